// The pools: initialisation, the shared pool's lock around exactly one heap
// call (seen through interposed lock calls), and what each pool does when
// its heap refuses: the fatal reports, made after the lock is released, and
// the simple pool's null.
#include <dlfcn.h>
#include <gtest/gtest.h>

#include <functional>

#include "heap_driver.h"

// These take precedence over the platform library's calls for the whole
// program, the pools included; they log each call when asked and forward.
namespace {
struct LockTrace {
  std::vector<int> *events = nullptr;          // +1 acquire, -1 release
  bool echo = false;                           // also report each call on stderr
  std::function<void()> onAcquire, onRelease;  // once held / just before release
} trace;

int Forward(const char *name, void *lock) {
  return reinterpret_cast<int (*)(void *)>(dlsym(RTLD_NEXT, name))(lock);
}
}  // namespace

extern "C" int Tandel_AcquireExclLock(void *lock) {
  int rc = Forward("Tandel_AcquireExclLock", lock);
  if (trace.events) trace.events->push_back(+1);
  if (trace.echo) std::fputs("lock acquired\n", stderr);
  if (trace.onAcquire) trace.onAcquire();
  return rc;
}

extern "C" int Tandel_ReleaseExclLock(void *lock) {
  if (trace.onRelease) trace.onRelease();
  if (trace.events) trace.events->push_back(-1);
  if (trace.echo) std::fputs("lock released\n", stderr);
  return Forward("Tandel_ReleaseExclLock", lock);
}

