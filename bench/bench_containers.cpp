// SPDX-License-Identifier: MIT
// Benchmarks the containers against the standard library's nearest
// equivalents. A program, not a test: it prints times and ratios and judges
// nothing.
//
//   build/bench/bench_containers [family...]
//
// With arguments, only the families named (RbtInt32, RBT, HST, ESA, SH) are
// measured, and the summary leaves the others empty.
//
// Every pair runs in this one process on the same keys, generated from fixed
// seeds. Each repetition runs both contenders through the same phases, in an
// order that alternates from one repetition to the next, so that a slow
// moment of a shared machine hits both alike; a phase's time is the median
// of the repetitions. Small sizes repeat their cycle (build, query, empty)
// until a phase has seen enough operations to be timed. Times are CPU time
// of the measuring thread. The ratio is coffer's time over the standard
// container's: below 1, coffer is faster.
#include <coffer/coffer.h>
#include <malloc.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <map>
#include <random>
#include <string>
#include <vector>

namespace {

constexpr int kReps = 5;               // counted repetitions per pair
constexpr size_t kMinOps = 200000;     // operations per phase and repetition, at least
constexpr size_t kMaxProbes = 200000;  // lookups and removals per cycle, at most
constexpr int kMaxPhases = 5;

volatile uintptr_t g_sink;

// Times are the CPU time of this thread: on a machine shared with other
// work, the time spent waiting for a core is nobody's cost.
double CpuNanos() {
  timespec ts;
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &ts);
  return ts.tv_sec * 1e9 + ts.tv_nsec;
}

// Times a phase and adds it to the cycle's running total.
template <class F>
void Timed(double *total, F &&f) {
  const double t0 = CpuNanos();
  f();
  *total += CpuNanos() - t0;
}

double Median(std::vector<double> v) {
  std::sort(v.begin(), v.end());
  return v[v.size() / 2];
}

// One pair of contenders on one key set: the per-repetition totals of each
// phase, divided by the operations it ran.
struct Pair {
  const char *family;
  const char *versus;
  size_t n;
  std::vector<const char *> phases;
  std::vector<std::vector<double>> coffer, other;  // [phase][repetition], ns per operation
};

std::vector<Pair> g_pairs;

// Runs cycle(side, totals) for both sides, alternating which goes first, and
// records ns per operation of each phase. A cycle builds from n keys and
// runs probes operations in every other phase, except those listed in
// fullPhases, which run n.
template <class Cycle>
void Measure(const char *family, const char *versus, size_t n, size_t probes,
             std::vector<const char *> phases, std::vector<size_t> fullPhases, Cycle cycle) {
  Pair p{family, versus, n, phases, {}, {}};
  p.coffer.assign(phases.size(), {});
  p.other.assign(phases.size(), {});
  const size_t cycles = (kMinOps + n - 1) / n;
  for (int rep = 0; rep < kReps; rep++) {
    for (int k = 0; k < 2; k++) {
      const bool coffer = (rep + k) % 2 == 0;
      double totals[kMaxPhases] = {};
      for (size_t c = 0; c < cycles; c++) cycle(coffer, totals);
      for (size_t i = 0; i < phases.size(); i++) {
        const bool full = std::count(fullPhases.begin(), fullPhases.end(), i) > 0;
        (coffer ? p.coffer : p.other)[i].push_back(totals[i] /
                                                   double((full ? n : probes) * cycles));
      }
    }
  }
  g_pairs.push_back(p);
  std::fprintf(stderr, ".");
}

// ---- 32-bit integer keys ---------------------------------------------------

// Even keys below 2e9 (within the serial order's half range); key + 1 is
// then absent. probe is a sample of the keys in random order (all of them
// up to kMaxProbes), absent that of the absent keys.
struct IntKeys {
  std::vector<int32_t> keys, absent, probe;
  explicit IntKeys(size_t n) {
    std::mt19937 rng(7);
    for (size_t i = 0; i < n; i++) keys.push_back(static_cast<int32_t>(rng() % 1000000000u) * 2);
    probe = keys;
    std::shuffle(probe.begin(), probe.end(), rng);
    probe.resize(std::min(n, kMaxProbes));
    for (int32_t key : probe) absent.push_back(key + 1);
    std::shuffle(absent.begin(), absent.end(), rng);
  }
};

