// SPDX-License-Identifier: MIT
// The process-heap pool: the standard allocator, with exhaustion fatal.
#include <cstdlib>
#include <cstring>

#include "mempool/pool.h"

namespace {

void *MemPoolStdHeapAlloc(MemPool *, size_t size) {
  void *p = std::malloc(size);
  if (!p) Panic(coffer::kOutOfMemory, size);
  return p;
}

void *MemPoolStdHeapCalloc(MemPool *, size_t count, size_t size) {
  // Refuse a product that does not fit in 32 bits, so the report below can
  // show the exact size that was asked for.
  size_t bytes;
  if (!coffer::CallocBytes(count, size, &bytes))
    Panic(coffer::kCallocOverflow, "MemPoolStdHeapCalloc", count, size);
  void *p = std::calloc(count, size);
  if (!p) Panic(coffer::kOutOfMemory, bytes);
  return p;
}

void *MemPoolStdHeapRealloc(MemPool *, void *ptr, size_t size) {
  void *p = std::realloc(ptr, size);
  if (!p && size != 0) Panic(coffer::kOutOfMemory, size);
  return p;
}

void MemPoolStdHeapFree(MemPool *, void *ptr) { std::free(ptr); }

}  // namespace

extern "C" COFFER_API bool MemPool_InitOnStdHeap(MemPool *pool) {
  std::memset(pool, 0, sizeof *pool);
  pool->alloc = MemPoolStdHeapAlloc;
  pool->calloc = MemPoolStdHeapCalloc;
  pool->realloc = MemPoolStdHeapRealloc;
  pool->free = MemPoolStdHeapFree;
  return true;
}
