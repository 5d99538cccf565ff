// SPDX-License-Identifier: MIT
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

// One call's view of a tree: the data record, the sentinel and the pool's
// base, resolved once. Links inside the tree are never 0 (an absent child is
// the sentinel), so they convert without a null test, and loops test them
// against nilOff before converting, so a walk converts only the nodes it
// actually visits.
//
// The balancing procedures take the view by value. A colour is a byte, and
// a store to a byte may change any memory the compiler cannot rule out, so
// a view read through a reference (or the handle's base read through the
// handle) would be loaded again after every recolouring, in the middle of
// the fix-up's chain of dependent loads. A copy of its own, whose address
// never leaves the call, stays in registers.
struct RbtCtx {
  RbtTree *t;
  RbtTreeData *d;
  const void *base;
  PoolOffset nilOff;
  RbtNode *nil;

  explicit RbtCtx(RbtTree *tree)
      : t(tree),
        d(static_cast<RbtTreeData *>(tree->data)),
        base(tree->mp.base),
        nilOff(d->nil),
        nil(NodeAt(nilOff)) {}

  // The tree's one place where offsets and nodes meet.
  RbtNode *NodeAt(PoolOffset off) const { return static_cast<RbtNode *>(LinkedAddr(base, off)); }
  PoolOffset OffsetOf(const RbtNode *n) const { return LinkedOffset(base, n); }
};

// Each walk and balancing case has a mirror image; both are written once, for
// the side L (true: left), with the near child on that side and the far one
// opposite.
template <bool L, class Node>
inline auto &Near(Node *n) {
  return L ? n->left : n->right;
}
template <bool L, class Node>
inline auto &Far(Node *n) {
  return L ? n->right : n->left;
}

// The child link on the side a comparison chose (right: true for the right
// child). A descent's direction is a coin toss that the processor would
// mispredict at every other step, so the child is picked with a conditional
// move, not a branch. The empty asm statement hides the picked link from the
// optimiser, which would otherwise merge the choice with the search's own
// tests of the comparison and branch on it again; it emits no instruction.
inline PoolOffset ChildLink(const RbtNode *x, bool right) {
  PoolOffset link = right ? x->right : x->left;
  asm("" : "+r"(link));
  return link;
}

// The walks below are inline: they are most of the work of the public
// neighbour calls, which then convert and test only what they visit.
//
// A walk in order returns every node it passes on the way down, and every
// node it climbs to, before it enters that node's far subtree. So each such
// node's far child is loaded ahead (Touch) as soon as the node is reached:
// in a tree larger than the cache, the walk then finds it there instead of
// waiting for memory at every step.

// The last node on side L below xo (the leftmost for L true); xo is not the
// sentinel.
template <bool L>
inline RbtNode *RBTExtreme(const RbtCtx &c, PoolOffset xo) {
  RbtNode *x = c.NodeAt(xo);
  Touch(c.NodeAt(Far<L>(x)));
  for (PoolOffset next; (next = Near<L>(x)) != c.nilOff;) {
    x = c.NodeAt(next);
    Touch(c.NodeAt(Far<L>(x)));
  }
  return x;
}

// x's in-order neighbour on its far side (the successor for L true): the
// nearest node of the far subtree, else the first ancestor reached from its
// near side. Null past the end.
template <bool L>
inline RbtNode *RBTNeighbour(const RbtCtx &c, const RbtNode *x) {
  if (Far<L>(x) != c.nilOff) return RBTExtreme<L>(c, Far<L>(x));
  // Climb while coming from the far side; compare offsets, not addresses.
  PoolOffset xo = c.OffsetOf(x);
  for (PoolOffset yo = x->parent; yo != c.nilOff;) {
    RbtNode *y = c.NodeAt(yo);
    if (Far<L>(y) != xo) {
      Touch(c.NodeAt(Far<L>(y)));
      return y;
    }
    xo = yo;
    yo = y->parent;
  }
  return nullptr;
}

// Neighbour walks; both return null past either end.
inline RbtNode *RBTSuccessor(const RbtCtx &c, const RbtNode *x) { return RBTNeighbour<true>(c, x); }
inline RbtNode *RBTPredecessor(const RbtCtx &c, const RbtNode *x) {
  return RBTNeighbour<false>(c, x);
}
// Leftmost and rightmost nodes; null for an empty tree.
inline RbtNode *RBTMinimum(const RbtCtx &c) {
  return c.d->root == c.nilOff ? nullptr : RBTExtreme<true>(c, c.d->root);
}
inline RbtNode *RBTMaximum(const RbtCtx &c) {
  return c.d->root == c.nilOff ? nullptr : RBTExtreme<false>(c, c.d->root);
}

// Links a filled red node z below parent (the sentinel for an empty tree) on
// the given side, rebalances and counts it.
void RBTAttach(RbtCtx c, RbtNode *z, RbtNode *parent, bool left);

// Takes z out of the tree and rebalances; when z has two children its
// successor node is relinked into z's place. Touches neither z's key nor its
// value, releases nothing and leaves size alone.
void RBTUnlink(RbtCtx c, RbtNode *z);

// The key order a tree's checker applies: the family's own.
enum RbtKeyKind { kRbtStringKeys, kRbtInt32Keys, kRbtVoidPtrKeys };

// Verifies the invariants stated in rbt_core.cpp: sentinel, colours, black
// heights, parent links, key order and size. True for a handle without data.
// With a span, every record and key must lie in it (see CheckSpan).
bool RBTCheckTree(const RbtTree *tree, RbtKeyKind kind, CheckFault *fault,
                  const CheckSpan *span = nullptr);

// The sentinel as every tree keeps it: black, its children itself, owned,
// no value. Its parent is scratch space and may hold anything.
bool RBTSentinelSound(const RbtCtx &c);

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
