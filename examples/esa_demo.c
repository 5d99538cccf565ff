// SPDX-License-Identifier: MIT
/* A sorted string array on the process heap, with a release callback. */
#include <coffer/esa.h>
#include <stdio.h>

static void release(CofferVal val) { printf("  released value %u\n", (unsigned)val); }

static void show(EsaArray *arr) {
  int32_t i;
  for (i = 0; i < ESA_GetSize(arr); i++)
    printf("  [%d] %-8s -> %u\n", (int)i, ESA_GetKey(arr, i), (unsigned)ESA_GetVal(arr, i));
}

int main(void) {
  static const char *fruit[] = {"pear", "apple", "fig", "Quince", "apple", "kiwi"};
  EsaArray *arr = ESA_AllocArray(4, 4);
  int32_t at = -1;
  unsigned i;
  if (!arr) return 1;
  ESA_SetFreeValFn(arr, release);

  printf("inserting:");
  for (i = 0; i < sizeof fruit / sizeof fruit[0]; i++) {
    printf(" %s=%u", fruit[i], i + 1);
    ESA_Insert(arr, fruit[i], i + 1);
  }
  printf("\nin strcmp order (equal keys keep their insertion order):\n");
  show(arr);

  if (ESA_Find(arr, "fig", &at)) printf("found fig at %d with value %u\n", (int)at, (unsigned)ESA_GetVal(arr, at));
  ESA_SetVal(arr, at, 30);
  printf("fig now holds %u (replacing a value releases nothing)\n", (unsigned)ESA_GetVal(arr, at));

  printf("removing entry 0 (%s):\n", ESA_GetKey(arr, 0));
  ESA_Remove(arr, 0);
  printf("removing entries 1..2:\n");
  ESA_RemoveRange(arr, 1, 3);
  show(arr);
  printf("freeing the array:\n");
  ESA_FreeArray(arr);
  return 0;
}
