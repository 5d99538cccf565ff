// The sorted string array's sharp edges: the order of its pool calls, the
// capacities it refuses, and its checker firing on damaged arrays.
#include <gtest/gtest.h>

#include <climits>

#include "esa/esa_internal.h"
#include "support/test_pool.h"

namespace coffer_test {
namespace {

TEST(Esa, PoolCallsAndReleasesInOrder) {
  TestPool tp;
  StartCallLog();
  EsaArray *a = ESA_AllocArrayEx(tp.pool(), 0, 2);
  ESA_SetFreeValFn(a, RecordRelease);
  for (const char *k : {"ab", "c", "b"}) ESA_Insert(a, k, k[0]);
  ESA_Remove(a, 0);
  ESA_Clear(a);
  ESA_Insert(a, "x", 4);
  ESA_FreeArray(a);
  a = ESA_AllocArrayEx(tp.pool(), 4, 8);  // slack below the increment: the block outlives the clear
  ESA_Insert(a, "k", 5);
  ESA_FreeArray(a);
  EXPECT_EQ(TakeCallLog(),
            "c1x40 c1x16 r0:0 r0:16 a3 a2 r32 a2 v97 f r16 v98 f v99 f r0 r0:16 a2 v4 f r0 f f "
            "c1x40 c1x16 r0:32 a2 f f f f");
  EXPECT_EQ(tp.held(), 0u);
}

// Capacities the array cannot use are refused before anything is allocated;
// an increment below 1 counts as 1.
TEST(Esa, UnusableCapacities) {
  TestPool tp;
  EXPECT_EQ(ESA_AllocArrayEx(tp.pool(), -1, 4), nullptr);
  EXPECT_EQ(ESA_AllocArrayEx(tp.pool(), 0x20000000, 1), nullptr);  // slots x 8 overflows
  EXPECT_EQ(tp.held(), 0u);
  EsaArray *a = ESA_AllocArrayEx(tp.pool(), 1, 0);
  ASSERT_TRUE(ESA_Insert(a, "a", 1) && ESA_Insert(a, "b", 2));
  EXPECT_EQ(static_cast<EsaArrayData *>(a->data)->capacity, 2);
  const long calls = tp.calls();
  for (int32_t inc : {INT32_MAX, 0x20000000}) {  // size + increment, then its bytes, overflow
    ESA_SetCapacityIncrement(a, inc);
    EXPECT_FALSE(ESA_Insert(a, "c", 3));
  }
  EXPECT_FALSE(coffer::ESAResize(a, -1));
  EXPECT_EQ(tp.calls(), calls);
  EXPECT_EQ(ESA_GetSize(a), 2);
  ESA_FreeArray(a);
  ESA_FreeArray(nullptr);
  EXPECT_EQ(tp.held(), 0u);
}

TEST(Esa, CheckerFiresOnEachDamage) {
  EsaArray *a = ESA_AllocArray(4, 4);
  for (const char *k : {"a", "b", "c"}) ESA_Insert(a, k, 0);
  auto *d = static_cast<EsaArrayData *>(a->data);
  EsaEntry *e = ESA_Get(a, 0);
  const struct {
    const char *what;
    std::function<void()> damage;
  } kDamage[] = {
      {"size outside 0 .. capacity", [&] { d->size = 5; }},
      {"size outside 0 .. capacity", [&] { d->size = -1; }},
      {"slots without an entry block", [&] { d->entries = 0; }},
      {"entry without a key", [&] { e[1].key = 0; }},
      {"keys out of order", [&] { std::swap(e[0], e[2]); }},
  };
  coffer::CheckFault fault;
  for (const auto &row : kDamage) {
    const EsaArrayData saved = *d;
    const EsaEntry entries[3] = {e[0], e[1], e[2]};
    ASSERT_TRUE(coffer::ESACheckArray(a, &fault));
    row.damage();
    EXPECT_FALSE(coffer::ESACheckArray(a, &fault));
    EXPECT_STREQ(fault.what, row.what);
    *d = saved;
    std::copy(entries, entries + 3, e);
  }
  ESA_FreeArray(a);
}

}  // namespace
}  // namespace coffer_test
