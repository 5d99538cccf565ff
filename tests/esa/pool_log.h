// A pool record that writes every call it receives, in order, into one text
// log and passes the call on to a wrapped pool (a TestPool, so failure
// injection and leak checks still apply). Value callbacks may write to the
// same log, so the interleaving of pool calls and callbacks is checked too.
// Entries: aN alloc, cKxN calloc, rN realloc (r0:N from null), f free, f0 a
// free of null.
#ifndef COFFER_TESTS_POOL_LOG_H
#define COFFER_TESTS_POOL_LOG_H

#include <coffer/mempool.h>

#include <string>

namespace pool_log {

inline std::string &Text() {
  static std::string s;
  return s;
}
inline MemPool &Inner() {
  static MemPool m;
  return m;
}
inline void Add(const std::string &s) { Text() += (Text().empty() ? "" : " ") + s; }
inline std::string Take() {
  std::string s;
  s.swap(Text());
  return s;
}

inline void *Alloc(MemPool *p, size_t n) {
  Add("a" + std::to_string(n));
  return Inner().alloc(p, n);
}
inline void *Calloc(MemPool *p, size_t k, size_t n) {
  Add("c" + std::to_string(k) + "x" + std::to_string(n));
  return Inner().calloc(p, k, n);
}
inline void *Realloc(MemPool *p, void *q, size_t n) {
  Add((q ? "r" : "r0:") + std::to_string(n));
  return Inner().realloc(p, q, n);
}
inline void Free(MemPool *p, void *q) {
  Add(q ? "f" : "f0");
  Inner().free(p, q);
}
inline void Value(CofferVal v) { Add("v" + std::to_string(v)); }

// The wrapped record keeps the inner pool's base and lock word, which is all
// the inner operations read from the record they are called through.
inline MemPool Wrap(MemPool *inner) {
  Inner() = *inner;
  MemPool m = *inner;
  m.alloc = Alloc;
  m.calloc = Calloc;
  m.realloc = Realloc;
  m.free = Free;
  Text().clear();
  return m;
}

}  // namespace pool_log

#endif
