// Several processes allocating, resizing and freeing concurrently through
// the shared-heap pool on one region: afterwards the heap must be sound and
// hold exactly the blocks the processes kept, with their contents intact.
#include <coffer/mempool.h>
#include <coffer/platform.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <random>
#include <vector>

#include "mempool/pool.h"
#include "region_test_util.h"

namespace {

using coffer::ShHeapCounts;
using coffer_test::FillPattern;
using coffer_test::HasPattern;
using coffer_test::HeapSound;

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

}  // namespace
