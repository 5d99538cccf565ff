// Every container family inside heap regions: built through one mapping of a
// memory file, then read and changed through a second mapping at another
// address with a pool attached by size 0; and each family run out of room in
// a simple-heap region, where it must report failure and leave the region
// and itself consistent.
#include <coffer/coffer.h>
#include <coffer/platform.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include "mempool/region_heap.h"

namespace {

// A memory file mapped twice, so one region is seen at two addresses.
class TwoMappings {
 public:
  explicit TwoMappings(size_t size) : size_(size) {
    fd_ = memfd_create("coffer-region", 0);
    EXPECT_GE(fd_, 0);
    EXPECT_EQ(ftruncate(fd_, size), 0);
    a_ = Map();
    b_ = Map();
    EXPECT_NE(a_, b_);
  }
  ~TwoMappings() {
    munmap(a_, size_);
    munmap(b_, size_);
    close(fd_);
  }
  char *a() const { return a_; }
  char *b() const { return b_; }
  // The address in mapping B of something seen at p in mapping A.
  template <class T>
  T *InB(T *p) const {
    return reinterpret_cast<T *>(b_ + (reinterpret_cast<char *>(p) - a_));
  }

 private:
  char *Map() {
    void *p = mmap(nullptr, size_, PROT_READ | PROT_WRITE, MAP_SHARED, fd_, 0);
    EXPECT_NE(p, MAP_FAILED);
    return static_cast<char *>(p);
  }
  size_t size_;
  int fd_;
  char *a_, *b_;
};

TandelExclLock *Lock() {
  static TandelExclLock lock;
  static bool ready = Tandel_InitExclLock(&lock) == 0;
  EXPECT_TRUE(ready);
  return &lock;
}

enum class Kind { kSimple, kShared };

void InitPool(Kind kind, MemPool *pool, void *region, size_t size) {
  if (kind == Kind::kShared)
    ASSERT_TRUE(MemPool_InitOnSharedHeap(pool, region, size, Lock()));
  else
    ASSERT_TRUE(MemPool_InitOnSimpleHeap(pool, region, size));
}

// The heap is sound and holds nothing but free space.
void ExpectRegionEmpty(const void *region) {
  coffer::ShHeapCounts counts;
  std::string why;
  ASSERT_TRUE(coffer::SHCheckHeap(region, &counts, &why)) << why;
  EXPECT_EQ(counts.allocatedBlocks, 0u);
  EXPECT_EQ(counts.freeBlocks, 1u);
}

void ExpectRegionSound(const void *region) {
  coffer::ShHeapCounts counts;
  std::string why;
  ASSERT_TRUE(coffer::SHCheckHeap(region, &counts, &why)) << why;
}

// A handle of mapping B around a container that mapping A made.
CollectionHeader HandleInB(const TwoMappings &m, const CollectionHeader *ha, MemPool *pb) {
  CollectionHeader hb = *ha;
  hb.mp = *pb;
  hb.ownsHandle = false;
  hb.data = m.InB(static_cast<char *>(ha->data));
  return hb;
}

std::string Key(int i) { return "key" + std::to_string(i); }

class SecondMapping : public ::testing::TestWithParam<Kind> {
 protected:
  static constexpr size_t kSize = 1 << 20;
  void SetUp() override {
    InitPool(GetParam(), &pa_, m_.a(), kSize);
    InitPool(GetParam(), &pb_, m_.b(), 0);  // attach: the region is not formatted again
    ASSERT_EQ(pb_.base, m_.b());
  }
  // Frees a handle that mapping A allocated, through mapping B's pool.
  void FreeHandleInB(CollectionHeader *ha) { pb_.free(&pb_, m_.InB(ha)); }

