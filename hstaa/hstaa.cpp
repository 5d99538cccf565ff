// SPDX-License-Identifier: MIT
// Associative arrays over the string tree: path-keyed values, a value count
// per subtree, and array templates. Under any node, a child named "#" or "##"
// is the template (representative) of the array whose elements are the
// siblings keyed "#x..." or "##x..."; an element missing from the tree reads
// as its template, is made as a copy of it, and receives whatever is inserted
// or removed through the template while it exists.
//
// Paths are walked in place: each component is cut by overwriting the
// separator behind it with NUL, and every walk that changes the tree puts the
// separator back before it returns, so one remainder can be handed to several
// elements in turn and then walked by the caller itself.
#include <coffer/hstaa.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>

#include "hst/hst_internal.h"

static_assert(offsetof(HstaaTree, hst) == 0, "an HstaaTree is also an HstTree and a MemPool");
static_assert(offsetof(HstaaTree, cloneValFn) == sizeof(HstTree) &&
                  offsetof(HstaaTree, insertValFn) == sizeof(HstTree) + 4 &&
                  offsetof(HstaaTree, removeValFn) == sizeof(HstTree) + 8,
              "HstaaTree member order");
static_assert(offsetof(HstNode, subtreeValCount) == 16 && sizeof(HstNode) == 20,
              "the value count is the fifth word of a node");

namespace {

using coffer::hst::Children;
using coffer::hst::CopyPath;
using coffer::hst::Data;
using coffer::hst::FindChildIn;
using coffer::hst::FindCut;
using coffer::hst::InsertChild;
using coffer::hst::IsLastName;
using coffer::hst::NodeAt;

// Checking builds check the tree and its value counts whenever a call that
// may have changed them returns; the counts hold between any two such calls,
// nested ones included, since every change is carried up to the root at once.
#define HSTAA_CHECKED(tree) \
  COFFER_CHECK_ON_RETURN("associative array", coffer::hst::HSTCheckTree, &(tree)->hst, true)

// The two marks. Callers may compare the pointers: there is one of each.
const char kMark[] = "#";
const char kDoubleMark[] = "##";

char Separator(HstaaTree *tree) { return Data(&tree->hst)->separator; }

// The template that an element key falls back on, if node has one.
HstNode *FindRep(HstaaTree *tree, HstNode *node, const char *key) {
  const char *mark = HSTAA_GetArrayRep(key);
  return mark ? HST_FindChild(&tree->hst, node, mark) : nullptr;
}

// Finds the child named key, or makes it: as a copy of its array's template
// when there is one (the copied values then count in node and above), else
// as a plain node without values. *plain tells which way it was made.
HstNode *InsertStep(HstaaTree *tree, HstNode *node, const char *key, bool *plain) {
  HstTree *h = &tree->hst;
  *plain = false;
  int32_t slot;  // one search: where a plain child goes when there is none
  if (HstNode *child = FindChildIn(h, node, key, &slot)) return child;
  if (HstNode *rep = FindRep(tree, node, key)) {
    HstNode *copy = HST_CloneSubtree(h, rep, tree->cloneValFn, key, node);
    if (copy) HSTAAAdjustSubtreeValCount(h, node, copy->subtreeValCount);
    return copy;
  }
  HstNode *child = InsertChild(h, node, key, Data(h)->defaultVal, slot);
  *plain = child != nullptr;
  return child;
}

// After a removal below child (named key, under node): drops child when it
// holds nothing, or when it is an element that holds just as many values as
// its template and so adds nothing a lookup through the template would not
// find.
void PruneAfterRemoval(HstaaTree *tree, HstNode *node, HstNode *child, const char *key) {
  int32_t n = child->subtreeValCount;
  bool prune = n == 0;
  if (!prune) {
    HstNode *rep = FindRep(tree, node, key);
    prune = rep && rep->subtreeValCount == n;
  }
  if (!prune) return;
  HST_RemoveSubtree(&tree->hst, child);
  HSTAAAdjustSubtreeValCount(&tree->hst, node, -n);
}

}  // namespace

