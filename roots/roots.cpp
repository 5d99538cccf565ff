// SPDX-License-Identifier: MIT
// The directory of named roots: created, changed and read through a pool
// whose base is a heap region (see roots.h for what is trusted and why).
// Invariants between calls, stated where they are maintained: the entries
// in use are in strictly ascending strcmp order of their names, each name is
// NUL-padded to its field, and the directory record never moves, so the
// header's second reserved word is written only by creation and destruction.
#include <cstring>

#include "mempool/pool.h"
#include "roots/roots_internal.h"

using namespace coffer;

namespace {

ShRegionHeader *HeaderOf(MemPool *pool) { return static_cast<ShRegionHeader *>(pool->base); }

// The directory, found while holding the pool's lock: the walk reads block
// headers that other processes change under that lock. Null without one.
RootsDirectory *FindDirectory(MemPool *pool) {
  if (!pool->base) return nullptr;
  if (pool->lock) Tandel_AcquireExclLock(pool->lock);
  const RootsDirectory *dir = RootsFindDirectory(ViewOfPool(pool), nullptr);
  if (pool->lock) Tandel_ReleaseExclLock(pool->lock);
  return const_cast<RootsDirectory *>(dir);
}

RootsEntry *EntriesOf(MemPool *pool, RootsDirectory *dir) {
  return static_cast<RootsEntry *>(OffsetToAddr(pool, dir->entries));
}

bool NameUsable(const char *name) {
  return name && name[0] != '\0' && std::strlen(name) <= ROOTS_NAME_MAX;
}

// Doubles the entry block (4 entries at first); false, with the directory as
// it was, when the pool refuses.
bool Grow(MemPool *pool, RootsDirectory *dir) {
  const int32_t capacity = dir->capacity ? 2 * dir->capacity : 4;
  if (capacity > static_cast<int32_t>(0xFFFFFFFFu / sizeof(RootsEntry))) return false;
  void *block = pool->realloc(pool, OffsetToAddr(pool, dir->entries), capacity * sizeof(RootsEntry));
  if (!block) return false;
  dir->entries = AddrToOffset(pool, block);
  dir->capacity = capacity;
  return true;
}

// Hands an entry to the caller's outputs, each of which may be null.
void Report(const RootsEntry &e, const char **outName, int32_t *outKind, PoolOffset *outRecord) {
  if (outName) *outName = e.name;
  if (outKind) *outKind = static_cast<int32_t>(e.kind);
  if (outRecord) *outRecord = e.record;
}

}  // namespace

extern "C" {

COFFER_API bool Roots_CreateDirectory(MemPool *pool) {
  if (!pool->base) return false;
  if (FindDirectory(pool)) return true;
  auto *dir = static_cast<RootsDirectory *>(pool->calloc(pool, 1, sizeof(RootsDirectory)));
  if (!dir) return false;
  const PoolOffset off = AddrToOffset(pool, dir);
  *dir = RootsDirectory{ROOTS_DIRECTORY_MAGIC, off, 0, 0, 0};
  ShRegionHeader *h = HeaderOf(pool);
  const ShRegionHeader before = *h;
  h->reserved[1] = off;
  h->reserved[0] = ROOTS_REGION_MAGIC;
  if (FindDirectory(pool)) return true;
  // The pool handed out memory that is no block of its region.
  h->reserved[0] = before.reserved[0], h->reserved[1] = before.reserved[1];
  pool->free(pool, dir);
  return false;
}

COFFER_API void Roots_DestroyDirectory(MemPool *pool) {
  if (!pool->base) return;
  RootsDirectory *dir = FindDirectory(pool);
  // The words go first: a process that dies midway leaves no directory.
  HeaderOf(pool)->reserved[0] = 0;
  HeaderOf(pool)->reserved[1] = 0;
  if (!dir) return;
  pool->free(pool, OffsetToAddr(pool, dir->entries));
  pool->free(pool, dir);
}

COFFER_API bool Roots_Set(MemPool *pool, const char *name, int32_t kind,
                          const CollectionHeader *container) {
  RootsDirectory *dir = FindDirectory(pool);
  if (!dir || !NameUsable(name) || !container) return false;
  const PoolOffset record = AddrToOffset(pool, container->data);
  if (!container->data || RootsRecordFault(ViewOfPool(pool), kind, record)) return false;
  int32_t at;
  if (!RootsSearch(ViewOfPool(pool), dir, name, &at)) {
    if (dir->count == dir->capacity && !Grow(pool, dir)) return false;
    RootsEntry *e = EntriesOf(pool, dir);
    std::memmove(e + at + 1, e + at, (dir->count - at) * sizeof *e);
    std::memset(e[at].name, 0, sizeof e[at].name);
    std::memcpy(e[at].name, name, std::strlen(name));
    dir->count++;
  }
  RootsEntry *e = EntriesOf(pool, dir) + at;
  e->kind = static_cast<uint32_t>(kind);
  e->record = record;
  return true;
}

COFFER_API bool Roots_Get(MemPool *pool, const char *name, int32_t *outKind,
                          PoolOffset *outRecord) {
  RootsDirectory *dir = FindDirectory(pool);
  int32_t at;
  if (!dir || !name || !RootsSearch(ViewOfPool(pool), dir, name, &at)) return false;
  Report(EntriesOf(pool, dir)[at], nullptr, outKind, outRecord);
  return true;
}

COFFER_API bool Roots_Remove(MemPool *pool, const char *name) {
  RootsDirectory *dir = FindDirectory(pool);
  int32_t at;
  if (!dir || !name || !RootsSearch(ViewOfPool(pool), dir, name, &at)) return false;
  RootsEntry *e = EntriesOf(pool, dir);
  std::memmove(e + at, e + at + 1, (dir->count - at - 1) * sizeof *e);
  dir->count--;
  std::memset(e + dir->count, 0, sizeof *e);
  return true;
}

COFFER_API int32_t Roots_GetCount(MemPool *pool) {
  RootsDirectory *dir = FindDirectory(pool);
  return dir ? dir->count : -1;
}

COFFER_API bool Roots_GetAt(MemPool *pool, int32_t index, const char **outName, int32_t *outKind,
                            PoolOffset *outRecord) {
  RootsDirectory *dir = FindDirectory(pool);
  if (!dir || index < 0 || index >= dir->count) return false;
  Report(EntriesOf(pool, dir)[index], outName, outKind, outRecord);
  return true;
}

}  // extern "C"
