// SPDX-License-Identifier: MIT
// The pools and the region heap: the model, damaged regions, the pools'
// reports, processes sharing a region. The program has its own heap, with a
// point after every header write where a process can be killed; its own lock
// calls, through which the model sees the shared pool lock; and its own
// Panic, which leaves the report where a parent reads it.
#include <dlfcn.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/wait.h>

#include <cstdarg>
#include <tuple>

#include "../heap_driver.h"
#include "mempool/pool.h"
#include "support/driver.h"

static int g_killAt = 0, g_points = 0;
static char g_text[256], *g_report = g_text;  // in memory shared with a parent, once mapped

extern "C" void CofferHeapKillPoint(void) {
  if (++g_points == g_killAt) kill(getpid(), SIGKILL);
}

extern "C" void Panic(const char *format, ...) {
  va_list args;
  va_start(args, format);
  std::vsnprintf(g_report, sizeof g_text, format, args);
  va_end(args);
  reinterpret_cast<void (*)(const char *, ...)>(dlsym(RTLD_NEXT, "Panic"))("%s", g_report);
  std::abort();
}

extern "C" int Tandel_AcquireExclLock(void *lock) {
  static auto next = reinterpret_cast<int (*)(void *)>(dlsym(RTLD_NEXT, "Tandel_AcquireExclLock"));
  int rc = next(lock);
  if (coffer_test::g_onAcquire) coffer_test::g_onAcquire();
  return rc;
}

extern "C" int Tandel_ReleaseExclLock(void *lock) {
  static auto next = reinterpret_cast<int (*)(void *)>(dlsym(RTLD_NEXT, "Tandel_ReleaseExclLock"));
  if (coffer_test::g_onRelease) coffer_test::g_onRelease();
  return next(lock);
}

