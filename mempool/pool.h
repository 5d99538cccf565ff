// SPDX-License-Identifier: MIT
// Shared conventions of every container family: offset conversion, pool
// calls made through a handle, handle allocation and release, value drop.
#ifndef COFFER_MEMPOOL_POOL_H
#define COFFER_MEMPOOL_POOL_H

#include <coffer/mempool.h>
#include <coffer/platform.h>

#include <cstring>

namespace coffer {

// The only place where a PoolOffset turns into an address and back. 0 is null
// both ways; nothing a pool hands out sits at its own base.
// The sums wrap in 32 bits, so they are formed on integers, not pointers.
// The linked forms skip the test for 0 and null: they serve offsets that are
// never 0 and addresses that are never null (see LinkedRecordAt below), and
// take either the base itself, for a caller that keeps it at hand (RbtCtx),
// or the pool whose base it is.
inline void *LinkedAddr(const void *base, PoolOffset off) {
  return reinterpret_cast<void *>(reinterpret_cast<uintptr_t>(base) + off);
}
inline PoolOffset LinkedOffset(const void *base, const void *p) {
  return static_cast<PoolOffset>(reinterpret_cast<uintptr_t>(p) -
                                 reinterpret_cast<uintptr_t>(base));
}
inline void *LinkedAddr(const MemPool *mp, PoolOffset off) { return LinkedAddr(mp->base, off); }
inline PoolOffset LinkedOffset(const MemPool *mp, const void *p) { return LinkedOffset(mp->base, p); }
inline void *OffsetToAddr(const MemPool *mp, PoolOffset off) {
  return off ? LinkedAddr(mp, off) : nullptr;
}
inline PoolOffset AddrToOffset(const MemPool *mp, const void *p) {
  return p ? LinkedOffset(mp, p) : 0;
}

// Starts bringing the memory at p into the cache ahead of its use. The
// target's baseline instruction set has no prefetch instruction, so this is
// an ordinary load whose value is dropped: it waits for memory alongside the
// work that follows instead of before it. p must be readable.
inline void Touch(const void *p) {
  asm volatile("" : : "r"(*static_cast<const volatile unsigned char *>(p)));
}

// count x size for a pool's calloc; false when the product does not fit in
// 32 bits. *bytes gets the product even then: wrapped, it would hand out a
// block too small, which is why every caller must heed the result.
inline bool CallocBytes(size_t count, size_t size, size_t *bytes) {
  *bytes = count * size;
  return size == 0 || count <= static_cast<size_t>(0xFFFFFFFFu) / size;
}

// Messages of the pools that treat exhaustion as fatal.
constexpr const char *kOutOfMemory = "Out of memory trying to allocate %zu bytes.";
constexpr const char *kCallocOverflow = "%s: integer overflow (%zu, %zu";

// The idiom every family uses, through its handle: RecordAt turns an offset
// into the record it names, OffsetOf turns a record back into its offset.
// Families wrap them once under their record's name (NodeAt, EntriesOf).
template <class T>
inline T *RecordAt(const CollectionHeader *h, PoolOffset off) {
  return static_cast<T *>(OffsetToAddr(&h->mp, off));
}
inline PoolOffset OffsetOf(const CollectionHeader *h, const void *p) {
  return AddrToOffset(&h->mp, p);
}

// The same idiom for offsets that are never 0 and records that are never
// null: the key copies a red-black tree's nodes name (its links convert in
// RbtCtx, from the base it keeps). It skips the null test, which would
// otherwise cost a branch at every step of every descent.
template <class T>
inline T *LinkedRecordAt(const CollectionHeader *h, PoolOffset off) {
  return static_cast<T *>(LinkedAddr(&h->mp, off));
}

// Every allocation of a container goes through its handle's pool copy, with
// the handle itself as the pool argument.
inline void *PoolAlloc(CollectionHeader *h, size_t size) { return h->mp.alloc(&h->mp, size); }
inline void *PoolCalloc(CollectionHeader *h, size_t size) { return h->mp.calloc(&h->mp, 1, size); }
inline void *PoolRealloc(CollectionHeader *h, void *p, size_t size) {
  return h->mp.realloc(&h->mp, p, size);
}
inline void PoolFree(CollectionHeader *h, void *p) { h->mp.free(&h->mp, p); }

// Copies a NUL-terminated string into exactly strlen + 1 bytes of the pool;
// null when the pool refuses.
char *PoolStrdup(CollectionHeader *h, const char *s);

// Allocates a zeroed handle from pool and copies the pool record into it:
// no callbacks, ownsHandle set, no data yet. Null when the pool refuses.
CollectionHeader *AllocHandle(MemPool *pool);

// Releases the handle through its own pool when the family made it.
void ReleaseHandle(CollectionHeader *h);

// Gives a dropped value to whichever release callback is set.
inline void DropValue(CollectionHeader *h, CofferVal val) {
  if (h->freeValFn)
    h->freeValFn(val);
  else if (h->mpFreeValFn)
    h->mpFreeValFn(&h->mp, val);
}

FreeValFn SetFreeValFn(CollectionHeader *h, FreeValFn fn);
MpFreeValFn SetMpFreeValFn(CollectionHeader *h, MpFreeValFn fn);

// A handle built on the stack around a data record kept inside another
// container: the outer pool, no callbacks, not owned.
inline CollectionHeader TransientHandle(const CollectionHeader *outer, void *data) {
  CollectionHeader t;
  std::memset(&t, 0, sizeof t);
  t.mp = outer->mp;
  t.data = data;
  return t;
}

}  // namespace coffer

#endif
