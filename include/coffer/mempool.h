/* coffer memory pools and the region heap.
 *
 * Every container keeps its records in a MemPool chosen by the caller: the
 * process heap, or a caller-supplied heap region run by the region heap
 * (SH_*), optionally under a process-shared lock. Pool-resident records refer
 * to each other by PoolOffset (address minus the pool's base), so a container
 * built in a region is valid wherever the region is mapped. */
#ifndef COFFER_MEMPOOL_H
#define COFFER_MEMPOOL_H

#include <stddef.h>
#include <stdint.h>
#ifndef __cplusplus
#include <stdbool.h>
#endif

#ifdef __cplusplus
extern "C" {
#endif

#define COFFER_API __attribute__((visibility("default")))

/* The opaque 32-bit word that containers store as a value. 0 is an ordinary
 * value. */
typedef uintptr_t CofferVal;

/* An offset from a pool's base; 0 is null. */
typedef uint32_t PoolOffset;

typedef struct MemPool MemPool;

typedef void *(*MemPoolAllocFn)(MemPool *pool, size_t size);
typedef void *(*MemPoolCallocFn)(MemPool *pool, size_t count, size_t size);
typedef void *(*MemPoolReallocFn)(MemPool *pool, void *ptr, size_t size);
typedef void (*MemPoolFreeFn)(MemPool *pool, void *ptr);

/* Six 32-bit words. Each operation receives the record it was called
 * through, so a copy of a record (or any struct that starts with one) works
 * exactly as the original. */
struct MemPool {
  MemPoolAllocFn alloc;
  MemPoolCallocFn calloc;
  MemPoolReallocFn realloc;
  MemPoolFreeFn free;
  void *base; /* origin of this pool's offsets; 0 for the process heap */
  void *lock; /* exclusive-lock handle of a shared region; 0 otherwise */
};

/* Value-release callbacks; at most one is set on a container. */
typedef void (*FreeValFn)(CofferVal val);
typedef void (*MpFreeValFn)(MemPool *pool, CofferVal val);

/* The whole of every container handle. mp comes first, so a handle is also a
 * pool, and the container passes itself as the pool to every pool call. */
typedef struct CollectionHeader {
  MemPool mp;
  FreeValFn freeValFn;
  MpFreeValFn mpFreeValFn;
  bool ownsHandle; /* the family's free call releases the handle too */
  void *data;      /* the family's data record, a plain address */
} CollectionHeader;

/* Fills pool with the process-heap operations (malloc and friends; an
 * exhausted heap is fatal). base and lock are 0. Always returns true. */
COFFER_API bool MemPool_InitOnStdHeap(MemPool *pool);

/* Fills pool with the shared-heap operations over region: each allocator
 * call holds lock (a handle for Tandel_AcquireExclLock) and an exhausted
 * region is fatal. A nonzero size formats the region; size 0 attaches to a
 * region already formatted, in this or another process. Returns false, with
 * the region untouched, for a nonzero size of 32 bytes or less. */
COFFER_API bool MemPool_InitOnSharedHeap(MemPool *pool, void *region, size_t size,
                                         void *lock);

/* As MemPool_InitOnSharedHeap without a lock; an exhausted region gives a
 * null result instead of a fatal report. */
COFFER_API bool MemPool_InitOnSimpleHeap(MemPool *pool, void *region, size_t size);

/* ---- region heap ---------------------------------------------------------
 * A formatted region is a 16-byte header followed by blocks that tile it.
 * Every field is a 32-bit region offset or size; nothing holds an address. */

#define SH_NO_BLOCK 0xFFFFFFFFu

typedef struct ShRegionHeader {
  uint32_t regionSize; /* the whole region, header included */
  uint32_t freeHead;   /* first free block, or SH_NO_BLOCK */
  uint32_t reserved[2];
} ShRegionHeader;

typedef struct ShBlockHeader {
  uint32_t blockSize;     /* the whole block, this header included */
  uint32_t prevBlockSize; /* size of the block before; 0 for the first */
  uint32_t nextFree;      /* free: next on the free list; allocated: 0 */
  uint32_t prevFree;      /* free: previous on the free list; allocated: 0 */
} ShBlockHeader;

/* Formats a region of size bytes as one free block. Returns 0, or -1 (and
 * writes nothing) when size is 32 or less. */
COFFER_API int32_t SH_Reset(void *region, size_t size);
/* Returns a payload of at least size bytes, or null. */
COFFER_API void *SH_Alloc(void *region, size_t size);
/* Releases a payload of this region; null is ignored. */
COFFER_API void SH_Free(void *region, void *ptr);
/* Moves a payload to a block of size bytes (never in place unless the
 * capacity already equals size); null on failure, the old block intact. */
COFFER_API void *SH_Realloc(void *region, void *ptr, size_t size);

#ifdef __cplusplus
}
#endif

#endif
