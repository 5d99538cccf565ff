/* coffer sorted string array: (key, value) entries in strcmp order of their
 * keys, found by bisection. Equal keys are allowed and keep insertion order.
 * The data record, entry block and key copies all live in the array's pool. */
#ifndef COFFER_ESA_H
#define COFFER_ESA_H

#include <coffer/mempool.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef CollectionHeader EsaArray;

/* Pool-resident records (a shared-memory format). */
typedef struct EsaArrayData {
  PoolOffset entries;        /* the entry block; 0 when there is none */
  int32_t size;              /* entries in use */
  int32_t capacity;          /* slots in the entry block */
  int32_t capacityIncrement; /* growth step, and the slack that shrinks */
} EsaArrayData;

typedef struct EsaEntry {
  PoolOffset key; /* the array's own copy of the key */
  CofferVal val;
} EsaEntry;

COFFER_API EsaArray *ESA_AllocArray(int32_t initialCapacity, int32_t capacityIncrement);
COFFER_API EsaArray *ESA_AllocArrayEx(MemPool *pool, int32_t initialCapacity,
                                      int32_t capacityIncrement);
COFFER_API bool ESA_CreateArrayData(EsaArray *arr, int32_t initialCapacity,
                                    int32_t capacityIncrement);
COFFER_API void ESA_FreeArray(EsaArray *arr);
COFFER_API int32_t ESA_GetSize(EsaArray *arr);
COFFER_API void ESA_SetCapacityIncrement(EsaArray *arr, int32_t capacityIncrement);
COFFER_API FreeValFn ESA_SetFreeValFn(EsaArray *arr, FreeValFn fn);
COFFER_API MpFreeValFn ESA_SetMpFreeValFn(EsaArray *arr, MpFreeValFn fn);
/* Entry pointers stay valid until the next insertion or removal. */
COFFER_API EsaEntry *ESA_Get(EsaArray *arr, int32_t index);
COFFER_API const char *ESA_GetKey(EsaArray *arr, int32_t index);
COFFER_API CofferVal ESA_GetVal(EsaArray *arr, int32_t index);
COFFER_API bool ESA_SetVal(EsaArray *arr, int32_t index, CofferVal val);
COFFER_API bool ESA_Insert(EsaArray *arr, const char *key, CofferVal val);
COFFER_API bool ESA_Find(EsaArray *arr, const char *key, int32_t *outIndex);
COFFER_API bool ESA_Remove(EsaArray *arr, int32_t index);
COFFER_API bool ESA_RemoveRange(EsaArray *arr, int32_t first, int32_t end);
COFFER_API bool ESA_Clear(EsaArray *arr);

#ifdef __cplusplus
}
#endif

#endif
