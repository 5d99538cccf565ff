// The region heap against a model: operations decoded from a byte string run
// on a region through SH_*, the simple pool and the shared pool, and after
// each one the whole observable state must match the model: the offset
// returned (the lower of the first two fits), every header word, the
// contents of every live block, calloc's zero fill, the checker's verdict
// and counts. The model test feeds it seeded random bytes, the fuzz target
// the fuzzer's.
#ifndef COFFER_TESTS_MEMPOOL_HEAP_DRIVER_H
#define COFFER_TESTS_MEMPOOL_HEAP_DRIVER_H

#include <coffer/platform.h>

#include <algorithm>
#include <cstring>
#include <map>
#include <string>
#include <vector>

#include "mempool/region_heap.h"

namespace coffer_test {

// Bytes that tell which write a block last had.
inline uint8_t Mark(uint32_t tag, uint32_t i) {
  return uint8_t((tag * 2654435761u + i * 131u) >> 7);
}
inline void Stamp(void *p, uint32_t n, uint32_t tag) {
  for (uint32_t i = 0; i < n; ++i) static_cast<uint8_t *>(p)[i] = Mark(tag, i);
}
inline bool Stamped(const void *p, uint32_t n, uint32_t tag) {
  for (uint32_t i = 0; i < n; ++i)
    if (static_cast<const uint8_t *>(p)[i] != Mark(tag, i)) return false;
  return true;
}

// A 4-byte aligned region filled with a marker byte, so that stale bytes show.
struct Region {
  explicit Region(uint32_t size, uint8_t fill = 0xA5) : words(size / 4 + 1, fill * 0x01010101u) {}
  char *base() { return reinterpret_cast<char *>(words.data()); }
  uint32_t *word(uint32_t off) { return reinterpret_cast<uint32_t *>(base() + off); }
  uint32_t off(const void *p) { return p ? uint32_t(static_cast<const char *>(p) - base()) : 0; }
  std::vector<uint32_t> words;
};

// The allocator restated over a block map (offset -> size, free) and a free
// list in list order. Calls take and give payload offsets, 0 for none.
class HeapModel {
 public:
  explicit HeapModel(uint32_t size) : size_(size), list_{16} { blocks_[16] = {size - 16, true}; }

  uint32_t Fit(uint64_t size) const {  // the block an allocation would take, or 0
    uint32_t chosen = 0;
    for (uint32_t o : list_) {
      if ((size + 3) / 4 * 4 + 16 > blocks_.at(o).first) continue;
      if (chosen) return std::min(chosen, o);
      chosen = o;
    }
    return chosen;
  }
  uint32_t Alloc(uint64_t size) {
    uint32_t off = Fit(size), need = uint32_t((size + 3) / 4 * 4 + 16);
    if (!off) return 0;
    auto at = std::find(list_.begin(), list_.end(), off);
    auto &b = blocks_[off];
    if (b.first - need > 16)  // the rest takes the block's place on the list
      blocks_[ *at = off + need] = {b.first - need, true}, b.first = need;
    else
      list_.erase(at);
    b.second = false;
    return off + 16;
  }
  void Free(uint32_t payload) {
    auto it = blocks_.find(payload - 16), next = std::next(it);
    it->second.second = true;
    list_.insert(list_.begin(), it->first);
    if (next != blocks_.end() && next->second.second) Absorb(it, next);
    if (it != blocks_.begin() && std::prev(it)->second.second) Absorb(std::prev(it), it);
  }
  uint32_t Realloc(uint32_t payload, uint32_t size) {
    if (!payload) return Alloc(size);
    if (size == 0) return Free(payload), 0;
    if (Capacity(payload) == size) return payload;
    uint32_t moved = Alloc(size);
    if (moved) Free(payload);
    return moved;
  }
  uint32_t Capacity(uint32_t payload) const { return blocks_.at(payload - 16).first - 16; }

  // "" when every header word and the checker's counts agree with the model.
  std::string Differs(char *region) const {
    auto word = [&](uint32_t off, int i) { return reinterpret_cast<uint32_t *>(region + off)[i]; };
    if (word(0, 0) != size_ || word(0, 1) != (list_.empty() ? SH_NO_BLOCK : list_[0]))
      return "the region header";
    std::map<uint32_t, size_t> place;  // on the free list
    for (size_t i = 0; i < list_.size(); ++i) place[list_[i]] = i;
    coffer::ShHeapCounts c, m{};
    m.freeListLength = uint32_t(list_.size());
    uint32_t prevSize = 0;
    for (const auto &[off, b] : blocks_) {
      size_t i = b.second ? place.at(off) : 0;
      uint32_t next = i + 1 < list_.size() ? list_[i + 1] : SH_NO_BLOCK,
               prev = i ? list_[i - 1] : SH_NO_BLOCK;
      const uint32_t want[4] = {b.first, prevSize, b.second ? next : 0, b.second ? prev : 0};
      for (int k = 0; k < 4; ++k)
        if (word(off, k) != want[k])
          return "word " + std::to_string(k) + " of block " + std::to_string(off);
      prevSize = b.first;
      (b.second ? m.freeBlocks : m.allocatedBlocks)++;
      (b.second ? m.freeBytes : m.allocatedBytes) += b.first;
      m.largestFree = std::max(m.largestFree, b.second ? b.first : 0);
      m.sizeLog2[31 - __builtin_clz(b.first)]++;
    }
    if (coffer::SHCheckRegion(region, size_, &c, nullptr, nullptr) != coffer::ShHeapState::kSound)
      return "the checker finds a fault";
    return std::memcmp(&c, &m, sizeof c) ? "the checker's counts" : "";
  }

