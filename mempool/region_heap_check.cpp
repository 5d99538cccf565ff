// SPDX-License-Identifier: MIT
// The region heap checker: one walk over the blocks, one over the free list,
// every fault reported with its offset. It runs on regions of any content
// (an inspection tool runs it on whatever a file or mapping holds), so it
// reads only inside the mapping it is given, follows nothing it has not
// checked, and visits each block at most once. It uses the C library only.
#include <cstdlib>

#include "mempool/region_heap.h"

namespace coffer {
namespace {

constexpr uint32_t kHead = sizeof(ShBlockHeader);
constexpr uint32_t kNone = SH_NO_BLOCK;

// One bit per 4-byte unit of the region, enough to mark any block start.
struct Bits {
  uint32_t *words;
  bool Get(uint32_t off) const { return words[off / 128] >> (off / 4 % 32) & 1u; }
  void Set(uint32_t off) { words[off / 128] |= 1u << (off / 4 % 32); }
};

struct Walk {
  const char *base;
  uint32_t limit;    // bytes that may be read: regionSize, or less when mapped so
  uint32_t tiledTo;  // the block walk checked everything below this offset
  bool tiled;        // ... and reached the region's end
  ShHeapCounts *counts;
  ShFaultSink sink;
  void *context;
  bool damaged, untidy;
  Bits starts, listed;  // block starts; blocks the free list reached

