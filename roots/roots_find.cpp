// SPDX-License-Identifier: MIT
// Reading a directory of named roots, and judging the records it names, in
// a region whose bytes may be stale, damaged or hostile: every offset is
// checked against the region before it is followed, and every walk is
// bounded by the region's size.
#include <cstddef>
#include <cstring>

#include "esa/esa_internal.h"
#include "hst/hst_internal.h"
#include "mempool/region_heap.h"
#include "rbt/rbt_internal.h"
#include "roots/roots_internal.h"

static_assert(sizeof(RootsDirectory) == 20, "RootsDirectory is 20 bytes");
static_assert(offsetof(RootsDirectory, magic) == 0 && offsetof(RootsDirectory, self) == 4 &&
                  offsetof(RootsDirectory, entries) == 8 && offsetof(RootsDirectory, count) == 12 &&
                  offsetof(RootsDirectory, capacity) == 16,
              "RootsDirectory layout");
static_assert(sizeof(RootsEntry) == 48, "RootsEntry is 48 bytes");
static_assert(offsetof(RootsEntry, name) == 0 && offsetof(RootsEntry, kind) == 40 &&
                  offsetof(RootsEntry, record) == 44,
              "RootsEntry layout");

namespace coffer {
namespace {

constexpr uint32_t kHead = sizeof(ShBlockHeader);

// Whether a block starts at off, found by walking the tiling from the first
// block. Each step moves at least a header forward, so the walk ends.
bool Reaches(RegionView v, uint32_t off) {
  uint32_t o = kHead;
  while (o < off) {
    if (!v.Holds(o, kHead)) return false;
    const uint32_t size = v.At<ShBlockHeader>(o)->blockSize;
    if (size < kHead || size % 4 != 0 || size > v.limit - o) return false;
    o += size;
  }
  return o == off;
}

// The payload at payload is that of a block marked allocated with room for
// bytes, judged from the block's own header only: constant time, no walk,
// for the records the directory names.
bool LooksAllocated(RegionView v, uint32_t payload, uint32_t bytes) {
  if (payload < 2 * kHead || !v.Holds(payload - kHead, kHead + uint64_t{bytes})) return false;
  const ShBlockHeader *b = v.At<ShBlockHeader>(payload - kHead);
  return SHBlockUseOf(b) == ShBlockUse::kAllocated && b->blockSize >= kHead + bytes &&
         b->blockSize <= v.limit - (payload - kHead);
}

// The same, and the tiling reaches the block, so its header is no stale
// word inside another block's payload: for the directory and its entries.
bool IsAllocated(RegionView v, uint32_t payload, uint32_t bytes) {
  return LooksAllocated(v, payload, bytes) && Reaches(v, payload - kHead);
}

bool EntryNameSound(const RootsEntry &e) {
  return e.name[0] != '\0' && std::memchr(e.name, 0, sizeof e.name) != nullptr;
}

const char *EntriesFault(RegionView v, const RootsDirectory *dir) {
  const RootsEntry *e = RootsEntries(v, dir);
  for (int32_t i = 0; i < dir->count; i++) {
    if (!EntryNameSound(e[i])) return "a root's name is empty or unterminated";
    if (i > 0 && std::strcmp(e[i - 1].name, e[i].name) >= 0) return "roots out of name order";
    if (!RootsKindName(e[i].kind)) return "a root of no known kind";
    if (!v.Holds(e[i].record, 4)) return "a root's record lies outside the region";
  }
  return nullptr;
}

const char *ArrayFault(RegionView v, PoolOffset off) {
  const EsaArrayData *d = v.At<EsaArrayData>(off);
  if (d->size < 0 || d->size > d->capacity) return "size outside 0 .. capacity";
  if (d->capacity > 0 && !v.Holds(d->entries, uint64_t{sizeof(EsaEntry)} * d->capacity))
    return "entry block outside the region";
  return nullptr;
}

const char *RbtFault(RegionView v, PoolOffset off) {
  const RbtTreeData *d = v.At<RbtTreeData>(off);
  if (!v.Holds(d->nil, sizeof(RbtNode))) return "sentinel outside the region";
  if (d->root != d->nil && !v.Holds(d->root, sizeof(RbtNode))) return "root outside the region";
  CollectionHeader h = HandleAt(v, off);
  if (!RBTSentinelSound(RbtCtx(&h))) return "sentinel changed";
  return nullptr;
}

const char *HstFault(RegionView v, PoolOffset off) {
  const HstTreeData *d = v.At<HstTreeData>(off);
  if (d->size < 1) return "size below 1";
  if (!v.Holds(d->root, sizeof(HstNode))) return "root outside the region";
  const HstNode *root = v.At<HstNode>(d->root);
  if (root->parent != 0 || root->key < sizeof(ShRegionHeader) || root->key >= v.limit ||
      *v.At<char>(root->key) != 0)
    return "root with a parent or a name";
  return nullptr;
}

// The checks run in two groups. Until the record is known to be an allocated
// block with the directory's magic and its own offset, failing words are
// taken for words left from before a format (stale); past that, for damage.
const char *DirectoryFault(RegionView v, const RootsDirectory **out, bool *stale) {
  *stale = true;
  if (v.limit < sizeof(ShRegionHeader) || v.At<ShRegionHeader>(0)->reserved[0] != ROOTS_REGION_MAGIC)
    return "no directory";
  const PoolOffset off = v.At<ShRegionHeader>(0)->reserved[1];
  const RootsDirectory *dir = v.At<RootsDirectory>(off);
  if (!v.Holds(off, sizeof *dir)) return "directory outside the region";
  if (!IsAllocated(v, off, sizeof *dir))
    return "directory not in an allocated block (left from before a format?)";
  if (dir->magic != ROOTS_DIRECTORY_MAGIC || dir->self != off) return "no directory record there";
  *stale = false;
  const uint64_t bytes = uint64_t{sizeof(RootsEntry)} * static_cast<uint32_t>(dir->capacity);
  if (dir->count < 0 || dir->count > dir->capacity || (dir->capacity > 0 && !v.Holds(dir->entries, bytes)))
    return "directory sizes damaged";
  if (dir->capacity > 0 && !IsAllocated(v, dir->entries, static_cast<uint32_t>(bytes)))
    return "directory entries not in an allocated block";
  *out = dir;
  return EntriesFault(v, dir);
}

}  // namespace

CollectionHeader HandleAt(RegionView v, PoolOffset off) {
  CollectionHeader h;
  std::memset(&h, 0, sizeof h);
  h.mp.base = const_cast<char *>(v.base);
  h.data = const_cast<char *>(v.At<char>(off));
  return h;
}

RegionView ViewOfPool(const MemPool *pool) {
  const auto *h = static_cast<const ShRegionHeader *>(pool->base);
  return RegionView{static_cast<const char *>(pool->base), h ? h->regionSize : 0};
}

RegionView ViewOfImage(const void *image, size_t mapped) {
  const auto *h = static_cast<const ShRegionHeader *>(image);
  uint32_t limit = mapped < sizeof *h ? 0 : h->regionSize;
  if (limit > mapped) limit = static_cast<uint32_t>(mapped);
  return RegionView{static_cast<const char *>(image), limit};
}

const RootsDirectory *RootsFindDirectory(RegionView v, const char **why, bool *stale) {
  const RootsDirectory *dir = nullptr;
  bool isStale;
  const char *fault = DirectoryFault(v, &dir, &isStale);
  if (why) *why = fault;
  if (stale) *stale = fault && isStale;
  return fault ? nullptr : dir;
}

bool RootsSearch(RegionView v, const RootsDirectory *dir, const char *name, int32_t *at) {
  const RootsEntry *e = RootsEntries(v, dir);
  int32_t lo = 0, hi = dir->count;
  while (lo < hi) {
    const int32_t mid = lo + (hi - lo) / 2;
    if (std::strcmp(e[mid].name, name) < 0)
      lo = mid + 1;
    else
      hi = mid;
  }
  *at = lo;
  return lo < dir->count && std::strcmp(e[lo].name, name) == 0;
}

const char *RootsRecordFault(RegionView v, uint32_t kind, PoolOffset off) {
  static const uint32_t kBytes[] = {0, sizeof(EsaArrayData), sizeof(RbtTreeData), sizeof(RbtTreeData),
                                    sizeof(RbtTreeData), sizeof(HstTreeData)};
  if (!RootsKindName(kind)) return "no such kind";
  if (!LooksAllocated(v, off, kBytes[kind])) return "not the payload of an allocated block";
  if (kind == ROOTS_KIND_ARRAY) return ArrayFault(v, off);
  if (kind == ROOTS_KIND_HST) return HstFault(v, off);
  return RbtFault(v, off);
}

namespace {
const char *const kKindNames[] = {nullptr, "array", "rbt", "rbt-int32", "rbt-voidptr", "hst"};
}

const char *RootsKindName(uint32_t kind) { return kind >= 1 && kind <= 5 ? kKindNames[kind] : nullptr; }

uint32_t RootsKindNamed(const char *name) {
  for (uint32_t k = 1; k <= 5; k++)
    if (std::strcmp(kKindNames[k], name) == 0) return k;
  return 0;
}

}  // namespace coffer
