// SPDX-License-Identifier: MIT
// Whole-tree operations of the string tree: releasing values and subtrees,
// removal, clearing, freeing, renaming a detached node and copying subtrees.
#include <cstring>

#include "hst/hst_internal.h"

using namespace coffer;
using namespace coffer::hst;

namespace {

// Index of the entry of node in its parent's child array, or -1. Entries of
// equal names stand side by side and the bisection may land on any of them,
// so the entry holding this very node is picked among them: a sibling of the
// same name (HST_InsertChild and cloning allow one) keeps its own entry.
int32_t EntryOf(HstTree *tree, EsaArray *kids, HstNode *node) {
  const char *key = HST_GetKey(tree, node);
  int32_t found;
  if (!ESA_Find(kids, key, &found)) return -1;
  const CofferVal off = OffsetOf(tree, node);
  const int32_t size = ESA_GetSize(kids);
  for (int32_t i = found; i >= 0 && std::strcmp(ESA_GetKey(kids, i), key) == 0; i--)
    if (ESA_GetVal(kids, i) == off) return i;
  for (int32_t i = found + 1; i < size && std::strcmp(ESA_GetKey(kids, i), key) == 0; i++)
    if (ESA_GetVal(kids, i) == off) return i;
  return -1;
}

}  // namespace

extern "C" {

COFFER_API void HSTFreeVal(HstTree *tree, CofferVal val) { DropValue(tree, val); }

COFFER_API void HSTFreeSubtree(HstTree *tree, HstNode *node) {
  // Children first, in name order, each with its whole subtree; releasing a
  // child leaves this node's array as it is, so the indices stay put.
  const int32_t n = HST_GetNumChildren(tree, node);
  for (int32_t i = 0; i < n; i++) HSTFreeSubtree(tree, HST_GetChild(tree, node, i));
  HSTFreeVal(tree, node->val);
  HSTFreeNode(tree, node);
}

COFFER_API void HST_RemoveSubtree(HstTree *tree, HstNode *node) {
  HST_CHECKED(tree);
  // The root has no entry to unlink and the tree record must keep naming a
  // live root, so removing it empties the tree instead.
  if (node == HST_GetRoot(tree)) {
    HST_Clear(tree);
    return;
  }
  HstNode *parent = HST_GetParent(tree, node);
  if (parent && parent->children) {
    EsaArray kids = Children(tree, parent);
    int32_t index = EntryOf(tree, &kids, node);
    if (index >= 0) ESA_Remove(&kids, index);
  }
  HSTFreeSubtree(tree, node);
}

COFFER_API void HST_Clear(HstTree *tree) {
  HST_CHECKED(tree);
  HstNode *root = HST_GetRoot(tree);
  const int32_t n = HST_GetNumChildren(tree, root);
  for (int32_t i = 0; i < n; i++) HSTFreeSubtree(tree, HST_GetChild(tree, root, i));
  if (root->children) {
    EsaArray kids = Children(tree, root);
    ESA_FreeArray(&kids);
    root->children = 0;
  }
  HSTFreeVal(tree, root->val);
  // The root starts over as at creation; its old value is gone, so a later
  // clear or free must not see it again.
  // size needs no reset: every node released above counted itself out, so
  // it reads 1, the root, as on a fresh tree.
  root->val = Data(tree)->defaultVal;
  root->subtreeValCount = 0;
}

COFFER_API void HST_FreeTree(HstTree *tree) {
  if (!tree) return;
  if (HstTreeData *data = Data(tree)) {
    HST_Clear(tree);  // every value, the root's included, released once
    HSTFreeNode(tree, HST_GetRoot(tree));
    PoolFree(tree, data);
    tree->data = nullptr;  // a handle the caller keeps must not name the record
  }
  ReleaseHandle(tree);
}

COFFER_API bool HSTReplaceKey(HstTree *tree, HstNode *node, const char *newKey) {
  char *copy = PoolStrdup(tree, newKey);
  if (!copy) return false;
  PoolFree(tree, RecordAt<char>(tree, node->key));
  node->key = OffsetOf(tree, copy);
  return true;
}

}  // extern "C"

namespace {

// Makes the copy depth first: the whole copy stays detached until its top
// is attached last, so a failure anywhere releases it with no entry to undo.
HstNode *CloneSubtree(HstTree *tree, HstNode *src, HstCloneValFn cloneValFn, const char *newKey,
                      HstNode *dstParent) {
  const CofferVal defaultVal = Data(tree)->defaultVal;
  CofferVal val = defaultVal;
  const bool cloned = src->val != defaultVal;
  if (cloned) {
    val = 0;
    if (!cloneValFn(tree, src->val, &val)) return nullptr;  // it keeps no copy
  }
  HstNode *copy = HSTAllocNode(tree, HST_GetKey(tree, src), val);
  if (!copy) {
    if (cloned) HSTFreeVal(tree, val);
    return nullptr;
  }
  copy->subtreeValCount = src->subtreeValCount;
  // Counted before the copy is attached, so a copy made under its own source
  // (or under one of its descendants) does not contain itself.
  const int32_t n = HST_GetNumChildren(tree, src);
  for (int32_t i = 0; i < n; i++) {
    if (!CloneSubtree(tree, HST_GetChild(tree, src, i), cloneValFn, nullptr, copy)) {
      HSTFreeSubtree(tree, copy);
      return nullptr;
    }
  }
  if ((newKey && !HSTReplaceKey(tree, copy, newKey)) ||
      !HSTInsertChildNode(tree, dstParent, copy)) {
    HSTFreeSubtree(tree, copy);  // still detached: no parent entry to touch
    return nullptr;
  }
  return copy;
}

}  // namespace

extern "C" {

COFFER_API HstNode *HST_CloneSubtree(HstTree *tree, HstNode *src, HstCloneValFn cloneValFn,
                                     const char *newKey, HstNode *dstParent) {
  HST_CHECKED(tree);
  return CloneSubtree(tree, src, cloneValFn, newKey, dstParent);
}

COFFER_API void HSTAAAdjustSubtreeValCount(HstTree *tree, HstNode *node, int32_t delta) {
  if (delta == 0) return;
  for (; node; node = HST_GetParent(tree, node)) {
    // Wrapping addition: a count pushed past the int32 range must not be
    // undefined behaviour.
    node->subtreeValCount = static_cast<int32_t>(static_cast<uint32_t>(node->subtreeValCount) +
                                                 static_cast<uint32_t>(delta));
  }
}

}  // extern "C"
