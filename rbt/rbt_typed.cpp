// SPDX-License-Identifier: MIT
// Red-black trees keyed by a 32-bit word kept in the node itself: signed
// integers in serial order and pointers in unsigned address order. Nothing
// about a key is allocated, so a caller's node makes insertion allocation-free.
#include "rbt/rbt_core.h"

namespace coffer {
namespace {

// What the two word families share; Order supplies the comparison.
template <class Order, class ArgT>
struct WordKey {
  using Arg = ArgT;
  static constexpr bool kKeyInNode = true;

  static bool Acquire(RbtTree *, Arg key, uint32_t *word) {
    *word = Order::Word(key);
    return true;
  }
  static void Release(RbtTree *, uint32_t) {}

  struct Probe {
    uint32_t key;

    Probe(const RbtTree *, Arg k) : key(Order::Word(k)) {}
    int Compare(const RbtNode *x) const { return Order::Compare(key, x->key); }
    void Went(bool) {}
  };
};

// a comes before b when a - b, wrapped to 32 bits, reads as negative. This
// is the signed order while a tree's keys span less than 2^31. The wrapped
// difference is itself the comparison's result: one subtraction, whose sign
// the descents test without a branch.
struct SerialOrder {
  static uint32_t Word(int32_t key) { return static_cast<uint32_t>(key); }
  static int Compare(uint32_t a, uint32_t b) { return static_cast<int32_t>(a - b); }
};

// The address as a number; never dereferenced nor made an offset.
struct AddressOrder {
  static uint32_t Word(const void *key) {
    return static_cast<uint32_t>(reinterpret_cast<uintptr_t>(key));
  }
  static int Compare(uint32_t a, uint32_t b) { return (a > b) - (a < b); }
};

using Int32Key = WordKey<SerialOrder, int32_t>;
using VoidPtrKey = WordKey<AddressOrder, const void *>;

}  // namespace

RbtNode *RbtInt32InsertNode(RbtTree *tree, RbtNode *node, int32_t key, CofferVal val) {
  return rbt::InsertNode<Int32Key>(tree, node, key, val);
}
void RbtInt32RemoveNode(RbtTree *tree, RbtNode *z) { rbt::RemoveNode<Int32Key>(RbtCtx(tree), z); }

RbtNode *RbtVoidPtrInsertNode(RbtTree *tree, RbtNode *node, const void *key, CofferVal val) {
  return rbt::InsertNode<VoidPtrKey>(tree, node, key, val);
}
void RbtVoidPtrRemoveNode(RbtTree *tree, RbtNode *z) {
  rbt::RemoveNode<VoidPtrKey>(RbtCtx(tree), z);
}

}  // namespace coffer

COFFER_RBT_DEFINE_FAMILY(RbtInt32, coffer::Int32Key, int32_t, kRbtInt32Keys, RbtInt32InsertNode,
                         RbtInt32RemoveNode)
COFFER_RBT_DEFINE_FAMILY(RbtVoidPtr, coffer::VoidPtrKey, const void *, kRbtVoidPtrKeys,
                         RbtVoidPtrInsertNode, RbtVoidPtrRemoveNode)
