// SPDX-License-Identifier: MIT
// Every family against its model: on seeded random operations, under the
// failure-injection driver, and inside a heap region through both region
// pools.
#include <coffer/platform.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include "support/driver.h"

namespace coffer_test {
namespace {

const std::pair<const char *, Runner> kRunners[] = {
    {"esa", RunEsaModel}, {"rbt", RunRbtModel}, {"hst", RunHstModel}, {"hstaa", RunHstaaModel}};

TEST(Models, AgreeOnSeededOperations) {
  for (auto [name, run] : kRunners)
    for (uint32_t seed = 1; seed <= 40; seed++) {
      Ops ops(RandomBytes(seed, 3000));
      EXPECT_EQ(RunOnTestPool([&](Arena a) { return run(ops, a); }), "") << name << " seed " << seed;
    }
}

TEST(Models, RollBackEveryRefusedAllocation) {
  for (auto [name, run] : kRunners)
    for (uint32_t seed = 100; seed <= 110; seed++) {
      std::vector<uint8_t> bytes = RandomBytes(seed, 300);
      EXPECT_EQ(ForEachFailure([&](Arena a) {
                  Ops ops(bytes);
                  return run(ops, a);
                }),
                "") << name << " seed " << seed;
    }
}

// Once every container is gone the region is one free block again.
TEST(Models, AgreeInsideARegion) {
  std::vector<uint32_t> region(1 << 16);
  const size_t size = region.size() * 4;
  TandelExclLock lock;
  ASSERT_EQ(Tandel_InitExclLock(&lock), 0);
  for (auto [name, run] : kRunners)
    for (uint32_t seed = 1; seed <= 6; seed++) {
      MemPool pool;
      ASSERT_TRUE(seed % 2 ? MemPool_InitOnSharedHeap(&pool, region.data(), size, &lock)
                           : MemPool_InitOnSimpleHeap(&pool, region.data(), size));
      Ops ops(RandomBytes(seed, 2000));
      EXPECT_EQ(run(ops, Arena{&pool, nullptr}), "") << name << " seed " << seed;
      EXPECT_EQ(region[1], 16u) << name << " seed " << seed;  // freeHead, whose
      EXPECT_EQ(region[4], size - 16) << name << " seed " << seed;  // block is all
    }
  Tandel_DestroyExclLock(&lock);
}

// The lock of a holder that died is recovered and then held by the next
// acquirer, which the pools rely on to go on with the region.
TEST(Models, LockOfADeadHolderIsRecovered) {
  auto *lock = static_cast<TandelExclLock *>(
      mmap(nullptr, sizeof(TandelExclLock), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));
  ASSERT_EQ(Tandel_InitExclLock(lock), 0);
  EXPECT_EQ(Tandel_AcquireExclLock(lock), 0);
  EXPECT_EQ(Tandel_ReleaseExclLock(lock), 0);
  if (pid_t child = fork(); child == 0)
    _exit(Tandel_AcquireExclLock(lock));  // dies holding it
  else
    waitpid(child, nullptr, 0);
  EXPECT_EQ(Tandel_AcquireExclLock(lock), 0);
  EXPECT_EQ(Tandel_ReleaseExclLock(lock), 0);
  EXPECT_EQ(Tandel_DestroyExclLock(lock), 0);
  munmap(lock, sizeof *lock);
}

}  // namespace
}  // namespace coffer_test