namespace coffer_test {
namespace {

TEST(RegionHeap, RandomOperationsMatchTheModel) {
  for (uint32_t seed = 0; seed < 21; ++seed) {
    std::vector<uint8_t> bytes = RandomBytes(seed + 1, 4 * 3000);
    bytes[0] = uint8_t(seed % 7);  // each region size
    ASSERT_EQ(DriveHeap(bytes.data(), bytes.size()), "") << "seed " << seed;
  }
}

// Each row writes header words into a region of blocks 16 48 80 112 144 176
// (p0 to p5) and 208, free list 112 48 208; the checker must report exactly
// its faults (ShFault, offset), and a heap call meeting them (A size, F
// block, Z block size) must be refused as damaged at `at`, writing nothing,
// or with `at` -1 go through and leave the region clean.
TEST(RegionHeap, EachDamageIsFoundAndRefused) {
  const std::tuple<std::vector<std::pair<uint32_t, uint32_t>>, std::vector<long long>, char,
                   uint32_t, uint32_t, long long>
      rows[] = {
          // no damage: free neighbours (untidy, joined when touched), a last block of 16 bytes
          {{{88, 48}, {92, 112}, {120, 80}, {60, 80}}, {0, 80, 0, 112}, 'F', 4, 0, -1},
          {{{208, 800}, {1008, 16}, {1012, 800}, {1016, 0}, {1020, 0}}, {}, 'A', 16, 0, -1},
          {{{0, 32}}, {1, 0}, 'A', 1, 0, 0},
          {{{0, 1028}}, {2, 0}, 'F', 5, 0, 208},  // the heap cannot know the mapping
          {{{208, 808}}, {3, 1016}, 'F', 5, 0, 208},
          {{{48, 8}}, {4, 48}, 'F', 0, 0, 48},  // the free block after the one released
          {{{208, 820}}, {5, 208}, 'A', 800, 0, 208},
          {{{208, 820}}, {5, 208}, 'A', 16, 0, 208},  // met as the next on the list
          {{{16, 30}}, {6, 16}, 'F', 0, 0, 16},
          {{{84, 36}}, {7, 80}, 'F', 2, 0, 80},
          {{{52, 36}}, {7, 48}, 'Z', 2, 4, 48},  // a resize checks its release before it allocates
          {{{60, 0}}, {8, 48, 13, 208}, 'A', 20, 0, 48},
          {{{216, 212}}, {9, 208}, 'A', 900, 0, 212},
          {{{4, 2000}}, {9, 0, 13, 48, 13, 112, 13, 208}, 'A', 20, 0, 0},
          {{{4, 2000}}, {9, 0, 13, 48, 13, 112, 13, 208}, 'F', 0, 0, 0},
          {{{216, 176}}, {10, 208}, 'A', 900, 0, 208},
          {{{60, 208}}, {11, 48}, 'A', 20, 0, 48},
          {{{216, 112}}, {12, 208}, 'A', 900, 0, 112},
          {{{120, 208}, {124, SH_NO_BLOCK}, {220, 112}}, {13, 48}, 'F', 2, 0, 48},
          // a resize whose allocation, from a block too large, breaks the release
          // it checked before: the allocation is undone
          {{{48, 200}, {252, 200}}, {5, 248, 9, 0, 13, 48}, 'Z', 4, 24, 80},
      };
  for (const auto &[writes, faults, call, arg, size, at] : rows) {
    SCOPED_TRACE(testing::PrintToString(faults));
    Region r(1024);
    void *p[6], *q = nullptr;
    ASSERT_EQ(SH_Reset(r.base(), 1024), 0);
    for (void *&b : p) b = SH_Alloc(r.base(), 16);
    SH_Free(r.base(), p[1]);
    SH_Free(r.base(), p[3]);
    for (auto [off, word] : writes) r.words[off / 4] = word;
    std::vector<long long> found;
    auto keep = [](void *c, coffer::ShFault f, uint32_t off) {
      auto *v = static_cast<std::vector<long long> *>(c);
      v->insert(v->end(), {int(f), off});
    };
    coffer::SHCheckRegion(r.base(), 1024, nullptr, keep, &found);
    EXPECT_EQ(found, faults);
    const std::vector<uint32_t> before = r.words;
    coffer::ShOutcome out;
    if (call == 'A') q = coffer::SHAllocChecked(r.base(), arg, &out);
    if (call == 'F') coffer::SHFreeChecked(r.base(), p[arg], &out);
    if (call == 'Z') q = coffer::SHReallocChecked(r.base(), p[arg], size, &out);
    found.clear();
    coffer::SHCheckRegion(r.base(), 1024, nullptr, keep, &found);
    if (at < 0)
      EXPECT_TRUE(out.refusal == coffer::ShRefusal::kNone && found.empty());
    else
      EXPECT_TRUE(out.refusal == coffer::ShRefusal::kDamaged && out.at == at && !q &&
                  r.words == before);
  }
}

// The shared pool reports exhaustion, damage and blocks that are not the
// caller's once its lock is released (an overflowing calloc before it takes
// it); the process-heap pool reports the exact sizes.
TEST(PoolsDeathTest, Reports) {
  TandelExclLock lock;
  ASSERT_EQ(Tandel_InitExclLock(&lock), 0);
  Region r(4096);
  MemPool shared, std;
  MemPool_InitOnStdHeap(&std);
  MemPool_InitOnSharedHeap(&shared, r.base(), 4096, &lock);
  void *p = shared.alloc(&shared, 64), *gone = shared.alloc(&shared, 8);
  shared.free(&shared, gone);
  g_onAcquire = [] { std::fputs("lock acquired\n", stderr); };
  g_onRelease = [] { std::fputs("lock released\n", stderr); };
  auto damage = [&] { r.words[25] = 4; };  // the block after p (at 96) disagrees about its size
  const std::string locked = "^lock acquired\nlock released\n",
                    oom = locked + "Out of memory trying to allocate ",
                    foreign = locked + "Shared heap: offset 112 is not the payload of an allocated",
                    damaged = locked + "Shared heap region damaged at offset ",
                    stdOom = "(^|\n)Out of memory trying to allocate ",
                    overflow = "HeapCalloc: integer overflow \\(65536, 65536\n$";
  const std::pair<std::function<void()>, std::string> rows[] = {
      {[&] { shared.alloc(&shared, 100000); }, oom + "100000 bytes\\.\n$"},
      {[&] { shared.calloc(&shared, 1000, 100); }, oom + "100000 bytes\\.\n$"},
      {[&] { shared.realloc(&shared, p, 5000); }, oom + "5000 bytes\\.\n$"},
      {[&] { shared.calloc(&shared, 65535, 65537); }, oom + "4294967295 bytes"},
      {[&] { shared.calloc(&shared, 65536, 65536); }, "^MemPoolShared" + overflow},
      {[&] { shared.free(&shared, gone); }, foreign},
      {[&] { shared.realloc(&shared, gone, 8); }, foreign},
      {[&] { shared.realloc(&shared, gone, 0); }, foreign},
      {[&] { damage(), shared.free(&shared, p); }, damaged + "96\\.\n$"},
      {[&] { damage(), shared.realloc(&shared, p, 8); }, damaged + "96\\.\n$"},
      {[&] { damage(), shared.alloc(&shared, 100000); }, damaged + "96\\.\n$"},  // not exhaustion
      {[&] { r.words[0] = 32, shared.alloc(&shared, 8); }, damaged + "0\\.\n$"},
      {[&] { std.calloc(&std, 65536, 65536); }, "(^|\n)MemPoolStd" + overflow},
      // 65535 x 65537 is exactly 2^32 - 1: the test passes, calloc itself fails.
      {[&] { std.calloc(&std, 65535, 65537); }, stdOom + "4294967295 bytes.\n$"},
      {[&] { std.alloc(&std, 0xFFFFFFF0u); }, stdOom + "4294967280 bytes.\n$"},
      {[&] { std.realloc(&std, nullptr, 0xFFFFFFF0u); }, stdOom + "4294967280 bytes.\n$"},
  };
  for (const auto &[call, report] : rows) EXPECT_DEATH(call(), report);
  g_onAcquire = g_onRelease = nullptr;
}

constexpr uint32_t kRegion = 1 << 21, kKillRegion = 2048, kBlocks = 10;

// What the processes share; each call maps it at another address.
struct Shared {
  TandelExclLock lock;
  char report[sizeof g_text];
  alignas(16) char region[kRegion];
};
Shared *Map() {
  static const int fd = memfd_create("coffer-test", 0);
  EXPECT_EQ(ftruncate(fd, sizeof(Shared)), 0);
  void *p = mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
  g_report = static_cast<Shared *>(p)->report;
  return static_cast<Shared *>(p);
}

// Runs fn in a child process, which exits 0 once fn returns; its wait status.
int InChild(const std::function<void()> &fn) {
  pid_t pid = fork();
  if (pid == 0) fn(), _exit(0);
  int status = -1;
  waitpid(pid, &status, 0);
  return status;
}

// Ten blocks of 48 bytes, each filled with its number, the third, fifth and
// eighth free (free list 7 4 2, then the rest of the region).
std::vector<char *> Lay(Shared *s, MemPool *mp) {
  std::memset(s->region, 0xA5, kKillRegion);
  Tandel_InitExclLock(&s->lock);
  MemPool_InitOnSharedHeap(mp, s->region, kKillRegion, &s->lock);
  std::vector<char *> p;
  for (int i = 0; i < int(kBlocks); ++i)
    std::memset(p.emplace_back(static_cast<char *>(mp->alloc(mp, 48))), i, 48);
  for (int i : {2, 4, 7}) mp->free(mp, p[i]), p[i] = nullptr;
  return p;
}

// The next process attaches, allocates, checks and releases the blocks the
// killed one did not work on, and releases its own.
void NextCaller(Shared *s, std::vector<char *> held, uint32_t victim) {
  MemPool mp;
  MemPool_InitOnSharedHeap(&mp, s->region, 0, &s->lock);
  if (victim < kBlocks) held[victim] = nullptr;
  for (uint32_t size : {24u, 200u, 8u}) held.push_back(static_cast<char *>(mp.alloc(&mp, size)));
  for (size_t i = kBlocks; i < held.size(); ++i) std::memset(held[i], int(i), 8);
  for (size_t i = 0; i < held.size(); ++i)
    if (held[i] && std::count(held[i], held[i] + 8, char(i)) != 8) _exit(3);
  for (char *q : held) mp.free(&mp, q);
}

// Each call on each block (an allocation, a release or a resize, to one of
// the sizes; of null where the block is free) is killed at every point,
// holding the pool's lock, which the next caller must recover.
TEST(Processes, EveryKillPointLeavesTheRegionUsableOrRefused) {
  static const uint32_t kSizes[] = {0, 8, 48, 100, 600};
  Shared *s = Map();
  for (uint32_t victim = 0; victim < kBlocks; ++victim)
    for (char call : {'A', 'F', 'R'}) {
      MemPool mp;
      std::vector<char *> held = Lay(s, &mp);
      auto run = [&] {
        if (call == 'A') mp.alloc(&mp, kSizes[victim % 5]);
        if (call == 'F') mp.free(&mp, held[victim]);
        if (call == 'R') mp.realloc(&mp, held[victim], kSizes[victim % 5]);
      };
      for (int k = 1;; ++k) {
        SCOPED_TRACE(call + std::to_string(victim) + " killed at " + std::to_string(k));
        held = Lay(s, &mp);
        int status = InChild([&] { g_points = 0, g_killAt = k, run(); });
        if (status == 0) break;  // the call ended before point k
        ASSERT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL) << status;
        std::vector<uint32_t> damage;  // where the checker finds it
        auto keep = [](void *c, coffer::ShFault f, uint32_t at) {
          if (coffer::SHFaultIsDamage(f)) static_cast<std::vector<uint32_t> *>(c)->push_back(at);
        };
        coffer::SHCheckRegion(s->region, kKillRegion, nullptr, keep, &damage);
        coffer::ShHeapCounts c;
        unsigned at = 0;
        s->report[0] = 0;
        if ((status = InChild([&] { NextCaller(s, held, call == 'A' ? kBlocks : victim); }))) {
          // refused where the checker finds damage too
          EXPECT_EQ(std::sscanf(s->report, "Shared heap region damaged at offset %u.", &at), 1)
              << status << " " << s->report;
          EXPECT_NE(std::count(damage.begin(), damage.end(), at), 0) << s->report;
        } else {  // used safely: the region is sound, holding at most what was killed
          EXPECT_NE(coffer::SHCheckRegion(s->region, kKillRegion, &c, nullptr, nullptr),
                    coffer::ShHeapState::kDamaged);
          EXPECT_LE(c.allocatedBlocks, 2u);
        }
      }
    }
}

// Eight processes, each mapping the region at its own address, run every
// family's model there at once, each container matching its model after
// every step; once all are gone the heap checks clean and empty.
TEST(Processes, EightRunEveryFamilyInOneRegion) {
  Shared *s = Map();
  MemPool pool;
  ASSERT_EQ(Tandel_InitExclLock(&s->lock), 0);
  ASSERT_TRUE(MemPool_InitOnSharedHeap(&pool, s->region, kRegion, &s->lock));
  for (int id = 0; id < 8; ++id)
    if (fork() == 0) {
      Shared *mine = Map();  // elsewhere, for s is still mapped
      munmap(s, sizeof(Shared));
      MemPool_InitOnSharedHeap(&pool, mine->region, 0, &mine->lock);
      for (Runner run : {RunEsaModel, RunRbtModel, RunHstModel, RunHstaaModel}) {
        std::vector<uint8_t> bytes = RandomBytes(7000 + id, 3000);
        bytes[0] = uint8_t(3 + id % 3);  // a usable capacity, each key kind and separator
        Ops ops(bytes);
        if (std::string e = run(ops, Arena{&pool, nullptr}); !e.empty()) Panic("%s", e.c_str());
      }
      _exit(0);
    }
  for (int id = 0, status = -1; id < 8; ++id)
    EXPECT_TRUE(wait(&status) > 0 && status == 0) << s->report;
  coffer::ShHeapCounts c;
  EXPECT_EQ(coffer::SHCheckRegion(s->region, kRegion, &c, nullptr, nullptr),
            coffer::ShHeapState::kSound);
  EXPECT_EQ(c.allocatedBlocks, 0u);
}

}  // namespace
}  // namespace coffer_test
