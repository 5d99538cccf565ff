// SPDX-License-Identifier: MIT
// The string tree and the associative arrays against one reference tree
// (children in a std::map, whose byte order is strcmp's), compared node by
// node after every step together with the exact sequence of callbacks.
#include <coffer/hstaa.h>

#include <cstdio>
#include <map>
#include <memory>

#include "hst/hst_internal.h"
#include "support/driver.h"

namespace coffer_test {
namespace {

using Names = std::vector<std::string>;

struct MNode {
  MNode(std::string k, CofferVal v) : key(std::move(k)), val(v) {}
  std::string key;
  CofferVal val;
  int32_t count = 0;  // the string tree's subtreeValCount; the arrays derive theirs
  int held = 0;       // arrays: accepted insertions less accepted removals here
  MNode *parent = nullptr;
  std::map<std::string, std::unique_ptr<MNode>> kids;
  HstNode *lib = nullptr;  // the library's node, once compared
};

std::unique_ptr<MNode> New(CofferVal val) { return std::make_unique<MNode>("", val); }
MNode *Attach(MNode *parent, std::unique_ptr<MNode> n, const std::string &key) {
  n->key = key;
  n->parent = parent;
  return (parent->kids[key] = std::move(n)).get();
}
MNode *Child(MNode *n, const std::string &k) {
  auto it = n->kids.find(k);
  return it == n->kids.end() ? nullptr : it->second.get();
}
MNode *Lookup(MNode *n, const Names &names) {
  for (const std::string &k : names)
    if (!(n = Child(n, k))) return nullptr;
  return n;
}
HstNode *LibOf(MNode *n) { return n ? n->lib : nullptr; }
int Sum(const MNode *n, int MNode::*field) {  // nodes (field null) or values held
  int c = field ? n->*field : 1;
  for (auto &k : n->kids) c += Sum(k.second.get(), field);
  return c;
}
void Collect(MNode *n, std::vector<MNode *> *all) {
  all->push_back(n);
  for (auto &k : n->kids) Collect(k.second.get(), all);
}

// Every callback and release, in order: I(nsert) and R(emove) of an operand
// at a value, C(lone) of a value, F a released value.
std::vector<std::string> g_log;
struct Behaviour {
  int refuseOperand = -1, refuseAt = -1, refuseClone = -1;
} g_b;
bool Apply(char what, CofferVal cur, CofferVal op, CofferVal *out) {
  g_log.push_back(what + std::to_string(cur) + "," + std::to_string(op));
  if (what == 'C') {  // the copy of value v is v + 1000, so copies show
    if (static_cast<int>(cur % 1000) == g_b.refuseClone) return false;
    *out = cur + 1000;
  } else if (what == 'R') {  // a node's value counts what it holds
    if (cur % 1000 == 0) return false;
    *out = cur - 1;
  } else {
    if (static_cast<int>(op) == g_b.refuseOperand || static_cast<int>(cur) == g_b.refuseAt) return false;
    *out = cur + 1;
  }
  return true;
}
bool CloneVal(HstTree *, CofferVal v, CofferVal *out) { return Apply('C', v, 0, out); }
void Release(CofferVal v) { g_log.push_back("F" + std::to_string(v)); }
// Releasing n's subtree: children in name order, each before its parent.
void LogReleases(const MNode *n) {
  for (auto &k : n->kids) LogReleases(k.second.get());
  Release(n->val);
}
// Runs the model's side of a step, its callbacks logged into want.
template <class Step>
auto Expect(std::vector<std::string> *want, Step step) {
  std::swap(*want, g_log);
  auto result = step();
  std::swap(*want, g_log);
  return result;
}

// The library's tree against the model's, node by node; wires up lib.
std::string Compare(HstTree *t, HstNode *h, MNode *m, bool derived, TestPool *tp) {
  m->lib = h;
  MODEL_EXPECT(HST_GetKey(t, h) == m->key && HST_GetVal(t, h) == m->val);
  MODEL_EXPECT(!tp || tp->SizeOf(HST_GetKey(t, h)) == m->key.size() + 1);
  MODEL_EXPECT(h->subtreeValCount == (derived ? Sum(m, &MNode::held) : m->count));
  MODEL_EXPECT(HST_GetNumChildren(t, h) == static_cast<int32_t>(m->kids.size()));
  int32_t i = 0;
  for (auto &k : m->kids) {
    HstNode *c = HST_GetChild(t, h, i++);
    MODEL_EXPECT(c && HST_GetParent(t, c) == h);
    MODEL_TRY(Compare(t, c, k.second.get(), derived, tp));
  }
  MODEL_EXPECT(HST_GetChild(t, h, i) == nullptr && HST_GetChild(t, h, -1) == nullptr);
  return "";
}
std::string CompareTree(HstTree *t, MNode *root, bool derived, TestPool *tp) {
  MODEL_EXPECT(HST_GetParent(t, HST_GetRoot(t)) == nullptr && HST_GetSize(t) == Sum(root, nullptr));
  coffer::CheckFault fault;
  MODEL_EXPECT(coffer::hst::HSTCheckTree(t, derived, &fault));
  return Compare(t, HST_GetRoot(t), root, derived, tp);
}
// Frees the tree: every value released once, children before parents.
std::string FreeTree(HstTree *t, MNode *root) {
  g_log.clear();
  HST_FreeTree(t);
  std::vector<std::string> freed;
  std::swap(freed, g_log);
  LogReleases(root);
  MODEL_EXPECT(freed == g_log);
  return "";
}

// The names a path's text (after its first character) walks through: cut
// at each separator, which a NUL separator never does; a separator at the
// very end ends the walk.
Names Split(const std::string &text, char sep) {
  if (text.empty() || !sep) return text.empty() ? Names{} : Names{text};
  Names names;
  for (size_t at = 0;;) {
    size_t cut = text.find(sep, at);
    names.push_back(text.substr(at, cut - at));
    if (cut == std::string::npos || cut + 1 == text.size()) return names;
    at = cut + 1;
  }
}
// Path text: names joined by the separator, or now and then any bytes.
struct Path {
  std::string text;
  Names names;
};
Path MakePath(Ops &ops, char sep, const Names &names) {
  std::string text;
  if (ops.Take(8) == 0) {
    for (uint32_t n = ops.Take(12); n; --n) text += static_cast<char>(1 + ops.Take(255));
  } else {
    for (uint32_t d = ops.Take(5); d; --d) {
      text += names[ops.Take(names.size())];
      if (sep && ops.Take(3)) text += sep;
    }
  }
  return {text, Split(text, sep)};
}

// The array a key is an element of: "#", "##", or "" for none.
std::string MarkOf(const std::string &k) {
  if (k.size() >= 3 && k[0] == '#' && k[1] == '#') return "##";
  return k.size() >= 2 && k[0] == '#' && k[1] != '#' ? "#" : "";
}
bool IsMark(const std::string &k) { return k == "#" || k == "##"; }

// Both layers' algorithms, restated on the reference tree.
struct Model {
  CofferVal dv;
  MNode root{"", dv};

