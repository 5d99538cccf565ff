// Sharp edges of the string tree: records, path syntax, release order,
// cloning rules and the behaviours chosen where a plain reading would release
// a value twice or leave the tree naming a released node.
#include "hst_check.h"

namespace {

using coffer_test::Released;
using coffer_test::ReleasedPools;
using coffer_test::TestPool;
using namespace hst_test;

class HstTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ResetLogs();
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
    return HST_InsertChild(tree, parent, key, val);
  }

  TestPool tp;
  HstTree *tree = nullptr;
  HstNode *root = nullptr;
};

TEST_F(HstTest, FreshTreeAndRecords) {
  EXPECT_EQ(Dump(tree), "size 1 (=57072#0)");
  EXPECT_EQ(HST_GetParent(tree, root), nullptr);
  EXPECT_EQ(HST_GetChild(tree, root, 0), nullptr);
  EXPECT_EQ(root->children, 0u);
  auto *data = static_cast<HstTreeData *>(tree->data);
  EXPECT_EQ(data->root + reinterpret_cast<uintptr_t>(tp.pool()->base),
            reinterpret_cast<uintptr_t>(root));  // offsets from the pool's base
  EXPECT_EQ(data->separator, '/');
  EXPECT_EQ(data->reserved[0] | data->reserved[1] | data->reserved[2], 0);
  EXPECT_EQ(tp.SizeOf(HST_GetKey(tree, root)), 1u);
  HstNode *b = Child(root, "beta", 1);
  Child(root, "alpha", 2);
  Child(root, "gamma", 3);
  HstNode *b2 = Child(root, "beta", 4);  // no check for an existing name
  EXPECT_EQ(Dump(tree), "size 5 (=57072#0(alpha=2#0)(beta=1#0)(beta=4#0)(gamma=3#0))");
  EXPECT_EQ(HST_GetChild(tree, root, 1), b);
  EXPECT_EQ(HST_GetChild(tree, root, 2), b2);
  EXPECT_EQ(HST_FindChild(tree, root, "Beta"), nullptr);  // names match with case
  EXPECT_EQ(tp.SizeOf(HST_GetKey(tree, b)), 5u);          // each node owns its copy
  HST_SetVal(tree, b, 9);
  HST_SetVal(tree, root, 9);
  EXPECT_TRUE(Released().empty());  // replacing never releases
}

TEST_F(HstTest, PathSyntax) {
  HstNode *a = Child(root, "a", 1);
  HstNode *b = Child(a, "b", 2);
  const std::pair<const char *, HstNode *> before[] = {
      {"/a/b", b},     {"/a/b/", b},       {"/", root},     {"x", root},        {"xa/b", b},
      {"/b", nullptr}, {"/a//b", nullptr}, {"//", nullptr}, {"/a/bc", nullptr}, {"", nullptr}};
  for (auto &[path, want] : before) EXPECT_EQ(HST_Find(tree, path), want) << path;
  // Another separator makes / an ordinary name character; a NUL separator
  // never cuts, so the whole rest is one name.
  for (char sep : {'.', '\0'}) {
    HstTree *t = HST_AllocTreeEx(tp.pool(), sep, 0, 0, 1);
    HstNode *n = HST_Insert(t, ".a.b/c", 7);
    EXPECT_STREQ(HST_GetKey(t, n), sep ? "b/c" : "a.b/c");
    EXPECT_EQ(HST_Find(t, "/a.b/c"), n);
    EXPECT_EQ(HST_Find(t, "/a/b/c"), nullptr);
    HST_FreeTree(t);
  }
}

TEST_F(HstTest, InsertByPathAndThePathIsNeverWritten) {
  static const char kPath[] = "/a/b";  // read-only: a walk cutting it in place would fault
  HstNode *b = HST_Insert(tree, kPath, 10);
  EXPECT_EQ(Dump(tree), "size 3 (=57072#0(a=57072#0(b=10#0)))");
  EXPECT_EQ(HST_Insert(tree, "/a/b/", 12), b);
  HST_SetVal(tree, HST_Find(tree, "/a"), 5);
  HST_Insert(tree, "/a/c", 13);  // existing intermediate nodes keep their values
  EXPECT_EQ(HST_Insert(tree, "x", 14), root);
  HstNode *deep = HST_Insert(tree, "/a//b", 15);
  EXPECT_EQ(HST_Find(tree, "/a//b"), deep);
  const std::string all = "size 6 (=14#0(a=5#0(=57072#0(b=15#0))(b=12#0)(c=13#0)))";
  EXPECT_EQ(Dump(tree), all);
  EXPECT_TRUE(Released().empty());
  char halfway[] = "/a/zz/b/c";
  EXPECT_EQ(HST_Find(tree, halfway), nullptr);
  EXPECT_STREQ(halfway, "/a/zz/b/c");
  // The empty path names nothing and changes nothing, not even the child
  // with the empty name.
  const long calls = tp.calls();
  EXPECT_EQ(HST_Insert(tree, "", 9), nullptr);
  EXPECT_EQ(Dump(tree), all);
  EXPECT_EQ(tp.calls(), calls);
}

