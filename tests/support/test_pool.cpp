// SPDX-License-Identifier: MIT
#include "support/test_pool.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>

namespace coffer_test {
namespace {
TestPool *From(MemPool *pool) { return static_cast<TestPool *>(pool->lock); }
std::string g_log;
bool g_logging = false;
}  // namespace

TestPool::TestPool(uintptr_t base) {
  record_ = MemPool{Alloc, Calloc, Realloc, Free, reinterpret_cast<void *>(base), this};
}
TestPool::~TestPool() {
  for (auto &b : blocks_) std::free(b.first);
}
size_t TestPool::SizeOf(const void *p) const {
  auto it = blocks_.find(const_cast<void *>(p));
  return it == blocks_.end() ? 0 : it->second;
}

void *TestPool::Grant(void *p, size_t size) {
  if (calls_++ == failAt_) return std::free(p), lastRefused_ = failAt_, nullptr;
  blocks_[p] = size;
  return p;
}
void *TestPool::Alloc(MemPool *pool, size_t size) {
  LogCall("a" + std::to_string(size));
  return From(pool)->Grant(std::malloc(size + 1), size);
}
void *TestPool::Calloc(MemPool *pool, size_t count, size_t size) {
  LogCall("c" + std::to_string(count) + "x" + std::to_string(size));
  return From(pool)->Grant(std::calloc(1, count * size + 1), count * size);
}
void *TestPool::Realloc(MemPool *pool, void *ptr, size_t size) {
  TestPool *tp = From(pool);
  LogCall((ptr ? "r" : "r0:") + std::to_string(size));
  if (ptr && !tp->blocks_.count(ptr)) tp->misuse += "realloc of a block not held; ";
  void *p = size ? tp->Grant(std::malloc(size), size) : nullptr;
  if (ptr && (p || !size)) {  // a refused realloc keeps the block
    if (p) std::memcpy(p, ptr, std::min(tp->blocks_[ptr], size));
    tp->blocks_.erase(ptr);
    std::free(ptr);
  }
  return p;
}
void TestPool::Free(MemPool *pool, void *ptr) {
  // Everything is read before the release: the record may lie in the block.
  TestPool *tp = From(pool);
  LogCall(ptr ? "f" : "f0");
  if (ptr && !tp->blocks_.erase(ptr)) return void(tp->misuse += "free of a block not held; ");
  std::free(ptr);
}

void StartCallLog() { g_log.clear(), g_logging = true; }
std::string TakeCallLog() { return g_logging = false, std::move(g_log); }
void LogCall(const std::string &entry) {
  if (g_logging) g_log += (g_log.empty() ? "" : " ") + entry;
}

std::vector<Released> &Releases() {
  static std::vector<Released> log;
  return log;
}
std::vector<CofferVal> ReleasedVals(const MemPool *pool) {
  std::vector<CofferVal> v;
  for (const Released &r : Releases()) v.push_back(r.pool == pool ? r.val : ~CofferVal{0});
  return v;
}
void RecordRelease(CofferVal val) { RecordMpRelease(nullptr, val); }
void RecordMpRelease(MemPool *pool, CofferVal val) {
  Releases().push_back({val, pool});
  LogCall("v" + std::to_string(val));
}

}  // namespace coffer_test

// Out-of-memory paths are tested by asking for sizes no heap can give; under
// AddressSanitizer the allocator must then return null as libc's does
// instead of reporting the request.
extern "C" const char *__asan_default_options() { return "allocator_may_return_null=1"; }
