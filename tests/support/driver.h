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
  explicit Ops(std::vector<uint8_t> bytes)
      : own_(std::move(bytes)), p_(own_.data()), end_(p_ + own_.size()) {}
  bool More() const { return p_ < end_; }
  // A number below n (n at most 65536), 0 once the bytes have run out.
  uint32_t Take(uint32_t n);
  // Up to maxLen characters of alphabet.
  std::string Key(const std::string &alphabet, uint32_t maxLen);

 private:
  std::vector<uint8_t> own_;
  const uint8_t *p_, *end_;
};

std::vector<uint8_t> RandomBytes(uint32_t seed, size_t n);

// Where a model runs: a pool, and the TestPool behind it when there is one,
// which lets the model refuse allocations and see key sizes.
struct Arena {
  MemPool *pool;
  TestPool *tp;
};

// What one operation met: whether the pool refused one of its calls, and
// which (counted from the operation's first call).
struct OpWatch {
  TestPool *tp;
  long start;
  explicit OpWatch(TestPool *t) : tp(t), start(t ? t->calls() : 0) {}
  bool Refused() const { return tp && tp->lastRefused() >= start; }
  long RefusedCall() const { return Refused() ? tp->lastRefused() - start : -1; }
};

// A runner returns "" when the library agreed with its model throughout,
// else where they first differed.
std::string Differs(const char *file, int line, const char *what);
#define MODEL_EXPECT(cond) \
  do {                     \
    if (!(cond)) return coffer_test::Differs(__FILE__, __LINE__, #cond); \
  } while (0)
#define MODEL_TRY(call)              \
  do {                               \
    std::string e_ = (call);         \
    if (!e_.empty()) return e_;      \
  } while (0)

std::string RunEsaModel(Ops &ops, Arena arena);
std::string RunRbtModel(Ops &ops, Arena arena);  // the first byte picks the family
std::string RunHstModel(Ops &ops, Arena arena);
std::string RunHstaaModel(Ops &ops, Arena arena);

// The failure-injection driver: runs run on a fresh TestPool with its
// allocation call n refused, for every n up to the first run that makes no
// call n. After each run the pool must hold nothing and have seen no
// double release.
std::string ForEachFailure(const std::function<std::string(Arena)> &run);

// A fuzz target's body: runs a model on the fuzzer's bytes over a TestPool
// and aborts, saying why, on any disagreement, leak or double release.
int FuzzModel(std::string (*run)(Ops &, Arena), const uint8_t *data, size_t size);

}  // namespace coffer_test

#endif
