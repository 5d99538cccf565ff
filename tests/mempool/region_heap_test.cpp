// The region heap: random operations against the model, and scripts of the
// sharp edges: exact layouts, refusals, and damaged regions as the checker
// and the heap's own checks see them.
#include <gtest/gtest.h>

#include <random>
#include <sstream>

#include "heap_driver.h"

namespace {

using namespace coffer_test;
using coffer::ShOutcome;
using coffer::ShRefusal;

TEST(RegionHeapModel, RandomOperationsMatchTheModel) {
  for (uint8_t sizeIndex = 0; sizeIndex < 7; ++sizeIndex)
    for (uint32_t seed = 1; seed <= 3; ++seed) {
      std::mt19937 rng(seed * 7919 + sizeIndex);
      std::vector<uint8_t> bytes(4 * 3000);
      for (auto &b : bytes) b = static_cast<uint8_t>(rng());
      bytes[0] = sizeIndex;
      ASSERT_EQ(DriveHeap(bytes.data(), bytes.size()), "") << int{sizeIndex} << " " << seed;
    }
}

// A script runs heap calls on a 4096-byte buffer filled with 0xA5, each
// token with what it must return or leave. p<i> is the i-th block it got.
//   R<size>[!]          SH_Reset returns 0 (!: -1)
//   A<size>:<off>       allocation returns payload offset off (0: null)
//   Z<i>,<size>:<off>   resize of p<i> (i 9: of null) returns off
//   F<i>, F@<off>       release of p<i>, of the address region + off
//   ...!<at>, ...#<at>  the call is refused, the region left as it was: not
//                       an allocated block (at: its offset), damaged at at
//   @<off>:<w>,...      the header words at off are these (-1: SH_NO_BLOCK)
//   W<off>:<w>          writes a word there (damage)
//   X<fault>@<at>,...   the checker, mapping the last R's size, reports
//                       exactly these faults (ShFault numbers); X: none
//   S, U                takes a snapshot; nothing changed since it
std::vector<long long> Numbers(const std::string &t) {
  std::vector<long long> v;
  for (const char *s = t.c_str() + 1; *s;) {
    char *end;
    long long n = std::strtoll(s, &end, 0);
    end == s ? ++s : (v.push_back(n), s = end);
  }
  return v;
}

void RunScript(const std::string &script) {
  SCOPED_TRACE(script);
  Region r(4096);
  std::vector<void *> p;
  std::vector<uint32_t> snap, before;
  long long mapped = 0;
  std::istringstream in(script);
  for (std::string t; in >> t;) {
    ShOutcome out = {ShRefusal::kNone, 0}, want = out;
    size_t cut = t[0] == 'R' ? std::string::npos : t.find_first_of("!#");
    if (cut != std::string::npos)
      want = {t[cut] == '!' ? ShRefusal::kNotAllocated : ShRefusal::kDamaged,
              uint32_t(std::stoll(t.substr(cut + 1)))};
    std::vector<long long> v = Numbers(t.substr(0, cut));
    auto block = [&](long long i) { return size_t(i) < p.size() ? p[i] : nullptr; };
    std::vector<std::pair<coffer::ShFault, uint32_t>> faults, expected;
    auto keep = [](void *c, coffer::ShFault f, uint32_t at) {
      static_cast<decltype(faults) *>(c)->push_back({f, at});
    };
    void *q = nullptr;
    before = r.words;
    switch (t[0]) {
      case 'R':
        EXPECT_EQ(SH_Reset(r.base(), mapped = v[0]), t.back() == '!' ? -1 : 0) << t;
        break;
      case 'A':
        if ((q = coffer::SHAllocChecked(r.base(), v[0], &out))) p.push_back(q);
        EXPECT_EQ(r.off(q), v[1]) << t;
        break;
      case 'Z':
        q = coffer::SHReallocChecked(r.base(), block(v[0]), v[1], &out);
        EXPECT_EQ(r.off(q), v[2]) << t;
        if (v[0] == 9 && q)
          p.push_back(q);
        else if (q || v[1] == 0)
          p[v[0]] = q;
        break;
      case 'F':
        coffer::SHFreeChecked(r.base(), t[1] == '@' ? r.base() + v[0] : block(v[0]), &out);
        break;
      case '@':
        for (size_t i = 1; i < v.size(); ++i)
          EXPECT_EQ(r.word(v[0])[i - 1], uint32_t(v[i])) << t << " word " << i - 1;
        break;
      case 'W':
        *r.word(v[0]) = uint32_t(v[1]);
        break;
      case 'X':
        for (size_t i = 0; i + 1 < v.size(); i += 2)
          expected.push_back({coffer::ShFault(v[i]), v[i + 1]});
        coffer::SHCheckRegion(r.base(), mapped, nullptr, keep, &faults);
        EXPECT_EQ(faults, expected) << t;
        break;
      case 'S':
        snap = r.words;
        break;
      default:
        EXPECT_EQ(r.words, snap) << t;
    }
    EXPECT_EQ(out.refusal, want.refusal) << t;
    EXPECT_EQ(out.at, want.at) << t;
    EXPECT_TRUE(out.refusal == ShRefusal::kNone || r.words == before) << t;
  }
}

// Blocks 16 48 80 112 144 176 (p0 to p5) and the rest at 208; 48 and 112
// free, the free list 112 48 208.
#define SIX "R1024 A16:32 A16:64 A16:96 A16:128 A16:160 A16:192 F1 F3 "

TEST(RegionHeapEdges, Scripts) {
  const char *scripts[] = {
      // formatting, and the smallest region: one block that holds 0 bytes
      "S R32! U R33 @0:33,16 @16:17,0,-1,-1 A1:0 A0:32 @0:33,-1 @16:17,0,0,0 A0:0",
      // the reserved words and payloads are never written; a split when more
      // than 16 bytes would be left, the whole block otherwise
      "R4096 @0:4096,16,0xA5A5A5A5,0xA5A5A5A5 @16:4080,0,-1,-1 A5:32 @16:24,0,0,0 "
      "@32:0xA5A5A5A5 @40:4056,24,-1,-1 A0:56 @40:16,24,0,0 @56:4040,16,-1,-1 @0:4096,56",
      "R64 A16:32 @16:48,0,0,0 @0:64,-1",
      "R64 A12:32 @16:28,0,0,0 @44:20,28,-1,-1",
      // the lower of the first two fits, though the higher heads the list
      "R1024 A16:32 A16:64 A16:96 A16:128 A16:160 F1 F3 @0:1024,112 @112:32,32,48,-1 A16:64",
      // a release merges forward, then backward into a block that keeps its place
      "R1024 A16:32 A16:64 A16:96 A16:128 A16:160 A16:192 F2 F1 @48:64,32,208,-1 "
      "@208:816,32,-1,48 F3 @0:1024,48 @48:96,32,208,-1 @144:32,96,0,0",
      // resizing: in place only at the exact capacity, otherwise moved
      "R1024 A21:32 Z0,24:32 Z0,8:72 @0:1024,16 @16:40,0,80,-1 Z9,8:32 Z1,0:0 Z0,0:0 "
      "@0:1024,16 @16:1008,0,-1,-1",
      // refusals write nothing: sizes that would wrap, no room, no resize in
      // place, a second release, addresses that are no payload of the region
      "R256 A100:32 S A0xFFFFFFFF:0 A0xFFFFFFFD:0 A0xFFFFFFFC:0 A109:0 Z0,200:0 Z0,109:0 F9 U "
      "A108:148 F0 F0!32 Z0,8:0!32 F@4!4 F@2000!2000 F@34!34 F@8!8",
      // a resize checks the release before it allocates
      "R256 A8:32 A8:56 F0 W20:36 Z1,4:0#16",
      // one row per fault of the checker, with a heap call that meets it;
      // free blocks side by side are untidy, not damage: joined when touched
      SIX "W88:48 W92:112 W120:80 W60:80 X0@80,0@112 F4 X @48:128,32,208,-1 @176:32,128",
      SIX "W0:32 X1@0 A1:0#0",
      SIX "W0:1028 X2@0 F5#208",  // the heap cannot know the mapping
      SIX "W208:808 X3@1016 F5#208",
      SIX "W176:8 X4@176 F5#176",
      SIX "W208:820 X5@208 A800:0#208",
      SIX "W208:820 X5@208 A16:0#208",      // met as the next on the list
      SIX "W16:30 X6@16 F0#16",
      SIX "W84:36 X7@80 F2#80",
      SIX "W60:0 X8@48,13@208 A20:0#48",
      SIX "W216:212 X9@208 A900:0#212",
      SIX "W4:2000 X9@0,13@48,13@112,13@208 A20:0#0",
      SIX "W216:176 X10@208 A900:0#208",
      SIX "W60:208 X11@48 A20:0#48",
      SIX "W216:112 X12@208 A900:0#112",
      SIX "W120:208 W124:-1 W220:112 X13@48 F2#48",
      // a resize whose allocation, from a block too large, breaks the release
      // it checked before: the allocation is undone
      SIX "W48:200 W252:200 Z4,24:0#80",
  };
  for (const char *s : scripts) RunScript(s);
}

}  // namespace
