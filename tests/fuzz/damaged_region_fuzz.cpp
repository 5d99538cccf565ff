// SPDX-License-Identifier: MIT
// Regions of any content, attached as they are: heap calls and checker must
// not crash, loop or touch a byte outside the region (a heap block of just
// its size, for the sanitizer; the checker also gets a shorter mapping), and
// a refused call writes nothing. While calls keep the heap's contract (blocks
// handed back are live) on an undamaged region, no call refuses and it stays
// undamaged; an allocation refuses only a damaged region. Input: a count n, n
// operations of 4 bytes, then the region, regionSize (up to 64 KiB) long.
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "mempool/region_heap.h"

using namespace coffer;

static bool Damaged(const char *region, uint32_t mapped) {
  return SHCheckRegion(region, mapped, nullptr, nullptr, nullptr) == ShHeapState::kDamaged;
}

static void Check(bool ok, const char *what) {
  if (!ok) std::fprintf(stderr, "%s\n", what), std::abort();
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
  const size_t start = 1 + 4 * (size ? data[0] % 9 : 0);
  uint32_t regionSize;
  if (size < start + 4 || (std::memcpy(&regionSize, data + start, 4), regionSize > (1u << 16)))
    return 0;
  const uint32_t mapped = std::max(regionSize, 16u), part = std::max(mapped / 2, 16u);
  char *region = static_cast<char *>(std::calloc(mapped, 1));
  std::memcpy(region, data + start, std::min<size_t>(size - start, mapped));
  std::vector<char> cut(region, region + part);  // a mapping shorter than the region
  Check(part == mapped || Damaged(cut.data(), part), "a cut mapping checks clean");
  std::vector<void *> live, stale;  // blocks the heap gave out: held, handed back
  bool contract = true;             // every call so far kept it, on an undamaged region
  for (const uint8_t *op = data + 1; op < data + start; op += 4) {
    const uint32_t arg = op[1] | op[2] << 8, what = op[0] % 4, count = 1 + op[3] % 4;
    std::vector<void *> &from = op[3] % 3 == 1 ? live : stale;
    const size_t pick = op[3] / 3 % (from.size() + 1);
    const bool isLive = &from == &live && pick < live.size(), alloc = what % 3 == 0;
    void *ptr = op[3] % 3 && pick < from.size() ? from[pick]
                                                : reinterpret_cast<void *>(uintptr_t(region) + arg);
    const uint32_t n = what == 0 ? arg : what == 3 ? count * (arg % 512 / 4) : arg % 512;
    const bool wasDamaged = Damaged(region, mapped);
    const std::vector<char> before(region, region + mapped);
    ShOutcome out = {ShRefusal::kNone, 0};
    MemPool mp;
    MemPool_InitOnSimpleHeap(&mp, region, 0);
    void *p = what == 0   ? SHAllocChecked(region, n, &out)
              : what == 1 ? (SHFreeChecked(region, ptr, &out), nullptr)
              : what == 2 ? SHReallocChecked(region, ptr, n, &out)
                          : mp.calloc(&mp, count, n / count);
    const bool refused = out.refusal != ShRefusal::kNone;
    Check(!refused || !std::memcmp(before.data(), region, mapped), "a refused call wrote");
    Check(out.refusal != ShRefusal::kDamaged || out.at < mapped, "damage outside the region");
    Check(!alloc || out.refusal != ShRefusal::kDamaged || wasDamaged, "an allocation refused");
    if (contract && !wasDamaged && (alloc || isLive))
      Check(!refused && !Damaged(region, mapped), "a call refused or damaged a sound region");
    contract = contract && !wasDamaged && (alloc || isLive || refused);
    if (isLive && !refused && p != ptr && (p || what == 1 || n == 0))
      stale.push_back(ptr), live.erase(live.begin() + pick);
    if (p) std::memset(p, 0xEE, n);  // as a caller would
    if (p && p != ptr) live.push_back(p);
  }
  std::free(region);
  return 0;
}
