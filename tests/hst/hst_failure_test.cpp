// Allocation refused at every point of every call that allocates: the result
// reports it, the tree is left as documented and nothing leaks.
#include <algorithm>

#include "hst_check.h"

namespace {

using coffer_test::Released;
using coffer_test::TestPool;
using hst_test::CheckTree;
using hst_test::Dump;
using hst_test::Script;
using V = std::vector<CofferVal>;

constexpr CofferVal kDefault = 0xDEF0;

// Blocks of a child array that a failed call may leave behind, empty, on a
// node that had none before.
size_t KeptArrayBlocks(HstTree *tree, HstNode *node, bool hadArray) {
  if (hadArray || !node->children) return 0;
  auto *arr = coffer::At<EsaArrayData>(tree, node->children);
  EXPECT_EQ(arr->size, 0);
  return 1 + (arr->entries != 0);
}

TEST(HstFailure, AllocTreeExAtEveryPoint) {
  for (bool from : {false, true}) {
    long points = 0;
    for (long n = 0;; n++) {
      TestPool tp;
      from ? tp.FailFrom(n) : tp.FailAt(n);
      HstTree *t = HST_AllocTreeEx(tp.pool(), '/', kDefault, 2, 2);
      if (t) {
        EXPECT_EQ(HST_GetSize(t), 1);
        CheckTree(t);
        HST_FreeTree(t);
        EXPECT_EQ(tp.liveBlocks(), 0u);
        break;
      }
      points++;
      EXPECT_EQ(tp.liveBlocks(), 0u) << n;
      // Every block the pool granted goes back: the node is asked for even
      // when the root's key copy was refused.
      EXPECT_EQ(tp.frees(), from ? n : tp.calls() - 1) << "each block made goes back";
    }
    EXPECT_EQ(points, 4);  // handle, data record, root key, root node
  }
}

TEST(HstFailure, CreateTreeDataOnCallerHandle) {
  for (long n = 0; n < 3; n++) {
    TestPool tp;
    CollectionHeader h;
    std::memset(&h, 0, sizeof h);
    h.mp = *tp.pool();
    tp.FailAt(n);
    EXPECT_FALSE(HST_CreateTreeData(&h, '/', kDefault, 2, 2));
    EXPECT_EQ(h.data, nullptr);
    EXPECT_EQ(tp.liveBlocks(), 0u);
  }
}

TEST(HstFailure, AllocNodeAndReplaceKey) {
  TestPool tp;
  HstTree *t = HST_AllocTreeEx(tp.pool(), '/', kDefault, 2, 2);
  const size_t live = tp.liveBlocks();
  for (long n = 0; n < 2; n++) {
    tp.FailAt(tp.calls() + n);
    EXPECT_EQ(HSTAllocNode(t, "k", 1), nullptr);
    EXPECT_EQ(HST_GetSize(t), 1);
    EXPECT_EQ(tp.liveBlocks(), live);
  }
  tp.NeverFail();
  HstNode *d = HSTAllocNode(t, "old", 1);
  tp.FailAt(tp.calls());
  EXPECT_FALSE(HSTReplaceKey(t, d, "new"));
  EXPECT_STREQ(HST_GetKey(t, d), "old");
  EXPECT_EQ(tp.liveBlocks(), live + 2);
  // Attaching a detached node: the child array, its entry block, the entry's
  // key copy. The node stays detached and whole on every failure.
  for (long n = 0;; n++) {
    tp.FailAt(tp.calls() + n);
    const bool hadArray = HST_GetRoot(t)->children != 0;
    HstNode *got = HSTInsertChildNode(t, HST_GetRoot(t), d);
    if (got) {
      EXPECT_EQ(n, 3);
      break;
    }
    EXPECT_EQ(d->parent, 0u);
    EXPECT_STREQ(HST_GetKey(t, d), "old");
    EXPECT_EQ(HST_GetNumChildren(t, HST_GetRoot(t)), 0);
    EXPECT_EQ(tp.liveBlocks(), live + 2 + KeptArrayBlocks(t, HST_GetRoot(t), hadArray));
  }
  EXPECT_EQ(HST_Find(t, "/old"), d);
  tp.NeverFail();
  HST_FreeTree(t);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

// A tree on its own pool, built afresh for every refused call so that what
// one failure leaves behind does not shift the points of the next.
struct Fresh {
  TestPool tp;
  HstTree *t;
  explicit Fresh(int32_t capacity) {
    t = HST_AllocTreeEx(tp.pool(), '/', kDefault, capacity, 2);
    HST_SetFreeValFn(t, coffer_test::RecordRelease);
  }
  ~Fresh() {
    tp.NeverFail();
    HST_FreeTree(t);
    EXPECT_EQ(tp.liveBlocks(), 0u);
  }
};

// HST_InsertChild under a node without children (the array is made first)
// and under one whose array is full (the entry block grows).
TEST(HstFailure, InsertChildAtEveryPoint) {
  for (int full = 0; full < 2; full++) {
    SCOPED_TRACE(full);
    long points = 0;
    for (long n = 0;; n++) {
      Fresh f(2);
      HstTree *t = f.t;
      HstNode *parent = HST_Insert(t, "/p", 1);
      if (full) {
        HST_Insert(t, "/p/a", 2);
        HST_Insert(t, "/p/c", 3);
      }
      Released().clear();
      const bool hadArray = parent->children != 0;
      const std::string before = Dump(t);
      const size_t live = f.tp.liveBlocks();
      f.tp.FailAt(f.tp.calls() + n);
      HstNode *got = HST_InsertChild(t, parent, "b", 9);
      f.tp.NeverFail();
      if (got) {
        EXPECT_EQ(HST_GetVal(t, got), 9u);
        EXPECT_EQ(HST_GetChild(t, parent, full ? 1 : 0), got);
        CheckTree(t);
        break;
      }
      points++;
      EXPECT_EQ(Dump(t), before);
      EXPECT_EQ(f.tp.liveBlocks(), live + KeptArrayBlocks(t, parent, hadArray));
      EXPECT_TRUE(Released().empty()) << "a value never stored is not released";
    }
    // Array record and entry block, key, node, entry key; or key, node,
    // growth, entry key.
    EXPECT_EQ(points, full ? 4 : 5);
  }
}

// A path insertion that fails part-way keeps the nodes made before the
// failure, each with defaultVal, and stores the value nowhere.
TEST(HstFailure, InsertPathAtEveryPoint) {
  long points = 0;
  for (long n = 0;; n++) {
    Fresh f(1);
    HstTree *t = f.t;
    HST_Insert(t, "/a", 1);
    Released().clear();
    const size_t live = f.tp.liveBlocks();
    char path[] = "/a/b/c/";
    f.tp.FailAt(f.tp.calls() + n);
    HstNode *got = HST_Insert(t, path, 7);
    f.tp.NeverFail();
    EXPECT_STREQ(path, "/a/b/c/");
    if (got) {
      EXPECT_EQ(got, HST_Find(t, "/a/b/c"));
      EXPECT_EQ(HST_GetVal(t, got), 7u);
      EXPECT_EQ(HST_GetVal(t, HST_Find(t, "/a/b")), kDefault);
      break;
    }
    points++;
    CheckTree(t);
    EXPECT_TRUE(Released().empty());
    EXPECT_EQ(HST_Find(t, "/a/b/c"), nullptr);
    HstNode *b = HST_Find(t, "/a/b");
    if (b) {
      EXPECT_EQ(HST_GetVal(t, b), kDefault);
      EXPECT_EQ(HST_GetNumChildren(t, b), 0);
    }
    EXPECT_EQ(HST_GetSize(t), b ? 3 : 2);
    EXPECT_EQ(HST_GetVal(t, HST_Find(t, "/a")), 1u);
    // Without b, only a's (empty) new child array may remain.
    if (!b) {
      EXPECT_EQ(f.tp.liveBlocks(), live + KeptArrayBlocks(t, HST_Find(t, "/a"), false));
    }
  }
  EXPECT_EQ(points, 10);  // five for each of b and c
}

// Cloning with every allocation refused in turn, under a destination that
// already has children and under a leaf: nothing is attached, the tree reads
// exactly as before, every value copied goes back once, nothing leaks.
TEST(HstFailure, CloneAtEveryAllocationPoint) {
  for (bool from : {false, true}) {
    for (int leaf = 0; leaf < 2; leaf++) {
      SCOPED_TRACE(testing::Message() << "from " << from << " leaf " << leaf);
      TestPool tp;
      HstTree *t = HST_AllocTreeEx(tp.pool(), '/', kDefault, 1, 1);
      HST_SetFreeValFn(t, coffer_test::RecordRelease);
      HST_Insert(t, "/s/a/x", 3);
      HST_Insert(t, "/s/a/y", kDefault);
      HST_Insert(t, "/s/b", 4);
      HST_SetVal(t, HST_Find(t, "/s"), 1);
      HST_Insert(t, "/d/e", 5);
      HSTAAAdjustSubtreeValCount(t, HST_Find(t, "/s/a/x"), 1);
      HstNode *src = HST_Find(t, "/s");
      long points = 0;
      for (long n = 0;; n++) {
        HstNode *dst = HST_Find(t, leaf ? "/d/e" : "/d");
        hst_test::ResetLogs();
        const bool hadArray = dst->children != 0;
        const std::string before = Dump(t);
        const size_t live = tp.liveBlocks();
        from ? tp.FailFrom(tp.calls() + n) : tp.FailAt(tp.calls() + n);
        HstNode *got = HST_CloneSubtree(t, src, hst_test::ScriptedClone, "t", dst);
        tp.NeverFail();
        if (got) {
          EXPECT_EQ(HST_GetParent(t, got), dst);
          EXPECT_EQ(got->subtreeValCount, 1);
          EXPECT_TRUE(Released().empty());
          break;
        }
        points++;
        EXPECT_EQ(Dump(t), before);
        EXPECT_EQ(tp.liveBlocks(), live + KeptArrayBlocks(t, dst, hadArray));
        V want, got2;
        for (auto &m : Script().made) want.push_back(m.second);
        for (CofferVal v : Released())
          if (v != kDefault) got2.push_back(v);
        std::sort(got2.begin(), got2.end());
        EXPECT_EQ(got2, want);
        CheckTree(t);
      }
      // Five copied nodes: key and node each; s' and a' get an array and an
      // entry block; four entries inside the copy, two of them growing a
      // full block; the rename; under /d growth and entry key, under the leaf
      // an array, its block and the entry key.
      EXPECT_EQ(points, leaf ? 24 : 23);
      HST_FreeTree(t);
      EXPECT_EQ(tp.liveBlocks(), 0u);
    }
  }
}

}  // namespace
