// SPDX-License-Identifier: MIT
// What coffer-inspect needs from the region heap's checker: every finding
// with its offset, and the statistics of one walk. A thin view over the
// library's own checker, compiled into the tool.
#ifndef COFFER_TOOLS_INSPECT_HEAP_VIEW_H
#define COFFER_TOOLS_INSPECT_HEAP_VIEW_H

#include <cstddef>
#include <cstdint>

namespace inspect {

struct HeapFinding {
  const char *what;
  uint32_t at;  // offset of the header that holds it; 0 for the region header
  bool damage;  // false for untidiness the heap repairs by itself
};

struct HeapStats {
  uint32_t freeBlocks, allocatedBlocks;
  uint32_t freeBytes, allocatedBytes;  // headers included
  uint32_t largestFree;                // blockSize of the largest free block
  uint32_t freeListLength;             // blocks the free list reaches
  uint32_t sizeLog2[32];               // blocks by the highest set bit of blockSize
};

enum HeapState { kHeapSound, kHeapUntidy, kHeapDamaged, kHeapNoMemory };

typedef void (*HeapSink)(void *context, const HeapFinding &finding);

// Checks the region at image, of which mapped bytes are readable; stats
// (when not null) counts what the walk met, sink hears every finding.
HeapState CheckHeap(const void *image, size_t mapped, HeapStats *stats, HeapSink sink,
                    void *context);

}  // namespace inspect

#endif
