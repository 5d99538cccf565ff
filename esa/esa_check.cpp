// SPDX-License-Identifier: MIT
// The sorted string array's invariant checker (see esa_internal.h).
#include <cstring>

#include "esa/esa_internal.h"

bool coffer::ESACheckArray(const EsaArray *arr, CheckFault *fault, const CheckSpan *span) {
  const EsaArrayData *d = Data(arr);
  if (!d) return true;
  const PoolOffset at = OffsetOf(arr, d);
  if (!SpanHolds(span, at, sizeof *d)) return Fault(fault, "record outside the region", at);
  if (d->size < 0 || d->size > d->capacity) return Fault(fault, "size outside 0 .. capacity", at);
  if (d->capacity > 0 && d->entries == 0) return Fault(fault, "slots without an entry block", at);
  if (d->capacity > 0 && !SpanHolds(span, d->entries, uint64_t{sizeof(EsaEntry)} * d->capacity))
    return Fault(fault, "entry block outside the region", at);
  const EsaEntry *e = EntriesOf(arr);
  for (int32_t i = 0; i < d->size; i++) {
    if (e[i].key == 0) return Fault(fault, "entry without a key", d->entries + 8 * i);
    if (!SpanHoldsString(span, &arr->mp, e[i].key))
      return Fault(fault, "key outside the region", d->entries + 8 * i);
    if (i > 0 && std::strcmp(KeyOf(arr, e + i - 1), KeyOf(arr, e + i)) > 0)
      return Fault(fault, "keys out of order", d->entries + 8 * i);
  }
  return true;
}
