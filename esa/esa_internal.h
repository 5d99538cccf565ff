// Internal operations of the sorted string array, visible to its tests.
#ifndef COFFER_ESA_INTERNAL_H
#define COFFER_ESA_INTERNAL_H

#include <coffer/esa.h>

namespace coffer {

// Reallocates the entry block to n slots. Refuses a negative count or one
// whose byte size does not fit in 32 bits; a shrink to 0 slots always works.
bool ESAResize(EsaArray *arr, int32_t n);

// Moves entries from .. to - 1 so that they start at dest (overlap allowed);
// nothing unless from < to.
void ESAShiftEntries(EsaArray *arr, int32_t from, int32_t to, int32_t dest);

}  // namespace coffer

#endif
