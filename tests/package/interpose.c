// SPDX-License-Identifier: MIT
/* A program's own Panic replaces the platform layer's for the library: the
 * library reaches it through the dynamic linker. */
#include <coffer/coffer.h>
#include <setjmp.h>
#include <stdarg.h>
#include <stdio.h>
#include <string.h>

static jmp_buf panicked;
static char message[128];

void Panic(const char *format, ...) {
  va_list args;
  va_start(args, format);
  vsnprintf(message, sizeof message, format, args);
  va_end(args);
  longjmp(panicked, 1);
}

int main(void) {
  MemPool pool;
  MemPool_InitOnStdHeap(&pool);
  if (setjmp(panicked) == 0) pool.calloc(&pool, 0x10000, 0x10000);
  return strcmp(message, "MemPoolStdHeapCalloc: integer overflow (65536, 65536") != 0;
}