  void Drop(MNode *n) {
    LogReleases(n);
    if (n == &root) return void((root.kids.clear(), root.val = dv, root.count = 0));
    n->parent->kids.erase(n->key);
  }
  // The string tree's copy: parents first, values other than the default
  // through the callback, counts as they were. A refused value releases
  // the partial copy.
  std::unique_ptr<MNode> Clone(const MNode *src) {
    auto n = New(dv);
    n->held = src->held, n->count = src->count;
    if (src->val != dv && !Apply('C', src->val, 0, &n->val)) return nullptr;
    for (auto &k : src->kids) {
      auto c = Clone(k.second.get());
      if (!c) return LogReleases(n.get()), nullptr;
      Attach(n.get(), std::move(c), k.first);
    }
    return n;
  }
  MNode *Insert(MNode *node, const Names &p, size_t i, CofferVal val) {
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
        child = Attach(node, New(dv), k);
        if (!made) made = child;
      }
      if (IsMark(k)) Propagate(HSTAA_PROPAGATE_INSERT, node, k, p, i + 1, val);
      node = child;
    }
    if (Apply('I', node->val, val, &node->val)) return node->held++, node;
    if (made) Drop(made);
    return nullptr;
  }
  void Remove(MNode *node, const Names &p, size_t i, CofferVal val) {
    if (i == p.size()) {
      if (Apply('R', node->val, val, &node->val)) node->held--;
      return;
    }
    const std::string &k = p[i];
    MNode *child = Child(node, k);
    if (!child) return;
    if (IsMark(k)) Propagate(HSTAA_PROPAGATE_REMOVE, node, k, p, i + 1, val);
    Remove(child, p, i + 1, val);
    MNode *rep = MarkOf(k).empty() ? nullptr : Child(node, MarkOf(k));
    const int n = Sum(child, &MNode::held);
    if (n == 0 || (rep && Sum(rep, &MNode::held) == n)) Drop(child);
  }
  // Elements follow their template in key order: visit that run only.
  bool Propagate(int mode, MNode *parent, const std::string &mark, const Names &p, size_t i,
                 CofferVal val) {
    for (std::string at = mark;;) {
      auto it = parent->kids.upper_bound(at);
      if (it == parent->kids.end() || MarkOf(it->first) != mark) return true;
      at = it->first;
      MNode *e = it->second.get();
      if (mode == HSTAA_PROPAGATE_INSERT && !Insert(e, p, i, val)) return false;
      if (mode == HSTAA_PROPAGATE_REMOVE) {
        Remove(e, p, i, val);
        if (Sum(e, &MNode::held) == 0) Drop(e);
      }
    }
  }
  std::pair<MNode *, bool> FindPrefix(MNode *node, const Names &p) {
    for (const std::string &k : p) {
      MNode *child = Child(node, k);
      if (!child && !MarkOf(k).empty()) child = Child(node, MarkOf(k));
      if (!child) return {node, false};
      node = child;
    }
    return {node, true};
  }
  // After a refused allocation the arrays keep whatever was done before it:
  // the model takes the library's tree as it stands (its counts checked).
  std::unique_ptr<MNode> Adopt(HstTree *t, HstNode *h) {
    auto n = New(HST_GetVal(t, h));
    n->held = h->subtreeValCount;
    for (int32_t i = 0; i < HST_GetNumChildren(t, h); i++) {
      HstNode *c = HST_GetChild(t, h, i);
      n->held -= c->subtreeValCount;
      Attach(n.get(), Adopt(t, c), HST_GetKey(t, c));
    }
    return n;
  }
};

}  // namespace

