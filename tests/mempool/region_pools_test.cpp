// The shared-heap and simple-heap pools: initialisation, lock discipline
// (through interposed lock calls), fatal reports, zero fill, several
// processes on one region, and one region mapped at two addresses.
#include <coffer/platform.h>
#include <dlfcn.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <ostream>
#include <random>

#include "mempool/pool.h"
#include "region_test_util.h"

// ---- interposed lock calls -----------------------------------------------------
// This program's definitions take precedence over the platform library's for
// every caller in the program, the pool code included. They record each call
// when asked and then forward to the real lock.

namespace {

struct LockEvent {
  bool acquire;
  void *lock;
  bool operator==(const LockEvent &o) const { return acquire == o.acquire && lock == o.lock; }
};
void PrintTo(const LockEvent &e, std::ostream *os) {
  *os << (e.acquire ? "acquire " : "release ") << e.lock;
}

struct LockTrace {
  std::vector<LockEvent> *events = nullptr;  // recording when set
  bool echo = false;                         // also report each call on stderr
  std::function<void(void *)> onAcquire;     // runs once the lock is held
  std::function<void(void *)> onRelease;     // runs just before it is released
  void *only = nullptr;                      // forward only this handle, when set
} trace;

using LockFn = int (*)(void *);

LockFn Real(const char *name) {
  auto fn = reinterpret_cast<LockFn>(dlsym(RTLD_NEXT, name));
  if (!fn) std::abort();
  return fn;
}

bool Forwards(void *lock) { return !trace.only || lock == trace.only; }

}  // namespace

extern "C" int Tandel_AcquireExclLock(void *lock) {
  static LockFn real = Real("Tandel_AcquireExclLock");
  int rc = Forwards(lock) ? real(lock) : 0;
  if (trace.events) trace.events->push_back({true, lock});
  if (trace.echo) std::fputs("lock acquired\n", stderr);
  if (trace.onAcquire) trace.onAcquire(lock);
  return rc;
}

extern "C" int Tandel_ReleaseExclLock(void *lock) {
  static LockFn real = Real("Tandel_ReleaseExclLock");
  if (trace.onRelease) trace.onRelease(lock);
  if (trace.events) trace.events->push_back({false, lock});
  if (trace.echo) std::fputs("lock released\n", stderr);
  return Forwards(lock) ? real(lock) : 0;
}

