// The string tree's sharp edges: the order of its pool calls, siblings of
// one name, detached nodes, what a failed copy releases, and the checker
// firing on damaged trees.
#include <gtest/gtest.h>

#include <functional>

#include "hst/hst_internal.h"
#include "support/test_pool.h"

namespace coffer_test {
namespace {

TEST(Hst, PoolCallsAndReleasesInOrder) {
  TestPool tp;
  StartCallLog();
  HstTree *t = HST_AllocTreeEx(tp.pool(), '/', 0, 1, 1);
  HST_SetFreeValFn(t, RecordRelease);
  HST_Insert(t, "/ab/c", 3);
  HST_CloneSubtree(t, HST_Find(t, "/ab"), [](HstTree *, CofferVal v, CofferVal *out) { return *out = v + 1, true; },
                   "d", HST_GetRoot(t));
  HST_RemoveSubtree(t, HST_Find(t, "/ab"));
  HST_FreeTree(t);
  HST_FreeTree(nullptr);
  EXPECT_EQ(TakeCallLog(),
            "c1x40 c1x24 a1 c1x20 "                                // handle, record, root
            "c1x16 r0:8 a3 c1x20 a3 c1x16 r0:8 a2 c1x20 a2 "       // /ab/c
            "a3 c1x20 a2 c1x20 c1x16 r0:8 a2 a2 f r16 a2 "         // ab copied as d
            "f r8 v3 f f v0 f r0 f f f "                           // ab removed
            "v4 f f v0 f r0 f f f f r0 f v0 f f f f");             // the rest freed
  EXPECT_EQ(tp.held(), 0u);
}

// Siblings of one name (only the node primitives make them): a lookup finds
// the one the bisection meets first, a removal takes out that very node.
TEST(Hst, SiblingsOfOneName) {
  HstTree *t = HST_AllocTree('/', 0, 0, 1);
  HstNode *root = HST_GetRoot(t), *k[3];
  for (int i = 0; i < 3; i++) k[i] = HST_InsertChild(t, root, "k", i);
  EXPECT_EQ(HST_FindChild(t, root, "k"), k[1]);
  HST_RemoveSubtree(t, k[1]);
  EXPECT_EQ(HST_GetChild(t, root, 0), k[0]);
  EXPECT_EQ(HST_GetChild(t, root, 1), k[2]);
  EXPECT_EQ(HST_GetSize(t), 3);
  HST_FreeTree(t);
}

// A detached node: renamed, then attached in the place of its new name.
TEST(Hst, DetachedNodes) {
  TestPool tp;
  HstTree *t = HST_AllocTreeEx(tp.pool(), '/', 0, 0, 1);
  HST_Insert(t, "/m", 1);
  EXPECT_EQ(HSTAllocNode(t, nullptr, 0), nullptr);
  HstNode *n = HSTAllocNode(t, "z", 2);
  tp.FailAt(tp.calls());
  EXPECT_FALSE(HSTReplaceKey(t, n, "a"));
  EXPECT_STREQ(HST_GetKey(t, n), "z");
  EXPECT_TRUE(HSTReplaceKey(t, n, "a"));
  EXPECT_FALSE(HSTAllocChild(t, HST_GetRoot(t)));  // it has one already
  EXPECT_EQ(HSTInsertChildNode(t, HST_GetRoot(t), n), n);
  EXPECT_EQ(HST_GetChild(t, HST_GetRoot(t), 0), n);
  EXPECT_EQ(HST_GetParent(t, n), HST_GetRoot(t));
  EXPECT_EQ(HST_Find(t, ""), nullptr);  // no first character to skip
  EXPECT_EQ(HST_Insert(t, "", 5), nullptr);
  EXPECT_EQ(HST_GetSize(t), 3);
  HST_FreeTree(t);
  EXPECT_EQ(tp.held(), 0u);
}

// A copy whose third value cannot be made releases the two made before it,
// and the default value of every node copied so far, children first.
TEST(Hst, FailedCopyReleasesWhatItMade) {
  HstTree *t = HST_AllocTree('/', 9, 1, 1);
  HST_SetFreeValFn(t, RecordRelease);
  for (const char *p : {"/s", "/s/a", "/s/a/x", "/s/b", "/s/c"}) HST_Insert(t, p, 9);
  for (CofferVal v : {1, 2, 3}) HST_SetVal(t, HST_Find(t, v == 1 ? "/s/a" : v == 2 ? "/s/a/x" : "/s/b"), v);
  Releases().clear();
  static int calls;
  HstCloneValFn third = [](HstTree *, CofferVal v, CofferVal *out) { return *out = v + 100, ++calls < 3; };
  EXPECT_EQ(HST_CloneSubtree(t, HST_Find(t, "/s"), third, "d", HST_GetRoot(t)), nullptr);
  EXPECT_EQ(ReleasedVals(), (std::vector<CofferVal>{102, 101, 9}));
  EXPECT_EQ(HST_GetSize(t), 6);
  EXPECT_EQ(HST_GetNumChildren(t, HST_GetRoot(t)), 1);
  HST_FreeTree(t);
}

TEST(Hst, CheckerFiresOnEachDamage) {
  HstTree *t = HST_AllocTree('/', 0, 2, 2);
  for (const char *p : {"/a/b", "/a/c", "/d"}) HST_Insert(t, p, 0);
  HstNode *a = HST_Find(t, "/a"), *b = HST_Find(t, "/a/b"), *root = HST_GetRoot(t);
  auto *kids = coffer::RecordAt<EsaArrayData>(t, a->children);
  auto *entries = coffer::RecordAt<EsaEntry>(t, kids->entries);
  const struct {
    const char *what;
    bool counts;
    std::function<void()> damage;
  } kDamage[] = {
      {"root missing, named or with a parent", false, [&] { root->parent = a->parent; }},
      {"node without a name", false, [&] { b->key = 0; }},
      {"keys out of order", false, [&] { std::swap(entries[0], entries[1]); }},
      {"child entry names no node", false, [&] { entries[1].val = 0; }},
      {"parent link disagrees with child entry", false, [&] { b->parent = b->children; }},
      {"child entry named unlike its node", false, [&] { entries[0].key = entries[1].key; }},
      {"more nodes than size counts", false, [&] { static_cast<HstTreeData *>(t->data)->size = 2; }},
      {"size differs from the nodes reachable", false, [&] { static_cast<HstTreeData *>(t->data)->size = 9; }},
      {"negative value count", true, [&] { b->subtreeValCount = -1; }},
      {"value count below its children's", true, [&] { b->subtreeValCount = 1; }},
  };
  coffer::CheckFault fault;
  for (const auto &row : kDamage) {
    const HstNode savedRoot = *root, savedB = *b;
    const HstTreeData savedData = *static_cast<HstTreeData *>(t->data);
    const EsaEntry savedEntries[2] = {entries[0], entries[1]};
    ASSERT_TRUE(coffer::hst::HSTCheckTree(t, true, &fault));
    row.damage();
    EXPECT_FALSE(coffer::hst::HSTCheckTree(t, row.counts, &fault)) << row.what;
    EXPECT_STREQ(fault.what, row.what);
    *root = savedRoot, *b = savedB, *static_cast<HstTreeData *>(t->data) = savedData;
    entries[0] = savedEntries[0], entries[1] = savedEntries[1];
  }
  HST_FreeTree(t);
}

}  // namespace
}  // namespace coffer_test
