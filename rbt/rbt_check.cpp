// SPDX-License-Identifier: MIT
// The red-black trees' invariant checker: the invariants stated above the
// balancing code in rbt_core.cpp, verified by one bounded walk. Each key
// order is restated here on its own, so the checker does not trust the
// comparisons it is checking.
#include "rbt/rbt_internal.h"

namespace coffer {
namespace {

// Bytes read as signed, the terminator counting as 0.
int CompareStrings(const RbtTree *tree, uint32_t a, uint32_t b) {
  const signed char *x = RecordAt<const signed char>(tree, a);
  const signed char *y = RecordAt<const signed char>(tree, b);
  while (*x == *y && *x) ++x, ++y;
  return *x - *y;
}

int CompareSerial(const RbtTree *, uint32_t a, uint32_t b) {
  return a == b ? 0 : static_cast<int32_t>(a - b) < 0 ? -1 : 1;
}

int CompareAddresses(const RbtTree *, uint32_t a, uint32_t b) { return a < b ? -1 : a > b; }

// Whether a node may stand at depth (the root at 1) of a tree of size
// nodes: a red-black tree of n nodes is at most 2 log2(n + 1) deep, so the
// walk's recursion stays within 64 levels whatever the links say.
bool DepthPossible(uint32_t depth, uint32_t size) {
  const uint64_t n1 = uint64_t{size} + 1;
  return depth < 64 && (uint64_t{1} << depth) <= n1 * n1;
}

struct Walk {
  const RbtCtx &c;
  RbtKeyKind kind;
  const CheckSpan *span;
  CheckFault *fault;
  uint32_t count = 0;
  const RbtNode *prev = nullptr;

  // The black height of the subtree at off, or -1 once a fault is reported.
  // The node count bounds the walk, so a link that loops ends it.
  int Visit(PoolOffset off, PoolOffset parent, uint32_t depth) {
    if (off == c.nilOff) return 0;
    if (off == 0) return Fault(fault, "a link is 0 instead of the sentinel", parent), -1;
    if (++count > c.d->size) return Fault(fault, "more nodes than size counts", off), -1;
    if (!DepthPossible(depth, c.d->size)) return Fault(fault, "deeper than its size allows", off), -1;
    if (!SpanHolds(span, off, sizeof(RbtNode))) return Fault(fault, "node outside the region", parent), -1;
    const RbtNode *x = c.NodeAt(off);
    if (x->parent != parent) return Fault(fault, "parent link disagrees with child link", off), -1;
    if (x->color > kRbtRed) return Fault(fault, "colour neither red nor black", off), -1;
    if (x->color == kRbtRed && (IsRed(x->left) || IsRed(x->right)))
      return Fault(fault, "red node with a red child", off), -1;
    if (kind == kRbtStringKeys && !SpanHoldsString(span, &c.t->mp, x->key))
      return Fault(fault, "key outside the region", off), -1;
    int left = Visit(x->left, off, depth + 1);
    if (left < 0) return -1;
    static int (*const kOrders[])(const RbtTree *, uint32_t, uint32_t) = {
        CompareStrings, CompareSerial, CompareAddresses};
    if (prev && kOrders[kind](c.t, prev->key, x->key) > 0)
      return Fault(fault, "keys out of order", off), -1;
    prev = x;
    int right = Visit(x->right, off, depth + 1);
    if (right < 0) return -1;
    if (left != right) return Fault(fault, "black heights differ", off), -1;
    return left + (x->color == kRbtBlack);
  }
  // A child outside the span is reported when the walk reaches it.
  bool IsRed(PoolOffset off) const {
    return off != c.nilOff && off && SpanHolds(span, off, sizeof(RbtNode)) &&
           c.NodeAt(off)->color == kRbtRed;
  }
};

}  // namespace

bool RBTCheckTree(const RbtTree *tree, RbtKeyKind kind, CheckFault *fault, const CheckSpan *span) {
  if (!tree->data) return true;
  const PoolOffset at = OffsetOf(tree, tree->data);
  if (!SpanHolds(span, at, sizeof(RbtTreeData))) return Fault(fault, "record outside the region", at);
  RbtCtx c(const_cast<RbtTree *>(tree));
  if (!SpanHolds(span, c.nilOff, sizeof(RbtNode))) return Fault(fault, "sentinel outside the region", at);
  if (!RBTSentinelSound(c)) return Fault(fault, "sentinel changed", c.nilOff);
  if (c.d->root != c.nilOff && SpanHolds(span, c.d->root, sizeof(RbtNode)) &&
      c.NodeAt(c.d->root)->color != kRbtBlack)
    return Fault(fault, "red root", c.d->root);
  Walk walk{c, kind, span, fault};
  if (walk.Visit(c.d->root, c.nilOff, 1) < 0) return false;
  if (walk.count != c.d->size) return Fault(fault, "size differs from the nodes reachable", c.d->root);
  return true;
}

bool RBTSentinelSound(const RbtCtx &c) {
  const RbtNode *nil = c.nil;
  return nil->left == c.nilOff && nil->right == c.nilOff && nil->color == kRbtBlack &&
         nil->ownsNode == 1 && nil->val == 0;
}

}  // namespace coffer
