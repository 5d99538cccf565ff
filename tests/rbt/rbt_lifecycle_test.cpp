// Lifecycle of the three tree families: creation with own and caller
// sentinels, allocation failure at every allocation point with exact
// roll-back, value release order and timing, callbacks, caller nodes, swap.
#include <cstring>
#include <set>

#include "rbt_test_util.h"
#include "support/test_pool.h"

using coffer_test::Released;
using coffer_test::ReleasedPools;
using coffer_test::TestPool;

namespace rbt_test {
namespace {

// The keys 0, 1, 2 ... of each family, in ascending order.
template <class Fam>
typename Fam::Key MakeKey(int i);
template <>
std::string MakeKey<StringFamily>(int i) {
  return std::string(1, static_cast<char>('a' + i));
}
template <>
int32_t MakeKey<Int32Family>(int i) {
  return i - 3;
}
template <>
uintptr_t MakeKey<VoidPtrFamily>(int i) {
  return 0x7FFFFFFEu + i;
}

// Blocks one tree-made node occupies in the pool (node, plus key copy).
template <class Fam>
size_t BlocksPerNode() {
  return Fam::kCopiesKey ? 2 : 1;
}

template <class Fam>
class RbtLifecycle : public ::testing::Test {
 protected:
  void SetUp() override {
    Released().clear();
    ReleasedPools().clear();
  }
};
using Families = ::testing::Types<StringFamily, Int32Family, VoidPtrFamily>;
TYPED_TEST_SUITE(RbtLifecycle, Families);

TYPED_TEST(RbtLifecycle, NewTreeAndOwnSentinel) {
  using Fam = TypeParam;
  TestPool tp;
  RbtTree *t = Fam::AllocEx(tp.pool());
  ASSERT_NE(t, nullptr);
  EXPECT_EQ(tp.calls(), 3);  // handle, data record, sentinel
  EXPECT_TRUE(t->ownsHandle);
  EXPECT_EQ(t->freeValFn, nullptr);
  EXPECT_EQ(t->mpFreeValFn, nullptr);
  EXPECT_EQ(std::memcmp(&t->mp, tp.pool(), sizeof(MemPool)), 0);
  RbtTreeData *d = DataOf(t);
  EXPECT_EQ(tp.SizeOf(d), 16u);
  EXPECT_EQ(d->size, 0u);
  EXPECT_EQ(d->root, d->nil);
  EXPECT_EQ(d->ownsNil, 1u);
  RbtNode *nil = NilOf(t);
  EXPECT_EQ(tp.SizeOf(nil), 24u);
  EXPECT_NE(reinterpret_cast<uintptr_t>(nil), d->nil);  // offsets are not addresses here
  EXPECT_EQ(nil->parent, d->nil);
  EXPECT_EQ(nil->left, d->nil);
  EXPECT_EQ(nil->right, d->nil);
  EXPECT_EQ(nil->color, 0);
  EXPECT_EQ(nil->ownsNode, 1);
  EXPECT_EQ(nil->val, 0u);
  EXPECT_EQ(nil->key, 0u);
  EXPECT_EQ(Fam::GetSize(t), 0);
  Fam::FreeTree(t);
  EXPECT_EQ(tp.liveBlocks(), 0u);
  Fam::FreeTree(nullptr);
}

TYPED_TEST(RbtLifecycle, ProcessHeapOffsetsAreAddresses) {
  using Fam = TypeParam;
  RbtTree *t = Fam::AllocStd();
  ASSERT_NE(t, nullptr);
  EXPECT_EQ(t->mp.base, nullptr);
  RbtNode *n = Fam::Insert(t, MakeKey<Fam>(1), 5);
  EXPECT_EQ(DataOf(t)->root, reinterpret_cast<uintptr_t>(n));
  EXPECT_EQ(Fam::First(t), n);
  Fam::FreeTree(t);
}

TYPED_TEST(RbtLifecycle, CallerSentinelIsNeverReleased) {
  using Fam = TypeParam;
  TestPool tp;
  RbtNode nil;
  std::memset(&nil, 0x5C, sizeof nil);
  RbtTree *t = Fam::AllocWithNil(tp.pool(), &nil);
  ASSERT_NE(t, nullptr);
  EXPECT_EQ(tp.calls(), 2);  // handle and data record only
  EXPECT_EQ(DataOf(t)->ownsNil, 0u);
  EXPECT_EQ(NilOf(t), &nil);
  EXPECT_EQ(nil.key, 0x5C5C5C5Cu);
  EXPECT_EQ(nil.ownsNode, 1);
  EXPECT_EQ(nil.color, 0);
  for (int i = 0; i < 5; ++i) Fam::Insert(t, MakeKey<Fam>(i % 3), i + 1);
  Fam::FreeTree(t);  // a free of the sentinel would be flagged by the pool
  EXPECT_EQ(tp.liveBlocks(), 0u);
  EXPECT_EQ(nil.key, 0x5C5C5C5Cu);
}

// Every allocation point of the allocation calls: nothing is left behind.
TYPED_TEST(RbtLifecycle, AllocationCallsRollBack) {
  using Fam = TypeParam;
  for (long n = 0; n < 3; ++n) {
    TestPool tp;
    tp.FailAt(n);
    EXPECT_EQ(Fam::AllocEx(tp.pool()), nullptr);
    EXPECT_EQ(tp.liveBlocks(), 0u);
  }
  RbtNode nil{};
  for (long n = 0; n < 2; ++n) {
    TestPool tp;
    tp.FailAt(n);
    EXPECT_EQ(Fam::AllocWithNil(tp.pool(), &nil), nullptr);
    EXPECT_EQ(tp.liveBlocks(), 0u);
  }
  // CreateTreeData on a handle the caller built: the handle is never
  // released there, data ends null, and a later free leaves the handle be.
  for (long n = 0; n < 2; ++n) {
    TestPool tp;
    CollectionHeader h{};
    h.mp = *tp.pool();
    h.data = &h;  // overwritten without being released
    tp.FailAt(n);
    EXPECT_EQ(Fam::CreateTreeData(&h, nullptr), 0);
    EXPECT_EQ(h.data, nullptr);
    EXPECT_EQ(tp.liveBlocks(), 0u);
    Fam::FreeTree(&h);
  }
  // A pool-made handle whose data record failed is released by the free.
  TestPool tp;
  auto *h = static_cast<CollectionHeader *>(tp.pool()->calloc(tp.pool(), 1, sizeof *h));
  h->mp = *tp.pool();
  h->ownsHandle = true;
  tp.FailAt(1);
  EXPECT_EQ(Fam::CreateTreeData(h, nullptr), 0);
  Fam::FreeTree(h);
  EXPECT_EQ(tp.liveBlocks(), 0u);
  // And a caller handle that succeeds keeps its handle through the free.
  CollectionHeader own{};
  own.mp = *tp.pool();
  tp.NeverFail();
  ASSERT_EQ(Fam::CreateTreeData(&own, nullptr), 1);
  Fam::Insert(&own, MakeKey<Fam>(0), 1);
  Fam::FreeTree(&own);
  EXPECT_EQ(own.data, nullptr);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

// Builds a tree with a refusal at allocation call n, for every n up to the
// first run without a refusal. Each refused insertion returns null and
// leaves the tree, the pool and a caller's node exactly as they were.
TYPED_TEST(RbtLifecycle, InsertionRollsBackAtEveryAllocation) {
  using Fam = TypeParam;
  std::mt19937 rng(3);
  std::vector<typename Fam::Key> keys;
  for (int i = 0; i < 24; ++i) keys.push_back(MakeKey<Fam>(rng() % 5));
  for (long n = 0;; ++n) {
    SCOPED_TRACE(n);
    TestPool tp;
    tp.FailAt(n);
    RbtTree *t = Fam::AllocEx(tp.pool());
    if (!t) {
      EXPECT_EQ(tp.liveBlocks(), 0u);
      continue;
    }
    Model<Fam> model;
    bool refused = false;
    size_t ownNodes = 0;
    std::vector<RbtNode> callerNodes(keys.size());
    for (size_t i = 0; i < keys.size(); ++i) {
      bool useCaller = i % 3 == 0;
      RbtNode *mine = useCaller ? &callerNodes[i] : nullptr;
      if (mine) std::memset(mine, 0x3C, sizeof *mine);
      size_t before = tp.liveBlocks();
      RbtNode *got = Fam::InsertNoAlloc(t, mine, keys[i], i + 1);
      if (!got) {
        refused = true;
        EXPECT_EQ(tp.liveBlocks(), before);
        if (mine) {
          RbtNode pattern;
          std::memset(&pattern, 0x3C, sizeof pattern);
          EXPECT_EQ(std::memcmp(mine, &pattern, sizeof pattern), 0);
        }
      } else {
        model.Insert(keys[i], i + 1);
        if (!mine) ++ownNodes;
      }
      ASSERT_NO_FATAL_FAILURE(CheckInvariants<Fam>(t, 0));
      ASSERT_NO_FATAL_FAILURE(CompareShape<Fam>(t, model));
    }
    size_t keyCopies = Fam::kCopiesKey ? model.size() : 0;
    EXPECT_EQ(tp.liveBlocks(), 3 + ownNodes + keyCopies);
    Fam::FreeTree(t);
    EXPECT_EQ(tp.liveBlocks(), 0u);
    if (!refused) break;
  }
}

// A failed node allocation after a good key copy leaves no key copy behind;
// a null key allocates nothing.
TEST(RbtStringInsert, KeyCopyAndNullKey) {
  TestPool tp;
  RbtTree *t = RBT_AllocTreeEx(tp.pool());
  long calls = tp.calls();
  EXPECT_EQ(RBT_Insert(t, nullptr, 1), nullptr);
  RbtNode mine;
  EXPECT_EQ(RBT_InsertNoAlloc(t, &mine, nullptr, 1), nullptr);
  EXPECT_EQ(tp.calls(), calls);
  tp.FailAt(calls + 1);  // the node, after the key copy
  EXPECT_EQ(RBT_Insert(t, "key", 1), nullptr);
  EXPECT_EQ(tp.liveBlocks(), 3u);
  EXPECT_EQ(RBT_GetSize(t), 0);
  tp.NeverFail();
  RbtNode *e = RBT_Insert(t, "", 2);
  ASSERT_NE(e, nullptr);
  EXPECT_EQ(tp.SizeOf(coffer::At<char>(t, e->key)), 1u);
  RBT_FreeTree(t);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

TYPED_TEST(RbtLifecycle, ClearAndFreeDropValuesInOrder) {
  using Fam = TypeParam;
  TestPool tp;
  RbtTree *t = Fam::AllocEx(tp.pool());
  Fam::SetFreeValFn(t, coffer_test::RecordRelease);
  Fam::Clear(t);
  Fam::Insert(t, MakeKey<Fam>(1), 1);
  Fam::Insert(t, MakeKey<Fam>(0), 2);
  Fam::Insert(t, MakeKey<Fam>(0), 3);
  EXPECT_TRUE(Released().empty());
  Fam::Clear(t);
  EXPECT_EQ(Released(), (std::vector<CofferVal>{2, 3, 1}));
  EXPECT_EQ(Fam::GetSize(t), 0);
  EXPECT_EQ(DataOf(t)->root, DataOf(t)->nil);
  EXPECT_EQ(tp.liveBlocks(), 3u);
  EXPECT_EQ(t->freeValFn, coffer_test::RecordRelease);  // callbacks stay

  Released().clear();
  ReleasedPools().clear();
  Fam::Insert(t, MakeKey<Fam>(1), 1);
  Fam::Insert(t, MakeKey<Fam>(0), 2);
  Fam::Insert(t, MakeKey<Fam>(0), 0);  // 0 is a value like any other
  Fam::SetMpFreeValFn(t, coffer_test::RecordMpRelease);
  Fam::FreeTree(t);
  EXPECT_EQ(Released(), (std::vector<CofferVal>{2, 0, 1}));
  EXPECT_EQ(ReleasedPools(), (std::vector<MemPool *>(3, &t->mp)));
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

// The callback sees the node still linked, still counted and still
// allocated (its key copy too); the memory goes only afterwards.
struct DropProbe {
  static TestPool *tp;
  static std::map<CofferVal, RbtNode *> nodes;
  static std::vector<int32_t> sizesSeen;
  static int failures;
  static void Check(MemPool *pool, CofferVal val) {
    auto *t = reinterpret_cast<RbtTree *>(pool);
    RbtNode *n = nodes.at(val);
    sizesSeen.push_back(static_cast<int32_t>(DataOf(t)->size));
    bool linked = n->parent != DataOf(t)->nil || DataOf(t)->root == coffer::Off(t, n);
    if (!tp->IsLive(n) || !linked) ++failures;
    if (!tp->IsLive(coffer::At<char>(t, n->key))) ++failures;  // the key copy
  }
};
TestPool *DropProbe::tp;
std::map<CofferVal, RbtNode *> DropProbe::nodes;
std::vector<int32_t> DropProbe::sizesSeen;
int DropProbe::failures;

TEST(RbtDropTiming, ValueGoesBeforeNodeAndKey) {
  TestPool tp;
  DropProbe::tp = &tp;
  RbtTree *t = RBT_AllocTreeEx(tp.pool());
  RBT_SetMpFreeValFn(t, DropProbe::Check);
  const char *keys[] = {"a", "b", "c", "d", "e", "f"};
  for (CofferVal v = 1; v <= 6; ++v) DropProbe::nodes[v] = RBT_Insert(t, keys[v - 1], v);
  RBT_Remove(t, DropProbe::nodes[4]);
  RBT_RemoveRange(t, DropProbe::nodes[1], DropProbe::nodes[3]);
  RBT_Clear(t);
  RBT_Insert(t, "z", 5);
  DropProbe::nodes[5] = RBT_First(t);
  RBT_FreeTree(t);
  EXPECT_EQ(DropProbe::failures, 0);
  EXPECT_EQ(DropProbe::sizesSeen, (std::vector<int32_t>{6, 5, 4, 3, 2, 1, 1}));
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

TYPED_TEST(RbtLifecycle, CallbackSetters) {
  using Fam = TypeParam;
  TestPool tp;
  RbtTree *t = Fam::AllocEx(tp.pool());
  EXPECT_EQ(Fam::SetFreeValFn(t, coffer_test::RecordRelease), nullptr);
  EXPECT_EQ(Fam::SetMpFreeValFn(t, coffer_test::RecordMpRelease), nullptr);
  EXPECT_EQ(t->freeValFn, nullptr);
  Fam::Remove(t, Fam::Insert(t, MakeKey<Fam>(0), 9));
  EXPECT_EQ(ReleasedPools(), std::vector<MemPool *>{&t->mp});
  EXPECT_EQ(Fam::SetMpFreeValFn(t, nullptr), coffer_test::RecordMpRelease);
  EXPECT_EQ(Fam::SetFreeValFn(t, nullptr), nullptr);
  EXPECT_EQ(t->mpFreeValFn, nullptr);
  Fam::Remove(t, Fam::Insert(t, MakeKey<Fam>(0), 8));
  EXPECT_EQ(Released(), std::vector<CofferVal>{9});
  Fam::FreeTree(t);
}

// A caller's node: returned as is, every field set by the tree, ownsNode 0;
// removal drops the value but never releases the node, which can be reused.
// The word-keyed families make no pool call at all for it.
TYPED_TEST(RbtLifecycle, CallerNodes) {
  using Fam = TypeParam;
  TestPool tp;
  RbtTree *t = Fam::AllocEx(tp.pool());
  Fam::SetFreeValFn(t, coffer_test::RecordRelease);
  Fam::Insert(t, MakeKey<Fam>(1), 1);
  RbtNode mine;
  std::memset(&mine, 0xEE, sizeof mine);
  long calls = tp.calls(), frees = tp.frees();
  for (int round = 0; round < 2; ++round) {
    ASSERT_EQ(Fam::InsertNoAlloc(t, &mine, MakeKey<Fam>(2), 7), &mine);
    EXPECT_EQ(mine.ownsNode, 0);
    EXPECT_EQ(mine.color, 1);
    EXPECT_EQ(mine.val, 7u);
    EXPECT_EQ(mine.left, DataOf(t)->nil);
    EXPECT_EQ(mine.right, DataOf(t)->nil);
    EXPECT_EQ(mine.parent, DataOf(t)->root);
    EXPECT_EQ(mine.reserved[0], 0xEE);  // never written
    EXPECT_TRUE(Fam::KeyOf(t, &mine) == MakeKey<Fam>(2));
    Fam::Remove(t, &mine);
    EXPECT_EQ(Released().back(), 7u);
  }
  EXPECT_EQ(tp.calls() - calls, Fam::kCopiesKey ? 2 : 0);
  EXPECT_EQ(tp.frees() - frees, Fam::kCopiesKey ? 2 : 0);  // key copies only
  RbtNode *own = Fam::InsertNoAlloc(t, nullptr, MakeKey<Fam>(0), 3);
  ASSERT_NE(own, nullptr);
  EXPECT_EQ(own->ownsNode, 1);
  EXPECT_TRUE(tp.IsLive(own));
  EXPECT_EQ(tp.liveBlocks(), 3 + 2 * BlocksPerNode<Fam>());
  Fam::FreeTree(t);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

template <class Fam>
std::vector<CofferVal> FillAndKeepValues(RbtTree *t, int n, CofferVal first) {
  for (int i = 0; i < n; ++i) Fam::Insert(t, MakeKey<Fam>(i), first + i);
  return ValsInOrder<Fam>(t);
}

TYPED_TEST(RbtLifecycle, SwapKeepsHandlesAndCallbacks) {
  using Fam = TypeParam;
  TestPool tp;
  RbtTree *a = Fam::AllocEx(tp.pool()), *b = Fam::AllocEx(tp.pool());
  RbtTreeData *da = DataOf(a), *db = DataOf(b);
  Fam::SetFreeValFn(a, coffer_test::RecordRelease);
  Fam::SetMpFreeValFn(b, coffer_test::RecordMpRelease);
  std::vector<CofferVal> three = FillAndKeepValues<Fam>(a, 3, 1);
  Fam::Swap(a, b);
  EXPECT_EQ(DataOf(a), da);
  EXPECT_EQ(DataOf(b), db);
  EXPECT_EQ(Fam::GetSize(a), 0);
  EXPECT_EQ(Fam::First(a), nullptr);
  EXPECT_EQ(ValsInOrder<Fam>(b), three);
  ASSERT_NO_FATAL_FAILURE(CheckInvariants<Fam>(a, 0));
  ASSERT_NO_FATAL_FAILURE(CheckInvariants<Fam>(b, 0));
  Fam::Remove(b, Fam::First(b));
  EXPECT_EQ(ReleasedPools(), std::vector<MemPool *>{&b->mp});  // b's own callback
  Fam::FreeTree(a);
  Fam::FreeTree(b);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

TYPED_TEST(RbtLifecycle, SwapOfTreesSharingASentinel) {
  using Fam = TypeParam;
  TestPool tp;
  RbtNode nil{};
  RbtTree *a = Fam::AllocWithNil(tp.pool(), &nil), *b = Fam::AllocWithNil(tp.pool(), &nil);
  std::vector<CofferVal> va = FillAndKeepValues<Fam>(a, 4, 10);
  std::vector<CofferVal> vb = FillAndKeepValues<Fam>(b, 2, 20);
  RbtTreeData before_a = *DataOf(a), before_b = *DataOf(b);
  Fam::Swap(a, b);
  EXPECT_EQ(DataOf(a)->root, before_b.root);
  EXPECT_EQ(DataOf(b)->root, before_a.root);
  EXPECT_EQ(DataOf(a)->nil, before_a.nil);
  EXPECT_EQ(DataOf(a)->ownsNil, 0u);
  EXPECT_EQ(DataOf(b)->ownsNil, 0u);
  EXPECT_EQ(ValsInOrder<Fam>(a), vb);
  EXPECT_EQ(ValsInOrder<Fam>(b), va);
  Fam::FreeTree(a);
  ASSERT_NO_FATAL_FAILURE(CheckInvariants<Fam>(b, 0));
  Fam::FreeTree(b);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

// A tree owning its sentinel swapped with one borrowing a caller's: the
// ownership flag moves with its sentinel, so freeing both releases the
// tree's own sentinel once and never the caller's.
TYPED_TEST(RbtLifecycle, SwapOfMixedSentinelOwnership) {
  using Fam = TypeParam;
  TestPool tp;
  RbtNode callerNil;
  std::memset(&callerNil, 0x77, sizeof callerNil);
  RbtTree *own = Fam::AllocEx(tp.pool());
  RbtTree *borrow = Fam::AllocWithNil(tp.pool(), &callerNil);
  RbtNode *ownNil = NilOf(own);
  std::vector<CofferVal> vo = FillAndKeepValues<Fam>(own, 3, 1);
  std::vector<CofferVal> vb = FillAndKeepValues<Fam>(borrow, 5, 100);
  Fam::Swap(own, borrow);
  EXPECT_EQ(NilOf(own), &callerNil);
  EXPECT_EQ(DataOf(own)->ownsNil, 0u);
  EXPECT_EQ(NilOf(borrow), ownNil);
  EXPECT_EQ(DataOf(borrow)->ownsNil, 1u);
  EXPECT_EQ(ValsInOrder<Fam>(own), vb);
  EXPECT_EQ(ValsInOrder<Fam>(borrow), vo);
  ASSERT_NO_FATAL_FAILURE(CheckInvariants<Fam>(own, 0x77777777u));
  ASSERT_NO_FATAL_FAILURE(CheckInvariants<Fam>(borrow, 0));
  Fam::Insert(own, MakeKey<Fam>(0), 50);
  Fam::Remove(borrow, Fam::First(borrow));
  Fam::FreeTree(own);  // must not release callerNil (the pool would flag it)
  EXPECT_TRUE(tp.IsLive(ownNil));
  Fam::FreeTree(borrow);
  EXPECT_EQ(tp.liveBlocks(), 0u);  // nor leak the tree's own sentinel
  EXPECT_EQ(callerNil.key, 0x77777777u);
}

}  // namespace
}  // namespace rbt_test
