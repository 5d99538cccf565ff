// SPDX-License-Identifier: MIT
// The two pools over a heap region: the shared-heap pool, which holds the
// caller's exclusive lock around each region-heap call and treats an
// exhausted region as fatal, and the simple-heap pool, which takes no lock
// and passes null on. Both refuse a damaged region; the shared pool says so.
#include <cstring>

#include "mempool/pool.h"
#include "mempool/region_heap.h"

namespace {

using coffer::CallocBytes;
using coffer::kCallocOverflow;
using coffer::kOutOfMemory;
using coffer::ShOutcome;
using coffer::ShRefusal;

// Messages of the shared pool when the heap refuses for a reason other than
// room: the region's headers are damaged, or the caller handed back
// something the region never gave out (or took back already).
constexpr const char *kRegionDamaged = "Shared heap region damaged at offset %u.";
constexpr const char *kNotAllocated =
    "Shared heap: offset %u is not the payload of an allocated block.";

// Called once the lock is released; returns only when the heap did not refuse.
void PanicIfRefused(const ShOutcome &out) {
  if (out.refusal == ShRefusal::kDamaged) Panic(kRegionDamaged, static_cast<unsigned>(out.at));
  if (out.refusal == ShRefusal::kNotAllocated) Panic(kNotAllocated, static_cast<unsigned>(out.at));
}

// The heap sees only the headers it walks, and a block handed back that
// does not check out may be a damaged header or a pointer the region never
// gave out. So before the shared pool reports a refused block, or calls a
// failed allocation "out of memory", it checks the whole region under the
// lock: damage anywhere (a free block lost from the list by a holder killed
// in mid-release, say) is reported as damage, and otherwise the block was
// not the caller's to hand back. These paths are fatal, so the cost of the
// check does not matter.
void Settle(void *base, void *ptr, bool failed, ShOutcome *out) {
  bool refused = out->refusal != ShRefusal::kNone;
  if (refused ? !ptr : !failed) return;  // a walk from freeHead is no caller's doing
  coffer::CheckFault fault;
  if (!coffer::SHCheckSound(base, static_cast<ShRegionHeader *>(base)->regionSize, &fault)) {
    if (out->refusal != ShRefusal::kDamaged) *out = {ShRefusal::kDamaged, fault.at};
  } else if (refused) {
    *out = {ShRefusal::kNotAllocated, static_cast<uint32_t>(reinterpret_cast<uintptr_t>(ptr) -
                                                            reinterpret_cast<uintptr_t>(base))};
  }
}

// The shared operations read the lock handle once, before acquiring it, and
// release that same handle: the record they are called through may live in
// the block being released or moved, and is not read once the heap call
// has run. The lock covers the heap call only; zero fills and panics come
// after the release so that no other user of the region waits on them.

void *MemPoolSharedHeapAlloc(MemPool *pool, size_t size) {
  void *lock = pool->lock;
  void *base = pool->base;
  ShOutcome out;
  Tandel_AcquireExclLock(lock);
  void *p = coffer::SHAllocChecked(base, size, &out);
  Settle(base, nullptr, !p, &out);
  Tandel_ReleaseExclLock(lock);
  if (!p) {
    PanicIfRefused(out);
    Panic(kOutOfMemory, size);
  }
  return p;
}

void *MemPoolSharedHeapCalloc(MemPool *pool, size_t count, size_t size) {
  size_t n;
  if (!CallocBytes(count, size, &n)) Panic(kCallocOverflow, "MemPoolSharedHeapCalloc", count, size);
  void *p = MemPoolSharedHeapAlloc(pool, n);
  std::memset(p, 0, n);
  return p;
}

void *MemPoolSharedHeapRealloc(MemPool *pool, void *ptr, size_t size) {
  void *lock = pool->lock;
  void *base = pool->base;
  ShOutcome out;
  Tandel_AcquireExclLock(lock);
  void *p = coffer::SHReallocChecked(base, ptr, size, &out);
  Settle(base, ptr, !p && size != 0, &out);
  Tandel_ReleaseExclLock(lock);
  PanicIfRefused(out);
  if (!p && size != 0) Panic(kOutOfMemory, size);
  return p;
}

void MemPoolSharedHeapFree(MemPool *pool, void *ptr) {
  void *lock = pool->lock;
  void *base = pool->base;
  ShOutcome out;
  Tandel_AcquireExclLock(lock);
  coffer::SHFreeChecked(base, ptr, &out);
  Settle(base, ptr, false, &out);
  Tandel_ReleaseExclLock(lock);
  PanicIfRefused(out);
}

void *MemPoolSimpleHeapAlloc(MemPool *pool, size_t size) { return SH_Alloc(pool->base, size); }

void *MemPoolSimpleHeapCalloc(MemPool *pool, size_t count, size_t size) {
  size_t n;
  if (!CallocBytes(count, size, &n)) return nullptr;  // a wrapped product would be too small
  void *p = SH_Alloc(pool->base, n);
  if (p) std::memset(p, 0, n);
  return p;
}

void *MemPoolSimpleHeapRealloc(MemPool *pool, void *ptr, size_t size) {
  return SH_Realloc(pool->base, ptr, size);
}

void MemPoolSimpleHeapFree(MemPool *pool, void *ptr) { SH_Free(pool->base, ptr); }

// Formats the region when size is nonzero, then fills the record. A size the
// heap refuses leaves both the region and the record as they were, so a
// failed call has no effect at all.
bool InitRegionPool(MemPool *pool, const MemPool &ops, void *region, size_t size) {
  if (size != 0 && SH_Reset(region, size) != 0) return false;
  *pool = ops;
  pool->base = region;
  return true;
}

}  // namespace

extern "C" COFFER_API bool MemPool_InitOnSharedHeap(MemPool *pool, void *region, size_t size,
                                                    void *lock) {
  const MemPool ops = {MemPoolSharedHeapAlloc,
                       MemPoolSharedHeapCalloc,
                       MemPoolSharedHeapRealloc,
                       MemPoolSharedHeapFree,
                       nullptr,
                       lock};
  return InitRegionPool(pool, ops, region, size);
}

extern "C" COFFER_API bool MemPool_InitOnSimpleHeap(MemPool *pool, void *region, size_t size) {
  const MemPool ops = {MemPoolSimpleHeapAlloc,
                       MemPoolSimpleHeapCalloc,
                       MemPoolSimpleHeapRealloc,
                       MemPoolSimpleHeapFree,
                       nullptr,
                       nullptr};
  return InitRegionPool(pool, ops, region, size);
}
