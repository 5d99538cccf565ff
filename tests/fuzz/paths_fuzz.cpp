// Fuzz target: the path calls of the string tree and the associative arrays
// on arbitrary path bytes and separators. Whatever the bytes, the trees stay
// sound (their checker), the caller's text is never written, and freeing
// them leaves nothing behind.
#include <coffer/hstaa.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "hst/hst_internal.h"
#include "support/test_pool.h"

namespace {

// A node's value counts what it holds, so a removal never takes more.
bool Keep(HstaaTree *, CofferVal cur, CofferVal op, CofferVal *out) { return *out = cur + 1, op != 3; }
bool Take(HstaaTree *, CofferVal cur, CofferVal, CofferVal *out) { return *out = cur - 1, cur != 0; }
bool Copy(HstTree *, CofferVal v, CofferVal *out) { return *out = v, true; }

void Fail(const char *what) {
  std::fprintf(stderr, "%s\n", what);
  std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
  if (size < 2) return 0;
  coffer_test::TestPool tp;
  HstaaTree t;
  std::memset(&t, 0, sizeof t);
  t.hst.mp = *tp.pool();
  t.insertValFn = Keep, t.removeValFn = Take, t.cloneValFn = Copy;
  if (!HST_CreateTreeData(&t.hst, static_cast<char>(data[0]), 0, 1, 1)) Fail("creation failed");
  // The rest is paths separated by NUL, each led by a byte that picks the call.
  std::string text(reinterpret_cast<const char *>(data + 1), size - 1);
  for (size_t at = 0; at < text.size();) {
    const char how = text[at];
    std::string path = text.substr(at + 1, text.find('\0', at + 1) - at - 1);
    at += path.size() + 2;
    const std::string before = path;
    bool complete;
    switch (how & 7) {
      case 0: HST_Insert(&t.hst, path.c_str(), 0); break;
      case 1: HST_Find(&t.hst, path.c_str()); break;
      case 2: HSTAA_FindPrefix(&t, path.c_str(), &complete); break;
      case 3: case 4: HSTAA_Insert(&t, path.c_str(), how & 3); break;
      default: HSTAA_Remove(&t, path.c_str(), 1); break;
    }
    if (path != before) Fail("the caller's path was written");
    coffer::CheckFault fault;
    if (!coffer::hst::HSTCheckTree(&t.hst, true, &fault)) Fail(fault.what);
  }
  HST_FreeTree(&t.hst);
  if (tp.held() || !tp.misuse.empty()) Fail("blocks left behind or released twice");
  return 0;
}
