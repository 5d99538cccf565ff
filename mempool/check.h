// SPDX-License-Identifier: MIT
// What the invariant checkers share: the report of a broken invariant, and
// the hook that runs a checker at the end of every change in checking builds
// (configured with COFFER_CHECKS=ON).
//
// The checkers are internal: tests call them directly, and a checking build
// calls them after each operation that changed a container or a region, so a
// fault shows where it was made instead of where it is later tripped over.
// They read only through the structure's own links and bound every walk, so
// they return on any content, a damaged one included.
#ifndef COFFER_MEMPOOL_CHECK_H
#define COFFER_MEMPOOL_CHECK_H

#include <coffer/mempool.h>
#include <coffer/platform.h>

namespace coffer {

// The first broken invariant a checker met: a fixed text that names it, and
// the pool offset of the record where it was seen.
struct CheckFault {
  const char *what;
  PoolOffset at;
};

// Records a fault (when the caller asked for one) and returns false, so a
// checker can end a failed test with `return Fault(...)`.
inline bool Fault(CheckFault *fault, const char *what, PoolOffset at) {
  if (fault) *fault = CheckFault{what, at};
  return false;
}

// The pool offsets a checker may follow when the bytes it reads are not to
// be trusted (a region read from a file, say): [lo, hi), usually the mapped
// part of a region past its header. A record must lie wholly inside on a
// 4-byte boundary, and a string must end inside. A checker given no span
// trusts every link, as the library's checks of its own containers do, and
// then behaves exactly as it always has.
struct CheckSpan {
  PoolOffset lo, hi;
};

inline bool SpanHolds(const CheckSpan *span, PoolOffset off, uint64_t bytes) {
  return !span || (off >= span->lo && off % 4 == 0 && off <= span->hi && bytes <= span->hi - off);
}

inline bool SpanHoldsString(const CheckSpan *span, const MemPool *mp, PoolOffset off) {
  if (!span) return true;
  if (off < span->lo || off >= span->hi) return false;
  const char *s = reinterpret_cast<const char *>(reinterpret_cast<uintptr_t>(mp->base) + off);
  return __builtin_memchr(s, 0, span->hi - off) != nullptr;
}

}  // namespace coffer

namespace coffer {

// Runs a check when it goes out of scope, so one line at the top of a call
// covers every way out of it.
template <class F>
struct CheckOnReturn {
  F check;
  ~CheckOnReturn() { check(); }
};
template <class F>
CheckOnReturn<F> MakeCheckOnReturn(F check) {
  return CheckOnReturn<F>{check};
}

}  // namespace coffer

#if COFFER_CHECKS
// Runs checker(args..., &fault) and ends the process, naming the family and
// the fault, when it finds one.
#define COFFER_CHECK(family, checker, ...)                                              \
  do {                                                                                  \
    coffer::CheckFault fault_ = {nullptr, 0};                                           \
    if (!checker(__VA_ARGS__, &fault_))                                                 \
      Panic("%s: invariant broken: %s (offset %u)", family, fault_.what,                \
            static_cast<unsigned>(fault_.at));                                          \
  } while (0)
// The same, when the enclosing call returns.
#define COFFER_CHECK_ON_RETURN(family, checker, ...) \
  auto coffer_check_on_return_ =                     \
      coffer::MakeCheckOnReturn([&] { COFFER_CHECK(family, checker, __VA_ARGS__); })
#else
#define COFFER_CHECK(family, checker, ...) \
  do {                                     \
  } while (0)
#define COFFER_CHECK_ON_RETURN(family, checker, ...) static_assert(true, "")
#endif

#endif
