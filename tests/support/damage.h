// SPDX-License-Identifier: MIT
// Tables of damage a checker must find. Each row damages a structure kept in
// a heap region; the check must then fail and name what the row names. The
// region's bytes are put back after every row.
#ifndef COFFER_TESTS_SUPPORT_DAMAGE_H
#define COFFER_TESTS_SUPPORT_DAMAGE_H

#include <gtest/gtest.h>

#include <functional>
#include <vector>

#include "mempool/check.h"

namespace coffer_test {

struct Damage {
  const char *what;
  std::function<void()> apply;
};

inline void ExpectEachFound(std::vector<uint32_t> &region, const std::function<bool(coffer::CheckFault *)> &check,
                            std::initializer_list<Damage> rows) {
  for (const Damage &row : rows) {
    const std::vector<uint32_t> saved = region;
    coffer::CheckFault fault{"", 0};
    ASSERT_TRUE(check(&fault)) << fault.what;
    row.apply();
    EXPECT_FALSE(check(&fault)) << row.what;
    EXPECT_STREQ(fault.what, row.what);
    region = saved;
  }
}

// A region of n words with a simple-heap pool over it.
struct RegionPool {
  explicit RegionPool(size_t n) : words(n) { MemPool_InitOnSimpleHeap(&pool, words.data(), n * 4); }
  std::vector<uint32_t> words;
  MemPool pool;
};

}  // namespace coffer_test

#endif
