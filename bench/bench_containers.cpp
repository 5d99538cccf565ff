// Benchmarks of the containers against the standard library's nearest
// equivalents, on the same keys and in the same order. A program, not a test:
// it prints nanoseconds per operation and judges nothing.
//
//   build/bench/bench_containers [n]      (default n = 200000)
#include <coffer/coffer.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <random>
#include <string>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;

double NsPerOp(Clock::time_point t0, size_t ops) {
  return std::chrono::duration<double, std::nano>(Clock::now() - t0).count() / ops;
}

// The first round only warms the allocator and the caches, so that neither
// side pays for fresh pages the other then reuses; the second is printed.
bool g_print = false;

void Row(const char *what, double coffer, double other, const char *otherName) {
  if (!g_print) return;
  std::printf("%-34s %9.1f ns   %-28s %9.1f ns   x%.2f\n", what, coffer, otherName, other,
              other / coffer);
}

// Keys with long shared prefixes, as paths and identifiers have.
std::vector<std::string> MakeKeys(size_t n, unsigned seed) {
  std::mt19937 rng(seed);
  std::vector<std::string> keys;
  keys.reserve(n);
  for (size_t i = 0; i < n; i++)
    keys.push_back("/srv/app/config/section" + std::to_string(rng() % 64) + "/key" +
                   std::to_string(rng()));
  return keys;
}

volatile uintptr_t g_sink;

void BenchStringTree(const std::vector<std::string> &keys) {
  size_t n = keys.size();
  RbtTree *t = RBT_AllocTree();
  auto t0 = Clock::now();
  for (size_t i = 0; i < n; i++) RBT_Insert(t, keys[i].c_str(), i);
  double ins = NsPerOp(t0, n);
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) g_sink = RBT_Find(t, keys[i].c_str())->val;
  double find = NsPerOp(t0, n);
  t0 = Clock::now();
  RBT_FreeTree(t);
  double del = NsPerOp(t0, n);

  std::multimap<std::string, uintptr_t> m;
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) m.emplace(keys[i], i);
  double mins = NsPerOp(t0, n);
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) g_sink = m.find(keys[i])->second;
  double mfind = NsPerOp(t0, n);
  t0 = Clock::now();
  m.clear();
  double mdel = NsPerOp(t0, n);
  Row("RBT insert", ins, mins, "multimap<string> emplace");
  Row("RBT find", find, mfind, "multimap<string> find");
  Row("RBT free (removes one by one)", del, mdel, "multimap<string> clear");
}

void BenchIntTree(size_t n) {
  std::mt19937 rng(7);
  std::vector<int32_t> keys(n);
  for (auto &k : keys) k = static_cast<int32_t>(rng() % 1000000000);
  RbtTree *t = RbtInt32_AllocTree();
  auto t0 = Clock::now();
  for (size_t i = 0; i < n; i++) RbtInt32_Insert(t, keys[i], i);
  double ins = NsPerOp(t0, n);
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) g_sink = RbtInt32_LowerBound(t, keys[i])->val;
  double find = NsPerOp(t0, n);
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) RbtInt32_Remove(t, RbtInt32_Find(t, keys[i]));
  double del = NsPerOp(t0, n);
  RbtInt32_FreeTree(t);

  std::multimap<int32_t, uintptr_t> m;
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) m.emplace(keys[i], i);
  double mins = NsPerOp(t0, n);
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) g_sink = m.lower_bound(keys[i])->second;
  double mfind = NsPerOp(t0, n);
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) m.erase(m.find(keys[i]));
  double mdel = NsPerOp(t0, n);
  Row("RbtInt32 insert", ins, mins, "multimap<int> emplace");
  Row("RbtInt32 lower bound", find, mfind, "multimap<int> lower_bound");
  Row("RbtInt32 find + remove", del, mdel, "multimap<int> find + erase");
}

void BenchSortedArray(const std::vector<std::string> &keys) {
  size_t n = keys.size() / 10;  // insertion moves entries: keep it quadratic-friendly
  EsaArray *a = ESA_AllocArray(0, 1024);
  auto t0 = Clock::now();
  for (size_t i = 0; i < n; i++) ESA_Insert(a, keys[i].c_str(), i);
  double ins = NsPerOp(t0, n);
  int32_t at;
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) g_sink = ESA_Find(a, keys[i].c_str(), &at);
  double find = NsPerOp(t0, n);
  ESA_FreeArray(a);

  std::map<std::string, uintptr_t> m;
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) m.emplace(keys[i], i);
  double mins = NsPerOp(t0, n);
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) g_sink = m.count(keys[i]);
  double mfind = NsPerOp(t0, n);
  Row("ESA insert", ins, mins, "map<string> emplace");
  Row("ESA find", find, mfind, "map<string> count");
}

void BenchRegionHeap(size_t n) {
  size_t size = 64u << 20;
  std::vector<char> region(size);
  MemPool pool;
  MemPool_InitOnSimpleHeap(&pool, region.data(), size);
  std::mt19937 rng(11);
  std::vector<size_t> sizes(n);
  for (auto &s : sizes) s = 8 + rng() % 120;
  std::vector<void *> live(1024, nullptr);
  auto t0 = Clock::now();
  for (size_t i = 0; i < n; i++) {
    void *&slot = live[rng() % live.size()];
    pool.free(&pool, slot);
    slot = pool.alloc(&pool, sizes[i]);
  }
  double sh = NsPerOp(t0, n);
  for (void *&p : live) pool.free(&pool, p), p = nullptr;
  rng.seed(11);
  for (auto &s : sizes) s = 8 + rng() % 120;
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) {
    void *&slot = live[rng() % live.size()];
    std::free(slot);
    slot = std::malloc(sizes[i]);
  }
  double libc = NsPerOp(t0, n);
  for (void *p : live) std::free(p);
  Row("region heap free + alloc", sh, libc, "libc free + malloc");
}

void BenchStringTreePaths(const std::vector<std::string> &keys) {
  size_t n = keys.size() / 4;
  HstTree *t = HST_AllocTree('/', 0, 4, 8);
  auto t0 = Clock::now();
  for (size_t i = 0; i < n; i++) HST_Insert(t, keys[i].c_str(), i);
  double ins = NsPerOp(t0, n);
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) g_sink = HST_GetVal(t, HST_Find(t, keys[i].c_str()));
  double find = NsPerOp(t0, n);
  HST_FreeTree(t);

  std::map<std::string, uintptr_t> m;
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) m[keys[i]] = i;
  double mins = NsPerOp(t0, n);
  t0 = Clock::now();
  for (size_t i = 0; i < n; i++) g_sink = m.find(keys[i])->second;
  double mfind = NsPerOp(t0, n);
  Row("HST insert at path", ins, mins, "map<full path> assign");
  Row("HST find path", find, mfind, "map<full path> find");
}

}  // namespace

int main(int argc, char **argv) {
  size_t n = argc > 1 ? std::strtoul(argv[1], nullptr, 10) : 200000;
  std::vector<std::string> keys = MakeKeys(n, 1);
  std::printf("n = %zu\n%-34s %12s   %-28s %12s   %s\n", n, "coffer", "", "alternative", "",
              "alternative / coffer");
  for (int round = 0; round < 2; round++) {
    g_print = round == 1;
    BenchStringTree(keys);
    BenchIntTree(n);
    BenchSortedArray(keys);
    BenchStringTreePaths(keys);
    BenchRegionHeap(n * 5);
  }
  return 0;
}
