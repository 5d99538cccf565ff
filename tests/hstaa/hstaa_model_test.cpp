// Differential test: a plain reference tree (std::map children, values and
// "values held" per node) driven side by side with the library through
// thousands of random insertions, removals, propagations and lookups.
// After every call both trees must agree on every key, value and count, on
// the node returned, on the values released and on the callback calls.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <map>
#include <memory>
#include <ostream>
#include <random>
#include <string>
#include <vector>

#include "hstaa_fixture.h"
#include "support/test_pool.h"

using hstaa_test::Behaviour;
using hstaa_test::Dump;
using hstaa_test::TestTree;

namespace {

using Path = std::vector<std::string>;

// ---- the reference model ----------------------------------------------------

struct MNode {
  std::string key;
  CofferVal val = 0;
  int held = 0;  // accepted insertions less accepted removals, at this node
  MNode *parent = nullptr;
  std::map<std::string, std::unique_ptr<MNode>> kids;  // byte order, as strcmp
};

// The array a key is an element of: "#", "##", or "" for none.
std::string MarkOf(const std::string &k) {
  if (k.size() >= 3 && k[0] == '#' && k[1] == '#') return "##";
  if (k.size() >= 2 && k[0] == '#' && k[1] != '#') return "#";
  return "";
}
bool IsMark(const std::string &k) { return k == "#" || k == "##"; }

struct Model {
  Behaviour *b;
  CofferVal defaultVal;
  MNode root;
  int nodes = 1;
  std::vector<CofferVal> released;
  long insertCalls = 0, removeCalls = 0, cloneCalls = 0;

  Model(Behaviour *behaviour, CofferVal dv) : b(behaviour), defaultVal(dv) { root.val = dv; }

  static int Count(const MNode *n) {
    int c = n->held;
    for (auto &k : n->kids) c += Count(k.second.get());
    return c;
  }
  static MNode *Child(MNode *n, const std::string &k) {
    auto it = n->kids.find(k);
    return it == n->kids.end() ? nullptr : it->second.get();
  }
  MNode *Add(MNode *parent, const std::string &k, CofferVal v) {
    auto n = std::make_unique<MNode>();
    n->key = k;
    n->val = v;
    n->parent = parent;
    MNode *raw = n.get();
    parent->kids[k] = std::move(n);
    nodes++;
    return raw;
  }
  void ReleaseAll(MNode *n) {
    released.push_back(n->val);
    nodes--;
    for (auto &k : n->kids) ReleaseAll(k.second.get());
  }
  void Drop(MNode *n) {
    ReleaseAll(n);
    n->parent->kids.erase(n->key);
  }

  // Copies of the source's values in preorder; false at the first refused
  // copy, with the copies made before it in *vals.
  bool CopyValues(const MNode *src, std::vector<CofferVal> *vals) {
    CofferVal v = defaultVal;
    if (src->val != defaultVal) {
      cloneCalls++;
      if (!hstaa_test::CloneRule(*b, src->val, &v)) return false;
    }
    vals->push_back(v);
    for (auto &k : src->kids)
      if (!CopyValues(k.second.get(), vals)) return false;
    return true;
  }
  void Build(const MNode *src, MNode *dst, std::vector<CofferVal>::const_iterator *v) {
    dst->val = *(*v)++;
    dst->held = src->held;
    for (auto &k : src->kids) Build(k.second.get(), Add(dst, k.first, 0), v);
  }
  MNode *Clone(const MNode *rep, const std::string &key, MNode *parent) {
    std::vector<CofferVal> vals;
    if (!CopyValues(rep, &vals)) {
      released.insert(released.end(), vals.begin(), vals.end());
      return nullptr;
    }
    MNode *copy = Add(parent, key, 0);
    auto it = vals.cbegin();
    Build(rep, copy, &it);
    return copy;
  }

