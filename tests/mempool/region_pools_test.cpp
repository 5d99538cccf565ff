// The shared-heap and simple-heap pools: initialisation, lock discipline
// (through interposed lock calls), fatal reports and zero fill.
#include <coffer/platform.h>
#include <dlfcn.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <functional>
#include <random>

#include "mempool/pool.h"
#include "region_test_util.h"

// ---- interposed lock calls -----------------------------------------------------
// These definitions take precedence over the platform library's for every
// caller in the program, the pool code included. They log each call when asked
// and forward to the real lock.

namespace {

struct LockTrace {
  std::vector<std::pair<bool, void *>> *events = nullptr;  // (acquire?, handle) when set
  bool echo = false;                                       // also report each call on stderr
  std::function<void()> onAcquire, onRelease;              // once held / just before release
  void *only = nullptr;                                    // forward only this handle, when set
} trace;

int Forward(const char *name, void *lock) {
  auto real = reinterpret_cast<int (*)(void *)>(dlsym(RTLD_NEXT, name));
  if (!real) std::abort();
  return !trace.only || lock == trace.only ? real(lock) : 0;
}

}  // namespace

extern "C" int Tandel_AcquireExclLock(void *lock) {
  int rc = Forward("Tandel_AcquireExclLock", lock);
  if (trace.events) trace.events->push_back({true, lock});
  if (trace.echo) std::fputs("lock acquired\n", stderr);
  if (trace.onAcquire) trace.onAcquire();
  return rc;
}

extern "C" int Tandel_ReleaseExclLock(void *lock) {
  if (trace.onRelease) trace.onRelease();
  if (trace.events) trace.events->push_back({false, lock});
  if (trace.echo) std::fputs("lock released\n", stderr);
  return Forward("Tandel_ReleaseExclLock", lock);
}

