// SPDX-License-Identifier: MIT
#include "support/driver.h"

#include <cstdio>
#include <cstdlib>
#include <random>

namespace coffer_test {

uint32_t Ops::Take(uint32_t n) {
  uint32_t v = 0;
  for (uint32_t span = 1; span < n && p_ < end_; span <<= 8) v = v << 8 | *p_++;
  return n ? v % n : 0;
}

std::string Ops::Key(const std::string &alphabet, uint32_t maxLen) {
  std::string k;
  for (uint32_t n = Take(maxLen + 1); n; --n) k += alphabet[Take(alphabet.size())];
  return k;
}

std::vector<uint8_t> RandomBytes(uint32_t seed, size_t n) {
  std::mt19937 rng(seed);
  std::vector<uint8_t> v(n);
  for (uint8_t &b : v) b = static_cast<uint8_t>(rng());
  return v;
}

std::string RunOnTestPool(const std::function<std::string(Arena)> &run, long failAt) {
  TestPool tp;
  tp.FailAt(failAt);
  std::string e = run(Arena{tp.pool(), &tp});
  if (e.empty() && tp.held()) e = std::to_string(tp.held()) + " blocks leaked";
  return e.empty() ? tp.misuse : e;
}

std::string ForEachFailure(const std::function<std::string(Arena)> &run) {
  for (long n = 0;; n++) {
    long calls = 0;
    std::string e = RunOnTestPool([&](Arena a) {
      std::string got = run(a);
      calls = a.tp->calls();
      return got;
    }, n);
    if (!e.empty()) return "refusing call " + std::to_string(n) + ": " + e;
    if (calls <= n) return "";
  }
}

int FuzzModel(const uint8_t *data, size_t size) {
  static const Runner kRunners[] = {RunEsaModel, RunRbtModel, RunHstModel, RunHstaaModel};
  if (size == 0) return 0;
  std::string e = RunOnTestPool([&](Arena a) {
    Ops ops(data + 1, size - 1);
    return kRunners[data[0] % 4](ops, a);
  });
  if (!e.empty()) std::fprintf(stderr, "%s\n", e.c_str()), std::abort();
  return 0;
}

}  // namespace coffer_test
