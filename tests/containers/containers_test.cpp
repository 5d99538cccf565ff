// SPDX-License-Identifier: MIT
// The containers. Every family against its model, on seeded random
// operations and under the failure-injection driver (the heap's tests run the
// models inside a region, in eight processes at once). Then the sharp edges
// the models do not reach: the order of each family's pool calls and
// releases, siblings of one name, each checker firing on damaged structures,
// and the path calls' copies of a path.
#include <coffer/hstaa.h>
#include <gtest/gtest.h>

#include <functional>

#include "esa/esa_internal.h"
#include "hst/hst_internal.h"
#include "rbt/rbt_internal.h"
#include "support/damage.h"
#include "support/driver.h"

namespace coffer_test {
namespace {

const std::pair<const char *, Runner> kRunners[] = {
    {"esa", RunEsaModel}, {"rbt", RunRbtModel}, {"hst", RunHstModel}, {"hstaa", RunHstaaModel}};

TEST(Models, AgreeOnSeededOperations) {
  for (auto [name, run] : kRunners)
    for (uint32_t seed = 1; seed <= 40; seed++) {
      Ops ops(RandomBytes(seed, 3000));
      EXPECT_EQ(RunOnTestPool([&](Arena a) { return run(ops, a); }), "") << name << " seed " << seed;
    }
}

TEST(Models, RollBackEveryRefusedAllocation) {
  for (auto [name, run] : kRunners)
    for (uint32_t seed = 100; seed <= 110; seed++) {
      std::vector<uint8_t> bytes = RandomBytes(seed, 300);
      auto scenario = [&](Arena a) { Ops ops(bytes); return run(ops, a); };
      EXPECT_EQ(ForEachFailure(scenario), "") << name << " seed " << seed;
    }
}

TEST(Esa, PoolCallsAndReleasesInOrder) {
  TestPool tp;
  StartCallLog();
  EsaArray *a = ESA_AllocArrayEx(tp.pool(), 0, 2);
  ESA_SetFreeValFn(a, RecordRelease);
  for (const char *k : {"ab", "c", "b"}) ESA_Insert(a, k, k[0]);
  ESA_Remove(a, 0);
  ESA_Clear(a);
  ESA_Insert(a, "x", 4);
  ESA_FreeArray(a);
  a = ESA_AllocArrayEx(tp.pool(), 4, 8);  // slack below the increment: the block outlives the clear
  ESA_Insert(a, "k", 5);
  ESA_FreeArray(a);
  ESA_FreeArray(nullptr);
  EsaArray mine = {*tp.pool(), nullptr, nullptr, false, &mine};  // data left from something else
  EXPECT_TRUE(!ESA_CreateArrayData(&mine, -1, 2) && !mine.data);  // refused before any pool call
  EXPECT_EQ(TakeCallLog(),
            "c1x40 c1x16 r0:0 r0:16 a3 a2 r32 a2 v97 f r16 v98 f v99 f r0 r0:16 a2 v4 f r0 f f "
            "c1x40 c1x16 r0:32 a2 f f f f");
  EXPECT_EQ(tp.held(), 0u);
}

TEST(Esa, CheckerFindsEachDamage) {
  RegionPool r(256);
  EsaArray *a = ESA_AllocArrayEx(&r.pool, 4, 4);
  for (const char *k : {"a", "b", "c"}) ESA_Insert(a, k, 0);
  EsaArrayData *d = coffer::Data(a);
  EsaEntry *e = ESA_Get(a, 0);
  coffer::CheckSpan span = {16, 1024};  // the region past its header
  ExpectEachFound(r.words, [&](coffer::CheckFault *f) { return coffer::ESACheckArray(a, f, &span); },
                  {{"size outside 0 .. capacity", [&] { d->size = 5; }},
                   {"size outside 0 .. capacity", [&] { d->size = -1; }},
                   {"slots without an entry block", [&] { d->entries = 0; }},
                   {"entry without a key", [&] { e[1].key = 0; }},
                   {"keys out of order", [&] { std::swap(e[0], e[2]); }},
                   {"entry block outside the region", [&] { d->entries = 8; }},
                   {"key outside the region", [&] { e[1].key = 8; }},
                   {"record outside the region", [&] { span.hi = 16; }}});  // last: the span stays narrowed
}

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
  RBT_FreeTree(nullptr), RbtInt32_FreeTree(nullptr), RbtVoidPtr_FreeTree(nullptr);
  EXPECT_EQ(TakeCallLog(),
            "c1x40 c1x16 c1x24 a2 c1x24 a2 v2 f v1 f f f f f "  // the caller's node stays
            "c1x40 c1x16 c1x24 c1x24 v4 f v5 f f f "
            "c1x16 c1x24 f f");  // data and sentinel of the caller's handle
  EXPECT_EQ(tp.held(), 0u);
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
                  {{"sentinel changed", [&] { coffer::RbtCtx(t).nil->color = 1; }},
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
  HST_FreeTree(t);
}

TEST(Hst, CheckerFindsEachDamage) {
  RegionPool r(1024);
  HstTree *t = HST_AllocTreeEx(&r.pool, '/', 0, 2, 2);
  for (const char *p : {"/a/b", "/a/c", "/d"}) HST_Insert(t, p, 0);
  HstNode *a = HST_Find(t, "/a"), *b = HST_Find(t, "/a/b"), *root = HST_GetRoot(t);
  HstTreeData *data = coffer::hst::Data(t);
  EsaEntry *e = coffer::EntriesOf(t, coffer::hst::ChildArray(t, a));
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

// The path calls of the string tree and the associative arrays copy the path
// with malloc and free the copy before they return; when the copy is refused
// they fail and change nothing. (Without the sanitizer, which owns malloc and
// finds leaks itself.)
#ifndef __SANITIZE_ADDRESS__
namespace {
long g_heldBlocks;
bool g_refuseMalloc;
}  // namespace

extern "C" void *__libc_malloc(size_t);
extern "C" void __libc_free(void *);
extern "C" void *malloc(size_t n) {
  if (g_refuseMalloc) return g_refuseMalloc = false, nullptr;
  void *p = __libc_malloc(n);
  g_heldBlocks += p != nullptr;
  return p;
}
extern "C" void free(void *p) {
  g_heldBlocks -= p != nullptr;
  __libc_free(p);
}

namespace {

bool Add(HstaaTree *, CofferVal cur, CofferVal op, CofferVal *out) { return *out = cur + op, true; }

TEST(Hstaa, PathCopies) {
  HstaaTree t{};
  MemPool_InitOnStdHeap(&t.hst.mp);
  t.insertValFn = t.removeValFn = Add;
  t.cloneValFn = [](HstTree *, CofferVal v, CofferVal *out) { return *out = v, true; };
  ASSERT_TRUE(HST_CreateTreeData(&t.hst, '/', 0, 1, 1));
  HstNode *b = HSTAA_Insert(&t, "/a/b", 1);
  bool complete = false;
  const std::function<bool()> kCalls[] = {
      [&] { return HST_Find(&t.hst, "/a/b") == b; },
      [&] { return HST_Insert(&t.hst, "/a/b", 1) == b; },
      [&] { return HSTAA_FindPrefix(&t, "/a/b", &complete) == b; },
      [&] { return HSTAA_Insert(&t, "/a/b", 1) == b; },
      [&] { return HSTAA_Remove(&t, "/a/b", 9); },
  };
  for (const auto &call : kCalls) {
    const long held = g_heldBlocks;
    EXPECT_TRUE(call());
    EXPECT_EQ(g_heldBlocks, held);
    complete = true;
    g_refuseMalloc = true;
    EXPECT_FALSE(call());
    EXPECT_TRUE(complete);  // not written when the copy is refused
  }
  EXPECT_EQ(HST_GetVal(&t.hst, b), 11u);  // 1, set to 1, +1, +9: nothing twice
  HST_FreeTree(&t.hst);  // the caller's handle stays, naming no record
  EXPECT_EQ(t.hst.data, nullptr);
}

}  // namespace
#endif
