// SPDX-License-Identifier: MIT
// The string tree's invariant checker (see hst_internal.h), with the value
// counts of the associative-array layer as an option: both are one walk.
#include <cstdlib>

#include "esa/esa_internal.h"
#include "hst/hst_internal.h"

namespace coffer {
namespace hst {
namespace {

// A node whose children are being visited: the next entry, and the sum of
// the value counts of the children met so far.
struct Frame {
  PoolOffset node;
  int32_t next;
  int64_t below;
};

// A depth-first walk with a stack of its own on the process heap: a path
// tree may be as deep as it has nodes, more than the call stack would take.
struct Walk {
  HstTree *tree;
  bool counts;
  CheckFault *fault;
  const CheckSpan *span;
  int32_t seen = 0;
  Frame *stack = nullptr;
  uint32_t depth = 0, room = 0;

  ~Walk() { std::free(stack); }

  // Counts the node at off (inside the span) and checks its own record and
  // child array; pushes it when it has children to visit. The node count
  // bounds the walk, so a child link that loops ends it.
  bool Enter(PoolOffset off) {
    const HstNode *node = NodeAt(tree, off);
    if (++seen > Data(tree)->size) return Fault(fault, "more nodes than size counts", off);
    if (counts && node->subtreeValCount < 0) return Fault(fault, "negative value count", off);
    if (!node->children) return true;
    EsaArray kids = Children(tree, const_cast<HstNode *>(node));
    if (!ESACheckArray(&kids, fault, span)) return false;
    if (depth == room) {
      room = room ? 2 * room : 64;
      auto *grown = static_cast<Frame *>(std::realloc(stack, room * sizeof(Frame)));
      if (!grown) return Fault(fault, "checker out of memory", off);
      stack = grown;
    }
    stack[depth++] = Frame{off, 0, 0};
    return true;
  }

  // Checks the next child entry of the node on top and enters the child, or,
  // past the last entry, checks the node's count and leaves it.
  bool Step() {
    Frame &f = stack[depth - 1];
    const HstNode *node = NodeAt(tree, f.node);
    const EsaArrayData *kids = ChildArray(tree, node);
    if (f.next == kids->size) {
      depth--;
      if (counts && node->subtreeValCount < f.below)
        return Fault(fault, "value count below its children's", f.node);
      return true;
    }
    const EsaEntry *entry = EntriesOf(tree, kids) + f.next++;
    const PoolOffset off = static_cast<PoolOffset>(entry->val);
    if (!off) return Fault(fault, "child entry names no node", f.node);
    if (!SpanHolds(span, off, sizeof(HstNode))) return Fault(fault, "node outside the region", f.node);
    const HstNode *child = NodeAt(tree, off);
    if (child->parent != f.node) return Fault(fault, "parent link disagrees with child entry", f.node);
    if (child->key == 0) return Fault(fault, "node without a name", off);
    if (!SpanHoldsString(span, &tree->mp, child->key)) return Fault(fault, "key outside the region", off);
    if (std::strcmp(KeyOf(tree, entry), RecordAt<const char>(tree, child->key)) != 0)
      return Fault(fault, "child entry named unlike its node", off);
    f.below += child->subtreeValCount;
    return Enter(off);
  }
};

}  // namespace

bool HSTCheckTree(HstTree *tree, bool counts, CheckFault *fault, const CheckSpan *span) {
  HstTreeData *data = Data(tree);
  if (!data) return true;
  const PoolOffset at = OffsetOf(tree, data);
  if (!SpanHolds(span, at, sizeof *data)) return Fault(fault, "record outside the region", at);
  if (data->root && !SpanHolds(span, data->root, sizeof(HstNode)))
    return Fault(fault, "node outside the region", at);
  const HstNode *root = NodeAt(tree, data->root);
  if (!root || root->parent != 0 || root->key == 0)
    return Fault(fault, "root missing, named or with a parent", data->root);
  if (!SpanHoldsString(span, &tree->mp, root->key)) return Fault(fault, "key outside the region", data->root);
  if (RecordAt<const char>(tree, root->key)[0] != '\0')
    return Fault(fault, "root missing, named or with a parent", data->root);
  Walk walk{tree, counts, fault, span};
  if (!walk.Enter(data->root)) return false;
  while (walk.depth)
    if (!walk.Step()) return false;
  if (walk.seen != data->size) return Fault(fault, "size differs from the nodes reachable", data->root);
  return true;
}

}  // namespace hst
}  // namespace coffer
