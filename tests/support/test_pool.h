// Test helpers shared by every subsystem's tests: a caller-supplied pool that
// counts, checks and refuses allocations on demand, and value-release logs.
#ifndef COFFER_TESTS_TEST_POOL_H
#define COFFER_TESTS_TEST_POOL_H

#include <coffer/mempool.h>

#include <cstddef>
#include <map>
#include <vector>

namespace coffer_test {

// A pool over malloc. The record it hands out keeps a pointer to this object
// in its lock word (containers copy the record, and a custom pool may use
// that word as it likes), so every copy reaches the same bookkeeping.
//
// Allocation calls (alloc, calloc, and realloc with a nonzero size) are
// numbered from 0; FailAt(n) makes call n return null, FailFrom(n) makes
// call n and every later one return null. A refused realloc keeps its block.
// base is nonzero by default so that offsets differ from addresses.
class TestPool {
 public:
  explicit TestPool(uintptr_t base = 0x1000);
  ~TestPool();
  TestPool(const TestPool &) = delete;
  TestPool &operator=(const TestPool &) = delete;

  MemPool *pool() { return &record_; }

  void FailAt(long n) { failAt_ = n, failFrom_ = -1; }
  void FailFrom(long n) { failFrom_ = n, failAt_ = -1; }
  void NeverFail() { failAt_ = failFrom_ = -1; }

  long calls() const { return calls_; }  // allocation calls so far
  long frees() const { return frees_; }  // non-null frees so far
  size_t liveBlocks() const { return live_.size(); }
  bool IsLive(const void *p) const { return live_.count(const_cast<void *>(p)) != 0; }
  size_t SizeOf(const void *p) const;  // size of a live block, 0 otherwise

 private:
  static TestPool *From(MemPool *pool);
  static void *Alloc(MemPool *pool, size_t size);
  static void *Calloc(MemPool *pool, size_t count, size_t size);
  static void *Realloc(MemPool *pool, void *ptr, size_t size);
  static void Free(MemPool *pool, void *ptr);
  bool Refuse();

  MemPool record_;
  long calls_ = 0;
  long frees_ = 0;
  long failAt_ = -1;
  long failFrom_ = -1;
  std::map<void *, size_t> live_;
};

// Value-release logs: the callbacks append the values they receive.
std::vector<CofferVal> &Released();
std::vector<MemPool *> &ReleasedPools();
void RecordRelease(CofferVal val);
void RecordMpRelease(MemPool *pool, CofferVal val);

}  // namespace coffer_test

#endif
