// Sharp edges: the key orders (signed bytes, serial integers, unsigned
// addresses), equal runs under the three searches, range bounds, node
// identity across a two-child removal.
#include <climits>

#include "rbt_test_util.h"
#include "support/test_pool.h"

using coffer_test::Released;
using coffer_test::TestPool;

namespace rbt_test {
namespace {

CofferVal ValOr0(const RbtNode *n) { return n ? n->val : 0; }

class RbtString : public ::testing::Test {
 protected:
  RbtString() : t(RBT_AllocTreeEx(tp.pool())) { Released().clear(); }
  ~RbtString() override { RBT_FreeTree(t); }
  std::string Key(const RbtNode *n) const { return StringFamily::KeyOf(t, n); }
  TestPool tp;
  RbtTree *t;
};

TEST_F(RbtString, ThreeKeysGiveBlackRootAndRedChildren) {
  RBT_Insert(t, "b", 1);
  RBT_Insert(t, "a", 2);
  RBT_Insert(t, "c", 3);
  RbtNode *root = RootOf(t);
  EXPECT_EQ(Key(root), "b");
  EXPECT_EQ(root->color, 0);
  EXPECT_EQ(Key(NodeAt(t, root->left)), "a");
  EXPECT_EQ(NodeAt(t, root->left)->color, 1);
  EXPECT_EQ(Key(NodeAt(t, root->right)), "c");
  EXPECT_EQ(NodeAt(t, root->right)->color, 1);
  EXPECT_EQ(RBT_GetSize(t), 3);
}

TEST_F(RbtString, EmptyTreeSearchesFindNothing) {
  EXPECT_EQ(RBT_Find(t, "a"), nullptr);
  EXPECT_EQ(RBT_LowerBound(t, ""), nullptr);
  EXPECT_EQ(RBT_UpperBound(t, ""), nullptr);
  EXPECT_EQ(RBT_First(t), nullptr);
  EXPECT_EQ(RBT_Prev(t, nullptr), nullptr);
}

TEST_F(RbtString, EqualRunUnderTheThreeSearches) {
  for (CofferVal v = 1; v <= 3; ++v) RBT_Insert(t, "b", v);
  EXPECT_EQ(ValOr0(RBT_Find(t, "b")), 2u);  // the root, nearest on the path
  EXPECT_EQ(ValOr0(RBT_LowerBound(t, "b")), 1u);
  EXPECT_EQ(RBT_UpperBound(t, "b"), nullptr);
}

TEST_F(RbtString, BoundsAroundMissingAndPrefixKeys) {
  const char *keys[] = {"a", "b", "b", "c"};
  for (CofferVal v = 1; v <= 4; ++v) RBT_Insert(t, keys[v - 1], v);
  EXPECT_EQ(ValOr0(RBT_LowerBound(t, "b")), 2u);
  EXPECT_EQ(ValOr0(RBT_UpperBound(t, "b")), 4u);
  EXPECT_EQ(ValOr0(RBT_LowerBound(t, "bb")), 4u);
  EXPECT_EQ(ValOr0(RBT_UpperBound(t, "bb")), 4u);
  EXPECT_EQ(RBT_Find(t, "bb"), nullptr);
  EXPECT_EQ(RBT_Find(t, "d"), nullptr);
  EXPECT_EQ(RBT_LowerBound(t, "d"), nullptr);
  EXPECT_EQ(RBT_UpperBound(t, "d"), nullptr);
  for (const char *k : {"", "0"}) {
    EXPECT_EQ(ValOr0(RBT_LowerBound(t, k)), 1u);
    EXPECT_EQ(ValOr0(RBT_UpperBound(t, k)), 1u);
  }
  // The lower bound of b then the upper bound of b delimit exactly its run.
  RBT_SetFreeValFn(t, coffer_test::RecordRelease);
  RBT_RemoveRange(t, RBT_LowerBound(t, "b"), RBT_UpperBound(t, "b"));
  EXPECT_EQ(Released(), (std::vector<CofferVal>{2, 3}));
  EXPECT_EQ(ValsInOrder<StringFamily>(t), (std::vector<CofferVal>{1, 4}));
}

// Bytes read as signed: 0x80 and above sort before the terminator.
TEST_F(RbtString, HighBytesSortFirst) {
  RBT_Insert(t, "\x80", 1);
  RBT_Insert(t, "A", 2);
  EXPECT_EQ(ValOr0(RBT_LowerBound(t, "")), 2u);
  EXPECT_EQ(ValOr0(RBT_UpperBound(t, "")), 2u);
  RBT_Insert(t, "a", 3);
  RBT_Insert(t, "a\xE9", 4);
  RBT_Insert(t, "ab", 5);
  RBT_Insert(t, "", 6);
  EXPECT_EQ(ValsInOrder<StringFamily>(t), (std::vector<CofferVal>{1, 6, 2, 4, 3, 5}));
  EXPECT_EQ(ValOr0(RBT_Find(t, "a\xE9")), 4u);
  EXPECT_EQ(ValOr0(RBT_UpperBound(t, "a\xE9")), 3u);
  EXPECT_EQ(ValOr0(RBT_LowerBound(t, "\x80")), 1u);
  EXPECT_EQ(ValOr0(RBT_LowerBound(t, "\xFF")), 6u);  // -1: after -128, before the empty key
}

// Keys sharing long prefixes, where the descent skips the bytes it knows
// to match: every key must still be found and ordered exactly.
TEST_F(RbtString, LongCommonPrefixes) {
  std::multimap<std::string, CofferVal, KeyLess<StringFamily>> mm;
  std::mt19937 rng(11);
  std::string base(60, 'p');
  for (CofferVal v = 1; v <= 400; ++v) {
    std::string k = base.substr(0, rng() % 61);
    for (unsigned n = rng() % 3; n; --n) k += "p\xF0q"[rng() % 3];
    RBT_Insert(t, k.c_str(), v);
    mm.emplace(k, v);
  }
  ASSERT_NO_FATAL_FAILURE(CheckInvariants<StringFamily>(t, 0));
  std::vector<CofferVal> expected;
  for (auto &e : mm) expected.push_back(e.second);
  EXPECT_EQ(ValsInOrder<StringFamily>(t), expected);
  for (int i = 0; i < 200; ++i) {
    std::string k = base.substr(0, rng() % 61) + (rng() % 2 ? "\xF0" : "");
    auto lo = mm.lower_bound(k), hi = mm.upper_bound(k);
    EXPECT_EQ(ValOr0(RBT_LowerBound(t, k.c_str())), lo == mm.end() ? 0 : lo->second);
    EXPECT_EQ(ValOr0(RBT_UpperBound(t, k.c_str())), hi == mm.end() ? 0 : hi->second);
    RbtNode *f = RBT_Find(t, k.c_str());
    EXPECT_EQ(f != nullptr, lo != hi);
    if (f) {
      EXPECT_EQ(Key(f), k);
    }
  }
}

TEST_F(RbtString, RangeRemovalBounds) {
  RbtNode *n[6];
  const char *keys[] = {"a", "b", "c", "d", "e", "f"};
  for (int i = 0; i < 6; ++i) n[i] = RBT_Insert(t, keys[i], i + 1);
  RBT_SetFreeValFn(t, coffer_test::RecordRelease);
  RBT_RemoveRange(t, n[2], n[2]);
  EXPECT_TRUE(Released().empty());
  RBT_RemoveRange(t, n[1], n[3]);
  EXPECT_EQ(Released(), (std::vector<CofferVal>{2, 3}));
  EXPECT_EQ(RBT_Next(t, n[0]), n[3]);
  Released().clear();
  RBT_RemoveRange(t, n[4], nullptr);
  EXPECT_EQ(Released(), (std::vector<CofferVal>{5, 6}));
  EXPECT_EQ(RBT_Next(t, n[3]), nullptr);
  EXPECT_EQ(RBT_Prev(t, n[0]), nullptr);
  EXPECT_EQ(RBT_Prev(t, nullptr), n[3]);
  ASSERT_NO_FATAL_FAILURE(CheckInvariants<StringFamily>(t, 0));
}

// Removing the root, which has two children, moves its successor node into
// its place; every other node keeps its address, key and value.
TEST_F(RbtString, TwoChildRemovalRelinksTheSuccessor) {
  std::vector<RbtNode *> nodes;
  std::vector<std::string> keys;
  for (int i = 0; i < 31; ++i) {
    keys.push_back(std::string(1, static_cast<char>('A' + (i * 7) % 31)));
    nodes.push_back(RBT_Insert(t, keys.back().c_str(), i + 1));
  }
  for (int round = 0; round < 20; ++round) {
    RbtNode *z = RootOf(t);
    ASSERT_NE(z->left, DataOf(t)->nil);
    ASSERT_NE(z->right, DataOf(t)->nil);
    RBT_Remove(t, z);
    auto it = std::find(nodes.begin(), nodes.end(), z);
    keys.erase(keys.begin() + (it - nodes.begin()));
    nodes.erase(it);
    for (size_t i = 0; i < nodes.size(); ++i) {
      EXPECT_EQ(Key(nodes[i]), keys[i]);
      EXPECT_TRUE(tp.IsLive(nodes[i]));
    }
    ASSERT_NO_FATAL_FAILURE(CheckInvariants<StringFamily>(t, 0));
    if (RBT_GetSize(t) < 3) break;
  }
}

TEST(RbtInt32, SerialOrder) {
  TestPool tp;
  RbtTree *t = RbtInt32_AllocTreeEx(tp.pool());
  RbtNode *big = RbtInt32_Insert(t, INT32_MAX, 1);
  RbtNode *neg = RbtInt32_Insert(t, -2, 2);
  EXPECT_EQ(RbtInt32_First(t), big);  // INT32_MAX - (-2) wraps negative
  EXPECT_EQ(RbtInt32_Next(t, big), neg);
  RbtInt32_Clear(t);
  RbtInt32_Insert(t, 5, 1);
  RbtInt32_Insert(t, -3, 2);
  RbtInt32_Insert(t, 0, 3);
  EXPECT_EQ(ValsInOrder<Int32Family>(t), (std::vector<CofferVal>{2, 3, 1}));
  EXPECT_EQ(ValOr0(RbtInt32_LowerBound(t, 1)), 1u);
  EXPECT_EQ(ValOr0(RbtInt32_UpperBound(t, 0)), 1u);
  EXPECT_EQ(RbtInt32_LowerBound(t, 6), nullptr);
  // Key 0 is an ordinary key.
  RbtNode *zero = RbtInt32_Find(t, 0);
  ASSERT_NE(zero, nullptr);
  RbtInt32_Remove(t, zero);
  EXPECT_EQ(RbtInt32_Find(t, 0), nullptr);
  RbtInt32_FreeTree(t);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

template <class Fam>
void EqualRunOfSeven(RbtTree *t) {
  for (CofferVal v = 1; v <= 3; ++v) Fam::Insert(t, 7, v);
  EXPECT_EQ(ValOr0(Fam::Find(t, 7)), 2u);
  EXPECT_EQ(ValOr0(Fam::LowerBound(t, 7)), 1u);
  EXPECT_EQ(Fam::UpperBound(t, 7), nullptr);
  EXPECT_EQ(Fam::Find(t, 8), nullptr);
  Fam::FreeTree(t);
}

TEST(RbtTyped, EqualRuns) {
  TestPool tp;
  EqualRunOfSeven<Int32Family>(RbtInt32_AllocTreeEx(tp.pool()));
  EqualRunOfSeven<VoidPtrFamily>(RbtVoidPtr_AllocTreeEx(tp.pool()));
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

TEST(RbtVoidPtr, UnsignedAddressOrder) {
  TestPool tp;
  RbtTree *t = RbtVoidPtr_AllocTreeEx(tp.pool());
  const uintptr_t keys[] = {0x7FFFFFFFu, 0x80000000u, 0xFFFFFFFFu, 0};
  for (CofferVal v = 0; v < 4; ++v)
    RbtVoidPtr_Insert(t, reinterpret_cast<const void *>(keys[v]), v + 1);
  EXPECT_EQ(ValsInOrder<VoidPtrFamily>(t), (std::vector<CofferVal>{4, 1, 2, 3}));
  RbtNode *null = RbtVoidPtr_Find(t, nullptr);
  ASSERT_NE(null, nullptr);
  EXPECT_EQ(null->val, 4u);
  RbtVoidPtr_Remove(t, null);
  EXPECT_EQ(RbtVoidPtr_Find(t, nullptr), nullptr);
  EXPECT_EQ(ValOr0(RbtVoidPtr_LowerBound(t, nullptr)), 1u);
  EXPECT_EQ(ValOr0(RbtVoidPtr_UpperBound(t, reinterpret_cast<const void *>(0x80000000u))), 3u);
  RbtVoidPtr_FreeTree(t);
  EXPECT_EQ(tp.liveBlocks(), 0u);
}

}  // namespace
}  // namespace rbt_test