namespace {

using namespace coffer_test;
using Events = std::vector<std::pair<bool, void *>>;

// Logs the lock calls made while it lives.
struct TraceScope {
  TraceScope() { trace.events = &events; }
  ~TraceScope() { trace = LockTrace(); }
  Events events;
};

// A process-local lock for the shared pool.
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

// A nonzero size formats the region, 0 attaches to it as it is. A size the
// heap refuses fails the whole call: neither the region nor the record is
// written.
TEST(RegionPoolInit, FormatAttachOrRefuse) {
  Lock l;
  Region r(4096), expected(4096);
  MemPool mp = Poisoned(), poisoned = Poisoned();
  EXPECT_TRUE(MemPool_InitOnSimpleHeap(&mp, r.base(), 4096));
  SH_Reset(expected.base(), 4096);
  EXPECT_EQ(r.Snapshot(), expected.Snapshot());
  EXPECT_TRUE(mp.alloc && mp.calloc && mp.realloc && mp.free && mp.base == r.base() && !mp.lock);
  SH_Alloc(r.base(), 100);
  auto before = r.Snapshot();
  mp = Poisoned();
  EXPECT_TRUE(MemPool_InitOnSharedHeap(&mp, r.base(), 0, &l.lock));
  EXPECT_EQ(r.Snapshot(), before);
  EXPECT_TRUE(mp.base == r.base() && mp.lock == &l.lock);
  EXPECT_EQ(r.off(mp.alloc(&mp, 8)), 148u);  // after the block that was already there
  for (uint32_t size : {1u, 16u, 32u}) {
    before = r.Snapshot();
    MemPool a = Poisoned(), b = Poisoned();
    EXPECT_FALSE(MemPool_InitOnSharedHeap(&a, r.base(), size, &l.lock)) << size;
    EXPECT_FALSE(MemPool_InitOnSimpleHeap(&b, r.base(), size)) << size;
    EXPECT_EQ(std::memcmp(&a, &poisoned, sizeof a), 0) << size;
    EXPECT_EQ(std::memcmp(&b, &poisoned, sizeof b), 0) << size;
    EXPECT_EQ(r.Snapshot(), before) << size;
  }
  EXPECT_TRUE(MemPool_InitOnSimpleHeap(&mp, r.base(), 33));
  EXPECT_EQ(r.head()->regionSize, 33u);
}

// Apart from the lock, both pools make the same region-heap calls; the simple
// pool takes no lock and the shared one exactly one per call.
TEST(RegionPools, SameRegionWorkWithAndWithoutTheLock) {
  Lock l;
  Region rs(16384), rp(16384);
  MemPool shared, simple;
  ASSERT_TRUE(MemPool_InitOnSharedHeap(&shared, rs.base(), 16384, &l.lock));
  ASSERT_TRUE(MemPool_InitOnSimpleHeap(&simple, rp.base(), 16384));
  std::mt19937 rng(42);
  std::vector<uint32_t> live;  // payload offsets, the same in both regions
  TraceScope t;
  for (int step = 0; step < 600; ++step) {
    uint32_t k = rng() % 4, size = rng() % 200, off = 0;
    if (live.size() >= 30 && k < 2) k += 2;  // stays clear of exhaustion
    if (live.empty()) k = 0;
    if (k >= 2) {  // free or realloc a live block
      size_t i = rng() % live.size();
      off = live[i];
      live.erase(live.begin() + i);
    }
    auto op = [&](MemPool &mp, Region &r) -> void * {
      switch (k) {
        case 0:
          return mp.alloc(&mp, size);
        case 1:
          return mp.calloc(&mp, 1 + size % 5, size / 5);
        case 2:
          return mp.free(&mp, r.at(off)), nullptr;
        default:
          return mp.realloc(&mp, r.at(off), size);
      }
    };
    void *a = op(shared, rs), *b = op(simple, rp);
    ASSERT_EQ(rs.off(a), rp.off(b));
    if (a) live.push_back(rs.off(a));
    ASSERT_EQ(rs.Snapshot(), rp.Snapshot()) << "step " << step;
    ASSERT_EQ(t.events.size(), 2u * (step + 1));
  }
  EXPECT_TRUE(HeapSound(rs.base()));
}

TEST(RegionPools, CallocZeroesExactlyTheProduct) {
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

TEST(RegionPools, SimpleExhaustionAndOverflowGiveNullAndWriteNothing) {
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
  // A product past 32 bits would wrap to a small block the caller overruns.
  EXPECT_EQ(mp.calloc(&mp, 65536, 65536), nullptr);    // wraps to 0
  EXPECT_EQ(mp.calloc(&mp, 0x40000001u, 4), nullptr);  // wraps to 4
  EXPECT_EQ(r.Snapshot(), before);
  EXPECT_NE(mp.calloc(&mp, 0xFFFFFFFFu, 0), nullptr);  // size 0 skips the test
  EXPECT_NE(mp.calloc(&mp, 0, 0xFFFFFFFFu), nullptr);
  EXPECT_NE(mp.alloc(&mp, 68), nullptr);  // fills the region exactly
  EXPECT_EQ(r.head()->freeHead, kNone);
  EXPECT_EQ(mp.alloc(&mp, 0), nullptr);
}

// Each shared operation takes the lock exactly once, around exactly the
// region-heap call: the heap is unchanged when the lock is taken and final
// when it is released (calloc zero-fills after the release).
TEST(RegionPoolLock, OneAcquireAndOneReleaseAroundEachCall) {
  Lock l;
  Region r(4096, 0xAB);
  MemPool mp;
  MemPool_InitOnSharedHeap(&mp, r.base(), 4096, &l.lock);
  void *held = mp.alloc(&mp, 10), *p = nullptr;
  const std::pair<const char *, std::function<void()>> cases[] = {
      {"alloc", [&] { p = mp.alloc(&mp, 50); }},
      {"realloc grow", [&] { p = mp.realloc(&mp, p, 90); }},
      {"realloc same", [&] { p = mp.realloc(&mp, p, 92); }},
      {"realloc null", [&] { held = mp.realloc(&mp, nullptr, 5); }},
      {"free", [&] { mp.free(&mp, p); }},
      {"free null", [&] { mp.free(&mp, nullptr); }},
      {"realloc zero", [&] { EXPECT_EQ(mp.realloc(&mp, held, 0), nullptr); }},
      {"calloc", [&] { p = mp.calloc(&mp, 1, 64); }},  // must stay last
  };
  for (const auto &[name, call] : cases) {
    SCOPED_TRACE(name);
    TraceScope t;
    std::vector<char> atAcquire, atRelease;
    trace.onAcquire = [&] { atAcquire = r.Snapshot(); };
    trace.onRelease = [&] { atRelease = r.Snapshot(); };
    auto before = r.Snapshot();
    call();
    EXPECT_EQ(t.events, (Events{{true, &l.lock}, {false, &l.lock}}));
    EXPECT_EQ(atAcquire, before);
    if (std::strcmp(name, "calloc") == 0) {  // zeroed after the release, and nothing else
      EXPECT_EQ(static_cast<uint8_t>(atRelease[r.off(p)]), 0xAB);
      EXPECT_EQ(std::vector<char>(static_cast<char *>(p), static_cast<char *>(p) + 64),
                std::vector<char>(64, 0));
      std::memcpy(p, &atRelease[r.off(p)], 64);
    }
    EXPECT_EQ(atRelease, r.Snapshot());
    EXPECT_TRUE(HeapSound(r.base()));
  }
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
  trace.onAcquire = [&] { std::memset(handle, 0xEE, sizeof *handle); };
  handle->mp.free(&handle->mp, handle);
  EXPECT_EQ(t.events, (Events{{true, &l.lock}, {false, &l.lock}}));
  coffer::ShHeapCounts c;
  EXPECT_TRUE(HeapSound(r.base(), &c));
  EXPECT_EQ(c.allocatedBlocks, 1u);
  EXPECT_EQ(r.head()->freeHead, 16u);
  EXPECT_EQ(r.off(neighbour), 88u);  // still allocated
}

class RegionPoolDeathTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(Tandel_InitExclLock(&lock_), 0);
    ASSERT_TRUE(MemPool_InitOnSharedHeap(&mp_, region_.base(), 4096, &lock_));
    trace.echo = true;
  }
  void TearDown() override { trace.echo = false; }
  TandelExclLock lock_;
  Region region_{4096};
  MemPool mp_;
};

