// Randomised differential tests: every family runs side by side with the
// textbook model and a std::multimap through thousands of insertions (many
// equal keys), single removals, range removals and clears. After every step
// the whole shape, colours, keys and values must match the model, the
// invariants must hold, every live node must still carry its own key and
// value, and searches and traversals must agree with the multimap.
#include <cstring>
#include <deque>
#include <iterator>

#include "rbt_test_util.h"
#include "support/test_pool.h"

using coffer_test::Released;
using coffer_test::TestPool;

namespace rbt_test {
namespace {

template <class Fam>
class Harness {
 public:
  using Key = typename Fam::Key;

  Harness(TestPool &tp, RbtNode *callerNil, CofferVal firstVal)
      : tp_(tp), nextVal_(firstVal), arena_(48) {
    nilKey_ = callerNil ? callerNil->key : 0;
    t_ = callerNil ? Fam::AllocWithNil(tp.pool(), callerNil) : Fam::AllocEx(tp.pool());
    EXPECT_NE(t_, nullptr);
    Fam::SetFreeValFn(t_, coffer_test::RecordRelease);
    for (size_t i = 0; i < arena_.size(); ++i) freeSlots_.push_back(i);
  }

  RbtTree *tree() const { return t_; }
  size_t size() const { return live_.size(); }

  // One random insertion or removal followed by a full verification.
  void Step(std::mt19937 &rng, int insertPercent) {
    unsigned r = rng() % 100, s = rng() % 200;
    if (live_.empty() || r < static_cast<unsigned>(insertPercent))
      Insert(Fam::RandomKey(rng), rng() % 8 == 0);
    else if (s < 170)
      RemoveOne(rng);
    else if (s < 185)
      RemoveIndexRange(rng);
    else
      RemoveBoundRange(rng);
    Verify(rng);
  }

  void Insert(const Key &key, bool callerNode) {
    CofferVal v = nextVal_++;
    RbtNode *n;
    long callsBefore = tp_.calls();
    if (callerNode && !freeSlots_.empty()) {
      size_t slot = freeSlots_.back();
      freeSlots_.pop_back();
      RbtNode *mine = &arena_[slot];
      n = Fam::InsertNoAlloc(t_, mine, key, v);
      ASSERT_EQ(n, mine);
      ASSERT_EQ(n->ownsNode, 0);
      // Only the string family allocates (its key copy).
      ASSERT_EQ(tp_.calls() - callsBefore, Fam::kCopiesKey ? 1 : 0);
      slotOf_[v] = slot;
    } else {
      n = Fam::Insert(t_, key, v);
      ASSERT_NE(n, nullptr);
      ASSERT_EQ(n->ownsNode, 1);
      ASSERT_TRUE(tp_.IsLive(n));
    }
    live_[v] = {n, key};
    mm_.emplace(key, v);
    model_.Insert(key, v);
  }

  void RemoveOne(std::mt19937 &rng) {
    auto it = std::next(live_.begin(), rng() % live_.size());
    CofferVal v = it->first;
    Released().clear();
    Fam::Remove(t_, it->second.node);
    ASSERT_EQ(Released(), std::vector<CofferVal>{v});
    Forget(v);
  }

  // A range between two nodes chosen by position; end may be null or equal
  // to first.
  void RemoveIndexRange(std::mt19937 &rng) {
    std::vector<RbtNode *> order;
    for (RbtNode *n = Fam::First(t_); n; n = Fam::Next(t_, n)) order.push_back(n);
    size_t i = rng() % order.size();
    size_t j = i + rng() % std::min<size_t>(order.size() - i + 1, 12);
    RbtNode *end = j < order.size() ? order[j] : nullptr;
    std::vector<CofferVal> expected;
    for (size_t k = i; k < j; ++k) expected.push_back(order[k]->val);
    Released().clear();
    Fam::RemoveRange(t_, order[i], end);
    ASSERT_EQ(Released(), expected);
    for (CofferVal v : expected) Forget(v);
  }

  // The run of keys between two random keys, delimited by the bounds.
  void RemoveBoundRange(std::mt19937 &rng) {
    Key a = Fam::RandomKey(rng), b = rng() % 10 ? a : Fam::RandomKey(rng);
    if (Fam::Less(b, a)) std::swap(a, b);
    RbtNode *first = Fam::LowerBound(t_, a), *end = Fam::UpperBound(t_, b);
    std::vector<CofferVal> expected;
    for (auto it = mm_.lower_bound(a); it != mm_.upper_bound(b); ++it)
      expected.push_back(it->second);
    if (!first) {
      ASSERT_TRUE(expected.empty());
      return;
    }
    Released().clear();
    Fam::RemoveRange(t_, first, end);
    ASSERT_EQ(Released(), expected);
    for (CofferVal v : expected) Forget(v);
  }

  void Clear() {
    std::vector<CofferVal> expected;
    for (auto &e : mm_) expected.push_back(e.second);
    Released().clear();
    Fam::Clear(t_);
    ASSERT_EQ(Released(), expected);
    for (CofferVal v : expected) Forget(v);
    ASSERT_EQ(Fam::GetSize(t_), 0);
  }

  void Free() {
    std::vector<CofferVal> expected;
    for (auto &e : mm_) expected.push_back(e.second);
    Released().clear();
    Fam::FreeTree(t_);
    t_ = nullptr;
    ASSERT_EQ(Released(), expected);
  }

