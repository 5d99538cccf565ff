// The heap view over the library's checker as it stands: the first fault
// only, and the counts it keeps. (Replaced by a direct call once the checker
// reports every fault and the statistics itself.)
#include "tools/inspect/heap_view.h"

#include <cstring>
#include <string>

#include "mempool/region_heap.h"

namespace inspect {

HeapState CheckHeap(const void *image, size_t mapped, HeapStats *stats, HeapSink sink,
                    void *context) {
  if (stats) std::memset(stats, 0, sizeof *stats);
  const auto *h = static_cast<const ShRegionHeader *>(image);
  if (mapped < 2 * sizeof *h + 1 || h->regionSize > mapped || h->regionSize <= 32) {
    sink(context, HeapFinding{"regionSize leaves no room for a block, or is larger than the mapping", 0, true});
    return kHeapDamaged;
  }
  coffer::ShHeapCounts c;
  std::string why;
  const bool sound = coffer::SHCheckHeap(image, &c, &why);
  if (stats) {
    stats->freeBlocks = c.freeBlocks, stats->allocatedBlocks = c.allocatedBlocks;
    stats->freeBytes = c.freeBytes, stats->allocatedBytes = c.allocatedBytes;
  }
  if (sound) return kHeapSound;
  static char text[160];
  unsigned at = 0;
  const size_t cut = why.rfind(" (block at ");
  std::snprintf(text, sizeof text, "%s", why.substr(0, cut).c_str());
  if (cut != std::string::npos) std::sscanf(why.c_str() + cut, " (block at %u)", &at);
  sink(context, HeapFinding{text, at, true});
  return kHeapDamaged;
}

}  // namespace inspect