std::string RunHstModel(Ops &ops, Arena arena) {
  static const char kSeps[] = {'/', '.', '\0'};
  static const Names kNames = {"a", "b", "ab", "", "/", "."};
  const char sep = kSeps[ops.Take(3)];
  Model m{ops.Take(2) ? CofferVal{0} : CofferVal{7}};
  OpWatch made(arena.tp);
  HstTree *t = HST_AllocTreeEx(arena.pool, sep, m.dv, ops.Take(3), ops.Take(4) - 1);
  if (!t) return made.Refused() ? "" : "creation failed unrefused";
  HST_SetFreeValFn(t, Release);
  MODEL_TRY(CompareTree(t, &m.root, false, arena.tp));
  for (CofferVal next = 1; ops.More(); next++) {
    g_log.clear();
    std::vector<std::string> want;
    std::vector<MNode *> all;
    Collect(&m.root, &all);
    MNode *x = all[ops.Take(all.size())], *y = all[ops.Take(all.size())];
    OpWatch op(arena.tp);
    const uint32_t kind = ops.Take(16);
    Path p = MakePath(ops, sep, kNames);
    // An empty path has no first character to skip: it names nothing.
    const std::string text = ops.Take(16) ? (ops.Take(2) ? "/" : "x") + p.text : "";
    if (kind < 4) {  // insert at a path: missing names made with the default value
      HstNode *got = HST_Insert(t, text.c_str(), next);
      MNode *n = &m.root;
      for (const std::string &k : text.empty() ? Names{} : p.names) {
        MNode *c = Child(n, k);
        HstNode *h = HST_FindChild(t, n->lib, k.c_str());
        if (!c && h) (c = Attach(n, New(m.dv), k))->lib = h;  // made by this call
        if (!(n = c)) break;  // refused here: what was made stays
      }
      MODEL_EXPECT(!got == (op.Refused() || text.empty()) && got == LibOf(got ? n : nullptr));
      if (got) n->val = next;
    } else if (kind < 6) {  // find, through a path or by name
      MODEL_EXPECT(HST_Find(t, text.c_str()) == LibOf(text.empty() ? nullptr : Lookup(&m.root, p.names)));
      MODEL_EXPECT(HST_FindChild(t, x->lib, p.text.c_str()) == LibOf(Child(x, p.text)));
    } else if (kind == 6 && !Child(x, p.text)) {  // a new child by name
      HstNode *got = HST_InsertChild(t, x->lib, p.text.c_str(), next);
      MODEL_EXPECT(!got == op.Refused());
      if (got) Attach(x, New(next), p.text);
    } else if (kind == 7 && !Child(x, p.text)) {  // the same from a detached node, renamed
      HstNode *n = HSTAllocNode(t, "-", next);
      const bool renamed = n && HSTReplaceKey(t, n, p.text.c_str());
      MODEL_EXPECT(!n || HST_GetKey(t, n) == (renamed ? p.text : "-"));
      const bool got = renamed && HSTInsertChildNode(t, x->lib, n) == n;
      if (n && !got) HSTFreeNode(t, n);  // still detached
      MODEL_EXPECT(got != op.Refused());
      if (got) Attach(x, New(next), p.text);
    } else if (kind < 10) {  // remove a subtree; the root's empties the tree
      HST_RemoveSubtree(t, x->lib);
      Expect(&want, [&] { return m.Drop(x), 0; });
    } else if (kind < 12 && x != &m.root) {  // copy x's subtree under y, maybe renamed
      const std::string key = ops.Take(2) ? p.text : x->key;
      g_b.refuseClone = ops.Take(3) ? -1 : static_cast<int>(ops.Take(next) % 1000);
      if (Child(y, key)) continue;  // sibling names stay unique
      HstNode *got = HST_CloneSubtree(t, x->lib, CloneVal, key == x->key ? nullptr : key.c_str(), y->lib);
      std::unique_ptr<MNode> copy = Expect(&want, [&] { return m.Clone(x); });
      if (op.Refused()) {  // every value the copy made is released again, and only those
        std::map<CofferVal, int> copies;
        for (const std::string &e : g_log) {
          CofferVal v = std::stoul(e.substr(1));
          if (e[0] == 'C' && static_cast<int>(v % 1000) != g_b.refuseClone) copies[v + 1000]++;
          if (e[0] == 'F' && v != m.dv) copies[v]--;
        }
        for (auto &c : copies) MODEL_EXPECT(c.second == 0);
        MODEL_EXPECT(!got);
        want = g_log;
      } else {
        MODEL_EXPECT(!got == !copy);
        if (copy) Attach(y, std::move(copy), key);
      }
      g_b.refuseClone = -1;
    } else if (kind < 13) {  // replace a value: never released
      HST_SetVal(t, x->lib, next);
      x->val = next;
    } else if (kind < 14) {  // the count the arrays keep, carried up to the root
      int32_t delta = static_cast<int32_t>(ops.Take(5)) - 2;
      HSTAAAdjustSubtreeValCount(t, x->lib, delta);
      for (MNode *n = x; n; n = n->parent) n->count += delta;
    } else if (kind < 15) {  // clear: the root's value goes last
      HST_Clear(t);
      Expect(&want, [&] { return m.Drop(&m.root), 0; });
    } else if (arena.tp) {
      arena.tp->FailAt(arena.tp->calls());
    }
    MODEL_EXPECT(g_log == want);
    MODEL_TRY(CompareTree(t, &m.root, false, arena.tp));
  }
  return FreeTree(t, &m.root);
}

