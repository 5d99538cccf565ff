// SPDX-License-Identifier: MIT
// The sorted string array's sharp edges: the order of its pool calls, the
// capacities it refuses, and its checker firing on damaged arrays.
#include <gtest/gtest.h>

#include "esa/esa_internal.h"
#include "support/damage.h"
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
  ESA_FreeArray(nullptr);
  EXPECT_EQ(TakeCallLog(),
            "c1x40 c1x16 r0:0 r0:16 a3 a2 r32 a2 v97 f r16 v98 f v99 f r0 r0:16 a2 v4 f r0 f f "
            "c1x40 c1x16 r0:32 a2 f f f f");
  EXPECT_EQ(tp.held(), 0u);
}

TEST(Esa, CheckerFindsEachDamage) {
  RegionPool r(256);
  EsaArray *a = ESA_AllocArrayEx(&r.pool, 4, 4);
  for (const char *k : {"a", "b", "c"}) ESA_Insert(a, k, 0);
  auto *d = static_cast<EsaArrayData *>(a->data);
  EsaEntry *e = ESA_Get(a, 0);
  coffer::CheckSpan span = {16, 1024};  // the region past its header
  ExpectEachFound(r.words, [&](coffer::CheckFault *f) { return coffer::ESACheckArray(a, f, &span); },
                  {{"size outside 0 .. capacity", [&] { d->size = 5; }},
                   {"size outside 0 .. capacity", [&] { d->size = -1; }},
                   {"slots without an entry block", [&] { d->entries = 0; }},
                   {"entry without a key", [&] { e[1].key = 0; }},
                   {"keys out of order", [&] { std::swap(e[0], e[2]); }},
                   {"entry block outside the region", [&] { d->entries = 8; }},
                   {"key outside the region", [&] { e[1].key = 8; }},
                   {"record outside the region", [&] { span.hi = 16; }}});  // last: the span stays narrowed
}

}  // namespace
}  // namespace coffer_test
