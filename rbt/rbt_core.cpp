// SPDX-License-Identifier: MIT
// Red-black balancing on a tree with a sentinel, shared by every key family:
// rotations, insertion fix-up, removal with successor relinking, and the
// key-independent parts of the lifecycle. The neighbour walks are inline, in
// rbt_internal.h.
//
// The invariants every call below restores before it returns (RBTCheckTree
// verifies them in checking builds):
//   1. every node is red or black; the root and the sentinel are black;
//   2. a red node has two black children (absent children are the sentinel);
//   3. every path from a node down to the sentinel passes the same number of
//      black nodes (its black height);
//   4. parent links mirror child links; the root's parent is the sentinel;
//   5. in-order, keys never decrease, and equal keys stand in insertion
//      order (an equal key is placed to the right);
//   6. size counts the nodes reachable from the root;
//   7. the sentinel's left and right name itself. Its parent is scratch
//      space for the removal fix-up, written only there.
// Nodes never move between records: removal relinks the successor node
// instead of copying its contents, so a node pointer stays valid until that
// very node is removed.
#include <cstddef>

#include "rbt/rbt_internal.h"

static_assert(sizeof(RbtTreeData) == 16, "RbtTreeData is 16 bytes");
static_assert(offsetof(RbtTreeData, root) == 0 && offsetof(RbtTreeData, nil) == 4 &&
                  offsetof(RbtTreeData, ownsNil) == 8 && offsetof(RbtTreeData, size) == 12,
              "RbtTreeData layout");
static_assert(sizeof(RbtTreeData::ownsNil) == 4 && sizeof(RbtTreeData::size) == 4,
              "ownsNil and size are 32-bit");
static_assert(sizeof(RbtNode) == 24, "RbtNode is 24 bytes");
static_assert(offsetof(RbtNode, parent) == 0 && offsetof(RbtNode, left) == 4 &&
                  offsetof(RbtNode, right) == 8 && offsetof(RbtNode, key) == 12 &&
                  offsetof(RbtNode, color) == 16 && offsetof(RbtNode, ownsNode) == 17 &&
                  offsetof(RbtNode, reserved) == 18 && offsetof(RbtNode, val) == 20,
              "RbtNode layout");
static_assert(sizeof(RbtNode::key) == 4 && sizeof(RbtNode::val) == 4 &&
                  sizeof(RbtNode::color) == 1 && sizeof(RbtNode::ownsNode) == 1,
              "RbtNode field widths");

