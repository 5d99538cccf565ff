// The string tree's invariant checker (see hst_internal.h), with the value
// counts of the associative-array layer as an option: both are one walk.
#include "esa/esa_internal.h"
#include "hst/hst_internal.h"

namespace coffer {
namespace hst {
namespace {

struct Walk {
  HstTree *tree;
  bool counts;
  CheckFault *fault;
  int32_t seen = 0;

  // The node count bounds the walk, so a child link that loops ends it.
  bool Visit(HstNode *node) {
    const PoolOffset off = OffsetOf(tree, node);
    if (++seen > Data(tree)->size) return Fault(fault, "more nodes than size counts", off);
    if (counts && node->subtreeValCount < 0) return Fault(fault, "negative value count", off);
    if (!node->children) return true;
    EsaArray kids = Children(tree, node);
    if (!ESACheckArray(&kids, fault)) return false;
    int64_t below = 0;
    for (int32_t i = 0; i < ESA_GetSize(&kids); i++) {
      HstNode *child = NodeAt(tree, static_cast<PoolOffset>(ESA_GetVal(&kids, i)));
      if (!child) return Fault(fault, "child entry names no node", off);
      if (child->parent != off) return Fault(fault, "parent link disagrees with child entry", off);
      if (child->key == 0) return Fault(fault, "node without a name", OffsetOf(tree, child));
      if (std::strcmp(ESA_GetKey(&kids, i), HST_GetKey(tree, child)) != 0)
        return Fault(fault, "child entry named unlike its node", OffsetOf(tree, child));
      if (!Visit(child)) return false;
      below += child->subtreeValCount;
    }
    if (counts && node->subtreeValCount < below)
      return Fault(fault, "value count below its children's", off);
    return true;
  }
};

}  // namespace

bool HSTCheckTree(HstTree *tree, bool counts, CheckFault *fault) {
  HstTreeData *data = Data(tree);
  if (!data) return true;
  HstNode *root = HST_GetRoot(tree);
  if (!root || root->parent != 0 || root->key == 0 || HST_GetKey(tree, root)[0] != '\0')
    return Fault(fault, "root missing, named or with a parent", data->root);
  Walk walk{tree, counts, fault};
  if (!walk.Visit(root)) return false;
  if (walk.seen != data->size) return Fault(fault, "size differs from the nodes reachable", data->root);
  return true;
}

}  // namespace hst
}  // namespace coffer
