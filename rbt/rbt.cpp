// SPDX-License-Identifier: MIT
// String-keyed red-black tree. Keys are copied into the pool and ordered
// byte by byte with each byte read as signed (the NUL counts as 0), which is
// not strcmp order: a byte of 0x80 or above sorts before the terminator.
#include <cstring>

#include "rbt/rbt_core.h"

namespace coffer {
namespace {

struct StringKey {
  using Arg = const char *;
  static constexpr bool kKeyInNode = false;

  static bool Acquire(RbtTree *tree, const char *key, uint32_t *word) {
    if (!key) return false;
    char *copy = PoolStrdup(tree, key);
    if (!copy) return false;
    *word = OffsetOf(tree, copy);
    return true;
  }
  static void Release(RbtTree *tree, uint32_t word) { PoolFree(tree, RecordAt<char>(tree, word)); }

  // Every key in the subtree being descended lies between the nearest
  // ancestors where the descent went left and right, so it shares with the
  // key as many leading bytes as the smaller of the two stop positions there;
  // comparisons start past them.
  struct Probe {
    const RbtTree *tree;
    const signed char *key;
    uint32_t lcpLow = 0, lcpHigh = 0, stop = 0;

    Probe(const RbtTree *t, const char *k)
        : tree(t), key(reinterpret_cast<const signed char *>(k)) {}

    int Compare(const RbtNode *x) {
      // A key copy is never at offset 0.
      const signed char *other = LinkedRecordAt<const signed char>(tree, x->key);
      uint32_t i = lcpLow < lcpHigh ? lcpLow : lcpHigh;
      while (key[i] == other[i] && key[i] != 0) ++i;
      stop = i;
      return key[i] - other[i];
    }
    void Went(bool left) {
      // Selections rather than a branch on the direction (see ChildLink).
      lcpHigh = left ? stop : lcpHigh;
      lcpLow = left ? lcpLow : stop;
    }
  };
};

}  // namespace

RbtNode *RBTInsertNode(RbtTree *tree, RbtNode *node, const char *key, CofferVal val) {
  return rbt::InsertNode<StringKey>(tree, node, key, val);
}

void RBTRemoveNode(RbtTree *tree, RbtNode *z) { rbt::RemoveNode<StringKey>(RbtCtx(tree), z); }

}  // namespace coffer

COFFER_RBT_DEFINE_FAMILY(RBT, coffer::StringKey, const char *, kRbtStringKeys, RBTInsertNode,
                         RBTRemoveNode)
