// The two pools over a heap region: the shared-heap pool, which holds the
// caller's exclusive lock around each region-heap call and treats an
// exhausted region as fatal, and the simple-heap pool, which takes no lock
// and passes null on.
#include <cstring>

#include "mempool/pool.h"
#include "mempool/region_heap.h"

namespace {

using coffer::CallocBytes;
using coffer::kCallocOverflow;
using coffer::kOutOfMemory;

// The shared operations read the lock handle once, before acquiring it, and
// release that same handle: the record they are called through may live in
// the block being released or moved, and is not read once the heap call
// has run. The lock covers the heap call only; zero fills and panics come
// after the release so that no other user of the region waits on them.

void *MemPoolSharedHeapAlloc(MemPool *pool, size_t size) {
  void *lock = pool->lock;
  void *base = pool->base;
  Tandel_AcquireExclLock(lock);
  void *p = SH_Alloc(base, size);
  Tandel_ReleaseExclLock(lock);
  if (!p) Panic(kOutOfMemory, size);
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
  Tandel_AcquireExclLock(lock);
  void *p = SH_Realloc(base, ptr, size);
  Tandel_ReleaseExclLock(lock);
  if (!p && size != 0) Panic(kOutOfMemory, size);
  return p;
}

void MemPoolSharedHeapFree(MemPool *pool, void *ptr) {
  void *lock = pool->lock;
  void *base = pool->base;
  Tandel_AcquireExclLock(lock);
  SH_Free(base, ptr);
  Tandel_ReleaseExclLock(lock);
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
