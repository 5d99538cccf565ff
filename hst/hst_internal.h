// Accessors shared by the string tree's source files: the one place where
// the tree's offsets become records, and the transient handle over a node's
// child array.
#ifndef COFFER_HST_HST_INTERNAL_H
#define COFFER_HST_HST_INTERNAL_H

#include <coffer/hst.h>

#include "mempool/pool.h"

namespace coffer {
namespace hst {

inline HstTreeData *Data(HstTree *tree) { return static_cast<HstTreeData *>(tree->data); }
inline HstNode *NodeAt(HstTree *tree, PoolOffset off) { return At<HstNode>(tree, off); }
inline PoolOffset NodeOff(HstTree *tree, HstNode *node) { return Off(tree, node); }

// An EsaArray handle on the stack around the node's child array (data null
// when the node has none). It carries no release callback, so the array never
// treats the node offsets it stores as values to release.
inline EsaArray Children(HstTree *tree, HstNode *node) {
  return TransientHandle(tree, At<EsaArrayData>(tree, node->children));
}

}  // namespace hst
}  // namespace coffer

#endif
