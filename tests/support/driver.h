// SPDX-License-Identifier: MIT
// The model drivers: each family's reference model, run side by side with
// the library on operations read from a byte string (seeded random bytes in
// the tests, the fuzzer's input in the fuzz targets), comparing the whole
// observable state after every step. Nothing here depends on GoogleTest.
#ifndef COFFER_TESTS_SUPPORT_DRIVER_H
#define COFFER_TESTS_SUPPORT_DRIVER_H

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "support/test_pool.h"

namespace coffer_test {

class Ops {
 public:
  Ops(const uint8_t *data, size_t size) : p_(data), end_(data + size) {}
  explicit Ops(std::vector<uint8_t> bytes) : own_(std::move(bytes)), p_(own_.data()), end_(p_ + own_.size()) {}
  bool More() const { return p_ < end_; }
  uint32_t Take(uint32_t n);  // below n (at most 65536); 0 once the bytes run out
  std::string Key(const std::string &alphabet, uint32_t maxLen);

 private:
  std::vector<uint8_t> own_;
  const uint8_t *p_, *end_;
};
std::vector<uint8_t> RandomBytes(uint32_t seed, size_t n);

// Where a model runs: a pool, and the TestPool behind it when there is one,
// through which the model refuses allocations and sees key sizes.
struct Arena {
  MemPool *pool;
  TestPool *tp;
};

// Whether the pool refused one of an operation's calls, and which (counted
// from the operation's first call).
struct OpWatch {
  TestPool *tp;
  long start;
  explicit OpWatch(TestPool *t) : tp(t), start(t ? t->calls() : 0) {}
  bool Refused() const { return tp && tp->lastRefused() >= start; }
  long RefusedCall() const { return Refused() ? tp->lastRefused() - start : -1; }
};

// A runner returns "" when the library agreed with its model throughout,
// else where they first differed.
using Runner = std::string (*)(Ops &, Arena);
std::string RunEsaModel(Ops &ops, Arena arena);
std::string RunRbtModel(Ops &ops, Arena arena);  // the first byte picks the family
std::string RunHstModel(Ops &ops, Arena arena);
std::string RunHstaaModel(Ops &ops, Arena arena);
#define MODEL_EXPECT(cond) \
  if (!(cond)) return std::string(__FILE__ ":") + std::to_string(__LINE__) + ": " #cond
#define MODEL_TRY(call) \
  if (std::string e_ = (call); !e_.empty()) return e_

// Runs run on a TestPool and adds what the pool saw: a leak or a double
// release. With failAt, the pool refuses that allocation call.
std::string RunOnTestPool(const std::function<std::string(Arena)> &run, long failAt = -1);
// The failure-injection driver: RunOnTestPool with call n refused, for every
// n up to the first run that makes no call n.
std::string ForEachFailure(const std::function<std::string(Arena)> &run);
// A fuzz target's body: a runner on the fuzzer's bytes, aborting with the
// reason on any disagreement.
int FuzzModel(const uint8_t *data, size_t size);

}  // namespace coffer_test

#endif
