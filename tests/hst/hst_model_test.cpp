// Randomized comparison of the string tree with a plain model tree: after
// every step the whole tree (names, order, values, counts, parent links,
// size) and the exact sequence of released values must agree.
#include <algorithm>
#include <memory>
#include <random>

#include "hst_check.h"

namespace {

using coffer_test::Released;
using coffer_test::ReleasedPools;
using coffer_test::TestPool;
using hst_test::Script;

constexpr CofferVal kDefault = 0xDEF0;

struct M {
  std::string key;
  CofferVal val = 0;
  int32_t svc = 0;
  M *parent = nullptr;
  std::vector<std::unique_ptr<M>> kids;  // strcmp order, equal names in insertion order
};

// A child found by name the way the tree's bisection finds it, so that
// duplicate names resolve to the same sibling.
M *MFind(M *node, const std::string &name) {
  int lo = 0, hi = static_cast<int>(node->kids.size()) - 1;
  while (lo <= hi) {
    int mid = (lo + hi) / 2;
    int c = std::strcmp(name.c_str(), node->kids[mid]->key.c_str());
    if (c == 0) return node->kids[mid].get();
    if (c > 0)
      lo = mid + 1;
    else
      hi = mid - 1;
  }
  return nullptr;
}

M *MAttach(M *parent, std::unique_ptr<M> child) {
  auto pos = std::upper_bound(parent->kids.begin(), parent->kids.end(), child,
                              [](const std::unique_ptr<M> &a, const std::unique_ptr<M> &b) {
                                return std::strcmp(a->key.c_str(), b->key.c_str()) < 0;
                              });
  child->parent = parent;
  return parent->kids.insert(pos, std::move(child))->get();
}

M *MInsertChild(M *parent, const std::string &key, CofferVal val) {
  auto child = std::make_unique<M>();
  child->key = key;
  child->val = val;
  return MAttach(parent, std::move(child));
}

// The names a path walks through, read independently of the tree's walk.
std::vector<std::string> Split(const std::string &path, char sep) {
  std::vector<std::string> names;
  std::string rest = path.substr(1);
  if (rest.empty()) return names;
  size_t start = 0;
  for (;;) {
    size_t at = rest.find(sep, start);
    if (at == std::string::npos) {
      names.push_back(rest.substr(start));
      return names;
    }
    names.push_back(rest.substr(start, at - start));
    if (at + 1 == rest.size()) return names;  // a trailing separator ends the walk
    start = at + 1;
  }
}

M *MWalk(M *root, const std::string &path, char sep, bool create) {
  M *node = root;
  for (const std::string &name : Split(path, sep)) {
    M *child = MFind(node, name);
    if (!child && create) child = MInsertChild(node, name, kDefault);
    if (!child) return nullptr;
    node = child;
  }
  return node;
}

int32_t MRelease(M *node, std::vector<CofferVal> *log) {
  int32_t n = 1;
  for (auto &kid : node->kids) n += MRelease(kid.get(), log);
  log->push_back(node->val);
  return n;
}

void MClear(M *root, std::vector<CofferVal> *log) {
  for (auto &kid : root->kids) MRelease(kid.get(), log);
  log->push_back(root->val);
  root->kids.clear();
  root->val = kDefault;
  root->svc = 0;
}

std::unique_ptr<M> MCopy(const M *src, size_t *made) {
  auto copy = std::make_unique<M>();
  copy->key = src->key;
  copy->svc = src->svc;
  copy->val = kDefault;
  if (src->val != kDefault) {
    const auto &calls = Script().made;
    EXPECT_LT(*made, calls.size());
    if (*made < calls.size()) {
      EXPECT_EQ(calls[*made].first, src->val) << "clone callback called out of order";
      copy->val = calls[(*made)++].second;
    }
  }
  for (const auto &kid : src->kids) {
    auto k = MCopy(kid.get(), made);
    k->parent = copy.get();
    copy->kids.push_back(std::move(k));
  }
  return copy;
}

int32_t MCountVals(const M *node) {
  int32_t n = node->val != kDefault;
  for (const auto &kid : node->kids) n += MCountVals(kid.get());
  return n;
}

// Parallel walk; collects both trees' nodes in preorder for random picks.
bool Compare(HstTree *tree, HstNode *node, const M *m, std::vector<HstNode *> *hs,
             std::vector<M *> *ms) {
  hs->push_back(node);
  ms->push_back(const_cast<M *>(m));
  const int32_t n = HST_GetNumChildren(tree, node);
  if (m->key != HST_GetKey(tree, node) || m->val != HST_GetVal(tree, node) ||
      m->svc != node->subtreeValCount || n != static_cast<int32_t>(m->kids.size())) {
    ADD_FAILURE() << "node '" << HST_GetKey(tree, node) << "' differs from model '" << m->key
                  << "': val " << HST_GetVal(tree, node) << "/" << m->val << " count "
                  << node->subtreeValCount << "/" << m->svc << " children " << n << "/"
                  << m->kids.size();
    return false;
  }
  EsaArray kids = hst_test::ChildArray(tree, node);
  for (int32_t i = 0; i < n; i++) {
    HstNode *child = HST_GetChild(tree, node, i);
    if (!child || HST_GetParent(tree, child) != node ||
        std::strcmp(ESA_GetKey(&kids, i), HST_GetKey(tree, child)) != 0) {
      ADD_FAILURE() << "bad child link under '" << m->key << "' at " << i;
      return false;
    }
    if (!Compare(tree, child, m->kids[i].get(), hs, ms)) return false;
  }
  return true;
}

class Random {
 public:
  explicit Random(unsigned seed) : gen_(seed) {}
  int Below(int n) { return std::uniform_int_distribution<int>(0, n - 1)(gen_); }
  bool Chance(int percent) { return Below(100) < percent; }

