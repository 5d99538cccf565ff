// Consistency check of a region heap, for tests and diagnostics.
#include <algorithm>
#include <vector>

#include "mempool/region_heap.h"

namespace coffer {
namespace {

const ShBlockHeader *BlockAt(const void *region, uint32_t off) {
  return reinterpret_cast<const ShBlockHeader *>(static_cast<const char *>(region) + off);
}

bool Fail(std::string *why, const char *what, uint32_t off) {
  if (why) *why = std::string(what) + " (block at " + std::to_string(off) + ")";
  return false;
}

// The free list must start at freeHead, link back through prevFree, visit
// only free blocks and each once, and hold all of them.
bool CheckFreeList(const void *region, const std::vector<uint32_t> &freeOffsets, std::string *why) {
  std::vector<bool> seen(freeOffsets.size(), false);
  uint32_t prev = SH_NO_BLOCK;
  size_t steps = 0;
  for (uint32_t cur = static_cast<const ShRegionHeader *>(region)->freeHead; cur != SH_NO_BLOCK;
       cur = BlockAt(region, cur)->nextFree) {
    auto it = std::lower_bound(freeOffsets.begin(), freeOffsets.end(), cur);
    if (it == freeOffsets.end() || *it != cur)
      return Fail(why, "free list names something that is not a free block", cur);
    size_t i = static_cast<size_t>(it - freeOffsets.begin());
    if (seen[i]) return Fail(why, "free list visits a block twice", cur);
    seen[i] = true;
    if (BlockAt(region, cur)->prevFree != prev)
      return Fail(why, "prevFree does not name the previous block on the free list", cur);
    prev = cur;
    ++steps;
  }
  if (steps != freeOffsets.size()) {
    size_t missing = static_cast<size_t>(std::find(seen.begin(), seen.end(), false) - seen.begin());
    return Fail(why, "free block missing from the free list", freeOffsets[missing]);
  }
  return true;
}

}  // namespace

bool SHCheckHeap(const void *region, ShHeapCounts *counts, std::string *why) {
  ShHeapCounts local = {0, 0, 0, 0};
  ShHeapCounts &c = counts ? *counts : local;
  c = local;
  const auto *h = static_cast<const ShRegionHeader *>(region);
  const uint32_t size = h->regionSize;
  if (size <= 2 * sizeof(ShBlockHeader)) return Fail(why, "regionSize too small", 0);

  std::vector<uint32_t> freeOffsets;  // in address order, for the list walk
  uint32_t prevSize = 0;
  bool prevFree = false;
  for (uint32_t o = sizeof(ShRegionHeader); o < size;) {
    if (size - o < sizeof(ShBlockHeader)) return Fail(why, "block header crosses region end", o);
    const ShBlockHeader *b = BlockAt(region, o);
    if (b->blockSize < sizeof(ShBlockHeader)) return Fail(why, "blockSize below 16", o);
    if (b->blockSize > size - o) return Fail(why, "block runs past region end", o);
    bool last = b->blockSize == size - o;
    if (!last && b->blockSize % 4 != 0) return Fail(why, "inner blockSize not a multiple of 4", o);
    if (b->prevBlockSize != prevSize) return Fail(why, "prevBlockSize mismatch", o);
    bool isFree = b->nextFree != 0 || b->prevFree != 0;
    if (isFree) {
      if (prevFree) return Fail(why, "two adjacent free blocks", o);
      // A link of 0 on one side only is neither free nor allocated.
      if (b->nextFree == 0 || b->prevFree == 0) return Fail(why, "free block with a 0 link", o);
      freeOffsets.push_back(o);
      ++c.freeBlocks;
      c.freeBytes += b->blockSize;
    } else {
      ++c.allocatedBlocks;
      c.allocatedBytes += b->blockSize;
    }
    prevFree = isFree;
    prevSize = b->blockSize;
    o += b->blockSize;
  }
  return CheckFreeList(region, freeOffsets, why);
}

}  // namespace coffer
