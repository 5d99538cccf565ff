// Test scaffolding for the red-black trees: per-family traits, a textbook
// red-black tree (pointer based, sentinel, successor-copy deletion) to run
// side by side with the library, an invariant checker and a shape comparison.
#ifndef COFFER_TESTS_RBT_TEST_UTIL_H
#define COFFER_TESTS_RBT_TEST_UTIL_H

#include <gtest/gtest.h>

#include <coffer/rbt.h>

#include <algorithm>
#include <cstdint>
#include <map>
#include <random>
#include <string>
#include <vector>

#include "mempool/pool.h"

namespace rbt_test {

inline RbtTreeData *DataOf(const RbtTree *t) { return static_cast<RbtTreeData *>(t->data); }
inline RbtNode *NodeAt(const RbtTree *t, PoolOffset off) { return coffer::At<RbtNode>(t, off); }
inline RbtNode *NilOf(const RbtTree *t) { return NodeAt(t, DataOf(t)->nil); }
inline RbtNode *RootOf(const RbtTree *t) { return NodeAt(t, DataOf(t)->root); }

// ---- family traits ----------------------------------------------------------
// Each family's calls under one set of names, its key type for the model, an
// order written independently of the library's, and a key generator that
// yields many equal keys.

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
  static Key KeyOf(const RbtTree *t, const RbtNode *n) { return coffer::At<char>(t, n->key); }
  // Bytes as signed values, the terminator included as 0.
  static bool Less(const Key &a, const Key &b) {
    std::vector<signed char> x(a.begin(), a.end()), y(b.begin(), b.end());
    x.push_back(0);
    y.push_back(0);
    return std::lexicographical_compare(x.begin(), x.end(), y.begin(), y.end());
  }
  // Short keys over a, b and the high byte 0xE9 (prefixes of one another,
  // many repeats), and keys behind a long common prefix.
  static Key RandomKey(std::mt19937 &rng) {
    static const char kShort[] = {'a', 'b', '\xE9'};
    static const char kLong[] = {'x', '\x90', 'y'};
    Key k;
    if (rng() % 4 == 0) {
      k = "a-rather-long-common-prefix/";
      for (unsigned n = rng() % 3; n; --n) k += kLong[rng() % 3];
    } else {
      for (unsigned n = rng() % 4; n; --n) k += kShort[rng() % 3];
    }
    return k;
  }
};

struct Int32Family {
  using Key = int32_t;
  static constexpr bool kCopiesKey = false;
  RBT_TEST_FAMILY_CALLS(RbtInt32, RBT_TEST_INT_ARG)
  static Key KeyOf(const RbtTree *, const RbtNode *n) { return static_cast<int32_t>(n->key); }
  // Serial order: a before b when b lies 1 to 2^31 steps after a.
  static bool Less(Key a, Key b) {
    uint32_t d = static_cast<uint32_t>(b) - static_cast<uint32_t>(a);
    return d != 0 && d <= 0x80000000u;
  }
  static Key RandomKey(std::mt19937 &rng) { return static_cast<int32_t>(rng() % 41) - 20; }
};

// Keys on both sides of the signed wrap-around, where serial order and
// signed order disagree (INT32_MAX comes before INT32_MIN).
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
  static bool Less(Key a, Key b) { return a < b; }
  static Key RandomKey(std::mt19937 &rng) {
    static const Key kEdges[] = {0, 1, 0x7FFFFFFFu, 0x80000000u, 0x80000001u, 0xFFFFFFFFu};
    return rng() % 3 == 0 ? kEdges[rng() % 6] : 0x7FFFFFF0u + rng() % 32;
  }
};

template <class Fam>
struct KeyLess {
  bool operator()(const typename Fam::Key &a, const typename Fam::Key &b) const {
    return Fam::Less(a, b);
  }
};

// ---- textbook model -----------------------------------------------------------
// RB-INSERT with RB-INSERT-FIXUP, RB-DELETE that copies the successor's
// contents into the removed node, RB-DELETE-FIXUP, LEFT-/RIGHT-ROTATE, on
// heap nodes with one sentinel. Equal keys go right.
template <class Fam>
class Model {
 public:
  using Key = typename Fam::Key;
  struct Node {
    Node *p, *l, *r;
    bool red;
    Key key;
    CofferVal val;
  };

