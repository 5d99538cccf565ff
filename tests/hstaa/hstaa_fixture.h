// An associative-array tree for tests: the handle, configurable value
// callbacks that count their calls, a per-tree release log, and readers that
// dump the whole tree and check its structure and value counts.
#ifndef COFFER_TESTS_HSTAA_FIXTURE_H
#define COFFER_TESTS_HSTAA_FIXTURE_H

#include <coffer/hstaa.h>
#include <gtest/gtest.h>

#include <cstring>
#include <set>
#include <string>
#include <vector>

namespace hstaa_test {

// What the value callbacks do. Operands and node values are small numbers.
struct Behaviour {
  enum Insert { kReplace, kIncrement };  // out = operand; out = cur + 1
  enum Remove { kIfEqual, kDecrement };  // cur == operand -> 0; cur > 0 -> cur - 1
  Insert insert = kReplace;
  Remove remove = kIfEqual;
  std::set<CofferVal> refuseOperands;  // insertValFn refuses these operands
  std::set<CofferVal> refuseCurrent;   // ... and nodes holding these values
  std::set<CofferVal> refuseClone;     // cloneValFn refuses these values
};

// Pure forms of the callbacks, shared with the reference model.
inline bool InsertRule(const Behaviour &b, CofferVal cur, CofferVal op, CofferVal *out) {
  if (b.refuseOperands.count(op) || b.refuseCurrent.count(cur)) return false;
  *out = b.insert == Behaviour::kReplace ? op : cur + 1;
  return true;
}
inline bool RemoveRule(const Behaviour &b, CofferVal cur, CofferVal op, CofferVal *out) {
  if (b.remove == Behaviour::kIfEqual) {
    if (cur != op) return false;
    *out = 0;
    return true;
  }
  if (cur == 0) return false;
  *out = cur - 1;
  return true;
}
inline bool CloneRule(const Behaviour &b, CofferVal val, CofferVal *out) {
  if (b.refuseClone.count(val)) return false;
  *out = val;
  return true;
}

struct TestTree {
  HstaaTree t;  // first: the callbacks find the TestTree from the handle
  Behaviour behaviour;
  long insertCalls = 0, removeCalls = 0, cloneCalls = 0;
  std::vector<CofferVal> released;

  explicit TestTree(MemPool *pool, CofferVal defaultVal = 0, char sep = '/', int32_t cap = 2,
                    int32_t inc = 2) {
    std::memset(&t, 0, sizeof t);
    t.hst.mp = *pool;
    t.hst.ownsHandle = false;
    t.cloneValFn = Clone;
    t.insertValFn = Insert;
    t.removeValFn = Remove;
    HST_SetMpFreeValFn(&t.hst, Release);
    ok = HST_CreateTreeData(&t.hst, sep, defaultVal, cap, inc);
  }
  ~TestTree() {
    if (t.hst.data) HST_FreeTree(&t.hst);
  }
  TestTree(const TestTree &) = delete;
  TestTree &operator=(const TestTree &) = delete;

  bool ok = false;
  HstTree *h() { return &t.hst; }
  HstNode *root() { return HST_GetRoot(&t.hst); }
  HstNode *Find(const char *path) { return HST_Find(&t.hst, path); }
  // Count of the node at path, or -1 when there is no such node.
  int32_t Count(const char *path) {
    HstNode *n = Find(path);
    return n ? HSTAA_GetSubtreeValCount(&t, n) : -1;
  }
  CofferVal Val(const char *path) { return HST_GetVal(&t.hst, Find(path)); }
  void ResetCalls() {
    insertCalls = removeCalls = cloneCalls = 0;
    released.clear();
  }

  static TestTree *Of(void *handle) { return reinterpret_cast<TestTree *>(handle); }
  static bool Insert(HstaaTree *tree, CofferVal cur, CofferVal op, CofferVal *out) {
    TestTree *tt = Of(tree);
    tt->insertCalls++;
    return InsertRule(tt->behaviour, cur, op, out);
  }
  static bool Remove(HstaaTree *tree, CofferVal cur, CofferVal op, CofferVal *out) {
    TestTree *tt = Of(tree);
    tt->removeCalls++;
    return RemoveRule(tt->behaviour, cur, op, out);
  }
  static bool Clone(HstTree *tree, CofferVal val, CofferVal *out) {
    TestTree *tt = Of(tree);
    tt->cloneCalls++;
    return CloneRule(tt->behaviour, val, out);
  }
  static void Release(MemPool *pool, CofferVal val) { Of(pool)->released.push_back(val); }
};

// One line per node in preorder (children in key order): depth, key, value
// and count. Keys are bracketed so empty keys and spaces show.
inline void DumpNode(HstaaTree *t, HstNode *n, int depth, std::string *out) {
  *out += std::string(2 * depth, ' ') + "[" + HST_GetKey(&t->hst, n) + "] " +
          std::to_string(HST_GetVal(&t->hst, n)) + " #" +
          std::to_string(HSTAA_GetSubtreeValCount(t, n)) + "\n";
  for (int32_t i = 0; i < HST_GetNumChildren(&t->hst, n); i++)
    DumpNode(t, HST_GetChild(&t->hst, n, i), depth + 1, out);
}
inline std::string Dump(HstaaTree *t) {
  std::string s;
  DumpNode(t, HST_GetRoot(&t->hst), 0, &s);
  return s;
}

// Checks parent links, strictly ascending sibling keys and, when the values
// themselves count what a node holds (the kIncrement/kDecrement callbacks),
// that every count is the node's value plus its children's counts. Returns
// the number of nodes in the subtree.
inline int32_t CheckNode(HstaaTree *t, HstNode *n, bool valueIsHeld) {
  HstTree *h = &t->hst;
  int32_t nodes = 1;
  int64_t sum = 0;
  const int32_t kids = HST_GetNumChildren(h, n);
  for (int32_t i = 0; i < kids; i++) {
    HstNode *c = HST_GetChild(h, n, i);
    EXPECT_EQ(HST_GetParent(h, c), n) << HST_GetKey(h, c);
    if (i > 0) {
      EXPECT_LT(std::strcmp(HST_GetKey(h, HST_GetChild(h, n, i - 1)), HST_GetKey(h, c)), 0);
    }
    EXPECT_GE(HSTAA_GetSubtreeValCount(t, c), 0) << HST_GetKey(h, c);
    sum += HSTAA_GetSubtreeValCount(t, c);
    nodes += CheckNode(t, c, valueIsHeld);
  }
  if (valueIsHeld) {
    EXPECT_EQ(HSTAA_GetSubtreeValCount(t, n), static_cast<int64_t>(HST_GetVal(h, n)) + sum)
        << "at [" << HST_GetKey(h, n) << "]";
  } else {
    EXPECT_GE(HSTAA_GetSubtreeValCount(t, n), sum) << "at [" << HST_GetKey(h, n) << "]";
  }
  return nodes;
}
inline void CheckTree(HstaaTree *t, bool valueIsHeld) {
  int32_t nodes = CheckNode(t, HST_GetRoot(&t->hst), valueIsHeld);
  EXPECT_EQ(nodes, HST_GetSize(&t->hst));
}

}  // namespace hstaa_test

#endif
