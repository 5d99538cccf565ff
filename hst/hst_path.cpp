// Path lookup and path insertion. A path's first character stands for the
// leading separator and is never examined; the rest is names joined by the
// tree's separator, and a separator at the very end stops the walk early.
#include <cstdlib>
#include <cstring>

#include "hst/hst_internal.h"

using namespace coffer;
using namespace coffer::hst;

namespace {

// Walks the names of a path copy (which the walk cuts in place and restores)
// from the root. With create set, a missing name is made with defaultVal.
// Returns the node named, or null when a name is missing or cannot be made.
HstNode *WalkNames(HstTree *tree, char *copy, bool create) {
  HstTreeData *data = Data(tree);
  const char sep = data->separator;
  HstNode *node = HST_GetRoot(tree);
  // An empty path has no first character to skip and names nothing.
  if (copy[0] == '\0') return nullptr;
  char *name = copy + 1;
  if (*name == '\0') return node;
  for (;;) {
    // A NUL separator would match the terminator and lead the walk past it.
    char *end = sep ? std::strchr(name, sep) : nullptr;
    if (end) *end = '\0';
    HstNode *child = HST_FindChild(tree, node, name);
    if (!child && create) child = HST_InsertChild(tree, node, name, data->defaultVal);
    if (end) *end = sep;
    if (!child) return nullptr;
    node = child;
    if (!end || end[1] == '\0') return node;
    name = end + 1;
  }
}

// Runs the walk on a process-heap copy of the path, so the caller's string
// is never written and nothing of the walk lands in the pool.
HstNode *WalkPath(HstTree *tree, const char *path, bool create) {
  size_t len = std::strlen(path) + 1;
  char *copy = static_cast<char *>(std::malloc(len));
  if (!copy) return nullptr;
  std::memcpy(copy, path, len);
  HstNode *node = WalkNames(tree, copy, create);
  std::free(copy);
  return node;
}

}  // namespace

extern "C" {

COFFER_API HstNode *HST_Find(HstTree *tree, const char *path) {
  return WalkPath(tree, path, false);
}

COFFER_API HstNode *HST_Insert(HstTree *tree, const char *path, CofferVal val) {
  HstNode *node = WalkPath(tree, path, true);
  // The old value is overwritten, not released: replacing never releases.
  if (node) HST_SetVal(tree, node, val);
  return node;
}

}  // extern "C"
