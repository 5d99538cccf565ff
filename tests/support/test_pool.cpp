#include "support/test_pool.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>

namespace coffer_test {

TestPool::TestPool(uintptr_t base) {
  std::memset(&record_, 0, sizeof record_);
  record_.alloc = Alloc;
  record_.calloc = Calloc;
  record_.realloc = Realloc;
  record_.free = Free;
  record_.base = reinterpret_cast<void *>(base);
  record_.lock = this;
}

TestPool::~TestPool() {
  for (auto &b : live_) std::free(b.first);
}

size_t TestPool::SizeOf(const void *p) const {
  auto it = live_.find(const_cast<void *>(p));
  return it == live_.end() ? 0 : it->second;
}

TestPool *TestPool::From(MemPool *pool) { return static_cast<TestPool *>(pool->lock); }

bool TestPool::Refuse() {
  long n = calls_++;
  return n == failAt_ || (failFrom_ >= 0 && n >= failFrom_);
}

void *TestPool::Alloc(MemPool *pool, size_t size) {
  TestPool *tp = From(pool);
  if (tp->Refuse()) return nullptr;
  void *p = std::malloc(size ? size : 1);
  tp->live_[p] = size;
  return p;
}

void *TestPool::Calloc(MemPool *pool, size_t count, size_t size) {
  TestPool *tp = From(pool);
  if (tp->Refuse()) return nullptr;
  void *p = std::calloc(count ? count : 1, size ? size : 1);
  tp->live_[p] = count * size;
  return p;
}

void *TestPool::Realloc(MemPool *pool, void *ptr, size_t size) {
  TestPool *tp = From(pool);
  if (size == 0) {
    Free(pool, ptr);
    return nullptr;
  }
  if (ptr && !tp->IsLive(ptr)) ADD_FAILURE() << "realloc of a block this pool does not hold";
  if (tp->Refuse()) return nullptr;
  void *p = std::malloc(size);
  if (ptr) {
    size_t old = tp->live_[ptr];
    std::memcpy(p, ptr, old < size ? old : size);
    tp->live_.erase(ptr);
    std::free(ptr);
  }
  tp->live_[p] = size;
  return p;
}

void TestPool::Free(MemPool *pool, void *ptr) {
  if (!ptr) return;
  // Read everything before the release: the record may be inside the block.
  TestPool *tp = From(pool);
  auto it = tp->live_.find(ptr);
  if (it == tp->live_.end()) {
    ADD_FAILURE() << "free of a block this pool does not hold";
    return;
  }
  tp->live_.erase(it);
  tp->frees_++;
  std::free(ptr);
}

std::vector<CofferVal> &Released() {
  static std::vector<CofferVal> log;
  return log;
}

std::vector<MemPool *> &ReleasedPools() {
  static std::vector<MemPool *> log;
  return log;
}

void RecordRelease(CofferVal val) {
  Released().push_back(val);
  ReleasedPools().push_back(nullptr);
}

void RecordMpRelease(MemPool *pool, CofferVal val) {
  Released().push_back(val);
  ReleasedPools().push_back(pool);
}

}  // namespace coffer_test

// Out-of-memory paths are tested by asking for sizes no heap can give; under
// AddressSanitizer the allocator must then return null as libc's does
// instead of reporting the request.
extern "C" const char *__asan_default_options() { return "allocator_may_return_null=1"; }
