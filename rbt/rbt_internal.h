// Internal operations of the red-black trees, shared by the string, 32-bit
// integer and pointer families and visible to their tests.
//
// The balancing code knows nothing about keys: it works on links, colours
// and the sentinel. Everything key-specific lives in a key policy (see
// rbt_core.h), so the three families run one algorithm.
#ifndef COFFER_RBT_INTERNAL_H
#define COFFER_RBT_INTERNAL_H

#include <coffer/rbt.h>

#include "mempool/check.h"
#include "mempool/pool.h"

namespace coffer {

enum : uint8_t { kRbtBlack = 0, kRbtRed = 1 };

// One call's view of a tree: the data record and the sentinel, resolved once.
// Links inside the tree are never 0 (an absent child is the sentinel), and
// loops test them against nilOff before converting, so a walk converts only
// the nodes it actually visits.
struct RbtCtx {
  RbtTree *t;
  RbtTreeData *d;
  RbtNode *nil;
  PoolOffset nilOff;

  explicit RbtCtx(RbtTree *tree)
      : t(tree), d(static_cast<RbtTreeData *>(tree->data)), nil(RecordAt<RbtNode>(tree, d->nil)),
        nilOff(d->nil) {}

  // The tree's one place where offsets and nodes meet.
  RbtNode *NodeAt(PoolOffset off) const { return RecordAt<RbtNode>(t, off); }
  PoolOffset OffsetOf(const RbtNode *n) const { return coffer::OffsetOf(t, n); }
  // Null for the sentinel: what the public calls hand back.
  RbtNode *OrNull(RbtNode *n) const { return n == nil ? nullptr : n; }
};

// Neighbour walks; both return the sentinel past either end.
RbtNode *RBTSuccessor(const RbtCtx &c, const RbtNode *x);
RbtNode *RBTPredecessor(const RbtCtx &c, const RbtNode *x);
// Leftmost and rightmost nodes; the sentinel for an empty tree.
RbtNode *RBTMinimum(const RbtCtx &c);
RbtNode *RBTMaximum(const RbtCtx &c);

// Links a filled red node z below parent (the sentinel for an empty tree) on
// the given side, rebalances and counts it.
void RBTAttach(const RbtCtx &c, RbtNode *z, RbtNode *parent, bool left);

// Takes z out of the tree and rebalances; when z has two children its
// successor node is relinked into z's place. Touches neither z's key nor its
// value, releases nothing and leaves size alone.
void RBTUnlink(const RbtCtx &c, RbtNode *z);

// The key order a tree's checker applies: the family's own.
enum RbtKeyKind { kRbtStringKeys, kRbtInt32Keys, kRbtVoidPtrKeys };

// Verifies the invariants stated in rbt_core.cpp: sentinel, colours, black
// heights, parent links, key order and size. True for a handle without data.
bool RBTCheckTree(const RbtTree *tree, RbtKeyKind kind, CheckFault *fault);

// Lifecycle steps common to the families. RBTCreateTreeData builds the data
// record and (without a caller's sentinel) the sentinel through the handle;
// on failure nothing stays allocated and data is null.
int32_t RBTCreateTreeData(RbtTree *tree, RbtNode *nil);
RbtTree *RBTAllocTree(MemPool *pool, RbtNode *nil);
RbtTree *RBTAllocTreeOnStdHeap();
void RBTSwap(RbtTree *tree, RbtTree *other);

// The family-specific insertion and removal, instances of the shared
// procedures over each family's key policy.
RbtNode *RBTInsertNode(RbtTree *tree, RbtNode *node, const char *key, CofferVal val);
void RBTRemoveNode(RbtTree *tree, RbtNode *z);
RbtNode *RbtInt32InsertNode(RbtTree *tree, RbtNode *node, int32_t key, CofferVal val);
void RbtInt32RemoveNode(RbtTree *tree, RbtNode *z);
RbtNode *RbtVoidPtrInsertNode(RbtTree *tree, RbtNode *node, const void *key, CofferVal val);
void RbtVoidPtrRemoveNode(RbtTree *tree, RbtNode *z);

}  // namespace coffer

#endif
