// coffer-inspect run as a process on regions the test writes behind a
// header of 64 bytes: intact, damaged in each way the heap checker knows,
// and random bytes.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <unistd.h>

#include <cstdlib>
#include <cstring>

#include "roots/region.h"
#include "support/driver.h"

namespace coffer_test {
namespace {

// The region with a directory naming its five containers.
struct Named : Region {
  Named() {
    Roots_CreateDirectory(&pool);
    const char *const names[] = {"array", "rbt", "int", "ptr", "tree"};
    for (int i = 0; i < 5; i++) Roots_Set(&pool, names[i], i + 1, c[i]);
  }
};

// The tool's exit status (-1 when it did not exit by itself: a sanitizer's
// report exits 86) and what it printed.
std::pair<int, std::string> Inspect(const std::vector<uint32_t> &words, const std::string &command,
                                    const std::string &more = "") {
  const std::string file = ::testing::TempDir() + "coffer-inspect-" + std::to_string(getpid());
  FILE *f = std::fopen(file.c_str(), "wb");
  std::fwrite(std::string(64, '#').data(), 1, 64, f);
  std::fwrite(words.data(), 4, words.size(), f);
  std::fclose(f);
  setenv("ASAN_OPTIONS", "exitcode=86", 1), setenv("UBSAN_OPTIONS", "exitcode=86", 1);
  FILE *p = popen((COFFER_INSPECT " " + command + " --offset 64 " + file + " " + more + " 2>&1").c_str(), "r");
  std::string out(1 << 16, '\0');
  out.resize(std::fread(&out[0], 1, out.size(), p));
  const int status = pclose(p);
  return {WIFEXITED(status) && WEXITSTATUS(status) != 86 ? WEXITSTATUS(status) : -1, out};
}

TEST(Inspect, EveryCommandOnAnIntactRegion) {
  Named r;
  const std::pair<std::string, const char *> kRuns[] = {  // a command and a line it prints
      {"check", "intact\n"},
      {"stats", "\nfree list length    "},
      {"roots", "\"tree\"  hst"},
      {"dump array", "\n\"y\" = 1\n"},
      {"dump rbt", "rbt: 2 nodes, height 2\n"},
      {"dump --kind rbt-int32 --at " + std::to_string(r.rec(2)), "\n121 = 3\n"},
      {"dump ptr", "rbt-voidptr: 2 nodes, height 2\n"},
      {"dump tree", "\n    \"/x/y\" = 5  (count 0)\n"},
  };
  for (const auto &[command, line] : kRuns) {
    auto [status, out] = Inspect(r.words, command);
    EXPECT_EQ(status, 0) << command;
    EXPECT_NE(out.find(line), std::string::npos) << command << ":\n" << out;
    std::tie(status, out) = Inspect(r.words, command, "--json");
    EXPECT_TRUE(status == 0 && out.front() == '{' && out.back() == '\n') << command << ":\n" << out;
  }
  EXPECT_EQ(Inspect(r.words, "dump none").first, 1);
  EXPECT_EQ(Inspect(r.words, "dump --at 20 --kind hst").first, 1);
  EXPECT_EQ(Inspect(r.words, "check", "--offset 62").first, 1);
  EXPECT_EQ(Inspect(r.words, "stats", "--offset 60").first, 1);  // the program's header is no region
  EXPECT_EQ(Inspect(r.words, "unknown").first, 2);
}

// Each row damages the region as one fault of the heap checker, of the
// directory or of a container would; check must exit 1 naming the offset.
// A is the first allocated block, F the first free one.
TEST(Inspect, DamageIsReportedWithItsOffset) {
  const struct {
    const char *what;
    uint32_t (*damage)(Region &, uint32_t A, uint32_t F);  // returns the offset named
  } kRows[] = {
      {"region too small", [](Region &r, uint32_t, uint32_t) { return r.word(0) = 32, 0u; }},
      {"region past the mapping", [](Region &r, uint32_t, uint32_t) { return r.word(0) = kSize + 4, 0u; }},
      {"header truncated", [](Region &r, uint32_t o, uint32_t) {
         for (o = 16; o + r.word(o) < kSize;) o += r.word(o);  // the last block
         return r.word(o) -= 8, kSize - 8;
       }},
      {"block too small", [](Region &r, uint32_t A, uint32_t) { return r.word(A) = 8, A; }},
      {"block past the end", [](Region &r, uint32_t A, uint32_t) { return r.word(A) = kSize, A; }},
      {"block misaligned", [](Region &r, uint32_t A, uint32_t) { return r.word(A) += 2, A; }},
      {"previous size", [](Region &r, uint32_t A, uint32_t) { return r.word(A + 4) += 4, A; }},
      {"half free", [](Region &r, uint32_t A, uint32_t) { return r.word(A + 8) = 16, A; }},
      {"link to no block", [](Region &r, uint32_t, uint32_t F) { return r.word(F + 8) = F + 4, F; }},
      {"link to an allocated block", [](Region &r, uint32_t A, uint32_t) { return r.word(4) = A, 0u; }},
      {"back link", [](Region &r, uint32_t A, uint32_t F) { return r.word(F + 12) = A, F; }},
      {"list cycle", [](Region &r, uint32_t, uint32_t F) { return r.word(F + 8) = F, F; }},
      {"free block unlisted", [](Region &r, uint32_t, uint32_t F) { return r.word(4) = SH_NO_BLOCK, F; }},
      {"directory", [](Region &r, uint32_t, uint32_t) { return r.word(r.word(12) + 12) = 9, r.word(12); }},
      {"container", [](Region &r, uint32_t, uint32_t) { return r.word(r.rec(1) + 4) = 0, r.rec(1); }},
  };
  for (const auto &row : kRows) {
    Named r;
    uint32_t F = r.word(4), at = row.damage(r, 16, F);
    const auto [status, out] = Inspect(r.words, "check");
    EXPECT_EQ(status, 1) << row.what << ":\n" << out;
    EXPECT_NE(out.find("at " + std::to_string(at) + ":"), std::string::npos) << row.what << ":\n" << out;
  }
}

TEST(Inspect, RandomBytesGiveAnAnswerNeverACrash) {
  for (uint32_t seed = 1; seed <= 6; seed++) {
    std::vector<uint8_t> bytes = RandomBytes(seed, 4096);
    std::vector<uint32_t> words(1024);
    std::memcpy(words.data(), bytes.data(), 4096);
    if (seed % 2) words[0] = 4096, words[1] %= 4096;  // a plausible header, hostile blocks
    for (const char *command : {"check", "stats", "roots", "dump --at 32 --kind hst"}) {
      const int status = Inspect(words, command).first;
      EXPECT_TRUE(status == 0 || status == 1) << command << " seed " << seed;
    }
  }
}

}  // namespace
}  // namespace coffer_test
