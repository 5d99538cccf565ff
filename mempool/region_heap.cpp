// SPDX-License-Identifier: MIT
// The region heap: a first-two-fit allocator whose bookkeeping lives entirely
// inside a caller-supplied region and links blocks by region offset, so one
// region can be mapped at different addresses by several processes.
//
// Other processes write the region too, so a call checks the header words
// it acts on, and reads and checks all it will touch before its first write.
// A call that finds a bad word refuses and writes nothing.
// The checks are those of a well-formed region, so on one the calls leave
// exactly the bytes they always left.
#include "mempool/region_heap.h"

#include <cstddef>
#include <cstring>

static_assert(sizeof(ShRegionHeader) == 16, "region header is 16 bytes");
static_assert(offsetof(ShRegionHeader, regionSize) == 0 &&
                  offsetof(ShRegionHeader, freeHead) == 4 &&
                  offsetof(ShRegionHeader, reserved) == 8,
              "region header layout");
static_assert(sizeof(ShBlockHeader) == 16, "block header is 16 bytes");
static_assert(offsetof(ShBlockHeader, blockSize) == 0 &&
                  offsetof(ShBlockHeader, prevBlockSize) == 4 &&
                  offsetof(ShBlockHeader, nextFree) == 8 && offsetof(ShBlockHeader, prevFree) == 12,
              "block header layout");
static_assert(sizeof(size_t) == sizeof(uint32_t), "region sizes are 32-bit");

// The kill test stops a process after any header write; other builds have
// no such point.
#ifdef COFFER_HEAP_KILL_POINTS
extern "C" void CofferHeapKillPoint(void);
#define COFFER_KILL_POINT() CofferHeapKillPoint()
#else
#define COFFER_KILL_POINT() ((void)0)
#endif

namespace coffer {
namespace {

// Size of a block header; the region header is as large, so the first block
// starts at this offset too.
constexpr uint32_t kHead = sizeof(ShBlockHeader);
// A region must be larger than its header plus one block with no room.
constexpr uint32_t kMinRegion = sizeof(ShRegionHeader) + kHead;
constexpr uint32_t kLargestRoundable = 0xFFFFFFFCu;
constexpr uint32_t kNone = SH_NO_BLOCK;

// One call's view of a region: its size is read once and checked, and every
// offset read from the region is measured against it before it is followed.
struct Heap {
  char *base;
  uint32_t size;
  ShOutcome *out;
  // While set, every write is noted here so that it can be undone: a
  // resize whose allocation turns out to have met damage (only a damaged
  // region can do that) takes it back and writes nothing. An allocation
  // writes at most 12 words.
  struct Journal {
    uint32_t *word[16], old[16];
    int n;
  } * journal;

  // Every header write goes through here, so the kill test can stop a call
  // between any two of them.
  void Put(uint32_t &word, uint32_t value) const {
    if (journal) journal->word[journal->n] = &word, journal->old[journal->n++] = word;
    word = value;
    COFFER_KILL_POINT();
  }
  void Undo() const {
    while (journal->n > 0) --journal->n, *journal->word[journal->n] = journal->old[journal->n];
  }

  ShRegionHeader *head() const { return reinterpret_cast<ShRegionHeader *>(base); }
  ShBlockHeader *at(uint32_t off) const { return reinterpret_cast<ShBlockHeader *>(base + off); }

  // Record a refusal; false, so that checks can end in `return Damaged(...)`.
  bool Refuse(ShRefusal why, uint32_t off) const {
    *out = {why, off};
    return false;
  }
  bool Damaged(uint32_t off) const { return Refuse(ShRefusal::kDamaged, off); }

