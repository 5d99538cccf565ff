// SPDX-License-Identifier: MIT
// Sorted string array: entries kept in strcmp order of their keys, found by
// bisection. The entry block grows linearly by capacityIncrement slots and
// shrinks straight to the entries in use once the slack reaches that step.
#include <climits>
#include <cstddef>
#include <cstring>

#include "esa/esa_internal.h"

static_assert(sizeof(EsaArrayData) == 16, "EsaArrayData is 16 bytes");
static_assert(offsetof(EsaArrayData, entries) == 0 && offsetof(EsaArrayData, size) == 4 &&
                  offsetof(EsaArrayData, capacity) == 8 &&
                  offsetof(EsaArrayData, capacityIncrement) == 12,
              "EsaArrayData layout");
static_assert(sizeof(EsaEntry) == 8 && offsetof(EsaEntry, key) == 0 && offsetof(EsaEntry, val) == 4,
              "EsaEntry layout");

namespace coffer {
namespace {

// The growth and shrink step. An increment below 1 would let growth add no
// slot and an insertion write past the block, so such an increment counts
// as 1.
inline int32_t Step(const EsaArrayData *d) {
  return d->capacityIncrement > 0 ? d->capacityIncrement : 1;
}

inline bool InRange(const EsaArray *arr, int32_t index) {
  return index >= 0 && index < Data(arr)->size;
}

// Drops the entry's value through the handle's callback, then its key copy.
// The callback fields are read afresh for every entry.
void ReleaseEntry(EsaArray *arr, EsaEntry *e) {
  DropValue(arr, e->val);
  PoolFree(arr, RecordAt<char>(arr, e->key));
}

// After a removal: shrink to exactly the entries in use once the slack
// reaches the step. A refused shrink leaves the block as it was.
void ShrinkIfSlack(EsaArray *arr) {
  EsaArrayData *d = Data(arr);
  if (d->capacity - d->size >= Step(d)) ESAResize(arr, d->size);
}

}  // namespace

bool ESAResize(EsaArray *arr, int32_t n) {
  if (n < 0 || static_cast<uint32_t>(n) > UINT32_MAX / sizeof(EsaEntry)) return false;
  EsaArrayData *d = Data(arr);
  void *block = PoolRealloc(arr, OffsetToAddr(&arr->mp, d->entries), n * sizeof(EsaEntry));
  if (!block && n > 0) return false;
  d->entries = OffsetOf(arr, block);
  d->capacity = n;
  return true;
}

void ESAShiftEntries(EsaArray *arr, int32_t from, int32_t to, int32_t dest) {
  if (from >= to) return;
  EsaEntry *e = EntriesOf(arr);
  std::memmove(e + dest, e + from, (to - from) * sizeof(EsaEntry));
}

bool ESAInsertAt(EsaArray *arr, int32_t index, const char *key, CofferVal val) {
  EsaArrayData *d = Data(arr);
  if (d->size == d->capacity) {
    int32_t step = Step(d);
    if (d->size > INT32_MAX - step || !ESAResize(arr, d->size + step)) return false;
  }
  // The key copy is made before any entry moves, so a refusal leaves the
  // entries where they were (a grown capacity stays grown).
  char *copy = PoolStrdup(arr, key);
  if (!copy) return false;
  ESAShiftEntries(arr, index, d->size, index + 1);
  EsaEntry *e = EntriesOf(arr) + index;
  e->key = OffsetOf(arr, copy);
  e->val = val;
  d->size++;
  return true;
}

}  // namespace coffer

using namespace coffer;

