// Key classification and the array-aware prefix lookup.
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>

#include "hstaa_fixture.h"
#include "support/test_pool.h"

using hstaa_test::TestTree;

namespace {

struct KeyRow {
  const char *key;
  bool isRep;
  const char *rep;  // expected text, or null
};

TEST(HstaaKeys, ClassificationTable) {
  const KeyRow rows[] = {
      {"#", true, nullptr},   {"##", true, nullptr},   {"#0", false, "#"},
      {"#x", false, "#"},     {"#!", false, "#"},      {"# ", false, "#"},
      {"#01", false, "#"},    {"#abc", false, "#"},    {"#-", false, "#"},
      {"#\x7f", false, "#"},  {"#\xff#", false, "#"},  {"##0", false, "##"},
      {"###", false, "##"},   {"##\x01", false, "##"}, {"####", false, "##"},
      {"", false, nullptr},   {"a", false, nullptr},   {"a#", false, nullptr},
      {" #", false, nullptr}, {"x##", false, nullptr},
  };
  for (const KeyRow &r : rows) {
    SCOPED_TRACE(std::string("key [") + r.key + "]");
    EXPECT_EQ(HSTAA_IsArrayRep(r.key), r.isRep);
    const char *rep = HSTAA_GetArrayRep(r.key);
    if (r.rep) {
      ASSERT_NE(rep, nullptr);
      EXPECT_STREQ(rep, r.rep);
    } else {
      EXPECT_EQ(rep, nullptr);
    }
    EXPECT_EQ(HSTAA_IsArrayIndex(r.key), r.rep != nullptr);
  }
}

TEST(HstaaKeys, MarksAreTwoConstantStrings) {
  const char *one = HSTAA_GetArrayRep("#1");
  const char *two = HSTAA_GetArrayRep("##1");
  EXPECT_EQ(HSTAA_GetArrayRep("#zz"), one);
  EXPECT_EQ(HSTAA_GetArrayRep("#\x01"), one);
  EXPECT_EQ(HSTAA_GetArrayRep("###"), two);
  EXPECT_EQ(HSTAA_GetArrayRep("##abc"), two);
  EXPECT_NE(one, two);
  EXPECT_STREQ(one, "#");
  EXPECT_STREQ(two, "##");
  // Only the first three bytes are read: the key need not end after them.
  char longKey[] = "##0123456789";
  EXPECT_EQ(HSTAA_GetArrayRep(longKey), two);
}

class HstaaLookup : public ::testing::Test {
 protected:
  coffer_test::TestPool pool;
  TestTree tt{pool.pool()};