namespace {

using coffer::ShHeapCounts;
using coffer_test::ExpectBlock;
using coffer_test::FillPattern;
using coffer_test::HasPattern;
using coffer_test::HeapSound;
using coffer_test::Region;

constexpr uint32_t kNone = SH_NO_BLOCK;

// Records the lock calls made while it lives.
class TraceScope {
 public:
  TraceScope() { trace.events = &events; }
  ~TraceScope() { trace = LockTrace(); }
  std::vector<LockEvent> events;
};

// A real process-local lock for the shared pool.
struct Lock {
  Lock() { EXPECT_EQ(Tandel_InitExclLock(&lock), 0); }
  ~Lock() { Tandel_DestroyExclLock(&lock); }
  TandelExclLock lock;
};

MemPool Poisoned() {
  MemPool mp;
  std::memset(&mp, 0x5C, sizeof mp);
  return mp;
}

// ---- initialisation ---------------------------------------------------------

TEST(RegionPoolInit, SimpleFormatsLikeReset) {
  Region r(4096), expected(4096);
  MemPool mp = Poisoned();
  EXPECT_TRUE(MemPool_InitOnSimpleHeap(&mp, r.base(), 4096));
  SH_Reset(expected.base(), 4096);
  EXPECT_EQ(r.Snapshot(), expected.Snapshot());
  EXPECT_EQ(mp.base, r.base());
  EXPECT_EQ(mp.lock, nullptr);
  EXPECT_TRUE(mp.alloc && mp.calloc && mp.realloc && mp.free);
}

TEST(RegionPoolInit, SharedAttachLeavesTheRegionAlone) {
  Lock l;
  Region r(4096);
  SH_Reset(r.base(), 4096);
  SH_Alloc(r.base(), 100);
  auto before = r.Snapshot();
  MemPool mp = Poisoned();
  EXPECT_TRUE(MemPool_InitOnSharedHeap(&mp, r.base(), 0, &l.lock));
  EXPECT_EQ(r.Snapshot(), before);
  EXPECT_EQ(mp.base, r.base());
  EXPECT_EQ(mp.lock, &l.lock);
  void *p = mp.alloc(&mp, 8);
  EXPECT_EQ(r.off(p), 148u);  // after the block that was already there
}

// A size the heap refuses fails the whole call: neither the region nor the
// record is written.
TEST(RegionPoolInit, TinyRegionsAreRefused) {
  Lock l;
  for (uint32_t size : {1u, 16u, 32u}) {
    Region r(64);
    auto before = r.Snapshot();
    MemPool a = Poisoned(), b = Poisoned(), poisoned = Poisoned();
    EXPECT_FALSE(MemPool_InitOnSharedHeap(&a, r.base(), size, &l.lock)) << size;
    EXPECT_FALSE(MemPool_InitOnSimpleHeap(&b, r.base(), size)) << size;
    EXPECT_EQ(std::memcmp(&a, &poisoned, sizeof a), 0) << size;
    EXPECT_EQ(std::memcmp(&b, &poisoned, sizeof b), 0) << size;
    EXPECT_EQ(r.Snapshot(), before) << size;
  }
  Region r(64);
  MemPool mp;
  EXPECT_TRUE(MemPool_InitOnSimpleHeap(&mp, r.base(), 33));
  EXPECT_EQ(r.head()->regionSize, 33u);
}

// ---- both pools do the same region-heap work ---------------------------------

TEST(RegionPools, SameRegionWorkWithAndWithoutTheLock) {
  Lock l;
  Region rs(16384), rp(16384);
  MemPool shared, simple;
  ASSERT_TRUE(MemPool_InitOnSharedHeap(&shared, rs.base(), 16384, &l.lock));
  ASSERT_TRUE(MemPool_InitOnSimpleHeap(&simple, rp.base(), 16384));
  std::mt19937 rng(42);
  std::vector<uint32_t> live;  // payload offsets, the same in both regions
  for (int step = 0; step < 600; ++step) {
    uint32_t k = rng() % 4, size = rng() % 200;
    if (live.size() >= 30 && k < 2) k += 2;  // stays well clear of exhaustion
    if (live.empty() || k == 0) {
      void *a = shared.alloc(&shared, size), *b = simple.alloc(&simple, size);
      ASSERT_EQ(rs.off(a), rp.off(b));
      live.push_back(rs.off(a));
    } else if (k == 1) {
      uint32_t count = 1 + size % 5;
      void *a = shared.calloc(&shared, count, size / 5);
      void *b = simple.calloc(&simple, count, size / 5);
      ASSERT_EQ(rs.off(a), rp.off(b));
      live.push_back(rs.off(a));
    } else {
      size_t i = rng() % live.size();
      uint32_t off = live[i];
      live.erase(live.begin() + i);
      if (k == 2) {
        shared.free(&shared, rs.at(off));
        simple.free(&simple, rp.at(off));
      } else {
        void *a = shared.realloc(&shared, rs.at(off), size);
        void *b = simple.realloc(&simple, rp.at(off), size);
        ASSERT_EQ(rs.off(a), rp.off(b));
        if (a) live.push_back(rs.off(a));
      }
    }
    ASSERT_EQ(rs.Snapshot(), rp.Snapshot()) << "step " << step;
  }
  EXPECT_TRUE(HeapSound(rs.base()));
}

// ---- zero fill and exhaustion ----------------------------------------------------

TEST(RegionPools, CallocZeroesTheWholeProduct) {
  Lock l;
  Region rs(1024), rp(1024, 0xFF);
  MemPool shared, simple;
  MemPool_InitOnSharedHeap(&shared, rs.base(), 1024, &l.lock);
  MemPool_InitOnSimpleHeap(&simple, rp.base(), 1024);
  for (MemPool *mp : {&shared, &simple}) {
    char *dirty = static_cast<char *>(mp->alloc(mp, 24));
    std::memset(dirty, 0x77, 24);
    mp->free(mp, dirty);
    char *p = static_cast<char *>(mp->calloc(mp, 3, 7));
    ASSERT_EQ(p, dirty);  // the same block, so the zeros are the fill's doing
    for (int i = 0; i < 21; ++i) EXPECT_EQ(p[i], 0) << i;
    EXPECT_EQ(p[21], 0x77);  // rounding room is not part of the product
  }
}

TEST(RegionPools, SimpleExhaustionGivesNullAndWritesNothing) {
  Region r(256);
  MemPool mp;
  MemPool_InitOnSimpleHeap(&mp, r.base(), 256);
  void *p = mp.alloc(&mp, 100);
  FillPattern(p, 100, 3);
  auto before = r.Snapshot();
  EXPECT_EQ(mp.alloc(&mp, 200), nullptr);
  EXPECT_EQ(mp.calloc(&mp, 2, 100), nullptr);
  EXPECT_EQ(mp.realloc(&mp, p, 200), nullptr);
  EXPECT_EQ(mp.realloc(&mp, nullptr, 200), nullptr);
  EXPECT_EQ(r.Snapshot(), before);
  // Filling it up exactly, then one more.
  void *rest = mp.alloc(&mp, 108);
  ASSERT_NE(rest, nullptr);
  EXPECT_EQ(r.head()->freeHead, kNone);
  EXPECT_EQ(mp.alloc(&mp, 0), nullptr);
  EXPECT_EQ(mp.calloc(&mp, 0, 0), nullptr);
}

// A product past 32 bits would wrap to a small block that the caller then
// overruns; the simple pool refuses it instead.
TEST(RegionPools, SimpleCallocRefusesAnOverflowingProduct) {
  Region r(1 << 16);
  MemPool mp;
  MemPool_InitOnSimpleHeap(&mp, r.base(), 1 << 16);
  auto before = r.Snapshot();
  EXPECT_EQ(mp.calloc(&mp, 65536, 65536), nullptr);    // wraps to 0
  EXPECT_EQ(mp.calloc(&mp, 0x40000001u, 4), nullptr);  // wraps to 4
  EXPECT_EQ(mp.calloc(&mp, 65535, 65537), nullptr);    // 2^32 - 1: fits, but no block does
  EXPECT_EQ(r.Snapshot(), before);
  EXPECT_NE(mp.calloc(&mp, 0xFFFFFFFFu, 0), nullptr);  // size 0 skips the test
  EXPECT_NE(mp.calloc(&mp, 0, 0xFFFFFFFFu), nullptr);
}

TEST(RegionPools, SharedReallocToZeroReleasesWithoutPanic) {
  Lock l;
  Region r(512);
  MemPool mp;
  MemPool_InitOnSharedHeap(&mp, r.base(), 512, &l.lock);
  void *p = mp.realloc(&mp, nullptr, 40);  // as alloc
  ASSERT_EQ(r.off(p), 32u);
  EXPECT_EQ(mp.realloc(&mp, p, 0), nullptr);
  ExpectBlock(r, 16, 496, 0, kNone, kNone);
  mp.free(&mp, nullptr);
  ExpectBlock(r, 16, 496, 0, kNone, kNone);
}

// ---- lock discipline -----------------------------------------------------------

// Each shared operation takes the lock exactly once, around exactly the
// region-heap call: the heap is unchanged when the lock is taken and final
// when it is released (calloc zero-fills after the release).
TEST(RegionPoolLock, OneAcquireAndOneReleaseAroundEachCall) {
  Lock l;
  Region r(4096, 0xAB);
  MemPool mp;
  MemPool_InitOnSharedHeap(&mp, r.base(), 4096, &l.lock);
  void *held = mp.alloc(&mp, 10);

  struct Case {
    const char *name;
    std::function<void()> call;
    bool fillsAfterRelease;
  };
  void *p = nullptr;
  std::vector<Case> cases = {
      {"alloc", [&] { p = mp.alloc(&mp, 50); }, false},
      {"realloc grow", [&] { p = mp.realloc(&mp, p, 90); }, false},
      {"realloc same", [&] { p = mp.realloc(&mp, p, 92); }, false},
      {"realloc null", [&] { held = mp.realloc(&mp, nullptr, 5); }, false},
      {"free", [&] { mp.free(&mp, p); }, false},
      {"free null", [&] { mp.free(&mp, nullptr); }, false},
      {"realloc zero", [&] { mp.realloc(&mp, held, 0); }, false},
      {"calloc", [&] { p = mp.calloc(&mp, 1, 64); }, true},
  };
  for (const Case &c : cases) {
    SCOPED_TRACE(c.name);
    TraceScope t;
    std::vector<char> atAcquire, atRelease;
    trace.onAcquire = [&](void *) { atAcquire = r.Snapshot(); };
    trace.onRelease = [&](void *) { atRelease = r.Snapshot(); };
    auto before = r.Snapshot();
    c.call();
    auto after = r.Snapshot();
    std::vector<LockEvent> want = {{true, &l.lock}, {false, &l.lock}};
    EXPECT_EQ(t.events, want);
    EXPECT_EQ(atAcquire, before);
    if (c.fillsAfterRelease) {
      EXPECT_NE(atRelease, after);
      EXPECT_EQ(static_cast<uint8_t>(atRelease[r.off(p)]), 0xAB);  // not yet zeroed
    } else {
      EXPECT_EQ(atRelease, after);
    }
    EXPECT_TRUE(HeapSound(r.base()));
  }
}

TEST(RegionPoolLock, SimplePoolTakesNoLock) {
  Region r(1024);
  MemPool mp;
  MemPool_InitOnSimpleHeap(&mp, r.base(), 1024);
  TraceScope t;
  void *p = mp.alloc(&mp, 10);
  p = mp.realloc(&mp, p, 100);
  mp.free(&mp, mp.calloc(&mp, 2, 2));
  mp.free(&mp, p);
  EXPECT_TRUE(t.events.empty());
}

// A container frees its handle through the handle: the record the call goes
// through lies in the block being freed. The free must not read the record
// once it holds the lock; the acquire hook scribbles over it to prove that.
TEST(RegionPoolLock, FreeOfARecordThroughItself) {
  Lock l;
  Region r(1024);
  MemPool mp;
  MemPool_InitOnSharedHeap(&mp, r.base(), 1024, &l.lock);
  auto *handle = static_cast<CollectionHeader *>(mp.calloc(&mp, 1, sizeof(CollectionHeader)));
  handle->mp = mp;
  void *neighbour = mp.alloc(&mp, 16);
  TraceScope t;
  trace.only = &l.lock;
  trace.onAcquire = [&](void *) { std::memset(handle, 0xEE, sizeof *handle); };
  handle->mp.free(&handle->mp, handle);
  std::vector<LockEvent> want = {{true, &l.lock}, {false, &l.lock}};
  EXPECT_EQ(t.events, want);
  ShHeapCounts c;
  EXPECT_TRUE(HeapSound(r.base(), &c));
  EXPECT_EQ(c.allocatedBlocks, 1u);
  EXPECT_EQ(r.head()->freeHead, 16u);
  EXPECT_EQ(r.off(neighbour), 88u);  // still allocated, untouched
}

// ---- fatal reports -----------------------------------------------------------------

class RegionPoolDeathTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(Tandel_InitExclLock(&lock_), 0);
    ASSERT_TRUE(MemPool_InitOnSharedHeap(&mp_, region_.base(), 4096, &lock_));
  }
  TandelExclLock lock_;
  Region region_{4096};
  MemPool mp_;
};

