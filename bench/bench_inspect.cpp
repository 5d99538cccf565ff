// SPDX-License-Identifier: MIT
// Benchmark of coffer-inspect's check and stats on a live-sized region: 64
// MiB holding 100,000 blocks, a third of them free and scattered, with a
// directory naming a string-keyed tree and a sorted array that hold most of
// the rest. A program, not a test: it prints what each command took.
//
//   build/bench/bench_inspect [blocks [file]]      (default 100000 blocks)
//
// With a file, the region is also written there, for timing the tool itself:
//   time build/tools/inspect/coffer-inspect check file
#include <coffer/coffer.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <random>
#include <vector>

#include "tools/inspect/inspect.h"

namespace {

constexpr size_t kRegion = 64u << 20;

// Fills the region until it holds about `blocks` blocks: two named
// containers of n entries each (a node and a key copy per tree entry, a
// key copy per array entry),
// then fillers of random sizes, every third released again.
void Fill(MemPool *pool, uint32_t blocks) {
  const uint32_t n = blocks / 6;
  RbtTree *tree = RBT_AllocTreeEx(pool);
  EsaArray *array = ESA_AllocArrayEx(pool, 0, 4096);
  char key[32];
  for (uint32_t i = 0; i < n; i++) {
    std::snprintf(key, sizeof key, "key-%08u", i * 2654435761u);
    RBT_Insert(tree, key, i);
    ESA_Insert(array, key, i);
  }
  Roots_CreateDirectory(pool);
  Roots_Set(pool, "tree", ROOTS_KIND_RBT, tree);
  Roots_Set(pool, "array", ROOTS_KIND_ARRAY, array);
  std::mt19937 rng(7);
  std::vector<void *> fillers;
  // The containers and the directory took about 3n + 12 blocks; a small
  // count may leave no room for fillers.
  const uint32_t taken = 3 * n + 12;
  const uint32_t wanted = blocks > taken ? blocks - taken : 0;
  while (fillers.size() < wanted) fillers.push_back(pool->alloc(pool, 16 + rng() % 1024));
  for (size_t i = 0; i < fillers.size(); i += 3) pool->free(pool, fillers[i]);
}

double Time(inspect::Command command, const void *region, FILE *sink, int *status) {
  const auto t0 = std::chrono::steady_clock::now();
  *status = inspect::Run(inspect::Request{command, false, nullptr, 0, 0}, region, kRegion, sink);
  return std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - t0).count();
}

}  // namespace

int main(int argc, char **argv) {
  const uint32_t blocks = argc > 1 ? static_cast<uint32_t>(std::atoi(argv[1])) : 100000;
  void *region = std::calloc(1, kRegion);
  MemPool pool;
  if (!region || !MemPool_InitOnSimpleHeap(&pool, region, kRegion)) return 1;
  Fill(&pool, blocks);
  FILE *sink = std::fopen("/dev/null", "w");
  int status;
  std::printf("region of %zu MiB\n", kRegion >> 20);
  std::fflush(stdout);
  inspect::Run(inspect::Request{inspect::kStats, false, nullptr, 0, 0}, region, kRegion, stdout);
  for (int round = 0; round < 3; round++) {
    const double check = Time(inspect::kCheck, region, sink, &status);
    const double stats = Time(inspect::kStats, region, sink, &status);
    std::printf("round %d: check %.1f ms (exit %d), stats %.1f ms\n", round, check, status, stats);
  }
  std::fclose(sink);
  if (argc > 2) {
    FILE *out = std::fopen(argv[2], "wb");
    if (!out || std::fwrite(region, 1, kRegion, out) != kRegion || std::fclose(out) != 0) return 1;
  }
  std::free(region);
  return 0;
}