  MNode *Insert(MNode *node, const Path &p, size_t i, CofferVal val) {
    MNode *made = nullptr;
    for (; i < p.size(); i++) {
      const std::string &k = p[i];
      MNode *child = Child(node, k);
      if (!child && !MarkOf(k).empty()) {
        if (MNode *rep = Child(node, MarkOf(k))) {
          child = Clone(rep, k, node);
          if (!child) return nullptr;
        }
      }
      if (!child) {
        child = Add(node, k, defaultVal);
        if (!made) made = child;
      }
      if (IsMark(k)) Propagate(0, node, k, p, i + 1, val);
      node = child;
    }
    CofferVal out = node->val;
    insertCalls++;
    if (hstaa_test::InsertRule(*b, node->val, val, &out)) {
      node->val = out;
      node->held++;
      return node;
    }
    if (made && Count(made) == 0) Drop(made);
    return nullptr;
  }

  void Remove(MNode *node, const Path &p, size_t i, CofferVal val) {
    if (i == p.size()) {
      CofferVal out = node->val;
      removeCalls++;
      if (hstaa_test::RemoveRule(*b, node->val, val, &out)) {
        node->val = out;
        node->held--;
      }
      return;
    }
    const std::string &k = p[i];
    MNode *child = Child(node, k);
    if (!child) return;
    if (IsMark(k)) Propagate(1, node, k, p, i + 1, val);
    Remove(child, p, i + 1, val);
    int n = Count(child);
    bool prune = n == 0;
    if (!prune && !MarkOf(k).empty()) {
      MNode *rep = Child(node, MarkOf(k));
      prune = rep && Count(rep) == n;
    }
    if (prune) Drop(child);
  }

  bool Propagate(int mode, MNode *parent, const std::string &mark, const Path &p, size_t i,
                 CofferVal val) {
    if (!IsMark(mark) || !Child(parent, mark)) return true;
    std::string at = mark;
    for (;;) {
      auto it = parent->kids.upper_bound(at);
      if (it == parent->kids.end() || MarkOf(it->first) != mark) return true;
      at = it->first;
      MNode *e = it->second.get();
      if (mode == 0) {
        if (!Insert(e, p, i, val)) return false;
      } else if (mode == 1) {
        Remove(e, p, i, val);
        if (Count(e) == 0) Drop(e);
      }
    }
  }

  std::pair<MNode *, bool> FindPrefix(MNode *node, const Path &p) {
    for (const std::string &k : p) {
      MNode *child = Child(node, k);
      if (!child && !MarkOf(k).empty()) child = Child(node, MarkOf(k));
      if (!child) return {node, false};
      node = child;
    }
    return {node, true};
  }

