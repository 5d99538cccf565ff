// The exact pool calls of the tree's operations, and allocation refused at
// every point of every call that allocates: the result reports it, the tree
// is left as documented and nothing leaks.
#include "../esa/pool_log.h"
#include "hst_check.h"

namespace {

using coffer_test::Released;
using coffer_test::TestPool;
using namespace hst_test;

bool LoggedClone(HstTree *, CofferVal val, CofferVal *out) {
  pool_log::Add("k" + std::to_string(val));
  *out = val + 100;
  return true;
}

// Every pool call (with its size) and every callback, in order.
TEST(HstPoolCalls, OrderOfAWholeLife) {
  TestPool tp;
  MemPool logged = pool_log::Wrap(tp.pool());
  HstTree *t = HST_AllocTreeEx(&logged, '/', 7, 1, 1);
  EXPECT_EQ(pool_log::Take(), "c1x40 c1x24 a1 c1x20");  // handle, record, root key, root
  HST_SetFreeValFn(t, pool_log::Value);
  HstNode *root = HST_GetRoot(t);
  // Per new node: the parent's array (record, block) when it has none, the
  // key copy, the node, the entry (growing a full block) with its key copy.
  HST_Insert(t, "/a/bc", 3);
  EXPECT_EQ(pool_log::Take(), "c1x16 r0:8 a2 c1x20 a2 c1x16 r0:8 a3 c1x20 a3");
  HST_InsertChild(t, root, "z", 9);
  EXPECT_EQ(pool_log::Take(), "a2 c1x20 r16 a2");
  HstNode *a = HST_Find(t, "/a");
  HST_SetVal(t, a, 5);
  // Clone: value, node (key, node), children, rename, attach.
  HST_CloneSubtree(t, a, LoggedClone, "q", HST_Find(t, "/z"));
  EXPECT_EQ(pool_log::Take(), "k5 a2 c1x20 k3 a3 c1x20 c1x16 r0:8 a3 a2 f c1x16 r0:8 a2");
  // Unlink (entry key, shrink), then depth first: value, array, key, node.
  HST_RemoveSubtree(t, a);
  EXPECT_EQ(pool_log::Take(), "f r8 v3 f f v5 f r0 f f f");
  HST_FreeTree(t);
  EXPECT_EQ(pool_log::Take(), "v103 f f v105 f r0 f f f v9 f r0 f f f f r0 f v7 f f f f");
  // Refusals: the key copy, the node, the entry's key copy. Only what was
  // granted is freed; the node is asked for even when the key was refused.
  t = HST_AllocTreeEx(&logged, '/', 0, 1, 1);
  pool_log::Take();
  for (long n : {2, 1, 2}) {
    tp.FailAt(tp.calls() + n);
    EXPECT_EQ(HST_InsertChild(t, HST_GetRoot(t), "k", 1), nullptr);
  }
  EXPECT_EQ(pool_log::Take(), "c1x16 r0:8 a2 c1x20 f a2 c1x20 f a2 c1x20 a2 f f");
  tp.FailAt(tp.calls() + 1);
  EXPECT_EQ(HST_Insert(t, "/k", 1), nullptr);  // a failed walk stores nothing
  HST_FreeTree(t);
  EXPECT_EQ(pool_log::Take(), "a2 c1x20 f f f f f f f");
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

TEST(HstFailure, CreationAtEveryPoint) {
  for (long n = 0; n < 5; n++) {
    for (bool from : {false, true}) {
      TestPool tp;
      from ? tp.FailFrom(n) : tp.FailAt(n);
      HstTree *t = HST_AllocTreeEx(tp.pool(), '/', kDefault, 2, 2);
      EXPECT_EQ(t == nullptr, n < 4);  // handle, data record, root key, root node
      HST_FreeTree(t);
      EXPECT_EQ(tp.liveBlocks(), 0u) << n;
    }
    // On a handle the caller keeps, data is null again after a failure.
    TestPool tp;
    CollectionHeader h;
    std::memset(&h, 0, sizeof h);
    h.mp = *tp.pool();
    tp.FailAt(n);
    EXPECT_EQ(HST_CreateTreeData(&h, '/', kDefault, 2, 2), n >= 3);
    EXPECT_EQ(h.data == nullptr, n < 3);
    HST_FreeTree(&h);
    EXPECT_EQ(tp.liveBlocks(), 0u);
  }
}

TEST(HstFailure, ReplaceKeyAndAttach) {
  TestPool tp;
  HstTree *t = HST_AllocTreeEx(tp.pool(), '/', kDefault, 2, 2);
  HstNode *root = HST_GetRoot(t);
  const size_t live = tp.liveBlocks();
  HstNode *d = HSTAllocNode(t, "old", 1);
  tp.FailAt(tp.calls());
  EXPECT_FALSE(HSTReplaceKey(t, d, "new"));
  EXPECT_STREQ(HST_GetKey(t, d), "old");
  // Attaching: the child array, its entry block, the entry's key copy. The
  // node stays detached and whole on every failure.
  for (long n = 0;; n++) {
    tp.FailAt(tp.calls() + n);
    const bool hadArray = root->children != 0;
    if (HSTInsertChildNode(t, root, d)) {
      EXPECT_EQ(n, 3);
      break;
    }
    EXPECT_EQ(d->parent, 0u);
    EXPECT_STREQ(HST_GetKey(t, d), "old");
    EXPECT_EQ(HST_GetNumChildren(t, root), 0);
    EXPECT_EQ(tp.liveBlocks(), live + 2 + KeptArrayBlocks(t, root, hadArray));
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

// Under a node without children (the array is made first) and under one
// whose array is full (the entry block grows).
TEST(HstFailure, InsertChildAtEveryPoint) {
  for (int full = 0; full < 2; full++) {
    long points = 0;
    for (long n = 0;; n++) {
      Fresh f(2);
      HstNode *parent = HST_Insert(f.t, "/p", 1);
      if (full) HST_Insert(f.t, "/p/a", 2), HST_Insert(f.t, "/p/c", 3);
      Released().clear();
      const bool hadArray = parent->children != 0;
      const std::string before = Dump(f.t);
      const size_t live = f.tp.liveBlocks();
      f.tp.FailAt(f.tp.calls() + n);
      HstNode *got = HST_InsertChild(f.t, parent, "b", 9);
      if (got) {
        EXPECT_EQ(HST_GetChild(f.t, parent, full), got);
        break;
      }
      points++;
      EXPECT_EQ(Dump(f.t), before);
      EXPECT_EQ(f.tp.liveBlocks(), live + KeptArrayBlocks(f.t, parent, hadArray));
      EXPECT_TRUE(Released().empty()) << "a value never stored is not released";
    }
    EXPECT_EQ(points, full ? 4 : 5);
  }
}

// A path insertion that fails part-way keeps the nodes made before the
// failure, each with defaultVal, and stores the value nowhere.
TEST(HstFailure, InsertPathAtEveryPoint) {
  long points = 0;
  for (long n = 0;; n++) {
    Fresh f(1);
    HST_Insert(f.t, "/a", 1);
    Released().clear();
    const size_t live = f.tp.liveBlocks();
    f.tp.FailAt(f.tp.calls() + n);
    HstNode *got = HST_Insert(f.t, "/a/b/c/", 7);
    f.tp.NeverFail();
    if (got) {
      EXPECT_EQ(got, HST_Find(f.t, "/a/b/c"));
      EXPECT_EQ(HST_GetVal(f.t, got), 7u);
      break;
    }
    points++;
    CheckTree(f.t);
    EXPECT_TRUE(Released().empty());
    EXPECT_EQ(HST_Find(f.t, "/a/b/c"), nullptr);
    HstNode *b = HST_Find(f.t, "/a/b");
    EXPECT_TRUE(!b || HST_GetVal(f.t, b) == kDefault);
    // b's key, node and entry key, and the child arrays made on the way.
    size_t blocks = live + (b ? 3 : 0);
    for (HstNode *n : {HST_Find(f.t, "/a"), b})
      if (n && n->children)
        blocks += 1 + (coffer::RecordAt<EsaArrayData>(f.t, n->children)->entries != 0);
    EXPECT_EQ(f.tp.liveBlocks(), blocks);
    EXPECT_EQ(HST_GetSize(f.t), b ? 3 : 2);
    EXPECT_EQ(HST_GetVal(f.t, HST_Find(f.t, "/a")), 1u);
  }
  EXPECT_EQ(points, 10);  // five for each of b and c
}

// Under a destination that has children and under a leaf: nothing attached,
// the tree reads exactly as before, every copied value goes back once.
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
      long points = 0;
      for (long n = 0;; n++) {
        HstNode *dst = HST_Find(t, leaf ? "/d/e" : "/d");
        ResetLogs();
        const bool hadArray = dst->children != 0;
        const std::string before = Dump(t);
        const size_t live = tp.liveBlocks();
        from ? tp.FailFrom(tp.calls() + n) : tp.FailAt(tp.calls() + n);
        HstNode *got = HST_CloneSubtree(t, HST_Find(t, "/s"), ScriptedClone, "t", dst);
        tp.NeverFail();
        if (got) {
          EXPECT_EQ(got->subtreeValCount, 1);
          EXPECT_TRUE(Released().empty());
          break;
        }
        points++;
        EXPECT_EQ(Dump(t), before);
        EXPECT_EQ(tp.liveBlocks(), live + KeptArrayBlocks(t, dst, hadArray));
        ExpectCopiesReleased();
      }
      // Five copied nodes: key and node each; s' and a' an array and block
      // each; four entries inside the copy, two growing a full block; the
      // rename; under /d growth and entry key, under the leaf an array, its
      // block and the entry key.
      EXPECT_EQ(points, leaf ? 24 : 23);
      CheckTree(t);
      HST_FreeTree(t);
      EXPECT_EQ(tp.liveBlocks(), 0u);
    }
  }
}

}  // namespace