 private:
  std::mt19937 gen_;
};

const char *const kNames[] = {"", "a", "b", "ab", "B", "\xc3\xa9", "zz"};

std::string RandomName(Random *rnd) { return kNames[rnd->Below(7)]; }

std::string RandomPath(Random *rnd, char sep) {
  std::string path(1, rnd->Chance(80) ? sep : 'x');  // the first character is not examined
  int depth = rnd->Below(5);
  for (int i = 0; i < depth; i++) {
    if (i > 0) path += sep;
    path += RandomName(rnd);
  }
  if (depth > 0 && rnd->Chance(15)) path += sep;
  return path;
}

struct Run {
  TestPool tp;
  HstTree *tree = nullptr;
  M root;
  char sep;
  bool mpCallback;
  CofferVal nextVal = 1;
  std::vector<CofferVal> expected;  // releases the model predicts for this step
  std::vector<HstNode *> hs;
  std::vector<M *> ms;

  Run(char separator, bool mp) : sep(separator), mpCallback(mp) {
    tree = HST_AllocTreeEx(tp.pool(), sep, kDefault, 1, 2);
    if (mp)
      HST_SetMpFreeValFn(tree, coffer_test::RecordMpRelease);
    else
      HST_SetFreeValFn(tree, coffer_test::RecordRelease);
    root.val = kDefault;
  }

  int32_t ModelSize() { return static_cast<int32_t>(ms.size()); }

  void Sync(const std::string &step) {
    hs.clear();
    ms.clear();
    ASSERT_TRUE(Compare(tree, HST_GetRoot(tree), &root, &hs, &ms)) << step;
    ASSERT_EQ(HST_GetSize(tree), ModelSize()) << step;
    ASSERT_EQ(Released(), expected) << step;
    for (MemPool *p : ReleasedPools()) ASSERT_EQ(p, mpCallback ? &tree->mp : nullptr) << step;
    Released().clear();
    ReleasedPools().clear();
    expected.clear();
  }

