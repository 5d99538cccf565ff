// SPDX-License-Identifier: MIT
// The red-black trees' sharp edges: the order of pool calls and releases,
// what a release callback sees, sentinels that travel with a swap, and the
// checker firing on damaged trees.
#include <gtest/gtest.h>

#include <functional>

#include "rbt/rbt_internal.h"
#include "support/damage.h"
#include "support/test_pool.h"

namespace coffer_test {
namespace {

TEST(Rbt, PoolCallsAndReleasesInOrder) {
  TestPool tp;
  RbtNode mine;
  StartCallLog();
  RbtTree *s = RBT_AllocTreeEx(tp.pool());
  RBT_SetFreeValFn(s, RecordRelease);
  RBT_Insert(s, "b", 1);
  RBT_InsertNoAlloc(s, &mine, "a", 2);
  EXPECT_EQ(RBT_Insert(s, nullptr, 3), nullptr);
  RBT_FreeTree(s);
  RbtTree *i = RbtInt32_AllocTreeWithNil(tp.pool(), &mine);
  RbtInt32_SetFreeValFn(i, RecordRelease);
  RbtInt32_Insert(i, 5, 4);
  RbtInt32_Insert(i, 5, 5);
  RbtInt32_Clear(i);
  RbtInt32_FreeTree(i);
  RbtTree h = {*tp.pool(), nullptr, nullptr, false, nullptr};  // a caller's handle
  EXPECT_EQ(RbtVoidPtr_CreateTreeData(&h, nullptr), 1);
  RbtVoidPtr_FreeTree(&h);  // not owned: the handle stays, naming no record
  EXPECT_EQ(h.data, nullptr);
  RBT_FreeTree(nullptr);
  RbtInt32_FreeTree(nullptr);
  RbtVoidPtr_FreeTree(nullptr);
  EXPECT_EQ(TakeCallLog(),
            "c1x40 c1x16 c1x24 a2 c1x24 a2 v2 f v1 f f f f f "  // the caller's node stays
            "c1x40 c1x16 c1x24 c1x24 v4 f v5 f f f "
            "c1x16 c1x24 f f");  // data and sentinel of the caller's handle
  EXPECT_EQ(tp.held(), 0u);
}

// A value is dropped while its node is still linked and counted.
RbtTree *g_tree;
std::vector<int32_t> g_sizes;
TEST(Rbt, ReleaseSeesTheNodeStillInTheTree) {
  g_tree = RbtVoidPtr_AllocTree();
  RbtVoidPtr_SetFreeValFn(g_tree, [](CofferVal v) {
    g_sizes.push_back(RbtVoidPtr_GetSize(g_tree));
    g_sizes.push_back(RbtVoidPtr_Find(g_tree, reinterpret_cast<void *>(v)) != nullptr);
  });
  for (uintptr_t k = 1; k <= 3; k++) RbtVoidPtr_Insert(g_tree, reinterpret_cast<void *>(k), k);
  RbtVoidPtr_Remove(g_tree, RbtVoidPtr_Find(g_tree, reinterpret_cast<void *>(2)));
  RbtVoidPtr_FreeTree(g_tree);
  EXPECT_EQ(g_sizes, (std::vector<int32_t>{3, 1, 2, 1, 1, 1}));
}

TEST(Rbt, CheckerFindsEachDamage) {
  RegionPool r(1024);
  RbtTree *t = RbtInt32_AllocTreeEx(&r.pool);
  for (int32_t k : {4, 2, 6, 1, 3, 5, 7, 8}) RbtInt32_Insert(t, k, 0);
  auto *d = static_cast<RbtTreeData *>(t->data);
  auto node = [&](int32_t k) { return RbtInt32_Find(t, k); };
  coffer::CheckSpan span = {16, 4096};  // the region past its header
  auto chain = [&] {  // black nodes 1 .. 8, each the right child of the one before
    RbtNode *n[10] = {};
    for (int32_t k = 1; k <= 8; k++) n[k] = node(k);
    for (int32_t k = 1; k <= 8; k++)
      n[k]->parent = k > 1 ? coffer::OffsetOf(t, n[k - 1]) : d->nil, n[k]->left = d->nil,
      n[k]->right = k < 8 ? coffer::OffsetOf(t, n[k + 1]) : d->nil, n[k]->color = 0;
    d->root = coffer::OffsetOf(t, n[1]);
  };
  ExpectEachFound(r.words, [&](coffer::CheckFault *f) { return coffer::RBTCheckTree(t, coffer::kRbtInt32Keys, f, &span); },
                  {{"sentinel changed", [&] { coffer::RecordAt<RbtNode>(t, d->nil)->color = 1; }},
                   {"red root", [&] { node(4)->color = 1; }},
                   {"red node with a red child", [&] { node(7)->color = 1; }},
                   {"black heights differ", [&] { node(1)->color = 1 - node(1)->color; }},
                   {"colour neither red nor black", [&] { node(5)->color = 2; }},
                   {"parent link disagrees with child link", [&] { node(3)->parent = d->nil; }},
                   {"keys out of order", [&] { node(3)->key = 9; }},
                   {"more nodes than size counts", [&] { d->size = 2; }},
                   {"size differs from the nodes reachable", [&] { d->size = 9; }},
                   {"a link is 0 instead of the sentinel", [&] { node(8)->left = 0; }},
                   {"deeper than its size allows", chain},
                   {"sentinel outside the region", [&] { d->nil = 8; }},
                   {"node outside the region", [&] { node(7)->right = 8; }},
                   {"record outside the region", [&] { span.hi = 16; }}});  // last: the span stays narrowed
}

}  // namespace
}  // namespace coffer_test
