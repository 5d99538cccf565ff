// Randomized comparison of the string tree with a plain model tree: after
// every step the whole tree (names, order, values, counts, size), its links
// and the exact sequence of released values must agree.
#include <algorithm>
#include <memory>
#include <random>

#include "hst_check.h"

namespace {

using coffer_test::Released;
using coffer_test::ReleasedPools;
using namespace hst_test;

struct M {
  std::string key;
  CofferVal val = kDefault;
  int32_t svc = 0;
  M *parent = nullptr;
  std::vector<std::unique_ptr<M>> kids;  // strcmp order, equal names in insertion order
};

// A child found by name the way the tree's bisection finds it, so that
// duplicate names resolve to the same sibling.
M *MFind(M *node, const std::string &name) {
  int lo = 0, hi = static_cast<int>(node->kids.size()) - 1;
  while (lo <= hi) {
    int mid = (lo + hi) / 2, c = std::strcmp(name.c_str(), node->kids[mid]->key.c_str());
    if (c == 0) return node->kids[mid].get();
    c > 0 ? lo = mid + 1 : hi = mid - 1;
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

// Walks the names of a path, read independently of the tree's walk: the
// first character skipped, a trailing separator ending the walk.
M *MWalk(M *node, const std::string &path, char sep, bool create) {
  for (size_t start = 1; start < path.size();) {
    size_t at = std::min(path.find(sep, start), path.size());
    std::string name = path.substr(start, at - start);
    M *child = MFind(node, name);
    if (!child && create) child = MInsertChild(node, name, kDefault);
    if (!child) return nullptr;
    node = child;
    start = at + 1;
  }
  return node;
}

void MRelease(M *node, V *log) {
  for (auto &kid : node->kids) MRelease(kid.get(), log);
  log->push_back(node->val);
}

void MClear(M *root, V *log) {
  MRelease(root, log);
  root->kids.clear();
  root->val = kDefault;
  root->svc = 0;
}

// The copy, with the values the clone callback handed out in call order.
std::unique_ptr<M> MCopy(const M *src, size_t *used) {
  auto copy = std::make_unique<M>(M{src->key, kDefault, src->svc, nullptr, {}});
  if (src->val != kDefault && *used < Script().made.size()) {
    EXPECT_EQ(Script().made[*used].first, src->val) << "clone callback called out of order";
    copy->val = Script().made[(*used)++].second;
  }
  for (const auto &kid : src->kids) {
    copy->kids.push_back(MCopy(kid.get(), used));
    copy->kids.back()->parent = copy.get();
  }
  return copy;
}

int32_t MCountVals(const M *node) {
  int32_t n = node->val != kDefault;
  for (const auto &kid : node->kids) n += MCountVals(kid.get());
  return n;
}

// The model in the tree's Dump format, and both trees' nodes in preorder.
void MDump(const M *m, std::string *out, std::vector<M *> *ms) {
  ms->push_back(const_cast<M *>(m));
  *out += "(" + m->key + "=" + std::to_string(m->val) + "#" + std::to_string(m->svc);
  for (const auto &kid : m->kids) MDump(kid.get(), out, ms);
  *out += ")";
}
void Preorder(HstTree *tree, HstNode *node, std::vector<HstNode *> *hs) {
  hs->push_back(node);
  for (int32_t i = 0; i < HST_GetNumChildren(tree, node); i++)
    Preorder(tree, HST_GetChild(tree, node, i), hs);
}

struct Runner {
  coffer_test::TestPool tp;
  HstTree *tree;
  M root;
  char sep;
  bool mp;
  std::mt19937 gen;
  CofferVal nextVal = 1;
  V expected;  // releases the model predicts for this step
  std::vector<HstNode *> hs;
  std::vector<M *> ms;

  Runner(char separator, bool mpCallback, unsigned seed)
      : sep(separator), mp(mpCallback), gen(seed) {
    tree = HST_AllocTreeEx(tp.pool(), sep, kDefault, 1, 2);
    if (mp)
      HST_SetMpFreeValFn(tree, coffer_test::RecordMpRelease);
    else
      HST_SetFreeValFn(tree, coffer_test::RecordRelease);
  }
  int Below(int n) { return std::uniform_int_distribution<int>(0, n - 1)(gen); }
  bool Chance(int percent) { return Below(100) < percent; }
  std::string Name() {
    static const char *const kNames[] = {"", "a", "b", "ab", "B", "\xc3\xa9", "zz"};
    return kNames[Below(7)];
  }
  std::string Path() {
    std::string path(1, Chance(80) ? sep : 'x');  // the first character is not examined
    for (int i = 0, depth = Below(5); i < depth; i++)
      path += (i ? std::string(1, sep) : "") + Name();
    if (path.size() > 1 && Chance(15)) path += sep;
    return path;
  }

  void Sync(const std::string &step) {
    hs.clear();
    ms.clear();
    std::string body;
    MDump(&root, &body, &ms);
    ASSERT_EQ(Dump(tree), "size " + std::to_string(ms.size()) + " " + body) << step;
    CheckTree(tree);
    Preorder(tree, HST_GetRoot(tree), &hs);
    ASSERT_EQ(Released(), expected) << step;
    ASSERT_EQ(ReleasedPools(), std::vector<MemPool *>(expected.size(), mp ? &tree->mp : nullptr));
    ResetLogs();
    expected.clear();
  }

  std::string Step() {
    const int pick = Below(100), at = Below(static_cast<int>(ms.size()));
    HstNode *hnode = hs[at];
    M *mnode = ms[at];
    const bool big = ms.size() > 250;
    if (pick < 30 && !big) {
      std::string path = Path();
      CofferVal val = Chance(10) ? kDefault : nextVal++;
      HstNode *got = HST_Insert(tree, path.c_str(), val);
      M *want = MWalk(&root, path, sep, true);
      want->val = val;
      EXPECT_TRUE(got && HST_GetKey(tree, got) == want->key);
      return "insert " + path;
    }
    if (pick < 38 && !big) {
      std::string key = Chance(20) ? std::string("x") + sep + "y" : Name();
      EXPECT_NE(HST_InsertChild(tree, hnode, key.c_str(), nextVal), nullptr);
      MInsertChild(mnode, key, nextVal++);
      return "insert child " + key + " under " + mnode->key;
    }
    if (pick < 48) {
      std::string path = Path();
      HstNode *got = HST_Find(tree, path.c_str());
      M *want = MWalk(&root, path, sep, false);
      // Both trees are in step, so the preorder positions must match.
      EXPECT_EQ(std::find(hs.begin(), hs.end(), got) - hs.begin(),
                std::find(ms.begin(), ms.end(), want) - ms.begin())
          << path;
      return "find " + path;
    }
    if (pick < 56 || big) {
      HST_RemoveSubtree(tree, hnode);
      if (mnode == &root) return MClear(&root, &expected), "remove root";
      MRelease(mnode, &expected);
      auto &sibs = mnode->parent->kids;
      sibs.erase(std::find_if(sibs.begin(), sibs.end(),
                              [&](const std::unique_ptr<M> &k) { return k.get() == mnode; }));
      return "remove " + std::to_string(at);
    }
    if (pick < 71) {
      const int dst = Below(static_cast<int>(ms.size()));
      std::string newKey = Name();
      const bool renamed = Chance(50);
      const int32_t vals = MCountVals(mnode);
      const bool fail = vals > 0 && Chance(25);
      if (fail) Script().failAt = Below(vals);
      HstNode *got =
          HST_CloneSubtree(tree, hnode, ScriptedClone, renamed ? newKey.c_str() : nullptr, hs[dst]);
      EXPECT_EQ(Script().calls, fail ? Script().failAt + 1 : vals);
      EXPECT_EQ(got == nullptr, fail);
      if (fail) {
        ExpectCopiesReleased();  // and defaultVal once per copied node holding it
        ResetLogs();
        return "failed clone";
      }
      size_t used = 0;
      auto copy = MCopy(mnode, &used);
      EXPECT_EQ(used, Script().made.size());
      if (renamed) copy->key = newKey;
      MAttach(ms[dst], std::move(copy));
      return "clone " + std::to_string(at) + " under " + std::to_string(dst);
    }
    if (pick < 72) return HST_Clear(tree), MClear(&root, &expected), "clear";
    if (pick < 86) {
      HST_SetVal(tree, hnode, nextVal);
      mnode->val = nextVal++;
      return "set";
    }
    const int32_t delta = Below(7) - 3;
    HSTAAAdjustSubtreeValCount(tree, hnode, delta);
    for (M *m = mnode; m; m = m->parent) m->svc += delta;
    return "adjust";
  }
};

TEST(HstModel, RandomOperationsMatchTheModel) {
  // Two separators (the other one an ordinary name character) and both kinds
  // of release callback.
  for (unsigned seed = 1; seed <= 8; seed++) {
    SCOPED_TRACE(seed);
    ResetLogs();
    Runner run(seed <= 4 ? '/' : '.', seed > 4, seed);
    run.Sync("start");
    for (int i = 0; i < 2500 && !HasFailure(); i++) {
      std::string step = run.Step();
      run.Sync("step " + std::to_string(i) + ": " + step);
    }
    if (HasFailure()) return;
    HST_FreeTree(run.tree);
    MClear(&run.root, &run.expected);
    EXPECT_EQ(Released(), run.expected);
    EXPECT_EQ(run.tp.liveBlocks(), 0u);
  }
}

}  // namespace
