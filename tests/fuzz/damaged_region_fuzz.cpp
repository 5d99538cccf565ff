// Regions of any content, attached as they are. The heap calls and the
// checker must not crash, loop or touch a byte outside the region (a heap
// block of exactly its size, so the sanitizer sees any access past either
// end), and a refused call writes nothing. While the calls keep the heap's
// contract (a block handed back is live) on an undamaged region, heap and
// checker must agree: no call refuses, and the region stays undamaged; an
// allocation refuses a region as damaged only when the checker finds damage.
//
// Input: a count byte n, n operations of four bytes, then the region's
// bytes; its regionSize (at most 64 KiB) says how long it is, and bytes the
// input does not give are 0.
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
  size_t ops = size ? data[0] % 9 : 0, start = 1 + 4 * ops;
  uint32_t regionSize;
  if (size < start + 4 || (std::memcpy(&regionSize, data + start, 4), regionSize > (1u << 16)))
    return 0;
  const uint32_t mapped = regionSize < 16 ? 16 : regionSize,
                 part = mapped / 2 < 16 ? 16 : mapped / 2;
  char *region = static_cast<char *>(std::calloc(mapped, 1)),
       *cut = static_cast<char *>(std::malloc(part));
  std::memcpy(region, data + start, size - start < mapped ? size - start : mapped);
  std::memcpy(cut, region, part);  // a mapping shorter than the region: read only as far
  Check(part == mapped || Damaged(cut, part), "a cut mapping checks clean");
  std::free(cut);
  std::vector<void *> live, stale;  // blocks the heap gave out: held, handed back
  std::vector<char> before;
  bool contract = true;
  for (size_t i = 0; i < ops; ++i) {
    const uint8_t *op = data + 1 + 4 * i;
    uint32_t arg = op[1] | op[2] << 8, n = arg % 512, what = op[0] % 4;  // arg: a size or offset
    std::vector<void *> &from = op[3] % 3 == 1 ? live : stale;
    size_t pick = op[3] / 3 % (from.size() + 1);
    bool isLive = &from == &live && pick < live.size(), alloc = what % 3 == 0;
    void *ptr = op[3] % 3 && pick < from.size() ? from[pick]
                                                : reinterpret_cast<void *>(uintptr_t(region) + arg);
    bool wasDamaged = Damaged(region, mapped);
    before.assign(region, region + mapped);
    ShOutcome out = {ShRefusal::kNone, 0};
    MemPool mp;
    MemPool_InitOnSimpleHeap(&mp, region, 0);
    void *p = what == 0   ? SHAllocChecked(region, n = arg, &out)
              : what == 1 ? (SHFreeChecked(region, ptr, &out), nullptr)
              : what == 2 ? SHReallocChecked(region, ptr, n, &out)
                          : mp.calloc(&mp, 1 + op[3] % 4, n / 4);
    if (what == 3) n = (1 + op[3] % 4) * (n / 4);
    bool refused = out.refusal != ShRefusal::kNone;
    Check(!refused || std::memcmp(before.data(), region, mapped) == 0, "a refused call wrote");
    Check(out.refusal != ShRefusal::kDamaged || out.at < mapped, "damage outside the region");
    Check(!alloc || out.refusal != ShRefusal::kDamaged || wasDamaged,
          "allocation refused a sound region");
    if (contract && !wasDamaged && (alloc || isLive)) {
      Check(!refused, "refused a live block of an undamaged region");
      Check(!Damaged(region, mapped), "a call damaged an undamaged region");
    }
    contract = contract && !wasDamaged && (alloc || isLive || refused);
    if (isLive && !refused && p != ptr && (p || what == 1 || n == 0))
      stale.push_back(ptr), live.erase(live.begin() + pick);
    if (p) std::memset(p, 0xEE, n);  // as a caller would
    if (p && p != ptr) live.push_back(p);
  }
  std::free(region);
  return 0;
}
