// SPDX-License-Identifier: MIT
// Accessors shared by the string tree's source files: the one place where
// the tree's offsets become records, the transient handle over a node's
// child array, and the node primitives behind the exported ones, which the
// tree's own walks call directly rather than through the exported names.
#ifndef COFFER_HST_HST_INTERNAL_H
#define COFFER_HST_HST_INTERNAL_H

#include <coffer/hst.h>

#include "esa/esa_internal.h"
#include "mempool/check.h"
#include "mempool/pool.h"

namespace coffer {
namespace hst {

inline HstTreeData *Data(HstTree *tree) { return static_cast<HstTreeData *>(tree->data); }
inline HstNode *NodeAt(HstTree *tree, PoolOffset off) { return RecordAt<HstNode>(tree, off); }
inline HstNode *Root(HstTree *tree) { return NodeAt(tree, Data(tree)->root); }
// The node's child array record; null when it has none.
inline EsaArrayData *ChildArray(HstTree *tree, const HstNode *node) {
  return RecordAt<EsaArrayData>(tree, node->children);
}

// An EsaArray handle on the stack around the node's child array (data null
// when the node has none). It carries no release callback, so the array never
// treats the node offsets it stores as values to release.
inline EsaArray Children(HstTree *tree, HstNode *node) {
  return TransientHandle(tree, ChildArray(tree, node));
}

// Invariants of a tree between calls: the root is named "" and has no
// parent; every node is reachable from it, exactly once, and size counts
// them (nodes the caller holds detached after HSTAllocNode are not allowed
// to exist while a checked call runs); each node's child array holds the
// children in strcmp order of their names, each entry named like its node,
// whose parent names the array's owner. With counts, as the associative
// arrays keep them, every subtreeValCount is at least the sum of its
// children's (what the node holds itself is not recorded anywhere else).
// With a span, every record and name must lie in it (see CheckSpan).
bool HSTCheckTree(HstTree *tree, bool counts, CheckFault *fault, const CheckSpan *span = nullptr);

// Checking builds check the tree whenever a call that changed it returns.
// Only the calls a caller makes on a whole tree do so: the node primitives
// run while a copy is still detached.
#define HST_CHECKED(tree) \
  COFFER_CHECK_ON_RETURN("string tree", coffer::hst::HSTCheckTree, tree, false)

// strcmp's order (bytes read as unsigned), written out: names are short, and
// most differ in their first bytes, where a call to the C library's routine
// costs more than the loop.
inline int CompareNames(const char *a, const char *b) {
  const unsigned char *x = reinterpret_cast<const unsigned char *>(a);
  const unsigned char *y = reinterpret_cast<const unsigned char *>(b);
  while (*x == *y && *x != 0) ++x, ++y;
  return *x - *y;
}

// HST_FindChild, searching the child array in place (no handle is needed to
// read it). It probes the entries exactly as ESA_Find does, so that among
// children of one name it finds the same one. When no child has the name,
// *slot is where one would go among node's children, after every smaller
// name, ready for InsertChild.
inline HstNode *FindChildIn(HstTree *tree, const HstNode *node, const char *key, int32_t *slot) {
  *slot = 0;
  const EsaArrayData *kids = ChildArray(tree, node);
  if (!kids) return nullptr;
  const EsaEntry *e = EntriesOf(tree, kids);
  int32_t low = 0, high = kids->size - 1;
  while (low <= high) {
    const int32_t middle = low + (high - low) / 2;
    const int cmp = CompareNames(key, KeyOf(tree, e + middle));
    if (cmp == 0) return NodeAt(tree, static_cast<PoolOffset>(e[middle].val));
    if (cmp > 0)
      low = middle + 1;
    else
      high = middle - 1;
  }
  *slot = low;
  return nullptr;
}

// The node primitives of HSTAllocNode, HSTAllocChild and HST_InsertChild.
// InsertChild puts the new child at slot, which FindChildIn reported for an
// absent name; kSlotAfterEqual puts it after every sibling of the same name.
HstNode *AllocNode(HstTree *tree, const char *key, CofferVal val);
bool AllocChildArray(HstTree *tree, HstNode *node);
constexpr int32_t kSlotAfterEqual = -1;
HstNode *InsertChild(HstTree *tree, HstNode *parent, const char *key, CofferVal val,
                     int32_t slot);

// Path rules, shared with the associative arrays. A path's first character
// stands for the leading separator and is skipped; the rest is names joined
// by the tree's separator. Walks cut a name in place by writing NUL over the
// separator behind it, and put the separator back before they return.

// The separator behind the name that starts at name, or null when the name
// runs to the end of the path. A NUL separator never cuts: it would match
// the terminator and lead the walk past it. (strchr, written out: names are
// short.)
inline char *FindCut(char *name, char sep) {
  if (!sep) return nullptr;
  for (char *p = name; *p; ++p)
    if (*p == sep) return p;
  return nullptr;
}

// Whether the name cut at cut is the last one: nothing follows it, or only
// the separator itself (a trailing separator ends the walk there).
inline bool IsLastName(const char *cut) { return !cut || cut[1] == '\0'; }

// A copy of path on the process heap (never the pool, which the walk must
// not touch for a lookup), or null when malloc refuses. Freed with free.
char *CopyPath(const char *path);

}  // namespace hst
}  // namespace coffer

#endif
