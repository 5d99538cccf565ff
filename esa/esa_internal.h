// SPDX-License-Identifier: MIT
// Internal operations of the sorted string array, visible to its tests and to
// the string tree, which searches and fills the child arrays of its nodes.
#ifndef COFFER_ESA_INTERNAL_H
#define COFFER_ESA_INTERNAL_H

#include <coffer/esa.h>

#include "mempool/check.h"
#include "mempool/pool.h"

namespace coffer {

// The array's one place where offsets become records. Any handle on the
// array's pool converts them: the string tree reads the child arrays of its
// nodes through its own handle, without building one for each array.
inline EsaArrayData *Data(const EsaArray *arr) { return static_cast<EsaArrayData *>(arr->data); }
inline EsaEntry *EntriesOf(const CollectionHeader *h, const EsaArrayData *d) {
  return RecordAt<EsaEntry>(h, d->entries);
}
inline EsaEntry *EntriesOf(const EsaArray *arr) { return EntriesOf(arr, Data(arr)); }
inline const char *KeyOf(const EsaArray *arr, const EsaEntry *e) { return RecordAt<char>(arr, e->key); }

// Invariants of an array between calls: 0 <= size <= capacity; an entry
// block exists whenever there are slots; every entry in use holds a key copy,
// and the keys ascend in strcmp order. Equal keys keep their insertion order,
// which no structure records, so only the order itself is checked. With a
// span, every record and key must lie in it (see CheckSpan).
bool ESACheckArray(const EsaArray *arr, CheckFault *fault,
                   const CheckSpan *span = nullptr);  // true for no data

// Reallocates the entry block to n slots. Refuses a negative count or one
// whose byte size does not fit in 32 bits; a shrink to 0 slots always works.
bool ESAResize(EsaArray *arr, int32_t n);

// Moves entries from .. to - 1 so that they start at dest (overlap allowed);
// nothing unless from < to.
void ESAShiftEntries(EsaArray *arr, int32_t from, int32_t to, int32_t dest);

// ESA_Insert at a slot the caller has found already, which must keep the
// entries in order: the entry block grows first if it is full, then the key
// is copied, then the entries from index on move up. False, with the entries
// where they were, when the pool refuses.
bool ESAInsertAt(EsaArray *arr, int32_t index, const char *key, CofferVal val);

}  // namespace coffer

#endif
