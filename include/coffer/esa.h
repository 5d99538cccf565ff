// SPDX-License-Identifier: MIT
/** @file
 * coffer sorted string array: (key, value) entries in strcmp order of their
 * keys (bytes compared as unsigned), found by bisection. Equal keys are
 * allowed and keep insertion order. The data record, the entry block and the
 * key copies all live in the array's pool.
 *
 * The entry block grows by capacityIncrement slots when it is full, and
 * shrinks to exactly the entries in use as soon as a removal leaves that many
 * slots free. An increment below 1 counts as 1.
 */
#ifndef COFFER_ESA_H
#define COFFER_ESA_H

#include <coffer/mempool.h>

#ifdef __cplusplus
extern "C" {
#endif

/** A sorted string array's handle. */
typedef CollectionHeader EsaArray;

/** The pool-resident record of an array (a shared-memory format). */
typedef struct EsaArrayData {
  PoolOffset entries;        /**< the entry block; 0 when there is none */
  int32_t size;              /**< entries in use */
  int32_t capacity;          /**< slots in the entry block */
  int32_t capacityIncrement; /**< growth step, and the slack that shrinks */
} EsaArrayData;

/** One entry of the entry block. */
typedef struct EsaEntry {
  PoolOffset key; /**< the array's own copy of the key */
  CofferVal val;  /**< the caller's value */
} EsaEntry;

/**
 * Makes an empty array on the process heap.
 *
 * @param initialCapacity    slots of the first entry block (0 or more).
 * @param capacityIncrement  growth step and shrink slack (below 1 counts as 1).
 * @return the new array, or null.
 * @par Ownership
 * The array owns its handle: ESA_FreeArray releases it with everything else.
 * @par Failure
 * null for a negative initial capacity (or one whose byte size does not fit in
 * 32 bits); nothing stays allocated.
 * @par Panic
 * When the process heap is exhausted.
 */
COFFER_API EsaArray *ESA_AllocArray(int32_t initialCapacity, int32_t capacityIncrement);

/**
 * Makes an empty array whose handle and records come from pool.
 *
 * @param pool               the pool; the array keeps a copy of the record,
 *                           which is read during this call only.
 * @param initialCapacity    slots of the first entry block (0 or more).
 * @param capacityIncrement  growth step and shrink slack (below 1 counts as 1).
 * @return the new array, or null.
 * @par Ownership
 * The array owns its handle (allocated from pool): ESA_FreeArray releases it
 * with everything else.
 * @par Failure
 * null for a negative initial capacity or when the pool refuses the handle,
 * the data record or the entry block; nothing stays allocated.
 * @par Panic
 * When the pool panics on exhaustion (process-heap and shared-heap pools).
 */
COFFER_API EsaArray *ESA_AllocArrayEx(MemPool *pool, int32_t initialCapacity,
                                      int32_t capacityIncrement);

/**
 * Gives a caller-built handle an empty array: allocates the data record and
 * the first entry block through the handle and stores the record in
 * arr->data, overwriting whatever was there.
 *
 * @param arr                a handle whose mp is filled in (set the callbacks,
 *                           ownsHandle and data yourself, e.g. to zero).
 * @param initialCapacity    slots of the first entry block (0 or more).
 * @param capacityIncrement  growth step and shrink slack (below 1 counts as 1).
 * @return true on success.
 * @par Ownership
 * The records belong to the array; the handle stays the caller's unless
 * ownsHandle is set (ESA_FreeArray then releases it through arr->mp). A data
 * record arr->data held before is not released.
 * @par Failure
 * false with arr->data null and nothing allocated; a negative initial capacity
 * fails before any allocation.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API bool ESA_CreateArrayData(EsaArray *arr, int32_t initialCapacity,
                                    int32_t capacityIncrement);

/**
 * Frees an array: releases every value through the release callback, in
 * ascending order, then the key copies, the entry block and the data record,
 * and last the handle if the array owns it.
 *
 * @param arr  the array, or null (nothing happens). A handle whose data is null
 *             has only the handle released (if owned).
 * @par Ownership
 * Everything of the array is gone. A handle the caller keeps still points at
 * the released data record: give it a new one with ESA_CreateArrayData before
 * any other use.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void ESA_FreeArray(EsaArray *arr);

/**
 * Tells how many entries the array holds.
 *
 * @param arr  the array.
 * @return the number of entries.
 * @par Ownership
 * Unchanged.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API int32_t ESA_GetSize(EsaArray *arr);

/**
 * Sets the growth step of the entry block, which is also the slack at which a
 * removal shrinks it; it applies from the next insertion or removal.
 *
 * @param arr                the array.
 * @param capacityIncrement  the new step; below 1 counts as 1.
 * @par Ownership
 * Unchanged.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void ESA_SetCapacityIncrement(EsaArray *arr, int32_t capacityIncrement);

/**
 * Sets the callback that releases the values the array drops, and clears the
 * MpFreeValFn one: at most one callback is set.
 *
 * @param arr  the array.
 * @param fn   the callback, or null for none.
 * @return the FreeValFn set before (not the MpFreeValFn this call clears).
 * @par Ownership
 * From now on every dropped value goes to fn: entries removed, cleared or
 * freed. Replacing a value (ESA_SetVal) never drops it.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API FreeValFn ESA_SetFreeValFn(EsaArray *arr, FreeValFn fn);

/**
 * Sets the callback that releases dropped values with the array's handle as
 * its pool argument, and clears the FreeValFn one.
 *
 * @param arr  the array.
 * @param fn   the callback, or null for none.
 * @return the MpFreeValFn set before (not the FreeValFn this call clears).
 * @par Ownership
 * As ESA_SetFreeValFn, with fn receiving arr as the pool.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API MpFreeValFn ESA_SetMpFreeValFn(EsaArray *arr, MpFreeValFn fn);

/**
 * Gives the address of an entry.
 *
 * @param arr    the array.
 * @param index  the entry's position, 0 to size - 1.
 * @return the entry, or null for an index out of range.
 * @par Ownership
 * The entry stays the array's; the pointer is valid until the next insertion
 * or removal, either of which may move the entry block. Read the key through
 * ESA_GetKey: entry->key is an offset in the pool.
 * @par Failure
 * null for an index out of range.
 * @par Panic
 * Never.
 */
COFFER_API EsaEntry *ESA_Get(EsaArray *arr, int32_t index);

/**
 * Gives the key of an entry.
 *
 * @param arr    the array.
 * @param index  the entry's position.
 * @return the array's copy of the key, or null for an index out of range.
 * @par Ownership
 * The string stays the array's and is valid until its entry is removed; do not
 * change it (that would break the order).
 * @par Failure
 * null for an index out of range.
 * @par Panic
 * Never.
 */
COFFER_API const char *ESA_GetKey(EsaArray *arr, int32_t index);

/**
 * Gives the value of an entry.
 *
 * @param arr    the array.
 * @param index  the entry's position.
 * @return the value, or 0 for an index out of range (0 is also an ordinary
 *         value: check the index against ESA_GetSize when that matters).
 * @par Ownership
 * The value stays the array's.
 * @par Failure
 * 0 for an index out of range.
 * @par Panic
 * Never.
 */
COFFER_API CofferVal ESA_GetVal(EsaArray *arr, int32_t index);

/**
 * Replaces the value of an entry.
 *
 * @param arr    the array.
 * @param index  the entry's position.
 * @param val    the new value.
 * @return true, or false for an index out of range.
 * @par Ownership
 * The old value is not released: it is the caller's again. val belongs to the
 * array.
 * @par Failure
 * false changes nothing.
 * @par Panic
 * Never.
 */
COFFER_API bool ESA_SetVal(EsaArray *arr, int32_t index, CofferVal val);

/**
 * Inserts an entry at its place in key order, after every entry with an equal
 * key; grows the entry block by the increment first if it is full.
 *
 * @param arr  the array.
 * @param key  a NUL-terminated string, not null.
 * @param val  the value.
 * @return true on success.
 * @par Ownership
 * The array stores its own copy of key (length + 1 bytes from the pool); key
 * stays the caller's. val belongs to the array until the entry is removed.
 * @par Failure
 * false when the pool refuses the grown entry block or the key copy (or the
 * block would pass INT32_MAX entries): the entries are as they were, val is not
 * released, and a block grown before the key copy failed stays grown.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API bool ESA_Insert(EsaArray *arr, const char *key, CofferVal val);

/**
 * Finds an entry by key, by bisection.
 *
 * @param arr            the array.
 * @param key            a NUL-terminated string, not null.
 * @param[out] outIndex  receives the entry's position when one is found.
 * @return true when an entry has this key. Among equal keys the one found is
 *         the first the bisection meets, not necessarily the first of them.
 * @par Ownership
 * Unchanged.
 * @par Failure
 * false leaves *outIndex untouched.
 * @par Panic
 * Never.
 */
COFFER_API bool ESA_Find(EsaArray *arr, const char *key, int32_t *outIndex);

/**
 * Removes an entry: its value goes to the release callback, then its key copy
 * is released and the entries after it move down. The entry block then
 * shrinks to the entries in use if that frees at least the increment.
 *
 * @param arr    the array.
 * @param index  the entry's position.
 * @return true, or false for an index out of range.
 * @par Ownership
 * The value has been handed to the release callback (or just dropped, when
 * none is set).
 * @par Failure
 * false changes nothing. A refused shrink is not a failure: the block keeps its
 * capacity.
 * @par Panic
 * When the pool panics on exhaustion: shrinking asks the pool for a new,
 * smaller block (the region heap never resizes in place), so on a full
 * shared-heap region even a removal can end the process.
 */
COFFER_API bool ESA_Remove(EsaArray *arr, int32_t index);

/**
 * Removes the entries first to end - 1, releasing their values in ascending
 * order as ESA_Remove does, then shrinks the block as ESA_Remove does.
 *
 * @param arr    the array.
 * @param first  the first position to remove, 0 or more.
 * @param end    the position after the last one to remove, at most the size.
 * @return true, or false when the range is empty, reversed or out of bounds.
 * @par Ownership
 * As ESA_Remove, for every entry of the range.
 * @par Failure
 * false changes nothing and releases nothing.
 * @par Panic
 * As ESA_Remove, unless the array ends up empty (a shrink to no slots asks
 * the pool for nothing).
 */
COFFER_API bool ESA_RemoveRange(EsaArray *arr, int32_t first, int32_t end);

/**
 * Removes every entry (ESA_RemoveRange over the whole array); the array stays
 * usable.
 *
 * @param arr  the array.
 * @return true when entries were removed, false when it was empty already.
 * @par Ownership
 * Every value has gone to the release callback, in ascending order.
 * @par Failure
 * false on an empty array, which keeps its capacity.
 * @par Panic
 * Never.
 */
COFFER_API bool ESA_Clear(EsaArray *arr);

#ifdef __cplusplus
}
#endif

#endif
