// The shared library as a program sees it: exactly the public calls are
// exported, and the platform calls are bound by the dynamic linker so a
// program can interpose its own.
#include <coffer/coffer.h>
#include <gtest/gtest.h>

#include <csetjmp>
#include <cstdarg>
#include <cstdio>
#include <fstream>
#include <regex>
#include <set>
#include <string>

namespace {

std::set<std::string> OutputLines(const std::string &cmd) {
  std::set<std::string> out;
  FILE *f = popen(cmd.c_str(), "r");
  if (!f) return out;
  char line[512];
  while (std::fgets(line, sizeof line, f)) {
    std::string s(line);
    while (!s.empty() && (s.back() == '\n' || s.back() == ' ')) s.pop_back();
    if (!s.empty()) out.insert(s);
  }
  pclose(f);
  return out;
}

std::set<std::string> ListedExports() {
  std::ifstream map(COFFER_SYMBOL_LIST);
  std::string text((std::istreambuf_iterator<char>(map)), std::istreambuf_iterator<char>());
  std::set<std::string> names;
  std::regex name("\\b(MemPool_|SH_|ESA_|RBT_|Rbt|HST)[A-Za-z0-9_]*(?=;)");
  for (std::sregex_iterator it(text.begin(), text.end(), name), end; it != end; ++it)
    names.insert(it->str());
  return names;
}

TEST(Library, ExportsExactlyThePublicCalls) {
  std::set<std::string> exported = OutputLines(std::string("nm -D --defined-only ") + COFFER_LIBRARY_PATH +
                                       " | awk '$2 != \"A\" {sub(/@.*/, \"\", $3); print $3}'");
  std::set<std::string> listed = ListedExports();
  EXPECT_EQ(listed.size(), 124u);
  EXPECT_EQ(exported, listed);
}

TEST(Library, PlatformCallsAreLeftToTheDynamicLinker) {
  // Names without their version (Panic@COFFER_PLATFORM_1).
  std::set<std::string> undefined =
      OutputLines(std::string("nm -D --undefined-only ") + COFFER_LIBRARY_PATH +
                  " | awk '{sub(/@.*/, \"\", $2); print $2}'");
  EXPECT_TRUE(undefined.count("Panic"));
  EXPECT_TRUE(undefined.count("Tandel_AcquireExclLock"));
  EXPECT_TRUE(undefined.count("Tandel_ReleaseExclLock"));
  bool soname = false;
  for (const std::string &line : OutputLines(std::string("readelf -d ") + COFFER_LIBRARY_PATH)) {
    if (line.find("(SONAME)") != std::string::npos)
      soname = line.find("[libcoffer.so.1]") != std::string::npos;
    // Binding symbols inside the library would defeat interposition.
    EXPECT_EQ(line.find("SYMBOLIC"), std::string::npos) << line;
  }
  EXPECT_TRUE(soname);
}

// This program's own Panic replaces the platform layer's for the library.
std::jmp_buf g_panicked;
char g_message[256];
}  // namespace

extern "C" void Panic(const char *format, ...) {
  va_list args;
  va_start(args, format);
  std::vsnprintf(g_message, sizeof g_message, format, args);
  va_end(args);
  std::longjmp(g_panicked, 1);
}

namespace {

TEST(Library, ProgramsCanInterposePanic) {
  MemPool pool;
  MemPool_InitOnStdHeap(&pool);
  g_message[0] = 0;
  if (setjmp(g_panicked) == 0) {
    pool.calloc(&pool, 0x10000, 0x10000);
    FAIL() << "calloc returned";
  }
  EXPECT_STREQ(g_message, "MemPoolStdHeapCalloc: integer overflow (65536, 65536");
}

}  // namespace
