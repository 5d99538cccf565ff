// SPDX-License-Identifier: MIT
// Named roots and coffer-inspect. The directory against a model, read again
// from a copy of the region at another address; the directories and records
// it must refuse; refused pool calls. Then the tool, run as a process on
// regions written behind a 64-byte header: intact, damaged in each way the
// checkers know. (Its reader's fuzz target feeds it random bytes.)
#include <coffer/roots.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <map>

#include "mempool/pool.h"
#include "support/driver.h"

namespace coffer_test {
namespace {

constexpr uint32_t kSize = 1 << 16;

// A formatted region holding one container of each kind, two entries each.
struct Region {
  std::vector<uint32_t> words = std::vector<uint32_t>(kSize / 4, 0xA5A5A5A5u);
  MemPool pool;
  CollectionHeader *c[5];
  Region() {
    MemPool_InitOnSimpleHeap(&pool, words.data(), kSize);
    c[0] = ESA_AllocArrayEx(&pool, 2, 2), c[1] = RBT_AllocTreeEx(&pool), c[2] = RbtInt32_AllocTreeEx(&pool);
    c[3] = RbtVoidPtr_AllocTreeEx(&pool), c[4] = HST_AllocTreeEx(&pool, '/', 0, 1, 1);
    for (const char *k : {"x", "y"})
      ESA_Insert(c[0], k, 1), RBT_Insert(c[1], k, 2), RbtInt32_Insert(c[2], k[0], 3),
          RbtVoidPtr_Insert(c[3], k, 4), HST_Insert(c[4], k[0] == 'x' ? "/x" : "/x/y", 5);
  }
  uint32_t &word(uint32_t off) { return words[off / 4]; }
  PoolOffset rec(int i) { return coffer::AddrToOffset(&pool, c[i]->data); }
  void Name(const char *const names[5]) {
    for (int i = 0; i < 5; i++) Roots_Set(&pool, names[i], i + 1, c[i]);
  }
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

// Each kind's open-by-name call and size call; -1 when the open is refused.
int32_t OpenedSize(MemPool *pool, const std::string &name, int32_t kind) {
  static const struct {
    bool (*open)(CollectionHeader *, MemPool *, const char *);
    int32_t (*size)(CollectionHeader *);
  } kFamilies[] = {{ESA_OpenNamedArray, ESA_GetSize}, {RBT_OpenNamedTree, RBT_GetSize},
                   {RbtInt32_OpenNamedTree, RbtInt32_GetSize}, {RbtVoidPtr_OpenNamedTree, RbtVoidPtr_GetSize},
                   {HST_OpenNamedTree, HST_GetSize}};
  CollectionHeader h;
  return kFamilies[kind - 1].open(&h, pool, name.c_str()) ? kFamilies[kind - 1].size(&h) : -1;
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

// Formats the region again and allocates n blocks of size bytes.
void Format(Region &r, int n, uint32_t size) {
  SH_Reset(r.words.data(), kSize);
  while (n--) SH_Alloc(r.words.data(), size);
}

// Each row leaves bytes that must not be taken for a directory, given the
// directory's offset d and its entry block e.
#define ROW(what, body) {what, [](Region &r, uint32_t d, uint32_t e) { (void)d, (void)e, body; }}
TEST(Roots, StaleOrDamagedDirectoriesAreRefused) {
  const struct {
    const char *what;
    void (*damage)(Region &, uint32_t, uint32_t);
  } kRows[] = {
      ROW("no magic", r.word(8) = 0),
      ROW("formatted again", Format(r, 0, 0)),
      ROW("formatted, cut up", Format(r, 200, 8)),
      ROW("formatted, the same block rewritten", (Format(r, 1, d - 48), SH_Alloc(r.words.data(), 20), r.word(d) = 0)),
      ROW("offset past the region", r.word(12) = kSize - 8),
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
    EXPECT_EQ(OpenedSize(&r.pool, "b", ROOTS_KIND_HST), -1) << row.what;
  }
  Region r;  // records that are not what they are opened as
  CollectionHeader h;
  EXPECT_FALSE(ESA_OpenArray(&h, &r.pool, r.rec(0) + 4) || HST_OpenTree(&h, &r.pool, r.rec(0)) ||
               RBT_OpenTree(&h, &r.pool, r.rec(0)));  // not a payload; too small; no sentinel
  static_cast<RbtTreeData *>(r.c[1]->data)->nil = r.rec(0), static_cast<HstTreeData *>(r.c[4]->data)->size = 0;
  EXPECT_FALSE(RBT_OpenTree(&h, &r.pool, r.rec(1)) || HST_OpenTree(&h, &r.pool, r.rec(4)));
  EXPECT_TRUE(RbtInt32_OpenTree(&h, &r.pool, r.rec(2)) && h.data == r.c[2]->data && !h.ownsHandle);
  MemPool heap;  // the process heap holds no region, so no directory
  EXPECT_TRUE(MemPool_InitOnStdHeap(&heap) && !Roots_CreateDirectory(&heap) && Roots_GetCount(&heap) == -1);
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

TEST(Roots, RefusedPoolCallsLeaveTheRegionAsItWas) {
  EXPECT_EQ(ForEachFailure([](Arena arena) -> std::string {
              Region r;
              MemPool pool = kCounted;
              pool.base = r.words.data(), g_counter = arena.tp;
              Model m;
              for (int i = 0; i < 7; i++) {  // create, then six roots: the entry block grows twice
                const std::string name(1, static_cast<char>('a' + i));
                const std::vector<uint32_t> before = r.words;
                if (!(i ? Roots_Set(&pool, name.c_str(), ROOTS_KIND_RBT, r.c[1]) : Roots_CreateDirectory(&pool)))
                  return r.words == before ? "" : "a refused call changed the region";
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

// ---- coffer-inspect ------------------------------------------------------------
#ifdef COFFER_INSPECT  // built with the tools

const char *const kNames[] = {"array", "rbt", "int", "ptr", "tree"};

// The tool's exit status (-1 when it did not exit by itself: a sanitizer's
// report exits 86) and what it printed.
std::pair<int, std::string> Inspect(const std::vector<uint32_t> &words, const std::string &command,
                                    const std::string &more = "") {
  const std::string file = ::testing::TempDir() + "coffer-inspect-" + std::to_string(getpid());
  FILE *f = std::fopen(file.c_str(), "wb");
  std::fwrite(std::string(64, '#').data(), 1, 64, f);
  std::fwrite(words.data(), 4, words.size(), f);
  std::fclose(f);
  setenv("ASAN_OPTIONS", "exitcode=86", 1), setenv("UBSAN_OPTIONS", "exitcode=86", 1);
  FILE *p = popen((COFFER_INSPECT " " + command + " --offset 64 " + file + " " + more + " 2>&1").c_str(), "r");
  std::string out(1 << 16, '\0');
  out.resize(std::fread(&out[0], 1, out.size(), p));
  const int status = pclose(p);
  return {WIFEXITED(status) && WEXITSTATUS(status) != 86 ? WEXITSTATUS(status) : -1, out};
}

TEST(Inspect, EveryCommandOnAnIntactRegion) {
  Region r;
  r.Name((Roots_CreateDirectory(&r.pool), kNames));
  const std::pair<std::string, const char *> kRuns[] = {  // a command and a line it prints
      {"check", "intact\n"},
      {"stats", "\nfree list length    "},
      {"roots", "\n\"tree\"                   hst "},
      {"dump array", "\n\"y\" = 1\n"},
      {"dump rbt", "rbt: 2 nodes, height 2\n"},
      {"dump --kind rbt-int32 --at " + std::to_string(r.rec(2)), "\n121 = 3\n"},
      {"dump ptr", "rbt-voidptr: 2 nodes, height 2\n"},
      {"dump tree", "\n    \"/x/y\" = 5  (count 0)\n"},
  };
  for (const auto &[command, line] : kRuns) {
    auto [status, out] = Inspect(r.words, command);
    EXPECT_TRUE(status == 0 && out.find(line) != std::string::npos) << command << ":\n" << out;
    std::tie(status, out) = Inspect(r.words, command, "--json");
    EXPECT_TRUE(status == 0 && out.front() == '{' && out.back() == '\n') << command << ":\n" << out;
  }
  const std::pair<const char *, const char *> kRefused[] = {
      {"dump none", ""}, {"dump --at 20 --kind hst", ""}, {"check", "--offset 62"},
      {"stats", "--offset 60"}};  // the program's header is no region
  for (const auto &[command, more] : kRefused) EXPECT_EQ(Inspect(r.words, command, more).first, 1) << command << more;
  EXPECT_EQ(Inspect(r.words, "unknown").first, 2);
}

// Each row damages the region as one fault of the heap checker, or of the
// directory or a container, would; check exits 1 naming the offset the row
// returns. A is the first block (allocated), F the free list's head.
TEST(Inspect, DamageIsReportedWithItsOffset) {
  const struct {
    const char *what;
    uint32_t (*damage)(Region &, uint32_t A, uint32_t F);
  } kRows[] = {
      {"region too small", [](Region &r, uint32_t, uint32_t) { return r.word(0) = 32, 0u; }},
      {"region past the mapping", [](Region &r, uint32_t, uint32_t) { return r.word(0) = kSize + 4, 0u; }},
      {"header truncated", [](Region &r, uint32_t o, uint32_t) {
         for (o = 16; o + r.word(o) < kSize;) o += r.word(o);  // the last block
         return r.word(o) -= 8, kSize - 8;
       }},
      {"block too small", [](Region &r, uint32_t A, uint32_t) { return r.word(A) = 8, A; }},
      {"block past the end", [](Region &r, uint32_t A, uint32_t) { return r.word(A) = kSize, A; }},
      {"block misaligned", [](Region &r, uint32_t A, uint32_t) { return r.word(A) += 2, A; }},
      {"previous size", [](Region &r, uint32_t A, uint32_t) { return r.word(A + 4) += 4, A; }},
      {"half free", [](Region &r, uint32_t A, uint32_t) { return r.word(A + 8) = 16, A; }},
      {"link to no block", [](Region &r, uint32_t, uint32_t F) { return r.word(F + 8) = F + 4, F; }},
      {"link to an allocated block", [](Region &r, uint32_t A, uint32_t) { return r.word(4) = A, 0u; }},
      {"back link", [](Region &r, uint32_t A, uint32_t F) { return r.word(F + 12) = A, F; }},
      {"list cycle", [](Region &r, uint32_t, uint32_t F) { return r.word(F + 8) = F, F; }},
      {"free block unlisted", [](Region &r, uint32_t, uint32_t F) { return r.word(4) = SH_NO_BLOCK, F; }},
      {"directory", [](Region &r, uint32_t, uint32_t) { return r.word(r.word(12) + 12) = 9, r.word(12); }},
      {"container", [](Region &r, uint32_t, uint32_t) { return r.word(r.rec(1) + 4) = 0, r.rec(1); }},
  };
  for (const auto &row : kRows) {
    Region r;
    r.Name((Roots_CreateDirectory(&r.pool), kNames));
    const uint32_t at = row.damage(r, 16, r.word(4));
    const auto [status, out] = Inspect(r.words, "check");
    EXPECT_TRUE(status == 1 && out.find("at " + std::to_string(at) + ":") != std::string::npos)
        << row.what << ":\n" << out;
  }
}

#endif

}  // namespace
}  // namespace coffer_test