  // A block header fits at off: past the region header, aligned, inside.
  // (The walks test every link, so the ranges are one unsigned comparison.)
  bool Fits(uint32_t off) const { return off - kHead <= size - 2 * kHead && off % 4 == 0; }
  // A size the block at off (which fits) may have: at least a header, ending
  // inside the region, and a multiple of 4 unless the block is the last, so
  // that every successor is aligned.
  bool SizeFits(uint32_t off, uint32_t bs) const {
    return bs - kHead <= size - off - kHead && (bs % 4 == 0 || bs == size - off);
  }
  // The block at off (whose size fits) is not the last.
  bool HasSuccessor(uint32_t off) const { return at(off)->blockSize < size - off; }
};

bool Open(Heap *h, void *region, ShOutcome *out) {
  *out = {ShRefusal::kNone, 0};
  *h = {static_cast<char *>(region), static_cast<ShRegionHeader *>(region)->regionSize, out,
        nullptr};
  return h->size > kMinRegion || h->Damaged(0);
}

// ---- checks: read only ---------------------------------------------------------

// The block a free-list link leads to from `from` (kNone: from freeHead): a
// free block whose size fits and whose prevFree names `from`. A link that
// names no header in the region, or an allocated block, is the fault of the
// header holding it; anything else is the fault of the block it names.
bool ListStep(const Heap &h, uint32_t from, uint32_t off) {
  uint32_t holder = from == kNone ? 0 : from;
  if (!h.Fits(off)) return h.Damaged(holder);
  const ShBlockHeader *b = h.at(off);
  if (b->prevFree == from && b->nextFree != 0 && h.SizeFits(off, b->blockSize)) return true;
  return h.Damaged(SHBlockUseOf(b) == ShBlockUse::kAllocated ? holder : off);
}

// The free block at off can be unlinked: both its list neighbours (or
// freeHead) name it back.
bool Unlinkable(const Heap &h, uint32_t off) {
  const ShBlockHeader *b = h.at(off);
  bool prevOk = b->prevFree == kNone ? h.head()->freeHead == off
                                     : h.Fits(b->prevFree) && h.at(b->prevFree)->nextFree == off &&
                                           SHBlockUseOf(h.at(b->prevFree)) == ShBlockUse::kFree;
  bool nextOk =
      b->nextFree == kNone || (h.Fits(b->nextFree) && h.at(b->nextFree)->prevFree == off &&
                               SHBlockUseOf(h.at(b->nextFree)) == ShBlockUse::kFree);
  return (prevOk && nextOk) || h.Damaged(off);
}

// Walks the free list and stops at the second block that can hold r bytes;
// of the (at most) two, the lower one wins, which keeps the heap compact
// without the cost of a full best-fit scan. This is the hot loop, so a step
// checks what it follows: the link (a header in the region) and the back
// link. A size only steers the choice, and the caller checks the whole of
// the block it takes; a torn block's 0 link fails the next step. No sound
// list is longer than the blocks the region can hold, so a longer walk has
// met overlapping headers. The walk has checked the chosen block's next on
// the list unless it stopped at the chosen block itself.
bool FindFit(const Heap &h, uint32_t r, uint32_t *chosen, bool *nextChecked) {
  *chosen = kNone;
  *nextChecked = true;
  uint32_t from = kNone, budget = h.size / kHead + 1;
  for (uint32_t o = h.head()->freeHead; o != kNone; from = o, o = h.at(o)->nextFree) {
    if (!h.Fits(o)) return h.Damaged(from == kNone ? 0 : from);
    const ShBlockHeader *b = h.at(o);
    if (b->prevFree != from || --budget == 0)
      return h.Damaged(SHBlockUseOf(b) == ShBlockUse::kAllocated && from != kNone ? from : o);
    if (r > b->blockSize - kHead) continue;
    if (*chosen == kNone) {
      *chosen = o;
    } else {
      if (o < *chosen) *chosen = o, *nextChecked = false;
      break;
    }
  }
  return true;
}

// ptr is the payload of an allocated block of this region whose size fits.
bool Owned(const Heap &h, void *ptr, uint32_t *off) {
  uint32_t payload =
      static_cast<uint32_t>(reinterpret_cast<uintptr_t>(ptr) - reinterpret_cast<uintptr_t>(h.base));
  *off = payload - kHead;
  if (!h.Fits(*off)) return h.Refuse(ShRefusal::kNotAllocated, payload);
  const ShBlockHeader *b = h.at(*off);
  ShBlockUse use = SHBlockUseOf(b);
  // Free already: a second release.
  if (use == ShBlockUse::kFree) return h.Refuse(ShRefusal::kNotAllocated, payload);
  return (use == ShBlockUse::kAllocated && h.SizeFits(*off, b->blockSize)) || h.Damaged(*off);
}

// What releasing the block at off will join: the free blocks right after it
// (`after`) and right before it (`before`). Each is checked as a whole block
// on the list, and so are the block after them (whose prevBlockSize the
// release rewrites) and the list head (whose prevFree it rewrites). More than
// one free neighbour on a side is untidiness left by a release cut short.
struct Release {
  uint32_t off, after, before;
};

bool CheckAfter(const Heap &h, Release *rel) {
  uint32_t last = rel->off;
  for (uint32_t next; (next = last + h.at(last)->blockSize) != h.size; last = next) {
    if (!h.Fits(next)) return h.Damaged(last);
    const ShBlockHeader *b = h.at(next);
    if (b->prevBlockSize != h.at(last)->blockSize) return h.Damaged(next);
    ShBlockUse use = SHBlockUseOf(b);
    if (use == ShBlockUse::kAllocated) break;
    if (use == ShBlockUse::kTorn || !h.SizeFits(next, b->blockSize)) return h.Damaged(next);
    if (!Unlinkable(h, next)) return false;
    ++rel->after;  // offsets only grow, so this ends
  }
  return true;
}

bool CheckBefore(const Heap &h, Release *rel) {
  for (uint32_t cur = rel->off;; ++rel->before) {
    uint32_t pbs = h.at(cur)->prevBlockSize;
    if (pbs == 0) return cur == kHead || h.Damaged(cur);
    if (pbs < kHead || pbs % 4 != 0 || pbs > cur - kHead || h.at(cur - pbs)->blockSize != pbs)
      return h.Damaged(cur);
    cur -= pbs;
    ShBlockUse use = SHBlockUseOf(h.at(cur));
    if (use == ShBlockUse::kAllocated) return true;
    if (use == ShBlockUse::kTorn) return h.Damaged(cur);
    if (!Unlinkable(h, cur)) return false;  // offsets only shrink, so this ends
  }
}

bool CheckRelease(const Heap &h, Release *rel) {
  rel->after = rel->before = 0;
  if (!CheckAfter(h, rel) || !CheckBefore(h, rel)) return false;
  uint32_t first = h.head()->freeHead;
  return first == kNone || ListStep(h, kNone, first);
}

// ---- writes: only after the checks above ---------------------------------------

void Unlink(const Heap &h, uint32_t off) {
  ShBlockHeader *b = h.at(off);
  if (b->prevFree == kNone)
    h.Put(h.head()->freeHead, b->nextFree);
  else
    h.Put(h.at(b->prevFree)->nextFree, b->nextFree);
  if (b->nextFree != kNone) h.Put(h.at(b->nextFree)->prevFree, b->prevFree);
}

// Absorbs the free block at absorbed into the free block at keeper, which
// lies immediately before it. The absorbed header is left as it was: it is
// payload now.
void Merge(const Heap &h, uint32_t keeper, uint32_t absorbed) {
  Unlink(h, absorbed);
  ShBlockHeader *k = h.at(keeper);
  h.Put(k->blockSize, k->blockSize + h.at(absorbed)->blockSize);
  if (h.HasSuccessor(keeper)) h.Put(h.at(keeper + k->blockSize)->prevBlockSize, k->blockSize);
}

// Cuts need bytes off the front of the free block at off. The remainder is
// written whole before anything names it, and takes the block's place on the
// free list (the caller unlinks the front).
void Split(const Heap &h, uint32_t off, uint32_t need) {
  ShBlockHeader *b = h.at(off);
  uint32_t restOff = off + need;
  ShBlockHeader *rest = h.at(restOff);
  h.Put(rest->blockSize, b->blockSize - need);
  h.Put(rest->prevBlockSize, need);
  h.Put(rest->nextFree, b->nextFree);
  h.Put(rest->prevFree, off);
  if (b->nextFree != kNone) h.Put(h.at(b->nextFree)->prevFree, restOff);
  if (h.HasSuccessor(restOff))
    h.Put(h.at(restOff + rest->blockSize)->prevBlockSize, rest->blockSize);
  h.Put(b->blockSize, need);
  h.Put(b->nextFree, restOff);
}

// The block goes to the front of the free list, then joins the free blocks
// after it and is joined by those before it, the first of which keeps its
// place on the list.
void ApplyRelease(const Heap &h, const Release &rel) {
  ShBlockHeader *b = h.at(rel.off);
  uint32_t oldHead = h.head()->freeHead;
  h.Put(b->prevFree, kNone);
  h.Put(b->nextFree, oldHead);
  if (oldHead != kNone) h.Put(h.at(oldHead)->prevFree, rel.off);
  h.Put(h.head()->freeHead, rel.off);
  for (uint32_t i = 0; i < rel.after; ++i) Merge(h, rel.off, rel.off + b->blockSize);
  for (uint32_t i = 0, cur = rel.off; i < rel.before; ++i) {
    uint32_t prev = cur - h.at(cur)->prevBlockSize;
    Merge(h, prev, cur);
    cur = prev;
  }
}

// ---- the calls -------------------------------------------------------------------

void *Alloc(const Heap &h, size_t size) {
  // Rounding the three largest sizes up would wrap to 0.
  if (size > kLargestRoundable) return nullptr;
  uint32_t r = (static_cast<uint32_t>(size) + 3u) & ~3u;
  uint32_t off;
  bool nextChecked;
  if (h.head()->freeHead == kNone || !FindFit(h, r, &off, &nextChecked) || off == kNone)
    return nullptr;
  // A remainder of 16 bytes or less would be a block with no room, so the
  // whole block goes out instead. The fit leaves need <= blockSize. A split
  // rewrites the prevBlockSize of the block after, which must have room for
  // its header; the list neighbours it rewrites are checked.
  ShBlockHeader *b = h.at(off);
  uint32_t need = r + kHead, next = off + b->blockSize;
  bool split = need < b->blockSize - kHead;
  if (b->nextFree == 0 || !h.SizeFits(off, b->blockSize) ||
      (split && next != h.size && !h.Fits(next)))
    return h.Damaged(off), nullptr;
  if (!nextChecked && b->nextFree != kNone && !ListStep(h, off, b->nextFree)) return nullptr;
  if (split) Split(h, off, need);
  Unlink(h, off);
  h.Put(b->nextFree, 0);
  h.Put(b->prevFree, 0);
  return h.base + off + kHead;
}

bool Free(const Heap &h, void *ptr) {
  Release rel;
  if (!Owned(h, ptr, &rel.off) || !CheckRelease(h, &rel)) return false;
  ApplyRelease(h, rel);
  return true;
}

// Never in place: the new block is taken while the old one is held, so
// they never overlap. The release is checked before the allocation, so that
// a refusal leaves the region as it was, and again after it; on a sound
// region the allocation writes only checked words and the second check
// passes, while on a damaged one it may not, and the allocation is undone.
// The copy comes last: a release writes headers only, never the payload.
void *Realloc(const Heap &h, void *ptr, size_t size, bool *changed) {
  *changed = false;
  if (!ptr) {
    void *p = Alloc(h, size);
    *changed = p != nullptr;
    return p;
  }
  Release rel;
  if (!Owned(h, ptr, &rel.off) || !CheckRelease(h, &rel)) return nullptr;
  if (size == 0) {
    ApplyRelease(h, rel);
    *changed = true;
    return nullptr;
  }
  uint32_t capacity = h.at(rel.off)->blockSize - kHead;
  if (capacity == size) return ptr;
  Heap::Journal journal;
  journal.n = 0;
  Heap logged = h;
  logged.journal = &journal;
  void *q = Alloc(logged, size);
  if (!q) return nullptr;
  if (!CheckRelease(h, &rel)) return logged.Undo(), nullptr;
  ApplyRelease(h, rel);
  std::memmove(q, ptr, capacity < size ? capacity : size);
  *changed = true;
  return q;
}

// A checking build checks the whole region after every call that changed
// it and stops at once when the region is damaged. Only calls that went
// through are checked: a refused call wrote nothing. A call that went
// through on a region damaged where it did not look stops here too, so the
// tests that expect such calls to go on (the kill test, the fuzz targets)
// build the heap without this check.
void CheckAfterCall([[maybe_unused]] const Heap &h) {
  COFFER_CHECK("region heap", SHCheckSound, h.base, h.size);
}

}  // namespace

void *SHAllocChecked(void *region, size_t size, ShOutcome *out) {
  Heap h;
  if (!Open(&h, region, out)) return nullptr;
  void *p = Alloc(h, size);
  if (p) CheckAfterCall(h);
  return p;
}

void SHFreeChecked(void *region, void *ptr, ShOutcome *out) {
  Heap h;
  if (!Open(&h, region, out) || !ptr) return;
  if (Free(h, ptr)) CheckAfterCall(h);
}

void *SHReallocChecked(void *region, void *ptr, size_t size, ShOutcome *out) {
  Heap h;
  if (!Open(&h, region, out)) return nullptr;
  bool changed;
  void *p = Realloc(h, ptr, size, &changed);
  if (changed && out->refusal == ShRefusal::kNone) CheckAfterCall(h);
  return p;
}

}  // namespace coffer

using namespace coffer;

extern "C" COFFER_API int32_t SH_Reset(void *region, size_t size) {
  if (size <= kMinRegion) return -1;
  ShRegionHeader *h = static_cast<ShRegionHeader *>(region);
  h->regionSize = size;
  h->freeHead = kHead;
  ShBlockHeader *b = reinterpret_cast<ShBlockHeader *>(static_cast<char *>(region) + kHead);
  b->blockSize = size - kHead;
  b->prevBlockSize = 0;
  b->nextFree = SH_NO_BLOCK;
  b->prevFree = SH_NO_BLOCK;
  return 0;
}

extern "C" COFFER_API void *SH_Alloc(void *region, size_t size) {
  ShOutcome out;
  return SHAllocChecked(region, size, &out);
}

extern "C" COFFER_API void SH_Free(void *region, void *ptr) {
  ShOutcome out;
  SHFreeChecked(region, ptr, &out);
}

extern "C" COFFER_API void *SH_Realloc(void *region, void *ptr, size_t size) {
  ShOutcome out;
  return SHReallocChecked(region, ptr, size, &out);
}
