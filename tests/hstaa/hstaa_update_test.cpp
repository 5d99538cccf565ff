// Insertion, removal and propagation: worked examples, refusals, the path
// text, and allocation failure at every allocation point.
#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "hstaa_fixture.h"
#include "support/test_pool.h"

using hstaa_test::Behaviour;
using hstaa_test::CheckTree;
using hstaa_test::Dump;
using hstaa_test::TestTree;

namespace {

// Separator /, defaultVal 0, insert replaces by the operand, removal accepts
// only the value the node holds and leaves 0, clones copy.
class HstaaUpdate : public ::testing::Test {
 protected:
  coffer_test::TestPool pool;
  TestTree tt{pool.pool()};
  HstaaTree *t() { return &tt.t; }
  HstNode *Ins(const char *path, CofferVal v) { return HSTAA_Insert(t(), path, v); }
  void Rem(const char *path, CofferVal v) { EXPECT_TRUE(HSTAA_Remove(t(), path, v)); }
  void TearDown() override {
    CheckTree(t(), false);
    HST_FreeTree(tt.h());
    tt.t.hst.data = nullptr;
    EXPECT_EQ(pool.liveBlocks(), 0u);
  }
};

TEST_F(HstaaUpdate, InsertMakesPathAndRemovePrunesIt) {
  HstNode *b = Ins("/a/b", 5);
  ASSERT_NE(b, nullptr);
  EXPECT_EQ(b, tt.Find("/a/b"));
  EXPECT_EQ(tt.Val("/a/b"), 5u);
  EXPECT_EQ(tt.Count("/a/b"), 1);
  EXPECT_EQ(tt.Count("/a"), 1);
  EXPECT_EQ(tt.Count("/"), 1);
  Rem("/a/b", 5);
  EXPECT_EQ(tt.Find("/a"), nullptr);
  EXPECT_EQ(tt.Count("/"), 0);
  EXPECT_EQ(HST_GetSize(tt.h()), 1);
  EXPECT_EQ(tt.released.size(), 2u);  // b's emptied value, then a's default
}

TEST_F(HstaaUpdate, EveryAcceptedInsertCounts) {
  ASSERT_NE(Ins("/a/b", 5), nullptr);
  ASSERT_NE(Ins("/a/b", 6), nullptr);
  EXPECT_EQ(tt.Val("/a/b"), 6u);
  EXPECT_EQ(tt.Count("/a/b"), 2);
  EXPECT_EQ(tt.Count("/a"), 2);
  EXPECT_EQ(tt.Count("/"), 2);
  Rem("/a/b", 6);  // one value out, one stays: nothing pruned
  EXPECT_EQ(tt.Count("/a/b"), 1);
  EXPECT_EQ(tt.Val("/a/b"), 0u);
}

TEST_F(HstaaUpdate, TemplateElementsAndPruning) {
  ASSERT_NE(Ins("/l/#/p", 80), nullptr);
  EXPECT_EQ(tt.Count("/l/#/p"), 1);
  EXPECT_EQ(tt.Count("/l/#"), 1);
  EXPECT_EQ(tt.Count("/l"), 1);
  EXPECT_EQ(tt.Count("/"), 1);
  EXPECT_EQ(tt.insertCalls, 1);

  // #3 is made as a copy of "#", then q is made below it.
  HstNode *q = Ins("/l/#3/q", 7);
  ASSERT_EQ(q, tt.Find("/l/#3/q"));
  EXPECT_EQ(tt.Val("/l/#3/p"), 80u);
  EXPECT_EQ(tt.Count("/l/#3/p"), 1);
  EXPECT_EQ(tt.Count("/l/#3/q"), 1);
  EXPECT_EQ(tt.Count("/l/#3"), 2);
  EXPECT_EQ(tt.Count("/l"), 3);
  EXPECT_EQ(tt.Count("/"), 3);
  EXPECT_EQ(tt.cloneCalls, 1);  // p's 80; "#" itself holds the default

  // Through the template: the element first, then the template.
  tt.ResetCalls();
  HstNode *r = Ins("/l/#/r", 9);
  ASSERT_EQ(r, tt.Find("/l/#/r"));
  EXPECT_EQ(tt.Val("/l/#3/r"), 9u);
  EXPECT_EQ(tt.Count("/l/#3"), 3);
  EXPECT_EQ(tt.Val("/l/#/r"), 9u);
  EXPECT_EQ(tt.Count("/l/#"), 2);
  EXPECT_EQ(tt.Count("/l"), 5);
  EXPECT_EQ(tt.insertCalls, 2);

  // q goes, and #3 then holds as many values as "#": it goes too.
  Rem("/l/#3/q", 7);
  EXPECT_EQ(tt.Find("/l/#3"), nullptr);
  EXPECT_EQ(tt.Count("/l"), 2);
  bool complete = false;
  EXPECT_EQ(HSTAA_FindPrefix(t(), "/l/#3/p", &complete), tt.Find("/l/#/p"));
  EXPECT_TRUE(complete);
}

TEST_F(HstaaUpdate, RemovalThroughTemplateReachesElementsFirst) {
  ASSERT_NE(Ins("/l/#/p", 80), nullptr);
  ASSERT_NE(Ins("/l/#1/q", 7), nullptr);  // #1: p 80, q 7
  ASSERT_NE(Ins("/l/#2/s", 3), nullptr);  // #2: p 80, s 3
  Rem("/l/#/q", 7);                       // #1 loses q; "#" has none
  EXPECT_EQ(tt.Find("/l/#1/q"), nullptr);
  EXPECT_EQ(tt.Count("/l/#1"), 1);
  EXPECT_EQ(tt.Count("/l/#"), 1);

  tt.ResetCalls();
  Rem("/l/#/p", 80);
  EXPECT_EQ(tt.removeCalls, 3);          // #1, #2, then "#"
  EXPECT_EQ(tt.Find("/l/#1"), nullptr);  // left with nothing at all
  EXPECT_EQ(tt.Find("/l/#2/p"), nullptr);
  EXPECT_EQ(tt.Count("/l/#2"), 1);      // keeps its own s
  EXPECT_EQ(tt.Find("/l/#"), nullptr);  // emptied template
  EXPECT_EQ(tt.Count("/l"), 1);
  EXPECT_EQ(tt.Count("/"), 1);
}

TEST_F(HstaaUpdate, ElementAsFullAsItsTemplateIsPrunedEvenOnRefusal) {
  ASSERT_NE(Ins("/l/#/p", 80), nullptr);
  ASSERT_NE(Ins("/l/#1/q", 7), nullptr);  // #1: p 80, q 7
  char r[] = "r";
  ASSERT_NE(HSTAAInsert(t(), tt.Find("/l/#"), r, 9), nullptr);  // "#" alone: p 80, r 9
  EXPECT_EQ(tt.Count("/l/#1"), 2);
  EXPECT_EQ(tt.Count("/l/#"), 2);
  tt.ResetCalls();
  Rem("/l/#1/q", 55);  // refused
  EXPECT_EQ(tt.removeCalls, 1);
  EXPECT_EQ(tt.Find("/l/#1"), nullptr);
  EXPECT_EQ(tt.Count("/l"), 2);
  EXPECT_EQ(tt.released.size(), 3u);  // #1, its p and its q
}

TEST_F(HstaaUpdate, EmptyNodeOnTheWayIsPruned) {
  ASSERT_NE(HST_Insert(tt.h(), "/z/y", 0), nullptr);  // plain nodes, no values
  Rem("/z/missing/deeper", 1);
  EXPECT_EQ(tt.Find("/z"), nullptr);
  EXPECT_EQ(tt.removeCalls, 0);
}

TEST_F(HstaaUpdate, MissingElementIsNotSoughtInTemplate) {
  ASSERT_NE(Ins("/l/#/p", 80), nullptr);
  Rem("/l/#9/p", 80);
  EXPECT_EQ(tt.removeCalls, 0);
  EXPECT_EQ(tt.Val("/l/#/p"), 80u);
  EXPECT_EQ(tt.Count("/l/#/p"), 1);
}

TEST_F(HstaaUpdate, PropagationVisitsOnlyTheRunOfItsArray) {
  ASSERT_NE(Ins("/l/#!/v", 1), nullptr);
  ASSERT_NE(Ins("/l/##1/v", 1), nullptr);
  ASSERT_NE(Ins("/l/#5/v", 1), nullptr);
  ASSERT_NE(Ins("/l/##/u", 4), nullptr);  // reaches ##1 only
  EXPECT_EQ(tt.Val("/l/##1/u"), 4u);
  EXPECT_EQ(tt.Find("/l/#!/u"), nullptr);
  EXPECT_EQ(tt.Find("/l/#5/u"), nullptr);

  ASSERT_NE(Ins("/l/#/w", 2), nullptr);  // order: #, #!, ##, ##1, #5
  EXPECT_EQ(tt.Val("/l/#!/w"), 2u);
  EXPECT_EQ(tt.Find("/l/#5/w"), nullptr);
  EXPECT_EQ(tt.Find("/l/##1/w"), nullptr);
  EXPECT_EQ(tt.Find("/l/##/w"), nullptr);
  EXPECT_EQ(tt.Val("/l/#/w"), 2u);
  EXPECT_EQ(tt.Count("/l"), 7);

  // Without a "##" array in between, the run reaches #5 as well.
  TestTree other(pool.pool());
  ASSERT_NE(HSTAA_Insert(&other.t, "/l/#!/v", 1), nullptr);
  ASSERT_NE(HSTAA_Insert(&other.t, "/l/#5/v", 1), nullptr);
  ASSERT_NE(HSTAA_Insert(&other.t, "/l/#/w", 2), nullptr);
  EXPECT_EQ(other.Val("/l/#!/w"), 2u);
  EXPECT_EQ(other.Val("/l/#5/w"), 2u);
  EXPECT_EQ(other.Count("/l"), 5);
  CheckTree(&other.t, false);
}

TEST_F(HstaaUpdate, NewTemplateCarriesIntoExistingElements) {
  ASSERT_NE(Ins("/l/#1/x", 1), nullptr);
  ASSERT_NE(Ins("/l/#/p", 4), nullptr);
  EXPECT_EQ(tt.Val("/l/#1/p"), 4u);
  EXPECT_EQ(tt.Val("/l/#/p"), 4u);
  EXPECT_EQ(tt.Count("/l/#1"), 2);
  EXPECT_EQ(tt.Count("/l"), 3);
}

TEST_F(HstaaUpdate, PropagationStopsAtRefusingElement) {
  tt.behaviour.refuseCurrent = {666};
  ASSERT_NE(Ins("/l/#1/p", 1), nullptr);
  ASSERT_NE(Ins("/l/#2/p", 666), nullptr);
  ASSERT_NE(Ins("/l/#3/p", 3), nullptr);
  tt.ResetCalls();
  HstNode *p = Ins("/l/#/p", 5);
  ASSERT_EQ(p, tt.Find("/l/#/p"));
  EXPECT_EQ(tt.insertCalls, 3);  // #1, #2 (refused), "#"
  EXPECT_EQ(tt.Val("/l/#1/p"), 5u);
  EXPECT_EQ(tt.Count("/l/#1"), 2);
  EXPECT_EQ(tt.Val("/l/#2/p"), 666u);
  EXPECT_EQ(tt.Count("/l/#2"), 1);
  EXPECT_EQ(tt.Val("/l/#3/p"), 3u);
  EXPECT_EQ(tt.Count("/l/#3"), 1);
  EXPECT_EQ(tt.Val("/l/#/p"), 5u);
  EXPECT_EQ(tt.Count("/l"), 5);

  // Called directly, the walk reports the refusal.
  char rest[] = "p";
  EXPECT_FALSE(HSTAAPropagateVal(t(), 0, tt.Find("/l"), tt.Find("/l/#"), rest, 6));
  EXPECT_STREQ(rest, "p");
  EXPECT_EQ(tt.Val("/l/#1/p"), 6u);
  EXPECT_EQ(tt.Val("/l/#3/p"), 3u);
  // A mode that is neither insertion nor removal walks and changes nothing.
  tt.ResetCalls();
  std::string before = Dump(t());
  EXPECT_TRUE(HSTAAPropagateVal(t(), 2, tt.Find("/l"), tt.Find("/l/#"), rest, 6));
  EXPECT_EQ(Dump(t()), before);
  EXPECT_EQ(tt.insertCalls + tt.removeCalls, 0);
  // Not a template, or no such template under the parent: nothing to walk.
  EXPECT_TRUE(HSTAAPropagateVal(t(), 0, tt.Find("/l"), tt.Find("/l/#1"), rest, 6));
  EXPECT_TRUE(HSTAAPropagateVal(t(), 0, tt.root(), tt.Find("/l/#"), rest, 6));
  EXPECT_EQ(Dump(t()), before);
}

TEST_F(HstaaUpdate, PropagatedRemovalDropsEmptiedElements) {
  // One value in each node, put there without going through the template.
  const std::pair<const char *, CofferVal> nodes[] = {
      {"/l/#1", 1}, {"/l/#2", 2}, {"/l/#3", 1}, {"/l/#", 9}};
  for (const auto &n : nodes)
    ASSERT_NE(HSTAAInsert(t(), HST_Insert(tt.h(), n.first, 0), nullptr, n.second), nullptr);
  EXPECT_TRUE(HSTAAPropagateVal(t(), 1, tt.Find("/l"), tt.Find("/l/#"), nullptr, 1));
  EXPECT_EQ(tt.Find("/l/#1"), nullptr);  // both emptied elements go, the walk
  EXPECT_EQ(tt.Find("/l/#3"), nullptr);  // looking again where #1 stood
  EXPECT_EQ(tt.Count("/l/#2"), 1);
  EXPECT_EQ(tt.Count("/l/#"), 1);
  EXPECT_EQ(tt.Count("/l"), 2);
  EXPECT_EQ(tt.removeCalls, 3);
}

TEST_F(HstaaUpdate, StartNodeItself) {
  ASSERT_EQ(Ins("/", 5), tt.root());
  EXPECT_EQ(tt.Count("/"), 1);
  tt.behaviour.refuseOperands = {4};
  EXPECT_EQ(Ins("/", 4), nullptr);
  EXPECT_EQ(tt.Count("/"), 1);

  // A refusal at an existing node removes nothing, even an empty one.
  HstNode *z = HST_Insert(tt.h(), "/z", 0);
  char empty[] = "";
  EXPECT_EQ(HSTAAInsert(t(), z, empty, 4), nullptr);
  EXPECT_EQ(HSTAAInsert(t(), z, nullptr, 4), nullptr);
  EXPECT_EQ(tt.Find("/z"), z);
  ASSERT_EQ(HSTAAInsert(t(), z, nullptr, 3), z);
  EXPECT_EQ(tt.Count("/"), 2);
  HSTAARemove(t(), z, nullptr, 3);
  EXPECT_EQ(tt.Count("/z"), 0);
  EXPECT_EQ(tt.Find("/z"), z);  // the start node is never pruned
  EXPECT_TRUE(HSTAA_Remove(t(), "/", 5));
  EXPECT_EQ(tt.Count("/"), 0);
}

TEST_F(HstaaUpdate, EmptyAbsolutePathDoesNothing) {
  ASSERT_NE(Ins("/a", 1), nullptr);
  std::string before = Dump(t());
  long calls = pool.calls();
  EXPECT_EQ(Ins("", 1), nullptr);
  EXPECT_TRUE(HSTAA_Remove(t(), "", 1));
  EXPECT_EQ(Dump(t()), before);
  EXPECT_EQ(pool.calls(), calls);
  EXPECT_EQ(tt.insertCalls, 1);
  EXPECT_EQ(tt.removeCalls, 0);
}

TEST_F(HstaaUpdate, RefusedInsertionLeavesNoEmptyNodeOfItsOwn) {
  tt.behaviour.refuseOperands = {4};
  EXPECT_EQ(Ins("/a/b/c", 4), nullptr);
  EXPECT_EQ(HST_GetSize(tt.h()), 1);
  EXPECT_EQ(tt.released.size(), 3u);  // the defaults of a, b and c

  // Below existing nodes only the new ones go.
  ASSERT_NE(Ins("/a/x", 1), nullptr);
  EXPECT_EQ(Ins("/a/b/c", 4), nullptr);
  EXPECT_EQ(tt.Find("/a/b"), nullptr);
  EXPECT_EQ(tt.Count("/a"), 1);
  EXPECT_EQ(Ins("/a/x", 4), nullptr);  // existing target stays as it was
  EXPECT_EQ(tt.Val("/a/x"), 1u);

  // An element copied on the way keeps its copied values; counts stay exact.
  ASSERT_NE(Ins("/l/#/p", 80), nullptr);
  EXPECT_EQ(Ins("/l/#3/q/r", 4), nullptr);
  EXPECT_EQ(tt.Find("/l/#3/q"), nullptr);
  EXPECT_EQ(tt.Count("/l/#3"), 1);
  EXPECT_EQ(tt.Count("/l"), 2);

  // Values carried into elements stay; the template made on the way goes.
  ASSERT_NE(Ins("/m/#1/v", 1), nullptr);
  tt.behaviour.refuseOperands.clear();
  tt.behaviour.refuseCurrent = {0};  // refuses at any new node, accepts at v
  EXPECT_EQ(Ins("/m/#/v", 6), nullptr);
  EXPECT_EQ(tt.Val("/m/#1/v"), 6u);
  EXPECT_EQ(tt.Count("/m/#1"), 2);
  EXPECT_EQ(tt.Find("/m/#"), nullptr);
  EXPECT_EQ(tt.Count("/m"), 2);
  EXPECT_EQ(tt.Count("/"), 5);
}

TEST_F(HstaaUpdate, PathTextIsLeftAsFound) {
  ASSERT_NE(Ins("/l/#/p", 80), nullptr);
  ASSERT_NE(Ins("/l/#1/q", 7), nullptr);
  tt.behaviour.refuseOperands = {4};
  const char *texts[] = {"l/#/p",  "l/#/p/", "l/#2/x/y", "l//#/", "l/#1/q", "l/#/zz/",
                         "nope/x", "l/##/k", "l",        "/",     "//"};
  for (const char *text : texts) {
    for (CofferVal v : {CofferVal(4), CofferVal(80), CofferVal(7)}) {
      SCOPED_TRACE(std::string(text) + " " + std::to_string(v));
      char buf[32];
      std::strcpy(buf, text);
      HSTAAInsert(t(), tt.root(), buf, v);
      EXPECT_STREQ(buf, text);
      HSTAARemove(t(), tt.root(), buf, v);
      EXPECT_STREQ(buf, text);
      HstNode *l = tt.Find("/l");
      HstNode *rep = tt.Find("/l/#");
      if (l && rep) {
        for (int32_t mode : {0, 1, 2}) {
          std::strcpy(buf, text);
          HSTAAPropagateVal(t(), mode, l, rep, buf, v);
          EXPECT_STREQ(buf, text);
          rep = tt.Find("/l/#");
          if (!rep) break;
        }
      }
      CheckTree(t(), false);
    }
  }
}

TEST_F(HstaaUpdate, InsertAtExistingNodeAllocatesNothing) {
  ASSERT_NE(Ins("/l/#/p", 80), nullptr);
  ASSERT_NE(Ins("/l/#1/p", 7), nullptr);
  long calls = pool.calls();
  ASSERT_NE(Ins("/l/#/p", 3), nullptr);
  ASSERT_NE(Ins("/l/#1/p", 3), nullptr);
  EXPECT_EQ(pool.calls(), calls);
}

TEST_F(HstaaUpdate, RefusedCloneFailsTheInsertion) {
  tt.behaviour.refuseClone = {80};
  ASSERT_NE(Ins("/l/#/a", 1), nullptr);
  ASSERT_NE(Ins("/l/#/p", 80), nullptr);
  tt.ResetCalls();
  EXPECT_EQ(Ins("/l/#3/q", 7), nullptr);
  EXPECT_EQ(tt.Find("/l/#3"), nullptr);
  EXPECT_EQ(tt.insertCalls, 0);
  EXPECT_EQ(tt.cloneCalls, 2);        // a's 1, then p's 80 refused
  EXPECT_EQ(tt.released.size(), 2u);  // the partial copy: its top's default and a's 1
  EXPECT_EQ(tt.Count("/l"), 2);
}

// Values that are themselves the number of values a node holds, so that the
// checker can verify every count exactly after any failure.
class HstaaAllocFailure : public ::testing::TestWithParam<int> {};

void Build(TestTree *tt) {
  const char *paths[] = {"/l/#/p",  "/l/#/p",   "/l/#1/q",      "/l/#!/x/#/y", "/l/#2",
                         "/l/##/k", "/l/##a/k", "/l/#!/x/#3/z", "/m/a",        "/m/#/p"};
  for (const char *p : paths) ASSERT_NE(HSTAA_Insert(&tt->t, p, 1), nullptr) << p;
}

TEST_P(HstaaAllocFailure, EveryPointLeavesExactCountsAndNoLeak) {
  const char *ops[] = {"l/#/n/o",  "l/#7/n", "l/#!/x/#/w",  "l/##/k/j",
                       "m/#9/#/q", "l/#/p",  "l/#!/x/#3/z", "m/a"};
  const bool failFrom = GetParam() == 1;
  long points = 0;
  for (const char *op : ops) {
    for (bool remove : {false, true}) {
      for (long n = 0;; n++) {
        SCOPED_TRACE(std::string(remove ? "remove " : "insert ") + op + " failing at " +
                     std::to_string(n));
        coffer_test::TestPool pool;
        bool hit;
        {
          TestTree tt(pool.pool());
          tt.behaviour.insert = Behaviour::kIncrement;
          tt.behaviour.remove = Behaviour::kDecrement;
          Build(&tt);
          const long base = pool.calls();
          if (failFrom)
            pool.FailFrom(base + n);
          else
            pool.FailAt(base + n);
          char buf[32];
          std::strcpy(buf, op);
          HstNode *r = nullptr;
          if (remove)
            HSTAARemove(&tt.t, tt.root(), buf, 1);
          else
            r = HSTAAInsert(&tt.t, tt.root(), buf, 1);
          hit = pool.calls() > base + n;
          pool.NeverFail();
          EXPECT_STREQ(buf, op);
          CheckTree(&tt.t, true);
          if (!hit && !remove) {
            EXPECT_NE(r, nullptr);
          }
        }
        EXPECT_EQ(pool.liveBlocks(), 0u);
        if (!hit) {
          points += n;
          break;
        }
      }
    }
  }
  EXPECT_GE(points, 60);  // failures were injected at every allocation of every call
}

INSTANTIATE_TEST_SUITE_P(AtAndFrom, HstaaAllocFailure, ::testing::Values(0, 1));

}  // namespace
