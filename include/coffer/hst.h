/* coffer hierarchical string tree: nodes named by strings, each holding one
 * value, addressed by walking named children or by paths such as /a/b. Each
 * node keeps its children in a sorted string array (strcmp order). */
#ifndef COFFER_HST_H
#define COFFER_HST_H

#include <coffer/esa.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef CollectionHeader HstTree;

/* Pool-resident records (a shared-memory format). */
typedef struct HstTreeData {
  PoolOffset root;
  int32_t size; /* live nodes, the root included */
  char separator;
  uint8_t reserved[3];
  CofferVal defaultVal;
  int32_t childCapacity;
  int32_t childCapacityIncrement;
} HstTreeData;

typedef struct HstNode {
  PoolOffset parent;   /* 0 for the root and for a detached node */
  PoolOffset children; /* EsaArrayData of the children; 0 until the first */
  PoolOffset key;      /* the node's own copy of its name */
  CofferVal val;
  int32_t subtreeValCount; /* kept by the associative-array layer */
} HstNode;

/* Copies a value for HST_CloneSubtree: writes the copy to *out (which starts
 * as 0) and returns true, or returns false and keeps no copy. */
typedef bool (*HstCloneValFn)(HstTree *tree, CofferVal val, CofferVal *out);

COFFER_API HstTree *HST_AllocTree(char separator, CofferVal defaultVal, int32_t childCapacity,
                                  int32_t childCapacityIncrement);
COFFER_API HstTree *HST_AllocTreeEx(MemPool *pool, char separator, CofferVal defaultVal,
                                    int32_t childCapacity, int32_t childCapacityIncrement);
COFFER_API bool HST_CreateTreeData(HstTree *tree, char separator, CofferVal defaultVal,
                                   int32_t childCapacity, int32_t childCapacityIncrement);
COFFER_API int32_t HST_GetSize(HstTree *tree);
COFFER_API FreeValFn HST_SetFreeValFn(HstTree *tree, FreeValFn fn);
COFFER_API MpFreeValFn HST_SetMpFreeValFn(HstTree *tree, MpFreeValFn fn);
COFFER_API HstNode *HST_GetRoot(HstTree *tree);
COFFER_API HstNode *HST_GetParent(HstTree *tree, HstNode *node);
COFFER_API const char *HST_GetKey(HstTree *tree, HstNode *node);
COFFER_API CofferVal HST_GetVal(HstTree *tree, HstNode *node);
COFFER_API void HST_SetVal(HstTree *tree, HstNode *node, CofferVal val);
COFFER_API int32_t HST_GetNumChildren(HstTree *tree, HstNode *node);
COFFER_API HstNode *HST_GetChild(HstTree *tree, HstNode *node, int32_t index);
COFFER_API HstNode *HST_FindChild(HstTree *tree, HstNode *node, const char *key);
COFFER_API HstNode *HST_Find(HstTree *tree, const char *path);
COFFER_API HstNode *HST_InsertChild(HstTree *tree, HstNode *parent, const char *key,
                                    CofferVal val);

/* Node primitives, exported for the associative-array layer and for callers
 * that build trees by hand. */
COFFER_API HstNode *HSTAllocNode(HstTree *tree, const char *key, CofferVal val);
COFFER_API bool HSTAllocChild(HstTree *tree, HstNode *node);
COFFER_API HstNode *HSTInsertChildNode(HstTree *tree, HstNode *parent, HstNode *node);
COFFER_API void HSTFreeNode(HstTree *tree, HstNode *node);

COFFER_API HstNode *HST_Insert(HstTree *tree, const char *path, CofferVal val);
COFFER_API void HSTFreeVal(HstTree *tree, CofferVal val);
COFFER_API void HSTFreeSubtree(HstTree *tree, HstNode *node);
COFFER_API void HST_RemoveSubtree(HstTree *tree, HstNode *node);
COFFER_API void HST_Clear(HstTree *tree);
COFFER_API void HST_FreeTree(HstTree *tree);
COFFER_API bool HSTReplaceKey(HstTree *tree, HstNode *node, const char *newKey);
COFFER_API HstNode *HST_CloneSubtree(HstTree *tree, HstNode *src, HstCloneValFn cloneValFn,
                                     const char *newKey, HstNode *dstParent);
COFFER_API void HSTAAAdjustSubtreeValCount(HstTree *tree, HstNode *node, int32_t delta);

#ifdef __cplusplus
}
#endif

#endif
