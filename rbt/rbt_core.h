// SPDX-License-Identifier: MIT
// The key-dependent procedures of the red-black trees, written once over a
// key policy. A policy K provides:
//
//   using Arg                      the key as callers pass it
//   kKeyInNode                     whether the node's key word is the key
//                                  itself rather than a reference to it
//   static bool Acquire(tree, key, uint32_t *word)
//                                  makes the node's key word (the string
//                                  family copies the key into the pool);
//                                  false when it cannot
//   static void Release(tree, word) gives back what Acquire made
//   struct Probe                   one descent's comparator: Probe(tree, key),
//                                  Compare(node) < 0, 0, > 0 as the key comes
//                                  before, equals or follows the node's key,
//                                  Went(left) after each step, true when the
//                                  descent goes left (the string family keeps
//                                  its common prefixes there)
//
// Every instance is a hidden function of its family; the exported calls are
// thin wrappers around them (COFFER_RBT_DEFINE_FAMILY below).
#ifndef COFFER_RBT_CORE_H
#define COFFER_RBT_CORE_H

#include "rbt/rbt_internal.h"

namespace coffer {
namespace rbt {

// One step of a descent: compares the key with x's. A key kept outside the
// node (K::kKeyInNode false) costs a second memory access at every step,
// after the node's own; both children are then requested ahead, so that the
// next node is on its way while the key is read and compared.
template <class K>
inline int Step(const RbtCtx &c, typename K::Probe &probe, const RbtNode *x) {
  if (!K::kKeyInNode) {
    Touch(c.NodeAt(x->left));
    Touch(c.NodeAt(x->right));
  }
  return probe.Compare(x);
}

template <class K>
RbtNode *InsertNode(RbtTree *tree, RbtNode *node, typename K::Arg key, CofferVal val) {
  uint32_t word;
  if (!K::Acquire(tree, key, &word)) return nullptr;
  uint8_t owns = 0;
  if (!node) {
    node = static_cast<RbtNode *>(PoolCalloc(tree, sizeof(RbtNode)));
    if (!node) {
      K::Release(tree, word);
      return nullptr;
    }
    owns = 1;
  }
  RbtCtx c(tree);
  node->parent = node->left = node->right = c.nilOff;
  node->key = word;
  node->color = kRbtRed;
  node->ownsNode = owns;
  node->val = val;

  // Equal keys go right, after every node they equal: insertion order.
  typename K::Probe probe(tree, key);
  RbtNode *y = c.nil;
  bool left = false;
  for (PoolOffset xo = c.d->root; xo != c.nilOff;) {
    y = c.NodeAt(xo);
    left = Step<K>(c, probe, y) < 0;
    probe.Went(left);
    xo = ChildLink(y, !left);
  }
  // The last comparison was against y, so it also says on which side of y
  // the node goes.
  RBTAttach(c, node, y, left);
  return node;
}

template <class K>
void RemoveNode(RbtCtx c, RbtNode *z) {
  // The value goes first, while z is still linked and counted.
  DropValue(c.t, z->val);
  RBTUnlink(c, z);
  K::Release(c.t, z->key);
  if (z->ownsNode) PoolFree(c.t, z);
  c.d->size--;
}

// Removes first up to but not including end (null: to the last node), in
// ascending order. Nodes keep their identity, so next stays valid.
template <class K>
void RemoveRange(RbtTree *tree, RbtNode *first, RbtNode *end) {
  if (first == end) return;
  RbtCtx c(tree);
  for (;;) {
    RbtNode *next = RBTSuccessor(c, first);
    RemoveNode<K>(c, first);
    if (next == end) return;
    first = next;
  }
}

template <class K>
void Clear(RbtTree *tree) {
  RbtCtx c(tree);
  if (c.d->size == 0) return;
  for (RbtNode *x = RBTMinimum(c); x;) {
    RbtNode *next = RBTSuccessor(c, x);
    RemoveNode<K>(c, x);
    x = next;
  }
}

template <class K>
void FreeTree(RbtTree *tree) {
  if (!tree) return;
  auto *d = static_cast<RbtTreeData *>(tree->data);
  if (d) {
    if (d->size) Clear<K>(tree);
    if (d->ownsNil) PoolFree(tree, RecordAt<RbtNode>(tree, d->nil));
    tree->data = nullptr;  // a handle the caller keeps must not point at freed memory
    PoolFree(tree, d);
  }
  ReleaseHandle(tree);
}

// The first equal node on the path from the root.
template <class K>
RbtNode *Find(RbtTree *tree, typename K::Arg key) {
  RbtCtx c(tree);
  typename K::Probe probe(tree, key);
  for (PoolOffset xo = c.d->root; xo != c.nilOff;) {
    RbtNode *x = c.NodeAt(xo);
    int r = Step<K>(c, probe, x);
    if (r == 0) return x;
    probe.Went(r < 0);
    xo = ChildLink(x, r > 0);
  }
  return nullptr;
}

// Both bounds are one descent that remembers the last node where it went
// left: going left on equality too finds the first of an equal run, going
// right on it finds the first node past the run, without walking the run.
// The common-prefix bounds stay valid, since an equal key bounds the subtree
// it leads into like any other. The step is written as selections, which
// the compiler can make without branches.
template <class K, bool kPastEqual>
RbtNode *Bound(RbtTree *tree, typename K::Arg key) {
  RbtCtx c(tree);
  typename K::Probe probe(tree, key);
  RbtNode *bound = nullptr;
  for (PoolOffset xo = c.d->root; xo != c.nilOff;) {
    RbtNode *x = c.NodeAt(xo);
    int r = Step<K>(c, probe, x);
    const bool left = kPastEqual ? r < 0 : r <= 0;
    bound = left ? x : bound;
    probe.Went(left);
    xo = ChildLink(x, !left);
  }
  return bound;
}

// The first node whose key is not less than key.
template <class K>
RbtNode *LowerBound(RbtTree *tree, typename K::Arg key) {
  return Bound<K, false>(tree, key);
}

// The first node whose key is greater than key.
template <class K>
RbtNode *UpperBound(RbtTree *tree, typename K::Arg key) {
  return Bound<K, true>(tree, key);
}

// Key-independent calls, shared by the wrappers of every family.
inline RbtNode *First(RbtTree *tree) {
  RbtCtx c(tree);
  return c.d->size ? RBTMinimum(c) : nullptr;
}
inline RbtNode *Next(RbtTree *tree, RbtNode *node) { return RBTSuccessor(RbtCtx(tree), node); }
inline RbtNode *Prev(RbtTree *tree, RbtNode *node) {
  RbtCtx c(tree);
  return node ? RBTPredecessor(c, node) : RBTMaximum(c);
}
inline int32_t GetSize(RbtTree *tree) {
  return static_cast<int32_t>(static_cast<RbtTreeData *>(tree->data)->size);
}

}  // namespace rbt
}  // namespace coffer