  void Verify(std::mt19937 &rng) {
    ASSERT_NO_FATAL_FAILURE(CheckInvariants<Fam>(t_, nilKey_));
    ASSERT_NO_FATAL_FAILURE(CompareShape<Fam>(t_, model_));
    ASSERT_EQ(Fam::GetSize(t_), static_cast<int32_t>(live_.size()));
    for (auto &e : live_) {  // node identity: nothing moved between nodes
      ASSERT_EQ(e.second.node->val, e.first);
      ASSERT_TRUE(Fam::KeyOf(t_, e.second.node) == e.second.key);
    }
    std::vector<CofferVal> expected;
    for (auto &e : mm_) expected.push_back(e.second);
    ASSERT_EQ(ValsInOrder<Fam>(t_), expected);
    std::vector<CofferVal> backward;
    for (RbtNode *n = Fam::Prev(t_, nullptr); n; n = Fam::Prev(t_, n)) backward.push_back(n->val);
    ASSERT_EQ(backward, std::vector<CofferVal>(expected.rbegin(), expected.rend()));
    for (int i = 0; i < 4; ++i) ASSERT_NO_FATAL_FAILURE(CheckSearches(Fam::RandomKey(rng)));
  }

  void CheckSearches(const Key &k) {
    long calls = tp_.calls();
    RbtNode *f = Fam::Find(t_, k), *lb = Fam::LowerBound(t_, k), *ub = Fam::UpperBound(t_, k);
    ASSERT_EQ(tp_.calls(), calls) << "a search allocated";
    auto onPath = model_.FindOnPath(k);
    ASSERT_EQ(f ? f->val : 0, onPath ? onPath->val : 0);
    ASSERT_EQ(f == nullptr, mm_.count(k) == 0);
    auto lo = mm_.lower_bound(k), hi = mm_.upper_bound(k);
    ASSERT_EQ(lb ? lb->val : 0, lo == mm_.end() ? 0 : lo->second);
    ASSERT_EQ(ub ? ub->val : 0, hi == mm_.end() ? 0 : hi->second);
  }

 private:
  struct Entry {
    RbtNode *node;
    Key key;
  };

  void Forget(CofferVal v) {
    const Key key = live_.at(v).key;
    live_.erase(v);
    auto range = mm_.equal_range(key);
    for (auto it = range.first; it != range.second; ++it)
      if (it->second == v) {
        mm_.erase(it);
        break;
      }
    model_.Remove(v);
    auto slot = slotOf_.find(v);
    if (slot != slotOf_.end()) {
      freeSlots_.push_back(slot->second);
      slotOf_.erase(slot);
    }
  }

  TestPool &tp_;
  RbtTree *t_;
  uint32_t nilKey_;
  CofferVal nextVal_;
  Model<Fam> model_;
  std::multimap<Key, CofferVal, KeyLess<Fam>> mm_;
  std::map<CofferVal, Entry> live_;
  std::deque<RbtNode> arena_;  // caller-supplied nodes, reused after removal
  std::vector<size_t> freeSlots_;
  std::map<CofferVal, size_t> slotOf_;
};

template <class Fam>
class RbtDifferential : public ::testing::Test {};
using Families = ::testing::Types<StringFamily, Int32Family, Int32WrapFamily, VoidPtrFamily>;
TYPED_TEST_SUITE(RbtDifferential, Families);

// Grows to hundreds of nodes, is cleared, grows again, shrinks, is cleared
// while small, and is emptied node by node.
TYPED_TEST(RbtDifferential, OwnSentinelMatchesModel) {
  for (unsigned seed : {1u, 2u}) {
    SCOPED_TRACE(seed);
    std::mt19937 rng(seed);
    TestPool tp;
    Harness<TypeParam> h(tp, nullptr, 1);
    for (int step = 0; step < 3000; ++step) {
      SCOPED_TRACE(step);
      ASSERT_NO_FATAL_FAILURE(h.Step(rng, step < 1800 ? 80 : 35));
      if (step == 700 || step == 2500) {
        ASSERT_NO_FATAL_FAILURE(h.Clear());
        ASSERT_NO_FATAL_FAILURE(h.Verify(rng));
      }
    }
    while (h.size()) ASSERT_NO_FATAL_FAILURE(h.Step(rng, 0));
    ASSERT_NO_FATAL_FAILURE(h.Step(rng, 100));
    ASSERT_NO_FATAL_FAILURE(h.Free());
    EXPECT_EQ(tp.liveBlocks(), 0u);
  }
}

// Two trees on one caller sentinel, changed in turn: removal in either
// writes the shared sentinel's parent, which must never disturb the other.
TYPED_TEST(RbtDifferential, SharedCallerSentinel) {
  std::mt19937 rng(7);
  TestPool tp;
  RbtNode nil;
  std::memset(&nil, 0xA5, sizeof nil);  // the key field must survive
  Harness<TypeParam> a(tp, &nil, 1), b(tp, &nil, 1000000);
  EXPECT_EQ(DataOf(a.tree())->ownsNil, 0u);
  for (int step = 0; step < 2000; ++step) {
    SCOPED_TRACE(step);
    ASSERT_NO_FATAL_FAILURE(a.Step(rng, step < 1200 ? 65 : 40));
    ASSERT_NO_FATAL_FAILURE(b.Step(rng, step < 1200 ? 65 : 40));
    ASSERT_NO_FATAL_FAILURE(a.Verify(rng));
  }
  ASSERT_NO_FATAL_FAILURE(a.Free());
  for (int step = 0; step < 200; ++step) ASSERT_NO_FATAL_FAILURE(b.Step(rng, 50));
  ASSERT_NO_FATAL_FAILURE(b.Free());
  EXPECT_EQ(tp.liveBlocks(), 0u);
  EXPECT_EQ(nil.key, 0xA5A5A5A5u);
  EXPECT_EQ(nil.reserved[0], 0xA5);
}

}  // namespace
}  // namespace rbt_test
