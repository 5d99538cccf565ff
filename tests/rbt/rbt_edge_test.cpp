// Sharp edges on small trees: the key orders (signed bytes, serial integers,
// unsigned addresses), equal runs under the three searches, the first shape.
#include <climits>

#include "rbt_test_util.h"
#include "support/test_pool.h"

using coffer_test::TestPool;

namespace rbt_test {
namespace {

// A tree of one family holding the keys inserted in order with the values
// 1, 2, 3 ..., checked, and freed (leaving nothing) at the end of the scope.
template <class Fam>
struct Built {
  TestPool tp;
  RbtTree *t = Fam::AllocEx(tp.pool());
  std::vector<RbtNode *> n;
  Built(const std::vector<typename Fam::Key> &keys) {
    CofferVal v = 1;
    for (auto &k : keys) n.push_back(Fam::Insert(t, k, v++));
    CheckTree<Fam>(t, 0);
  }
  ~Built() {
    Fam::FreeTree(t);
    EXPECT_EQ(tp.liveBlocks(), 0u);
  }
  std::vector<CofferVal> Order() { return ValsInOrder<Fam>(t); }
};

// Search results as values (0: null) for a key: Find, LowerBound, UpperBound.
template <class Fam>
std::vector<CofferVal> Searches(RbtTree *t, const typename Fam::Key &k) {
  return {ValOr0(Fam::Find(t, k)), ValOr0(Fam::LowerBound(t, k)), ValOr0(Fam::UpperBound(t, k))};
}
using V = std::vector<CofferVal>;

TEST(RbtString, FirstShapeAndEmptySearches) {
  Built<StringFamily> e({});
  EXPECT_EQ(Searches<StringFamily>(e.t, ""), (V{0, 0, 0}));
  EXPECT_EQ(RBT_First(e.t), nullptr);
  EXPECT_EQ(RBT_Prev(e.t, nullptr), nullptr);
  Built<StringFamily> b({"b", "a", "c"});
  RbtNode *root = RootOf(b.t);
  EXPECT_EQ(root, b.n[0]);
  EXPECT_EQ(root->color, 0);
  EXPECT_EQ(NodeAt(b.t, root->left), b.n[1]);
  EXPECT_EQ(NodeAt(b.t, root->right), b.n[2]);
  EXPECT_EQ(b.n[1]->color + b.n[2]->color, 2);
  EXPECT_EQ(RBT_GetSize(b.t), 3);
}

TEST(RbtString, SearchTable) {
  struct Row {
    std::vector<std::string> keys;
    std::string probe;
    V expected;  // Find, LowerBound, UpperBound
  } rows[] = {
      {{"b", "b", "b"}, "b", {2, 1, 0}},  // Find: the root, nearest on the path
      {{"a", "b", "b", "c"}, "b", {2, 2, 4}},
      {{"a", "b", "b", "c"}, "bb", {0, 4, 4}},
      {{"a", "b", "b", "c"}, "d", {0, 0, 0}},
      {{"a", "b", "b", "c"}, "", {0, 1, 1}},
      {{"a", "b", "b", "c"}, "0", {0, 1, 1}},
      // Bytes are signed: 0x80 and above come before the terminator.
      {{"\x80", "A"}, "", {0, 2, 2}},
      {{"\x80", "A", "a", "a\xE9", "ab", ""}, "a\xE9", {4, 4, 3}},
      {{"\x80", "A", "a", "a\xE9", "ab", ""}, "\xFF", {0, 6, 6}},
      {{"\x80", "A", "a", "a\xE9", "ab", ""}, "\x80", {1, 1, 6}},
  };
  for (const Row &r : rows) {
    SCOPED_TRACE(r.probe);
    Built<StringFamily> b(r.keys);
    EXPECT_EQ(Searches<StringFamily>(b.t, r.probe), r.expected);
  }
  Built<StringFamily> b({"\x80", "A", "a", "a\xE9", "ab", ""});
  EXPECT_EQ(b.Order(), (V{1, 6, 2, 4, 3, 5}));
}

// The word orders where they differ from plain signed order and at the ends
// of the address range; equal runs as in the string tree.
TEST(RbtTyped, OrdersAndEqualRuns) {
  Built<Int32Family> w({INT32_MAX, -2});  // INT32_MAX - (-2) wraps negative
  EXPECT_EQ(w.Order(), (V{1, 2}));
  Built<Int32Family> b({5, -3, 0});
  EXPECT_EQ(b.Order(), (V{2, 3, 1}));
  EXPECT_EQ(Searches<Int32Family>(b.t, 1), (V{0, 1, 1}));
  EXPECT_EQ(Searches<Int32Family>(b.t, 0), (V{3, 3, 1}));
  EXPECT_EQ(Searches<Int32Family>(b.t, 6), (V{0, 0, 0}));
  Built<VoidPtrFamily> p({0x7FFFFFFFu, 0x80000000u, 0xFFFFFFFFu, 0});
  EXPECT_EQ(p.Order(), (V{4, 1, 2, 3}));
  EXPECT_EQ(Searches<VoidPtrFamily>(p.t, 0), (V{4, 4, 1}));
  Built<Int32Family> i7({7, 7, 7});
  Built<VoidPtrFamily> p7({7, 7, 7});
  EXPECT_EQ(Searches<Int32Family>(i7.t, 7), (V{2, 1, 0}));
  EXPECT_EQ(Searches<VoidPtrFamily>(p7.t, 7), (V{2, 1, 0}));
}

}  // namespace
}  // namespace rbt_test