  Model() {
    nil_ = new Node{nullptr, nullptr, nullptr, false, Key(), 0};
    nil_->p = nil_->l = nil_->r = nil_;
    root_ = nil_;
  }
  ~Model() {
    Destroy(root_);
    delete nil_;
  }
  Model(const Model &) = delete;
  Model &operator=(const Model &) = delete;

  Node *nil() const { return nil_; }
  Node *root() const { return root_; }
  size_t size() const { return byVal_.size(); }

  void Insert(const Key &key, CofferVal val) {
    Node *z = new Node{nil_, nil_, nil_, true, key, val};
    byVal_[val] = z;
    Node *y = nil_;
    for (Node *x = root_; x != nil_; x = Fam::Less(key, x->key) ? x->l : x->r) y = x;
    z->p = y;
    if (y == nil_)
      root_ = z;
    else if (Fam::Less(key, y->key))
      y->l = z;
    else
      y->r = z;
    while (z->p->red) {
      Node *g = z->p->p;
      if (z->p == g->l) {
        Node *u = g->r;
        if (u->red) {
          z->p->red = u->red = false;
          g->red = true;
          z = g;
        } else {
          if (z == z->p->r) {
            z = z->p;
            RotateLeft(z);
          }
          z->p->red = false;
          z->p->p->red = true;
          RotateRight(z->p->p);
        }
      } else {
        Node *u = g->l;
        if (u->red) {
          z->p->red = u->red = false;
          g->red = true;
          z = g;
        } else {
          if (z == z->p->l) {
            z = z->p;
            RotateRight(z);
          }
          z->p->red = false;
          z->p->p->red = true;
          RotateLeft(z->p->p);
        }
      }
    }
    root_->red = false;
  }

  // Removes the node that currently holds val.
  void Remove(CofferVal val) {
    Node *z = byVal_.at(val);
    byVal_.erase(val);
    Node *y = (z->l == nil_ || z->r == nil_) ? z : Successor(z);
    Node *x = y->l != nil_ ? y->l : y->r;
    x->p = y->p;
    if (y->p == nil_)
      root_ = x;
    else if (y == y->p->l)
      y->p->l = x;
    else
      y->p->r = x;
    if (y != z) {
      z->key = y->key;
      z->val = y->val;
      byVal_[z->val] = z;
    }
    if (!y->red) DeleteFixup(x);
    delete y;
  }

  // The first equal node on the path from the root; nullptr if none.
  const Node *FindOnPath(const Key &key) const {
    for (Node *x = root_; x != nil_;) {
      if (Fam::Less(key, x->key))
        x = x->l;
      else if (Fam::Less(x->key, key))
        x = x->r;
      else
        return x;
    }
    return nullptr;
  }

 private:
  Node *Successor(Node *x) const {
    if (x->r != nil_) {
      x = x->r;
      while (x->l != nil_) x = x->l;
      return x;
    }
    Node *y = x->p;
    while (y != nil_ && x == y->r) x = y, y = y->p;
    return y;
  }

  void RotateLeft(Node *x) {
    Node *y = x->r;
    x->r = y->l;
    if (y->l != nil_) y->l->p = x;
    y->p = x->p;
    if (x->p == nil_)
      root_ = y;
    else if (x == x->p->l)
      x->p->l = y;
    else
      x->p->r = y;
    y->l = x;
    x->p = y;
  }

  void RotateRight(Node *x) {
    Node *y = x->l;
    x->l = y->r;
    if (y->r != nil_) y->r->p = x;
    y->p = x->p;
    if (x->p == nil_)
      root_ = y;
    else if (x == x->p->r)
      x->p->r = y;
    else
      x->p->l = y;
    y->r = x;
    x->p = y;
  }

  void DeleteFixup(Node *x) {
    while (x != root_ && !x->red) {
      if (x == x->p->l) {
        Node *w = x->p->r;
        if (w->red) {
          w->red = false;
          x->p->red = true;
          RotateLeft(x->p);
          w = x->p->r;
        }
        if (!w->l->red && !w->r->red) {
          w->red = true;
          x = x->p;
        } else {
          if (!w->r->red) {
            w->l->red = false;
            w->red = true;
            RotateRight(w);
            w = x->p->r;
          }
          w->red = x->p->red;
          x->p->red = false;
          w->r->red = false;
          RotateLeft(x->p);
          x = root_;
        }
      } else {
        Node *w = x->p->l;
        if (w->red) {
          w->red = false;
          x->p->red = true;
          RotateRight(x->p);
          w = x->p->l;
        }
        if (!w->r->red && !w->l->red) {
          w->red = true;
          x = x->p;
        } else {
          if (!w->l->red) {
            w->r->red = false;
            w->red = true;
            RotateLeft(w);
            w = x->p->l;
          }
          w->red = x->p->red;
          x->p->red = false;
          w->l->red = false;
          RotateRight(x->p);
          x = root_;
        }
      }
    }
    x->red = false;
  }

