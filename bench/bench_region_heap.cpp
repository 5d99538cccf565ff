// SPDX-License-Identifier: MIT
// The region heap on its own: a seeded trace of mixed allocations and
// releases in a 64 MiB region, timed through SH_Alloc and SH_Free. A program,
// not a test: it prints nanoseconds per call and judges nothing. The time is
// the process's CPU time, which other work on a shared machine disturbs far
// less than the wall clock.
//
//   build/bench/bench_region_heap [calls [rounds]]   (default 1000000 calls, 7 rounds)
#include <coffer/mempool.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <random>
#include <vector>

namespace {

double CpuNs() {
  timespec t;
  clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &t);
  return t.tv_sec * 1e9 + t.tv_nsec;
}

// One call of the trace: an allocation of size bytes into slot, or (size
// -1) the release of whatever slot holds.
struct Call {
  uint32_t slot;
  int32_t size;
};

// Mostly small blocks, some medium, a few large; the live set hovers around
// 20 000 blocks (about 12 MiB), so the free list grows long and fragmented.
std::vector<Call> MakeTrace(size_t n, unsigned seed, uint32_t *slots) {
  std::mt19937 rng(seed);
  std::vector<uint32_t> live, idle;
  std::vector<Call> trace;
  trace.reserve(n);
  uint32_t next = 0;
  while (trace.size() < n) {
    bool alloc = live.empty() || rng() % 100 < (live.size() < 20000 ? 60u : 40u);
    if (alloc) {
      uint32_t k = rng() % 100;
      int32_t size = k < 70 ? 8 + rng() % 121 : k < 95 ? 129 + rng() % 896 : 1025 + rng() % 15360;
      uint32_t slot = idle.empty() ? next++ : idle.back();
      if (!idle.empty()) idle.pop_back();
      live.push_back(slot);
      trace.push_back({slot, size});
    } else {
      size_t i = rng() % live.size();
      trace.push_back({live[i], -1});
      idle.push_back(live[i]);
      live[i] = live.back();
      live.pop_back();
    }
  }
  *slots = next;
  return trace;
}

}  // namespace

int main(int argc, char **argv) {
  size_t n = argc > 1 ? std::strtoul(argv[1], nullptr, 10) : 1000000;
  int rounds = argc > 2 ? std::atoi(argv[2]) : 7;
  const size_t regionSize = 64u << 20;
  uint32_t slots = 0;
  std::vector<Call> trace = MakeTrace(n, 2024, &slots);
  std::vector<void *> ptr(slots, nullptr);
  std::vector<char> region(regionSize);
  std::vector<double> ns;
  size_t refused = 0;
  // The first round warms the region's pages and the caches and is not counted.
  for (int round = 0; round <= rounds; round++) {
    SH_Reset(region.data(), regionSize);
    refused = 0;
    double t0 = CpuNs();
    for (const Call &c : trace) {
      if (c.size < 0) {
        SH_Free(region.data(), ptr[c.slot]);
      } else {
        ptr[c.slot] = SH_Alloc(region.data(), static_cast<size_t>(c.size));
        refused += ptr[c.slot] == nullptr;
      }
    }
    double t = (CpuNs() - t0) / n;
    if (round > 0) ns.push_back(t);
  }
  std::sort(ns.begin(), ns.end());
  std::printf("region heap trace: %zu calls, %d rounds, %zu refused\n", n, rounds, refused);
  std::printf("ns per call: best %.1f  median %.1f  worst %.1f\n", ns.front(), ns[ns.size() / 2],
              ns.back());
  return 0;
}
