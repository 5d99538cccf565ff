// SPDX-License-Identifier: MIT
// The string tree's records, its creation, the node primitives and the
// accessors that read a node and its children.
#include <cstddef>

#include "hst/hst_internal.h"

static_assert(sizeof(HstTreeData) == 24, "HstTreeData is 24 bytes");
static_assert(offsetof(HstTreeData, root) == 0 && offsetof(HstTreeData, size) == 4 &&
                  offsetof(HstTreeData, separator) == 8 && offsetof(HstTreeData, reserved) == 9 &&
                  offsetof(HstTreeData, defaultVal) == 12 &&
                  offsetof(HstTreeData, childCapacity) == 16 &&
                  offsetof(HstTreeData, childCapacityIncrement) == 20,
              "HstTreeData layout");
static_assert(sizeof(HstNode) == 20, "HstNode is 20 bytes");
static_assert(offsetof(HstNode, parent) == 0 && offsetof(HstNode, children) == 4 &&
                  offsetof(HstNode, key) == 8 && offsetof(HstNode, val) == 12 &&
                  offsetof(HstNode, subtreeValCount) == 16,
              "HstNode layout");

using namespace coffer;
using namespace coffer::hst;

extern "C" {

COFFER_API HstTree *HST_AllocTree(char separator, CofferVal defaultVal, int32_t childCapacity,
                                  int32_t childCapacityIncrement) {
  MemPool heap;
  MemPool_InitOnStdHeap(&heap);
  return HST_AllocTreeEx(&heap, separator, defaultVal, childCapacity, childCapacityIncrement);
}

COFFER_API HstTree *HST_AllocTreeEx(MemPool *pool, char separator, CofferVal defaultVal,
                                    int32_t childCapacity, int32_t childCapacityIncrement) {
  HstTree *tree = AllocHandle(pool);
  if (!tree) return nullptr;
  if (!HST_CreateTreeData(tree, separator, defaultVal, childCapacity, childCapacityIncrement)) {
    HST_FreeTree(tree);  // data is null, so only the handle goes
    return nullptr;
  }
  return tree;
}

COFFER_API bool HST_CreateTreeData(HstTree *tree, char separator, CofferVal defaultVal,
                                   int32_t childCapacity, int32_t childCapacityIncrement) {
  HST_CHECKED(tree);
  auto *data = static_cast<HstTreeData *>(PoolCalloc(tree, sizeof(HstTreeData)));
  tree->data = data;
  if (!data) return false;
  data->separator = separator;
  data->defaultVal = defaultVal;
  data->childCapacity = childCapacity;
  data->childCapacityIncrement = childCapacityIncrement;
  HstNode *root = AllocNode(tree, "", defaultVal);  // size becomes 1
  if (!root) {
    PoolFree(tree, data);
    tree->data = nullptr;
    return false;
  }
  data->root = OffsetOf(tree, root);
  return true;
}

COFFER_API int32_t HST_GetSize(HstTree *tree) { return Data(tree)->size; }

COFFER_API FreeValFn HST_SetFreeValFn(HstTree *tree, FreeValFn fn) {
  return SetFreeValFn(tree, fn);
}

COFFER_API MpFreeValFn HST_SetMpFreeValFn(HstTree *tree, MpFreeValFn fn) {
  return SetMpFreeValFn(tree, fn);
}

COFFER_API HstNode *HST_GetRoot(HstTree *tree) { return Root(tree); }

COFFER_API HstNode *HST_GetParent(HstTree *tree, HstNode *node) {
  return NodeAt(tree, node->parent);
}

COFFER_API const char *HST_GetKey(HstTree *tree, HstNode *node) {
  return RecordAt<const char>(tree, node->key);
}

COFFER_API CofferVal HST_GetVal(HstTree *, HstNode *node) { return node->val; }

COFFER_API void HST_SetVal(HstTree *, HstNode *node, CofferVal val) { node->val = val; }

COFFER_API int32_t HST_GetNumChildren(HstTree *tree, HstNode *node) {
  if (!node->children) return 0;
  EsaArray kids = Children(tree, node);
  return ESA_GetSize(&kids);
}

COFFER_API HstNode *HST_GetChild(HstTree *tree, HstNode *node, int32_t index) {
  if (!node->children) return nullptr;
  EsaArray kids = Children(tree, node);
  // An index out of range reads as value 0, which is the null offset.
  return NodeAt(tree, static_cast<PoolOffset>(ESA_GetVal(&kids, index)));
}

COFFER_API HstNode *HST_FindChild(HstTree *tree, HstNode *node, const char *key) {
  int32_t slot;
  return FindChildIn(tree, node, key, &slot);
}

COFFER_API HstNode *HSTAllocNode(HstTree *tree, const char *key, CofferVal val) {
  return AllocNode(tree, key, val);
}

COFFER_API bool HSTAllocChild(HstTree *tree, HstNode *node) { return AllocChildArray(tree, node); }

COFFER_API HstNode *HSTInsertChildNode(HstTree *tree, HstNode *parent, HstNode *node) {
  if (!parent->children && !AllocChildArray(tree, parent)) return nullptr;
  EsaArray kids = Children(tree, parent);
  if (!ESA_Insert(&kids, HST_GetKey(tree, node), OffsetOf(tree, node))) return nullptr;
  node->parent = OffsetOf(tree, parent);
  return node;
}

COFFER_API HstNode *HST_InsertChild(HstTree *tree, HstNode *parent, const char *key,
                                    CofferVal val) {
  HST_CHECKED(tree);
  return InsertChild(tree, parent, key, val, kSlotAfterEqual);
}

COFFER_API void HSTFreeNode(HstTree *tree, HstNode *node) {
  if (node->children) {
    // Only the array goes: its entries' key copies, entry block and record.
    // The child nodes they name are the caller's business.
    EsaArray kids = Children(tree, node);
    ESA_FreeArray(&kids);
  }
  PoolFree(tree, RecordAt<char>(tree, node->key));
  PoolFree(tree, node);
  Data(tree)->size--;
}

}  // extern "C"

