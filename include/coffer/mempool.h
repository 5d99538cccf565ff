// SPDX-License-Identifier: MIT
/** @file
 * coffer memory pools and the region heap.
 *
 * Every container keeps its records in a MemPool chosen by the caller: the
 * process heap, or a caller-supplied heap region run by the region heap
 * (SH_*), optionally under a process-shared lock. Pool-resident records refer
 * to each other by PoolOffset (address minus the pool's base), so a container
 * built in a region is valid wherever the region is mapped.
 *
 * Out of memory. Each pool decides what exhaustion means, and every call of
 * the library that asks its pool for memory inherits that decision:
 * - the process-heap pool (MemPool_InitOnStdHeap) and the shared-heap pool
 *   (MemPool_InitOnSharedHeap) call Panic, which does not return, with
 *   "Out of memory trying to allocate %zu bytes." (and for a calloc whose
 *   count x size does not fit in 32 bits, "<pool call>: integer overflow");
 * - the simple-heap pool (MemPool_InitOnSimpleHeap), and any pool a caller
 *   writes whose operations return null, make the container call fail: it
 *   returns null, false or 0 and leaves what its documentation says.
 *
 * The "Panic" heading of each call says whether it can reach the pool's Panic.
 * Memory that a path lookup copies into comes from malloc, never from a pool;
 * it is never fatal (the call fails instead).
 */
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

/** Marks an exported call of libcoffer.so. */
#define COFFER_API __attribute__((visibility("default")))

/** The opaque 32-bit word that containers store as a value. 0 is an ordinary
 * value. */
typedef uintptr_t CofferVal;

/** An offset from a pool's base; 0 is null. */
typedef uint32_t PoolOffset;

typedef struct MemPool MemPool;

/** Allocates size bytes from pool; null when the pool is exhausted (pools that
 * panic never return null). */
typedef void *(*MemPoolAllocFn)(MemPool *pool, size_t size);
/** Allocates count x size zeroed bytes from pool. */
typedef void *(*MemPoolCallocFn)(MemPool *pool, size_t count, size_t size);
/** Resizes a block of pool (null: allocates; size 0: releases and returns
 * null); null on failure with the old block intact. */
typedef void *(*MemPoolReallocFn)(MemPool *pool, void *ptr, size_t size);
/** Releases a block of pool; null is ignored. */
typedef void (*MemPoolFreeFn)(MemPool *pool, void *ptr);

/** A memory pool: six 32-bit words. Each operation receives the record it was
 * called through, so a copy of a record (or any struct that starts with one)
 * works exactly as the original. A caller may fill one with operations of its
 * own; the free operation must read what it needs from the record before it
 * releases the block, since a container frees its own handle through it. */
struct MemPool {
  MemPoolAllocFn alloc;
  MemPoolCallocFn calloc;
  MemPoolReallocFn realloc;
  MemPoolFreeFn free;
  void *base; /**< origin of this pool's offsets; 0 for the process heap */
  void *lock; /**< exclusive-lock handle of a shared region; 0 otherwise */
};

/** Releases a value that a container drops. At most one of the two kinds is
 * set on a container. It runs in the middle of the container call, on the
 * caller's thread: it must not call the same container, and must return
 * normally (no exception or longjmp through the library). */
typedef void (*FreeValFn)(CofferVal val);
/** As FreeValFn, and receives the container's handle as pool, so it can
 * release a value that points into the same pool. */
typedef void (*MpFreeValFn)(MemPool *pool, CofferVal val);

/** The whole of every container handle. mp comes first, so a handle is also a
 * pool, and the container passes itself as the pool to every pool call. A
 * handle holds addresses and is valid only in the process that made it;
 * everything it points to through data lives in the pool. */
typedef struct CollectionHeader {
  MemPool mp;              /**< copy of the pool the container draws from */
  FreeValFn freeValFn;     /**< value-release callback, or null */
  MpFreeValFn mpFreeValFn; /**< value-release callback with pool, or null */
  bool ownsHandle;         /**< the family's free call releases the handle too */
  void *data;              /**< the family's data record, a plain address */
} CollectionHeader;

