// A process killed inside a heap call, holding the shared pool's lock, must
// leave a region that the next process either uses safely or refuses with
// the damaged-region report. This program links its own build of the heap
// with a kill point after every header write, and runs each call once per
// point with the caller killed (SIGKILL) there.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <regex>

#include "../heap_driver.h"

namespace {
int g_killAt = 0, g_points = 0;
}
extern "C" void CofferHeapKillPoint(void) {
  if (++g_points == g_killAt) kill(getpid(), SIGKILL);
}

namespace {

using namespace coffer_test;
constexpr uint32_t kRegion = 2048, kBlocks = 10;
struct Area {
  TandelExclLock lock;
  alignas(16) char region[kRegion];
};

// Ten stamped blocks of 64 bytes, the third, fifth and eighth free (free
// list 7 4 2, then the rest of the region).
std::vector<void *> Lay(Area *a, MemPool *mp) {
  std::memset(a, 0xA5, sizeof *a);
  Tandel_InitExclLock(&a->lock);
  MemPool_InitOnSharedHeap(mp, a->region, kRegion, &a->lock);
  std::vector<void *> p;
  for (uint32_t i = 0; i < kBlocks; ++i) Stamp(p.emplace_back(mp->alloc(mp, 48)), 48, i);
  for (int i : {2, 4, 7}) mp->free(mp, p[i]), p[i] = nullptr;
  return p;
}

// Runs fn in a child process; returns its wait status and standard error.
int InChild(const std::function<void()> &fn, std::string *err) {
  int fds[2], status = -1;
  if (pipe(fds) != 0) return -1;
  pid_t pid = fork();
  if (pid == 0) dup2(fds[1], 2), fn(), _exit(0);
  close(fds[1]);
  char buf[256];
  for (ssize_t n; (n = read(fds[0], buf, sizeof buf)) > 0;) err->append(buf, n);
  close(fds[0]);
  waitpid(pid, &status, 0);
  return status;
}

// The next process attaches, allocates, checks and releases the blocks the
// killed one did not work on, and releases its own.
void NextCaller(Area *a, std::vector<void *> held, uint32_t victim) {
  MemPool mp;
  MemPool_InitOnSharedHeap(&mp, a->region, 0, &a->lock);
  if (victim < kBlocks) held[victim] = nullptr;
  for (uint32_t size : {24u, 200u, 8u}) Stamp(held.emplace_back(mp.alloc(&mp, size)), 8, 99);
  for (uint32_t i = 0; i < held.size(); ++i)
    if (held[i] && !Stamped(held[i], 8, i < kBlocks ? i : 99)) _exit(3);
  for (void *q : held) mp.free(&mp, q);
}

TEST(RegionKill, EveryKillPointLeavesTheRegionUsableOrRefused) {
  using Call = std::function<void(MemPool *, std::vector<void *> &)>;
  auto alloc = [](size_t n) -> Call { return [n](MemPool *mp, auto &) { mp->alloc(mp, n); }; };
  auto free = [](int i) -> Call { return [i](MemPool *mp, auto &p) { mp->free(mp, p[i]); }; };
  auto resize = [](int i, size_t n) -> Call {
    return [i, n](MemPool *mp, auto &p) { mp->realloc(mp, p[i], n); };
  };
  const struct {
    const char *call;
    uint32_t victim;  // the block the killed call releases or moves
    Call run;
  } scenarios[] = {
      {"SH_Alloc", kBlocks, alloc(8)},    // split a block in the middle of the list
      {"SH_Alloc", kBlocks, alloc(48)},   // take a whole one
      {"SH_Alloc", kBlocks, alloc(600)},  // split the last block on the list
      {"SH_Free", 0, free(0)},            // no free neighbour
      {"SH_Free", 6, free(6)},            // a free one after
      {"SH_Free", 9, free(9)},            // the free rest of the region after
      {"SH_Free", 5, free(5)},            // a free one before
      {"SH_Free", 3, free(3)},            // free ones on both sides
      {"SH_Realloc", 5, resize(5, 100)},  // grow: a new block, a release that merges
      {"SH_Realloc", 8, resize(8, 8)},    // shrink
      {"SH_Realloc", 3, resize(3, 0)},    // release
  };
  auto *a = static_cast<Area *>(
      mmap(nullptr, sizeof(Area), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));
  std::map<std::string, std::pair<int, int>> outcomes;  // used safely, refused
  const std::regex refusal("Shared heap region damaged at offset ([0-9]+)\\.\n");
  for (const auto &s : scenarios) {
    MemPool mp;
    std::vector<void *> held = Lay(a, &mp);
    g_points = 0;
    s.run(&mp, held);
    for (int k = 1, points = g_points; k <= points; ++k) {
      SCOPED_TRACE(std::string(s.call) + " on " + std::to_string(s.victim) + " killed at " +
                   std::to_string(k) + " of " + std::to_string(points));
      held = Lay(a, &mp);
      std::string err;
      int status = InChild([&] { g_points = 0, g_killAt = k, s.run(&mp, held); }, &err);
      ASSERT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL) << status << err;
      std::vector<uint32_t> faults;
      coffer::SHCheckRegion(
          a->region, kRegion, nullptr,
          [](void *c, coffer::ShFault f, uint32_t at) {
            if (coffer::SHFaultIsDamage(f)) static_cast<std::vector<uint32_t> *>(c)->push_back(at);
          },
          &faults);
      status = InChild([&] { NextCaller(a, held, s.victim); }, &err);
      std::smatch m;
      if (status == 0) {  // then the region must be sound, holding at most what was killed
        coffer::ShHeapCounts c;
        EXPECT_NE(coffer::SHCheckRegion(a->region, kRegion, &c, nullptr, nullptr),
                  coffer::ShHeapState::kDamaged);
        EXPECT_LE(c.allocatedBlocks, 2u);
        outcomes[s.call].first++;
      } else {  // refused where the checker finds damage too
        ASSERT_TRUE(std::regex_search(err, m, refusal)) << status << " " << err;
        EXPECT_NE(std::count(faults.begin(), faults.end(), std::stoul(m[1])), 0) << err;
        outcomes[s.call].second++;
      }
    }
  }
  for (const auto &[call, n] : outcomes)
    std::printf("%s: %d kill points, %d used safely, %d refused\n", call.c_str(),
                n.first + n.second, n.first, n.second);
  munmap(a, sizeof(Area));
}

}  // namespace
