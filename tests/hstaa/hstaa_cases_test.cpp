// Key classes, prefix lookup, worked insertion and removal cases with the
// exact order of callback calls, refusals, the path copy, and allocation
// failure at every allocation point.
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <string>

#include "hstaa_fixture.h"
#include "support/test_pool.h"

using hstaa_test::CheckTree;
using hstaa_test::Dump;
using hstaa_test::Expect;
using hstaa_test::TestTree;
using Log = std::vector<std::string>;

namespace {

TEST(HstaaKeys, ClassificationTable) {
  const struct {
    const char *key;
    bool isRep;
    const char *rep;
  } rows[] = {{"#", true, nullptr},  {"##", true, nullptr},   {"#0", false, "#"},
               {"#!", false, "#"},    {"# ", false, "#"},      {"#abc", false, "#"},
               {"#\xff#", false, "#"}, {"##0", false, "##"},    {"###", false, "##"},
               {"##\x01", false, "##"}, {"", false, nullptr},  {"a#", false, nullptr},
               {" #", false, nullptr}, {"x##", false, nullptr}};
  for (const auto &r : rows) {
    SCOPED_TRACE(std::string("[") + r.key + "]");
    const char *rep = HSTAA_GetArrayRep(r.key);
    EXPECT_EQ(HSTAA_IsArrayRep(r.key), r.isRep);
    EXPECT_EQ(HSTAA_IsArrayIndex(r.key), rep != nullptr);
    EXPECT_EQ(rep != nullptr, r.rep != nullptr);
    if (r.rep) {
      EXPECT_STREQ(rep, r.rep);
      EXPECT_EQ(rep, HSTAA_GetArrayRep(r.rep[1] ? "##z" : "#z"));  // one constant per mark
    }
  }
}

class Hstaa : public ::testing::Test {
 protected:
  coffer_test::TestPool pool;
  TestTree tt{pool.pool()};
  HstaaTree *t() { return &tt.t; }
  HstNode *Ins(const char *path, CofferVal v) { return HSTAA_Insert(t(), path, v); }
  void Rem(const char *path, CofferVal v) { EXPECT_TRUE(HSTAA_Remove(t(), path, v)); }
  void Put(const char *path, CofferVal v) {  // expecting the node the path names
    HstNode *n = Ins(path, v);
    EXPECT_TRUE(n && n == tt.Find(path)) << path;
  }
  Log Take() { return std::move(tt.log); }
  void TearDown() override { CheckTree(t(), false); }
};

TEST_F(Hstaa, PrefixLookup) {
  for (const char *p : {"/a/b", "//e", "/list/#/name", "/list/#7/x", "/list/##/y", "/m/#/n"})
    ASSERT_NE(HST_Insert(tt.h(), p, 0), nullptr);
  const struct {
    const char *path, *found;
    bool complete;
  } rows[] = {
      {"/", "/", true},         {"x", "/", true},            {"/zz", "/", false},
      {"", "/", false},         {"/a/b", "/a/b", true},      {"/a/c", "/a", false},
      {"/a/c/d", "/a", false},  {"/a/", "/a", true},         {"xa", "/a", true},
      {"/a/b/", "/a/b", true},  {"/a//b", "/a", false},      {"//e", "//e", true},
      {"//", "//", true},       {"/e", "/", false},          {"/list/7", "/list", false},
      {"/list/#8", "/list/#", true},     {"/list/#8/name", "/list/#/name", true},
      {"/list/#", "/list/#", true},      {"/list/#7/name", "/list/#7", false},
      {"/list/#8/x", "/list/#", false},  {"/list/##8/y", "/list/##/y", true},
      {"/list/###/y", "/list/##/y", true},  {"/m/##7", "/m", false},  {"/m/##", "/m", false}};
  const long calls = pool.calls();
  for (const auto &r : rows) {
    SCOPED_TRACE(r.path);
    bool complete = !r.complete;
    EXPECT_EQ(HSTAA_FindPrefix(t(), r.path, &complete), tt.Find(r.found));
    EXPECT_EQ(complete, r.complete);
  }
  EXPECT_EQ(pool.calls(), calls);

  // Relative: a null path names the start node, none if null; a walk that
  // stops leaves the unresolved component cut off.
  bool complete = false;
  EXPECT_EQ(HSTAAFindPrefix(t(), tt.root(), nullptr, &complete), tt.root());
  EXPECT_TRUE(complete);
  EXPECT_EQ(HSTAAFindPrefix(t(), nullptr, nullptr, &complete), nullptr);
  EXPECT_FALSE(complete);
  char part[] = "list/zz/b";
  EXPECT_EQ(HSTAAFindPrefix(t(), tt.root(), part, &complete), tt.Find("/list"));
  EXPECT_FALSE(complete);
  EXPECT_EQ(std::memcmp(part, "list/zz\0b", 10), 0);
}

TEST_F(Hstaa, TemplateAndElementLifecycle) {
  Put("/a/b", 5);
  Put("/a/b", 6);  // every accepted insertion counts
  Expect(&tt, "/a/b=6:2 /a:2 /:2");
  Rem("/a/b", 6);
  Rem("/a/b", 0);  // b then a pruned
  Expect(&tt, "/a! /:0");
  EXPECT_EQ(Take(), (Log{"I0,5", "I5,6", "R6,6", "R0,0", "F0", "F0"}));

  Put("/l/#/p", 80);  // no element: the walk ends at once
  Put("/l/#3/q", 7);  // #3 copied from "#" (whose own value is the default)
  Expect(&tt, "/l/#/p=80:1 /l/#:1 /l/#3/p=80:1 /l/#3/q=7:1 /l/#3:2 /l:3 /:3");
  Put("/l/#/r", 9);  // the element first, then the template
  Expect(&tt, "/l/#3/r=9:1 /l/#3:3 /l/#/r=9:1 /l/#:2 /l:5");
  EXPECT_EQ(Take(), (Log{"I0,80", "C80", "I0,7", "I0,9", "I0,9"}));
  Rem("/l/#3/q", 7);  // q goes; #3 then holds as much as "#" and goes too
  Expect(&tt, "/l/#3! /l:2 /:2");
  EXPECT_EQ(Take(), (Log{"R7,7", "F0", "F80", "F9", "F0"}));
  bool complete = false;
  EXPECT_EQ(HSTAA_FindPrefix(t(), "/l/#3/p", &complete), tt.Find("/l/#/p"));
  EXPECT_TRUE(complete);

  Put("/l/#1/q", 7);   // #1: p r q
  Put("/l/#2/s", 3);   // #2: p r s
  HSTAAInsert(t(), tt.Find("/l/#"), nullptr, 1);  // "#" holds 3 as well
  Take();
  Rem("/l/#1/q", 55);  // refused, but #1 is as full as "#": it goes
  EXPECT_EQ(Take(), (Log{"R7,55", "F80", "F7", "F9", "F0"}));
  Rem("/l/#9/p", 80);  // a missing element is not sought in the template
  Rem("/l/#", 1);      // #2 refuses; "#" gives its own value up
  Rem("/l/#/p", 80);   // elements first, each p left empty pruned
  EXPECT_EQ(Take(), (Log{"R0,1", "R1,1", "R80,80", "F0", "R80,80", "F0"}));
  Rem("/l/#/r", 9);  // #2 keeps s only; "#" loses its last value and goes
  Expect(&tt, "/l/#2=0:1 /l/#2/s:1 /l/#! /l:1");
  Rem("/l/#2/s", 3);  // an element left with nothing goes, and l with it
  Expect(&tt, "/l! /:0");

  ASSERT_NE(HST_Insert(tt.h(), "/z/y", 0), nullptr);
  Rem("/z/missing/deeper", 1);  // an empty node on the way goes all the same
  Expect(&tt, "/z!");
  HstNode *w = HST_Insert(tt.h(), "/w", 0);
  HSTAARemove(t(), w, nullptr, 1);  // the start node is never pruned
  EXPECT_EQ(tt.Find("/w"), w);
}

TEST_F(Hstaa, PropagationReach) {
  for (const char *p : {"/l/#!/v", "/l/##1/v", "/l/#5/v"}) Put(p, 1);
  Take();
  Put("/l/##/u", 4);  // the "##" run: ##1 only
  Put("/l/#/w", 2);   // key order #, #!, ##, ##1, #5: the "#" run ends at ##
  EXPECT_EQ(Take(), (Log{"I0,4", "I0,4", "I0,2", "I0,2"}));
  Expect(&tt, "/l/##1/u=4:1 /l/#!/u! /l/#5/u! /l/#!/w=2:1 /l/#5/w! /l/##1/w! /l:7");

  TestTree other(pool.pool());  // without "##" in between, #5 is reached
  for (const char *p : {"/l/#!/v", "/l/#5/v", "/l/#/w"}) HSTAA_Insert(&other.t, p, 1);
  Expect(&other, "/l/#!/w:1 /l/#5/w:1 /l/#/w:1 /l:5");
}

TEST_F(Hstaa, PropagationRefusals) {
  tt.behaviour.refuseCurrent = {666};
  Put("/l/#1/p", 1);
  Put("/l/#2/p", 666);
  Put("/l/#3/p", 3);
  Take();
  Put("/l/#/p", 5);  // stops at #2; the template still gets it
  EXPECT_EQ(Take(), (Log{"I1,5", "I666,5", "I0,5"}));
  Expect(&tt, "/l/#1/p=5:2 /l/#2/p=666:1 /l/#3/p=3:1 /l/#/p=5:1 /l:5");

  char rest[] = "p";
  HstNode *l = tt.Find("/l"), *rep = tt.Find("/l/#");
  EXPECT_FALSE(HSTAAPropagateVal(t(), 0, l, rep, rest, 6));
  EXPECT_EQ(Take(), (Log{"I5,6", "I666,6"}));
  const std::string before = Dump(t());
  // Another mode walks and changes nothing; nothing to walk for a non-template,
  // a parent without that template, or a parent without children.
  EXPECT_TRUE(HSTAAPropagateVal(t(), 2, l, rep, rest, 6));
  EXPECT_TRUE(HSTAAPropagateVal(t(), 0, l, tt.Find("/l/#1"), rest, 6));
  EXPECT_TRUE(HSTAAPropagateVal(t(), 0, tt.root(), rep, rest, 6));
  EXPECT_TRUE(HSTAAPropagateVal(t(), 0, tt.Find("/l/#/p"), rep, rest, 6));
  EXPECT_STREQ(rest, "p");
  EXPECT_EQ(Dump(t()), before);
  EXPECT_TRUE(Take().empty());

  // A propagated removal drops each element it leaves empty, looking again
  // where the dropped one stood.
  for (const char *p : {"/k/#1", "/k/#2", "/k/#3", "/k/#"})
    HSTAAInsert(t(), HST_Insert(tt.h(), p, 0), nullptr, 1);
  HSTAAInsert(t(), tt.Find("/k/#2"), nullptr, 2);
  Take();
  EXPECT_TRUE(HSTAAPropagateVal(t(), 1, tt.Find("/k"), tt.Find("/k/#"), nullptr, 1));
  EXPECT_EQ(Take(), (Log{"R1,1", "F0", "R2,1", "R1,1", "F0"}));
  Expect(&tt, "/k/#1! /k/#3! /k/#2=2:2 /k/#=1:1 /k:3");
}

TEST_F(Hstaa, RefusedInsertionLeavesNoEmptyNodeOfItsOwn) {
  tt.behaviour.refuseOperands = {4};
  EXPECT_EQ(Ins("/", 4), nullptr);  // at the start node: nothing removed
  EXPECT_EQ(Ins("/a/b/c", 4), nullptr);
  EXPECT_EQ(Take(), (Log{"I0,4", "I0,4", "F0", "F0", "F0"}));  // c, b, a
  EXPECT_EQ(HST_GetSize(tt.h()), 1);

  // An element copied on the way keeps its copied values.
  Put("/l/#/p", 80);
  EXPECT_EQ(Ins("/l/#3/q/r", 4), nullptr);
  Expect(&tt, "/l/#3/q! /l/#3:1 /l:2");
  // Values carried into elements stay; the template made on the way goes.
  Put("/m/#1/v", 1);
  tt.behaviour.refuseOperands.clear();
  tt.behaviour.refuseCurrent = {0};  // refuses at every new node
  EXPECT_EQ(Ins("/m/#/v", 6), nullptr);
  Expect(&tt, "/m/#1/v=6:2 /m/#1:2 /m/#! /m:2 /:4");
  // A refused copy fails the insertion, the partial copy released.
  tt.behaviour = {};
  tt.behaviour.refuseClone = {80};
  Put("/l/#/a", 1);
  Take();
  EXPECT_EQ(Ins("/l/#4/q", 7), nullptr);
  EXPECT_EQ(Take(), (Log{"C1", "C80", "F1", "F0"}));
  Expect(&tt, "/l/#4! /l:4");
}

TEST_F(Hstaa, NulSeparatorNeverCuts) {
  TestTree nul(pool.pool(), 0, '\0');
  nul.behaviour.counting = true;
  HstNode *n = HSTAA_Insert(&nul.t, "/a/b", 1);
  ASSERT_NE(n, nullptr);
  EXPECT_STREQ(HST_GetKey(nul.h(), n), "a/b");
  EXPECT_EQ(HST_GetParent(nul.h(), n), nul.root());
  char text[] = "a/b\0x";  // the walk must not go on past the terminator
  EXPECT_EQ(HSTAAInsert(&nul.t, nul.root(), text, 1), n);
  bool complete = false;
  EXPECT_EQ(HSTAA_FindPrefix(&nul.t, "/a/b", &complete), n);
  EXPECT_TRUE(complete);
  EXPECT_TRUE(HSTAA_Remove(&nul.t, "/a/b", 1));
  EXPECT_TRUE(HSTAA_Remove(&nul.t, "/a/b", 1));
  EXPECT_EQ(HST_GetSize(nul.h()), 1);
}

// The path copy: one malloc of strlen + 1 bytes per public call, freed before
// it returns. Where no sanitizer owns malloc, this program replaces it to
// watch (and refuse) blocks of one chosen size.
#if !defined(__SANITIZE_ADDRESS__)
size_t g_watchSize;
bool g_refuse;
int g_mallocs, g_frees;
void *g_block;
}  // namespace
extern "C" void *__libc_malloc(size_t);
extern "C" void __libc_free(void *);
extern "C" void *malloc(size_t n) noexcept {
  if (n != g_watchSize) return __libc_malloc(n);
  g_mallocs++;
  return g_block = g_refuse ? nullptr : __libc_malloc(n);
}
extern "C" void free(void *p) noexcept {
  if (p && p == g_block) g_frees++, g_block = nullptr;
  __libc_free(p);
}
namespace {

TEST_F(Hstaa, PathCopy) {
  const std::string path = "/a/" + std::string(4093, 'q');
  g_watchSize = path.size() + 1;
  bool complete = false;
  ASSERT_NE(HSTAA_Insert(t(), path.c_str(), 1), nullptr);
  ASSERT_NE(HSTAA_FindPrefix(t(), path.c_str(), &complete), nullptr);
  EXPECT_TRUE(HSTAA_Remove(t(), path.c_str(), 1));
  EXPECT_TRUE(g_mallocs == 3 && g_frees == 3);

  // Refused: null, 0, outComplete untouched, nothing changed or allocated.
  g_refuse = true;
  const long calls = pool.calls();
  for (bool c : {false, true}) {
    complete = c;
    EXPECT_EQ(HSTAA_FindPrefix(t(), path.c_str(), &complete), nullptr);
    EXPECT_EQ(complete, c);
  }
  EXPECT_EQ(HSTAA_Insert(t(), path.c_str(), 1), nullptr);
  EXPECT_FALSE(HSTAA_Remove(t(), path.c_str(), 1));
  EXPECT_EQ(g_mallocs, 7);

  // An empty path has no leading character to skip: it names nothing and
  // nothing is copied.
  g_refuse = false;
  g_watchSize = 1;
  EXPECT_EQ(HSTAA_FindPrefix(t(), "", &complete), tt.root());
  EXPECT_FALSE(complete);
  EXPECT_EQ(HSTAA_Insert(t(), "", 1), nullptr);
  EXPECT_TRUE(HSTAA_Remove(t(), "", 1));
  g_watchSize = 0;
  EXPECT_TRUE(g_mallocs == 7 && pool.calls() == calls && HST_GetSize(tt.h()) == 1);
  EXPECT_EQ(tt.log, (Log{"I0,1", "R1,1", "F0", "F0"}));
}
#endif

// With counting values the checker verifies every count exactly after a
// failure at any allocation, and the pool must end with no block alive.
class HstaaAllocFailure : public ::testing::TestWithParam<bool> {};

TEST_P(HstaaAllocFailure, EveryPointLeavesExactCountsAndNoLeak) {
  long points = 0;
  for (const char *op : {"l/#/n/o", "l/#7/n", "l/#!/x/#/w", "l/##/k/j", "m/#9/#/q", "l/#/p",
                         "l/#!/x/#3/z", "m/a"}) {
    for (int n = 0, remove = 0; remove < 2; n++, points++) {
      SCOPED_TRACE(std::string(remove ? "remove " : "insert ") + op + " at " + std::to_string(n));
      coffer_test::TestPool pool;
      bool hit;
      {
        TestTree tt(pool.pool());
        tt.behaviour.counting = true;
        for (const char *p : {"/l/#/p", "/l/#/p", "/l/#1/q", "/l/#!/x/#/y", "/l/#2", "/l/##/k",
                              "/l/##a/k", "/l/#!/x/#3/z", "/m/a", "/m/#/p"})
          ASSERT_NE(HSTAA_Insert(&tt.t, p, 1), nullptr);
        const long base = pool.calls();
        GetParam() ? pool.FailFrom(base + n) : pool.FailAt(base + n);
        char buf[32];
        std::strcpy(buf, op);
        HstNode *r = remove ? nullptr : HSTAAInsert(&tt.t, tt.root(), buf, 1);
        if (remove) HSTAARemove(&tt.t, tt.root(), buf, 1);
        hit = pool.calls() > base + n;
        pool.NeverFail();
        EXPECT_STREQ(buf, op);
        CheckTree(&tt.t, true);
        EXPECT_TRUE(hit || remove || r);
      }
      EXPECT_EQ(pool.liveBlocks(), 0u);
      if (!hit) n = -1, remove++;  // every allocation of this call has failed once
    }
  }
  EXPECT_GE(points, 60 + 16);
}

INSTANTIATE_TEST_SUITE_P(AtAndFrom, HstaaAllocFailure, ::testing::Bool());

}  // namespace