/**
 * Fills pool with the process-heap operations: malloc, calloc, realloc and
 * free. base and lock are 0, so an offset in this pool is the address itself.
 *
 * @param pool  the record to fill; every word is overwritten.
 * @return true, always.
 * @par Ownership
 * The record is the caller's and owns nothing: there is nothing to tear down.
 * Containers copy it when they are made, so it may be a temporary.
 * @par Failure
 * None.
 * @par Panic
 * Not here. The pool's operations panic on exhaustion, and calloc also when
 * count x size does not fit in 32 bits; realloc to size 0 returns what the C
 * library's realloc returns.
 */
COFFER_API bool MemPool_InitOnStdHeap(MemPool *pool);

/**
 * Fills pool with the shared-heap operations over a heap region: each
 * allocator operation holds lock around exactly one region-heap call (never
 * while container code or a callback runs). A nonzero size formats the region
 * (as SH_Reset does, and not under the lock, so before any other user
 * attaches); size 0 attaches to a region already formatted, in this or
 * another process, mapped at any address.
 *
 * @param pool    the record to fill.
 * @param region  the region's start in this process, aligned to at least 4
 *                bytes (payloads are 4-byte aligned relative to it).
 * @param size    the region's size in bytes to format it, or 0 to attach.
 * @param lock    a lock handle for Tandel_AcquireExclLock: the address of a
 *                TandelExclLock set up with Tandel_InitExclLock, in memory
 *                that every process using the region maps.
 * @return true; false for a nonzero size of 32 bytes or less.
 * @par Ownership
 * The region and the lock stay the caller's: they must outlive every container
 * made from the pool, and the library never creates or destroys a lock. The
 * record owns nothing.
 * @par Failure
 * false leaves both the region and the record untouched.
 * @par Panic
 * Not here. The pool's alloc and calloc panic when the region is exhausted,
 * calloc also when count x size does not fit in 32 bits, and realloc when it
 * cannot move a block to a nonzero size; each releases the lock first. Before
 * reporting exhaustion, or when the heap refused a call, the pool checks the
 * whole region under its lock: damage anywhere panics with "Shared heap
 * region damaged at offset %u.", and a free or realloc of something that is
 * no allocated block with "Shared heap: offset %u is not the payload of an
 * allocated block."
 */
COFFER_API bool MemPool_InitOnSharedHeap(MemPool *pool, void *region, size_t size,
                                         void *lock);

/**
 * As MemPool_InitOnSharedHeap without a lock: the pool's operations call the
 * region heap directly, so one region must then be used by one thread at a
 * time, and an exhausted region gives a null result instead of a fatal report.
 *
 * @param pool    the record to fill.
 * @param region  the region's start in this process, aligned to at least 4 bytes.
 * @param size    the region's size in bytes to format it, or 0 to attach.
 * @return true; false for a nonzero size of 32 bytes or less.
 * @par Ownership
 * The region stays the caller's and must outlive every container made from
 * the pool.
 * @par Failure
 * false leaves both the region and the record untouched.
 * @par Panic
 * Never, neither here nor in the pool's operations: containers on this pool
 * report exhaustion, and a damaged region, by their results; a refused
 * release is ignored.
 */
COFFER_API bool MemPool_InitOnSimpleHeap(MemPool *pool, void *region, size_t size);

/* ---- region heap ---------------------------------------------------------
 * A formatted region is a 16-byte header followed by blocks that tile it.
 * Every field is a 32-bit region offset or size; nothing holds an address.
 * The SH_ calls take no lock. Since other processes may write the region,
 * they check every header word before they follow it: on a damaged region
 * (a header that would lead a walk outside the region, into a loop or onto
 * a block that is not there) SH_Alloc and SH_Realloc return null and SH_Free
 * leaves the region as it is; they never write outside the region. The one
 * word taken on trust is regionSize: the region must be at least that large.
 * Two free blocks side by side, left by a release that was cut short, are
 * not damage: they are merged when next touched. */

