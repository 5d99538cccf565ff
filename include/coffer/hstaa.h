/* coffer associative arrays over the string tree: path-keyed values with
 * per-subtree value counts. Children named "#" and "##" are templates of the
 * arrays whose elements are "#..." and "##..." keys; values inserted or
 * removed through a template are carried into the elements that exist. */
#ifndef COFFER_HSTAA_H
#define COFFER_HSTAA_H

#include <coffer/hst.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct HstaaTree HstaaTree;

/* Merges (insertion) or takes out (removal) operand from a node's value cur:
 * on true the node's new value is in *out (which starts as cur, so accepting
 * without writing keeps the value); on false the node is left alone. */
typedef bool (*HstaaValFn)(HstaaTree *tree, CofferVal cur, CofferVal operand,
                           CofferVal *out);

/* Caller-provided handle. hst comes first, so an HstaaTree pointer is also an
 * HstTree and a MemPool pointer. Fill hst as HST_AllocTreeEx would, set the
 * callbacks, then call HST_CreateTreeData(&t->hst, ...). */
struct HstaaTree {
  HstTree hst;
  HstCloneValFn cloneValFn;
  HstaaValFn insertValFn;
  HstaaValFn removeValFn;
};

/* The modes of HSTAAPropagateVal: carry an insertion or a removal into the
 * elements of an array. Any other mode visits the elements and changes
 * nothing. */
#define HSTAA_PROPAGATE_INSERT 0
#define HSTAA_PROPAGATE_REMOVE 1

COFFER_API int32_t HSTAA_GetSubtreeValCount(HstaaTree *tree, HstNode *node);
COFFER_API bool HSTAA_IsArrayRep(const char *key);
COFFER_API const char *HSTAA_GetArrayRep(const char *key);
COFFER_API bool HSTAA_IsArrayIndex(const char *key);
COFFER_API HstNode *HSTAAFindPrefix(HstaaTree *tree, HstNode *node, char *path,
                                    bool *outComplete);
COFFER_API HstNode *HSTAA_FindPrefix(HstaaTree *tree, const char *path, bool *outComplete);
COFFER_API HstNode *HSTAA_Insert(HstaaTree *tree, const char *path, CofferVal val);
COFFER_API HstNode *HSTAAInsert(HstaaTree *tree, HstNode *node, char *path, CofferVal val);
COFFER_API bool HSTAA_Remove(HstaaTree *tree, const char *path, CofferVal val);
COFFER_API void HSTAARemove(HstaaTree *tree, HstNode *node, char *path, CofferVal val);
COFFER_API bool HSTAAPropagateVal(HstaaTree *tree, int32_t mode, HstNode *parent, HstNode *rep,
                                  char *rest, CofferVal val);

#ifdef __cplusplus
}
#endif

#endif
