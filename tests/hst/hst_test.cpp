// Sharp edges of the string tree: path syntax, release order, cloning rules
// and the behaviours chosen where a plain reading would release a value
// twice or leave the tree naming a released node.
#include "hst_check.h"

namespace {

using coffer_test::Released;
using coffer_test::ReleasedPools;
using coffer_test::TestPool;
using hst_test::CheckTree;
using hst_test::Dump;
using hst_test::Script;
using V = std::vector<CofferVal>;

constexpr CofferVal kDefault = 0xDEF0;

class HstTest : public ::testing::Test {
 protected:
  void SetUp() override {
    hst_test::ResetLogs();
    tree = HST_AllocTreeEx(tp.pool(), '/', kDefault, 2, 2);
    ASSERT_NE(tree, nullptr);
    HST_SetFreeValFn(tree, coffer_test::RecordRelease);
    root = HST_GetRoot(tree);
  }
  void TearDown() override {
    HST_FreeTree(tree);
    EXPECT_EQ(tp.liveBlocks(), 0u);
  }
  HstNode *Child(HstNode *parent, const char *key, CofferVal val) {
    HstNode *n = HST_InsertChild(tree, parent, key, val);
    EXPECT_NE(n, nullptr);
    return n;
  }

  TestPool tp;
  HstTree *tree = nullptr;
  HstNode *root = nullptr;
};

TEST_F(HstTest, FreshTreeAndRecords) {
  EXPECT_EQ(HST_GetSize(tree), 1);
  EXPECT_STREQ(HST_GetKey(tree, root), "");
  EXPECT_EQ(HST_GetVal(tree, root), kDefault);
  EXPECT_EQ(HST_GetParent(tree, root), nullptr);
  EXPECT_EQ(HST_GetNumChildren(tree, root), 0);
  EXPECT_EQ(HST_GetChild(tree, root, 0), nullptr);
  EXPECT_EQ(HST_GetChild(tree, root, -1), nullptr);
  EXPECT_EQ(root->children, 0u);
  // Records hold offsets from the pool's base, not addresses.
  auto *data = static_cast<HstTreeData *>(tree->data);
  EXPECT_EQ(data->root + reinterpret_cast<uintptr_t>(tp.pool()->base),
            reinterpret_cast<uintptr_t>(root));
  EXPECT_EQ(data->separator, '/');
  EXPECT_EQ(data->reserved[0] | data->reserved[1] | data->reserved[2], 0);
  EXPECT_EQ(tp.SizeOf(data), sizeof(HstTreeData));
  EXPECT_EQ(tp.SizeOf(root), sizeof(HstNode));
  EXPECT_EQ(tp.SizeOf(HST_GetKey(tree, root)), 1u);
  EXPECT_TRUE(tree->ownsHandle);
}

TEST_F(HstTest, ChildrenInNameOrderDuplicatesAllowed) {
  Child(root, "beta", 1);
  Child(root, "alpha", 2);
  Child(root, "gamma", 3);
  Child(root, "Zeta", 4);
  Child(root, "\x80", 5);
  const char *order[] = {"Zeta", "alpha", "beta", "gamma", "\x80"};
  ASSERT_EQ(HST_GetNumChildren(tree, root), 5);
  for (int i = 0; i < 5; i++) EXPECT_STREQ(HST_GetKey(tree, HST_GetChild(tree, root, i)), order[i]);
  HstNode *first = HST_FindChild(tree, root, "beta");
  HstNode *second = Child(root, "beta", 6);
  EXPECT_NE(first, second);
  EXPECT_EQ(HST_GetSize(tree), 7);
  EXPECT_EQ(HST_GetChild(tree, root, 2), first);
  EXPECT_EQ(HST_GetChild(tree, root, 3), second);
  EXPECT_EQ(HST_FindChild(tree, root, "Beta"), nullptr);  // names match with case
  EXPECT_EQ(HST_GetKey(tree, first), std::string("beta"));
  EXPECT_NE(HST_GetKey(tree, first), HST_GetKey(tree, second));  // each node owns its copy
  CheckTree(tree);
}

TEST_F(HstTest, SetValNeverReleases) {
  HstNode *a = Child(root, "a", 1);
  HST_SetVal(tree, a, 2);
  HST_SetVal(tree, root, 3);
  EXPECT_EQ(HST_GetVal(tree, a), 2u);
  EXPECT_TRUE(Released().empty());
}

TEST_F(HstTest, PathSyntax) {
  HstNode *a = Child(root, "a", 1);
  HstNode *b = Child(a, "b", 2);
  EXPECT_EQ(HST_Find(tree, "/a/b"), b);
  EXPECT_EQ(HST_Find(tree, "/a/b/"), b);
  EXPECT_EQ(HST_Find(tree, "/a"), a);
  EXPECT_EQ(HST_Find(tree, "/a/"), a);
  EXPECT_EQ(HST_Find(tree, "/"), root);
  EXPECT_EQ(HST_Find(tree, "x"), root);  // one character names the root
  EXPECT_EQ(HST_Find(tree, "xa/b"), b);  // the first character is never examined
  EXPECT_EQ(HST_Find(tree, "aa/b"), b);
  EXPECT_EQ(HST_Find(tree, "/b"), nullptr);
  EXPECT_EQ(HST_Find(tree, "/a//b"), nullptr);
  EXPECT_EQ(HST_Find(tree, "//"), nullptr);
  EXPECT_EQ(HST_Find(tree, "/a/b//"), nullptr);
  EXPECT_EQ(HST_Find(tree, "/a/bc"), nullptr);
  EXPECT_EQ(HST_Find(tree, "/a/b/c"), nullptr);
  // Empty names are names like any other.
  HstNode *e = Child(a, "", 3);
  HstNode *eb = Child(e, "b", 4);
  HstNode *rootEmpty = Child(root, "", 5);
  HstNode *bEmpty = Child(b, "", 6);
  EXPECT_EQ(HST_Find(tree, "/a//b"), eb);
  EXPECT_EQ(HST_Find(tree, "/a/"), a);
  EXPECT_EQ(HST_Find(tree, "/a//"), e);
  EXPECT_EQ(HST_Find(tree, "//"), rootEmpty);
  EXPECT_EQ(HST_Find(tree, "///"), nullptr);  // the empty child of the empty child
  HstNode *emptyEmpty = Child(rootEmpty, "", 7);
  EXPECT_EQ(HST_Find(tree, "///"), emptyEmpty);
  EXPECT_EQ(HST_Find(tree, "////"), nullptr);  // three empty names
  EXPECT_EQ(HST_Find(tree, "/a/b//"), bEmpty);
  EXPECT_EQ(HST_Find(tree, "/a/b/"), b);
}

TEST_F(HstTest, OtherSeparatorMakesSlashAName) {
  HstTree *t = HST_AllocTreeEx(tp.pool(), '.', 0, 0, 1);
  HstNode *a = HST_Insert(t, ".a.b/c", 7);
  ASSERT_NE(a, nullptr);
  EXPECT_STREQ(HST_GetKey(t, a), "b/c");
  EXPECT_EQ(HST_Find(t, "/a.b/c"), a);
  EXPECT_EQ(HST_Find(t, "/a/b/c"), nullptr);
  EXPECT_EQ(HST_GetSize(t), 3);
  HST_FreeTree(t);
}

TEST_F(HstTest, InsertByPath) {
  HstNode *b = HST_Insert(tree, "/a/b", 10);
  ASSERT_NE(b, nullptr);
  EXPECT_EQ(HST_GetSize(tree), 3);
  HstNode *a = HST_Find(tree, "/a");
  EXPECT_EQ(HST_GetVal(tree, a), kDefault);
  EXPECT_EQ(HST_GetVal(tree, b), 10u);
  EXPECT_EQ(HST_Insert(tree, "/a/b", 11), b);
  EXPECT_EQ(HST_Insert(tree, "/a/b/", 12), b);
  EXPECT_EQ(HST_GetVal(tree, b), 12u);
  EXPECT_EQ(HST_GetSize(tree), 3);
  EXPECT_TRUE(Released().empty());
  HST_SetVal(tree, a, 5);
  HST_Insert(tree, "/a/c", 13);
  EXPECT_EQ(HST_GetVal(tree, a), 5u);  // existing intermediate nodes keep their values
  EXPECT_EQ(HST_Insert(tree, "x", 14), root);
  EXPECT_EQ(HST_GetVal(tree, root), 14u);
  HstNode *deep = HST_Insert(tree, "/a//b", 15);
  ASSERT_NE(deep, nullptr);
  EXPECT_EQ(HST_GetParent(tree, HST_GetParent(tree, deep)), a);
  EXPECT_STREQ(HST_GetKey(tree, HST_GetParent(tree, deep)), "");
  EXPECT_EQ(HST_GetSize(tree), 6);
  CheckTree(tree);
}

TEST_F(HstTest, CallersPathIsNeverWritten) {
  HST_Insert(tree, "/a/b", 1);
  char found[] = "/a/b/";
  char halfway[] = "/a/zz/b/c";
  char made[] = "/p/q/r";
  EXPECT_NE(HST_Find(tree, found), nullptr);
  EXPECT_EQ(HST_Find(tree, halfway), nullptr);
  EXPECT_NE(HST_Insert(tree, made, 2), nullptr);
  EXPECT_STREQ(found, "/a/b/");
  EXPECT_STREQ(halfway, "/a/zz/b/c");
  EXPECT_STREQ(made, "/p/q/r");
  // A path in read-only memory would fault if the walk cut it in place.
  static const char kConst[] = "/a/b";
  EXPECT_NE(HST_Find(tree, kConst), nullptr);
}

TEST_F(HstTest, EmptyPathNamesNothing) {
  HST_Insert(tree, "//", 1);  // a child with the empty name must not be found by ""
  const std::string before = Dump(tree);
  const long calls = tp.calls();
  EXPECT_EQ(HST_Find(tree, ""), nullptr);
  EXPECT_EQ(HST_Insert(tree, "", 9), nullptr);
  EXPECT_EQ(Dump(tree), before);
  EXPECT_EQ(tp.calls(), calls);
}

TEST_F(HstTest, RemoveSubtreeReleasesDepthFirst) {
  HST_Insert(tree, "/a/b", 2);
  HST_Insert(tree, "/a/c/d", 4);
  HST_SetVal(tree, HST_Find(tree, "/a"), 1);
  HST_SetVal(tree, HST_Find(tree, "/a/c"), 3);
  HST_Insert(tree, "/z", 5);
  const size_t live = tp.liveBlocks();
  HST_RemoveSubtree(tree, HST_Find(tree, "/a"));
  EXPECT_EQ(Released(), (V{2, 4, 3, 1}));
  EXPECT_EQ(HST_GetSize(tree), 2);
  EXPECT_EQ(HST_Find(tree, "/a"), nullptr);
  EXPECT_EQ(HST_GetNumChildren(tree, root), 1);
  // a, b, c, d: key copy and node each, entry keys of a, b, c, d in their
  // parents' arrays, and the arrays of a and c with their entry blocks.
  EXPECT_EQ(live - tp.liveBlocks(), 4u * 2 + 4 + 2 * 2);
  CheckTree(tree);
}

TEST_F(HstTest, RemoveOneOfTwoSiblingsOfOneName) {
  HstNode *first = Child(root, "k", 1);
  Child(root, "j", 2);
  HstNode *second = Child(root, "k", 3);
  Child(root, "k", 4);
  HST_RemoveSubtree(tree, second);
  EXPECT_EQ(Released(), V{3});
  ASSERT_EQ(HST_GetNumChildren(tree, root), 3);
  for (int i = 0; i < 3; i++) EXPECT_NE(HST_GetChild(tree, root, i), second);
  HST_RemoveSubtree(tree, first);
  EXPECT_EQ(Released(), (V{3, 1}));
  EXPECT_EQ(HST_GetVal(tree, HST_GetChild(tree, root, 1)), 4u);
  CheckTree(tree);
}

TEST_F(HstTest, RemoveDetachedAndUnlistedNodes) {
  // A detached node has no entry to unlink; its subtree goes all the same.
  HstNode *d = HSTAllocNode(tree, "d", 8);
  ASSERT_NE(d, nullptr);
  Child(d, "e", 9);
  HST_RemoveSubtree(tree, d);
  EXPECT_EQ(Released(), (V{9, 8}));
  EXPECT_EQ(HST_GetSize(tree), 1);
}

TEST_F(HstTest, ClearReleasesRootLastAndStartsOver) {
  HST_Insert(tree, "/a/b", 2);
  HST_Insert(tree, "/c", 3);
  HST_SetVal(tree, root, 7);
  HSTAAAdjustSubtreeValCount(tree, HST_Find(tree, "/c"), 5);
  HST_Clear(tree);
  EXPECT_EQ(Released(), (V{2, kDefault, 3, 7}));
  EXPECT_EQ(HST_GetNumChildren(tree, root), 0);
  EXPECT_EQ(root->children, 0u);
  EXPECT_EQ(root->subtreeValCount, 0);
  EXPECT_EQ(HST_GetRoot(tree), root);
  EXPECT_STREQ(HST_GetKey(tree, root), "");
  // Sound: the root holds defaultVal again, so its old value cannot be
  // released a second time, and the size counts the root.
  EXPECT_EQ(HST_GetVal(tree, root), kDefault);
  EXPECT_EQ(HST_GetSize(tree), 1);
  Released().clear();
  HST_Clear(tree);
  EXPECT_EQ(Released(), V{kDefault});
  // The tree is usable again and counts every node made.
  ASSERT_NE(HST_Insert(tree, "/x/y", 1), nullptr);
  EXPECT_EQ(HST_GetSize(tree), 3);
  CheckTree(tree);
}

TEST_F(HstTest, FreeAfterClearReleasesEachValueOnce) {
  HstTree *t = HST_AllocTreeEx(tp.pool(), '/', kDefault, 1, 1);
  HST_SetMpFreeValFn(t, coffer_test::RecordMpRelease);
  HST_Insert(t, "/a", 1);
  HST_SetVal(t, HST_GetRoot(t), 9);
  HST_Clear(t);
  EXPECT_EQ(Released(), (V{1, 9}));
  HST_Insert(t, "/b/c", 2);
  HST_FreeTree(t);
  EXPECT_EQ(Released(), (V{1, 9, 2, kDefault, kDefault}));
  for (MemPool *p : ReleasedPools()) EXPECT_EQ(p, &t->mp);  // the handle is the pool
}

TEST_F(HstTest, RemoveSubtreeOfRootIsClear) {
  HST_Insert(tree, "/a/b", 2);
  HST_SetVal(tree, root, 7);
  HST_RemoveSubtree(tree, root);
  EXPECT_EQ(Released(), (V{2, kDefault, 7}));
  EXPECT_EQ(HST_GetRoot(tree), root);
  EXPECT_EQ(HST_GetVal(tree, root), kDefault);
  EXPECT_EQ(HST_GetSize(tree), 1);
  EXPECT_EQ(HST_GetNumChildren(tree, root), 0);
  EXPECT_NE(HST_Insert(tree, "/a", 3), nullptr);
  CheckTree(tree);
}

TEST_F(HstTest, SizeCountsLiveNodes) {
  EXPECT_EQ(HST_GetSize(tree), 1);
  HST_Insert(tree, "/a/b/c", 1);
  EXPECT_EQ(HST_GetSize(tree), 4);
  HstNode *d = HSTAllocNode(tree, "d", 2);  // a detached node is live too
  EXPECT_EQ(HST_GetSize(tree), 5);
  HSTInsertChildNode(tree, root, d);
  EXPECT_EQ(HST_GetSize(tree), 5);
  HST_RemoveSubtree(tree, HST_Find(tree, "/a/b"));
  EXPECT_EQ(HST_GetSize(tree), 3);
  HST_Clear(tree);
  EXPECT_EQ(HST_GetSize(tree), 1);
}

TEST_F(HstTest, FreeTreeNullAndCallerHandle) {
  HST_FreeTree(nullptr);
  // A handle the caller keeps: the records go, the handle stays, and it no
  // longer names the released data record.
  CollectionHeader h;
  std::memset(&h, 0, sizeof h);
  h.mp = *tp.pool();
  ASSERT_TRUE(HST_CreateTreeData(&h, '/', 3, 0, 4));
  HST_SetFreeValFn(&h, coffer_test::RecordRelease);
  HST_Insert(&h, "/a", 1);
  HST_FreeTree(&h);
  EXPECT_EQ(Released(), (V{1, 3}));
  EXPECT_EQ(h.data, nullptr);
  HST_FreeTree(&h);  // nothing left to release
  EXPECT_EQ(Released(), (V{1, 3}));
}

TEST_F(HstTest, CallbackSetters) {
  HstTree *t = HST_AllocTreeEx(tp.pool(), '/', kDefault, 1, 1);
  auto f = coffer_test::RecordRelease;
  auto g = coffer_test::RecordMpRelease;
  EXPECT_EQ(HST_SetFreeValFn(t, f), nullptr);
  EXPECT_EQ(HST_SetMpFreeValFn(t, g), nullptr);
  EXPECT_EQ(t->freeValFn, nullptr);
  EXPECT_EQ(HST_SetFreeValFn(t, nullptr), nullptr);
  EXPECT_EQ(t->mpFreeValFn, nullptr);
  HST_Insert(t, "/a", 0);  // 0 is released like any other value
  HST_FreeTree(t);         // no callback: nothing recorded
  EXPECT_TRUE(Released().empty());
  HstTree *u = HST_AllocTreeEx(tp.pool(), '/', kDefault, 1, 1);
  HST_SetFreeValFn(u, f);
  HST_Insert(u, "/a", 0);
  HST_RemoveSubtree(u, HST_Find(u, "/a"));
  EXPECT_EQ(Released(), V{0});
  HSTFreeVal(u, 42);
  EXPECT_EQ(Released(), (V{0, 42}));
  HST_FreeTree(u);
}

TEST_F(HstTest, CloneCallsCallbackForNonDefaultValuesInPreorder) {
  HST_Insert(tree, "/s/b/x", 3);
  HST_Insert(tree, "/s/a", 2);
  HST_SetVal(tree, HST_Find(tree, "/s"), 1);
  HstNode *src = HST_Find(tree, "/s");
  HSTAAAdjustSubtreeValCount(tree, HST_Find(tree, "/s/b/x"), 4);
  HstNode *dst = HST_Insert(tree, "/d", 9);
  const int32_t size = HST_GetSize(tree);
  HstNode *copy = HST_CloneSubtree(tree, src, hst_test::ScriptedClone, "t", dst);
  ASSERT_NE(copy, nullptr);
  // Parents before children, siblings in name order; b holds defaultVal.
  EXPECT_EQ(Script().seen, (V{1, 2, 3}));
  EXPECT_EQ(HST_GetSize(tree), size + 4);
  EXPECT_EQ(HST_Find(tree, "/d/t"), copy);
  EXPECT_EQ(HST_GetVal(tree, HST_Find(tree, "/d/t/b")), kDefault);
  EXPECT_EQ(HST_GetVal(tree, HST_Find(tree, "/d/t/b/x")), Script().made[2].second);
  EXPECT_EQ(HST_Find(tree, "/d/t/b/x")->subtreeValCount, 4);
  EXPECT_EQ(copy->subtreeValCount, 4);
  EXPECT_EQ(HST_GetParent(tree, copy), dst);
  EXPECT_TRUE(Released().empty());
  // A renamed copy takes its place by the new name.
  HST_Insert(tree, "/d/m", 0);
  HST_Insert(tree, "/d/z", 0);
  HstNode *c2 = HST_CloneSubtree(tree, src, hst_test::ScriptedClone, "q", dst);
  EXPECT_EQ(HST_GetChild(tree, dst, 1), c2);
  CheckTree(tree);
}

TEST_F(HstTest, CloneOfDefaultsNeverCallsCallback) {
  HST_Insert(tree, "/s/a/b", kDefault);
  HstNode *copy = HST_CloneSubtree(tree, HST_Find(tree, "/s"), hst_test::ScriptedClone, nullptr,
                                   HST_Find(tree, "/s/a/b"));
  ASSERT_NE(copy, nullptr);
  EXPECT_EQ(Script().calls, 0);
  EXPECT_EQ(HST_Find(tree, "/s/a/b/s/a/b"), HST_GetChild(tree, HST_Find(tree, "/s/a/b/s/a"), 0));
  // Copied under its own descendant, the source is copied as it was before.
  EXPECT_EQ(HST_GetNumChildren(tree, HST_Find(tree, "/s/a/b/s/a/b")), 0);
  EXPECT_EQ(HST_GetSize(tree), 7);
  CheckTree(tree);
}

TEST_F(HstTest, CloneUnderItself) {
  HstNode *n = HST_Insert(tree, "/n", 1);
  HST_Insert(tree, "/n/k", 2);
  HstNode *copy = HST_CloneSubtree(tree, n, hst_test::ScriptedClone, nullptr, n);
  ASSERT_NE(copy, nullptr);
  ASSERT_EQ(HST_GetNumChildren(tree, n), 2);
  EXPECT_STREQ(HST_GetKey(tree, copy), "n");
  EXPECT_EQ(HST_GetChild(tree, n, 1), copy);  // "k" < "n"
  EXPECT_EQ(HST_GetNumChildren(tree, copy), 1);
  EXPECT_STREQ(HST_GetKey(tree, HST_GetChild(tree, copy, 0)), "k");
  EXPECT_EQ(HST_GetSize(tree), 5);
  CheckTree(tree);
}

TEST_F(HstTest, CloneFailsAtNthCallbackCall) {
  // Five values, so the callback can fail at each of its five calls.
  HST_Insert(tree, "/s/a/x", 3);
  HST_Insert(tree, "/s/b", 5);
  HST_Insert(tree, "/s/a/y", 4);
  HST_Insert(tree, "/s/c", kDefault);
  HST_SetVal(tree, HST_Find(tree, "/s"), 1);
  HST_SetVal(tree, HST_Find(tree, "/s/a"), 2);
  for (HstNode *dst : {HST_Find(tree, "/s/b"), root}) {
    for (long n = 0; n < 5; n++) {
      SCOPED_TRACE(n);
      hst_test::ResetLogs();
      const bool hadArray = dst->children != 0;
      const std::string before = Dump(tree);
      const size_t live = tp.liveBlocks();
      Script().failAt = n;
      EXPECT_EQ(HST_CloneSubtree(tree, HST_Find(tree, "/s"), hst_test::ScriptedClone, "t", dst),
                nullptr);
      EXPECT_EQ(Script().calls, n + 1);
      EXPECT_EQ(Dump(tree), before);
      // A child array made for the destination stays, empty.
      size_t kept = 0;
      if (!hadArray && dst->children) {
        auto *arr = coffer::At<EsaArrayData>(tree, dst->children);
        kept = 1 + (arr->entries != 0);
      }
      EXPECT_EQ(tp.liveBlocks(), live + kept);
      // Every value copied so far went back once; defaultVal once per copied
      // node that held it (c is only reached after a, x, y and b).
      V want;
      for (auto &m : Script().made) want.push_back(m.second);
      V got;
      size_t defaults = 0;
      for (CofferVal v : Released()) v == kDefault ? (void)defaults++ : got.push_back(v);
      std::sort(got.begin(), got.end());
      EXPECT_EQ(got, want);
      EXPECT_EQ(defaults, 0u);
    }
  }
}

TEST_F(HstTest, ReplaceKeyOfDetachedNode) {
  HstNode *d = HSTAllocNode(tree, "old", 1);
  ASSERT_TRUE(HSTReplaceKey(tree, d, "brand new"));
  EXPECT_STREQ(HST_GetKey(tree, d), "brand new");
  EXPECT_EQ(tp.SizeOf(HST_GetKey(tree, d)), 10u);
  ASSERT_EQ(HSTInsertChildNode(tree, root, d), d);
  EXPECT_EQ(HST_Find(tree, "/brand new"), d);
  EXPECT_EQ(HSTAllocNode(tree, nullptr, 1), nullptr);
  EXPECT_FALSE(HSTAllocChild(tree, root));  // it has one already
}

TEST_F(HstTest, AdjustSubtreeValCount) {
  HstNode *b = HST_Insert(tree, "/a/b", 1);
  HstNode *a = HST_Find(tree, "/a");
  HstNode *c = HST_Insert(tree, "/c", 1);
  HSTAAAdjustSubtreeValCount(tree, b, 0);
  HSTAAAdjustSubtreeValCount(tree, nullptr, 3);
  EXPECT_EQ(root->subtreeValCount, 0);
  HSTAAAdjustSubtreeValCount(tree, b, 2);
  EXPECT_EQ(b->subtreeValCount, 2);
  EXPECT_EQ(a->subtreeValCount, 2);
  EXPECT_EQ(root->subtreeValCount, 2);
  EXPECT_EQ(c->subtreeValCount, 0);
  HSTAAAdjustSubtreeValCount(tree, a, -1);
  EXPECT_EQ(b->subtreeValCount, 2);
  EXPECT_EQ(a->subtreeValCount, 1);
  EXPECT_EQ(root->subtreeValCount, 1);
}

TEST_F(HstTest, ChildCapacitiesHandedOnUnchanged) {
  HstTree *t = HST_AllocTreeEx(tp.pool(), '/', 0, 3, 5);
  HST_Insert(t, "/a", 1);
  auto *arr = coffer::At<EsaArrayData>(t, HST_GetRoot(t)->children);
  EXPECT_EQ(arr->capacity, 3);
  EXPECT_EQ(arr->capacityIncrement, 5);
  HST_FreeTree(t);
  // An increment below 1 reaches the array as given, and the array's own
  // guard still lets children be added safely.
  t = HST_AllocTreeEx(tp.pool(), '/', 0, 0, 0);
  for (const char *p : {"/a", "/b", "/c", "/a/x"}) EXPECT_NE(HST_Insert(t, p, 1), nullptr);
  arr = coffer::At<EsaArrayData>(t, HST_GetRoot(t)->children);
  EXPECT_EQ(arr->capacityIncrement, 0);
  EXPECT_EQ(HST_GetNumChildren(t, HST_GetRoot(t)), 3);
  CheckTree(t);
  HST_FreeTree(t);
  // A negative capacity is refused by the array: no child can be made, and
  // nothing is left behind.
  t = HST_AllocTreeEx(tp.pool(), '/', 0, -1, 4);
  const size_t live = tp.liveBlocks();
  EXPECT_EQ(HST_InsertChild(t, HST_GetRoot(t), "a", 1), nullptr);
  EXPECT_EQ(HST_Insert(t, "/a", 1), nullptr);
  EXPECT_EQ(HST_GetSize(t), 1);
  EXPECT_EQ(tp.liveBlocks(), live);
  HST_FreeTree(t);
}

TEST(HstProcessHeap, OffsetsAreAddresses) {
  HstTree *t = HST_AllocTree('/', 5, 0, 2);
  ASSERT_NE(t, nullptr);
  EXPECT_EQ(t->mp.base, nullptr);
  HstNode *b = HST_Insert(t, "/a/b", 6);
  EXPECT_EQ(reinterpret_cast<uintptr_t>(HST_GetRoot(t)),
            static_cast<HstTreeData *>(t->data)->root);
  EXPECT_EQ(reinterpret_cast<uintptr_t>(HST_GetParent(t, b)), b->parent);
  EXPECT_EQ(HST_Find(t, "/a/b"), b);
  HST_FreeTree(t);
}

}  // namespace
