// The process-heap pool, and the handle and value-release conventions that
// every container family follows.
#include "mempool/pool.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>

#include "support/test_pool.h"

namespace {

MemPool StdPool() {
  MemPool p;
  std::memset(&p, 0xA5, sizeof p);
  EXPECT_TRUE(MemPool_InitOnStdHeap(&p));
  EXPECT_TRUE(p.alloc && p.calloc && p.realloc && p.free && !p.base && !p.lock);
  return p;
}

TEST(StdHeapPool, OperationsWorkThroughACopyOfTheRecord) {
  MemPool p = StdPool();
  char *a = static_cast<char *>(p.realloc(&p, p.alloc(&p, 5), 4000));
  auto *z = static_cast<unsigned char *>(p.calloc(&p, 100, 3));
  for (int i = 0; i < 300; i++) ASSERT_EQ(z[i], 0);
  p.free(&p, z);
  p.free(&p, a);
  p.free(&p, nullptr);
  p.free(&p, p.calloc(&p, 0xFFFFFFFFu, 0));  // a size of 0 skips the overflow test
  EXPECT_EQ(p.realloc(&p, p.alloc(&p, 8), 0), nullptr);
}

TEST(StdHeapPoolDeath, FatalReportsShowTheExactSizes) {
  MemPool p = StdPool();
  const std::string oom = "(^|\n)Out of memory trying to allocate ";
  EXPECT_DEATH(p.calloc(&p, 65536, 65536),
               "(^|\n)MemPoolStdHeapCalloc: integer overflow \\(65536, 65536\n$");
  // 65535 x 65537 is exactly 2^32 - 1: the test passes, calloc itself fails.
  EXPECT_DEATH(p.calloc(&p, 65535, 65537), oom + "4294967295 bytes.\n$");
  EXPECT_DEATH(p.alloc(&p, 0xFFFFFFF0u), oom + "4294967280 bytes.\n$");
  EXPECT_DEATH(p.realloc(&p, nullptr, 0xFFFFFFF0u), oom + "4294967280 bytes.\n$");
}

size_t callocArgs[2];
void *LoggedCalloc(MemPool *pool, size_t count, size_t size) {
  callocArgs[0] = count, callocArgs[1] = size;
  return pool->base ? nullptr : std::calloc(count, size);  // a nonzero base refuses
}

TEST(PoolConventions, HandlesAndTheirRelease) {
  MemPool rec = StdPool();
  rec.calloc = LoggedCalloc;
  CollectionHeader *h = coffer::AllocHandle(&rec);
  ASSERT_NE(h, nullptr);
  EXPECT_EQ(callocArgs[0], 1u);  // one zeroed element
  EXPECT_EQ(callocArgs[1], sizeof(CollectionHeader));
  EXPECT_EQ(std::memcmp(&h->mp, &rec, sizeof rec), 0);
  EXPECT_TRUE(h->ownsHandle && !h->freeValFn && !h->mpFreeValFn && !h->data);
  int data;
  h->freeValFn = coffer_test::RecordRelease;
  CollectionHeader t = coffer::TransientHandle(h, &data);
  EXPECT_EQ(std::memcmp(&t.mp, &rec, sizeof rec), 0);
  EXPECT_TRUE(!t.freeValFn && !t.mpFreeValFn && !t.ownsHandle && t.data == &data);
  coffer::ReleaseHandle(&t);  // not owned: a free here would hit the stack
  coffer::ReleaseHandle(h);   // owned: a leak would show under the sanitizer
  rec.base = &data;
  EXPECT_EQ(coffer::AllocHandle(&rec), nullptr);
}

// At most one release callback is set; a dropped value (0 included) goes to
// it, to the pool kind with the handle as the pool.
TEST(PoolConventions, SettersKeepAtMostOneCallbackAndDropUsesIt) {
  using namespace coffer_test;
  CollectionHeader h = {StdPool(), nullptr, nullptr, false, nullptr};
  Releases().clear();
  EXPECT_EQ(coffer::SetFreeValFn(&h, RecordRelease), nullptr);
  EXPECT_EQ(coffer::SetMpFreeValFn(&h, RecordMpRelease), nullptr);  // not the cleared one
  EXPECT_EQ(h.freeValFn, nullptr);
  coffer::DropValue(&h, 0);
  EXPECT_EQ(coffer::SetFreeValFn(&h, RecordRelease), nullptr);
  EXPECT_EQ(h.mpFreeValFn, nullptr);
  coffer::DropValue(&h, 7);
  EXPECT_EQ(coffer::SetFreeValFn(&h, nullptr), RecordRelease);
  coffer::DropValue(&h, 9);  // nobody to tell
  EXPECT_EQ(Releases(), (std::vector<Released>{{0, &h.mp}, {7, nullptr}}));
}

}  // namespace
