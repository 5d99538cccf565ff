// An associative-array tree for tests: value callbacks driven by a small rule
// set that log every call and every release in order, and readers that dump
// the tree and check its links, key order and value counts.
#ifndef COFFER_TESTS_HSTAA_FIXTURE_H
#define COFFER_TESTS_HSTAA_FIXTURE_H

#include <coffer/hstaa.h>
#include <gtest/gtest.h>

#include <cstring>
#include <set>
#include <sstream>
#include <string>
#include <vector>

namespace hstaa_test {

// Counting: insert gives cur + 1, remove cur - 1 (refused at 0), so a node's
// value is the number of values it holds. Otherwise insert replaces by the
// operand and remove accepts only the value held, leaving 0.
struct Behaviour {
  bool counting = false;
  std::set<CofferVal> refuseOperands, refuseCurrent, refuseClone;
};

// One callback: I(nsert) and R(emove) of op at cur, C(lone) of cur. Logged as
// "I<cur>,<op>", "R<cur>,<op>", "C<cur>"; a release as "F<value>".
inline bool Apply(const Behaviour &b, char what, CofferVal cur, CofferVal op, CofferVal *out,
                  std::vector<std::string> *log) {
  log->push_back(what + std::to_string(cur) + (what == 'C' ? "" : "," + std::to_string(op)));
  if (what == 'C') {
    if (b.refuseClone.count(cur)) return false;
    *out = cur;
  } else if (what == 'R') {
    if (b.counting ? cur == 0 : cur != op) return false;
    *out = b.counting ? cur - 1 : 0;
  } else {
    if (b.refuseOperands.count(op) || b.refuseCurrent.count(cur)) return false;
    *out = b.counting ? cur + 1 : op;
  }
  return true;
}

struct TestTree {
  HstaaTree t;  // first: the callbacks find the TestTree from the handle
  Behaviour behaviour;
  std::vector<std::string> log;

  explicit TestTree(MemPool *pool, CofferVal defaultVal = 0, char sep = '/', int32_t cap = 2) {
    std::memset(&t, 0, sizeof t);
    t.hst.mp = *pool;
    t.cloneValFn = [](HstTree *h, CofferVal v, CofferVal *out) {
      return Of(h)->Call('C', v, 0, out);
    };
    t.insertValFn = [](HstaaTree *h, CofferVal cur, CofferVal op, CofferVal *out) {
      EXPECT_EQ(*out, cur);  // handed the node's current value
      return Of(h)->Call('I', cur, op, out);
    };
    t.removeValFn = [](HstaaTree *h, CofferVal cur, CofferVal op, CofferVal *out) {
      EXPECT_EQ(*out, cur);
      return Of(h)->Call('R', cur, op, out);
    };
    HST_SetMpFreeValFn(&t.hst, [](MemPool *p, CofferVal v) {
      Of(p)->log.push_back("F" + std::to_string(v));
    });
    EXPECT_TRUE(HST_CreateTreeData(&t.hst, sep, defaultVal, cap, 2));
  }
  ~TestTree() { HST_FreeTree(&t.hst); }

  static TestTree *Of(void *handle) { return reinterpret_cast<TestTree *>(handle); }
  bool Call(char what, CofferVal cur, CofferVal op, CofferVal *out) {
    return Apply(behaviour, what, cur, op, out, &log);
  }
  HstTree *h() { return &t.hst; }
  HstNode *root() { return HST_GetRoot(&t.hst); }
  HstNode *Find(const char *path) { return HST_Find(&t.hst, path); }
};

// Checks written as "path=value:count", "path:count" or "path!" (no node).
inline void Expect(TestTree *tt, const std::string &checks) {
  std::istringstream in(checks);
  for (std::string tok; in >> tok;) {
    SCOPED_TRACE(tok);
    const size_t colon = tok.rfind(':'), eq = tok.find('=');
    HstNode *n = tt->Find(tok.substr(0, std::min({eq, colon, tok.size() - 1})).c_str());
    if (tok.back() == '!') {
      EXPECT_EQ(n, nullptr);
      continue;
    }
    ASSERT_NE(n, nullptr);
    EXPECT_EQ(HSTAA_GetSubtreeValCount(&tt->t, n), std::stoi(tok.substr(colon + 1)));
    if (eq != std::string::npos) {
      EXPECT_EQ(HST_GetVal(tt->h(), n), std::stoul(tok.substr(eq + 1)));
    }
  }
}

// One line per node in preorder (children in key order): key, value, count.
inline std::string Dump(HstaaTree *t, HstNode *n = nullptr, int depth = 0) {
  if (!n) n = HST_GetRoot(&t->hst);
  std::string s = std::string(2 * depth, ' ') + "[" + HST_GetKey(&t->hst, n) + "] " +
                  std::to_string(HST_GetVal(&t->hst, n)) + " #" +
                  std::to_string(HSTAA_GetSubtreeValCount(t, n)) + "\n";
  for (int32_t i = 0; i < HST_GetNumChildren(&t->hst, n); i++)
    s += Dump(t, HST_GetChild(&t->hst, n, i), depth + 1);
  return s;
}

// Parent links, strictly ascending sibling keys, and every count at least the
// sum of its children's (exactly the node's own value plus that sum when the
// values count what a node holds). Returns the number of nodes.
inline int32_t CheckNode(HstaaTree *t, HstNode *n, bool counting) {
  HstTree *h = &t->hst;
  int32_t nodes = 1, own = HSTAA_GetSubtreeValCount(t, n);
  for (int32_t i = 0; i < HST_GetNumChildren(h, n); i++) {
    HstNode *c = HST_GetChild(h, n, i);
    EXPECT_EQ(HST_GetParent(h, c), n);
    const char *prev = i ? HST_GetKey(h, HST_GetChild(h, n, i - 1)) : nullptr;
    EXPECT_TRUE(!prev || std::strcmp(prev, HST_GetKey(h, c)) < 0);
    own -= HSTAA_GetSubtreeValCount(t, c);
    nodes += CheckNode(t, c, counting);
  }
  EXPECT_GE(own, 0) << HST_GetKey(h, n);
  EXPECT_TRUE(!counting || static_cast<CofferVal>(own) == HST_GetVal(h, n)) << HST_GetKey(h, n);
  return nodes;
}
inline void CheckTree(HstaaTree *t, bool counting) {
  EXPECT_EQ(CheckNode(t, HST_GetRoot(&t->hst), counting), HST_GetSize(&t->hst));
}

}  // namespace hstaa_test

#endif