/** The end of the free list, and the free-list links of an allocated block. */
#define SH_NO_BLOCK 0xFFFFFFFFu

/** The first 16 bytes of a formatted region. */
typedef struct ShRegionHeader {
  uint32_t regionSize;  /**< the whole region, header included */
  uint32_t freeHead;    /**< first free block, or SH_NO_BLOCK */
  uint32_t reserved[2]; /**< never read or written by the heap (named roots use them) */
} ShRegionHeader;

/** The header of every block; the payload follows it. */
typedef struct ShBlockHeader {
  uint32_t blockSize;     /**< the whole block, this header included */
  uint32_t prevBlockSize; /**< size of the block before; 0 for the first */
  uint32_t nextFree;      /**< free: next on the free list; allocated: 0 */
  uint32_t prevFree;      /**< free: previous on the free list; allocated: 0 */
} ShBlockHeader;

/**
 * Formats a region as one free block, forgetting every block it held. Only
 * the region header and the first block header are written.
 *
 * @param region  the region's start.
 * @param size    the region's size in bytes.
 * @return 0, or -1 when size is 32 or less.
 * @par Ownership
 * The region stays the caller's; payloads handed out before are void.
 * @par Failure
 * -1 writes nothing.
 * @par Panic
 * Never.
 */
COFFER_API int32_t SH_Reset(void *region, size_t size);

/**
 * Hands out a payload of at least size bytes (rounded up to a multiple of 4),
 * not cleared. Of the first two free blocks that fit, the lower one is taken;
 * a remainder of more than 16 bytes stays free.
 *
 * @param region  a formatted region.
 * @param size    bytes wanted; 0 gives a payload of capacity 0 or more.
 * @return the payload's address, or null.
 * @par Ownership
 * The payload is the caller's until SH_Free or SH_Realloc gives it back.
 * @par Failure
 * null when no free block fits (or size exceeds 0xFFFFFFFC), and on a damaged
 * region; the region is unchanged.
 * @par Panic
 * Never.
 */
COFFER_API void *SH_Alloc(void *region, size_t size);

/**
 * Gives a payload back and merges its block with free neighbours on both
 * sides; the block goes to the front of the free list.
 *
 * @param region  a formatted region.
 * @param ptr     a payload from SH_Alloc or SH_Realloc on this region, or null
 *                (ignored).
 * @par Ownership
 * ptr must not be used afterwards.
 * @par Failure
 * A pointer that is not the payload of an allocated block of this region (a
 * second release, a foreign or misaligned address), or a damaged region around
 * it, is refused: the region is left as it is.
 * @par Panic
 * Never.
 */
COFFER_API void SH_Free(void *region, void *ptr);

/**
 * Moves a payload to a block of size bytes, keeping the contents up to the
 * smaller capacity. A block never grows or shrinks in place: unless its
 * capacity already equals size exactly, a new block is taken while the old one
 * is held, so a resize can fail even when the old block and its free
 * neighbours would be large enough.
 *
 * @param region  a formatted region.
 * @param ptr     a payload of this region, or null (then as SH_Alloc).
 * @param size    the new size in bytes; 0 releases ptr.
 * @return the new payload (ptr itself when its capacity equals size), or null
 *         after a release (size 0) or on failure.
 * @par Ownership
 * On success the old payload is released (unless returned) and the new one is
 * the caller's.
 * @par Failure
 * null with ptr still allocated and its contents intact; also when ptr is not
 * an allocated payload of this region or the region is damaged, which leaves
 * the region as it is.
 * @par Panic
 * Never.
 */
COFFER_API void *SH_Realloc(void *region, void *ptr, size_t size);

#ifdef __cplusplus
}
#endif

#endif
