// SPDX-License-Identifier: MIT
// The string tree's sharp edges: the order of its pool calls, siblings of
// one name, detached nodes, what a failed copy releases, and the checker
// firing on damaged trees.
#include <gtest/gtest.h>

#include <functional>

#include "hst/hst_internal.h"
#include "support/damage.h"
#include "support/test_pool.h"

namespace coffer_test {
namespace {

TEST(Hst, PoolCallsAndReleasesInOrder) {
  TestPool tp;
  StartCallLog();
  HstTree *t = HST_AllocTreeEx(tp.pool(), '/', 0, 1, 1);
  HST_SetFreeValFn(t, RecordRelease);
  HST_Insert(t, "/ab/c", 3);
  HST_CloneSubtree(t, HST_Find(t, "/ab"), [](HstTree *, CofferVal v, CofferVal *out) { return *out = v + 1, true; },
                   "d", HST_GetRoot(t));
  HST_RemoveSubtree(t, HST_Find(t, "/ab"));
  HST_FreeTree(t);
  HST_FreeTree(nullptr);
  EXPECT_EQ(TakeCallLog(),
            "c1x40 c1x24 a1 c1x20 "                                // handle, record, root
            "c1x16 r0:8 a3 c1x20 a3 c1x16 r0:8 a2 c1x20 a2 "       // /ab/c
            "a3 c1x20 a2 c1x20 c1x16 r0:8 a2 a2 f r16 a2 "         // ab copied as d
            "f r8 v3 f f v0 f r0 f f f "                           // ab removed
            "v4 f f v0 f r0 f f f f r0 f v0 f f f f");             // the rest freed
  EXPECT_EQ(tp.held(), 0u);
}

// Siblings of one name (only the node primitives make them): a lookup finds
// the one the bisection meets first, a removal takes out that very node.
TEST(Hst, SiblingsOfOneName) {
  HstTree *t = HST_AllocTree('/', 0, 0, 1);
  HstNode *root = HST_GetRoot(t), *k[3];
  for (int i = 0; i < 3; i++) k[i] = HST_InsertChild(t, root, "k", i);
  EXPECT_EQ(HST_FindChild(t, root, "k"), k[1]);
  HST_RemoveSubtree(t, k[1]);
  EXPECT_EQ(HST_GetChild(t, root, 0), k[0]);
  EXPECT_EQ(HST_GetChild(t, root, 1), k[2]);
  EXPECT_EQ(HST_GetSize(t), 3);
  EXPECT_FALSE(HSTAllocChild(t, root));  // it has an array already
  EXPECT_EQ(HSTAllocNode(t, nullptr, 0), nullptr);
  EXPECT_EQ(HST_Find(t, ""), nullptr);  // no first character to skip
  EXPECT_EQ(HST_Insert(t, "", 5), nullptr);
  HST_FreeTree(t);
}

TEST(Hst, CheckerFindsEachDamage) {
  RegionPool r(1024);
  HstTree *t = HST_AllocTreeEx(&r.pool, '/', 0, 2, 2);
  for (const char *p : {"/a/b", "/a/c", "/d"}) HST_Insert(t, p, 0);
  HstNode *a = HST_Find(t, "/a"), *b = HST_Find(t, "/a/b"), *root = HST_GetRoot(t);
  auto *data = static_cast<HstTreeData *>(t->data);
  auto *e = coffer::RecordAt<EsaEntry>(t, coffer::RecordAt<EsaArrayData>(t, a->children)->entries);
  coffer::CheckSpan span = {16, 4096};  // the region past its header
  ExpectEachFound(r.words, [&](coffer::CheckFault *f) { return coffer::hst::HSTCheckTree(t, true, f, &span); },
                  {{"root missing, named or with a parent", [&] { root->parent = a->parent; }},
                   {"node without a name", [&] { b->key = 0; }},
                   {"keys out of order", [&] { std::swap(e[0], e[1]); }},
                   {"child entry names no node", [&] { e[1].val = 0; }},
                   {"parent link disagrees with child entry", [&] { b->parent = 0; }},
                   {"child entry named unlike its node", [&] { e[0].key = e[1].key; }},
                   {"more nodes than size counts", [&] { data->size = 2; }},
                   {"size differs from the nodes reachable", [&] { data->size = 9; }},
                   {"negative value count", [&] { b->subtreeValCount = -1; }},
                   {"value count below its children's", [&] { b->subtreeValCount = 1; }},
                   {"node outside the region", [&] { e[1].val = 8; }},
                   {"key outside the region", [&] { b->key = 8; }},
                   {"record outside the region", [&] { span.hi = 16; }}});  // last: the span stays narrowed
}

}  // namespace
}  // namespace coffer_test
