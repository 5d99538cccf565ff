// Randomised differential tests: every family runs side by side with the
// textbook model through thousands of insertions (many equal keys, some into
// caller nodes), single removals, range removals and clears. After every step
// the shape, colours, keys and values must match the model, every live node
// must still carry its own key and value, traversals must list the model's
// order and searches must agree with a linear scan of it.
#include <cstring>
#include <iterator>
#include <map>
#include <tuple>

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
  using V = std::vector<CofferVal>;

  Harness(TestPool &tp, RbtNode *callerNil, CofferVal firstVal)
      : tp_(tp), nilKey_(callerNil ? callerNil->key : 0), nextVal_(firstVal), arena_(48) {
    t_ = callerNil ? Fam::AllocWithNil(tp.pool(), callerNil) : Fam::AllocEx(tp.pool());
    EXPECT_NE(t_, nullptr);
    Fam::SetFreeValFn(t_, coffer_test::RecordRelease);
    for (RbtNode &n : arena_) spare_.push_back(&n);
  }

  size_t size() const { return live_.size(); }

  // One random insertion or removal followed by a full verification.
  void Step(std::mt19937 &rng, unsigned insertPercent) {
    unsigned s = rng() % 200;
    if (live_.empty() || rng() % 100 < insertPercent)
      Insert(Fam::RandomKey(rng), rng() % 8 == 0);
    else if (s < 170)
      RemoveOne(rng);
    else
      RemoveSomeRange(rng, s < 185);
    Verify(rng);
  }

  void Insert(const Key &key, bool callerNode) {
    CofferVal v = nextVal_++;
    RbtNode *mine = callerNode && !spare_.empty() ? spare_.back() : nullptr;
    long calls = tp_.calls();
    RbtNode *n = mine ? Fam::InsertNoAlloc(t_, mine, key, v) : Fam::Insert(t_, key, v);
    ASSERT_NE(n, nullptr);
    if (mine) {
      spare_.pop_back();
      ASSERT_EQ(n, mine);
      ASSERT_EQ(tp_.calls() - calls, Fam::kCopiesKey ? 1 : 0);  // only a key copy
    }
    ASSERT_EQ(n->ownsNode, mine ? 0 : 1);
    ASSERT_TRUE(mine || tp_.IsLive(n));
    live_[v] = {n, key, mine != nullptr};
    model_.Insert(key, v);
  }

  void RemoveOne(std::mt19937 &rng) {
    auto it = std::next(live_.begin(), rng() % live_.size());
    ExpectRemoval(V{it->first}, [&] { Fam::Remove(t_, it->second.node); });
  }

  // Between two nodes chosen by position (end may be null or equal to first),
  // or the run of keys between two random keys, delimited by the bounds.
  void RemoveSomeRange(std::mt19937 &rng, bool byPosition) {
    std::vector<RbtNode *> order;
    for (RbtNode *n = Fam::First(t_); n; n = Fam::Next(t_, n)) order.push_back(n);
    size_t i = rng() % order.size();
    size_t j = i + rng() % std::min<size_t>(order.size() - i + 1, 12);
    if (!byPosition) {
      Key a = Fam::RandomKey(rng), b = rng() % 10 ? a : Fam::RandomKey(rng);
      if (Fam::Less(b, a)) std::swap(a, b);
      for (i = 0; i < order.size() && Fam::Less(Fam::KeyOf(t_, order[i]), a);) ++i;
      for (j = i; j < order.size() && !Fam::Less(b, Fam::KeyOf(t_, order[j]));) ++j;
      ASSERT_EQ(Fam::LowerBound(t_, a), i < order.size() ? order[i] : nullptr);
      ASSERT_EQ(Fam::UpperBound(t_, b), j < order.size() ? order[j] : nullptr);
      if (i == order.size()) return;
    }
    V expected;
    for (size_t k = i; k < j; ++k) expected.push_back(order[k]->val);
    RbtNode *end = j < order.size() ? order[j] : nullptr;
    ExpectRemoval(expected, [&] { Fam::RemoveRange(t_, order[i], end); });
  }

  // Clear (or free) drops every value in ascending order.
  void ClearOrFree(bool free) {
    ExpectRemoval(ModelOrder(), [&] { free ? Fam::FreeTree(t_) : Fam::Clear(t_); });
    ASSERT_TRUE(free || Fam::GetSize(t_) == 0);
  }

  void Verify(std::mt19937 &rng) {
    ASSERT_NO_FATAL_FAILURE(CheckTree<Fam>(t_, nilKey_, &model_));
    ASSERT_EQ(Fam::GetSize(t_), static_cast<int32_t>(live_.size()));
    for (auto &e : live_) {  // node identity: nothing moved between nodes
      ASSERT_EQ(e.second.node->val, e.first);
      ASSERT_TRUE(Fam::KeyOf(t_, e.second.node) == e.second.key);
    }
    V expected = ModelOrder(), backward;
    ASSERT_EQ(ValsInOrder<Fam>(t_), expected);
    for (RbtNode *n = Fam::Prev(t_, nullptr); n; n = Fam::Prev(t_, n)) backward.push_back(n->val);
    ASSERT_EQ(backward, V(expected.rbegin(), expected.rend()));
    long calls = tp_.calls();
    auto order = model_.InOrder();
    for (int i = 0; i < 4; ++i) {
      Key k = Fam::RandomKey(rng);
      auto onPath = model_.FindOnPath(k);
      CofferVal lo = 0, hi = 0;
      for (auto it = order.rbegin(); it != order.rend(); ++it) {
        if (!Fam::Less((*it)->key, k)) lo = (*it)->val;
        if (Fam::Less(k, (*it)->key)) hi = (*it)->val;
      }
      ASSERT_EQ(onPath == nullptr, lo == hi);
      ASSERT_EQ(ValOr0(Fam::Find(t_, k)), onPath ? onPath->val : 0);
      ASSERT_EQ(ValOr0(Fam::LowerBound(t_, k)), lo);
      ASSERT_EQ(ValOr0(Fam::UpperBound(t_, k)), hi);
    }
    ASSERT_EQ(tp_.calls(), calls) << "a search allocated";
  }

 private:
  struct Entry {
    RbtNode *node;
    Key key;
    bool callers;
  };

  V ModelOrder() const {
    V v;
    for (auto *n : model_.InOrder()) v.push_back(n->val);
    return v;
  }

  template <class F>
  void ExpectRemoval(const V &expected, F remove) {
    Released().clear();
    remove();
    ASSERT_EQ(Released(), expected);
    for (CofferVal v : expected) {
      if (live_.at(v).callers) spare_.push_back(live_.at(v).node);  // may be reused
      live_.erase(v);
      model_.Remove(v);
    }
  }

  TestPool &tp_;
  RbtTree *t_;
  uint32_t nilKey_;
  CofferVal nextVal_;
  Model<Fam> model_;
  std::map<CofferVal, Entry> live_;
  std::vector<RbtNode> arena_;  // caller-supplied nodes
  std::vector<RbtNode *> spare_;
};