 private:
  using It = std::map<uint32_t, std::pair<uint32_t, bool>>::iterator;
  void Absorb(It keeper, It absorbed) {
    list_.erase(std::find(list_.begin(), list_.end(), absorbed->first));
    keeper->second.first += absorbed->second.first;
    blocks_.erase(absorbed);
  }
  uint32_t size_;
  std::vector<uint32_t> list_;
  std::map<uint32_t, std::pair<uint32_t, bool>> blocks_;  // block -> (size, free)
};

// Four bytes an operation: what (alloc, free, realloc, calloc) through what
// (SH_*, simple pool, shared pool), a size and which live block. The shared
// pool panics where the heap runs out, so what the model says will fail
// goes through the simple pool. Returns "" or the first step that differed.
inline std::string DriveHeap(const uint8_t *data, size_t n) {
  static const uint32_t kSizes[] = {33, 64, 100, 257, 1024, 4099, 65536};
  static const uint32_t kEdges[] = {0xFFFFFFFFu, 0xFFFFFFFDu, 0xFFFFFFFCu, 0x80000000u, 0, 16};
  if (n < 2) return "";
  const uint32_t regionSize = kSizes[data[0] % 7];
  Region region(regionSize, data[1]);
  char *base = region.base();
  TandelExclLock lock;
  MemPool pools[3];  // [0] stands for the SH_* calls
  Tandel_InitExclLock(&lock);
  MemPool_InitOnSimpleHeap(&pools[0], base, regionSize);
  MemPool_InitOnSimpleHeap(&pools[1], base, 0);
  MemPool_InitOnSharedHeap(&pools[2], base, 0, &lock);
  HeapModel model(regionSize);
  std::map<uint32_t, std::pair<uint32_t, uint32_t>> live;  // payload -> (size, tag)
  std::string fault;
  for (size_t i = 2; i + 4 <= n && fault.empty(); i += 4) {
    const uint8_t *op = data + i;
    const uint32_t step = uint32_t(i / 4), what = op[0] % 8, via = op[0] / 8 % 3;
    uint32_t off = 0, v = (op[1] & 63u) << 8 | op[2], count = 1 + op[3] % 4, want = 0;
    if (!live.empty() && op[3] % 8) off = std::next(live.begin(), op[3] % live.size())->first;
    uint32_t size = op[1] < 64      ? v % 48
                    : op[1] < 128   ? v % 600
                    : op[1] < 192   ? v % regionSize
                    : op[2] % 7 < 6 ? kEdges[op[2] % 7]
                    : off           ? model.Capacity(off)
                                    : 0;
    void *got = nullptr, *ptr = off ? base + off : nullptr;
    MemPool *mp = &pools[via];
    if (what < 3 || (what < 7 && what >= 5 && !off)) {  // an allocation, or a resize of null
      if (via == 2 && !model.Fit(size)) mp = &pools[1];
      want = model.Alloc(size);
      got = via == 0 ? SH_Alloc(base, size) : mp->alloc(mp, size);
    } else if (what < 5) {
      if (off) model.Free(off);
      via == 0 ? SH_Free(base, ptr) : mp->free(mp, ptr);
      size = 0;
    } else if (what < 7) {
      if (via == 2 && size && model.Capacity(off) != size && !model.Fit(size)) mp = &pools[1];
      want = model.Realloc(off, size);
      got = via == 0 ? SH_Realloc(base, ptr, size) : mp->realloc(mp, ptr, size);
      if (got && !Stamped(got, std::min(live[off].first, size), live[off].second))
        fault = "contents lost";
    } else {
      size = size / count * count;
      if (via != 2 || !model.Fit(size)) mp = &pools[1];
      want = model.Alloc(size);
      got = mp->calloc(mp, count, size / count);
      if (got &&
          std::count(static_cast<char *>(got), static_cast<char *>(got) + size, 0) != long(size))
        fault = "calloc left bytes unzeroed";
    }
    if (region.off(got) != want)
      fault = "returned " + std::to_string(region.off(got)) + " not " + std::to_string(want);
    if (off && (got || size == 0)) live.erase(off);
    if (got) Stamp(got, size, step), live[want] = {size, step};
    if (fault.empty()) fault = model.Differs(base);
    for (const auto &[p, b] : live)
      if (fault.empty() && (step % 32 == 0 || p == want) && !Stamped(base + p, b.first, b.second))
        fault = "block at " + std::to_string(p) + " overwritten";
    if (!fault.empty()) fault = "step " + std::to_string(step) + ": " + fault;
  }
  Tandel_DestroyExclLock(&lock);
  return fault;
}

}  // namespace coffer_test

#endif
