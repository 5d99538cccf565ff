// SPDX-License-Identifier: MIT
// The three red-black tree families against a vector of entries in key
// order (equal keys in insertion order); the balancing itself is left to the
// library's checker.
#include <coffer/rbt.h>

#include <algorithm>
#include <cstring>

#include "rbt/rbt_internal.h"
#include "support/driver.h"

namespace coffer_test {
namespace {

#define FAMILY_CALLS(P)                                      \
  static constexpr auto allocEx = P##_AllocTreeEx;           \
  static constexpr auto allocWithNil = P##_AllocTreeWithNil; \
  static constexpr auto freeTree = P##_FreeTree;             \
  static constexpr auto clear = P##_Clear;                   \
  static constexpr auto swap = P##_Swap;                     \
  static constexpr auto insert = P##_Insert;                 \
  static constexpr auto insertNoAlloc = P##_InsertNoAlloc;   \
  static constexpr auto remove = P##_Remove;                 \
  static constexpr auto removeRange = P##_RemoveRange;       \
  static constexpr auto find = P##_Find;                     \
  static constexpr auto lowerBound = P##_LowerBound;         \
  static constexpr auto upperBound = P##_UpperBound;         \
  static constexpr auto first = P##_First;                   \
  static constexpr auto next = P##_Next;                     \
  static constexpr auto prev = P##_Prev;                     \
  static constexpr auto size = P##_GetSize;                  \
  static constexpr auto setFreeValFn = P##_SetFreeValFn;

struct Strings {
  FAMILY_CALLS(RBT)
  using Key = std::string;
  static constexpr coffer::RbtKeyKind kKind = coffer::kRbtStringKeys;
  static const char *Pass(const Key &k) { return k.c_str(); }
  static Key KeyOf(RbtTree *t, const RbtNode *n) { return coffer::RecordAt<char>(t, n->key); }
  // Bytes as signed values, the terminator counting as 0.
  static int Compare(const Key &a, const Key &b) {
    size_t i = 0;
    while (a.c_str()[i] == b.c_str()[i] && a.c_str()[i]) ++i;
    return static_cast<signed char>(a.c_str()[i]) - static_cast<signed char>(b.c_str()[i]);
  }
  // Runs of p make keys that are prefixes of one another, where the
  // descent skips the most; 0xE9 reads as negative.
  static Key Make(Ops &ops, uint32_t) {
    return std::string(ops.Take(2) ? ops.Take(24) : 0, 'p') + ops.Key("ab\xE9p", 3);
  }
};

struct Int32s {
  FAMILY_CALLS(RbtInt32)
  using Key = int32_t;
  static constexpr coffer::RbtKeyKind kKind = coffer::kRbtInt32Keys;
  static Key Pass(Key k) { return k; }
  static Key KeyOf(RbtTree *, const RbtNode *n) { return static_cast<int32_t>(n->key); }
  // Serial order: a before b when b lies 1 to 2^31 - 1 steps after a.
  static int Compare(Key a, Key b) {
    uint32_t d = static_cast<uint32_t>(b) - static_cast<uint32_t>(a);
    return d == 0 ? 0 : d < 0x80000000u ? -1 : 1;
  }
  // Around 0, or across the wrap from 2^31 - 1 to -2^31, where serial and
  // signed order part.
  static Key Make(Ops &ops, uint32_t range) {
    return static_cast<int32_t>((range ? 0x7FFFFFECu : 0xFFFFFFECu) + ops.Take(41));
  }
};

struct Pointers {
  FAMILY_CALLS(RbtVoidPtr)
  using Key = uintptr_t;
  static constexpr coffer::RbtKeyKind kKind = coffer::kRbtVoidPtrKeys;
  static const void *Pass(Key k) { return reinterpret_cast<const void *>(k); }
  static Key KeyOf(RbtTree *, const RbtNode *n) { return n->key; }
  static int Compare(Key a, Key b) { return a < b ? -1 : a > b; }
  static Key Make(Ops &ops, uint32_t) {
    static const Key kEdges[] = {0, 1, 0x7FFFFFFFu, 0x80000000u, 0xFFFFFFFFu};
    return ops.Take(3) ? 0x7FFFFFF0u + ops.Take(32) : kEdges[ops.Take(5)];
  }
};

template <class F>
struct Entry {
  typename F::Key key;
  CofferVal val;
  RbtNode *node;
};
template <class F>
using Model = std::vector<Entry<F>>;
// The position of k's lower bound (the first entry not before it) or, past
// its equal run, of its upper bound.
template <class F>
size_t Bound(const Model<F> &m, const typename F::Key &k, bool past) {
  return std::partition_point(m.begin(), m.end(), [&](const Entry<F> &x) { return F::Compare(x.key, k) < past; }) - m.begin();
}

// The first node equal to k on the path from the root, found through the
// tree's own links with the model's order.
template <class F>
RbtNode *FirstEqualOnPath(RbtTree *t, const typename F::Key &k) {
  auto *d = static_cast<RbtTreeData *>(t->data);
  for (PoolOffset x = d->root; x != d->nil;) {
    RbtNode *n = coffer::RecordAt<RbtNode>(t, x);
    int c = F::Compare(k, F::KeyOf(t, n));
    if (c == 0) return n;
    x = c < 0 ? n->left : n->right;
  }
  return nullptr;
}

template <class F>
std::string Compare(RbtTree *t, const Model<F> &m, TestPool *tp) {
  MODEL_EXPECT(F::size(t) == static_cast<int32_t>(m.size()));
  RbtNode *n = F::first(t);
  for (const auto &x : m) {
    MODEL_EXPECT(n == x.node && F::Compare(F::KeyOf(t, n), x.key) == 0 && n->val == x.val);
    if constexpr (F::kKind == coffer::kRbtStringKeys)
      MODEL_EXPECT(!tp || tp->SizeOf(coffer::RecordAt<char>(t, n->key)) == x.key.size() + 1);
    n = F::next(t, n);
  }
  MODEL_EXPECT(n == nullptr);
  n = F::prev(t, nullptr);
  for (auto it = m.rbegin(); it != m.rend(); ++it, n = F::prev(t, n)) MODEL_EXPECT(n == it->node);
  MODEL_EXPECT(n == nullptr);
  coffer::CheckFault fault;
  MODEL_EXPECT(coffer::RBTCheckTree(t, F::kKind, &fault));
  return "";
}

// The release callback, which also notes the tree's size: a value goes while
// its node is still counted.
template <class F>
RbtTree *g_tree;
std::vector<int32_t> g_sizes;
template <class F>
void Release(CofferVal val) {
  RecordRelease(val);
  g_sizes.push_back(F::size(g_tree<F>));
}

template <class F>
std::string Run(Ops &ops, Arena arena) {
  using Key = typename F::Key;
  const uint32_t range = ops.Take(2);
  RbtNode nils[2], spare[16];
  std::memset(nils, 0xA5, sizeof nils);  // the tree sets every field of a caller's sentinel,
  nils[0].key = nils[1].key = 0xC0FFEE;  // but its key, which it keeps
  RbtNode *lent = ops.Take(2) ? &nils[0] : nullptr;  // the sentinel lent to the tree
  OpWatch made(arena.tp);
  RbtTree *t = lent ? F::allocWithNil(arena.pool, lent) : F::allocEx(arena.pool);
  if (!t) return made.Refused() ? "" : "creation failed unrefused";
  F::setFreeValFn(g_tree<F> = t, Release<F>);
  Model<F> m;
  size_t spareUsed = 0;
  for (CofferVal next = 1; ops.More(); next++) {
    Releases().clear(), g_sizes.clear();
    std::vector<CofferVal> dropped;
    OpWatch op(arena.tp);
    const size_t n = m.size();
    const uint32_t kind = ops.Take(16);
    Key k = F::Make(ops, range);
    if (kind < 6) {  // insert, now and then into a caller's node
      RbtNode *mine = kind == 5 && spareUsed < 16 ? &spare[spareUsed] : nullptr;
      RbtNode before = mine ? *mine : RbtNode{};
      RbtNode *got = mine ? F::insertNoAlloc(t, mine, F::Pass(k), next) : F::insert(t, F::Pass(k), next);
      MODEL_EXPECT(!got == op.Refused() && (!mine || got == mine || !std::memcmp(mine, &before, sizeof before)));
      if (got) {
        MODEL_EXPECT(got->ownsNode == !mine && (mine || !arena.tp || arena.tp->SizeOf(got) == sizeof(RbtNode)));
        // Into a caller's node only the string family allocates: its key.
        MODEL_EXPECT(!mine || !arena.tp || arena.tp->calls() - op.start == (F::kKind == coffer::kRbtStringKeys));
        m.insert(m.begin() + Bound(m, k, true), {k, next, got});
        spareUsed += mine != nullptr;
      }
    } else if (kind < 9 && n) {  // remove one node
      size_t i = ops.Take(n);
      dropped.push_back(m[i].val);
      F::remove(t, m[i].node);
      m.erase(m.begin() + i);
    } else if (kind < 11 && n) {  // remove between two positions (to the end: null)
      size_t i = ops.Take(n), j = std::min(n, i + ops.Take(6));
      for (size_t x = i; x < j; x++) dropped.push_back(m[x].val);
      F::removeRange(t, m[i].node, j < n ? m[j].node : nullptr);  // i == j: first == end
      m.erase(m.begin() + i, m.begin() + j);
    } else if (kind < 12) {  // remove the run of keys equal to k, delimited by the bounds
      size_t i = Bound(m, k, false), j = Bound(m, k, true);
      RbtNode *lo = F::lowerBound(t, F::Pass(k)), *hi = F::upperBound(t, F::Pass(k));
      MODEL_EXPECT(lo == (i < n ? m[i].node : nullptr) && hi == (j < n ? m[j].node : nullptr));
      MODEL_EXPECT(F::find(t, F::Pass(k)) == FirstEqualOnPath<F>(t, k));
      for (size_t x = i; x < j; x++) dropped.push_back(m[x].val);
      if (lo) F::removeRange(t, lo, hi);
      m.erase(m.begin() + i, m.begin() + j);
    } else if (kind < 14) {  // swap the content into a new tree and free the old one:
      // each sentinel, with its ownership, goes with the content, so neither a
      // caller's sentinel is released nor the tree's own left behind
      RbtNode *lend = ops.Take(2) ? (lent == &nils[0] ? &nils[1] : &nils[0]) : nullptr;
      RbtTree *other = lend ? F::allocWithNil(arena.pool, lend) : F::allocEx(arena.pool);
      MODEL_EXPECT(other || op.Refused());
      if (!other) continue;
      F::setFreeValFn(other, Release<F>);  // callbacks stay with their handles
      F::swap(t, other);
      MODEL_EXPECT(F::size(t) == 0 && F::first(t) == nullptr);
      F::freeTree(t);
      g_tree<F> = t = other;
    } else if (kind == 14) {
      for (const auto &x : m) dropped.push_back(x.val);
      F::clear(t);
      m.clear();
    } else if (arena.tp) {
      arena.tp->FailAt(arena.tp->calls());
    }
    MODEL_EXPECT(ReleasedVals() == dropped);
    for (size_t i = 0; i < dropped.size(); i++) MODEL_EXPECT(g_sizes[i] >= static_cast<int32_t>(n - i));
    MODEL_TRY(Compare<F>(t, m, arena.tp));
  }
  Releases().clear();
  F::freeTree(t);
  std::vector<CofferVal> rest;
  for (const auto &x : m) rest.push_back(x.val);
  MODEL_EXPECT(ReleasedVals() == rest && nils[0].key == 0xC0FFEE && nils[1].key == 0xC0FFEE);
  return "";
}

}  // namespace

std::string RunRbtModel(Ops &ops, Arena arena) {
  switch (ops.Take(3)) {
    case 0: return Run<Strings>(ops, arena);
    case 1: return Run<Int32s>(ops, arena);
    default: return Run<Pointers>(ops, arena);
  }
}

}  // namespace coffer_test