  std::string Step(Random *rnd) {
    const int pick = rnd->Below(100);
    const int at = rnd->Below(ModelSize());
    HstNode *hnode = hs[at];
    M *mnode = ms[at];
    const bool big = ModelSize() > 250;
    if (pick < 30 && !big) {
      std::string path = RandomPath(rnd, sep);
      CofferVal val = rnd->Chance(10) ? kDefault : nextVal++;
      const std::string before = path;
      HstNode *got = HST_Insert(tree, path.c_str(), val);
      EXPECT_EQ(path, before);
      M *want = MWalk(&root, path, sep, true);
      want->val = val;
      EXPECT_NE(got, nullptr);
      if (got) {
        EXPECT_EQ(HST_GetKey(tree, got), want->key);
      }
      return "insert " + path;
    }
    if (pick < 38 && !big) {
      std::string key = rnd->Chance(20) ? std::string("x") + sep + "y" : RandomName(rnd);
      CofferVal val = nextVal++;
      EXPECT_NE(HST_InsertChild(tree, hnode, key.c_str(), val), nullptr);
      MInsertChild(mnode, key, val);
      return "insert child " + key + " under " + mnode->key;
    }
    if (pick < 48) {
      std::string path = RandomPath(rnd, sep);
      HstNode *got = HST_Find(tree, path.c_str());
      M *want = MWalk(&root, path, sep, false);
      EXPECT_EQ(got == nullptr, want == nullptr) << path;
      // Both trees are in step, so the preorder positions must match.
      if (got && want) {
        auto h = std::find(hs.begin(), hs.end(), got) - hs.begin();
        auto m = std::find(ms.begin(), ms.end(), want) - ms.begin();
        EXPECT_EQ(h, m) << path;
      }
      return "find " + path;
    }
    if (pick < 56 || big) {
      HST_RemoveSubtree(tree, hnode);
      if (mnode == &root) {
        MClear(&root, &expected);
      } else {
        MRelease(mnode, &expected);
        auto &sibs = mnode->parent->kids;
        sibs.erase(std::find_if(sibs.begin(), sibs.end(),
                                [&](const std::unique_ptr<M> &k) { return k.get() == mnode; }));
      }
      return "remove " + std::to_string(at);
    }
    if (pick < 71) {
      const int dst = rnd->Below(ModelSize());
      std::string newKey = RandomName(rnd);
      const bool renamed = rnd->Chance(50);
      const int32_t vals = MCountVals(mnode);
      hst_test::ResetLogs();
      const bool fail = vals > 0 && rnd->Chance(25);
      if (fail) Script().failAt = rnd->Below(vals);
      HstNode *got = HST_CloneSubtree(tree, hnode, hst_test::ScriptedClone,
                                      renamed ? newKey.c_str() : nullptr, hs[dst]);
      EXPECT_EQ(Script().calls, fail ? Script().failAt + 1 : vals);
      if (fail) {
        EXPECT_EQ(got, nullptr);
        // Everything copied so far goes back, each value once; defaultVal
        // goes once for every copied node that held it.
        std::vector<CofferVal> made, back;
        for (auto &c : Script().made) made.push_back(c.second);
        for (CofferVal v : Released())
          if (v != kDefault) back.push_back(v);
        std::sort(made.begin(), made.end());
        std::sort(back.begin(), back.end());
        EXPECT_EQ(back, made);
        Released().clear();
        ReleasedPools().clear();
        return "failed clone";
      }
      EXPECT_NE(got, nullptr);
      size_t used = 0;
      auto copy = MCopy(mnode, &used);
      EXPECT_EQ(used, Script().made.size());
      if (renamed) copy->key = newKey;
      MAttach(ms[dst], std::move(copy));
      return "clone " + std::to_string(at) + " under " + std::to_string(dst);
    }
    if (pick < 72) {
      HST_Clear(tree);
      MClear(&root, &expected);
      return "clear";
    }
    if (pick < 86) {
      CofferVal val = nextVal++;
      HST_SetVal(tree, hnode, val);
      mnode->val = val;
      return "set";
    }
    const int32_t delta = rnd->Below(7) - 3;
    HSTAAAdjustSubtreeValCount(tree, hnode, delta);
    if (delta)
      for (M *m = mnode; m; m = m->parent) m->svc += delta;
    return "adjust";
  }
};

void RunSeed(unsigned seed, char sep, bool mp) {
  hst_test::ResetLogs();
  Random rnd(seed);
  Run run(sep, mp);
  ASSERT_NE(run.tree, nullptr);
  run.Sync("start");
  for (int i = 0; i < 2500; i++) {
    std::string step = run.Step(&rnd);
    run.Sync("step " + std::to_string(i) + ": " + step);
    if (::testing::Test::HasFailure()) return;
  }
  HST_FreeTree(run.tree);
  MClear(&run.root, &run.expected);
  EXPECT_EQ(Released(), run.expected);
  EXPECT_EQ(run.tp.liveBlocks(), 0u);
}

TEST(HstModel, RandomSlashSeparatorFreeValFn) {
  for (unsigned seed = 1; seed <= 4; seed++) {
    SCOPED_TRACE(seed);
    RunSeed(seed, '/', false);
  }
}

TEST(HstModel, RandomDotSeparatorMpFreeValFn) {
  for (unsigned seed = 11; seed <= 14; seed++) {
    SCOPED_TRACE(seed);
    RunSeed(seed, '.', true);
  }
}

}  // namespace