void IntCycleCoffer(const IntKeys &k, double *t) {
  const size_t n = k.keys.size();
  RbtTree *tree = RbtInt32_AllocTree();
  Timed(&t[0], [&] {
    for (size_t i = 0; i < n; i++) RbtInt32_Insert(tree, k.keys[i], i);
  });
  Timed(&t[1], [&] {
    uintptr_t s = 0;
    for (const auto &key : k.absent)
      s += reinterpret_cast<uintptr_t>(RbtInt32_LowerBound(tree, key));
    g_sink = s;
  });
  Timed(&t[2], [&] {
    uintptr_t s = 0;
    for (RbtNode *x = RbtInt32_First(tree); x; x = RbtInt32_Next(tree, x)) s += x->val;
    g_sink = s;
  });
  Timed(&t[3], [&] {
    uintptr_t s = 0;
    for (const auto &key : k.probe) s += RbtInt32_Find(tree, key)->val;
    g_sink = s;
  });
  Timed(&t[4], [&] {
    for (const auto &key : k.probe) RbtInt32_Remove(tree, RbtInt32_Find(tree, key));
  });
  RbtInt32_FreeTree(tree);
}

void IntCycleStd(const IntKeys &k, double *t) {
  const size_t n = k.keys.size();
  std::multimap<int32_t, uint32_t> m;
  Timed(&t[0], [&] {
    for (size_t i = 0; i < n; i++) m.emplace(k.keys[i], i);
  });
  Timed(&t[1], [&] {
    uintptr_t s = 0;
    for (const auto &key : k.absent) {
      auto it = m.lower_bound(key);
      s += it == m.end() ? 0 : reinterpret_cast<uintptr_t>(&*it);
    }
    g_sink = s;
  });
  Timed(&t[2], [&] {
    uintptr_t s = 0;
    for (auto it = m.begin(); it != m.end(); ++it) s += it->second;
    g_sink = s;
  });
  Timed(&t[3], [&] {
    uintptr_t s = 0;
    for (const auto &key : k.probe) s += m.find(key)->second;
    g_sink = s;
  });
  Timed(&t[4], [&] {
    for (const auto &key : k.probe) m.erase(m.find(key));
  });
}

// ---- string keys -------------------------------------------------------------

// Keys with long shared prefixes, as paths and identifiers have; key + "+"
// is absent. probe and absent are samples as for the integer keys.
struct StringKeys {
  std::vector<std::string> keys, absent, probe;
  explicit StringKeys(size_t n) {
    std::mt19937 rng(1);
    for (size_t i = 0; i < n; i++) {
      std::string section = std::to_string(rng() % 64);
      keys.push_back("/srv/app/config/section" + section + "/key" + std::to_string(rng()));
    }
    probe = keys;
    std::shuffle(probe.begin(), probe.end(), rng);
    probe.resize(std::min(n, kMaxProbes));
    for (const std::string &key : probe) absent.push_back(key + "+");
    std::shuffle(absent.begin(), absent.end(), rng);
  }
};

void StringCycleCoffer(const StringKeys &k, double *t) {
  const size_t n = k.keys.size();
  RbtTree *tree = RBT_AllocTree();
  Timed(&t[0], [&] {
    for (size_t i = 0; i < n; i++) RBT_Insert(tree, k.keys[i].c_str(), i);
  });
  Timed(&t[1], [&] {
    uintptr_t s = 0;
    for (const auto &key : k.probe) s += RBT_Find(tree, key.c_str())->val;
    g_sink = s;
  });
  Timed(&t[2], [&] {
    uintptr_t s = 0;
    for (const auto &key : k.absent)
      s += reinterpret_cast<uintptr_t>(RBT_LowerBound(tree, key.c_str()));
    g_sink = s;
  });
  Timed(&t[3], [&] {
    for (const auto &key : k.probe) RBT_Remove(tree, RBT_Find(tree, key.c_str()));
  });
  RBT_FreeTree(tree);
}

void StringCycleStd(const StringKeys &k, double *t) {
  const size_t n = k.keys.size();
  std::multimap<std::string, uint32_t> m;
  Timed(&t[0], [&] {
    for (size_t i = 0; i < n; i++) m.emplace(k.keys[i], i);
  });
  Timed(&t[1], [&] {
    uintptr_t s = 0;
    for (const auto &key : k.probe) s += m.find(key)->second;
    g_sink = s;
  });
  Timed(&t[2], [&] {
    uintptr_t s = 0;
    for (const auto &key : k.absent) {
      auto it = m.lower_bound(key);
      s += it == m.end() ? 0 : reinterpret_cast<uintptr_t>(&*it);
    }
    g_sink = s;
  });
  Timed(&t[3], [&] {
    for (const auto &key : k.probe) m.erase(m.find(key));
  });
}

// ---- paths -------------------------------------------------------------------