TEST_F(RegionPoolDeathTest, ExhaustionPanicsAfterTheRelease) {
  trace.echo = true;
  EXPECT_DEATH(mp_.alloc(&mp_, 100000),
               "lock acquired\nlock released\nOut of memory trying to allocate 100000 bytes\\.");
  EXPECT_DEATH(mp_.calloc(&mp_, 1000, 100),
               "lock acquired\nlock released\nOut of memory trying to allocate 100000 bytes\\.");
  void *p = mp_.alloc(&mp_, 64);
  EXPECT_DEATH(mp_.realloc(&mp_, p, 5000),
               "lock acquired\nlock released\nOut of memory trying to allocate 5000 bytes\\.");
  EXPECT_DEATH(
      mp_.realloc(&mp_, nullptr, 4294967295u),
      "lock acquired\nlock released\nOut of memory trying to allocate 4294967295 bytes\\.");
  trace.echo = false;
}

TEST_F(RegionPoolDeathTest, CallocOverflowPanicsWithoutTheLock) {
  trace.echo = true;
  // Nothing precedes the message: the lock is never taken.
  EXPECT_DEATH(mp_.calloc(&mp_, 65536, 65536),
               "^MemPoolSharedHeapCalloc: integer overflow \\(65536, 65536\n$");
  EXPECT_DEATH(mp_.calloc(&mp_, 3, 0x60000000u),
               "^MemPoolSharedHeapCalloc: integer overflow \\(3, 1610612736\n$");
  trace.echo = false;
  // The largest product that fits passes the test and fails as exhaustion.
  EXPECT_DEATH(mp_.calloc(&mp_, 65535, 65537),
               "Out of memory trying to allocate 4294967295 bytes\\.");
}

