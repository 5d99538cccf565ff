// Accessors shared by the string tree's source files: the one place where
// the tree's offsets become records, and the transient handle over a node's
// child array.
#ifndef COFFER_HST_HST_INTERNAL_H
#define COFFER_HST_HST_INTERNAL_H

#include <coffer/hst.h>

#include <cstring>

#include "mempool/check.h"
#include "mempool/pool.h"

namespace coffer {
namespace hst {

inline HstTreeData *Data(HstTree *tree) { return static_cast<HstTreeData *>(tree->data); }
inline HstNode *NodeAt(HstTree *tree, PoolOffset off) { return RecordAt<HstNode>(tree, off); }

// An EsaArray handle on the stack around the node's child array (data null
// when the node has none). It carries no release callback, so the array never
// treats the node offsets it stores as values to release.
inline EsaArray Children(HstTree *tree, HstNode *node) {
  return TransientHandle(tree, RecordAt<EsaArrayData>(tree, node->children));
}

// Invariants of a tree between calls: the root is named "" and has no
// parent; every node is reachable from it, exactly once, and size counts
// them (nodes the caller holds detached after HSTAllocNode are not allowed
// to exist while a checked call runs); each node's child array holds the
// children in strcmp order of their names, each entry named like its node,
// whose parent names the array's owner. With counts, as the associative
// arrays keep them, every subtreeValCount is at least the sum of its
// children's (what the node holds itself is not recorded anywhere else).
bool HSTCheckTree(HstTree *tree, bool counts, CheckFault *fault);

// Checking builds check the tree whenever a call that changed it returns.
// Only the calls a caller makes on a whole tree do so: the node primitives
// run while a copy is still detached.
#define HST_CHECKED(tree) \
  COFFER_CHECK_ON_RETURN("string tree", coffer::hst::HSTCheckTree, tree, false)

// Path rules, shared with the associative arrays. A path's first character
// stands for the leading separator and is skipped; the rest is names joined
// by the tree's separator. Walks cut a name in place by writing NUL over the
// separator behind it, and put the separator back before they return.

// The separator behind the name that starts at name, or null when the name
// runs to the end of the path. A NUL separator never cuts: it would match
// the terminator and lead the walk past it.
inline char *FindCut(char *name, char sep) { return sep ? std::strchr(name, sep) : nullptr; }

// Whether the name cut at cut is the last one: nothing follows it, or only
// the separator itself (a trailing separator ends the walk there).
inline bool IsLastName(const char *cut) { return !cut || cut[1] == '\0'; }

// A copy of path on the process heap (never the pool, which the walk must
// not touch for a lookup), or null when malloc refuses. Freed with free.
char *CopyPath(const char *path);

}  // namespace hst
}  // namespace coffer

#endif
