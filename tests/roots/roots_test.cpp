// Named roots: the directory against a model, read again from a copy of the
// region at another address; the directories and records it must refuse;
// and refused pool calls during creation and change.
#include <coffer/roots.h>
#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <map>

#include "mempool/region_heap.h"
#include "roots/region.h"
#include "support/driver.h"

namespace coffer_test {
namespace {

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

// Opens a root by name with the family's call for kind and reads the size
// through the handle; -1 when the open is refused.
int32_t OpenedSize(MemPool *pool, const std::string &name, int32_t kind) {
  CollectionHeader h;
  const char *n = name.c_str();
  switch (kind) {
    case ROOTS_KIND_ARRAY: return ESA_OpenNamedArray(&h, pool, n) ? ESA_GetSize(&h) : -1;
    case ROOTS_KIND_RBT: return RBT_OpenNamedTree(&h, pool, n) ? RBT_GetSize(&h) : -1;
    case ROOTS_KIND_RBT_INT32: return RbtInt32_OpenNamedTree(&h, pool, n) ? RbtInt32_GetSize(&h) : -1;
    case ROOTS_KIND_RBT_VOIDPTR: return RbtVoidPtr_OpenNamedTree(&h, pool, n) ? RbtVoidPtr_GetSize(&h) : -1;
    default: return HST_OpenNamedTree(&h, pool, n) ? HST_GetSize(&h) : -1;
  }
}

TEST(Roots, DirectoryAgreesWithItsModelInEveryMapping) {
  for (uint32_t seed = 1; seed <= 4; seed++) {
    Region r;
    ASSERT_EQ(Roots_GetCount(&r.pool), -1);
    ASSERT_TRUE(Roots_CreateDirectory(&r.pool) && Roots_CreateDirectory(&r.pool));
    Model m;
    for (Ops ops(RandomBytes(seed, 600)); ops.More();) {
      std::string name = ops.Key("abc", 3);
      if (ops.Take(16) == 0) name.append(36 + ops.Take(2), 'x');  // 39 bytes fit, 40 do not
      const int32_t kind = 1 + ops.Take(5);
      const bool usable = !name.empty() && name.size() <= ROOTS_NAME_MAX;
      if (ops.Take(3) == 0) {
        EXPECT_EQ(Roots_Remove(&r.pool, name.c_str()), m.erase(name) == 1);
      } else {
        EXPECT_EQ(Roots_Set(&r.pool, name.c_str(), kind, r.c[kind - 1]), usable);
        if (usable) m[name] = {kind, r.rec(kind - 1)};
      }
      ASSERT_EQ(Compare(&r.pool, m), "") << "seed " << seed;
    }
    EXPECT_FALSE(Roots_Set(&r.pool, "wrong", ROOTS_KIND_HST, r.c[0]));  // an array is no string tree
    Region copy;  // the same bytes at another address, attached as another process would
    copy.words = r.words;
    MemPool_InitOnSimpleHeap(&copy.pool, copy.words.data(), 0);
    EXPECT_EQ(Compare(&copy.pool, m), "");
    for (const auto &[name, entry] : m) {
      EXPECT_EQ(OpenedSize(&copy.pool, name, entry.first), entry.first == ROOTS_KIND_HST ? 3 : 2);
      EXPECT_EQ(OpenedSize(&copy.pool, name, entry.first % 5 + 1), -1);  // as another family
    }
  }
}

// Formats the region again and allocates n small blocks.
void Format(Region &r, int n) {
  SH_Reset(r.words.data(), kSize);
  while (n--) SH_Alloc(r.words.data(), 8);
}

// Each row leaves bytes that must not be taken for a directory: reserved
// words d (offset) and the entry block at e as the directory left them.
#define ROW(what, body) {what, [](Region &r, uint32_t d, uint32_t e) { (void)d, (void)e, body; }}
TEST(Roots, StaleOrDamagedDirectoriesAreRefused) {
  const struct {
    const char *what;
    void (*damage)(Region &, uint32_t, uint32_t);
  } kRows[] = {
      ROW("no magic", r.word(8) = 0),
      ROW("formatted again", Format(r, 0)),
      ROW("formatted, cut up", Format(r, 200)),
      ROW("formatted, same block rewritten", (Format(r, 0), SH_Alloc(r.words.data(), d - 48),
                                              *static_cast<uint32_t *>(SH_Alloc(r.words.data(), 20)) = 0)),
      ROW("offset past the region", r.word(12) = kSize - 8),
      ROW("offset in the header", r.word(12) = 8),
      ROW("offset unaligned", r.word(12) += 2),
      ROW("own offset wrong", r.word(d + 4) += 4),
      ROW("count past capacity", r.word(d + 12) = 5),
      ROW("entries outside", r.word(d + 8) = kSize - 16),
      ROW("names out of order", std::swap(r.word(e), r.word(e + 48))),
      ROW("name unterminated", std::fill_n(&r.word(e), 10, 0x41414141)),
      ROW("unknown kind", r.word(e + 40) = 9),
      ROW("record outside", r.word(e + 44) = kSize),
  };
  for (const auto &row : kRows) {
    Region r;
    ASSERT_TRUE(Roots_CreateDirectory(&r.pool));
    ASSERT_TRUE(Roots_Set(&r.pool, "a", ROOTS_KIND_ARRAY, r.c[0]) && Roots_Set(&r.pool, "b", ROOTS_KIND_HST, r.c[4]));
    row.damage(r, r.word(12), r.word(r.word(12) + 8));
    EXPECT_EQ(Roots_GetCount(&r.pool), -1) << row.what;
    EXPECT_FALSE(Roots_Get(&r.pool, "a", nullptr, nullptr)) << row.what;
    EXPECT_EQ(OpenedSize(&r.pool, "b", ROOTS_KIND_HST), -1) << row.what;
  }
  // Records that cannot be opened as what they are asked to be.
  Region r;
  CollectionHeader h;
  EXPECT_FALSE(ESA_OpenArray(&h, &r.pool, r.rec(0) + 4));  // not a block's payload
  EXPECT_FALSE(HST_OpenTree(&h, &r.pool, r.rec(0)));       // block too small
  EXPECT_FALSE(RBT_OpenTree(&h, &r.pool, r.rec(0)));       // no sentinel there
  static_cast<RbtTreeData *>(r.c[1]->data)->nil = r.rec(0);
  EXPECT_FALSE(RBT_OpenTree(&h, &r.pool, r.rec(1)));  // a sentinel of no tree
  static_cast<HstTreeData *>(r.c[4]->data)->size = 0;
  EXPECT_FALSE(HST_OpenTree(&h, &r.pool, r.rec(4)));
  EXPECT_TRUE(RbtInt32_OpenTree(&h, &r.pool, r.rec(2)) && h.data == r.c[2]->data && !h.ownsHandle);
}

// A pool over a region whose allocation calls the failure-injection
// driver's pool counts first, and refuses when it does.
TestPool *g_counter;
bool Counted() {
  void *probe = g_counter->pool()->alloc(g_counter->pool(), 0);
  return probe && (g_counter->pool()->free(g_counter->pool(), probe), true);
}
const MemPool kCounted = {
    [](MemPool *p, size_t n) { return Counted() ? SH_Alloc(p->base, n) : nullptr; },
    [](MemPool *p, size_t k, size_t n) -> void * {
      void *b = Counted() ? SH_Alloc(p->base, k * n) : nullptr;
      return b ? std::memset(b, 0, k * n) : nullptr;
    },
    [](MemPool *p, void *b, size_t n) { return Counted() ? SH_Realloc(p->base, b, n) : nullptr; },
    [](MemPool *p, void *b) { SH_Free(p->base, b); }, nullptr, nullptr};

TEST(Roots, RefusedPoolCallsLeaveTheDirectoryAsItWas) {
  EXPECT_EQ(ForEachFailure([](Arena arena) -> std::string {
              Region r;
              MemPool pool = kCounted;
              pool.base = r.words.data(), g_counter = arena.tp;
              coffer::ShHeapCounts before, after;
              Model m;
              for (int i = 0; i < 7; i++) {  // create, then six roots: the entry block grows twice
                const std::string name(1, static_cast<char>('a' + i));
                coffer::SHCheckHeap(r.words.data(), &before, static_cast<std::string *>(nullptr));
                if (!(i ? Roots_Set(&pool, name.c_str(), ROOTS_KIND_RBT, r.c[1]) : Roots_CreateDirectory(&pool))) {
                  coffer::SHCheckHeap(r.words.data(), &after, static_cast<std::string *>(nullptr));
                  MODEL_EXPECT(after.allocatedBlocks == before.allocatedBlocks);
                  return i ? Compare(&pool, m) : Roots_GetCount(&pool) == -1 ? "" : "a directory";
                }
                if (i) m[name] = {ROOTS_KIND_RBT, r.rec(1)};
                MODEL_TRY(Compare(&pool, m));
              }
              Roots_DestroyDirectory(&pool);
              MODEL_EXPECT(r.word(8) == 0 && Roots_GetCount(&pool) == -1);
              ESA_FreeArray(r.c[0]), RBT_FreeTree(r.c[1]), RbtInt32_FreeTree(r.c[2]);
              RbtVoidPtr_FreeTree(r.c[3]), HST_FreeTree(r.c[4]);
              MODEL_EXPECT(r.word(16) == kSize - 16);  // one free block again: nothing leaked
              return "";
            }),
            "");
}

}  // namespace
}  // namespace coffer_test