template <class Fam>
class RbtDifferential : public ::testing::Test {};
using Families = ::testing::Types<StringFamily, Int32Family, Int32WrapFamily, VoidPtrFamily>;
TYPED_TEST_SUITE(RbtDifferential, Families);

// On its own sentinel a tree grows to hundreds of nodes, is cleared, grows
// again, shrinks, is cleared while small, and is emptied node by node. Two
// trees on one caller sentinel are changed in turn: removal in either writes
// the shared sentinel's parent, which must never disturb the other.
TYPED_TEST(RbtDifferential, MatchesModel) {
  for (unsigned seed : {1u, 2u, 3u}) {
    SCOPED_TRACE(seed);
    std::mt19937 rng(seed);
    TestPool tp;
    RbtNode nil;
    std::memset(&nil, 0xA5, sizeof nil);  // key and reserved must survive
    bool shared = seed == 3;
    Harness<TypeParam> a(tp, shared ? &nil : nullptr, 1), b(tp, &nil, 1000000);
    for (int step = 0; step < 3000; ++step) {
      SCOPED_TRACE(step);
      ASSERT_NO_FATAL_FAILURE(a.Step(rng, step < 1800 ? 80 : 35));
      if (shared) {
        ASSERT_NO_FATAL_FAILURE(b.Step(rng, step < 1800 ? 70 : 35));
        ASSERT_NO_FATAL_FAILURE(a.Verify(rng));
      } else if (step == 700 || step == 2500) {
        ASSERT_NO_FATAL_FAILURE(a.ClearOrFree(false));
      }
    }
    while (a.size()) ASSERT_NO_FATAL_FAILURE(a.Step(rng, 0));
    ASSERT_NO_FATAL_FAILURE(a.Step(rng, 100));
    ASSERT_NO_FATAL_FAILURE(a.ClearOrFree(true));
    for (int step = 0; step < 200; ++step) ASSERT_NO_FATAL_FAILURE(b.Step(rng, 50));
    ASSERT_NO_FATAL_FAILURE(b.ClearOrFree(true));
    EXPECT_EQ(tp.liveBlocks(), 0u);
    EXPECT_EQ(std::make_tuple(nil.key, nil.reserved[0]), std::make_tuple(0xA5A5A5A5u, 0xA5));
  }
}

}  // namespace
}  // namespace rbt_test
