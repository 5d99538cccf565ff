// The caller-supplied pool of the tests, and the log of released values.
// Nothing here depends on GoogleTest, so the fuzz targets use it too.
#ifndef COFFER_TESTS_SUPPORT_TEST_POOL_H
#define COFFER_TESTS_SUPPORT_TEST_POOL_H

#include <coffer/mempool.h>

#include <map>
#include <string>
#include <vector>

namespace coffer_test {

// A pool over malloc that numbers its allocation calls (alloc, calloc, and
// realloc to a nonzero size) from 0 and refuses the ones it is told to. It
// knows every block it handed out, so a leak or a release of a block it does
// not hold (a double release) shows. The record keeps a pointer to the pool
// in its lock word, which every copy of the record carries along. base is
// nonzero, so offsets differ from addresses.
class TestPool {
 public:
  explicit TestPool(uintptr_t base = 0x1000);
  ~TestPool();
  TestPool(const TestPool &) = delete;
  TestPool &operator=(const TestPool &) = delete;

  MemPool *pool() { return &record_; }
  void FailAt(long n) { failAt_ = n; }  // refuse call n only; -1 for none
  long calls() const { return calls_; }
  long lastRefused() const { return lastRefused_; }  // -1 before any refusal
  size_t held() const { return blocks_.size(); }
  size_t SizeOf(const void *p) const;  // 0 for a block not held

  std::string misuse;  // what the pool was wrongly asked to do

 private:
  static TestPool *From(MemPool *pool) { return static_cast<TestPool *>(pool->lock); }
  static void *Alloc(MemPool *pool, size_t size);
  static void *Calloc(MemPool *pool, size_t count, size_t size);
  static void *Realloc(MemPool *pool, void *ptr, size_t size);
  static void Free(MemPool *pool, void *ptr);
  bool Refuse();

  MemPool record_;
  long calls_ = 0, failAt_ = -1, lastRefused_ = -1;
  std::map<void *, size_t> blocks_;
};

// While logging, one text of pool calls and value releases in the order they
// happened: aN alloc, cKxN calloc, rN realloc (r0:N from null), f free,
// vN a released value. StartCallLog clears it; TakeCallLog hands it over
// and stops.
void StartCallLog();
std::string TakeCallLog();
void LogCall(const std::string &entry);

// Every value a release callback received; the pool argument of the MpFreeValFn kind, or null.
struct Released {
  CofferVal val;
  MemPool *pool;
  bool operator==(const Released &o) const { return val == o.val && pool == o.pool; }
};
std::vector<Released> &Releases();
std::vector<CofferVal> ReleasedVals();
void RecordRelease(CofferVal val);
void RecordMpRelease(MemPool *pool, CofferVal val);

}  // namespace coffer_test

#endif
