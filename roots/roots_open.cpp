// SPDX-License-Identifier: MIT
// Handles opened around containers that live in a region, by record offset
// or by root name: each call checks the record as its family needs before it
// fills the caller's handle, and leaves the handle untouched on refusal.
#include <cstring>

#include "mempool/pool.h"
#include "roots/roots_internal.h"

using namespace coffer;

namespace {

bool Open(CollectionHeader *h, MemPool *pool, uint32_t kind, PoolOffset record) {
  if (!pool->base || RootsRecordFault(ViewOfPool(pool), kind, record)) return false;
  std::memset(h, 0, sizeof *h);
  h->mp = *pool;
  h->data = OffsetToAddr(pool, record);
  return true;
}

bool OpenNamed(CollectionHeader *h, MemPool *pool, uint32_t kind, const char *name) {
  int32_t found;
  PoolOffset record;
  return Roots_Get(pool, name, &found, &record) && static_cast<uint32_t>(found) == kind &&
         Open(h, pool, kind, record);
}

}  // namespace

extern "C" {

COFFER_API bool ESA_OpenArray(EsaArray *arr, MemPool *pool, PoolOffset record) {
  return Open(arr, pool, ROOTS_KIND_ARRAY, record);
}
COFFER_API bool ESA_OpenNamedArray(EsaArray *arr, MemPool *pool, const char *name) {
  return OpenNamed(arr, pool, ROOTS_KIND_ARRAY, name);
}
COFFER_API bool RBT_OpenTree(RbtTree *tree, MemPool *pool, PoolOffset record) {
  return Open(tree, pool, ROOTS_KIND_RBT, record);
}
COFFER_API bool RBT_OpenNamedTree(RbtTree *tree, MemPool *pool, const char *name) {
  return OpenNamed(tree, pool, ROOTS_KIND_RBT, name);
}
COFFER_API bool RbtInt32_OpenTree(RbtTree *tree, MemPool *pool, PoolOffset record) {
  return Open(tree, pool, ROOTS_KIND_RBT_INT32, record);
}
COFFER_API bool RbtInt32_OpenNamedTree(RbtTree *tree, MemPool *pool, const char *name) {
  return OpenNamed(tree, pool, ROOTS_KIND_RBT_INT32, name);
}
COFFER_API bool RbtVoidPtr_OpenTree(RbtTree *tree, MemPool *pool, PoolOffset record) {
  return Open(tree, pool, ROOTS_KIND_RBT_VOIDPTR, record);
}
COFFER_API bool RbtVoidPtr_OpenNamedTree(RbtTree *tree, MemPool *pool, const char *name) {
  return OpenNamed(tree, pool, ROOTS_KIND_RBT_VOIDPTR, name);
}
COFFER_API bool HST_OpenTree(HstTree *tree, MemPool *pool, PoolOffset record) {
  return Open(tree, pool, ROOTS_KIND_HST, record);
}
COFFER_API bool HST_OpenNamedTree(HstTree *tree, MemPool *pool, const char *name) {
  return OpenNamed(tree, pool, ROOTS_KIND_HST, name);
}

}  // extern "C"
