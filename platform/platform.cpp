// SPDX-License-Identifier: MIT
// Platform layer: the fatal report and a robust, process-shared mutex kept in
// caller memory (so it can live inside a shared region).
#include <coffer/platform.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <pthread.h>

static_assert(sizeof(pthread_mutex_t) <= sizeof(TandelExclLock),
              "the lock storage must hold a mutex");
static_assert(alignof(pthread_mutex_t) <= alignof(TandelExclLock), "lock storage alignment");

namespace {
pthread_mutex_t *AsMutex(void *lock) { return static_cast<pthread_mutex_t *>(lock); }
}  // namespace

extern "C" {

void Panic(const char *format, ...) {
  va_list args;
  va_start(args, format);
  std::vfprintf(stderr, format, args);
  va_end(args);
  std::fputc('\n', stderr);
  std::fflush(stderr);
  std::abort();
}

int Tandel_InitExclLock(TandelExclLock *lock) {
  pthread_mutexattr_t attr;
  int rc = pthread_mutexattr_init(&attr);
  if (rc) return rc;
  rc = pthread_mutexattr_setpshared(&attr, PTHREAD_PROCESS_SHARED);
  if (!rc) rc = pthread_mutexattr_setrobust(&attr, PTHREAD_MUTEX_ROBUST);
  if (!rc) rc = pthread_mutex_init(AsMutex(lock), &attr);
  pthread_mutexattr_destroy(&attr);
  return rc;
}

int Tandel_DestroyExclLock(TandelExclLock *lock) { return pthread_mutex_destroy(AsMutex(lock)); }

int Tandel_AcquireExclLock(void *lock) {
  int rc = pthread_mutex_lock(AsMutex(lock));
  // The previous holder died while holding the lock. The region heap's
  // bookkeeping it guarded may be half-written, but leaving the lock dead
  // would stop every other user of the region for good; recover it.
  if (rc == EOWNERDEAD) rc = pthread_mutex_consistent(AsMutex(lock));
  return rc;
}

int Tandel_ReleaseExclLock(void *lock) { return pthread_mutex_unlock(AsMutex(lock)); }

}  // extern "C"
