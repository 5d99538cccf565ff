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

struct Walk {
  const RbtCtx &c;
  int (*compare)(const RbtTree *, uint32_t, uint32_t);
  CheckFault *fault;
  uint32_t count = 0;
  const RbtNode *prev = nullptr;

  // The black height of the subtree at off, or -1 once a fault is reported.
  // The node count bounds the walk, so a link that loops ends it.
  int Visit(PoolOffset off, PoolOffset parent) {
    if (off == c.nilOff) return 0;
    if (off == 0) return Fault(fault, "a link is 0 instead of the sentinel", parent), -1;
    if (++count > c.d->size) return Fault(fault, "more nodes than size counts", off), -1;
    const RbtNode *x = c.NodeAt(off);
    if (x->parent != parent) return Fault(fault, "parent link disagrees with child link", off), -1;
    if (x->color > kRbtRed) return Fault(fault, "colour neither red nor black", off), -1;
    if (x->color == kRbtRed && (IsRed(x->left) || IsRed(x->right)))
      return Fault(fault, "red node with a red child", off), -1;
    int left = Visit(x->left, off);
    if (left < 0) return -1;
    if (prev && compare(c.t, prev->key, x->key) > 0) return Fault(fault, "keys out of order", off), -1;
    prev = x;
    int right = Visit(x->right, off);
    if (right < 0) return -1;
    if (left != right) return Fault(fault, "black heights differ", off), -1;
    return left + (x->color == kRbtBlack);
  }
  bool IsRed(PoolOffset off) const { return off != c.nilOff && off && c.NodeAt(off)->color == kRbtRed; }
};

}  // namespace

bool RBTCheckTree(const RbtTree *tree, RbtKeyKind kind, CheckFault *fault) {
  if (!tree->data) return true;
  RbtCtx c(const_cast<RbtTree *>(tree));
  const RbtNode *nil = c.nil;
  if (nil->left != c.nilOff || nil->right != c.nilOff || nil->color != kRbtBlack ||
      nil->ownsNode != 1 || nil->val != 0)
    return Fault(fault, "sentinel changed", c.nilOff);
  if (c.d->root != c.nilOff && c.NodeAt(c.d->root)->color != kRbtBlack)
    return Fault(fault, "red root", c.d->root);
  static int (*const kOrders[])(const RbtTree *, uint32_t, uint32_t) = {
      CompareStrings, CompareSerial, CompareAddresses};
  Walk walk{c, kOrders[kind], fault};
  if (walk.Visit(c.d->root, c.nilOff) < 0) return false;
  if (walk.count != c.d->size) return Fault(fault, "size differs from the nodes reachable", c.d->root);
  return true;
}

}  // namespace coffer