extern "C" {

EsaArray *ESA_AllocArrayEx(MemPool *pool, int32_t initialCapacity, int32_t capacityIncrement) {
  EsaArray *arr = AllocHandle(pool);
  if (!arr) return nullptr;
  if (!ESA_CreateArrayData(arr, initialCapacity, capacityIncrement)) {
    ESA_FreeArray(arr);
    return nullptr;
  }
  return arr;
}

EsaArray *ESA_AllocArray(int32_t initialCapacity, int32_t capacityIncrement) {
  MemPool pool;
  MemPool_InitOnStdHeap(&pool);
  return ESA_AllocArrayEx(&pool, initialCapacity, capacityIncrement);
}

bool ESA_CreateArrayData(EsaArray *arr, int32_t initialCapacity, int32_t capacityIncrement) {
  COFFER_CHECK_ON_RETURN("sorted string array", ESACheckArray, arr);
  arr->data = nullptr;
  // A negative capacity has no meaning; refuse it before anything is made.
  if (initialCapacity < 0) return false;
  arr->data = PoolCalloc(arr, sizeof(EsaArrayData));
  if (!arr->data) return false;
  if (!ESAResize(arr, initialCapacity)) {
    PoolFree(arr, arr->data);
    arr->data = nullptr;
    return false;
  }
  Data(arr)->capacityIncrement = capacityIncrement;
  return true;
}

void ESA_FreeArray(EsaArray *arr) {
  if (!arr) return;
  if (EsaArrayData *d = Data(arr)) {
    ESA_Clear(arr);
    if (d->entries) PoolFree(arr, EntriesOf(arr));
    PoolFree(arr, d);
  }
  ReleaseHandle(arr);
}

int32_t ESA_GetSize(EsaArray *arr) { return Data(arr)->size; }

void ESA_SetCapacityIncrement(EsaArray *arr, int32_t capacityIncrement) {
  Data(arr)->capacityIncrement = capacityIncrement;
}

FreeValFn ESA_SetFreeValFn(EsaArray *arr, FreeValFn fn) { return SetFreeValFn(arr, fn); }

MpFreeValFn ESA_SetMpFreeValFn(EsaArray *arr, MpFreeValFn fn) { return SetMpFreeValFn(arr, fn); }

EsaEntry *ESA_Get(EsaArray *arr, int32_t index) {
  return InRange(arr, index) ? EntriesOf(arr) + index : nullptr;
}

const char *ESA_GetKey(EsaArray *arr, int32_t index) {
  return InRange(arr, index) ? KeyOf(arr, EntriesOf(arr) + index) : nullptr;
}

CofferVal ESA_GetVal(EsaArray *arr, int32_t index) {
  return InRange(arr, index) ? EntriesOf(arr)[index].val : 0;
}

bool ESA_SetVal(EsaArray *arr, int32_t index, CofferVal val) {
  if (!InRange(arr, index)) return false;
  EntriesOf(arr)[index].val = val;  // the old value stays the caller's
  return true;
}

bool ESA_Insert(EsaArray *arr, const char *key, CofferVal val) {
  COFFER_CHECK_ON_RETURN("sorted string array", ESACheckArray, arr);
  EsaArrayData *d = Data(arr);
  // Bisect to the slot after every key <= the new one, so equal keys keep
  // their insertion order.
  EsaEntry *e = EntriesOf(arr);
  int32_t low = 0, high = d->size - 1;
  while (low <= high) {
    int32_t middle = low + (high - low) / 2;
    if (std::strcmp(key, KeyOf(arr, e + middle)) < 0)
      high = middle - 1;
    else
      low = middle + 1;
  }
  return ESAInsertAt(arr, low, key, val);
}

bool ESA_Find(EsaArray *arr, const char *key, int32_t *outIndex) {
  EsaArrayData *d = Data(arr);
  EsaEntry *e = EntriesOf(arr);
  int32_t low = 0, high = d->size - 1;
  while (low <= high) {
    int32_t middle = low + (high - low) / 2;
    int cmp = std::strcmp(key, KeyOf(arr, e + middle));
    if (cmp == 0) {
      *outIndex = middle;
      return true;
    }
    if (cmp > 0)
      low = middle + 1;
    else
      high = middle - 1;
  }
  return false;
}

bool ESA_Remove(EsaArray *arr, int32_t index) {
  COFFER_CHECK_ON_RETURN("sorted string array", ESACheckArray, arr);
  if (!InRange(arr, index)) return false;
  EsaArrayData *d = Data(arr);
  ReleaseEntry(arr, EntriesOf(arr) + index);
  ESAShiftEntries(arr, index + 1, d->size, index);
  d->size--;
  ShrinkIfSlack(arr);
  return true;
}

bool ESA_RemoveRange(EsaArray *arr, int32_t first, int32_t end) {
  COFFER_CHECK_ON_RETURN("sorted string array", ESACheckArray, arr);
  EsaArrayData *d = Data(arr);
  if (!(first < end && end <= d->size && first >= 0)) return false;
  for (int32_t i = first; i < end; i++) ReleaseEntry(arr, EntriesOf(arr) + i);
  ESAShiftEntries(arr, end, d->size, first);
  d->size -= end - first;
  ShrinkIfSlack(arr);
  return true;
}

bool ESA_Clear(EsaArray *arr) { return ESA_RemoveRange(arr, 0, Data(arr)->size); }

}  // extern "C"