// Paths of 3 to 5 names; each name is a word and a number, with more choices
// deeper down, so upper levels are shared and lower ones fan out. probe is a
// permutation of the paths for the lookups.
struct PathKeys {
  std::vector<std::string> paths, probe;
  explicit PathKeys(size_t n) {
    static const char *const kWords[] = {"usr", "etc",   "var",    "opt",  "srv",   "home",
                                         "lib", "share", "config", "data", "cache", "log"};
    static const unsigned kFanout[] = {4, 16, 64, 256, 1024};
    std::mt19937 rng(3);
    for (size_t i = 0; i < n; i++) {
      std::string p;
      const unsigned depth = 3 + rng() % 3;
      for (unsigned level = 0; level < depth; level++)
        p += std::string("/") + kWords[rng() % 12] + std::to_string(rng() % kFanout[level]);
      paths.push_back(p);
    }
    probe = paths;
    std::shuffle(probe.begin(), probe.end(), rng);
  }
};

void PathCycleCoffer(const PathKeys &k, double *t) {
  const size_t n = k.paths.size();
  HstTree *tree = HST_AllocTree('/', 0, 4, 8);
  Timed(&t[0], [&] {
    for (size_t i = 0; i < n; i++) HST_Insert(tree, k.paths[i].c_str(), i);
  });
  Timed(&t[1], [&] {
    uintptr_t s = 0;
    for (const auto &key : k.probe) s += HST_GetVal(tree, HST_Find(tree, key.c_str()));
    g_sink = s;
  });
  HST_FreeTree(tree);
}

void PathCycleStd(const PathKeys &k, double *t) {
  const size_t n = k.paths.size();
  std::map<std::string, uint32_t> m;
  Timed(&t[0], [&] {
    for (size_t i = 0; i < n; i++) m[k.paths[i]] = i;
  });
  Timed(&t[1], [&] {
    uintptr_t s = 0;
    for (const auto &key : k.probe) s += m.find(key)->second;
    g_sink = s;
  });
}

// ---- sorted array and region heap, for reference -----------------------------

// The array is filled in key order, so that building it moves no entry.
void ArrayCycle(bool coffer, const StringKeys &k, double *t) {
  const size_t n = k.keys.size();
  if (coffer) {
    std::vector<std::string> sorted = k.keys;
    std::sort(sorted.begin(), sorted.end());
    EsaArray *a = ESA_AllocArray(0, 1024);
    for (size_t i = 0; i < n; i++) ESA_Insert(a, sorted[i].c_str(), i);
    Timed(&t[0], [&] {
      int32_t at, s = 0;
      for (const auto &key : k.probe) s += ESA_Find(a, key.c_str(), &at);
      g_sink = s;
    });
    ESA_FreeArray(a);
  } else {
    std::map<std::string, uint32_t> m;
    for (size_t i = 0; i < n; i++) m.emplace(k.keys[i], i);
    Timed(&t[0], [&] {
      size_t s = 0;
      for (const auto &key : k.probe) s += m.count(key);
      g_sink = s;
    });
  }
}

void HeapCycle(bool coffer, size_t n, double *t) {
  static std::vector<char> region(64u << 20);
  MemPool pool;
  MemPool_InitOnSimpleHeap(&pool, region.data(), region.size());
  std::mt19937 rng(11);
  std::vector<size_t> sizes(n), slots(n);
  for (size_t i = 0; i < n; i++) sizes[i] = 8 + rng() % 120, slots[i] = rng() % 1024;
  std::vector<void *> live(1024, nullptr);
  Timed(&t[0], [&] {
    for (size_t i = 0; i < n; i++) {
      void *&slot = live[slots[i]];
      if (coffer) {
        pool.free(&pool, slot);
        slot = pool.alloc(&pool, sizes[i]);
      } else {
        std::free(slot);
        slot = std::malloc(sizes[i]);
      }
    }
  });
  for (void *p : live) coffer ? pool.free(&pool, p) : std::free(p);
}

// ---- report --------------------------------------------------------------------

void PrintDetails() {
  std::printf("\n%-10s %-9s %-22s %12s %12s %7s\n", "family", "n", "phase", "coffer ns", "std ns",
              "ratio");
  for (const Pair &p : g_pairs)
    for (size_t i = 0; i < p.phases.size(); i++) {
      if (i == 0) std::printf("-- %s vs %s, %zu keys\n", p.family, p.versus, p.n);
      const double a = Median(p.coffer[i]), b = Median(p.other[i]);
      std::printf("%-10s %-9zu %-22s %12.1f %12.1f %7.2f\n", p.family, p.n, p.phases[i], a, b,
                  a / b);
    }
}

double Ratio(const char *family, size_t n, const char *phase) {
  for (const Pair &p : g_pairs)
    if (std::strcmp(p.family, family) == 0 && p.n == n)
      for (size_t i = 0; i < p.phases.size(); i++)
        if (std::strcmp(p.phases[i], phase) == 0) return Median(p.coffer[i]) / Median(p.other[i]);
  return 0;
}