std::string RunHstaaModel(Ops &ops, Arena arena) {
  static const Names kKeys = {"a", "", "#", "##", "#1", "#2", "#!", "# ", "##1", "###", "#", "##", "#1"};
  Model m{ops.Take(2) ? CofferVal{0} : CofferVal{1000}};
  g_b = Behaviour{static_cast<int>(ops.Take(6)) - 1, static_cast<int>(ops.Take(4)) - 1,
                  static_cast<int>(ops.Take(4)) - 1};
  HstaaTree tree{};
  tree.hst.mp = *arena.pool;
  tree.cloneValFn = CloneVal;
  tree.insertValFn = [](HstaaTree *, CofferVal cur, CofferVal op, CofferVal *out) { return *out == cur && Apply('I', cur, op, out); };
  tree.removeValFn = [](HstaaTree *, CofferVal cur, CofferVal op, CofferVal *out) { return *out == cur && Apply('R', cur, op, out); };
  HST_SetFreeValFn(&tree.hst, Release);
  HstTree *t = &tree.hst;
  OpWatch made(arena.tp);
  if (!HST_CreateTreeData(t, '/', m.dv, ops.Take(3), 2)) return made.Refused() ? "" : "creation failed unrefused";
  MODEL_TRY(CompareTree(t, &m.root, true, arena.tp));
  while (ops.More()) {
    g_log.clear();
    std::vector<MNode *> all;
    Collect(&m.root, &all);
    MNode *start = ops.Take(3) ? &m.root : all[ops.Take(all.size())];
    const bool relative = start != &m.root || ops.Take(2);
    Path p = MakePath(ops, '/', kKeys);
    for (const std::string &k : p.names) {  // the classes of keys, as the model sees them
      const char *rep = HSTAA_GetArrayRep(k.c_str());
      MODEL_EXPECT((rep ? rep : "") == MarkOf(k) && HSTAA_IsArrayRep(k.c_str()) == IsMark(k));
      MODEL_EXPECT(HSTAA_IsArrayIndex(k.c_str()) == !MarkOf(k).empty());
    }
    // An empty absolute path has no first character to skip: it names nothing.
    const std::string abs = ops.Take(16) ? (ops.Take(2) ? "/" : "x") + p.text : "";
    const bool none = !relative && abs.empty();
    char text[64];
    std::snprintf(text, sizeof text, "%s", p.text.c_str());
    char *arg = p.text.empty() && ops.Take(2) ? nullptr : text;
    const CofferVal v = 1 + ops.Take(4);
    OpWatch op(arena.tp);
    const uint32_t kind = ops.Take(17);
    std::vector<std::string> want;
    bool whole = true;  // the path text must come back as it was
    HstNode *got = nullptr;
    MNode *mine = nullptr;
    if (kind < 7) {
      got = relative ? HSTAAInsert(&tree, start->lib, arg, v) : HSTAA_Insert(&tree, abs.c_str(), v);
      mine = none ? nullptr : Expect(&want, [&] { return m.Insert(start, p.names, 0, v); });
      if (op.Refused()) {  // (a refusal inside an element does not stop the insertion)
        coffer::CheckFault fault;
        MODEL_EXPECT(coffer::hst::HSTCheckTree(t, true, &fault));
        m.root = std::move(*m.Adopt(t, HST_GetRoot(t)));
        for (auto &k : m.root.kids) k.second->parent = &m.root;
        want = g_log, got = nullptr, mine = nullptr;
      }
    } else if (kind < 13) {
      if (relative)
        HSTAARemove(&tree, start->lib, arg, v);
      else
        MODEL_EXPECT(HSTAA_Remove(&tree, abs.c_str(), v));
      if (!none) Expect(&want, [&] { return m.Remove(start, p.names, 0, v), 0; });
    } else if (kind < 15) {
      bool complete = !ops.Take(2);
      HstNode *found = relative ? HSTAAFindPrefix(&tree, start->lib, arg, &complete)
                                : HSTAA_FindPrefix(&tree, abs.c_str(), &complete);
      auto reached = none ? std::make_pair(&m.root, false) : m.FindPrefix(start, p.names);
      MODEL_EXPECT(found == reached.first->lib && complete == reached.second);
      whole = reached.second;  // else the unresolved name stays cut
    } else if (kind == 15 && !start->kids.empty()) {  // a mode that changes nothing, or no template
      MNode *rep = std::next(start->kids.begin(), ops.Take(start->kids.size()))->second.get();
      const int32_t mode = IsMark(rep->key) ? 2 + ops.Take(2) : ops.Take(4);
      MODEL_EXPECT(HSTAAPropagateVal(&tree, mode, start->lib, rep->lib, text, v));
    } else if (kind == 16 && arena.tp) {
      arena.tp->FailAt(arena.tp->calls());
    }
    MODEL_EXPECT(!whole || p.text == text);
    MODEL_EXPECT(g_log == want);
    MODEL_TRY(CompareTree(t, &m.root, true, arena.tp));
    MODEL_EXPECT(got == LibOf(mine));  // the node inserted at, once wired up
  }
  g_b = Behaviour{};
  return FreeTree(t, &m.root);
}

}  // namespace coffer_test
