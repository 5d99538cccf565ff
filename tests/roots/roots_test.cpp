// Named roots: the directory against a model, read again from a copy of the
// region at another address; the directories it must refuse; and refused
// pool calls during creation and change.
#include <coffer/roots.h>
#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <map>

#include "mempool/pool.h"
#include "mempool/region_heap.h"
#include "support/driver.h"

namespace coffer_test {
namespace {

constexpr uint32_t kSize = 1 << 16;

// A formatted region holding one container of each kind (two entries each).
struct Region {
  std::vector<uint32_t> words = std::vector<uint32_t>(kSize / 4, 0xA5A5A5A5u);
  MemPool pool;
  CollectionHeader *c[5];
  Region() {
    MemPool_InitOnSimpleHeap(&pool, words.data(), kSize);
    c[0] = ESA_AllocArrayEx(&pool, 2, 2), c[1] = RBT_AllocTreeEx(&pool);
    c[2] = RbtInt32_AllocTreeEx(&pool), c[3] = RbtVoidPtr_AllocTreeEx(&pool);
    c[4] = HST_AllocTreeEx(&pool, '/', 0, 1, 1);
    for (const char *k : {"x", "y"}) {
      ESA_Insert(c[0], k, 1), RBT_Insert(c[1], k, 2), RbtInt32_Insert(c[2], k[0], 3);
      RbtVoidPtr_Insert(c[3], k, 4), HST_Insert(c[4], k[0] == 'x' ? "/x" : "/x/y", 5);
    }
  }
  ShRegionHeader *head() { return reinterpret_cast<ShRegionHeader *>(words.data()); }
  uint32_t &word(uint32_t off) { return words[off / 4]; }
};

using Model = std::map<std::string, std::pair<int32_t, PoolOffset>>;

std::string Compare(MemPool *pool, const Model &m) {
  MODEL_EXPECT(Roots_GetCount(pool) == static_cast<int32_t>(m.size()));
  int32_t i = 0, kind;
  const char *name;
  PoolOffset rec;
  for (const auto &[n, entry] : m) {
    MODEL_EXPECT(Roots_GetAt(pool, i++, &name, &kind, &rec) && name == n);
    MODEL_EXPECT(kind == entry.first && rec == entry.second);
  }
  return Roots_GetAt(pool, i, &name, &kind, &rec) ? "an entry past the count" : "";
}

// Opens each root by name with its family's call, in the region at pool,
// and reads the container's size through the handle.
int32_t OpenedSize(MemPool *pool, const std::string &name, int32_t kind) {
  CollectionHeader h;
  switch (kind) {
    case ROOTS_KIND_ARRAY: return ESA_OpenNamedArray(&h, pool, name.c_str()) ? ESA_GetSize(&h) : -1;
    case ROOTS_KIND_RBT: return RBT_OpenNamedTree(&h, pool, name.c_str()) ? RBT_GetSize(&h) : -1;
    case ROOTS_KIND_RBT_INT32: return RbtInt32_OpenNamedTree(&h, pool, name.c_str()) ? RbtInt32_GetSize(&h) : -1;
    case ROOTS_KIND_RBT_VOIDPTR: return RbtVoidPtr_OpenNamedTree(&h, pool, name.c_str()) ? RbtVoidPtr_GetSize(&h) : -1;
    default: return HST_OpenNamedTree(&h, pool, name.c_str()) ? HST_GetSize(&h) : -1;
  }
}

TEST(Roots, DirectoryAgreesWithItsModelInEveryMapping) {
  for (uint32_t seed = 1; seed <= 4; seed++) {
    Region r;
    ASSERT_EQ(Roots_GetCount(&r.pool), -1);
    ASSERT_TRUE(Roots_CreateDirectory(&r.pool) && Roots_CreateDirectory(&r.pool));
    Model m;
    Ops ops(RandomBytes(seed, 600));
    while (ops.More()) {
      std::string name = ops.Key("abc", 3);
      if (ops.Take(16) == 0) name.append(36 + ops.Take(2), 'x');  // 39 bytes fit, 40 do not
      const int32_t kind = 1 + ops.Take(5);
      const bool usable = !name.empty() && name.size() <= ROOTS_NAME_MAX;
      if (ops.Take(3) == 0) {
        EXPECT_EQ(Roots_Remove(&r.pool, name.c_str()), m.erase(name) == 1);
      } else {
        EXPECT_EQ(Roots_Set(&r.pool, name.c_str(), kind, r.c[kind - 1]), usable);
        if (usable) m[name] = {kind, coffer::AddrToOffset(&r.pool, r.c[kind - 1]->data)};
      }
      ASSERT_EQ(Compare(&r.pool, m), "") << "seed " << seed;
    }
    EXPECT_FALSE(Roots_Set(&r.pool, "wrong", ROOTS_KIND_HST, r.c[0]));  // an array is no string tree
    Region copy;  // the same bytes at another address, attached as another process would
    copy.words = r.words;
    MemPool_InitOnSimpleHeap(&copy.pool, copy.words.data(), 0);
    EXPECT_EQ(Compare(&copy.pool, m), "");
    for (const auto &[name, entry] : m) {
      EXPECT_EQ(OpenedSize(&copy.pool, name, entry.first), entry.first == ROOTS_KIND_HST ? 3 : 2) << name;
      EXPECT_EQ(OpenedSize(&copy.pool, name, entry.first % 5 + 1), -1) << name;  // another family
    }
  }
}

// Each row leaves bytes that must not be taken for a directory (or, for the
// last rows, for a container): the directory and its two roots are refused.
TEST(Roots, StaleOrDamagedDirectoriesAreRefused) {
  const struct {
    const char *what;
    std::function<void(Region &, uint32_t dir, uint32_t entries)> damage;
  } kRows[] = {
      {"no magic", [](Region &r, uint32_t, uint32_t) { r.head()->reserved[0] = 0; }},
      {"formatted again", [](Region &r, uint32_t, uint32_t) { SH_Reset(r.words.data(), kSize); }},
      {"formatted, then cut up", [](Region &r, uint32_t, uint32_t) {
         SH_Reset(r.words.data(), kSize);
         for (int i = 0; i < 200; i++) SH_Alloc(r.words.data(), 8);
       }},
      {"formatted, same block rewritten", [](Region &r, uint32_t dir, uint32_t) {
         SH_Reset(r.words.data(), kSize);
         SH_Alloc(r.words.data(), dir - 48);
         EXPECT_EQ(SH_Alloc(r.words.data(), sizeof(RootsDirectory)), &r.word(dir));
         r.word(dir) = 0;
       }},
      {"offset past the region", [](Region &r, uint32_t, uint32_t) { r.head()->reserved[1] = kSize - 8; }},
      {"offset in the header", [](Region &r, uint32_t, uint32_t) { r.head()->reserved[1] = 8; }},
      {"offset unaligned", [](Region &r, uint32_t, uint32_t) { r.head()->reserved[1] += 2; }},
      {"own offset wrong", [](Region &r, uint32_t dir, uint32_t) { r.word(dir + 4) += 4; }},
      {"count past capacity", [](Region &r, uint32_t dir, uint32_t) { r.word(dir + 12) = 5; }},
      {"entries outside", [](Region &r, uint32_t dir, uint32_t) { r.word(dir + 8) = kSize - 16; }},
      {"names out of order", [](Region &r, uint32_t, uint32_t e) { std::swap(r.word(e), r.word(e + 48)); }},
      {"name unterminated", [](Region &r, uint32_t, uint32_t e) { std::fill_n(&r.word(e), 10, 0x41414141); }},
      {"unknown kind", [](Region &r, uint32_t, uint32_t e) { r.word(e + 40) = 9; }},
      {"record outside", [](Region &r, uint32_t, uint32_t e) { r.word(e + 44) = kSize; }},
  };
  for (const auto &row : kRows) {
    Region r;
    ASSERT_TRUE(Roots_CreateDirectory(&r.pool));
    ASSERT_TRUE(Roots_Set(&r.pool, "a", ROOTS_KIND_ARRAY, r.c[0]) && Roots_Set(&r.pool, "b", ROOTS_KIND_HST, r.c[4]));
    const uint32_t dir = r.head()->reserved[1], entries = r.word(dir + 8);
    row.damage(r, dir, entries);
    EXPECT_EQ(Roots_GetCount(&r.pool), -1) << row.what;
    EXPECT_FALSE(Roots_Get(&r.pool, "a", nullptr, nullptr)) << row.what;
    EXPECT_EQ(OpenedSize(&r.pool, "b", ROOTS_KIND_HST), -1) << row.what;
  }
  // Records that cannot be opened, though the directory is sound.
  Region r;
  CollectionHeader h;
  auto rec = [&](int i) { return coffer::AddrToOffset(&r.pool, r.c[i]->data); };
  EXPECT_FALSE(ESA_OpenArray(&h, &r.pool, rec(0) + 4));                      // not a block's payload
  EXPECT_FALSE(HST_OpenTree(&h, &r.pool, rec(0)));                          // block too small
  EXPECT_FALSE(RBT_OpenTree(&h, &r.pool, rec(0)));                          // no sentinel there
  static_cast<RbtTreeData *>(r.c[1]->data)->nil = rec(0);                   // a sentinel of no tree
  EXPECT_FALSE(RBT_OpenTree(&h, &r.pool, rec(1)));
  static_cast<HstTreeData *>(r.c[4]->data)->size = 0;
  EXPECT_FALSE(HST_OpenTree(&h, &r.pool, rec(4)));
  EXPECT_TRUE(RbtInt32_OpenTree(&h, &r.pool, rec(2)) && h.data == r.c[2]->data && !h.ownsHandle);
}

// A pool over a region whose allocation calls the failure-injection
// driver's pool counts first, and refuses when it does.
TestPool *g_counter;
bool Counted() {
  void *probe = g_counter->pool()->alloc(g_counter->pool(), 0);
  return probe && (g_counter->pool()->free(g_counter->pool(), probe), true);
}
MemPool CountedPool(void *region) {
  return MemPool{[](MemPool *p, size_t n) { return Counted() ? SH_Alloc(p->base, n) : nullptr; },
                 [](MemPool *p, size_t k, size_t n) -> void * {
                   void *b = Counted() ? SH_Alloc(p->base, k * n) : nullptr;
                   return b ? std::memset(b, 0, k * n) : nullptr;
                 },
                 [](MemPool *p, void *b, size_t n) { return Counted() ? SH_Realloc(p->base, b, n) : nullptr; },
                 [](MemPool *p, void *b) { SH_Free(p->base, b); }, region, nullptr};
}

TEST(Roots, RefusedPoolCallsLeaveTheDirectoryAsItWas) {
  EXPECT_EQ(ForEachFailure([](Arena arena) -> std::string {
              Region r;
              g_counter = arena.tp;
              MemPool pool = CountedPool(r.words.data());
              coffer::ShHeapCounts before, after;
              Model m;
              for (int i = 0; i < 7; i++) {
                coffer::SHCheckHeap(r.words.data(), &before, static_cast<std::string *>(nullptr));
                const std::string name(1, static_cast<char>('a' + i));
                const bool done = i == 0 ? Roots_CreateDirectory(&pool)
                                         : Roots_Set(&pool, name.c_str(), ROOTS_KIND_RBT, r.c[1]);
                coffer::SHCheckHeap(r.words.data(), &after, static_cast<std::string *>(nullptr));
                if (i > 0 && done) m[name] = {ROOTS_KIND_RBT, coffer::AddrToOffset(&pool, r.c[1]->data)};
                if (done) MODEL_TRY(Compare(&pool, m));
                MODEL_EXPECT(done || Roots_GetCount(&pool) == (i == 0 ? -1 : static_cast<int32_t>(m.size())));
                MODEL_EXPECT(done || after.allocatedBlocks == before.allocatedBlocks);
                if (!done) return "";
              }
              Roots_DestroyDirectory(&pool);
              MODEL_EXPECT(r.head()->reserved[0] == 0 && Roots_GetCount(&pool) == -1);
              ESA_FreeArray(r.c[0]), RBT_FreeTree(r.c[1]), RbtInt32_FreeTree(r.c[2]);
              RbtVoidPtr_FreeTree(r.c[3]), HST_FreeTree(r.c[4]);
              MODEL_EXPECT(r.word(16) == kSize - 16);  // one free block again: nothing leaked
              return "";
            }),
            "");
}

}  // namespace
}  // namespace coffer_test