namespace coffer {
namespace hst {

HstNode *AllocNode(HstTree *tree, const char *key, CofferVal val) {
  if (!key) return nullptr;
  // Both allocations are always asked for, key copy first, so a pool sees
  // the same sequence of calls whichever of them it refuses.
  char *keyCopy = PoolStrdup(tree, key);
  auto *node = static_cast<HstNode *>(PoolCalloc(tree, sizeof(HstNode)));
  if (!keyCopy || !node) {
    // Only what was granted goes back: a pool sees no free of a null block.
    if (keyCopy) PoolFree(tree, keyCopy);
    if (node) PoolFree(tree, node);
    return nullptr;
  }
  node->key = OffsetOf(tree, keyCopy);
  node->val = val;
  Data(tree)->size++;
  return node;
}

bool AllocChildArray(HstTree *tree, HstNode *node) {
  if (node->children) return false;
  HstTreeData *data = Data(tree);
  EsaArray kids = TransientHandle(tree, nullptr);
  // The capacities go to the array unchanged; it guards against unusable ones.
  if (!ESA_CreateArrayData(&kids, data->childCapacity, data->childCapacityIncrement))
    return false;
  node->children = OffsetOf(tree, kids.data);
  return true;
}

HstNode *InsertChild(HstTree *tree, HstNode *parent, const char *key, CofferVal val,
                     int32_t slot) {
  if (!parent->children && !AllocChildArray(tree, parent)) return nullptr;
  HstNode *node = AllocNode(tree, key, val);
  if (!node) return nullptr;
  EsaArray kids = Children(tree, parent);
  const PoolOffset off = OffsetOf(tree, node);
  if (!(slot == kSlotAfterEqual ? ESA_Insert(&kids, key, off)
                                : ESAInsertAt(&kids, slot, key, off))) {
    HSTFreeNode(tree, node);
    return nullptr;
  }
  node->parent = OffsetOf(tree, parent);
  return node;
}

}  // namespace hst
}  // namespace coffer
