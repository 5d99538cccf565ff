// SPDX-License-Identifier: MIT
/** @file
 * coffer platform layer: fatal reports and a process-shared exclusive lock.
 *
 * This small library, libcoffer-platform.so, sits under libcoffer.so.
 * libcoffer reaches Panic and the lock calls through the dynamic linker, so a
 * program may interpose its own by defining them itself (with the same
 * behaviour: a Panic of its own must not return either).
 */
#ifndef COFFER_PLATFORM_H
#define COFFER_PLATFORM_H

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/** Marks an exported call of libcoffer-platform.so. */
#define COFFER_PLATFORM_API __attribute__((visibility("default")))

/**
 * Reports a fatal condition and ends the process: formats its arguments
 * printf-style to standard error, ends the line and calls abort(). The
 * process-heap and shared-heap pools call it when memory is exhausted.
 *
 * @param format  a printf format.
 * @param ...     its arguments.
 * @par Ownership
 * Nothing is released: the process ends.
 * @par Failure
 * None.
 * @par Panic
 * This is the panic: it never returns.
 */
COFFER_PLATFORM_API void Panic(const char *format, ...)
    __attribute__((noreturn, format(printf, 1, 2)));

/** Storage for one exclusive lock, kept in caller memory (a shared region
 * included). Its contents are private to the platform layer. */
typedef union TandelExclLock {
  unsigned char opaque[32];
  int64_t align;
} TandelExclLock;

/**
 * Makes a process-shared, robust lock in caller memory: every process that
 * maps the memory can use it, and a lock whose holder died is recovered by
 * the next acquirer. Initialise it once, in one process, before any use.
 *
 * @param lock  the storage, in memory every user of the lock maps.
 * @return 0, or an errno value.
 * @par Ownership
 * The storage stays the caller's; end the lock with Tandel_DestroyExclLock
 * once no process uses it.
 * @par Failure
 * An errno value; the storage holds no usable lock.
 * @par Panic
 * Never.
 */
COFFER_PLATFORM_API int Tandel_InitExclLock(TandelExclLock *lock);

/**
 * Ends a lock made by Tandel_InitExclLock. Nobody may hold or wait for it.
 *
 * @param lock  the lock.
 * @return 0, or an errno value.
 * @par Ownership
 * The storage is the caller's again, free for any use.
 * @par Failure
 * An errno value; the lock is left as it was.
 * @par Panic
 * Never.
 */
COFFER_PLATFORM_API int Tandel_DestroyExclLock(TandelExclLock *lock);

/**
 * Waits until the caller holds the lock. The lock is not recursive: a thread
 * that holds it must not acquire it again. If the previous holder died while
 * holding it, the lock is made consistent and held; what it guarded may then
 * be half-changed.
 *
 * @param lock  the lock's address (the handle a shared-heap pool keeps).
 * @return 0, or an errno value.
 * @par Ownership
 * The caller holds the lock until Tandel_ReleaseExclLock.
 * @par Failure
 * An errno value; the lock is not held.
 * @par Panic
 * Never.
 */
COFFER_PLATFORM_API int Tandel_AcquireExclLock(void *lock);

/**
 * Releases a lock the caller holds.
 *
 * @param lock  the lock's address.
 * @return 0, or an errno value (EPERM when the caller does not hold it).
 * @par Ownership
 * The next waiter, if any, gets the lock.
 * @par Failure
 * An errno value; nothing changes.
 * @par Panic
 * Never.
 */
COFFER_PLATFORM_API int Tandel_ReleaseExclLock(void *lock);

#ifdef __cplusplus
}
#endif

#endif
