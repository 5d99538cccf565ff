// Sorted string array: differential test against a vector model, failure
// injection at every allocation point, release order, and the sharp edges.
#include <coffer/esa.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <climits>
#include <cstring>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "esa/esa_internal.h"
#include "pool_log.h"
#include "support/test_pool.h"

using coffer_test::Released;
using coffer_test::ReleasedPools;
using coffer_test::TestPool;

namespace {

int32_t Capacity(EsaArray *a) { return static_cast<EsaArrayData *>(a->data)->capacity; }

std::vector<std::string> Keys(EsaArray *a) {
  std::vector<std::string> out;
  for (int32_t i = 0; i < ESA_GetSize(a); i++) out.push_back(ESA_GetKey(a, i));
  return out;
}

// The model: entries in a vector, kept by unsigned-byte order with equal keys
// in insertion order, and the capacity the array must report.
struct Model {
  std::vector<std::pair<std::string, CofferVal>> e;
  int32_t cap = 0;
  int32_t inc = 0;
  int32_t Step() const { return inc > 0 ? inc : 1; }
  void Insert(const std::string &k, CofferVal v) {
    if (static_cast<int32_t>(e.size()) == cap) cap += Step();
    auto pos = std::upper_bound(e.begin(), e.end(), k, [](const std::string &a, const auto &b) {
      return std::strcmp(a.c_str(), b.first.c_str()) < 0;
    });
    e.insert(pos, {k, v});
  }
  void Shrink() {
    if (cap - static_cast<int32_t>(e.size()) >= Step()) cap = static_cast<int32_t>(e.size());
  }
  // The index a bisection of the sorted keys meets first, or -1.
  int32_t Probe(const std::string &k) const {
    int32_t low = 0, high = static_cast<int32_t>(e.size()) - 1;
    while (low <= high) {
      int32_t mid = (low + high) / 2;
      int c = std::strcmp(k.c_str(), e[mid].first.c_str());
      if (c == 0) return mid;
      if (c > 0)
        low = mid + 1;
      else
        high = mid - 1;
    }
    return -1;
  }
};

std::string RandomKey(std::mt19937 &rng) {
  // A small alphabet makes equal keys and prefixes common; the high byte
  // checks unsigned ordering.
  static const char alphabet[] = {'a', 'b', 'B', '\x80', '\xff', '0'};
  std::string k;
  int len = static_cast<int>(rng() % 4);
  for (int i = 0; i < len; i++) k += alphabet[rng() % sizeof alphabet];
  return k;
}

void ExpectSame(EsaArray *a, const Model &m) {
  ASSERT_EQ(ESA_GetSize(a), static_cast<int32_t>(m.e.size()));
  ASSERT_EQ(Capacity(a), m.cap);
  for (size_t i = 0; i < m.e.size(); i++) {
    ASSERT_STREQ(ESA_GetKey(a, i), m.e[i].first.c_str()) << "at " << i;
    ASSERT_EQ(ESA_GetVal(a, i), m.e[i].second) << "at " << i;
  }
}

void RunDifferential(MemPool *pool, int32_t initCap, int32_t inc, unsigned seed) {
  std::mt19937 rng(seed);
  EsaArray *a = ESA_AllocArrayEx(pool, initCap, inc);
  ASSERT_NE(a, nullptr);
  ESA_SetFreeValFn(a, coffer_test::RecordRelease);
  Model m;
  m.cap = initCap;
  m.inc = inc;
  CofferVal next = 1;
  for (int step = 0; step < 4000; step++) {
    Released().clear();
    std::vector<CofferVal> dropped;
    int op = static_cast<int>(rng() % 100);
    int32_t n = static_cast<int32_t>(m.e.size());
    if (op < 45) {
      std::string k = RandomKey(rng);
      ASSERT_TRUE(ESA_Insert(a, k.c_str(), next));
      m.Insert(k, next++);
    } else if (op < 72) {
      // Remove, RemoveRange and Clear against one model: a range.
      int32_t f = static_cast<int32_t>(rng() % (n + 3)) - 1;
      int32_t e = op < 60 ? f + 1 : static_cast<int32_t>(rng() % (n + 3)) - 1;
      if (op >= 70) f = 0, e = n;
      const bool ok = f < e && e <= n && f >= 0;
      ASSERT_EQ(op < 60 ? ESA_Remove(a, f) : op < 70 ? ESA_RemoveRange(a, f, e) : ESA_Clear(a), ok);
      if (ok) {
        for (int32_t i = f; i < e; i++) dropped.push_back(m.e[i].second);
        m.e.erase(m.e.begin() + f, m.e.begin() + e);
        m.Shrink();
      }
    } else if (op < 80) {
      int32_t i = static_cast<int32_t>(rng() % (n + 2)) - 1;
      bool ok = i >= 0 && i < n;
      ASSERT_EQ(ESA_SetVal(a, i, next), ok);
      if (ok) m.e[i].second = next;
      next++;
    } else {
      std::string k = RandomKey(rng);
      int32_t idx = -7;
      int32_t want = m.Probe(k);
      ASSERT_EQ(ESA_Find(a, k.c_str(), &idx), want >= 0);
      ASSERT_EQ(idx, want >= 0 ? want : -7) << "key '" << k << "'";
    }
    ASSERT_EQ(Released(), dropped) << "step " << step;
    ASSERT_NO_FATAL_FAILURE(ExpectSame(a, m)) << "step " << step;
  }
  Released().clear();
  std::vector<CofferVal> rest;
  for (auto &x : m.e) rest.push_back(x.second);
  ESA_FreeArray(a);
  EXPECT_EQ(Released(), rest);
}

TEST(EsaDifferential, MatchesModelOnCallerPool) {
  const std::pair<int32_t, int32_t> shapes[] = {{0, 4}, {10, 4}, {1, 1}, {3, 7}, {0, 0}, {2, -5}};
  unsigned seed = 1;
  for (auto [cap, inc] : shapes) {
    TestPool tp;
    RunDifferential(tp.pool(), cap, inc, seed++);
    EXPECT_EQ(tp.liveBlocks(), 0u) << "cap " << cap << " inc " << inc;
  }
}

TEST(EsaDifferential, MatchesModelOnProcessHeap) {
  MemPool pool;
  MemPool_InitOnStdHeap(&pool);
  RunDifferential(&pool, 4, 4, 99);
}

TEST(EsaAlloc, FailureAtEveryAllocationPoint) {
  // Creation: handle calloc, data calloc, entry block realloc.
  for (long n = 0; n < 4; n++) {
    TestPool tp;
    tp.FailAt(n);
    EsaArray *a = ESA_AllocArrayEx(tp.pool(), 8, 4);
    EXPECT_EQ(a == nullptr, n < 3) << n;
    ESA_FreeArray(a);
    EXPECT_EQ(tp.liveBlocks(), 0u) << n;
  }
  TestPool tp;
  EsaArray h;
  std::memset(&h, 0, sizeof h);
  h.mp = *tp.pool();
  tp.FailAt(1);  // the entry block
  EXPECT_FALSE(ESA_CreateArrayData(&h, 4, 4));
  EXPECT_EQ(h.data, nullptr);
  ESA_FreeArray(&h);  // not owned: nothing to release
  EXPECT_EQ(tp.liveBlocks(), 0u);
  // Insertion: a refused growth changes nothing; a refused key copy keeps
  // the growth but leaves the entries in place; neither releases the value.
  EsaArray *a = ESA_AllocArrayEx(tp.pool(), 2, 3);
  ESA_SetFreeValFn(a, coffer_test::RecordRelease);
  ASSERT_TRUE(ESA_Insert(a, "a", 1));
  ASSERT_TRUE(ESA_Insert(a, "c", 2));
  EsaEntry *before = ESA_Get(a, 0);
  const size_t live = tp.liveBlocks();
  Released().clear();
  tp.FailAt(tp.calls());
  EXPECT_FALSE(ESA_Insert(a, "b", 3));
  EXPECT_EQ(Capacity(a), 2);
  EXPECT_EQ(ESA_Get(a, 0), before);
  tp.FailAt(tp.calls() + 1);
  EXPECT_FALSE(ESA_Insert(a, "b", 3));
  EXPECT_EQ(Capacity(a), 5);
  EXPECT_EQ(Keys(a), (std::vector<std::string>{"a", "c"}));
  EXPECT_EQ(ESA_GetVal(a, 1), 2u);
  EXPECT_TRUE(Released().empty());
  EXPECT_EQ(tp.liveBlocks(), live);
  // A refused shrink: the removal still succeeds, the block keeps its size.
  tp.FailFrom(tp.calls());
  ASSERT_TRUE(ESA_Remove(a, 0));
  EXPECT_EQ(Capacity(a), 5);
  EXPECT_EQ(Keys(a), std::vector<std::string>{"c"});
  tp.NeverFail();
  ESA_FreeArray(a);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

// The exact pool calls, sizes and value releases, in order, of a whole life.
TEST(EsaAlloc, PoolCallOrder) {
  TestPool tp;
  MemPool logged = pool_log::Wrap(tp.pool());
  EsaArray *a = ESA_AllocArrayEx(&logged, 0, 2);
  EXPECT_EQ(pool_log::Take(), "c1x40 c1x16 r0:0");
  ESA_SetFreeValFn(a, pool_log::Value);
  ESA_Insert(a, "ab", 1);
  ESA_Insert(a, "c", 2);
  ESA_Insert(a, "b", 3);
  EXPECT_EQ(pool_log::Take(), "r0:16 a3 a2 r32 a2");
  ESA_Remove(a, 0);
  EXPECT_EQ(pool_log::Take(), "v1 f r16");
  ESA_Clear(a);
  EXPECT_EQ(pool_log::Take(), "v3 f v2 f r0");
  ESA_Insert(a, "x", 4);
  ESA_FreeArray(a);
  EXPECT_EQ(pool_log::Take(), "r0:16 a2 v4 f r0 f f");  // the clear shrinks to 0 slots
  // Slack below the increment: the block outlives the clear and goes after it.
  a = ESA_AllocArrayEx(&logged, 4, 8);
  ESA_Insert(a, "k", 5);
  ESA_FreeArray(a);
  EXPECT_EQ(pool_log::Take(), "c1x40 c1x16 r0:32 a2 f f f f");
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

TEST(EsaGuards, NegativeInitialCapacityIsRefused) {
  TestPool tp;
  EXPECT_EQ(ESA_AllocArrayEx(tp.pool(), -1, 4), nullptr);
  EXPECT_EQ(ESA_AllocArray(INT32_MIN, 4), nullptr);
  EsaArray h;
  std::memset(&h, 0, sizeof h);
  h.mp = *tp.pool();
  h.data = &h;  // overwritten
  EXPECT_FALSE(ESA_CreateArrayData(&h, -3, 1));
  EXPECT_EQ(h.data, nullptr);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

TEST(EsaGuards, IncrementBelowOneCountsAsOne) {
  for (int32_t inc : {0, -1, INT32_MIN}) {
    TestPool tp;
    EsaArray *a = ESA_AllocArrayEx(tp.pool(), 0, inc);
    for (int i = 0; i < 20; i++) ASSERT_TRUE(ESA_Insert(a, std::to_string(i).c_str(), i));
    EXPECT_EQ(Capacity(a), 20);
    ESA_SetCapacityIncrement(a, 0);  // through the setter too
    ASSERT_TRUE(ESA_Insert(a, "x", 0));
    EXPECT_EQ(Capacity(a), 21);
    ASSERT_TRUE(ESA_Remove(a, 0));  // slack 1 reaches the step of 1
    EXPECT_EQ(Capacity(a), 20);
    ESA_FreeArray(a);
    EXPECT_EQ(tp.liveBlocks(), 0u);
  }
}

TEST(EsaGuards, OverflowingResizeIsRefused) {
  TestPool tp;
  EsaArray *a = ESA_AllocArrayEx(tp.pool(), 1, 1);
  ASSERT_TRUE(ESA_Insert(a, "a", 1));
  const long calls = tp.calls();
  // size + increment overflows int32; then slots x 8 does not fit 32 bits.
  for (int32_t inc : {INT32_MAX, 0x20000000}) {
    ESA_SetCapacityIncrement(a, inc);
    EXPECT_FALSE(ESA_Insert(a, "b", 2));
  }
  EXPECT_FALSE(coffer::ESAResize(a, 0x20000000));
  EXPECT_FALSE(coffer::ESAResize(a, -1));
  EXPECT_EQ(tp.calls(), calls);
  EXPECT_EQ(Capacity(a), 1);
  EXPECT_EQ(Keys(a), std::vector<std::string>{"a"});
  ESA_FreeArray(a);
  EXPECT_EQ(ESA_AllocArrayEx(tp.pool(), 0x20000000, 1), nullptr);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

TEST(EsaRelease, RemovingCallsDropInAscendingOrderThroughTheSetCallback) {
  TestPool tp;
  EsaArray *a = ESA_AllocArrayEx(tp.pool(), 0, 4);
  const char *keys[] = {"e", "a", "d", "b", "c", "f"};
  for (int i = 0; i < 6; i++) ESA_Insert(a, keys[i], 10 + i);  // a=11 b=13 c=14 d=12 e=10 f=15
  ESA_SetMpFreeValFn(a, coffer_test::RecordMpRelease);
  Released().clear();
  ReleasedPools().clear();
  ASSERT_TRUE(ESA_Remove(a, 1));
  EXPECT_EQ(ReleasedPools(), std::vector<MemPool *>{&a->mp});
  ASSERT_TRUE(ESA_RemoveRange(a, 1, 3));  // c, d
  ESA_SetFreeValFn(a, coffer_test::RecordRelease);
  ASSERT_TRUE(ESA_SetVal(a, 0, 0));  // never releases; 0 is handed over like any value
  ASSERT_TRUE(ESA_Clear(a));         // a, e, f
  EXPECT_EQ(Released(), (std::vector<CofferVal>{13, 14, 12, 0, 10, 15}));
  EXPECT_EQ(Capacity(a), 3);  // slack 3 is below the increment
  EXPECT_FALSE(ESA_Clear(a));
  EXPECT_EQ(Capacity(a), 3);
  ESA_FreeArray(a);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

TEST(EsaSetters, EachSetterClearsTheOtherKind) {
  EsaArray *a = ESA_AllocArray(0, 1);
  EXPECT_EQ(ESA_SetFreeValFn(a, coffer_test::RecordRelease), nullptr);
  EXPECT_EQ(ESA_SetMpFreeValFn(a, coffer_test::RecordMpRelease), nullptr);
  EXPECT_EQ(a->freeValFn, nullptr);
  EXPECT_EQ(ESA_SetFreeValFn(a, coffer_test::RecordRelease), nullptr);
  EXPECT_EQ(a->mpFreeValFn, nullptr);
  EXPECT_EQ(ESA_SetFreeValFn(a, nullptr), &coffer_test::RecordRelease);
  ESA_FreeArray(a);
  ESA_FreeArray(nullptr);
}

TEST(EsaEdges, OrderingFindAndCapacityExamples) {
  EsaArray *a = ESA_AllocArray(0, 4);
  int32_t idx = 42;
  EXPECT_FALSE(ESA_Find(a, "x", &idx));
  EXPECT_EQ(idx, 42);
  for (const char *k : {"beta", "alpha", "beta", "gamma"}) ESA_Insert(a, k, 0);
  EXPECT_EQ(Capacity(a), 4);
  ESA_Insert(a, "beta", 0);
  EXPECT_EQ(Capacity(a), 8);
  ASSERT_TRUE(ESA_Find(a, "beta", &idx));  // alpha beta beta beta gamma
  EXPECT_EQ(idx, 2);
  ASSERT_TRUE(ESA_Remove(a, 0));
  EXPECT_EQ(Capacity(a), 4);  // slack reached the increment
  ESA_Clear(a);
  ESA_Insert(a, "beta", 1);
  ESA_Insert(a, "beta", 2);
  ASSERT_TRUE(ESA_Find(a, "beta", &idx));
  EXPECT_EQ(idx, 0);
  EXPECT_EQ(ESA_GetVal(a, 0), 1u);  // the first inserted stands first
  ESA_Clear(a);
  for (const char *k : {"alpha", "\x80", "Zeta", "al"}) ESA_Insert(a, k, 0);
  EXPECT_EQ(Keys(a), (std::vector<std::string>{"Zeta", "al", "alpha", "\x80"}));
  for (int32_t i : {4, -1}) {
    EXPECT_EQ(ESA_Get(a, i), nullptr);
    EXPECT_EQ(ESA_GetKey(a, i), nullptr);
    EXPECT_EQ(ESA_GetVal(a, i), 0u);
    EXPECT_FALSE(ESA_SetVal(a, i, 1));
    EXPECT_FALSE(ESA_Remove(a, i));
  }
  EXPECT_FALSE(ESA_RemoveRange(a, 2, 2));
  EXPECT_FALSE(ESA_RemoveRange(a, -1, 2));
  EXPECT_FALSE(ESA_RemoveRange(a, 0, 5));
  EXPECT_EQ(ESA_GetSize(a), 4);
  // Records hold offsets; on the process heap (base 0) they are addresses.
  EXPECT_EQ(reinterpret_cast<uintptr_t>(ESA_GetKey(a, 1)), ESA_Get(a, 1)->key);
  EXPECT_EQ(reinterpret_cast<uintptr_t>(ESA_Get(a, 0)),
            static_cast<EsaArrayData *>(a->data)->entries);
  ESA_FreeArray(a);

  a = ESA_AllocArray(10, 4);
  ESA_Insert(a, "x", 0);
  ESA_Remove(a, 0);
  EXPECT_EQ(Capacity(a), 0);
  ESA_FreeArray(a);
}

TEST(EsaEdges, KeysAreCopiedExactlyAndOffsetsAreFromBase) {
  TestPool tp;
  EsaArray *a = ESA_AllocArrayEx(tp.pool(), 1, 1);
  char key[] = "hello";
  ESA_Insert(a, key, 1);
  key[0] = 'j';
  EXPECT_STREQ(ESA_GetKey(a, 0), "hello");
  EXPECT_EQ(tp.SizeOf(ESA_GetKey(a, 0)), 6u);
  ESA_Insert(a, "", 2);
  EXPECT_EQ(tp.SizeOf(ESA_GetKey(a, 0)), 1u);
  EXPECT_EQ(ESA_Get(a, 0)->key + 0x1000, reinterpret_cast<uintptr_t>(ESA_GetKey(a, 0)));
  ESA_FreeArray(a);
}

}  // namespace