  void Destroy(Node *x) {
    if (x == nil_) return;
    Destroy(x->l);
    Destroy(x->r);
    delete x;
  }

  Node *nil_;
  Node *root_;
  std::map<CofferVal, Node *> byVal_;
};

// ---- checks on the library's tree -------------------------------------------

// Red-black and search-tree invariants, parent links, size, and the sentinel
// (left, right, colour, ownsNode, val and key as they were at creation).
// Values are assigned in insertion order, so equal keys must show rising
// values.
template <class Fam>
void CheckInvariants(const RbtTree *t, uint32_t nilKey) {
  const RbtTreeData *d = DataOf(t);
  const RbtNode *nil = NilOf(t);
  ASSERT_EQ(nil->left, d->nil);
  ASSERT_EQ(nil->right, d->nil);
  ASSERT_EQ(nil->color, 0);
  ASSERT_EQ(nil->ownsNode, 1);
  ASSERT_EQ(nil->val, 0u);
  ASSERT_EQ(nil->key, nilKey);
  if (d->root == d->nil) {
    ASSERT_EQ(d->size, 0u);
    return;
  }
  const RbtNode *root = RootOf(t);
  ASSERT_EQ(root->parent, d->nil);
  ASSERT_EQ(root->color, 0);

  struct Walk {
    const RbtTree *t;
    PoolOffset nilOff;
    uint32_t count = 0;
    const RbtNode *prev = nullptr;
    // Returns the black height, or -1 after a failure.
    int Visit(PoolOffset off) {
      if (off == nilOff) return 1;
      const RbtNode *x = NodeAt(t, off);
      if (x->color > 1) return ADD_FAILURE() << "bad colour", -1;
      for (PoolOffset c : {x->left, x->right}) {
        if (c == 0) return ADD_FAILURE() << "a link is 0 instead of the sentinel", -1;
        if (c != nilOff && NodeAt(t, c)->parent != off)
          return ADD_FAILURE() << "parent link broken", -1;
        if (c != nilOff && x->color == 1 && NodeAt(t, c)->color == 1)
          return ADD_FAILURE() << "red node with a red child", -1;
      }
      int lh = Visit(x->left);
      if (lh < 0) return -1;
      if (prev) {
        auto pk = Fam::KeyOf(t, prev), xk = Fam::KeyOf(t, x);
        if (Fam::Less(xk, pk)) return ADD_FAILURE() << "keys out of order", -1;
        if (!Fam::Less(pk, xk) && prev->val >= x->val)
          return ADD_FAILURE() << "equal keys out of insertion order", -1;
      }
      prev = x;
      ++count;
      int rh = Visit(x->right);
      if (rh < 0) return -1;
      if (lh != rh) return ADD_FAILURE() << "black heights differ", -1;
      return lh + (x->color == 0);
    }
  } walk{t, d->nil};
  ASSERT_GE(walk.Visit(d->root), 0);
  ASSERT_EQ(walk.count, d->size);
}

// Same shape, colours, keys and values as the model, node by node.
template <class Fam>
void CompareShape(const RbtTree *t, const Model<Fam> &m) {
  struct Walk {
    const RbtTree *t;
    const Model<Fam> &m;
    PoolOffset nilOff;
    bool Same(PoolOffset off, const typename Model<Fam>::Node *n) {
      if (n == m.nil()) {
        if (off == nilOff) return true;
        return ADD_FAILURE() << "tree has a node where the model has none", false;
      }
      if (off == nilOff) return ADD_FAILURE() << "tree lacks a node the model has", false;
      const RbtNode *x = NodeAt(t, off);
      if (Fam::KeyOf(t, x) != n->key || x->val != n->val || (x->color == 1) != n->red)
        return ADD_FAILURE() << "node differs: val " << x->val << " vs model " << n->val,
               false;
      return Same(x->left, n->l) && Same(x->right, n->r);
    }
  } walk{t, m, DataOf(t)->nil};
  ASSERT_TRUE(walk.Same(DataOf(t)->root, m.root()));
  ASSERT_EQ(static_cast<size_t>(DataOf(t)->size), m.size());
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
