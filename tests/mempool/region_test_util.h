// Helpers for the region heap and region pool tests.
#ifndef COFFER_TESTS_MEMPOOL_REGION_TEST_UTIL_H
#define COFFER_TESTS_MEMPOOL_REGION_TEST_UTIL_H

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "mempool/region_heap.h"

namespace coffer_test {

constexpr uint32_t kNone = SH_NO_BLOCK;

// A 4-byte aligned region of the requested size, filled with a marker byte
// so that stale bytes show.
class Region {
 public:
  explicit Region(uint32_t size, uint8_t fill = 0xA5) : words_((size + 3) / 4), size_(size) {
    std::memset(words_.data(), fill, words_.size() * 4);
  }
  void *base() { return words_.data(); }
  char *bytes() { return reinterpret_cast<char *>(words_.data()); }
  ShRegionHeader *head() { return reinterpret_cast<ShRegionHeader *>(words_.data()); }
  ShBlockHeader *block(uint32_t off) { return reinterpret_cast<ShBlockHeader *>(bytes() + off); }
  void *at(uint32_t off) { return bytes() + off; }
  // Region offset of an address; 0 for null.
  uint32_t off(const void *p) {
    return p ? static_cast<uint32_t>(static_cast<const char *>(p) - bytes()) : 0;
  }
  std::vector<char> Snapshot() { return std::vector<char>(bytes(), bytes() + size_); }

 private:
  std::vector<uint32_t> words_;
  uint32_t size_;
};

inline ::testing::AssertionResult HeapSound(const void *region,
                                            coffer::ShHeapCounts *counts = nullptr) {
  std::string why;
  if (coffer::SHCheckHeap(region, counts, &why)) return ::testing::AssertionSuccess();
  return ::testing::AssertionFailure() << "heap check: " << why;
}

// Every field of one block header.
inline void ExpectBlock(Region &r, uint32_t off, uint32_t size, uint32_t prevSize, uint32_t next,
                        uint32_t prev) {
  const ShBlockHeader *b = r.block(off);
  EXPECT_EQ((std::vector<uint32_t>{b->blockSize, b->prevBlockSize, b->nextFree, b->prevFree}),
            (std::vector<uint32_t>{size, prevSize, next, prev}))
      << "block at " << off;
}

// Deterministic contents, so a block's bytes identify its owner.
inline uint8_t PatternByte(uint32_t tag, uint32_t i) {
  return static_cast<uint8_t>((tag * 2654435761u + i * 131u) >> 7);
}
inline void FillPattern(void *p, uint32_t size, uint32_t tag) {
  for (uint32_t i = 0; i < size; ++i) static_cast<uint8_t *>(p)[i] = PatternByte(tag, i);
}
inline bool HasPattern(const void *p, uint32_t size, uint32_t tag) {
  for (uint32_t i = 0; i < size; ++i)
    if (static_cast<const uint8_t *>(p)[i] != PatternByte(tag, i)) return false;
  return true;
}

}  // namespace coffer_test

#endif
