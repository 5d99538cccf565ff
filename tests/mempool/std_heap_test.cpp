// The process-heap pool: its record, the overflow test of calloc, and the
// exact fatal reports.
#include <coffer/mempool.h>
#include <gtest/gtest.h>

#include <cstring>

namespace {

MemPool StdPool() {
  MemPool p;
  std::memset(&p, 0xA5, sizeof p);
  EXPECT_TRUE(MemPool_InitOnStdHeap(&p));
  return p;
}

TEST(StdHeapPool, InitFillsEveryWordOfAnArbitraryRecord) {
  MemPool p = StdPool();
  EXPECT_NE(p.alloc, nullptr);
  EXPECT_NE(p.calloc, nullptr);
  EXPECT_NE(p.realloc, nullptr);
  EXPECT_NE(p.free, nullptr);
  EXPECT_EQ(p.base, nullptr);
  EXPECT_EQ(p.lock, nullptr);
}

TEST(StdHeapPool, OperationsWorkThroughACopyOfTheRecord) {
  MemPool orig = StdPool();
  MemPool p = orig;
  char *a = static_cast<char *>(p.alloc(&p, 5));
  std::memcpy(a, "abcd", 5);
  a = static_cast<char *>(p.realloc(&p, a, 4000));
  EXPECT_STREQ(a, "abcd");
  unsigned char *z = static_cast<unsigned char *>(p.calloc(&p, 100, 3));
  for (int i = 0; i < 300; i++) ASSERT_EQ(z[i], 0);
  p.free(&p, z);
  p.free(&p, a);
  p.free(&p, nullptr);
  // A size of 0 skips the overflow test whatever the count.
  void *q = p.calloc(&p, 0xFFFFFFFFu, 0);
  p.free(&p, q);
  EXPECT_EQ(p.realloc(&p, p.alloc(&p, 8), 0), nullptr);
}

TEST(StdHeapPoolDeath, CallocOverflowNamesItselfAndBothArguments) {
  MemPool p = StdPool();
  EXPECT_DEATH(p.calloc(&p, 65536, 65536),
               "(^|\n)MemPoolStdHeapCalloc: integer overflow \\(65536, 65536\n$");
  // 65535 x 65537 is exactly 2^32 - 1: the test passes and calloc itself
  // fails, showing the exact product.
  EXPECT_DEATH(p.calloc(&p, 65535, 65537),
               "(^|\n)Out of memory trying to allocate 4294967295 bytes.\n$");
}

TEST(StdHeapPoolDeath, ExhaustionIsReportedWithTheSize) {
  MemPool p = StdPool();
  EXPECT_DEATH(p.alloc(&p, 0xFFFFFFF0u), "(^|\n)Out of memory trying to allocate 4294967280 bytes.\n$");
  EXPECT_DEATH(p.realloc(&p, nullptr, 0xFFFFFFF0u),
               "(^|\n)Out of memory trying to allocate 4294967280 bytes.\n$");
}

}  // namespace
