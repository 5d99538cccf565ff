// SPDX-License-Identifier: MIT
// The associative arrays' sharp edges: how keys are classified, paths that
// name nothing, and propagation modes that change nothing.
#include <coffer/hstaa.h>
#include <gtest/gtest.h>

#include <cstring>
#include <functional>

namespace {

TEST(Hstaa, KeyClasses) {
  const struct {
    const char *key, *rep;
    bool isRep;
  } kKeys[] = {{"#", nullptr, true},    {"##", nullptr, true}, {"#0", "#", false},
               {"#!", "#", false},      {"# ", "#", false},    {"#abc", "#", false},
               {"##0", "##", false},    {"###", "##", false},  {"", nullptr, false},
               {"a#", nullptr, false},  {"#\x80", "#", false}};
  for (const auto &k : kKeys) {
    const char *rep = HSTAA_GetArrayRep(k.key);
    EXPECT_EQ(rep ? std::string(rep) : "-", k.rep ? k.rep : "-") << k.key;
    EXPECT_EQ(HSTAA_IsArrayRep(k.key), k.isRep) << k.key;
    EXPECT_EQ(HSTAA_IsArrayIndex(k.key), k.rep != nullptr) << k.key;
  }
  EXPECT_EQ(HSTAA_GetArrayRep("#1"), HSTAA_GetArrayRep("#x"));  // one string per mark
  EXPECT_EQ(HSTAA_GetArrayRep("##1"), HSTAA_GetArrayRep("###"));
}

bool Add(HstaaTree *, CofferVal cur, CofferVal op, CofferVal *out) { return *out = cur + op, true; }

// A tree on the process heap whose callbacks add the operand.
struct Tree : HstaaTree {
  Tree() : HstaaTree{} {
    MemPool_InitOnStdHeap(&hst.mp);
    insertValFn = removeValFn = Add;
    cloneValFn = [](HstTree *, CofferVal v, CofferVal *out) { return *out = v, true; };
    EXPECT_TRUE(HST_CreateTreeData(&hst, '/', 0, 1, 1));
  }
};

// An empty absolute path has no first character to skip and names nothing;
// a mode other than insertion and removal visits the elements and changes
// nothing.
TEST(Hstaa, PathsThatNameNothingAndIdleModes) {
  Tree t;
  HstNode *root = HST_GetRoot(&t.hst);
  bool complete = true;
  EXPECT_EQ(HSTAA_FindPrefix(&t, "", &complete), root);
  EXPECT_FALSE(complete);
  EXPECT_EQ(HSTAA_Insert(&t, "", 1), nullptr);
  EXPECT_TRUE(HSTAA_Remove(&t, "", 1));
  ASSERT_NE(HSTAA_Insert(&t, "/l/#1/p", 1), nullptr);
  HstNode *l = HST_Find(&t.hst, "/l");
  HstNode *rep = HST_InsertChild(&t.hst, l, "#", 0);
  char rest[] = "p";
  EXPECT_TRUE(HSTAAPropagateVal(&t, 2, l, rep, rest, 5));
  EXPECT_TRUE(HSTAAPropagateVal(&t, HSTAA_PROPAGATE_INSERT, l, HST_Find(&t.hst, "/l/#1"), rest, 5));
  EXPECT_EQ(HST_GetVal(&t.hst, HST_Find(&t.hst, "/l/#1/p")), 1u);
  EXPECT_EQ(HSTAA_GetSubtreeValCount(&t, root), 1);
  HST_FreeTree(&t.hst);  // the caller's handle stays, naming no record
  EXPECT_EQ(t.hst.data, nullptr);
}

#ifndef __SANITIZE_ADDRESS__  // the sanitizer owns malloc there, and finds leaks itself
// The path calls copy the path with malloc and free the copy before they
// return; when the copy is refused they fail and change nothing.
long g_heldBlocks;
bool g_refuseMalloc;
}  // namespace

extern "C" void *__libc_malloc(size_t);
extern "C" void __libc_free(void *);
extern "C" void *malloc(size_t n) {
  if (g_refuseMalloc) return g_refuseMalloc = false, nullptr;
  void *p = __libc_malloc(n);
  g_heldBlocks += p != nullptr;
  return p;
}
extern "C" void free(void *p) {
  g_heldBlocks -= p != nullptr;
  __libc_free(p);
}

namespace {

TEST(Hstaa, PathCopies) {
  Tree t;
  HstNode *b = HSTAA_Insert(&t, "/a/b", 1);
  bool complete = false;
  const std::function<bool()> kCalls[] = {
      [&] { return HST_Find(&t.hst, "/a/b") == b; },
      [&] { return HST_Insert(&t.hst, "/a/b", 1) == b; },
      [&] { return HSTAA_FindPrefix(&t, "/a/b", &complete) == b; },
      [&] { return HSTAA_Insert(&t, "/a/b", 1) == b; },
      [&] { return HSTAA_Remove(&t, "/a/b", 9); },
  };
  for (const auto &call : kCalls) {
    const long held = g_heldBlocks;
    EXPECT_TRUE(call());
    EXPECT_EQ(g_heldBlocks, held);
    complete = true;
    g_refuseMalloc = true;
    EXPECT_FALSE(call());
    EXPECT_TRUE(complete);  // not written when the copy is refused
  }
  EXPECT_EQ(HST_GetVal(&t.hst, b), 11u);  // 1, set to 1, +1, +9: nothing twice
  HST_FreeTree(&t.hst);
}
#endif

}  // namespace
