// SPDX-License-Identifier: MIT
/* A user's program: one header, a lock of the platform layer (unless PLAIN,
 * for a link with -lcoffer alone) and a container in a locked region. */
#include <coffer/coffer.h>
#include <stdio.h>

int main(void) {
  static TandelExclLock lock; /* all zero: a default, in-process mutex */
  static char region[4096];
  MemPool pool;
  int32_t at = -1;
#ifndef PLAIN
  if (Tandel_InitExclLock(&lock) != 0) return 1;
#endif
  MemPool_InitOnSharedHeap(&pool, region, sizeof region, &lock);
  EsaArray *arr = ESA_AllocArrayEx(&pool, 2, 2);
  if (!arr || !ESA_Insert(arr, "key", 7) || !ESA_Find(arr, "key", &at)) return 1;
  printf("coffer %s: %u\n", COFFER_VERSION_STRING, (unsigned)ESA_GetVal(arr, at));
  ESA_FreeArray(arr);
  return COFFER_VERSION_MAJOR == 1 ? 0 : 1;
}
