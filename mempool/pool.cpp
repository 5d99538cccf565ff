// SPDX-License-Identifier: MIT
#include "mempool/pool.h"

#include <cstddef>

static_assert(sizeof(void *) == 4, "coffer is built for 32-bit targets only");
static_assert(sizeof(MemPool) == 24, "MemPool is six 32-bit words");
static_assert(offsetof(MemPool, alloc) == 0 && offsetof(MemPool, calloc) == 4 &&
                  offsetof(MemPool, realloc) == 8 && offsetof(MemPool, free) == 12 &&
                  offsetof(MemPool, base) == 16 && offsetof(MemPool, lock) == 20,
              "MemPool field order");
static_assert(sizeof(CofferVal) == 4 && sizeof(PoolOffset) == 4, "32-bit words");
static_assert(sizeof(bool) == 1, "booleans are one byte");
static_assert(offsetof(CollectionHeader, mp) == 0, "a handle is also a pool");
static_assert(offsetof(CollectionHeader, freeValFn) == 24 &&
                  offsetof(CollectionHeader, mpFreeValFn) == 28 &&
                  offsetof(CollectionHeader, ownsHandle) == 32 &&
                  offsetof(CollectionHeader, data) == 36 && sizeof(CollectionHeader) == 40,
              "CollectionHeader layout");

namespace coffer {

char *PoolStrdup(CollectionHeader *h, const char *s) {
  size_t n = std::strlen(s) + 1;
  char *copy = static_cast<char *>(PoolAlloc(h, n));
  if (copy) std::memcpy(copy, s, n);
  return copy;
}

CollectionHeader *AllocHandle(MemPool *pool) {
  auto *h = static_cast<CollectionHeader *>(pool->calloc(pool, 1, sizeof(CollectionHeader)));
  if (!h) return nullptr;
  h->mp = *pool;
  h->freeValFn = nullptr;
  h->mpFreeValFn = nullptr;
  h->ownsHandle = true;
  h->data = nullptr;
  return h;
}

void ReleaseHandle(CollectionHeader *h) {
  // The handle may be the very block its pool's free releases; free reads
  // what it needs from the record before releasing it.
  if (h->ownsHandle) h->mp.free(&h->mp, h);
}

FreeValFn SetFreeValFn(CollectionHeader *h, FreeValFn fn) {
  FreeValFn old = h->freeValFn;
  h->freeValFn = fn;
  h->mpFreeValFn = nullptr;
  return old;
}

MpFreeValFn SetMpFreeValFn(CollectionHeader *h, MpFreeValFn fn) {
  MpFreeValFn old = h->mpFreeValFn;
  h->mpFreeValFn = fn;
  h->freeValFn = nullptr;
  return old;
}

}  // namespace coffer
