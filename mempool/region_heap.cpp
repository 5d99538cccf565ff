// The region heap: a first-two-fit allocator whose bookkeeping lives entirely
// inside a caller-supplied region and links blocks by region offset, so one
// region can be mapped at different addresses by several processes.
#include "mempool/region_heap.h"

#include <cstddef>
#include <cstring>

static_assert(sizeof(ShRegionHeader) == 16, "region header is 16 bytes");
static_assert(offsetof(ShRegionHeader, regionSize) == 0 &&
                  offsetof(ShRegionHeader, freeHead) == 4 &&
                  offsetof(ShRegionHeader, reserved) == 8,
              "region header layout");
static_assert(sizeof(ShBlockHeader) == 16, "block header is 16 bytes");
static_assert(offsetof(ShBlockHeader, blockSize) == 0 &&
                  offsetof(ShBlockHeader, prevBlockSize) == 4 &&
                  offsetof(ShBlockHeader, nextFree) == 8 && offsetof(ShBlockHeader, prevFree) == 12,
              "block header layout");
static_assert(sizeof(size_t) == sizeof(uint32_t), "region sizes are 32-bit");

namespace coffer {
namespace {

// Size of a block header; the region header is as large, so the first block
// starts at this offset too.
constexpr uint32_t kHead = sizeof(ShBlockHeader);
// A region must be larger than its header plus one block with no room.
constexpr uint32_t kMinRegion = sizeof(ShRegionHeader) + kHead;
constexpr uint32_t kLargestRoundable = 0xFFFFFFFCu;

// The only places where region offsets and addresses meet.
ShRegionHeader *Header(void *region) { return static_cast<ShRegionHeader *>(region); }
ShBlockHeader *BlockAt(void *region, uint32_t off) {
  return reinterpret_cast<ShBlockHeader *>(static_cast<char *>(region) + off);
}
uint32_t BlockOfPayload(void *region, void *payload) {
  return static_cast<uint32_t>(static_cast<char *>(payload) - static_cast<char *>(region)) - kHead;
}
void *PayloadOf(void *region, uint32_t off) { return static_cast<char *>(region) + off + kHead; }

// Links are never both 0 on a free block: they hold SH_NO_BLOCK or offsets
// of at least 16.
bool IsFree(const ShBlockHeader *b) { return b->nextFree != 0 || b->prevFree != 0; }

bool HasSuccessor(void *region, uint32_t off) {
  return off + BlockAt(region, off)->blockSize < Header(region)->regionSize;
}

void Unlink(void *region, uint32_t off) {
  ShBlockHeader *b = BlockAt(region, off);
  if (b->prevFree == SH_NO_BLOCK)
    Header(region)->freeHead = b->nextFree;
  else
    BlockAt(region, b->prevFree)->nextFree = b->nextFree;
  if (b->nextFree != SH_NO_BLOCK) BlockAt(region, b->nextFree)->prevFree = b->prevFree;
}

// Walks the free list and stops at the second block that can hold r bytes;
// of the (at most) two, the lower one wins, which keeps the heap compact
// without the cost of a full best-fit scan.
uint32_t FindFit(void *region, uint32_t r) {
  uint32_t chosen = SH_NO_BLOCK;
  for (uint32_t o = Header(region)->freeHead; o != SH_NO_BLOCK; o = BlockAt(region, o)->nextFree) {
    if (r > BlockAt(region, o)->blockSize - kHead) continue;
    if (chosen == SH_NO_BLOCK) {
      chosen = o;
    } else {
      if (o < chosen) chosen = o;
      break;
    }
  }
  return chosen;
}

// Cuts need bytes off the front of the free block at off. The remainder
// takes the block's place on the free list (the caller unlinks the front).
void Split(void *region, uint32_t off, uint32_t need) {
  ShBlockHeader *b = BlockAt(region, off);
  uint32_t restOff = off + need;
  ShBlockHeader *rest = BlockAt(region, restOff);
  rest->blockSize = b->blockSize - need;
  rest->prevBlockSize = need;
  rest->nextFree = b->nextFree;
  rest->prevFree = off;
  if (b->nextFree != SH_NO_BLOCK) BlockAt(region, b->nextFree)->prevFree = restOff;
  if (HasSuccessor(region, restOff))
    BlockAt(region, restOff + rest->blockSize)->prevBlockSize = rest->blockSize;
  b->blockSize = need;
  b->nextFree = restOff;
}

}  // namespace

void SHMergeBlocks(void *region, uint32_t keeper, uint32_t absorbed) {
  Unlink(region, absorbed);
  ShBlockHeader *k = BlockAt(region, keeper);
  k->blockSize += BlockAt(region, absorbed)->blockSize;
  if (HasSuccessor(region, keeper))
    BlockAt(region, keeper + k->blockSize)->prevBlockSize = k->blockSize;
}

}  // namespace coffer

