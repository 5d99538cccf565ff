// Internal operations of the region heap, for the pools and for tests.
#ifndef COFFER_MEMPOOL_REGION_HEAP_H
#define COFFER_MEMPOOL_REGION_HEAP_H

#include <coffer/mempool.h>

#include <cstdint>
#include <string>

namespace coffer {

// Absorbs the free block at region offset absorbed into the free block at
// keeper, which lies immediately before it.
void SHMergeBlocks(void *region, uint32_t keeper, uint32_t absorbed);

// What a heap check found, filled whether or not the heap is sound.
struct ShHeapCounts {
  uint32_t freeBlocks;
  uint32_t allocatedBlocks;
  uint32_t freeBytes;       // sum of free blockSize, headers included
  uint32_t allocatedBytes;  // sum of allocated blockSize, headers included
};

// Walks a formatted region and verifies every invariant of the heap: the
// blocks tile the region exactly, each prevBlockSize matches, no two free
// blocks are adjacent, allocated blocks have both links 0, and the free list
// is doubly linked and holds exactly the free blocks. Returns false and says
// why (when why is not null) at the first fault. Allocates from the process
// heap, so it is meant for tests and diagnostics, never for the allocator.
bool SHCheckHeap(const void *region, ShHeapCounts *counts, std::string *why);

}  // namespace coffer

#endif
