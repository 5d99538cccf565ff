// Differential test: a plain reference tree (std::map children, values held
// per node) driven side by side with the library through random insertions,
// removals, propagations and lookups, absolute and relative. After every call
// both must agree on the whole tree (keys, values, counts), the node returned,
// the node count, the path text, and the exact sequence of callback calls and
// releases.
#include <gtest/gtest.h>

#include <cstdio>
#include <map>
#include <memory>
#include <random>

#include "hstaa_fixture.h"
#include "support/test_pool.h"

using hstaa_test::Behaviour;
using hstaa_test::Apply;
using hstaa_test::TestTree;

namespace {

using Path = std::vector<std::string>;

struct MNode {
  std::string key;
  CofferVal val = 0;
  int held = 0;  // accepted insertions less accepted removals at this node
  MNode *parent = nullptr;
  std::map<std::string, std::unique_ptr<MNode>> kids;  // byte order, as strcmp
};

// The array a key is an element of: "#", "##", or "" for none.
std::string MarkOf(const std::string &k) {
  if (k.size() >= 3 && k[0] == '#' && k[1] == '#') return "##";
  return k.size() >= 2 && k[0] == '#' && k[1] != '#' ? "#" : "";
}
bool IsMark(const std::string &k) { return k == "#" || k == "##"; }

struct Model {
  const Behaviour &b;
  CofferVal dv;
  MNode root;
  std::vector<std::string> log;

  Model(const Behaviour &behaviour, CofferVal defaultVal) : b(behaviour), dv(defaultVal) {
    root.val = dv;
  }
  // The values held in n's subtree, or with nodes set its number of nodes.
  static int Count(const MNode *n, bool nodes = false) {
    int c = nodes ? 1 : n->held;
    for (auto &k : n->kids) c += Count(k.second.get(), nodes);
    return c;
  }
  static MNode *Child(MNode *n, const std::string &k) {
    auto it = n->kids.find(k);
    return it == n->kids.end() ? nullptr : it->second.get();
  }
  static MNode *Attach(MNode *parent, std::unique_ptr<MNode> n, const std::string &key) {
    n->key = key;
    n->parent = parent;
    return (parent->kids[key] = std::move(n)).get();
  }
  // Children in key order, each before its parent, as the tree releases.
  void Release(const MNode *n) {
    for (auto &k : n->kids) Release(k.second.get());
    log.push_back("F" + std::to_string(n->val));
  }
  void Drop(MNode *n) {
    Release(n);
    n->parent->kids.erase(n->key);
  }
  // A copy built parent first; a refused value releases the partial copy.
  std::unique_ptr<MNode> Clone(const MNode *src) {
    auto n = std::make_unique<MNode>();
    n->val = dv;
    n->held = src->held;
    if (src->val != dv && !Apply(b, 'C', src->val, 0, &n->val, &log)) return nullptr;
    for (auto &k : src->kids) {
      auto c = Clone(k.second.get());
      if (!c) {
        Release(n.get());
        return nullptr;
      }
      Attach(n.get(), std::move(c), k.first);
    }
    return n;
  }

  MNode *Insert(MNode *node, const Path &p, size_t i, CofferVal val) {
    MNode *made = nullptr;
    for (; i < p.size(); i++) {
      const std::string &k = p[i];
      MNode *child = Child(node, k);
      MNode *rep = child || MarkOf(k).empty() ? nullptr : Child(node, MarkOf(k));
      if (rep) {
        auto copy = Clone(rep);
        if (!copy) return nullptr;
        child = Attach(node, std::move(copy), k);
      } else if (!child) {
        child = Attach(node, std::make_unique<MNode>(), k);
        child->val = dv;
        if (!made) made = child;
      }
      if (IsMark(k)) Propagate(0, node, k, p, i + 1, val);
      node = child;
    }
    if (Apply(b, 'I', node->val, val, &node->val, &log)) {
      node->held++;
      return node;
    }
    if (made) Drop(made);
    return nullptr;
  }

  void Remove(MNode *node, const Path &p, size_t i, CofferVal val) {
    if (i == p.size()) {
      if (Apply(b, 'R', node->val, val, &node->val, &log)) node->held--;
      return;
    }
    const std::string &k = p[i];
    MNode *child = Child(node, k);
    if (!child) return;
    if (IsMark(k)) Propagate(1, node, k, p, i + 1, val);
    Remove(child, p, i + 1, val);
    const int n = Count(child);
    MNode *rep = MarkOf(k).empty() ? nullptr : Child(node, MarkOf(k));
    if (n == 0 || (rep && Count(rep) == n)) Drop(child);
  }