// ---- several processes on one region ---------------------------------------------

constexpr int kProcs = 4;
constexpr int kKeep = 8;  // blocks each process leaves allocated
constexpr uint32_t kSharedRegion = 1 << 18;

struct Kept {
  uint32_t off;  // payload offset in the region
  uint32_t size;
  uint32_t tag;
};

struct SharedArea {
  TandelExclLock lock;
  Kept kept[kProcs][kKeep];
};

// One process's share of the work: random allocations, reallocations and
// releases, each block stamped with a pattern that only this process writes
// and checked before it goes back. Returns 0, or the step that went wrong.
int WorkInChild(MemPool *mp, int id, Kept *kept) {
  std::mt19937 rng(1000 + id);
  struct Live {
    void *p;
    uint32_t size, tag;
  };
  std::vector<Live> live;
  uint32_t nextTag = static_cast<uint32_t>(id) << 24;
  for (int step = 1; step <= 4000; ++step) {
    uint32_t k = rng() % 10, size = rng() % 400;
    if (live.size() < 40 && (k < 5 || live.empty())) {
      void *p = k == 0 ? mp->calloc(mp, 1, size) : mp->alloc(mp, size);
      if (k == 0 && size && static_cast<char *>(p)[size - 1] != 0) return step;
      live.push_back({p, size, ++nextTag});
      FillPattern(p, size, nextTag);
      continue;
    }
    size_t i = rng() % live.size();
    Live &b = live[i];
    if (!HasPattern(b.p, b.size, b.tag)) return step;
    if (k < 8) {
      mp->free(mp, b.p);
      live.erase(live.begin() + i);
    } else {
      b.p = mp->realloc(mp, b.p, size + 1);
      if (!HasPattern(b.p, std::min(b.size, size + 1), b.tag)) return step;
      b.size = size + 1;
      b.tag = ++nextTag;
      FillPattern(b.p, b.size, b.tag);
    }
  }
  while (live.size() > static_cast<size_t>(kKeep)) {
    if (!HasPattern(live.back().p, live.back().size, live.back().tag)) return 9999;
    mp->free(mp, live.back().p);
    live.pop_back();
  }
  for (size_t i = 0; i < live.size(); ++i)
    kept[i] = {coffer::AddrToOffset(mp, live[i].p), live[i].size, live[i].tag};
  return 0;
}

