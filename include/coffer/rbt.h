/* coffer red-black trees: ordered (key, value) trees with duplicates,
 * addressed by node. Three families share one handle and node layout:
 * RBT_* with string keys (bytes compared as signed), RbtInt32_* with 32-bit
 * integer keys in serial order, RbtVoidPtr_* with pointer keys in unsigned
 * order. Equal keys stay in insertion order. */
#ifndef COFFER_RBT_H
#define COFFER_RBT_H

#include <coffer/mempool.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef CollectionHeader RbtTree;

/* Pool-resident records (a shared-memory format). */
typedef struct RbtTreeData {
  PoolOffset root; /* equal to nil while the tree is empty */
  PoolOffset nil;  /* the sentinel */
  uint32_t ownsNil; /* the tree allocated the sentinel */
  uint32_t size;
} RbtTreeData;

typedef struct RbtNode {
  PoolOffset parent;
  PoolOffset left;
  PoolOffset right;
  uint32_t key;     /* RBT_*: PoolOffset of the key copy; typed trees: the key */
  uint8_t color;    /* 1 red, 0 black */
  uint8_t ownsNode; /* the tree allocated the node */
  uint8_t reserved[2];
  CofferVal val;
} RbtNode;

#define COFFER_RBT_DECLARE(P, KeyT)                                                  \
  COFFER_API RbtTree *P##_AllocTree(void);                                           \
  COFFER_API RbtTree *P##_AllocTreeEx(MemPool *pool);                                \
  COFFER_API RbtTree *P##_AllocTreeWithNil(MemPool *pool, RbtNode *nil);             \
  COFFER_API int32_t P##_CreateTreeData(RbtTree *tree, RbtNode *nil);                \
  COFFER_API void P##_FreeTree(RbtTree *tree);                                       \
  COFFER_API void P##_Clear(RbtTree *tree);                                          \
  COFFER_API int32_t P##_GetSize(RbtTree *tree);                                     \
  COFFER_API FreeValFn P##_SetFreeValFn(RbtTree *tree, FreeValFn fn);                \
  COFFER_API MpFreeValFn P##_SetMpFreeValFn(RbtTree *tree, MpFreeValFn fn);          \
  COFFER_API void P##_Swap(RbtTree *tree, RbtTree *other);                           \
  COFFER_API RbtNode *P##_Insert(RbtTree *tree, KeyT key, CofferVal val);            \
  COFFER_API RbtNode *P##_InsertNoAlloc(RbtTree *tree, RbtNode *node, KeyT key,      \
                                        CofferVal val);                              \
  COFFER_API void P##_Remove(RbtTree *tree, RbtNode *node);                          \
  COFFER_API void P##_RemoveRange(RbtTree *tree, RbtNode *first, RbtNode *end);      \
  COFFER_API RbtNode *P##_Find(RbtTree *tree, KeyT key);                             \
  COFFER_API RbtNode *P##_LowerBound(RbtTree *tree, KeyT key);                       \
  COFFER_API RbtNode *P##_UpperBound(RbtTree *tree, KeyT key);                       \
  COFFER_API RbtNode *P##_First(RbtTree *tree);                                      \
  COFFER_API RbtNode *P##_Next(RbtTree *tree, RbtNode *node);                        \
  COFFER_API RbtNode *P##_Prev(RbtTree *tree, RbtNode *node);

COFFER_RBT_DECLARE(RBT, const char *)
COFFER_RBT_DECLARE(RbtInt32, int32_t)
COFFER_RBT_DECLARE(RbtVoidPtr, const void *)

#ifdef __cplusplus
}
#endif

#endif