// Exhaustion panics after the release; an overflowing calloc panics without
// taking the lock at all (nothing precedes its message).
TEST_F(RegionPoolDeathTest, FatalReports) {
  const std::string oom = "lock acquired\nlock released\nOut of memory trying to allocate ";
  EXPECT_DEATH(mp_.alloc(&mp_, 100000), oom + "100000 bytes\\.");
  EXPECT_DEATH(mp_.calloc(&mp_, 1000, 100), oom + "100000 bytes\\.");
  EXPECT_DEATH(mp_.realloc(&mp_, mp_.alloc(&mp_, 64), 5000), oom + "5000 bytes\\.");
  EXPECT_DEATH(mp_.realloc(&mp_, nullptr, 4294967295u), oom + "4294967295 bytes\\.");
  EXPECT_DEATH(mp_.calloc(&mp_, 65535, 65537), oom + "4294967295 bytes\\.");  // 2^32 - 1 fits
  EXPECT_DEATH(mp_.calloc(&mp_, 65536, 65536),
               "^MemPoolSharedHeapCalloc: integer overflow \\(65536, 65536\n$");
  EXPECT_DEATH(mp_.calloc(&mp_, 3, 0x60000000u),
               "^MemPoolSharedHeapCalloc: integer overflow \\(3, 1610612736\n$");
}

}  // namespace
