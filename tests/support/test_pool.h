// SPDX-License-Identifier: MIT
// The caller-supplied pool of the tests and the log of released values.
// Nothing here depends on GoogleTest, so the fuzz targets use it too.
#ifndef COFFER_TESTS_SUPPORT_TEST_POOL_H
#define COFFER_TESTS_SUPPORT_TEST_POOL_H

#include <coffer/mempool.h>

#include <map>
#include <string>
#include <vector>

namespace coffer_test {

// A pool over malloc that numbers its allocation calls (alloc, calloc, and
// realloc to a nonzero size) from 0 and refuses call FailAt. It knows every
// block it handed out, so a leak shows and so does a release of a block it
// does not hold (a double release). The record finds the pool through its
// lock word, which every copy carries; base is nonzero, so offsets differ
// from addresses.
class TestPool {
 public:
  explicit TestPool(uintptr_t base = 0x1000);
  ~TestPool();
  MemPool *pool() { return &record_; }
  void FailAt(long n) { failAt_ = n; }
  long calls() const { return calls_; }
  long lastRefused() const { return lastRefused_; }  // -1 before any refusal
  size_t held() const { return blocks_.size(); }
  size_t SizeOf(const void *p) const;  // 0 for a block not held
  std::string misuse;

 private:
  static void *Alloc(MemPool *pool, size_t size);
  static void *Calloc(MemPool *pool, size_t count, size_t size);
  static void *Realloc(MemPool *pool, void *ptr, size_t size);
  static void Free(MemPool *pool, void *ptr);
  void *Grant(void *p, size_t size);  // null when this call is the one to refuse
  MemPool record_;
  long calls_ = 0, failAt_ = -1, lastRefused_ = -1;
  std::map<void *, size_t> blocks_;
};

// While logging, one text of pool calls and released values in the order
// they happened: aN alloc, cKxN calloc, rN realloc (r0:N from null), f free,
// vN a value. TakeCallLog hands the text over and stops.
void StartCallLog();
std::string TakeCallLog();
void LogCall(const std::string &entry);

// Every value a release callback received, with the pool argument of the
// MpFreeValFn kind (null for the other).
struct Released {
  CofferVal val;
  MemPool *pool;
};
std::vector<Released> &Releases();
std::vector<CofferVal> ReleasedVals(const MemPool *pool = nullptr);  // one given another pool reads as ~0
void RecordRelease(CofferVal val);
void RecordMpRelease(MemPool *pool, CofferVal val);

}  // namespace coffer_test

#endif