TEST_F(HstTest, RemoveSubtree) {
  HST_Insert(tree, "/z", 5);
  // Among siblings of one name, the entry of that very node goes.
  HstNode *first = Child(root, "k", 6);
  HstNode *second = Child(root, "k", 7);
  Child(root, "k", 8);
  HST_RemoveSubtree(tree, second);
  HST_RemoveSubtree(tree, first);
  EXPECT_EQ(Released(), (V{7, 6}));
  EXPECT_EQ(Dump(tree), "size 3 (=57072#0(k=8#0)(z=5#0))");
  // A detached node has no entry to unlink; its subtree goes all the same.
  HstNode *d = HSTAllocNode(tree, "d", 8);
  Child(d, "e", 9);
  HST_RemoveSubtree(tree, d);
  EXPECT_EQ(Released(), (V{7, 6, 9, 8}));
  // The root: emptied as by a clear, and the tree stays usable.
  HST_SetVal(tree, root, 10);
  HST_RemoveSubtree(tree, root);
  EXPECT_EQ(Released(), (V{7, 6, 9, 8, 8, 5, 10}));
  EXPECT_EQ(HST_GetRoot(tree), root);
  EXPECT_EQ(Dump(tree), "size 1 (=57072#0)");
  EXPECT_NE(HST_Insert(tree, "/a", 3), nullptr);
  CheckTree(tree);
}

TEST_F(HstTest, ClearReleasesRootLastAndStartsOver) {
  HST_Insert(tree, "/a/b", 2);
  HST_Insert(tree, "/c", 3);
  HST_SetVal(tree, root, 7);
  HSTAAAdjustSubtreeValCount(tree, HST_Find(tree, "/c"), 5);
  HST_Clear(tree);
  EXPECT_EQ(Released(), (V{2, kDefault, 3, 7}));
  EXPECT_EQ(root->children, 0u);
  EXPECT_EQ(HST_GetRoot(tree), root);
  // The root holds defaultVal again, so its old value cannot be released a
  // second time, and the size counts the root.
  EXPECT_EQ(Dump(tree), "size 1 (=57072#0)");
  HST_Clear(tree);
  EXPECT_EQ(Released(), (V{2, kDefault, 3, 7, kDefault}));
  HST_Insert(tree, "/x/y", 1);
  EXPECT_EQ(HST_GetSize(tree), 3);
  // Freeing after a clear: each value once, through the pool callback with
  // the handle as the pool.
  ResetLogs();
  HstTree *t = HST_AllocTreeEx(tp.pool(), '/', kDefault, 1, 1);
  HST_SetMpFreeValFn(t, coffer_test::RecordMpRelease);
  HST_Insert(t, "/a", 1);
  HST_SetVal(t, HST_GetRoot(t), 9);
  HST_Clear(t);
  HST_Insert(t, "/b/c", 2);
  HST_FreeTree(t);
  EXPECT_EQ(Released(), (V{1, 9, 2, kDefault, kDefault}));
  EXPECT_EQ(ReleasedPools(), std::vector<MemPool *>(5, &t->mp));
}

TEST_F(HstTest, FreeTreeAndCallbackSetters) {
  HST_FreeTree(nullptr);
  // A handle the caller keeps: the records go, the handle stays and no
  // longer names the released data record.
  CollectionHeader h;
  std::memset(&h, 0, sizeof h);
  h.mp = *tp.pool();
  ASSERT_TRUE(HST_CreateTreeData(&h, '/', 3, 0, 4));
  EXPECT_EQ(HST_SetFreeValFn(&h, coffer_test::RecordRelease), nullptr);
  EXPECT_EQ(HST_SetMpFreeValFn(&h, coffer_test::RecordMpRelease), nullptr);
  EXPECT_EQ(h.freeValFn, nullptr);
  EXPECT_EQ(HST_SetFreeValFn(&h, coffer_test::RecordRelease), nullptr);
  EXPECT_EQ(h.mpFreeValFn, nullptr);
  HST_Insert(&h, "/a", 0);  // 0 is released like any other value
  HSTFreeVal(&h, 42);
  HST_FreeTree(&h);
  EXPECT_EQ(Released(), (V{42, 0, 3}));
  EXPECT_EQ(h.data, nullptr);
  HST_FreeTree(&h);  // nothing left to release
  EXPECT_EQ(Released(), (V{42, 0, 3}));
}

