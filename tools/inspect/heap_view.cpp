// SPDX-License-Identifier: MIT
// The heap view: the library's own region heap checker, compiled into the
// tool, its findings and counts passed on as they are.
#include "tools/inspect/heap_view.h"

#include <cstring>

#include "mempool/region_heap.h"

namespace inspect {
namespace {

struct Relay {
  HeapSink sink;
  void *context;
};

void RelayFault(void *context, coffer::ShFault fault, uint32_t at) {
  const auto *r = static_cast<const Relay *>(context);
  r->sink(r->context, HeapFinding{coffer::SHFaultText(fault), at, coffer::SHFaultIsDamage(fault)});
}

}  // namespace

HeapState CheckHeap(const void *image, size_t mapped, HeapStats *stats, HeapSink sink,
                    void *context) {
  static_assert(sizeof(HeapStats) == sizeof(coffer::ShHeapCounts), "the same counts");
  coffer::ShHeapCounts counts;
  Relay relay = {sink, context};
  const coffer::ShHeapState state = coffer::SHCheckRegion(image, mapped, &counts, RelayFault, &relay);
  if (stats) {
    stats->freeBlocks = counts.freeBlocks, stats->allocatedBlocks = counts.allocatedBlocks;
    stats->freeBytes = counts.freeBytes, stats->allocatedBytes = counts.allocatedBytes;
    stats->largestFree = counts.largestFree, stats->freeListLength = counts.freeListLength;
    std::memcpy(stats->sizeLog2, counts.sizeLog2, sizeof stats->sizeLog2);
  }
  switch (state) {
    case coffer::ShHeapState::kSound: return kHeapSound;
    case coffer::ShHeapState::kUntidy: return kHeapUntidy;
    case coffer::ShHeapState::kDamaged: return kHeapDamaged;
    default: return kHeapNoMemory;
  }
}

}  // namespace inspect