  void DumpNode(const MNode *n, int depth, std::string *out) const {
    *out += std::string(2 * depth, ' ') + "[" + n->key + "] " + std::to_string(n->val) + " #" +
            std::to_string(Count(n)) + "\n";
    for (auto &k : n->kids) DumpNode(k.second.get(), depth + 1, out);
  }
  std::string Dump() const {
    std::string s;
    DumpNode(&root, 0, &s);
    return s;
  }
};

// ---- paths -------------------------------------------------------------------

// The components a relative path text names: split at every separator, a
// separator at the very end adding no empty component.
Path Split(const std::string &text) {
  Path p;
  if (text.empty()) return p;
  size_t start = 0;
  for (;;) {
    size_t at = text.find('/', start);
    if (at == std::string::npos) {
      p.push_back(text.substr(start));
      return p;
    }
    p.push_back(text.substr(start, at - start));
    start = at + 1;
    if (start == text.size()) return p;
  }
}

Path PathOf(const MNode *n) {
  Path p;
  for (; n->parent; n = n->parent) p.insert(p.begin(), n->key);
  return p;
}
Path PathOf(HstaaTree *t, HstNode *n) {
  Path p;
  for (; HST_GetParent(&t->hst, n); n = HST_GetParent(&t->hst, n))
    p.insert(p.begin(), HST_GetKey(&t->hst, n));
  return p;
}
HstNode *NodeAt(HstaaTree *t, const Path &p) {
  HstNode *n = HST_GetRoot(&t->hst);
  for (const std::string &k : p) n = n ? HST_FindChild(&t->hst, n, k.c_str()) : nullptr;
  return n;
}
void Collect(MNode *n, std::vector<MNode *> *all) {
  all->push_back(n);
  for (auto &k : n->kids) Collect(k.second.get(), all);
}

// ---- the driver --------------------------------------------------------------

struct Config {
  const char *name;
  CofferVal defaultVal;
  Behaviour behaviour;
};

void PrintTo(const Config &c, std::ostream *os) { *os << c.name; }

class HstaaModel : public ::testing::TestWithParam<Config> {};

const char *const kKeys[] = {"a", "b", "", "#", "##", "#1", "#2", "#!", "# ", "##1", "###", "#a"};

std::string RandomText(std::mt19937 &rng, int maxDepth) {
  // Marks and element keys twice as likely as plain names.
  std::uniform_int_distribution<int> depth(0, maxDepth), key(0, 19), coin(0, 4);
  std::string s;
  int d = depth(rng);
  for (int i = 0; i < d; i++) {
    int k = key(rng);
    if (i) s += '/';
    s += kKeys[k < 12 ? k : 3 + (k - 12)];
  }
  if (d && coin(rng) == 0) s += '/';
  return s;
}

TEST_P(HstaaModel, AgreesWithReferenceTree) {
  const Config &cfg = GetParam();
  for (unsigned seed = 1; seed <= 4; seed++) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    coffer_test::TestPool pool;
    {
      TestTree tt(pool.pool(), cfg.defaultVal, '/', 1, 2);
      ASSERT_TRUE(tt.ok);
      tt.behaviour = cfg.behaviour;
      Model m(&tt.behaviour, cfg.defaultVal);
      std::mt19937 rng(seed);
      std::uniform_int_distribution<int> opDist(0, 99), operand(1, 6), modeDist(0, 2);
      for (int step = 0; step < 1500; step++) {
        const int op = opDist(rng);
        const CofferVal v = operand(rng);
        tt.ResetCalls();
        m.released.clear();
        m.insertCalls = m.removeCalls = m.cloneCalls = 0;
        std::string what;

        // The node a relative call starts from: any node of the tree.
        std::vector<MNode *> all;
        Collect(&m.root, &all);
        MNode *start = all[std::uniform_int_distribution<size_t>(0, all.size() - 1)(rng)];
        HstNode *hstart = NodeAt(&tt.t, PathOf(start));
        ASSERT_NE(hstart, nullptr);

        std::string text = RandomText(rng, 4);
        const bool useNull = text.empty() && (step & 1);
        char buf[64];
        std::snprintf(buf, sizeof buf, "%s", text.c_str());
        char *arg = useNull ? nullptr : buf;

        if (op < 38) {
          std::string abs = (step % 7 ? "/" : "x") + text;
          what = "insert " + abs + " " + std::to_string(v);
          HstNode *got = HSTAA_Insert(&tt.t, abs.c_str(), v);
          MNode *want = m.Insert(&m.root, Split(text), 0, v);
          ASSERT_EQ(got != nullptr, want != nullptr) << what;
          if (got) {
            EXPECT_EQ(PathOf(&tt.t, got), PathOf(want)) << what;
          }
        } else if (op < 72) {
          std::string abs = "/" + text;
          what = "remove " + abs + " " + std::to_string(v);
          EXPECT_TRUE(HSTAA_Remove(&tt.t, abs.c_str(), v));
          m.Remove(&m.root, Split(text), 0, v);
        } else if (op < 82) {
          std::string abs = "/" + text;
          what = "find " + abs;
          bool complete = false;
          HstNode *got = HSTAA_FindPrefix(&tt.t, abs.c_str(), &complete);
          auto want = m.FindPrefix(&m.root, Split(text));
          ASSERT_NE(got, nullptr);
          EXPECT_EQ(PathOf(&tt.t, got), PathOf(want.first)) << what;
          EXPECT_EQ(complete, want.second) << what;
          HstNode *rel = HSTAAFindPrefix(&tt.t, hstart, arg, &complete);
          want = m.FindPrefix(start, Split(text));
          EXPECT_EQ(PathOf(&tt.t, rel), PathOf(want.first)) << what << " below";
          EXPECT_EQ(complete, want.second) << what << " below";
        } else if (op < 88) {
          what = "insert below " + std::to_string(PathOf(start).size()) + ": " + text;
          HstNode *got = HSTAAInsert(&tt.t, hstart, arg, v);
          MNode *want = m.Insert(start, Split(text), 0, v);
          ASSERT_EQ(got != nullptr, want != nullptr) << what;
          if (got) {
            EXPECT_EQ(PathOf(&tt.t, got), PathOf(want)) << what;
          }
          EXPECT_STREQ(buf, text.c_str());
        } else if (op < 94) {
          what = "remove below: " + text;
          HSTAARemove(&tt.t, hstart, arg, v);
          m.Remove(start, Split(text), 0, v);
          EXPECT_STREQ(buf, text.c_str());
        } else {
          // Direct propagation from a template of the tree, if there is one.
          std::vector<MNode *> reps;
          for (MNode *n : all)
            if (n->parent && IsMark(n->key)) reps.push_back(n);
          if (reps.empty()) continue;
          MNode *rep = reps[std::uniform_int_distribution<size_t>(0, reps.size() - 1)(rng)];
          const int mode = modeDist(rng);
          what = "propagate " + std::to_string(mode) + " " + rep->key + " / " + text;
          bool got = HSTAAPropagateVal(&tt.t, mode, NodeAt(&tt.t, PathOf(rep->parent)),
                                       NodeAt(&tt.t, PathOf(rep)), arg, v);
          bool want = m.Propagate(mode, rep->parent, rep->key, Split(text), 0, v);
          EXPECT_EQ(got, want) << what;
          EXPECT_STREQ(buf, text.c_str());
        }

        ASSERT_EQ(Dump(&tt.t), m.Dump()) << "after step " << step << ": " << what;
        ASSERT_EQ(HST_GetSize(tt.h()), m.nodes) << what;
        std::sort(tt.released.begin(), tt.released.end());
        std::sort(m.released.begin(), m.released.end());
        ASSERT_EQ(tt.released, m.released) << what;
        ASSERT_EQ(tt.insertCalls, m.insertCalls) << what;
        ASSERT_EQ(tt.removeCalls, m.removeCalls) << what;
        ASSERT_EQ(tt.cloneCalls, m.cloneCalls) << what;
      }
    }
    EXPECT_EQ(pool.liveBlocks(), 0u);
  }
}

Behaviour Make(Behaviour::Insert ins, Behaviour::Remove rem, std::set<CofferVal> refuseOps,
               std::set<CofferVal> refuseCur, std::set<CofferVal> refuseClone) {
  Behaviour b;
  b.insert = ins;
  b.remove = rem;
  b.refuseOperands = refuseOps;
  b.refuseCurrent = refuseCur;
  b.refuseClone = refuseClone;
  return b;
}

INSTANTIATE_TEST_SUITE_P(
    Callbacks, HstaaModel,
    ::testing::Values(
        Config{"accepting", 0, Make(Behaviour::kReplace, Behaviour::kIfEqual, {}, {}, {})},
        Config{"refusing", 0, Make(Behaviour::kReplace, Behaviour::kIfEqual, {4}, {6}, {5})},
        Config{"default100", 100, Make(Behaviour::kReplace, Behaviour::kIfEqual, {2}, {}, {3})},
        Config{"counting", 0, Make(Behaviour::kIncrement, Behaviour::kDecrement, {}, {3}, {})}),
    [](const ::testing::TestParamInfo<Config> &info) { return std::string(info.param.name); });

}  // namespace