TEST_F(HstTest, CloneOrderNamesAndCounts) {
  HST_Insert(tree, "/s/b/x", 3);
  HST_Insert(tree, "/s/a", 2);
  HstNode *src = HST_Insert(tree, "/s", 1);
  HSTAAAdjustSubtreeValCount(tree, HST_Find(tree, "/s/b/x"), 4);
  HstNode *dst = HST_Insert(tree, "/d", 9);
  HST_Insert(tree, "/d/m", 0);
  HstNode *copy = HST_CloneSubtree(tree, src, ScriptedClone, "e", dst);
  // Parents before children, siblings in name order; b holds defaultVal.
  EXPECT_EQ(Script().seen, (V{1, 2, 3}));
  EXPECT_EQ(HST_GetChild(tree, dst, 0), copy);  // placed by its new name
  std::string want = "(e=268435456#4(a=268435457#0)(b=57072#4(x=268435458#4)))";
  std::string got;
  DumpNode(tree, copy, &got);
  EXPECT_EQ(got, want);
  EXPECT_TRUE(Released().empty());
  // All values defaultVal: no callback (none given). Under its own
  // descendant, the source is copied as it was before.
  ResetLogs();
  HST_Insert(tree, "/p/q/r", kDefault);
  HstNode *r = HST_Find(tree, "/p/q/r");
  ASSERT_NE(HST_CloneSubtree(tree, HST_Find(tree, "/p"), nullptr, nullptr, r), nullptr);
  EXPECT_EQ(Script().calls, 0);
  got.clear();
  DumpNode(tree, HST_Find(tree, "/p"), &got);
  EXPECT_EQ(got, "(p=57072#0(q=57072#0(r=57072#0(p=57072#0(q=57072#0(r=57072#0))))))");
  CheckTree(tree);
}

TEST_F(HstTest, NodePrimitivesAndCounts) {
  HstNode *d = HSTAllocNode(tree, "old", 1);
  EXPECT_EQ(HST_GetSize(tree), 2);  // a detached node is live too
  ASSERT_TRUE(HSTReplaceKey(tree, d, "brand new"));
  EXPECT_EQ(tp.SizeOf(HST_GetKey(tree, d)), 10u);
  ASSERT_EQ(HSTInsertChildNode(tree, root, d), d);
  EXPECT_EQ(HST_Find(tree, "/brand new"), d);
  EXPECT_EQ(HSTAllocNode(tree, nullptr, 1), nullptr);
  EXPECT_FALSE(HSTAllocChild(tree, root));  // it has one already
  HstNode *b = HST_Insert(tree, "/a/b", 1);
  HSTAAAdjustSubtreeValCount(tree, b, 0);
  HSTAAAdjustSubtreeValCount(tree, nullptr, 3);
  HSTAAAdjustSubtreeValCount(tree, b, 2);
  HSTAAAdjustSubtreeValCount(tree, HST_GetParent(tree, b), -1);
  EXPECT_EQ(Dump(tree), "size 4 (=57072#1(a=57072#1(b=1#2))(brand new=1#0))");
}

TEST_F(HstTest, ChildCapacitiesHandedOnUnchanged) {
  // As given, even an increment below 1 (the array's own guard still grows
  // it); a negative capacity is refused by the array: no child, nothing left.
  for (auto [cap, inc] : {std::pair<int32_t, int32_t>{3, 5}, {0, 0}, {-1, 4}}) {
    HstTree *t = HST_AllocTreeEx(tp.pool(), '/', 0, cap, inc);
    const size_t live = tp.liveBlocks();
    for (const char *p : {"/a", "/b", "/c", "/a/x"})
      EXPECT_EQ(HST_Insert(t, p, 1) != nullptr, cap >= 0);
    if (cap < 0) {
      EXPECT_EQ(HST_InsertChild(t, HST_GetRoot(t), "a", 1), nullptr);
      EXPECT_EQ(tp.liveBlocks(), live);
    } else {
      auto *arr = coffer::RecordAt<EsaArrayData>(t, HST_GetRoot(t)->children);
      EXPECT_EQ(arr->capacityIncrement, inc);
      EXPECT_EQ(arr->capacity, cap ? cap : 3);
    }
    CheckTree(t);
    HST_FreeTree(t);
  }
}

TEST(HstProcessHeap, OffsetsAreAddresses) {
  HstTree *t = HST_AllocTree('/', 5, 0, 2);
  HstNode *b = HST_Insert(t, "/a/b", 6);
  EXPECT_EQ(reinterpret_cast<uintptr_t>(HST_GetRoot(t)), static_cast<HstTreeData *>(t->data)->root);
  EXPECT_EQ(reinterpret_cast<uintptr_t>(HST_GetParent(t, b)), b->parent);
  EXPECT_EQ(HST_Find(t, "/a/b"), b);
  HST_FreeTree(t);
}

}  // namespace