extern "C" {

int32_t HSTAA_GetSubtreeValCount(HstaaTree *, HstNode *node) { return node->subtreeValCount; }

bool HSTAA_IsArrayRep(const char *key) {
  return key[0] == '#' && (key[1] == '\0' || (key[1] == '#' && key[2] == '\0'));
}

const char *HSTAA_GetArrayRep(const char *key) {
  if (key[0] != '#') return nullptr;
  if (key[1] == '#') return key[2] != '\0' ? kDoubleMark : nullptr;
  return key[1] != '\0' ? kMark : nullptr;
}

bool HSTAA_IsArrayIndex(const char *key) { return HSTAA_GetArrayRep(key) != nullptr; }

HstNode *HSTAAFindPrefix(HstaaTree *tree, HstNode *node, char *path, bool *outComplete) {
  if (!path || !*path) {
    *outComplete = node != nullptr;
    return node;
  }
  const char sep = Separator(tree);
  for (;;) {
    char *cut = FindCut(path, sep);
    if (cut) *cut = '\0';
    HstNode *child = HST_FindChild(&tree->hst, node, path);
    if (!child) child = FindRep(tree, node, path);
    if (!child) {
      // The cut stays: the unresolved component is left terminated.
      *outComplete = false;
      return node;
    }
    if (cut) *cut = sep;
    if (IsLastName(cut)) {
      *outComplete = true;
      return child;
    }
    node = child;
    path = cut + 1;
  }
}

HstNode *HSTAA_FindPrefix(HstaaTree *tree, const char *path, bool *outComplete) {
  HstNode *root = HST_GetRoot(&tree->hst);
  if (!*path) {
    // No leading character to skip, so nothing of the path was resolved.
    *outComplete = false;
    return root;
  }
  char *copy = CopyPath(path);
  if (!copy) return nullptr;
  HstNode *found = HSTAAFindPrefix(tree, root, copy + 1, outComplete);
  std::free(copy);
  return found;
}

HstNode *HSTAAInsert(HstaaTree *tree, HstNode *node, char *path, CofferVal val) {
  HSTAA_CHECKED(tree);
  HstTree *h = &tree->hst;
  // The topmost node this call made as a plain path step. All nodes made
  // after it lie below it, so removing it undoes every plain step at once.
  HstNode *made = nullptr;
  if (path && *path) {
    const char sep = Separator(tree);
    char *key = path;
    for (;;) {
      char *cut = FindCut(key, sep);
      if (cut) *cut = '\0';
      bool plain;
      HstNode *child = InsertStep(tree, node, key, &plain);
      if (!child) {
        if (cut) *cut = sep;
        return nullptr;
      }
      if (plain && !made) made = child;
      // Elements take the value before their template; a refusal there does
      // not stop the insertion into the template.
      if (HSTAA_IsArrayRep(key))
        HSTAAPropagateVal(tree, HSTAA_PROPAGATE_INSERT, node, child, cut ? cut + 1 : nullptr, val);
      if (cut) *cut = sep;
      node = child;
      if (IsLastName(cut)) break;
      key = cut + 1;
    }
  }
  // out starts as the current value, so a callback that accepts without
  // writing it leaves the value as it was.
  CofferVal cur = HST_GetVal(h, node);
  CofferVal out = cur;
  if (tree->insertValFn(tree, cur, val, &out)) {
    HST_SetVal(h, node, out);
    HSTAAAdjustSubtreeValCount(h, node, 1);
    return node;
  }
  // Refused: leave no empty node of this call's making behind. Values that
  // were there before, and those carried into elements, stay.
  if (made && made->subtreeValCount == 0) HST_RemoveSubtree(h, made);
  return nullptr;
}

HstNode *HSTAA_Insert(HstaaTree *tree, const char *path, CofferVal val) {
  if (!*path) return nullptr;
  char *copy = CopyPath(path);
  if (!copy) return nullptr;
  HstNode *target = HSTAAInsert(tree, HST_GetRoot(&tree->hst), copy + 1, val);
  std::free(copy);
  return target;
}

void HSTAARemove(HstaaTree *tree, HstNode *node, char *path, CofferVal val) {
  HSTAA_CHECKED(tree);
  HstTree *h = &tree->hst;
  if (!path || !*path) {
    CofferVal cur = HST_GetVal(h, node);
    CofferVal out = cur;
    if (tree->removeValFn(tree, cur, val, &out)) {
      HST_SetVal(h, node, out);
      HSTAAAdjustSubtreeValCount(h, node, -1);
    }
    return;
  }
  const char sep = Separator(tree);
  char *cut = FindCut(path, sep);
  if (cut) *cut = '\0';
  char *rest = cut ? cut + 1 : nullptr;
  // A missing component ends the removal; a missing element is not looked
  // for in its template, whose values belong to the template alone.
  if (HstNode *child = HST_FindChild(h, node, path)) {
    if (HSTAA_IsArrayRep(path))
      HSTAAPropagateVal(tree, HSTAA_PROPAGATE_REMOVE, node, child, rest, val);
    HSTAARemove(tree, child, rest, val);
    PruneAfterRemoval(tree, node, child, path);
  }
  if (cut) *cut = sep;
}

bool HSTAA_Remove(HstaaTree *tree, const char *path, CofferVal val) {
  if (!*path) return true;  // names nothing, so there is nothing to remove
  char *copy = CopyPath(path);
  if (!copy) return false;
  HSTAARemove(tree, HST_GetRoot(&tree->hst), copy + 1, val);
  std::free(copy);
  return true;
}

bool HSTAAPropagateVal(HstaaTree *tree, int32_t mode, HstNode *parent, HstNode *rep, char *rest,
                       CofferVal val) {
  HSTAA_CHECKED(tree);
  HstTree *h = &tree->hst;
  const char *mark = HST_GetKey(h, rep);
  if (!HSTAA_IsArrayRep(mark) || !parent->children) return true;
  // The elements of an array follow its template in key order, so only that
  // run is visited: found by bisection, ended by the first other key.
  EsaArray kids = Children(h, parent);
  int32_t i;
  if (!ESA_Find(&kids, mark, &i)) return true;
  ++i;
  for (;;) {
    HstNode *elem = NodeAt(h, static_cast<PoolOffset>(ESA_GetVal(&kids, i)));
    if (!elem) return true;
    const char *elemMark = HSTAA_GetArrayRep(HST_GetKey(h, elem));
    if (!elemMark || std::strcmp(elemMark, mark) != 0) return true;
    if (mode == HSTAA_PROPAGATE_INSERT) {
      if (!HSTAAInsert(tree, elem, rest, val)) return false;
    } else if (mode == HSTAA_PROPAGATE_REMOVE) {
      HSTAARemove(tree, elem, rest, val);
      if (elem->subtreeValCount == 0) {
        // Nothing left in it: drop it, and look at the same position again,
        // where the next element now stands. It held no values, so no
        // count changes.
        HST_RemoveSubtree(h, elem);
        continue;
      }
    }
    ++i;
  }
}

}  // extern "C"
