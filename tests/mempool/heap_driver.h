// SPDX-License-Identifier: MIT
// The region heap against a model: operations decoded from a byte string run
// through the checked heap calls and both pools, and after each the whole
// observable state must match the model: the offset returned, the refusal,
// every header word, the checker's verdict and counts, and every other byte.
// An address that is no live payload (one released before, say) is refused.
#ifndef COFFER_TESTS_MEMPOOL_HEAP_DRIVER_H
#define COFFER_TESTS_MEMPOOL_HEAP_DRIVER_H

#include <algorithm>
#include <cstring>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "mempool/region_heap.h"

namespace coffer_test {

// A 4-byte aligned region filled with a marker byte, so that stale bytes show.
struct Region {
  explicit Region(uint32_t size, uint8_t fill = 0xA5) : words(size / 4 + 1, fill * 0x01010101u) {}
  char *base() { return reinterpret_cast<char *>(words.data()); }
  uint32_t off(const void *p) { return p ? uint32_t(static_cast<const char *>(p) - base()) : 0; }
  std::vector<uint32_t> words;
};

// The offsets of the words that differ between two images.
inline std::vector<uint32_t> Changed(const std::vector<uint32_t> &a,
                                     const std::vector<uint32_t> &b) {
  std::vector<uint32_t> offs;
  for (uint32_t w = 0, n = uint32_t(a.size()); w < n; w += 256)
    if (std::memcmp(&a[w], &b[w], 4 * std::min(256u, n - w)))
      for (uint32_t k = w; k < std::min(w + 256, n); ++k)
        if (a[k] != b[k]) offs.push_back(4 * k);
  return offs;
}

// Called by the lock calls of a program that interposes its own (a fuzz
// target cannot), so that the model sees the shared pool lock its heap call.
inline std::function<void()> g_onAcquire, g_onRelease;

// The allocator restated over a block map (offset -> size, free) and a free
// list in list order. Calls take and give payload offsets, 0 for none.
class HeapModel {
 public:
  explicit HeapModel(uint32_t size) : size_(size), list_{16} { blocks_[16] = {size - 16, true}; }
  uint32_t Alloc(uint64_t size) {  // takes the lower of the first two free blocks that fit
    uint32_t off = 0, fits = 0, need = uint32_t((size + 3) / 4 * 4 + 16);
    for (auto o = list_.begin(); o != list_.end() && fits < 2; ++o)
      if ((size + 3) / 4 * 4 + 16 <= blocks_.at(*o).first) off = fits++ ? std::min(off, *o) : *o;
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
  uint32_t Free(uint32_t payload) {  // 0, as a release returns
    if (!payload) return 0;
    auto it = blocks_.find(payload - 16), next = std::next(it);
    it->second.second = true;
    list_.insert(list_.begin(), it->first);
    if (next != blocks_.end() && next->second.second) Absorb(it, next);
    if (it != blocks_.begin() && std::prev(it)->second.second) Absorb(std::prev(it), it);
    return 0;
  }
  uint32_t Realloc(uint32_t payload, uint32_t size) {
    if (!payload || !size) return payload ? Free(payload) : Alloc(size);
    if (Capacity(payload) == size) return payload;
    uint32_t moved = Alloc(size);
    if (moved) Free(payload);
    return moved;
  }
  uint32_t Capacity(uint32_t payload) const { return blocks_.at(payload - 16).first - 16; }
  bool InHeader(uint32_t off) const {  // the region's size and freeHead, or a block header
    auto next = blocks_.upper_bound(off);
    return off < 8 || (next != blocks_.begin() && off - std::prev(next)->first < 16);
  }
  // "" when every header word and the checker's counts agree with the model.
  std::string Differs(char *region) const {
    const uint32_t head[2] = {size_, list_.empty() ? SH_NO_BLOCK : list_[0]};
    if (std::memcmp(region, head, sizeof head)) return "the region header";
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
      if (std::memcmp(region + off, want, sizeof want)) return "block " + std::to_string(off);
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
// (the checked heap calls, simple pool, shared pool), a size, and a live
// block, null or an address that is none. The shared pool panics where the
// heap fails, so such calls go through the simple pool; while it holds its
// lock its record is scribbled over, for a container's handle is released
// through itself. Returns "" or the first step that differed.
inline std::string DriveHeap(const uint8_t *data, size_t n) {
  static const uint32_t kSizes[] = {33, 64, 100, 257, 1024, 4099, 65536};
  static const uint32_t kEdges[] = {0xFFFFFFFFu, 0xFFFFFFFDu, 0xFFFFFFFCu, 0x80000000u, 0, 16};
  if (n < 2) return "";
  const uint32_t regionSize = kSizes[data[0] % 7];
  Region region(regionSize, data[1]);
  char *base = region.base();
  TandelExclLock lock;
  MemPool pools[3], held;  // pools[0] stands for the checked heap calls
  Tandel_InitExclLock(&lock);
  if (MemPool_InitOnSimpleHeap(&held, base, 32)) return "a region of 32 bytes formatted";
  MemPool_InitOnSimpleHeap(&pools[0], base, regionSize);
  MemPool_InitOnSimpleHeap(&pools[1], base, 0);
  MemPool_InitOnSharedHeap(&pools[2], base, 0, &lock);
  if (pools[1].calloc(&pools[1], 0x40000001u, 4)) return "a calloc of 2^32 + 4 bytes served";
  HeapModel model(regionSize);
  std::map<uint32_t, uint32_t> live;   // payload -> size
  std::vector<uint32_t> gone, before;  // payloads handed back; an image of the region
  std::string fault, locks;            // + taken, - released
  g_onAcquire = [&] {
    locks += region.words == before ? "+" : "+ after a write";
    held = pools[2], std::memset(&pools[2], 0xEE, sizeof held);
  };
  g_onRelease = [&] { locks += "-", pools[2] = held; };
  for (size_t i = 2; i + 4 <= n && fault.empty(); i += 4) {
    const uint8_t *op = data + i;
    const uint32_t step = uint32_t(i / 4), what = op[0] % 8, via = op[0] / 8 % 3;
    const uint32_t v = (op[1] & 63u) << 8 | op[2], count = 1 + op[3] % 4;
    const bool handsBack = what >= 3 && what < 7, foreign = handsBack && op[3] % 8 == 1;
    uint32_t off = 0, want = 0;
    if (foreign)
      off = !gone.empty() && op[2] % 2 ? gone[v % gone.size()] : 1 + v % (regionSize + 64);
    else if (handsBack && !live.empty() && op[3] % 8 > 1)
      off = std::next(live.begin(), op[3] % live.size())->first;
    if (foreign && live.count(off)) continue;
    uint32_t size = op[1] < 64        ? v % 48
                    : op[1] < 128     ? v % 600
                    : op[1] < 192     ? v % regionSize
                    : op[2] % 7 < 6   ? kEdges[op[2] % 7]
                    : off && !foreign ? model.Capacity(off)
                                      : 0;
    size = what == 3 || what == 4 ? 0 : what == 7 ? size / count * count : size;
    const uint32_t after = off && !foreign ? off + model.Capacity(off) : 0;  // the next block
    if (!foreign)
      want = !handsBack ? model.Alloc(size) : what < 5 ? model.Free(off) : model.Realloc(off, size);
    const bool releases = handsBack && (what < 5 || (off && !size));
    MemPool *mp = &pools[via == 2 && (foreign || (!want && !releases)) ? 1 : via];
    void *got = nullptr, *ptr = off ? base + off : nullptr;
    coffer::ShOutcome out = {coffer::ShRefusal::kNone, 0};
    before = region.words;
    locks.clear();
    if (what == 7) {
      got = mp->calloc(mp, count, size / count);
      if (got && std::count(base + want, base + want + size, 0) != long(size))
        fault = "calloc left bytes unzeroed";
    } else if (what < 3) {
      got = via ? mp->alloc(mp, size) : coffer::SHAllocChecked(base, size, &out);
    } else if (what < 5) {
      via ? mp->free(mp, ptr) : coffer::SHFreeChecked(base, ptr, &out);
    } else {
      got = via ? mp->realloc(mp, ptr, size) : coffer::SHReallocChecked(base, ptr, size, &out);
      const char *was = reinterpret_cast<char *>(before.data()) + off;  // a release keeps it
      if (got && live.count(off) && std::memcmp(got, was, std::min(live[off], size)))
        fault = "contents lost";
    }
    if (region.off(got) != want)
      fault = "returned " + std::to_string(region.off(got)) + " not " + std::to_string(want);
    const bool refused = out.refusal != coffer::ShRefusal::kNone;
    const bool outside = off % 4 || off < 32 || off > regionSize;  // where no header could be
    if (via == 0 && what != 7 &&
        (foreign ? !refused || (out.refusal == coffer::ShRefusal::kNotAllocated ? out.at != off : outside)
                 : refused || out.at))
      fault = "refusal " + std::to_string(int(out.refusal)) + " at " + std::to_string(out.at);
    if (!locks.empty() && locks != "+-") fault = "lock calls " + locks;
    // Only the region's size and freeHead, the headers of blocks left, of the
    // block handed back and of the one after it (which a release may absorb),
    // and the payload handed out change.
    for (uint32_t o : Changed(before, region.words))
      if (foreign || !(model.InHeader(o) || (off && (o - off + 16 < 16 || o - after < 16)) ||
                       (want && o - want < size)))
        fault = "wrote the word at " + std::to_string(o);
    if (off && !foreign && (got || releases)) live.erase(off), gone.push_back(off);
    if (got) std::memset(got, int(step), size), live[want] = size;  // as a caller would
    if (fault.empty()) fault = model.Differs(base);
    if (!fault.empty()) fault = "step " + std::to_string(step) + ": " + fault;
  }
  g_onAcquire = g_onRelease = nullptr;
  Tandel_DestroyExclLock(&lock);
  return fault;
}

}  // namespace coffer_test

#endif
