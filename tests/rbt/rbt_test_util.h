// Test scaffolding for the red-black trees: per-family traits, a textbook
// red-black tree (pointer based, sentinel, successor-copy deletion) to run
// side by side with the library, and one checker of invariants and shape.
#ifndef COFFER_TESTS_RBT_TEST_UTIL_H
#define COFFER_TESTS_RBT_TEST_UTIL_H

#include <gtest/gtest.h>

#include <coffer/rbt.h>

#include <algorithm>
#include <cstdint>
#include <deque>
#include <random>
#include <string>
#include <tuple>
#include <vector>

#include "mempool/pool.h"

namespace rbt_test {

inline RbtTreeData *DataOf(const RbtTree *t) { return static_cast<RbtTreeData *>(t->data); }
inline RbtNode *NodeAt(const RbtTree *t, PoolOffset off) { return coffer::RecordAt<RbtNode>(t, off); }
inline RbtNode *NilOf(const RbtTree *t) { return NodeAt(t, DataOf(t)->nil); }
inline RbtNode *RootOf(const RbtTree *t) { return NodeAt(t, DataOf(t)->root); }
inline CofferVal ValOr0(const RbtNode *n) { return n ? n->val : 0; }

// Each family's calls under one set of names, its key type, an order written
// independently of the library's, and keys with many repeats.
#define RBT_TEST_FAMILY_CALLS(P, KEYARG)                                                         \
  static RbtTree *AllocEx(MemPool *p) { return P##_AllocTreeEx(p); }                             \
  static RbtTree *AllocWithNil(MemPool *p, RbtNode *n) { return P##_AllocTreeWithNil(p, n); }    \
  static RbtTree *AllocStd() { return P##_AllocTree(); }                                         \
  static int32_t CreateTreeData(RbtTree *t, RbtNode *n) { return P##_CreateTreeData(t, n); }     \
  static void FreeTree(RbtTree *t) { P##_FreeTree(t); }                                          \
  static void Clear(RbtTree *t) { P##_Clear(t); }                                                \
  static int32_t GetSize(RbtTree *t) { return P##_GetSize(t); }                                  \
  static FreeValFn SetFreeValFn(RbtTree *t, FreeValFn f) { return P##_SetFreeValFn(t, f); }      \
  static MpFreeValFn SetMpFreeValFn(RbtTree *t, MpFreeValFn f) {                                 \
    return P##_SetMpFreeValFn(t, f);                                                             \
  }                                                                                              \
  static void Swap(RbtTree *a, RbtTree *b) { P##_Swap(a, b); }                                   \
  static RbtNode *Insert(RbtTree *t, const Key &k, CofferVal v) {                                \
    return P##_Insert(t, KEYARG(k), v);                                                          \
  }                                                                                              \
  static RbtNode *InsertNoAlloc(RbtTree *t, RbtNode *n, const Key &k, CofferVal v) {             \
    return P##_InsertNoAlloc(t, n, KEYARG(k), v);                                                \
  }                                                                                              \
  static void Remove(RbtTree *t, RbtNode *n) { P##_Remove(t, n); }                               \
  static void RemoveRange(RbtTree *t, RbtNode *a, RbtNode *b) { P##_RemoveRange(t, a, b); }      \
  static RbtNode *Find(RbtTree *t, const Key &k) { return P##_Find(t, KEYARG(k)); }              \
  static RbtNode *LowerBound(RbtTree *t, const Key &k) { return P##_LowerBound(t, KEYARG(k)); }  \
  static RbtNode *UpperBound(RbtTree *t, const Key &k) { return P##_UpperBound(t, KEYARG(k)); }  \
  static RbtNode *First(RbtTree *t) { return P##_First(t); }                                     \
  static RbtNode *Next(RbtTree *t, RbtNode *n) { return P##_Next(t, n); }                        \
  static RbtNode *Prev(RbtTree *t, RbtNode *n) { return P##_Prev(t, n); }

#define RBT_TEST_STR_ARG(k) (k).c_str()
#define RBT_TEST_INT_ARG(k) (k)
#define RBT_TEST_PTR_ARG(k) reinterpret_cast<const void *>(k)

struct StringFamily {
  using Key = std::string;
  static constexpr bool kCopiesKey = true;
  RBT_TEST_FAMILY_CALLS(RBT, RBT_TEST_STR_ARG)
  static Key KeyOf(const RbtTree *t, const RbtNode *n) { return coffer::RecordAt<char>(t, n->key); }
  static Key MakeKey(int i) { return std::string(1, static_cast<char>('a' + i)); }
  // Bytes as signed values, the terminator included as 0.
  static bool Less(const Key &a, const Key &b) {
    size_t i = 0;
    while (a.c_str()[i] == b.c_str()[i] && a.c_str()[i]) ++i;
    return static_cast<signed char>(a.c_str()[i]) < static_cast<signed char>(b.c_str()[i]);
  }
  // Short keys over a, b and the high byte 0xE9, and runs of p of any length
  // with a tail, prefixes of one another, where the descent skips the most.
  static Key RandomKey(std::mt19937 &rng) {
    const char *tails = rng() % 4 == 0 ? "p\x90q" : "ab\xE9";
    Key k(tails[0] == 'p' ? rng() % 40 : 0, 'p');
    for (unsigned n = rng() % 4; n; --n) k += tails[rng() % 3];
    return k;
  }
};

struct Int32Family {
  using Key = int32_t;
  static constexpr bool kCopiesKey = false;
  RBT_TEST_FAMILY_CALLS(RbtInt32, RBT_TEST_INT_ARG)
  static Key KeyOf(const RbtTree *, const RbtNode *n) { return static_cast<int32_t>(n->key); }
  static Key MakeKey(int i) { return i - 3; }
  // Serial order: a before b when b lies 1 to 2^31 steps after a.
  static bool Less(Key a, Key b) {
    uint32_t d = static_cast<uint32_t>(b) - static_cast<uint32_t>(a);
    return d != 0 && d <= 0x80000000u;
  }
  static Key RandomKey(std::mt19937 &rng) { return static_cast<int32_t>(rng() % 41) - 20; }
};

// Keys across the signed wrap-around, where serial and signed order disagree.
struct Int32WrapFamily : Int32Family {
  static Key RandomKey(std::mt19937 &rng) {
    return static_cast<int32_t>(0x7FFFFFECu + rng() % 41);
  }
};

struct VoidPtrFamily {
  using Key = uintptr_t;
  static constexpr bool kCopiesKey = false;
  RBT_TEST_FAMILY_CALLS(RbtVoidPtr, RBT_TEST_PTR_ARG)
  static Key KeyOf(const RbtTree *, const RbtNode *n) { return n->key; }
  static Key MakeKey(int i) { return 0x7FFFFFFEu + i; }
  static bool Less(Key a, Key b) { return a < b; }
  static Key RandomKey(std::mt19937 &rng) {
    static const Key kEdges[] = {0, 1, 0x7FFFFFFFu, 0x80000000u, 0x80000001u, 0xFFFFFFFFu};
    return rng() % 3 == 0 ? kEdges[rng() % 6] : 0x7FFFFFF0u + rng() % 32;
  }
};

// RB-INSERT with RB-INSERT-FIXUP, RB-DELETE copying the successor's contents
// into the removed node, RB-DELETE-FIXUP and the rotations, on nodes with
// one sentinel; c[0] is left, c[1] right, and each mirror pair is written once
// over a side d. Equal keys go right.
template <class Fam>
class Model {
 public:
  using Key = typename Fam::Key;
  struct Node {
    Node *p, *c[2];
    bool red;
    Key key;
    CofferVal val;
  };

  Model() : nil_(New(Node{nullptr, {nullptr, nullptr}, false, Key(), 0})), root_(nil_) {
    nil_->p = nil_->c[0] = nil_->c[1] = nil_;
  }
  Node *nil() const { return nil_; }
  Node *root() const { return root_; }
  size_t size() const { return size_; }

  void Insert(const Key &key, CofferVal val) {
    Node *z = New(Node{nil_, {nil_, nil_}, true, key, val}), *y = nil_;
    for (Node *x = root_; x != nil_; x = x->c[!Fam::Less(key, x->key)]) y = x;
    z->p = y;
    (y == nil_ ? root_ : y->c[!Fam::Less(key, y->key)]) = z;
    ++size_;
    while (z->p->red) {
      Node *g = z->p->p;
      int d = z->p == g->c[1];
      Node *u = g->c[!d];
      if (u->red) {
        z->p->red = u->red = false;
        g->red = true;
        z = g;
        continue;
      }
      if (z == z->p->c[!d]) Rotate(z = z->p, d);
      z->p->red = false;
      z->p->p->red = true;
      Rotate(z->p->p, !d);
    }
    root_->red = false;
  }

  // Removes the node that currently holds val.
  void Remove(CofferVal val) {
    Node *z = FindVal(root_, val);
    Node *y = (z->c[0] == nil_ || z->c[1] == nil_) ? z : Successor(z);
    Node *x = y->c[0] != nil_ ? y->c[0] : y->c[1];
    x->p = y->p;
    (y->p == nil_ ? root_ : y->p->c[y == y->p->c[1]]) = x;
    if (y != z) z->key = y->key, z->val = y->val;
    if (!y->red) DeleteFixup(x);
    --size_;
  }

  // The nodes in order (a plain walk, independent of any search).
  std::vector<const Node *> InOrder() const {
    std::vector<const Node *> v;
    auto walk = [&](auto &self, const Node *x) -> void {
      if (x == nil_) return;
      self(self, x->c[0]);
      v.push_back(x);
      self(self, x->c[1]);
    };
    walk(walk, root_);
    return v;
  }

  // The first equal node on the path from the root; nullptr if none.
  const Node *FindOnPath(const Key &key) const {
    Node *x = root_;
    while (x != nil_ && (Fam::Less(key, x->key) || Fam::Less(x->key, key)))
      x = x->c[!Fam::Less(key, x->key)];
    return x == nil_ ? nullptr : x;
  }

 private:
  Node *FindVal(Node *x, CofferVal val) {
    if (x == nil_ || x->val == val) return x;
    Node *l = FindVal(x->c[0], val);
    return l != nil_ ? l : FindVal(x->c[1], val);
  }
  Node *Successor(Node *x) const {  // only called with a right child
    for (x = x->c[1]; x->c[0] != nil_;) x = x->c[0];
    return x;
  }
  // d = 0 is LEFT-ROTATE (x's right child rises), d = 1 RIGHT-ROTATE.
  void Rotate(Node *x, int d) {
    Node *y = x->c[!d];
    x->c[!d] = y->c[d];
    if (y->c[d] != nil_) y->c[d]->p = x;
    y->p = x->p;
    (x->p == nil_ ? root_ : x->p->c[x == x->p->c[1]]) = y;
    y->c[d] = x;
    x->p = y;
  }
  void DeleteFixup(Node *x) {
    while (x != root_ && !x->red) {
      int d = x != x->p->c[0];
      Node *w = x->p->c[!d];
      if (w->red) {
        w->red = false;
        x->p->red = true;
        Rotate(x->p, d);
        w = x->p->c[!d];
      }
      if (!w->c[0]->red && !w->c[1]->red) {
        w->red = true;
        x = x->p;
        continue;
      }
      if (!w->c[!d]->red) {
        w->c[d]->red = false;
        w->red = true;
        Rotate(w, !d);
        w = x->p->c[!d];
      }
      w->red = x->p->red;
      x->p->red = false;
      w->c[!d]->red = false;
      Rotate(x->p, d);
      x = root_;
    }
    x->red = false;
  }
  Node *New(const Node &n) { return &store_.emplace_back(n); }

  std::deque<Node> store_;  // nodes live as long as the model
  Node *nil_, *root_;
  size_t size_ = 0;
};

// The sentinel as created (nilKey: the key it kept), links never 0, parent
// links, red-black rules, key order with equal keys in insertion order (values
// rise with insertion), size; with a model, the same shape, keys, values and
// colours node by node.
template <class Fam>
void CheckTree(const RbtTree *t, uint32_t nilKey, const Model<Fam> *m = nullptr) {
  using MNode = typename Model<Fam>::Node;
  const RbtTreeData *d = DataOf(t);
  const RbtNode *nil = NilOf(t);
  ASSERT_EQ(std::make_tuple(nil->left, nil->right, +nil->color, +nil->ownsNode, nil->val, nil->key),
            std::make_tuple(d->nil, d->nil, 0, 1, CofferVal{0}, nilKey));
  ASSERT_EQ(RootOf(t)->color, 0);
  ASSERT_TRUE(d->root == d->nil || RootOf(t)->parent == d->nil);
  uint32_t count = 0;
  const RbtNode *prev = nullptr;
  // Black height of the subtree at off, -1 after a failure.
  auto visit = [&](auto &self, PoolOffset off, const MNode *mn) -> int {
    if (m && (off == d->nil) != (mn == m->nil())) return ADD_FAILURE() << "shape differs", -1;
    if (off == d->nil) return 1;
    const RbtNode *x = NodeAt(t, off);
    if (x->color > 1) return ADD_FAILURE() << "bad colour", -1;
    if (m && (Fam::KeyOf(t, x) != mn->key || x->val != mn->val || (x->color == 1) != mn->red))
      return ADD_FAILURE() << "node of val " << x->val << " differs from model " << mn->val, -1;
    for (PoolOffset c : {x->left, x->right}) {
      if (c == 0) return ADD_FAILURE() << "a link is 0 instead of the sentinel", -1;
      if (c != d->nil && NodeAt(t, c)->parent != off) return ADD_FAILURE() << "parent link", -1;
      if (c != d->nil && x->color == 1 && NodeAt(t, c)->color == 1)
        return ADD_FAILURE() << "red node with a red child", -1;
    }
    int lh = self(self, x->left, m ? mn->c[0] : nullptr);
    if (lh < 0) return -1;
    if (prev) {
      auto pk = Fam::KeyOf(t, prev), xk = Fam::KeyOf(t, x);
      if (Fam::Less(xk, pk) || (!Fam::Less(pk, xk) && prev->val >= x->val))
        return ADD_FAILURE() << "out of order at val " << x->val, -1;
    }
    prev = x;
    ++count;
    int rh = self(self, x->right, m ? mn->c[1] : nullptr);
    if (rh < 0) return -1;
    if (lh != rh) return ADD_FAILURE() << "black heights differ", -1;
    return lh + (x->color == 0);
  };
  ASSERT_GE(visit(visit, d->root, m ? m->root() : nullptr), 0);
  ASSERT_EQ(count, d->size);
  ASSERT_EQ(count, m ? m->size() : count);
}

// Values in ascending order through First/Next.
template <class Fam>
std::vector<CofferVal> ValsInOrder(RbtTree *t) {
  std::vector<CofferVal> v;
  for (RbtNode *n = Fam::First(t); n; n = Fam::Next(t, n)) v.push_back(n->val);
  return v;
}

}  // namespace rbt_test

#endif
