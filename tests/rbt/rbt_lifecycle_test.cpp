// Lifecycle of the three tree families: the exact pool calls, creation with
// own and caller sentinels, allocation failure at every allocation point with
// exact roll-back, value release order and timing, caller nodes, swap.
#include <cstring>

#include "rbt_test_util.h"
#include "support/test_pool.h"

using coffer_test::Released;
using coffer_test::ReleasedPools;
using coffer_test::TestPool;

namespace rbt_test {
namespace {

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

// One log of everything the tree asks of its pool and its value callback:
// "p"/"h" + op + sizes for pool calls through the caller's record or any
// other (Take checks that every other one was the tree's handle), and
// "drop <val> <in|out> <size>" for a dropped value, in or out telling whether
// the node holding it was still reachable in order.
template <class Fam>
struct Log {
  static inline TestPool *tp;
  static inline MemPool rec;
  static inline std::vector<std::string> log;
  static inline std::vector<MemPool *> others;
  static void Note(MemPool *pool, const std::string &what) {
    log.push_back((pool == &rec ? "p " : "h ") + what);
    if (pool != &rec) others.push_back(pool);
  }
  static void *Alloc(MemPool *pool, size_t n) {
    Note(pool, "alloc " + std::to_string(n));
    return tp->pool()->alloc(pool, n);
  }
  static void *Calloc(MemPool *pool, size_t c, size_t n) {
    Note(pool, "calloc " + std::to_string(c) + "x" + std::to_string(n));
    return tp->pool()->calloc(pool, c, n);
  }
  static void Free(MemPool *pool, void *p) {
    Note(pool, "free " + std::to_string(tp->SizeOf(p)));
    tp->pool()->free(pool, p);
  }
  static void Drop(MemPool *pool, CofferVal v) {
    auto *t = reinterpret_cast<RbtTree *>(pool);
    bool in = false;
    for (RbtNode *n = Fam::First(t); n; n = Fam::Next(t, n)) in |= n->val == v;
    log.push_back("drop " + std::to_string(v) + (in ? " in " : " out ") +
                  std::to_string(Fam::GetSize(t)));
  }
  static std::vector<std::string> Take(const RbtTree *t) {
    for (MemPool *p : others) EXPECT_EQ(p, &t->mp);
    others.clear();
    return std::move(log);
  }
};

// The pool calls and drops, in order, of creation, insertion (the key copy
// with alloc of exactly its bytes, then the node with calloc), insertion
// into a caller's node, removal, clear and free, with an own and with a
// caller's sentinel; and what the tree writes into new records.
TYPED_TEST(RbtLifecycle, PoolCallsAndDropsInOrder) {
  using Fam = TypeParam;
  using L = Log<Fam>;
  TestPool tp;
  L::tp = &tp;
  L::rec = *tp.pool();
  L::rec.alloc = L::Alloc, L::rec.calloc = L::Calloc, L::rec.free = L::Free;
  const std::string H = std::to_string(sizeof(CollectionHeader));
  // The string family's log; "own:" marks what only an own sentinel causes,
  // "str:" what only the string family does beyond its key copies (2 and 1
  // bytes), which the word families do not make.
  const std::vector<std::string> full{
      "p calloc 1x" + H, "h calloc 1x16", "own:h calloc 1x24",  // created
      "h alloc 2", "h calloc 1x24", "h alloc 2", "h calloc 1x24", "h alloc 2",
      "h calloc 1x24",                                         // b 1, a 2, a 3
      "h alloc 2", "drop 7 in 4", "h free 2", "h alloc 2", "drop 7 in 4", "h free 2",
      "str:h alloc 1", "str:h calloc 1x24", "str:drop 9 in 4", "str:h free 1",
      "str:h free 24",                                                          // "" 9
      "drop 2 in 3", "h free 2", "h free 24", "drop 3 in 2", "h free 2", "h free 24",
      "drop 1 in 1", "h free 2", "h free 24",                                  // clear
      "h alloc 2", "h calloc 1x24", "h alloc 2", "h calloc 1x24",              // b 1, a 0
      "drop 0 in 2", "h free 2", "h free 24", "drop 1 in 1", "h free 2", "h free 24",
      "own:h free 24", "h free 16", "h free " + H};                            // free
  RbtNode nil, mine;
  std::memset(&nil, 0x5C, sizeof nil);
  std::memset(&mine, 0xEE, sizeof mine);
  for (bool own : {true, false}) {
    RbtTree *t = own ? Fam::AllocEx(&L::rec) : Fam::AllocWithNil(&L::rec, &nil);
    RbtTreeData *d = DataOf(t);  // a caller's sentinel: every field but key set
    EXPECT_EQ(std::make_tuple(+t->ownsHandle, t->freeValFn, t->mpFreeValFn, d->root, d->size,
                              d->ownsNil, NilOf(t)->parent),
              std::make_tuple(1, FreeValFn{}, MpFreeValFn{}, d->nil, 0u, own ? 1u : 0u, d->nil));
    EXPECT_EQ(std::memcmp(&t->mp, &L::rec, sizeof(MemPool)), 0);
    EXPECT_NE(reinterpret_cast<uintptr_t>(NilOf(t)), d->nil);  // offsets are not addresses
    ASSERT_NO_FATAL_FAILURE(CheckTree<Fam>(t, own ? 0 : 0x5C5C5C5Cu));
    Fam::SetMpFreeValFn(t, L::Drop);
    for (CofferVal v : {1, 2, 3}) Fam::Insert(t, Fam::MakeKey(v == 1), v);
    for (int round = 0; round < 2; ++round) {  // a caller's node, reused
      ASSERT_EQ(Fam::InsertNoAlloc(t, &mine, Fam::MakeKey(2), 7), &mine);
      EXPECT_EQ(std::make_tuple(+mine.ownsNode, +mine.color, mine.val, mine.left, mine.right),
                std::make_tuple(0, 1, CofferVal{7}, d->nil, d->nil));
      EXPECT_EQ(mine.reserved[0], 0xEE);
      EXPECT_TRUE(Fam::KeyOf(t, &mine) == Fam::MakeKey(2));
      Fam::Remove(t, &mine);
    }
    if constexpr (Fam::kCopiesKey) {  // a null key asks nothing
      EXPECT_EQ(RBT_Insert(t, nullptr, 9), nullptr);
      EXPECT_EQ(RBT_InsertNoAlloc(t, &mine, nullptr, 9), nullptr);
      RBT_Remove(t, RBT_Insert(t, "", 9));
    }
    Fam::Clear(t);
    Fam::Clear(t);  // empty: no drop, no pool call
    EXPECT_EQ(d->root, d->nil);
    EXPECT_EQ(t->mpFreeValFn, L::Drop);  // callbacks stay
    Fam::Insert(t, Fam::MakeKey(1), 1);
    Fam::Insert(t, Fam::MakeKey(0), 0);  // 0 is a value like any other
    Fam::FreeTree(t);
    std::vector<std::string> expected;
    for (std::string e : full) {
      bool keyCopy = e == "h alloc 2" || e == "h free 2";
      if (e.rfind("own:", 0) == 0) {
        if (!own) continue;
        e.erase(0, 4);
      }
      if (e.rfind("str:", 0) == 0 || keyCopy) {
        if (!Fam::kCopiesKey) continue;
        e.erase(0, keyCopy ? 0 : 4);
      }
      expected.push_back(e);
    }
    EXPECT_EQ(L::Take(t), expected);
  }
  EXPECT_EQ(tp.liveBlocks(), 0u);  // the caller's sentinel was never released
  EXPECT_EQ(std::make_tuple(nil.key, nil.reserved[0]), std::make_tuple(0x5C5C5C5Cu, 0x5C));
}

// On the process heap offsets are the addresses; a null handle frees nothing.
TYPED_TEST(RbtLifecycle, ProcessHeap) {
  using Fam = TypeParam;
  Fam::FreeTree(nullptr);
  RbtTree *t = Fam::AllocStd();
  ASSERT_NE(t, nullptr);
  EXPECT_EQ(t->mp.base, nullptr);
  RbtNode *n = Fam::Insert(t, Fam::MakeKey(1), 5);
  EXPECT_EQ(DataOf(t)->root, reinterpret_cast<uintptr_t>(n));
  Fam::FreeTree(t);
}

// Creates a tree (from the pool, on a caller's sentinel, or as data for a
// caller's handle) and fills it with a refusal at allocation call n, for
// every n up to the first run without one. A refused creation leaves nothing
// (and a caller's handle with data null, unreleased); each refused insertion
// returns null and leaves the tree, the pool and a caller's node as they were.
TYPED_TEST(RbtLifecycle, RollBackAtEveryAllocation) {
  using Fam = TypeParam;
  std::mt19937 rng(3);
  std::vector<typename Fam::Key> keys;
  for (int i = 0; i < 24; ++i) keys.push_back(Fam::MakeKey(rng() % 5));
  RbtNode pattern, nil{};
  std::memset(&pattern, 0x3C, sizeof pattern);
  for (int how = 0; how < 3; ++how) {
    bool refused = true;
    for (long n = 0; refused; ++n) {
      SCOPED_TRACE(testing::Message() << how << " " << n);
      TestPool tp;
      tp.FailAt(n);
      CollectionHeader h{};
      h.mp = *tp.pool();
      h.data = &h;  // overwritten, never released
      RbtTree *t = how == 0   ? Fam::AllocEx(tp.pool())
                   : how == 1 ? Fam::AllocWithNil(tp.pool(), &nil)
                              : (Fam::CreateTreeData(&h, nullptr) ? &h : nullptr);
      if (!t) {
        EXPECT_EQ(tp.liveBlocks(), 0u);
        if (how == 2) {
          EXPECT_EQ(h.data, nullptr);
          Fam::FreeTree(&h);  // data null: leaves the caller's handle alone
        }
        continue;
      }
      Model<Fam> model;
      refused = false;
      size_t ownNodes = 0;
      std::vector<RbtNode> callerNodes(keys.size(), pattern);
      for (size_t i = 0; i < keys.size(); ++i) {
        RbtNode *mine = i % 3 == 0 ? &callerNodes[i] : nullptr;
        size_t before = tp.liveBlocks();
        if (!Fam::InsertNoAlloc(t, mine, keys[i], i + 1)) {
          refused = true;
          EXPECT_EQ(tp.liveBlocks(), before);
          EXPECT_TRUE(!mine || std::memcmp(mine, &pattern, sizeof pattern) == 0);
        } else {
          model.Insert(keys[i], i + 1);
          ownNodes += !mine;
        }
        ASSERT_NO_FATAL_FAILURE(CheckTree<Fam>(t, 0, &model));
      }
      size_t fixed = how == 0 ? 3 : 2;  // handle, data record, own sentinel
      EXPECT_EQ(tp.liveBlocks(), fixed + ownNodes + (Fam::kCopiesKey ? model.size() : 0));
      Fam::FreeTree(t);
      EXPECT_EQ(tp.liveBlocks(), 0u);
      EXPECT_EQ(h.data, how == 2 ? nullptr : &h);
    }
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
}

// The setters clear the other kind and return only their own kind; without
// a callback nothing is called.
TYPED_TEST(RbtLifecycle, CallbackSetters) {
  using Fam = TypeParam;
  TestPool tp;
  RbtTree *t = Fam::AllocEx(tp.pool());
  EXPECT_EQ(Fam::SetFreeValFn(t, coffer_test::RecordRelease), nullptr);
  EXPECT_EQ(Fam::SetMpFreeValFn(t, coffer_test::RecordMpRelease), nullptr);
  EXPECT_EQ(t->freeValFn, nullptr);
  Fam::Remove(t, Fam::Insert(t, Fam::MakeKey(0), 0));
  EXPECT_EQ(ReleasedPools(), std::vector<MemPool *>{&t->mp});
  EXPECT_EQ(Fam::SetMpFreeValFn(t, nullptr), coffer_test::RecordMpRelease);
  EXPECT_EQ(Fam::SetFreeValFn(t, nullptr), nullptr);
  EXPECT_EQ(t->mpFreeValFn, nullptr);
  Fam::Remove(t, Fam::Insert(t, Fam::MakeKey(0), 8));
  Fam::Insert(t, Fam::MakeKey(0), 9);
  Fam::FreeTree(t);
  EXPECT_EQ(Released(), std::vector<CofferVal>{0});
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

// Swap of trees with own sentinels, with one shared caller sentinel, and of
// a tree owning its sentinel with one borrowing a caller's: contents change
// hands, handles keep data and callbacks, and ownsNil moves with its
// sentinel so freeing both releases the tree's own sentinel once and never
// the caller's.
TYPED_TEST(RbtLifecycle, Swap) {
  using Fam = TypeParam;
  TestPool tp;
  RbtNode shared{}, callerNil;
  std::memset(&callerNil, 0x77, sizeof callerNil);
  struct Case {
    RbtNode *nilA, *nilB;
  } cases[] = {{nullptr, nullptr}, {&shared, &shared}, {nullptr, &callerNil}};
  for (const Case &c : cases) {
    RbtTree *a = Fam::AllocWithNil(tp.pool(), c.nilA), *b = Fam::AllocWithNil(tp.pool(), c.nilB);
    Fam::SetFreeValFn(a, coffer_test::RecordRelease);
    Fam::SetMpFreeValFn(b, coffer_test::RecordMpRelease);
    for (int i = 0; i < 3; ++i) Fam::Insert(a, Fam::MakeKey(i), 10 + i);
    std::vector<CofferVal> va = ValsInOrder<Fam>(a);
    RbtTreeData *pa = DataOf(a), da = *pa, db = *DataOf(b);
    Fam::Swap(a, b);
    EXPECT_EQ(DataOf(a), pa);
    EXPECT_EQ(std::make_tuple(DataOf(a)->root, DataOf(a)->nil, DataOf(a)->ownsNil),
              std::make_tuple(db.root, db.nil, db.ownsNil));
    EXPECT_EQ(std::make_tuple(DataOf(b)->root, DataOf(b)->nil, DataOf(b)->ownsNil),
              std::make_tuple(da.root, da.nil, da.ownsNil));
    EXPECT_EQ(Fam::GetSize(a), 0);
    EXPECT_EQ(Fam::First(a), nullptr);
    EXPECT_EQ(ValsInOrder<Fam>(b), va);
    ASSERT_NO_FATAL_FAILURE(CheckTree<Fam>(a, NilOf(a)->key));
    ASSERT_NO_FATAL_FAILURE(CheckTree<Fam>(b, NilOf(b)->key));
    ReleasedPools().clear();
    Fam::Remove(b, Fam::First(b));
    EXPECT_EQ(ReleasedPools(), std::vector<MemPool *>{&b->mp});  // b's own callback
    Fam::Insert(a, Fam::MakeKey(0), 50);
    Fam::FreeTree(a);
    Fam::FreeTree(b);
    EXPECT_EQ(tp.liveBlocks(), 0u);  // no leak, and no foreign free was flagged
  }
  EXPECT_EQ(callerNil.key, 0x77777777u);
}

}  // namespace
}  // namespace rbt_test