namespace coffer {

namespace {

// Points whatever linked to old (its parent's child link, or root) at repl.
inline void ReplaceChild(const RbtCtx &c, PoolOffset parent, PoolOffset old, PoolOffset repl) {
  if (parent == c.nilOff) {
    c.d->root = repl;
    return;
  }
  RbtNode *p = c.NodeAt(parent);
  // The side is picked as an address, not by a branch on it (see ChildLink).
  PoolOffset &link = p->left == old ? p->left : p->right;
  link = repl;
}

inline uint8_t ColorOf(const RbtCtx &c, PoolOffset off) { return c.NodeAt(off)->color; }

// Lifts x's far child into x's place: Rotate<true> is the left rotation.
// It never writes the sentinel, so a shared sentinel stays untouched.
template <bool L>
void Rotate(const RbtCtx &c, RbtNode *x) {
  PoolOffset xo = c.OffsetOf(x), yo = Far<L>(x);
  RbtNode *y = c.NodeAt(yo);
  Far<L>(x) = Near<L>(y);
  if (Near<L>(y) != c.nilOff) c.NodeAt(Near<L>(y))->parent = xo;
  y->parent = x->parent;
  ReplaceChild(c, x->parent, xo, yo);
  Near<L>(y) = xo;
  x->parent = yo;
}

// One step of the insertion fix-up for a red z whose red parent p is the
// child on side L of g (invariant 2 broken between z and p). Returns the
// node to go on from.
template <bool L>
RbtNode *InsertStep(const RbtCtx &c, RbtNode *z, RbtNode *p, RbtNode *g) {
  RbtNode *u = c.NodeAt(Far<L>(g));
  if (u->color == kRbtRed) {
    // Case 1, red uncle: push g's blackness down to p and u; g may now
    // break invariant 2 with its own parent, so go on from g.
    p->color = kRbtBlack;
    u->color = kRbtBlack;
    g->color = kRbtRed;
    return g;
  }
  if (Far<L>(p) == c.OffsetOf(z)) {
    // Case 2, black uncle and z an inner grandchild: rotate it outward,
    // which turns this into case 3 with the roles of z and p exchanged.
    z = p;
    Rotate<L>(c, z);
    p = c.NodeAt(z->parent);
  }
  // Case 3, black uncle and z an outer grandchild: rotate g down to the far
  // side and swap its colour with p's. No red pair remains.
  p->color = kRbtBlack;
  g->color = kRbtRed;
  Rotate<!L>(c, g);
  return z;
}

void InsertFixup(const RbtCtx &c, RbtNode *z) {
  for (;;) {
    PoolOffset po = z->parent;
    RbtNode *p = c.NodeAt(po);  // the sentinel (black) above the root ends the loop
    if (p->color != kRbtRed) break;
    RbtNode *g = c.NodeAt(p->parent);  // exists: a red parent is never the root
    z = g->left == po ? InsertStep<true>(c, z, p, g) : InsertStep<false>(c, z, p, g);
  }
  c.NodeAt(c.d->root)->color = kRbtBlack;
}

// One step of the removal fix-up for a doubly black x that is the child on
// side L of p. Returns the offset of the node to go on from: p to climb, the
// root once the extra black has been absorbed.
template <bool L>
PoolOffset DeleteStep(const RbtCtx &c, PoolOffset po) {
  RbtNode *p = c.NodeAt(po);
  RbtNode *w = c.NodeAt(Far<L>(p));  // x's sibling: never the sentinel
  if (w->color == kRbtRed) {
    // Case 1, red sibling: rotate it above p so that x gets a black
    // sibling, then go on with cases 2 to 4.
    w->color = kRbtBlack;
    p->color = kRbtRed;
    Rotate<L>(c, p);
    w = c.NodeAt(Far<L>(p));
  }
  if (ColorOf(c, w->left) == kRbtBlack && ColorOf(c, w->right) == kRbtBlack) {
    // Case 2, black sibling with black children: take one black off both
    // sides by making w red; the extra black climbs to p.
    w->color = kRbtRed;
    return po;
  }
  if (ColorOf(c, Far<L>(w)) == kRbtBlack) {
    // Case 3, only w's near child is red: rotate it above w, which turns
    // this into case 4.
    c.NodeAt(Near<L>(w))->color = kRbtBlack;
    w->color = kRbtRed;
    Rotate<!L>(c, w);
    w = c.NodeAt(Far<L>(p));
  }
  // Case 4, w's far child is red: rotate w above p and recolour; the extra
  // black is absorbed and the fix-up ends.
  w->color = p->color;
  p->color = kRbtBlack;
  c.NodeAt(Far<L>(w))->color = kRbtBlack;
  Rotate<L>(c, p);
  return c.d->root;
}

// x may be the sentinel; its parent field was set by the caller for this.
void DeleteFixup(const RbtCtx &c, PoolOffset xo) {
  RbtNode *x = c.NodeAt(xo);
  while (xo != c.d->root && x->color == kRbtBlack) {
    PoolOffset po = x->parent;
    xo = c.NodeAt(po)->left == xo ? DeleteStep<true>(c, po) : DeleteStep<false>(c, po);
    x = c.NodeAt(xo);
  }
  // Never recolours the sentinel: it is black already, and a caller's
  // sentinel may be shared with other trees.
  if (x->color != kRbtBlack) x->color = kRbtBlack;
}

}  // namespace

void RBTAttach(RbtCtx c, RbtNode *z, RbtNode *parent, bool left) {
  PoolOffset zo = c.OffsetOf(z);
  z->parent = c.OffsetOf(parent);
  if (parent == c.nil)
    c.d->root = zo;
  else if (left)
    parent->left = zo;
  else
    parent->right = zo;
  InsertFixup(c, z);
  c.d->size++;
}

void RBTUnlink(RbtCtx c, RbtNode *z) {
  PoolOffset zo = c.OffsetOf(z);
  RbtNode *y = (z->left == c.nilOff || z->right == c.nilOff) ? z : RBTSuccessor(c, z);
  PoolOffset yo = c.OffsetOf(y);
  PoolOffset xo = y->left != c.nilOff ? y->left : y->right;
  // Also for the sentinel: the fix-up climbs from it through this field.
  c.NodeAt(xo)->parent = y->parent;
  ReplaceChild(c, y->parent, yo, xo);
  if (y->color == kRbtBlack) DeleteFixup(c, xo);
  if (y == z) return;
  // The successor node itself takes z's place, so no key or value changes
  // node. The fix-up ran with z standing where y now goes, which gives the
  // same shape and colours as copying y's contents into z.
  ReplaceChild(c, z->parent, zo, yo);
  y->parent = z->parent;
  y->left = z->left;
  y->right = z->right;
  y->color = z->color;
  c.NodeAt(z->left)->parent = yo;
  c.NodeAt(z->right)->parent = yo;
}

int32_t RBTCreateTreeData(RbtTree *tree, RbtNode *nil) {
  auto *d = static_cast<RbtTreeData *>(PoolCalloc(tree, sizeof(RbtTreeData)));
  tree->data = d;
  if (!d) return 0;
  uint32_t ownsNil = 0;
  if (!nil) {
    nil = static_cast<RbtNode *>(PoolCalloc(tree, sizeof(RbtNode)));
    if (!nil) {
      PoolFree(tree, d);
      tree->data = nullptr;
      return 0;
    }
    ownsNil = 1;
  }
  PoolOffset nilOff = OffsetOf(tree, nil);
  d->root = d->nil = nilOff;
  d->ownsNil = ownsNil;
  d->size = 0;
  // Every field but key: a caller's sentinel keeps whatever key it holds.
  nil->parent = nil->left = nil->right = nilOff;
  nil->color = kRbtBlack;
  nil->ownsNode = 1;
  nil->val = 0;
  return 1;
}

RbtTree *RBTAllocTree(MemPool *pool, RbtNode *nil) {
  RbtTree *tree = AllocHandle(pool);
  if (!tree) return nullptr;
  if (!RBTCreateTreeData(tree, nil)) {
    ReleaseHandle(tree);
    return nullptr;
  }
  return tree;
}

RbtTree *RBTAllocTreeOnStdHeap() {
  MemPool pool;
  MemPool_InitOnStdHeap(&pool);
  return RBTAllocTree(&pool, nullptr);
}

// ownsNil travels with nil, so each flag keeps describing the sentinel it
// was set for and a free never releases a caller's sentinel nor leaks the
// tree's own.
void RBTSwap(RbtTree *tree, RbtTree *other) {
  auto *a = static_cast<RbtTreeData *>(tree->data);
  auto *b = static_cast<RbtTreeData *>(other->data);
  RbtTreeData tmp = *a;  // root, nil, ownsNil and size: the whole record
  *a = *b;
  *b = tmp;
}

}  // namespace coffer
