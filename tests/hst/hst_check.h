// Helpers shared by the string tree tests: a structural invariant checker, a
// whole-tree dump for "unchanged" comparisons and a scripted clone callback.
#ifndef COFFER_TESTS_HST_CHECK_H
#define COFFER_TESTS_HST_CHECK_H

#include <coffer/hst.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <string>
#include <utility>
#include <vector>

#include "mempool/pool.h"
#include "support/test_pool.h"

namespace hst_test {

constexpr CofferVal kDefault = 0xDEF0;
using V = std::vector<CofferVal>;

inline EsaArray ChildArray(HstTree *tree, HstNode *node) {
  return coffer::TransientHandle(tree, coffer::RecordAt<EsaArrayData>(tree, node->children));
}

// Child arrays in strcmp order, every entry's key equal to its node's key,
// parent links; returns the number of nodes in the subtree.
inline int32_t CheckSubtree(HstTree *tree, HstNode *node) {
  int32_t count = 1;
  const int32_t n = HST_GetNumChildren(tree, node);
  EsaArray kids = ChildArray(tree, node);
  for (int32_t i = 0; i < n; i++) {
    HstNode *child = HST_GetChild(tree, node, i);
    EXPECT_TRUE(child && HST_GetParent(tree, child) == node);
    if (!child) continue;
    EXPECT_STREQ(ESA_GetKey(&kids, i), HST_GetKey(tree, child));
    EXPECT_TRUE(i == 0 || std::strcmp(ESA_GetKey(&kids, i - 1), ESA_GetKey(&kids, i)) <= 0);
    count += CheckSubtree(tree, child);
  }
  EXPECT_EQ(HST_GetChild(tree, node, n), nullptr);
  EXPECT_EQ(HST_GetChild(tree, node, -1), nullptr);
  return count;
}

// Whole tree: the root's empty name and no parent, the structure above, and
// a size equal to the live nodes.
inline void CheckTree(HstTree *tree) {
  HstNode *root = HST_GetRoot(tree);
  EXPECT_STREQ(HST_GetKey(tree, root), "");
  EXPECT_EQ(HST_GetParent(tree, root), nullptr);
  EXPECT_EQ(CheckSubtree(tree, root), HST_GetSize(tree));
}

inline void DumpNode(HstTree *tree, HstNode *node, std::string *out) {
  *out += "(" + std::string(HST_GetKey(tree, node)) + "=" + std::to_string(HST_GetVal(tree, node)) +
          "#" + std::to_string(node->subtreeValCount);
  for (int32_t i = 0; i < HST_GetNumChildren(tree, node); i++)
    DumpNode(tree, HST_GetChild(tree, node, i), out);
  *out += ")";
}

// Everything a caller can see of the tree, as one string.
inline std::string Dump(HstTree *tree) {
  std::string out = "size " + std::to_string(HST_GetSize(tree)) + " ";
  DumpNode(tree, HST_GetRoot(tree), &out);
  return out;
}

// A clone callback that hands out fresh values from a counter, logs every
// call and refuses its failAt-th call (from 0).
struct CloneScript {
  long failAt = -1;
  long calls = 0;
  CofferVal next = 0x10000000;
  std::vector<std::pair<CofferVal, CofferVal>> made;  // successful calls: (source, copy)
  V seen;                                             // every source value
};

inline CloneScript &Script() {
  static CloneScript s;
  return s;
}

inline bool ScriptedClone(HstTree *, CofferVal val, CofferVal *out) {
  CloneScript &s = Script();
  EXPECT_EQ(*out, 0u);
  s.seen.push_back(val);
  if (s.calls++ == s.failAt) return false;
  *out = s.next++;
  s.made.emplace_back(val, *out);
  return true;
}

inline void ResetLogs() {
  coffer_test::Released().clear();
  coffer_test::ReleasedPools().clear();
  Script() = CloneScript();
}

// After a failed clone: the values released, defaultVal aside, are exactly
// those the callback made, each once.
inline void ExpectCopiesReleased() {
  V made, back;
  for (auto &m : Script().made) made.push_back(m.second);
  for (CofferVal v : coffer_test::Released())
    if (v != kDefault) back.push_back(v);
  std::sort(made.begin(), made.end());
  std::sort(back.begin(), back.end());
  EXPECT_EQ(back, made);
}

// Blocks of a child array that a failed call may leave behind, empty, on a
// node that had none before.
inline size_t KeptArrayBlocks(HstTree *tree, HstNode *node, bool hadArray) {
  if (hadArray || !node->children) return 0;
  auto *arr = coffer::RecordAt<EsaArrayData>(tree, node->children);
  EXPECT_EQ(arr->size, 0);
  return 1 + (arr->entries != 0);
}

}  // namespace hst_test

#endif