// The twenty exported calls of one family P over key policy K (KeyT is the
// key type of P's declarations in coffer/rbt.h, KIND the order its checker
// applies), whose insertion and removal are the family's internal INSERT and
// REMOVE. In checking builds every call that changes a tree checks it on
// the way out.
#define COFFER_RBT_CHECKED(tree, KIND) \
  COFFER_CHECK_ON_RETURN("red-black tree", coffer::RBTCheckTree, tree, coffer::KIND)
#define COFFER_RBT_DEFINE_FAMILY(P, K, KeyT, KIND, INSERT, REMOVE)                               \
  extern "C" {                                                                                   \
  RbtTree *P##_AllocTree(void) { return coffer::RBTAllocTreeOnStdHeap(); }                       \
  RbtTree *P##_AllocTreeEx(MemPool *pool) { return coffer::RBTAllocTree(pool, nullptr); }        \
  RbtTree *P##_AllocTreeWithNil(MemPool *pool, RbtNode *nil) {                                   \
    return coffer::RBTAllocTree(pool, nil);                                                      \
  }                                                                                              \
  int32_t P##_CreateTreeData(RbtTree *tree, RbtNode *nil) {                                      \
    COFFER_RBT_CHECKED(tree, KIND);                                                              \
    return coffer::RBTCreateTreeData(tree, nil);                                                 \
  }                                                                                              \
  void P##_FreeTree(RbtTree *tree) { coffer::rbt::FreeTree<K>(tree); }                           \
  void P##_Clear(RbtTree *tree) {                                                                \
    COFFER_RBT_CHECKED(tree, KIND);                                                              \
    coffer::rbt::Clear<K>(tree);                                                                 \
  }                                                                                              \
  int32_t P##_GetSize(RbtTree *tree) { return coffer::rbt::GetSize(tree); }                      \
  FreeValFn P##_SetFreeValFn(RbtTree *tree, FreeValFn fn) {                                      \
    return coffer::SetFreeValFn(tree, fn);                                                       \
  }                                                                                              \
  MpFreeValFn P##_SetMpFreeValFn(RbtTree *tree, MpFreeValFn fn) {                                \
    return coffer::SetMpFreeValFn(tree, fn);                                                     \
  }                                                                                              \
  void P##_Swap(RbtTree *tree, RbtTree *other) {                                                 \
    COFFER_RBT_CHECKED(tree, KIND);                                                              \
    coffer::RBTSwap(tree, other);                                                                \
    COFFER_CHECK("red-black tree", coffer::RBTCheckTree, other, coffer::KIND);                   \
  }                                                                                              \
  RbtNode *P##_Insert(RbtTree *tree, KeyT key, CofferVal val) {                                  \
    COFFER_RBT_CHECKED(tree, KIND);                                                              \
    return coffer::INSERT(tree, nullptr, key, val);                                              \
  }                                                                                              \
  RbtNode *P##_InsertNoAlloc(RbtTree *tree, RbtNode *node, KeyT key, CofferVal val) {            \
    COFFER_RBT_CHECKED(tree, KIND);                                                              \
    return coffer::INSERT(tree, node, key, val);                                                 \
  }                                                                                              \
  void P##_Remove(RbtTree *tree, RbtNode *node) {                                                \
    COFFER_RBT_CHECKED(tree, KIND);                                                              \
    coffer::REMOVE(tree, node);                                                                  \
  }                                                                                              \
  void P##_RemoveRange(RbtTree *tree, RbtNode *first, RbtNode *end) {                            \
    COFFER_RBT_CHECKED(tree, KIND);                                                              \
    coffer::rbt::RemoveRange<K>(tree, first, end);                                               \
  }                                                                                              \
  RbtNode *P##_Find(RbtTree *tree, KeyT key) { return coffer::rbt::Find<K>(tree, key); }         \
  RbtNode *P##_LowerBound(RbtTree *tree, KeyT key) {                                             \
    return coffer::rbt::LowerBound<K>(tree, key);                                                \
  }                                                                                              \
  RbtNode *P##_UpperBound(RbtTree *tree, KeyT key) {                                             \
    return coffer::rbt::UpperBound<K>(tree, key);                                                \
  }                                                                                              \
  RbtNode *P##_First(RbtTree *tree) { return coffer::rbt::First(tree); }                         \
  RbtNode *P##_Next(RbtTree *tree, RbtNode *node) { return coffer::rbt::Next(tree, node); }      \
  RbtNode *P##_Prev(RbtTree *tree, RbtNode *node) { return coffer::rbt::Prev(tree, node); }      \
  }

#endif