  TwoMappings m_{kSize};
  MemPool pa_, pb_;
};

TEST_P(SecondMapping, SortedArray) {
  EsaArray *a = ESA_AllocArrayEx(&pa_, 0, 8);
  ASSERT_NE(a, nullptr);
  for (int i = 0; i < 100; i++) ASSERT_TRUE(ESA_Insert(a, Key(i).c_str(), i));
  EsaArray b = HandleInB(m_, a, &pb_);
  for (int i = 0; i < 100; i++) {
    int32_t at;
    ASSERT_TRUE(ESA_Find(&b, Key(i).c_str(), &at));
    EXPECT_EQ(ESA_GetVal(&b, at), static_cast<CofferVal>(i));
  }
  ASSERT_TRUE(ESA_Insert(&b, "zz", 7));
  ASSERT_TRUE(ESA_RemoveRange(&b, 0, 10));
  EXPECT_EQ(ESA_GetSize(a), 91);
  int32_t at;
  ASSERT_TRUE(ESA_Find(a, "zz", &at));
  EXPECT_EQ(ESA_GetVal(a, at), 7u);
  EXPECT_STREQ(ESA_GetKey(a, 90), "zz");
  ESA_FreeArray(&b);
  FreeHandleInB(a);
  ExpectRegionEmpty(m_.b());
}

TEST_P(SecondMapping, StringTree) {
  RbtTree *t = RBT_AllocTreeEx(&pa_);
  ASSERT_NE(t, nullptr);
  for (int i = 0; i < 200; i++) ASSERT_NE(RBT_Insert(t, Key(i).c_str(), i), nullptr);
  RbtTree b = HandleInB(m_, t, &pb_);
  for (int i = 0; i < 200; i += 2) {
    RbtNode *n = RBT_Find(&b, Key(i).c_str());
    ASSERT_NE(n, nullptr);
    EXPECT_EQ(n->val, static_cast<CofferVal>(i));
    RBT_Remove(&b, n);
  }
  ASSERT_NE(RBT_Insert(&b, "new", 1000), nullptr);
  EXPECT_EQ(RBT_GetSize(t), 101);
  std::string prev;
  int count = 0;
  for (RbtNode *n = RBT_First(t); n; n = RBT_Next(t, n), count++) {
    std::string k = static_cast<char *>(pa_.base) + n->key;
    EXPECT_LT(prev, k);
    prev = k;
  }
  EXPECT_EQ(count, 101);
  RBT_FreeTree(&b);
  FreeHandleInB(t);
  ExpectRegionEmpty(m_.b());
}

TEST_P(SecondMapping, IntegerAndPointerTrees) {
  RbtTree *ti = RbtInt32_AllocTreeEx(&pa_);
  RbtTree *tp = RbtVoidPtr_AllocTreeEx(&pa_);
  ASSERT_TRUE(ti && tp);
  for (int i = 0; i < 100; i++) {
    ASSERT_NE(RbtInt32_Insert(ti, i * 3 - 50, i), nullptr);
    ASSERT_NE(RbtVoidPtr_Insert(tp, reinterpret_cast<void *>(i * 16), i), nullptr);
  }
  RbtTree bi = HandleInB(m_, ti, &pb_), bp = HandleInB(m_, tp, &pb_);
  EXPECT_EQ(RbtInt32_LowerBound(&bi, 0)->val, 17u);  // 1 is the first key >= 0
  RbtInt32_RemoveRange(&bi, RbtInt32_First(&bi), RbtInt32_Find(&bi, 10));
  EXPECT_EQ(RbtInt32_First(ti)->key, 10u);
  EXPECT_EQ(RbtVoidPtr_Find(&bp, reinterpret_cast<void *>(160))->val, 10u);
  RbtVoidPtr_Clear(&bp);
  EXPECT_EQ(RbtVoidPtr_GetSize(tp), 0);
  RbtInt32_FreeTree(&bi);
  RbtVoidPtr_FreeTree(&bp);
  FreeHandleInB(ti);
  FreeHandleInB(tp);
  ExpectRegionEmpty(m_.b());
}

TEST_P(SecondMapping, HierarchicalStringTree) {
  HstTree *t = HST_AllocTreeEx(&pa_, '/', 0, 2, 2);
  ASSERT_NE(t, nullptr);
  for (int i = 0; i < 50; i++)
    ASSERT_NE(HST_Insert(t, ("/etc/" + Key(i % 7) + "/" + Key(i)).c_str(), i + 1), nullptr);
  HstTree b = HandleInB(m_, t, &pb_);
  HstNode *n = HST_Find(&b, "/etc/key3/key10");
  ASSERT_NE(n, nullptr);
  EXPECT_EQ(HST_GetVal(&b, n), 11u);
  ASSERT_NE(HST_Insert(&b, "/var/log", 99), nullptr);
  HST_RemoveSubtree(&b, HST_Find(&b, "/etc/key0"));
  EXPECT_EQ(HST_GetVal(t, HST_Find(t, "/var/log")), 99u);
  EXPECT_EQ(HST_Find(t, "/etc/key0"), nullptr);
  EXPECT_EQ(HST_GetNumChildren(t, HST_Find(t, "/etc")), 6);
  HST_FreeTree(&b);
  FreeHandleInB(t);
  ExpectRegionEmpty(m_.b());
}

bool Add(HstaaTree *, CofferVal cur, CofferVal op, CofferVal *out) {
  *out = cur + op;
  return true;
}
bool Sub(HstaaTree *, CofferVal cur, CofferVal op, CofferVal *out) {
  if (cur < op) return false;
  *out = cur - op;
  return true;
}
bool Copy(HstTree *, CofferVal v, CofferVal *out) {
  *out = v;
  return true;
}

HstaaTree CounterTree(MemPool *pool) {
  HstaaTree t;
  std::memset(&t, 0, sizeof t);
  t.hst.mp = *pool;
  t.cloneValFn = Copy;
  t.insertValFn = Add;
  t.removeValFn = Sub;
  return t;
}

TEST_P(SecondMapping, AssociativeArray) {
  HstaaTree a = CounterTree(&pa_);
  ASSERT_TRUE(HST_CreateTreeData(&a.hst, '/', 0, 2, 2));
  ASSERT_NE(HSTAA_Insert(&a, "/srv/#/port", 80), nullptr);
  ASSERT_NE(HSTAA_Insert(&a, "/srv/#1/host", 1), nullptr);
  HstaaTree b = CounterTree(&pb_);
  b.hst.data = m_.InB(static_cast<char *>(a.hst.data));
  ASSERT_NE(HSTAA_Insert(&b, "/srv/#2/host", 1), nullptr);
  ASSERT_NE(HSTAA_Insert(&b, "/srv/#/port", 1), nullptr);  // carried into #1 and #2
  bool complete = false;
  HstNode *n = HSTAA_FindPrefix(&a, "/srv/#2/port", &complete);
  EXPECT_TRUE(complete);
  EXPECT_EQ(HST_GetVal(&a.hst, n), 81u);
  EXPECT_EQ(HSTAA_GetSubtreeValCount(&a, HST_GetRoot(&a.hst)), 8);
  ASSERT_TRUE(HSTAA_Remove(&b, "/srv/#1/host", 1));
  // #1 is left holding as many values as its template, so it is pruned.
  EXPECT_EQ(HST_Find(&a.hst, "/srv/#1"), nullptr);
  EXPECT_EQ(HSTAA_GetSubtreeValCount(&a, HST_GetRoot(&a.hst)), 5);
  HST_FreeTree(&b.hst);
  ExpectRegionEmpty(m_.b());
}

INSTANTIATE_TEST_SUITE_P(Pools, SecondMapping, ::testing::Values(Kind::kSimple, Kind::kShared),
                         [](const auto &info) {
                           return info.param == Kind::kShared ? "SharedHeap" : "SimpleHeap";
                         });

// ---- exhaustion: regions of every size from tiny to roomy, so that the
// first refused allocation falls on every allocation point in turn.

template <class Fill>
void ForEachRegionSize(size_t from, size_t to, Fill fill) {
  std::vector<uint32_t> region((to + 3) / 4);
  for (size_t size = from; size <= to; size += 4) {
    MemPool pool;
    ASSERT_TRUE(MemPool_InitOnSimpleHeap(&pool, region.data(), size));
    fill(&pool, region.data(), size);
    ASSERT_NO_FATAL_FAILURE(ExpectRegionEmpty(region.data())) << "region of " << size;
  }
}

TEST(SimpleHeapExhaustion, SortedArray) {
  ForEachRegionSize(48, 1200, [](MemPool *pool, void *region, size_t size) {
    EsaArray *a = ESA_AllocArrayEx(pool, 1, 2);
    if (!a) return;
    int ok = 0;
    while (ok < 1000 && ESA_Insert(a, Key(ok).c_str(), ok)) ok++;
    ASSERT_NO_FATAL_FAILURE(ExpectRegionSound(region));
    ASSERT_EQ(ESA_GetSize(a), ok) << size;
    for (int i = 0; i < ok; i++) {
      int32_t at;
      ASSERT_TRUE(ESA_Find(a, Key(i).c_str(), &at));
      ASSERT_EQ(ESA_GetVal(a, at), static_cast<CofferVal>(i));
    }
    ESA_FreeArray(a);
  });
}

TEST(SimpleHeapExhaustion, RedBlackTrees) {
  ForEachRegionSize(48, 1200, [](MemPool *pool, void *region, size_t size) {
    RbtTree *t = RBT_AllocTreeEx(pool);
    RbtTree *ti = RbtInt32_AllocTreeEx(pool);
    int ok = 0, oki = 0;
    if (t)
      while (ok < 1000 && RBT_Insert(t, Key(ok).c_str(), ok)) ok++;
    if (ti)
      while (oki < 1000 && RbtInt32_Insert(ti, oki, oki)) oki++;
    ASSERT_NO_FATAL_FAILURE(ExpectRegionSound(region));
    if (t) {
      ASSERT_EQ(RBT_GetSize(t), ok) << size;
      for (int i = 0; i < ok; i++) ASSERT_NE(RBT_Find(t, Key(i).c_str()), nullptr);
    }
    if (ti) {
      ASSERT_EQ(RbtInt32_GetSize(ti), oki) << size;
    }
    RBT_FreeTree(t);
    RbtInt32_FreeTree(ti);
  });
}

TEST(SimpleHeapExhaustion, HierarchicalStringTree) {
  ForEachRegionSize(48, 1600, [](MemPool *pool, void *region, size_t size) {
    HstTree *t = HST_AllocTreeEx(pool, '/', 0, 1, 1);
    if (!t) return;
    int ok = 0;
    while (ok < 1000 && HST_Insert(t, ("/" + Key(ok % 3) + "/" + Key(ok)).c_str(), ok + 1)) ok++;
    ASSERT_NO_FATAL_FAILURE(ExpectRegionSound(region));
    for (int i = 0; i < ok; i++) {
      HstNode *n = HST_Find(t, ("/" + Key(i % 3) + "/" + Key(i)).c_str());
      ASSERT_NE(n, nullptr) << size;
      ASSERT_EQ(HST_GetVal(t, n), static_cast<CofferVal>(i + 1));
    }
    HST_FreeTree(t);
  });
}

// With counting callbacks a node's value is the number of values it holds,
// so every count must equal the node's value plus its children's counts.
int32_t ExpectCountsExact(HstaaTree *t, HstNode *n) {
  int32_t sum = static_cast<int32_t>(HST_GetVal(&t->hst, n));
  for (int32_t i = 0; i < HST_GetNumChildren(&t->hst, n); i++)
    sum += ExpectCountsExact(t, HST_GetChild(&t->hst, n, i));
  EXPECT_EQ(HSTAA_GetSubtreeValCount(t, n), sum) << HST_GetKey(&t->hst, n);
  return sum;
}

TEST(SimpleHeapExhaustion, AssociativeArray) {
  ForEachRegionSize(48, 2400, [](MemPool *pool, void *region, size_t) {
    HstaaTree t = CounterTree(pool);
    if (!HST_CreateTreeData(&t.hst, '/', 0, 1, 1)) return;
    if (HSTAA_Insert(&t, "/a/#/x", 1)) {
      int ok = 0;
      while (ok < 200 && HSTAA_Insert(&t, ("/a/#" + std::to_string(ok) + "/y").c_str(), 1)) ok++;
    }
    ASSERT_NO_FATAL_FAILURE(ExpectRegionSound(region));
    ExpectCountsExact(&t, HST_GetRoot(&t.hst));
    HST_FreeTree(&t.hst);
  });
}

}  // namespace