namespace {

using namespace coffer_test;

// Each shared operation takes the lock exactly once, around exactly the heap
// call: the region is unchanged when the lock is taken and final when it is
// released (calloc zero-fills after). A container frees its handle through
// the handle, so the free must not read the record once it holds the lock:
// the acquire hook scribbles over it to prove that.
TEST(RegionPools, SharedPoolLocksExactlyTheHeapCall) {
  TandelExclLock lock;
  ASSERT_EQ(Tandel_InitExclLock(&lock), 0);
  Region r(4096, 0xAB);
  MemPool mp;
  MemPool_InitOnSharedHeap(&mp, r.base(), 4096, &lock);
  auto *handle = static_cast<MemPool *>(mp.alloc(&mp, sizeof(MemPool)));
  *handle = mp;
  char *p = nullptr;
  const std::function<void()> calls[] = {
      [&] { p = static_cast<char *>(mp.alloc(&mp, 50)); },
      [&] { p = static_cast<char *>(mp.realloc(&mp, p, 90)); },
      [&] { p = static_cast<char *>(mp.realloc(&mp, p, 92)); },  // the same capacity
      [&] { mp.free(&mp, nullptr); },
      [&] { EXPECT_EQ(mp.realloc(&mp, p, 0), nullptr); },
      [&] { handle->free(handle, handle); },
      [&] { p = static_cast<char *>(mp.calloc(&mp, 1, 64)); },  // takes the handle's block
  };
  for (int i = 0; i < 7; ++i) {
    std::vector<int> events;
    std::vector<uint32_t> before = r.words, atAcquire, atRelease;
    trace = {&events, false, [&] { atAcquire = r.words; }, [&] { atRelease = r.words; }};
    if (i == 5) trace.onAcquire = [&] { std::memset(handle, 0xEE, sizeof *handle); };
    calls[i]();
    EXPECT_EQ(events, (std::vector<int>{1, -1})) << i;
    EXPECT_TRUE(i == 5 || atAcquire == before) << i;
    if (i == 6) {  // nothing zeroed before the release, all of it after
      EXPECT_EQ(std::count(p, p + 64, 0), 64);
      EXPECT_NE(std::memcmp(&atRelease[r.off(p) / 4], p, 64), 0);
      std::memcpy(p, &atRelease[r.off(p) / 4], 64);
    }
    EXPECT_EQ(atRelease, r.words) << i;
    trace = LockTrace();
    EXPECT_EQ(coffer::SHCheckRegion(r.base(), 4096, nullptr, nullptr, nullptr),
              coffer::ShHeapState::kSound);
  }
}

// Initialisation (a nonzero size formats, 0 attaches), then exhaustion,
// damage and blocks that are not the caller's: the shared pool reports each
// after its lock is released (an overflowing calloc before it takes the
// lock); the simple pool returns null or ignores the release, and writes
// nothing.
TEST(RegionPoolsDeathTest, Refusals) {
  TandelExclLock lock;
  ASSERT_EQ(Tandel_InitExclLock(&lock), 0);
  Region r(4096);
  MemPool shared, simple, std;
  MemPool_InitOnStdHeap(&std);
  ASSERT_TRUE(MemPool_InitOnSharedHeap(&shared, r.base(), 4096, &lock));
  void *p = shared.alloc(&shared, 64), *gone = shared.alloc(&shared, 8);
  shared.free(&shared, gone);
  std::vector<uint32_t> before = r.words;
  MemPool tiny = std;
  ASSERT_TRUE(MemPool_InitOnSimpleHeap(&simple, r.base(), 0));
  for (uint32_t size : {1u, 16u, 32u})  // too small: neither region nor record is written
    EXPECT_FALSE(MemPool_InitOnSharedHeap(&tiny, r.base(), size, &lock) ||
                 MemPool_InitOnSimpleHeap(&tiny, r.base(), size));
  EXPECT_TRUE(r.words == before && !std::memcmp(&tiny, &std, sizeof tiny));
  EXPECT_TRUE(shared.base == r.base() && shared.lock == &lock && simple.base == r.base() &&
              !simple.lock);
  const std::string oom = "Out of memory trying to allocate ",
                    locked = "lock acquired\nlock released\n";
  trace.echo = true;
  EXPECT_DEATH(shared.alloc(&shared, 100000), "^" + locked + oom + "100000 bytes\\.\n$");
  EXPECT_DEATH(shared.calloc(&shared, 1000, 100), "^" + locked + oom + "100000 bytes\\.\n$");
  EXPECT_DEATH(shared.realloc(&shared, p, 5000), "^" + locked + oom + "5000 bytes\\.\n$");
  EXPECT_DEATH(shared.calloc(&shared, 65535, 65537), "^" + locked + oom + "4294967295 bytes");
  EXPECT_DEATH(shared.calloc(&shared, 65536, 65536),
               "^MemPoolSharedHeapCalloc: integer overflow \\(65536, 65536\n$");
  const std::string foreign =
      "^" + locked + "Shared heap: offset 112 is not the payload of an allocated block\\.\n$";
  EXPECT_DEATH(shared.free(&shared, gone), foreign);
  EXPECT_DEATH(shared.realloc(&shared, gone, 8), foreign);
  EXPECT_DEATH(shared.realloc(&shared, gone, 0), foreign);
  trace.echo = false;
  EXPECT_EQ(simple.calloc(&simple, 65536, 65536), nullptr);    // wraps to 0
  EXPECT_EQ(simple.calloc(&simple, 0x40000001u, 4), nullptr);  // wraps to 4
  r.word(96)[1] = 4;  // the block after p no longer agrees about p's size
  before = r.words;
  EXPECT_EQ(simple.realloc(&simple, p, 8), nullptr);
  simple.free(&simple, p);
  simple.free(&simple, gone);
  EXPECT_EQ(r.words, before);
  trace.echo = true;
  const std::string damaged = "^" + locked + "Shared heap region damaged at offset 96\\.\n$";
  EXPECT_DEATH(shared.free(&shared, p), damaged);
  EXPECT_DEATH(shared.realloc(&shared, p, 8), damaged);
  EXPECT_DEATH(shared.alloc(&shared, 100000), damaged);  // damage, not exhaustion
  *r.word(0) = 32;
  EXPECT_DEATH(shared.alloc(&shared, 8),
               "^" + locked + "Shared heap region damaged at offset 0\\.\n$");
  trace.echo = false;
}

}  // namespace
