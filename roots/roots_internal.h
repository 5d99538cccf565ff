// SPDX-License-Identifier: MIT
// Internal operations of the named roots: reading a directory and judging
// records in a region whose bytes are not trusted. Nothing here allocates or
// writes, so the inspection tool builds the same code.
#ifndef COFFER_ROOTS_ROOTS_INTERNAL_H
#define COFFER_ROOTS_ROOTS_INTERNAL_H

#include <coffer/roots.h>

#include "mempool/check.h"

namespace coffer {

// A region as a reader sees it: the bytes [0, limit) may be read, limit
// being the smaller of the header's regionSize and what is mapped. Every
// offset is checked against limit before it is followed.
struct RegionView {
  const char *base;
  uint32_t limit;

  // The sum is formed on integers: an offset not yet checked may wrap.
  template <class T>
  const T *At(uint32_t off) const {
    return reinterpret_cast<const T *>(reinterpret_cast<uintptr_t>(base) + off);
  }
  // The pool offsets a container checker may follow in this region.
  CheckSpan Span() const { return CheckSpan{sizeof(ShRegionHeader), limit}; }
  // bytes at off lie inside the region, past its header, 4-byte aligned.
  bool Holds(uint32_t off, uint64_t bytes) const {
    const CheckSpan span = Span();
    return SpanHolds(&span, off, bytes);
  }
};

// The region of a pool, trusted to be mapped as large as its header says;
// limit 0 (nothing readable) for a pool without a base.
RegionView ViewOfPool(const MemPool *pool);
// A region image of which mapped bytes are readable.
RegionView ViewOfImage(const void *image, size_t mapped);
// A handle around the record at off, for the family checkers and walks.
CollectionHeader HandleAt(RegionView v, PoolOffset off);

// The region's directory, or null with the reason there is none that can be
// trusted (see roots.h for what is checked), and whether the words only lead
// to no directory (stale: none was made, or it is left from before a format)
// rather than to a damaged one. Reads block headers, so a caller holds the
// heap's lock when other processes may allocate.
const RootsDirectory *RootsFindDirectory(RegionView v, const char **why, bool *stale = nullptr);

// The entries of a directory RootsFindDirectory returned.
inline const RootsEntry *RootsEntries(RegionView v, const RootsDirectory *dir) {
  return v.At<RootsEntry>(dir->entries);
}

// True when name has an entry, at *at; else *at is where it would go.
bool RootsSearch(RegionView v, const RootsDirectory *dir, const char *name, int32_t *at);

// Null when the record at off can be opened as kind: it is the payload of a
// block marked allocated and large enough, and its constant-time invariants
// hold (see the Open calls in roots.h); else what is wrong with it.
const char *RootsRecordFault(RegionView v, uint32_t kind, PoolOffset off);

// "array", "rbt", "rbt-int32", "rbt-voidptr", "hst"; null for another kind.
const char *RootsKindName(uint32_t kind);
// The kind of such a name, or 0.
uint32_t RootsKindNamed(const char *name);

}  // namespace coffer

#endif
