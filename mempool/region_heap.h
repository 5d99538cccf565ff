// SPDX-License-Identifier: MIT
// Internal operations of the region heap, for the pools, the checker and tests.
#ifndef COFFER_MEMPOOL_REGION_HEAP_H
#define COFFER_MEMPOOL_REGION_HEAP_H

#include <coffer/mempool.h>

#include <cstdint>

#include "mempool/check.h"

namespace coffer {

// A block's use, read from its free-list links alone: a free block's links
// are SH_NO_BLOCK or offsets of at least 16, never 0; an allocated block's
// are both 0. One 0 link is torn (damage, or a cut-short change).
enum class ShBlockUse { kAllocated, kFree, kTorn };
inline ShBlockUse SHBlockUseOf(const ShBlockHeader *b) {
  if (b->nextFree == 0 && b->prevFree == 0) return ShBlockUse::kAllocated;
  return b->nextFree != 0 && b->prevFree != 0 ? ShBlockUse::kFree : ShBlockUse::kTorn;
}

// ---- checked heap calls ----------------------------------------------------
// A region is memory that other processes write too, so the heap checks the
// header words it reads before it acts on them: a link before it is followed,
// a block before it is taken or joined, a neighbour before it is written, and
// every walk is bounded. A call that meets a word that fails its check
// refuses and writes nothing: allocation and resizing return null, a release
// leaves the region as it was. The exported SH_* calls are these with the
// outcome dropped; the pools keep it to report why they failed.

enum class ShRefusal : uint32_t {
  kNone,          // done, or out of room
  kDamaged,       // a header failed its check; at is its offset (0: region header)
  kNotAllocated,  // ptr is not the payload of an allocated block; at is ptr's offset
};
// The heap cannot tell a damaged header of a block handed back from an
// address that was never a payload: a release or resize refused as damaged
// may be either, and only a check of the whole region tells which.

struct ShOutcome {
  ShRefusal refusal;
  uint32_t at;
};

void *SHAllocChecked(void *region, size_t size, ShOutcome *out);
void *SHReallocChecked(void *region, void *ptr, size_t size, ShOutcome *out);
void SHFreeChecked(void *region, void *ptr, ShOutcome *out);

// ---- the heap checker --------------------------------------------------------
// Walks a region of any content, reading only inside the first mappedSize
// bytes, never looping, and reports every fault it finds with the offset of
// the header that holds it (0 for the region header).

enum class ShFault : uint8_t {
  // Untidy, not damage: a release cut short leaves free neighbours, which the
  // heap uses safely and merges when it next touches them.
  kAdjacentFree,
  // Damage: each would lead a walk astray.
  kRegionTooSmall,       // regionSize (or the mapping) leaves no room for a block
  kRegionBeyondMapping,  // regionSize is larger than the mapping
  kBlockTruncated,       // a block would start too close to the end for its header
  kBlockTooSmall,        // blockSize is less than a header
  kBlockPastEnd,         // the block runs past the region's end
  kBlockMisaligned,      // an inner blockSize that is not a multiple of 4
  kPrevSizeMismatch,     // prevBlockSize disagrees with the block before
  kHalfFree,             // one free-list link is 0 and the other is not
  kLinkNotBlock,         // a free-list link (freeHead at 0) names no block
  kLinkToAllocated,      // a free-list link names an allocated block
  kBackLink,             // prevFree does not name the block before on the free list
  kListCycle,            // the free list comes back to a block it visited
  kFreeUnlisted,         // a free block the free list never reaches
};
constexpr int kShFaultKinds = 14;

enum class ShHeapState { kSound, kUntidy, kDamaged, kNoMemory };

// What the checker counted on its walk, for statistics as much as for tests.
// Blocks past a tiling fault are not counted.
struct ShHeapCounts {
  uint32_t freeBlocks;
  uint32_t allocatedBlocks;
  uint32_t freeBytes;       // sum of free blockSize, headers included
  uint32_t allocatedBytes;  // sum of allocated blockSize, headers included
  uint32_t largestFree;     // largest free blockSize
  uint32_t freeListLength;  // blocks the free list reaches
  uint32_t sizeLog2[32];    // blocks by the highest set bit of blockSize
};

// Called once per fault, in the order they are found.
typedef void (*ShFaultSink)(void *context, ShFault fault, uint32_t at);

// Checks the region at `region`, of which mappedSize bytes are readable;
// counts (when not null) gets the statistics. kNoMemory: the checker could
// not get its bitmaps (one bit per 4 bytes of region, twice) and checked
// no further than the region header. Allocates with malloc and uses no C++ runtime, so the library and
// tools can run it anywhere.
ShHeapState SHCheckRegion(const void *region, size_t mappedSize, ShHeapCounts *counts,
                          ShFaultSink sink, void *context);

// True when the region is not damaged (untidy is sound); otherwise *fault,
// when given, tells the first damage. The form of every checker, for
// COFFER_CHECK.
bool SHCheckSound(const void *region, size_t mappedSize, CheckFault *fault);

const char *SHFaultText(ShFault fault);
inline bool SHFaultIsDamage(ShFault fault) { return fault != ShFault::kAdjacentFree; }

}  // namespace coffer

#endif