  const ShBlockHeader *At(uint32_t off) const {
    return reinterpret_cast<const ShBlockHeader *>(base + off);
  }
  void Report(ShFault fault, uint32_t at) {
    (SHFaultIsDamage(fault) ? damaged : untidy) = true;
    if (sink) sink(context, fault, at);
  }
};

bool IsFree(const ShBlockHeader *b) { return SHBlockUseOf(b) == ShBlockUse::kFree; }
bool IsTorn(const ShBlockHeader *b) { return SHBlockUseOf(b) == ShBlockUse::kTorn; }

void Count(ShHeapCounts *c, const ShBlockHeader *b) {
  uint32_t bs = b->blockSize;
  if (IsFree(b)) {
    ++c->freeBlocks;
    c->freeBytes += bs;
    if (bs > c->largestFree) c->largestFree = bs;
  } else {
    ++c->allocatedBlocks;
    c->allocatedBytes += bs;
  }
  ++c->sizeLog2[31 - __builtin_clz(bs)];
}

// The block at o can be stepped over: it has room for its header and a size
// of at least a header, ending inside the region, aligned unless it is last.
bool CanStep(Walk *w, uint32_t o) {
  uint32_t room = w->limit - o;
  ShFault fault;
  if (room < kHead)
    fault = ShFault::kBlockTruncated;
  else if (w->At(o)->blockSize < kHead)
    fault = ShFault::kBlockTooSmall;
  else if (w->At(o)->blockSize > room)
    fault = ShFault::kBlockPastEnd;
  else if (w->At(o)->blockSize % 4 != 0 && w->At(o)->blockSize != room)
    fault = ShFault::kBlockMisaligned;
  else
    return true;
  w->Report(fault, o);
  return false;
}

// The blocks must tile the region, each naming the size of the one before.
// The walk stops at the first block it cannot step over.
void WalkBlocks(Walk *w) {
  uint32_t o = kHead, prevSize = 0;
  bool prevFree = false;
  while (o < w->limit && CanStep(w, o)) {
    const ShBlockHeader *b = w->At(o);
    if (b->prevBlockSize != prevSize) w->Report(ShFault::kPrevSizeMismatch, o);
    if (IsTorn(b)) w->Report(ShFault::kHalfFree, o);
    if (IsFree(b) && prevFree) w->Report(ShFault::kAdjacentFree, o);
    w->starts.Set(o);
    if (w->counts) Count(w->counts, b);
    prevFree = IsFree(b);
    prevSize = b->blockSize;
    o += prevSize;
  }
  w->tiledTo = o;
  w->tiled = o >= w->limit;
}

// The free list must start at freeHead, reach only free blocks, each once,
// each naming the one before. A link past a tiling fault cannot be judged
// and ends the walk quietly.
void WalkList(Walk *w) {
  uint32_t from = kNone, holder = 0;
  for (uint32_t o = reinterpret_cast<const ShRegionHeader *>(w->base)->freeHead; o != kNone;) {
    bool inside = o >= kHead && o < w->tiledTo && o % 4 == 0;
    if (!inside || !w->starts.Get(o)) {
      if (inside || w->tiled) w->Report(ShFault::kLinkNotBlock, holder);
      return;
    }
    const ShBlockHeader *b = w->At(o);
    if (w->listed.Get(o)) return w->Report(ShFault::kListCycle, holder);
    if (!IsFree(b)) {
      if (!IsTorn(b)) w->Report(ShFault::kLinkToAllocated, holder);
      return;  // a torn block was reported on the block walk
    }
    w->listed.Set(o);
    if (w->counts) ++w->counts->freeListLength;
    if (b->prevFree != from) w->Report(ShFault::kBackLink, o);
    from = holder = o;
    o = b->nextFree;
  }
}

// Every free block the block walk saw must be on the list.
void FindUnlisted(Walk *w) {
  for (uint32_t o = kHead; o < w->tiledTo; o += w->At(o)->blockSize)
    if (IsFree(w->At(o)) && !w->listed.Get(o)) w->Report(ShFault::kFreeUnlisted, o);
}

}  // namespace

ShHeapState SHCheckRegion(const void *region, size_t mappedSize, ShHeapCounts *counts,
                          ShFaultSink sink, void *context) {
  if (counts) *counts = ShHeapCounts{};
  Walk w{};
  w.base = static_cast<const char *>(region);
  w.counts = counts;
  w.sink = sink;
  w.context = context;
  uint32_t size = mappedSize < sizeof(ShRegionHeader)
                      ? 0
                      : static_cast<const ShRegionHeader *>(region)->regionSize;
  if (size <= sizeof(ShRegionHeader) + kHead) {
    w.Report(ShFault::kRegionTooSmall, 0);
    return ShHeapState::kDamaged;
  }
  w.limit = size;
  if (size > mappedSize) {
    w.Report(ShFault::kRegionBeyondMapping, 0);
    w.limit = static_cast<uint32_t>(mappedSize);
  }
  size_t words = w.limit / 128 + 1;
  w.starts.words = static_cast<uint32_t *>(std::calloc(2 * words, sizeof(uint32_t)));
  if (!w.starts.words) return ShHeapState::kNoMemory;
  w.listed.words = w.starts.words + words;
  WalkBlocks(&w);
  WalkList(&w);
  FindUnlisted(&w);
  std::free(w.starts.words);
  return w.damaged ? ShHeapState::kDamaged : w.untidy ? ShHeapState::kUntidy : ShHeapState::kSound;
}

bool SHCheckSound(const void *region, size_t mappedSize, CheckFault *fault) {
  CheckFault first = {nullptr, 0};
  auto keep = [](void *c, ShFault f, uint32_t at) {
    auto *p = static_cast<CheckFault *>(c);
    if (!p->what && SHFaultIsDamage(f)) *p = {SHFaultText(f), at};
  };
  if (SHCheckRegion(region, mappedSize, nullptr, keep, &first) != ShHeapState::kDamaged)
    return true;
  return Fault(fault, first.what, first.at);
}

const char *SHFaultText(ShFault fault) {
  static const char *const kText[kShFaultKinds] = {
      "two free blocks side by side",
      "regionSize leaves no room for a block",
      "regionSize is larger than the mapping",
      "no room for a block header before the region's end",
      "blockSize is less than a block header",
      "block runs past the region's end",
      "inner blockSize is not a multiple of 4",
      "prevBlockSize disagrees with the block before",
      "one free-list link is 0 and the other is not",
      "free-list link names no block",
      "free-list link names an allocated block",
      "prevFree does not name the block before on the free list",
      "free list comes back to a block it visited",
      "free block missing from the free list",
  };
  return kText[static_cast<unsigned>(fault)];
}

}  // namespace coffer