TEST(RegionPoolProcesses, ConcurrentUseThroughTheSharedPool) {
  size_t bytes = sizeof(SharedArea) + kSharedRegion;
  void *map = mmap(nullptr, bytes, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  ASSERT_NE(map, MAP_FAILED);
  auto *area = static_cast<SharedArea *>(map);
  void *region = static_cast<char *>(map) + sizeof(SharedArea);
  ASSERT_EQ(Tandel_InitExclLock(&area->lock), 0);
  MemPool mp;
  ASSERT_TRUE(MemPool_InitOnSharedHeap(&mp, region, kSharedRegion, &area->lock));
  std::memset(area->kept, 0, sizeof area->kept);

  pid_t pids[kProcs];
  for (int id = 0; id < kProcs; ++id) {
    pids[id] = fork();
    ASSERT_GE(pids[id], 0);
    if (pids[id] == 0) _exit(WorkInChild(&mp, id, area->kept[id]) ? 1 : 0);
  }
  for (int id = 0; id < kProcs; ++id) {
    int status = 0;
    ASSERT_EQ(waitpid(pids[id], &status, 0), pids[id]);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "process " << id << " " << status;
  }

  ShHeapCounts c;
  ASSERT_TRUE(HeapSound(region, &c));
  EXPECT_EQ(c.allocatedBlocks, static_cast<uint32_t>(kProcs * kKeep));
  EXPECT_EQ(c.freeBytes + c.allocatedBytes, kSharedRegion - 16);
  for (auto &row : area->kept)
    for (const Kept &k : row) {
      void *p = coffer::OffsetToAddr(&mp, k.off);
      ASSERT_NE(p, nullptr);
      EXPECT_TRUE(HasPattern(p, k.size, k.tag));
      mp.free(&mp, p);
    }
  ASSERT_TRUE(HeapSound(region, &c));
  EXPECT_EQ(c.allocatedBlocks, 0u);
  EXPECT_EQ(c.freeBlocks, 1u);
  EXPECT_EQ(c.freeBytes, kSharedRegion - 16);
  Tandel_DestroyExclLock(&area->lock);
  munmap(map, bytes);
}

// ---- one region, two mappings ------------------------------------------------------

// The heap holds offsets only, so a block allocated through one mapping can be
// freed through another at a different address. The lock lives in a block of
// the region and is reached through either mapping.
TEST(RegionPoolMappings, BlocksMoveBetweenTwoMappings) {
  constexpr uint32_t kSize = 16384;
  int fd = memfd_create("coffer-region", 0);
  ASSERT_GE(fd, 0);
  ASSERT_EQ(ftruncate(fd, kSize), 0);
  char *a = static_cast<char *>(mmap(nullptr, kSize, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0));
  char *b = static_cast<char *>(mmap(nullptr, kSize, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0));
  close(fd);
  ASSERT_NE(a, MAP_FAILED);
  ASSERT_NE(b, MAP_FAILED);
  ASSERT_NE(a, b);

  MemPool boot;
  ASSERT_TRUE(MemPool_InitOnSimpleHeap(&boot, a, kSize));
  auto *lockA = static_cast<TandelExclLock *>(boot.alloc(&boot, sizeof(TandelExclLock)));
  ASSERT_EQ(Tandel_InitExclLock(lockA), 0);
  void *lockB = b + (reinterpret_cast<char *>(lockA) - a);

  MemPool pa, pb;
  ASSERT_TRUE(MemPool_InitOnSharedHeap(&pa, a, 0, lockA));
  ASSERT_TRUE(MemPool_InitOnSharedHeap(&pb, b, 0, lockB));

  std::vector<PoolOffset> offs;
  for (uint32_t i = 0; i < 20; ++i) {
    MemPool *mp = i % 2 ? &pb : &pa;
    void *p = mp->alloc(mp, 40 + i);
    FillPattern(p, 40 + i, i);
    offs.push_back(coffer::AddrToOffset(mp, p));
  }
  // Whatever was written through one mapping reads back through the other.
  for (uint32_t i = 0; i < 20; ++i) {
    EXPECT_TRUE(HasPattern(coffer::OffsetToAddr(&pa, offs[i]), 40 + i, i));
    EXPECT_TRUE(HasPattern(coffer::OffsetToAddr(&pb, offs[i]), 40 + i, i));
  }
  // Free each block through the mapping that did not allocate it.
  for (uint32_t i = 0; i < 20; i += 2) pb.free(&pb, coffer::OffsetToAddr(&pb, offs[i]));
  EXPECT_TRUE(HeapSound(a));
  // A block freed through one mapping is found again through the other: of
  // the last two released, the lower.
  void *again = pa.alloc(&pa, 40);
  EXPECT_EQ(coffer::AddrToOffset(&pa, again), offs[16]);
  pb.free(&pb, coffer::OffsetToAddr(&pb, offs[16]));
  for (uint32_t i = 1; i < 20; i += 2) pa.free(&pa, coffer::OffsetToAddr(&pa, offs[i]));

  ShHeapCounts c;
  ASSERT_TRUE(HeapSound(b, &c));
  EXPECT_EQ(c.allocatedBlocks, 1u);  // the lock
  EXPECT_EQ(c.freeBlocks, 1u);
  EXPECT_EQ(std::memcmp(a, b, kSize), 0);
  Tandel_DestroyExclLock(lockA);
  munmap(a, kSize);
  munmap(b, kSize);
}

}  // namespace