  bool Propagate(int mode, MNode *parent, const std::string &mark, const Path &p, size_t i,
                 CofferVal val) {
    for (std::string at = mark;;) {
      auto it = parent->kids.upper_bound(at);
      if (it == parent->kids.end() || MarkOf(it->first) != mark) return true;
      at = it->first;
      MNode *e = it->second.get();
      if (mode == 0 && !Insert(e, p, i, val)) return false;
      if (mode == 1) {
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

  static std::string Dump(const MNode *n, int depth = 0) {
    std::string s = std::string(2 * depth, ' ') + "[" + n->key + "] " + std::to_string(n->val) +
                    " #" + std::to_string(Count(n)) + "\n";
    for (auto &k : n->kids) s += Dump(k.second.get(), depth + 1);
    return s;
  }
};

// A node's path from the root; {"-"} for none.
Path PathOf(const MNode *n) {
  Path p;
  for (; n && n->parent; n = n->parent) p.insert(p.begin(), n->key);
  return n ? p : Path{"-"};
}
Path PathOf(HstaaTree *t, HstNode *n) {
  Path p;
  for (; n && HST_GetParent(&t->hst, n); n = HST_GetParent(&t->hst, n))
    p.insert(p.begin(), HST_GetKey(&t->hst, n));
  return n ? p : Path{"-"};
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

// Marks and element keys of both arrays, on either side of "##" in key order;
// the marks and elements twice as likely as plain names. The text ends with a
// separator now and then, and always when it has to name an empty key last.
const char *const kKeys[] = {"a", "", "#", "##", "#1", "#2", "#!", "# ", "##1", "###"};

std::string RandomPath(std::mt19937 &rng, Path *p) {
  std::uniform_int_distribution<int> depth(0, 3), key(0, 17), coin(0, 4);
  std::string s;
  for (int i = 0, d = depth(rng); i < d; i++) {
    const int k = key(rng);
    p->push_back(kKeys[k < 10 ? k : k - 8]);
    s += (i ? "/" : "") + p->back();
  }
  return s + (!p->empty() && (p->back().empty() || coin(rng) == 0) ? "/" : "");
}

struct Config {
  const char *name;
  CofferVal defaultVal;
  Behaviour behaviour;
};
void PrintTo(const Config &c, std::ostream *os) { *os << c.name; }
class HstaaModel : public ::testing::TestWithParam<Config> {};

TEST_P(HstaaModel, AgreesWithReferenceTree) {
  const Config &cfg = GetParam();
  for (unsigned seed = 1; seed <= 4; seed++) {
    coffer_test::TestPool pool;
    {
      TestTree tt(pool.pool(), cfg.defaultVal, '/', 1);
      tt.behaviour = cfg.behaviour;
      Model m(tt.behaviour, cfg.defaultVal);
      std::mt19937 rng(seed);
      std::uniform_int_distribution<int> opDist(0, 99), operand(1, 4), coin(0, 2);
      for (int step = 0; step < 1000; step++) {
        const int op = opDist(rng);
        const CofferVal v = operand(rng);
        const bool rel = coin(rng) == 0;  // a relative call from any node
        std::vector<MNode *> all;
        Collect(&m.root, &all);
        MNode *start = rel ? all[std::uniform_int_distribution<size_t>(0, all.size() - 1)(rng)]
                           : &m.root;
        HstNode *hstart = NodeAt(&tt.t, PathOf(start));
        Path path;
        const std::string text = RandomPath(rng, &path), abs = (step % 7 ? "/" : "x") + text;
        char buf[64];
        std::snprintf(buf, sizeof buf, "%s", text.c_str());
        char *arg = text.empty() && (step & 1) ? nullptr : buf;
        SCOPED_TRACE("seed " + std::to_string(seed) + " step " + std::to_string(step) + ": " +
                     std::to_string(op) + (rel ? " relative " : " ") + text + " " +
                     std::to_string(v));
        tt.log.clear();
        m.log.clear();
        bool whole = true;  // the path text must be as it was
        if (op < 45) {
          HstNode *got =
              rel ? HSTAAInsert(&tt.t, hstart, arg, v) : HSTAA_Insert(&tt.t, abs.c_str(), v);
          ASSERT_EQ(PathOf(&tt.t, got), PathOf(m.Insert(start, path, 0, v)));
        } else if (op < 85) {
          if (rel) {
            HSTAARemove(&tt.t, hstart, arg, v);
          } else {
            EXPECT_TRUE(HSTAA_Remove(&tt.t, abs.c_str(), v));
          }
          m.Remove(start, path, 0, v);
        } else if (op < 93) {
          bool complete = false;
          HstNode *got = rel ? HSTAAFindPrefix(&tt.t, hstart, arg, &complete)
                             : HSTAA_FindPrefix(&tt.t, abs.c_str(), &complete);
          auto want = m.FindPrefix(start, path);
          EXPECT_EQ(PathOf(&tt.t, got), PathOf(want.first));
          EXPECT_EQ(complete, want.second);
          whole = want.second;  // else the unresolved component stays cut
        } else {
          // Straight from a template: any mode, the text as the rest below it.
          std::vector<MNode *> reps;
          for (MNode *n : all)
            if (n->parent && IsMark(n->key)) reps.push_back(n);
          if (reps.empty()) continue;
          MNode *rep = reps[std::uniform_int_distribution<size_t>(0, reps.size() - 1)(rng)];
          const int mode = coin(rng);
          EXPECT_EQ(HSTAAPropagateVal(&tt.t, mode, NodeAt(&tt.t, PathOf(rep->parent)),
                                      NodeAt(&tt.t, PathOf(rep)), arg, v),
                    m.Propagate(mode, rep->parent, rep->key, path, 0, v));
        }
        if (whole) {
          EXPECT_STREQ(buf, text.c_str());
        }
        ASSERT_EQ(hstaa_test::Dump(&tt.t), Model::Dump(&m.root));
        ASSERT_EQ(HST_GetSize(tt.h()), Model::Count(&m.root, true));
        ASSERT_EQ(tt.log, m.log);
      }
      hstaa_test::CheckTree(&tt.t, cfg.behaviour.counting);
    }
    EXPECT_EQ(pool.liveBlocks(), 0u);
  }
}

// Refusing sets: insert operands, insert at values, clone values.
INSTANTIATE_TEST_SUITE_P(
    Callbacks, HstaaModel,
    ::testing::Values(Config{"accepting", 0, {false, {}, {}, {}}},
                      Config{"refusing", 0, {false, {3}, {2}, {4}}},
                      Config{"default100", 100, {false, {2}, {}, {3}}},
                      Config{"counting", 0, {true, {}, {3}, {}}}),
    [](const ::testing::TestParamInfo<Config> &info) { return std::string(info.param.name); });

}  // namespace