  void Expect(const char *path, HstNode *node, bool complete) {
    SCOPED_TRACE(path);
    bool got = !complete;
    EXPECT_EQ(HSTAA_FindPrefix(&tt.t, path, &got), node);
    EXPECT_EQ(got, complete);
  }
};

TEST_F(HstaaLookup, RootOnly) {
  Expect("/", tt.root(), true);
  Expect("/x", tt.root(), false);
  Expect("x", tt.root(), true);  // the leading character is never examined
}

TEST_F(HstaaLookup, PlainPaths) {
  HstNode *b = HST_Insert(tt.h(), "/a/b", 0);
  HstNode *a = tt.Find("/a");
  Expect("/a/b", b, true);
  Expect("/a/c", a, false);
  Expect("/a/c/d", a, false);
  Expect("/a/", a, true);
  Expect("xa", a, true);
  Expect("/a/b/", b, true);
  Expect("/a//b", a, false);  // the empty key below a does not exist
}

TEST_F(HstaaLookup, ElementsResolveToTheirTemplate) {
  HstNode *name = HST_Insert(tt.h(), "/list/#/name", 0);
  HstNode *rep = tt.Find("/list/#");
  HstNode *list = tt.Find("/list");
  Expect("/list/#7/name", name, true);
  Expect("/list/#7", rep, true);
  Expect("/list/##7", list, false);  // no "##" template
  Expect("/list/7", list, false);
  Expect("/list/#", rep, true);
  Expect("/list/##", list, false);  // a mark is matched only exactly
  Expect("/list/#7/other", rep, false);

  // Once an element has a node, deeper components are sought inside it only.
  HstNode *seven = HST_Insert(tt.h(), "/list/#7", 0);
  Expect("/list/#7/name", seven, false);
  Expect("/list/#8/name", name, true);

  HstNode *dd = HST_Insert(tt.h(), "/list/##/x", 0);
  Expect("/list/##7/x", dd, true);
  Expect("/list/###/x", dd, true);
}

TEST_F(HstaaLookup, EmptyComponents) {
  HstNode *a = HST_Insert(tt.h(), "//a", 0);
  HstNode *empty = tt.Find("//");
  ASSERT_NE(empty, nullptr);
  EXPECT_STREQ(HST_GetKey(tt.h(), empty), "");
  Expect("//a", a, true);
  Expect("//", empty, true);
  Expect("/a", tt.root(), false);
}

TEST_F(HstaaLookup, OtherSeparator) {
  TestTree dot(pool.pool(), 0, '.');
  HstNode *b = HST_Insert(dot.h(), ".a/x.#", 0);
  bool complete = false;
  EXPECT_EQ(HSTAA_FindPrefix(&dot.t, ".a/x.#5", &complete), b);
  EXPECT_TRUE(complete);
}

TEST_F(HstaaLookup, EmptyAbsolutePathResolvesNothing) {
  bool complete = true;
  EXPECT_EQ(HSTAA_FindPrefix(&tt.t, "", &complete), tt.root());
  EXPECT_FALSE(complete);
}

TEST_F(HstaaLookup, LookupAllocatesNothingFromThePool) {
  HST_Insert(tt.h(), "/list/#/name", 0);
  long before = pool.calls();
  bool complete;
  HSTAA_FindPrefix(&tt.t, "/list/#3/name", &complete);
  HSTAA_FindPrefix(&tt.t, "/nothing/here", &complete);
  EXPECT_EQ(pool.calls(), before);
}

TEST_F(HstaaLookup, RelativeWalkAndItsText) {
  HstNode *b = HST_Insert(tt.h(), "/a/#/b", 0);
  HstNode *a = tt.Find("/a");
  bool complete = false;
  EXPECT_EQ(HSTAAFindPrefix(&tt.t, tt.root(), nullptr, &complete), tt.root());
  EXPECT_TRUE(complete);
  complete = true;
  EXPECT_EQ(HSTAAFindPrefix(&tt.t, nullptr, nullptr, &complete), nullptr);
  EXPECT_FALSE(complete);

  char whole[] = "a/#2/b/";
  EXPECT_EQ(HSTAAFindPrefix(&tt.t, tt.root(), whole, &complete), b);
  EXPECT_TRUE(complete);
  EXPECT_STREQ(whole, "a/#2/b/");  // a walk that resolves leaves the text whole

  // A walk that stops leaves the unresolved component cut off.
  char part[] = "a/zz/b";
  EXPECT_EQ(HSTAAFindPrefix(&tt.t, tt.root(), part, &complete), a);
  EXPECT_FALSE(complete);
  EXPECT_EQ(std::memcmp(part, "a/zz\0b", 7), 0);
}

// The path copy comes from malloc. Where no sanitizer owns malloc, this
// program replaces it so that one copy of a chosen size can be refused.
#if !defined(__SANITIZE_ADDRESS__)
size_t g_refuseMallocOfSize = 0;
}  // namespace
extern "C" void *__libc_malloc(size_t);
extern "C" void *malloc(size_t n) noexcept {
  if (n == g_refuseMallocOfSize) {
    g_refuseMallocOfSize = 0;
    return nullptr;
  }
  return __libc_malloc(n);
}
namespace {

TEST_F(HstaaLookup, PathCopyRefused) {
  HST_Insert(tt.h(), "/a", 0);
  // A length no other allocation of the call has.
  std::string path = "/a/" + std::string(4093, 'q');
  bool complete = true;
  long before = pool.calls();
  g_refuseMallocOfSize = path.size() + 1;
  EXPECT_EQ(HSTAA_FindPrefix(&tt.t, path.c_str(), &complete), nullptr);
  EXPECT_TRUE(complete);  // not written
  complete = false;
  g_refuseMallocOfSize = path.size() + 1;
  EXPECT_EQ(HSTAA_FindPrefix(&tt.t, path.c_str(), &complete), nullptr);
  EXPECT_FALSE(complete);

  g_refuseMallocOfSize = path.size() + 1;
  EXPECT_EQ(HSTAA_Insert(&tt.t, path.c_str(), 1), nullptr);
  g_refuseMallocOfSize = path.size() + 1;
  EXPECT_FALSE(HSTAA_Remove(&tt.t, path.c_str(), 1));
  g_refuseMallocOfSize = 0;
  EXPECT_EQ(pool.calls(), before);
  EXPECT_EQ(tt.insertCalls + tt.removeCalls, 0);
  EXPECT_EQ(HST_GetSize(tt.h()), 2);
}
#endif

}  // namespace