// The summary in the layout of the project's measurement table.
void PrintSummary(const size_t *intSizes, const size_t *pathSizes) {
  std::printf("\nratio = coffer's time / the standard container's (below 1 coffer is faster)\n\n");
  std::printf("| operation | %zu keys | %zu keys | %zu keys |\n|---|---|---|---|\n", intSizes[0],
              intSizes[1], intSizes[2]);
  struct {
    const char *label, *phase;
  } const intRows[] = {
      {"`RbtInt32_Insert` vs `std::multimap<int32_t,uint32_t>`", "insert"},
      {"`RbtInt32_LowerBound` (absent keys)", "lower bound (absent)"},
      {"in-order walk with `RbtInt32_Next`", "walk with Next"},
      {"`RbtInt32_Find` + `RbtInt32_Remove`", "find + remove"},
      {"`RbtInt32_Find`", "find"},
  };
  for (const auto &r : intRows)
    std::printf("| %s | %.2f | %.2f | %.2f |\n", r.label, Ratio("RbtInt32", intSizes[0], r.phase),
                Ratio("RbtInt32", intSizes[1], r.phase), Ratio("RbtInt32", intSizes[2], r.phase));
  std::printf(
      "| `RBT_*` string keys, insert / find / lower bound / find + remove vs "
      "`std::multimap<std::string,uint32_t>` |");
  for (int s = 0; s < 3; s++)
    std::printf(" %.2f / %.2f / %.2f / %.2f |", Ratio("RBT", intSizes[s], "insert"),
                Ratio("RBT", intSizes[s], "find"),
                Ratio("RBT", intSizes[s], "lower bound (absent)"),
                Ratio("RBT", intSizes[s], "find + remove"));
  std::printf(
      "\n| `HST_Find` vs a `std::map` of full paths (depth 3 to 5) | %.2f (%zu) | %.2f (%zu) | |\n",
      Ratio("HST", pathSizes[0], "find"), pathSizes[0], Ratio("HST", pathSizes[1], "find"),
      pathSizes[1]);
  std::printf("| `HST_Insert` vs the same map | %.2f (%zu) | %.2f (%zu) | |\n",
              Ratio("HST", pathSizes[0], "insert"), pathSizes[0],
              Ratio("HST", pathSizes[1], "insert"), pathSizes[1]);
}

}  // namespace

int main(int argc, char **argv) {
  // Keep freed memory in the process, so that no repetition pays the kernel
  // for pages an earlier one gave back.
  mallopt(M_TRIM_THRESHOLD, 1 << 30);
  mallopt(M_MMAP_THRESHOLD, 1 << 30);

  const size_t intSizes[] = {1000, 100000, 1000000};
  const size_t pathSizes[] = {10000, 100000};
  auto wanted = [&](const char *family) {
    if (argc < 2) return true;
    for (int i = 1; i < argc; i++)
      if (std::strcmp(argv[i], family) == 0) return true;
    return false;
  };
  std::fprintf(stderr, "measuring");
  for (size_t n : intSizes) {
    if (!wanted("RbtInt32")) break;
    IntKeys k(n);
    Measure("RbtInt32", "std::multimap<int32_t,uint32_t>", n, k.probe.size(),
            {"insert", "lower bound (absent)", "walk with Next", "find", "find + remove"}, {0, 2},
            [&](bool coffer, double *t) { coffer ? IntCycleCoffer(k, t) : IntCycleStd(k, t); });
  }
  for (size_t n : intSizes) {
    if (!wanted("RBT")) break;
    StringKeys k(n);
    Measure(
        "RBT", "std::multimap<std::string,uint32_t>", n, k.probe.size(),
        {"insert", "find", "lower bound (absent)", "find + remove"}, {0},
        [&](bool coffer, double *t) { coffer ? StringCycleCoffer(k, t) : StringCycleStd(k, t); });
  }
  for (size_t n : pathSizes) {
    if (!wanted("HST")) break;
    PathKeys k(n);
    Measure("HST", "std::map<std::string,uint32_t> of full paths", n, k.probe.size(),
            {"insert", "find"}, {0},
            [&](bool coffer, double *t) { coffer ? PathCycleCoffer(k, t) : PathCycleStd(k, t); });
  }
  if (wanted("ESA")) {
    StringKeys k(20000);
    Measure("ESA", "std::map<std::string,uint32_t>", 20000, k.probe.size(), {"find"}, {},
            [&](bool coffer, double *t) { ArrayCycle(coffer, k, t); });
  }
  if (wanted("SH"))
    Measure("SH", "libc", 1000000, 1000000, {"free + alloc"}, {},
            [&](bool coffer, double *t) { HeapCycle(coffer, 1000000, t); });
  std::fprintf(stderr, "\n");
  PrintDetails();
  PrintSummary(intSizes, pathSizes);
  return 0;
}
