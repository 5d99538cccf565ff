// SPDX-License-Identifier: MIT
// coffer-inspect: looks inside a coffer heap region kept in a file or a
// shared memory object, read-only. See coffer-inspect.1.
#include <csetjmp>
#include <csignal>
#include <cstdlib>
#include <cstring>

#include "roots/roots_internal.h"
#include "tools/inspect/inspect.h"
#include "tools/inspect/source.h"

namespace {

const char kUsage[] =
    "usage: coffer-inspect COMMAND [OPTIONS] (FILE | --shm NAME)\n"
    "\n"
    "Looks inside a coffer heap region, read-only.\n"
    "\n"
    "commands:\n"
    "  check                 every problem of the heap, the directory and each named\n"
    "                        container, with its offset; exit 0 intact, 1 damaged\n"
    "  stats                 blocks and bytes in use and free, largest free block,\n"
    "                        free-list length, fragmentation, block sizes\n"
    "  roots                 the named roots: names, kinds, records and sizes\n"
    "  dump NAME             the content of the container named NAME\n"
    "  dump --at OFFSET --kind KIND\n"
    "                        the content of the container whose record is at OFFSET;\n"
    "                        KIND: array, rbt, rbt-int32, rbt-voidptr, hst\n"
    "\n"
    "options:\n"
    "  --shm NAME            read the POSIX shared memory object NAME\n"
    "  --offset BYTES        the region starts this far into the file (a multiple of 4)\n"
    "  --json                one JSON document instead of text\n"
    "  --help                this text\n"
    "\n"
    "Exit status: 0 done (check: intact), 1 damaged or not found, 2 usage.\n";

struct Args {
  inspect::Request request = {inspect::kCheck, false, nullptr, 0, 0};
  inspect::Source source = {nullptr, nullptr, 0};
  bool help = false, haveAt = false;
};

bool Number(const char *text, uint64_t limit, uint64_t *out) {
  char *end;
  if (!text || !*text || *text == '-') return false;
  const unsigned long long v = std::strtoull(text, &end, 0);
  if (*end || v > limit) return false;
  *out = v;
  return true;
}

bool Command(const char *word, inspect::Command *out) {
  static const char *const kNames[] = {"check", "stats", "roots", "dump"};
  for (int i = 0; i < 4; i++)
    if (std::strcmp(word, kNames[i]) == 0) return *out = static_cast<inspect::Command>(i), true;
  return false;
}

// The words that are not options: the command, dump's name unless --at is
// given, then the file unless --shm is.
const char *Positionals(Args &a, const char *const *words, int n) {
  if (n == 0) return "no command";
  if (!Command(words[0], &a.request.command)) return "unknown command";
  int next = 1;
  if (a.request.command == inspect::kDump && !a.haveAt && next < n) a.request.name = words[next++];
  if (!a.source.shm && next < n) a.source.path = words[next++];
  return next < n ? "too many arguments" : nullptr;
}

const char *Parse(int argc, char **argv, Args &a) {
  const char *words[4];
  int count = 0;
  for (int i = 1; i < argc; i++) {
    const char *arg = argv[i], *value = i + 1 < argc ? argv[i + 1] : nullptr;
    uint64_t n;
    if (std::strcmp(arg, "--help") == 0 || std::strcmp(arg, "-h") == 0) {
      a.help = true;
    } else if (std::strcmp(arg, "--json") == 0) {
      a.request.json = true;
    } else if (std::strcmp(arg, "--shm") == 0) {
      if (!value || a.source.path || a.source.shm) return "--shm needs a name, and only one region";
      a.source.shm = argv[++i];
    } else if (std::strcmp(arg, "--offset") == 0) {
      if (!Number(value, ~0ull >> 1, &n)) return "--offset needs a number of bytes";
      a.source.offset = n, i++;
    } else if (std::strcmp(arg, "--at") == 0) {
      if (!Number(value, 0xFFFFFFFFu, &n)) return "--at needs an offset";
      a.request.at = static_cast<uint32_t>(n), a.haveAt = true, i++;
    } else if (std::strcmp(arg, "--kind") == 0) {
      if (!value || !(a.request.kind = coffer::RootsKindNamed(value))) return "--kind needs array, rbt, rbt-int32, rbt-voidptr or hst";
      i++;
    } else if (arg[0] == '-' && arg[1] == '-') {
      return "unknown option";
    } else if (count == 4) {
      return "too many arguments";
    } else {
      words[count++] = arg;
    }
  }
  return a.help ? nullptr : Positionals(a, words, count);
}

const char *Validate(const Args &a) {
  if (!a.source.path && !a.source.shm) return "no region: give a file or --shm NAME";
  if (a.request.command != inspect::kDump) return a.haveAt || a.request.kind ? "--at and --kind are for dump" : nullptr;
  if (a.haveAt != (a.request.kind != 0)) return "dump --at needs --kind, and --kind needs --at";
  if (a.haveAt == (a.request.name != nullptr)) return "dump needs a name or --at with --kind";
  return nullptr;
}

// A file that shrinks under the mapping raises SIGBUS on the next read; the
// tool reports it instead of dying.
sigjmp_buf g_shrunk;
void OnBusError(int) { siglongjmp(g_shrunk, 1); }

}  // namespace

int main(int argc, char **argv) {
  Args a;
  const char *usage = Parse(argc, argv, a);
  if (a.help) return std::fputs(kUsage, stdout), 0;
  if (!usage) usage = Validate(a);
  if (usage) {
    inspect::Refuse(a.request.json, stdout, usage);
    std::fputs("try: coffer-inspect --help\n", stderr);
    return 2;
  }
  inspect::Image image;
  if (const char *why = inspect::OpenImage(a.source, &image)) return inspect::Refuse(a.request.json, stdout, why);
  if (sigsetjmp(g_shrunk, 1)) {
    std::fflush(stdout);
    return inspect::Refuse(a.request.json, stdout, "the region shrank while it was read");
  }
  std::signal(SIGBUS, OnBusError);
  const int status = inspect::Run(a.request, image.bytes, image.size, stdout);
  inspect::CloseImage(&image);
  return status;
}