using namespace coffer;

extern "C" COFFER_API int32_t SH_Reset(void *region, size_t size) {
  if (size <= kMinRegion) return -1;
  ShRegionHeader *h = Header(region);
  h->regionSize = size;
  h->freeHead = kHead;
  ShBlockHeader *b = BlockAt(region, kHead);
  b->blockSize = size - kHead;
  b->prevBlockSize = 0;
  b->nextFree = SH_NO_BLOCK;
  b->prevFree = SH_NO_BLOCK;
  return 0;
}

extern "C" COFFER_API void *SH_Alloc(void *region, size_t size) {
  // Rounding the three largest sizes up would wrap to 0.
  if (size > kLargestRoundable) return nullptr;
  uint32_t r = (static_cast<uint32_t>(size) + 3u) & ~3u;
  if (Header(region)->freeHead == SH_NO_BLOCK) return nullptr;
  uint32_t off = FindFit(region, r);
  if (off == SH_NO_BLOCK) return nullptr;
  // A remainder of 16 bytes or less would be a block with no room, so the
  // whole block goes out instead.
  uint32_t need = r + kHead;
  ShBlockHeader *b = BlockAt(region, off);
  if (need < b->blockSize - kHead) Split(region, off, need);
  Unlink(region, off);
  b->nextFree = 0;
  b->prevFree = 0;
  return PayloadOf(region, off);
}

extern "C" COFFER_API void SH_Free(void *region, void *ptr) {
  if (!ptr) return;
  uint32_t off = BlockOfPayload(region, ptr);
  ShRegionHeader *h = Header(region);
  ShBlockHeader *b = BlockAt(region, off);
  b->prevFree = SH_NO_BLOCK;
  b->nextFree = h->freeHead;
  if (h->freeHead != SH_NO_BLOCK) BlockAt(region, h->freeHead)->prevFree = off;
  h->freeHead = off;
  if (HasSuccessor(region, off)) {
    uint32_t next = off + b->blockSize;
    if (IsFree(BlockAt(region, next))) SHMergeBlocks(region, off, next);
  }
  if (b->prevBlockSize != 0) {
    uint32_t prev = off - b->prevBlockSize;
    if (IsFree(BlockAt(region, prev))) SHMergeBlocks(region, prev, off);
  }
}

extern "C" COFFER_API void *SH_Realloc(void *region, void *ptr, size_t size) {
  if (!ptr) return SH_Alloc(region, size);
  if (size == 0) {
    SH_Free(region, ptr);
    return nullptr;
  }
  uint32_t capacity = BlockAt(region, BlockOfPayload(region, ptr))->blockSize - kHead;
  if (capacity == size) return ptr;
  // Never in place: the new block is taken while the old one is held, so
  // the copy below never overlaps.
  void *q = SH_Alloc(region, size);
  if (!q) return nullptr;
  std::memcpy(q, ptr, capacity < size ? capacity : size);
  SH_Free(region, ptr);
  return q;
}
