// SPDX-License-Identifier: MIT
// Path lookup and path insertion over the path rules of hst_internal.h.
#include <cstdlib>
#include <cstring>

#include "hst/hst_internal.h"

using namespace coffer;
using namespace coffer::hst;

namespace {

// Walks the names of a path copy from the root (see the path rules in
// hst_internal.h). With create set, a missing name is made with defaultVal.
// Returns the node named, or null when a name is missing or cannot be made.
HstNode *WalkNames(HstTree *tree, char *copy, bool create) {
  HstTreeData *data = Data(tree);
  const char sep = data->separator;
  HstNode *node = Root(tree);
  // An empty path has no first character to skip and names nothing.
  if (copy[0] == '\0') return nullptr;
  char *name = copy + 1;
  if (*name == '\0') return node;
  for (;;) {
    char *cut = FindCut(name, sep);
    if (cut) *cut = '\0';
    int32_t slot;
    HstNode *child = FindChildIn(tree, node, name, &slot);
    if (!child && create) child = InsertChild(tree, node, name, data->defaultVal, slot);
    if (cut) *cut = sep;
    if (!child) return nullptr;
    node = child;
    if (IsLastName(cut)) return node;
    name = cut + 1;
  }
}

// Runs the walk on a process-heap copy of the path, so the caller's string
// is never written and nothing of the walk lands in the pool.
HstNode *WalkPath(HstTree *tree, const char *path, bool create) {
  char *copy = CopyPath(path);
  if (!copy) return nullptr;
  HstNode *node = WalkNames(tree, copy, create);
  std::free(copy);
  return node;
}

}  // namespace

char *coffer::hst::CopyPath(const char *path) {
  size_t len = std::strlen(path) + 1;
  char *copy = static_cast<char *>(std::malloc(len));
  if (copy) std::memcpy(copy, path, len);
  return copy;
}

extern "C" {

COFFER_API HstNode *HST_Find(HstTree *tree, const char *path) {
  return WalkPath(tree, path, false);
}

COFFER_API HstNode *HST_Insert(HstTree *tree, const char *path, CofferVal val) {
  HST_CHECKED(tree);
  HstNode *node = WalkPath(tree, path, true);
  // The old value is overwritten, not released: replacing never releases.
  if (node) node->val = val;
  return node;
}

}  // extern "C"
