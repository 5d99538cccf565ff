/* coffer platform layer: fatal reports and a process-shared exclusive lock.
 *
 * This small library sits under libcoffer.so. libcoffer reaches every call
 * below through the dynamic linker, so a program may interpose its own
 * Panic or lock calls by defining them itself. */
#ifndef COFFER_PLATFORM_H
#define COFFER_PLATFORM_H

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#define COFFER_PLATFORM_API __attribute__((visibility("default")))

/* Formats its arguments printf-style to standard error, ends the line and
 * aborts the process. Never returns. */
COFFER_PLATFORM_API void Panic(const char *format, ...)
    __attribute__((noreturn, format(printf, 1, 2)));

/* Storage for one exclusive lock, kept in caller memory (a shared region
 * included). Its contents are private to the platform layer. */
typedef union TandelExclLock {
  unsigned char opaque[32];
  int64_t align;
} TandelExclLock;

/* Initialises a process-shared, robust lock in caller memory: every process
 * that maps the memory can use it, and a lock whose holder died is recovered
 * by the next acquirer. Returns 0 on success, an errno value otherwise. */
COFFER_PLATFORM_API int Tandel_InitExclLock(TandelExclLock *lock);

/* Destroys a lock made by Tandel_InitExclLock. Returns 0 or an errno value. */
COFFER_PLATFORM_API int Tandel_DestroyExclLock(TandelExclLock *lock);

/* The handle is the lock's address. Acquire returns once the caller holds the
 * lock; a lock left by a dead holder is made consistent and then held.
 * Both return 0 on success or an errno value. */
COFFER_PLATFORM_API int Tandel_AcquireExclLock(void *lock);
COFFER_PLATFORM_API int Tandel_ReleaseExclLock(void *lock);

#ifdef __cplusplus
}
#endif

#endif
