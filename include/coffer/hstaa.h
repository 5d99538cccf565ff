// SPDX-License-Identifier: MIT
/** @file
 * coffer associative arrays over the string tree: path-keyed values with a
 * value count per subtree, and array templates.
 *
 * Under any node, a child named exactly "#" or "##" is the representative
 * (template) of an array whose elements are its siblings with element keys:
 * - "#" followed by one byte other than '#' and NUL, then anything ("#0",
 *   "#x", "#!", "#abc"): elements of the "#" array;
 * - "##" followed by at least one more byte ("##0", "###"): elements of the
 *   "##" array.
 * Only the first three bytes decide; there is no numeric syntax ("#01" and
 * "#1" are different elements). In strcmp order the "##" representative is
 * directly followed by all "##" elements; "#" is followed by the "#" elements
 * whose second byte is below '#' (0x01 to 0x22), then "##" and its elements,
 * then the other "#" elements (digits, letters, everything from 0x24).
 *
 * An element without a node of its own reads as its representative (lookups
 * go on inside the template). Inserting at or below a missing element first
 * makes it as a copy of the template; a value inserted or removed through a
 * template is first carried into the elements that follow it in key order,
 * up to the first key that is not an element of the same array (so an
 * insertion through "#" does not reach the "#" elements after a "##" run). A
 * removal that passes through an element drops it once it holds no values,
 * or exactly as many as its representative.
 *
 * Paths are those of the string tree (see hst.h): the absolute forms taken by
 * HSTAA_FindPrefix, HSTAA_Insert and HSTAA_Remove skip their first character;
 * the relative forms taken by HSTAAFindPrefix, HSTAAInsert, HSTAARemove and
 * HSTAAPropagateVal start with the first name below the given node, and are
 * cut in place (each separator is overwritten with NUL while the walk looks at
 * the name before it). An empty relative path names the start node itself.
 *
 * The value count of a node (subtreeValCount) is the number of values it
 * holds (one per accepted insertValFn call, less one per accepted removeValFn
 * call) plus the counts of its children; the root's count is the number of
 * values in the tree. The layer takes no lock.
 */
#ifndef COFFER_HSTAA_H
#define COFFER_HSTAA_H

#include <coffer/hst.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct HstaaTree HstaaTree;

/** Merges (insertion) or takes out (removal) operand from a node's value cur:
 * on true the node's new value is in *out (which starts as cur, so accepting
 * without writing keeps the value); on false the node is left alone. The value
 * replaced is not released. A removal callback should accept only when the
 * node holds the operand: the counts rely on it. */
typedef bool (*HstaaValFn)(HstaaTree *tree, CofferVal cur, CofferVal operand,
                           CofferVal *out);

/** Caller-provided handle. hst comes first, so an HstaaTree pointer is also an
 * HstTree and a MemPool pointer. Fill hst as HST_AllocTreeEx would (mp from
 * MemPool_InitOnStdHeap or another pool; the rest zero), set the callbacks,
 * then call HST_CreateTreeData(&t->hst, ...); end it with HST_FreeTree. Values
 * of nodes that the layer removes go to the release callback set on hst. */
struct HstaaTree {
  HstTree hst;
  HstCloneValFn cloneValFn; /**< copies template values into a new element */
  HstaaValFn insertValFn;   /**< merges an inserted value */
  HstaaValFn removeValFn;   /**< takes a removed value out */
};

/** Mode of HSTAAPropagateVal: carry an insertion into the elements of an
 * array. */
#define HSTAA_PROPAGATE_INSERT 0
/** Mode of HSTAAPropagateVal: carry a removal into the elements of an array.
 * Any other mode visits the elements and changes nothing. */
#define HSTAA_PROPAGATE_REMOVE 1

/**
 * Gives a node's value count: the values held in its subtree.
 *
 * @param tree  the tree (not used).
 * @param node  a node of the tree, not null.
 * @return the count.
 * @par Ownership
 * Unchanged.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API int32_t HSTAA_GetSubtreeValCount(HstaaTree *tree, HstNode *node);

/**
 * Tells whether key is an array representative: exactly "#" or "##".
 *
 * @param key  a NUL-terminated string, not null.
 * @return true for "#" and "##".
 * @par Ownership
 * Unchanged.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API bool HSTAA_IsArrayRep(const char *key);

/**
 * Gives the representative of the array that key is an element of.
 *
 * @param key  a NUL-terminated string, not null.
 * @return "#" for "#" elements, "##" for "##" elements (see above), null for
 *         anything else, the representatives themselves included.
 * @par Ownership
 * The result is one of two constant strings of the library, valid for the life
 * of the program and the same pointer every time; never change or free it.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API const char *HSTAA_GetArrayRep(const char *key);

/**
 * Tells whether key is an array element key, that is, whether
 * HSTAA_GetArrayRep(key) is not null.
 *
 * @param key  a NUL-terminated string, not null.
 * @return true for element keys.
 * @par Ownership
 * Unchanged.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API bool HSTAA_IsArrayIndex(const char *key);

/**
 * Resolves a relative path as far as it goes: each name is looked up exactly,
 * and an element name without a node of its own resolves to its
 * representative (a name that is itself "#" or "##" only exactly).
 *
 * @param tree              the tree.
 * @param node              the start node.
 * @param path              a writable relative path, or null.
 * @param[out] outComplete  set to true when every name resolved, else false.
 * @return the deepest node reached: the last one resolved, or the node under
 *         which the first unresolved name was sought. For a null or empty path,
 *         node itself (outComplete false only when node is null).
 * @par Ownership
 * The node stays the tree's. path is cut in place: after a complete walk it is
 * as it was; after an incomplete one the separator behind the unresolved name
 * is left overwritten with NUL.
 * @par Failure
 * None; an unresolved path is reported through outComplete.
 * @par Panic
 * Never.
 */
COFFER_API HstNode *HSTAAFindPrefix(HstaaTree *tree, HstNode *node, char *path,
                                    bool *outComplete);

/**
 * Resolves an absolute path from the root as HSTAAFindPrefix does, on a copy.
 *
 * @param tree              the tree.
 * @param path              an absolute path; not written.
 * @param[out] outComplete  set to true when every name resolved, else false.
 * @return the deepest node reached; an empty path gives the root with
 *         outComplete false.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * null when malloc cannot copy the path; outComplete is then left untouched.
 * @par Panic
 * Never.
 */
COFFER_API HstNode *HSTAA_FindPrefix(HstaaTree *tree, const char *path, bool *outComplete);

/**
 * Inserts a value at an absolute path. Missing nodes are made on the way: an
 * element as a copy of its representative's subtree (values through
 * cloneValFn, their count added to every ancestor), any other name as a plain
 * node holding the default value. At each "#" or "##" on the way, the value is
 * first carried below the existing elements (HSTAAPropagateVal, whose failures
 * do not stop the insertion). Last, insertValFn merges val into the target's
 * value; on acceptance the new value is stored and the counts of the target
 * and every ancestor grow by 1.
 *
 * @param tree  the tree.
 * @param path  an absolute path; not written.
 * @param val   the operand handed to insertValFn.
 * @return the target node, or null.
 * @par Ownership
 * What insertValFn wrote belongs to the tree; the value it replaced is not
 * released.
 * @par Failure
 * null for an empty path, when malloc cannot copy the path (tree unchanged),
 * when a node cannot be made, or when insertValFn refuses at the target.
 * Nodes and element copies made before a failing node stay, and so do values
 * already carried into elements. After a refusal the topmost plain node this
 * call made is removed again if it holds no values (element copies stay).
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API HstNode *HSTAA_Insert(HstaaTree *tree, const char *path, CofferVal val);

/**
 * As HSTAA_Insert, from node along a relative path.
 *
 * @param tree  the tree.
 * @param node  the start node, not null.
 * @param path  a writable relative path, or null (empty: the target is node,
 *              and nothing is made or carried).
 * @param val   the operand handed to insertValFn.
 * @return the target node, or null.
 * @par Ownership
 * As HSTAA_Insert. path is cut in place and is as it was when the call returns.
 * @par Failure
 * As HSTAA_Insert.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API HstNode *HSTAAInsert(HstaaTree *tree, HstNode *node, char *path, CofferVal val);

/**
 * Removes a value at an absolute path. The walk follows existing nodes only
 * (a missing element is not looked for in its representative). At each "#" or
 * "##" on the way the removal is first carried below the existing elements
 * (an element left with no values is removed). At the target removeValFn takes
 * val out; on acceptance the new value is stored and the counts drop by 1. On
 * the way back every node passed is removed when its count is 0, and an
 * element when its count equals its representative's; the start node is never
 * removed.
 *
 * @param tree  the tree.
 * @param path  an absolute path; not written.
 * @param val   the operand handed to removeValFn.
 * @return true once the removal has been carried out, whatever it found (an
 *         empty path does nothing); false when malloc cannot copy the path.
 * @par Ownership
 * The values of removed nodes go to the tree's release callback (not to
 * removeValFn). The value removeValFn replaced is not released.
 * @par Failure
 * false leaves the tree unchanged. A refusal of removeValFn is not reported,
 * and the pruning on the way back happens all the same.
 * @par Panic
 * When the pool panics on exhaustion: removing a child entry may shrink its
 * array, which asks the pool for a new, smaller block.
 */
COFFER_API bool HSTAA_Remove(HstaaTree *tree, const char *path, CofferVal val);

/**
 * As HSTAA_Remove, from node along a relative path.
 *
 * @param tree  the tree.
 * @param node  the start node, not null.
 * @param path  a writable relative path, or null (empty: removeValFn at node
 *              itself, which is never removed).
 * @param val   the operand handed to removeValFn.
 * @par Ownership
 * As HSTAA_Remove. path is cut in place and is as it was when the call returns.
 * @par Failure
 * None is reported.
 * @par Panic
 * As HSTAA_Remove.
 */
COFFER_API void HSTAARemove(HstaaTree *tree, HstNode *node, char *path, CofferVal val);

/**
 * Carries an insertion or a removal through a representative into the
 * elements of its array that exist: the children of parent that follow rep in
 * key order, up to the first key that is not an element of rep's array.
 * HSTAA_PROPAGATE_INSERT runs HSTAAInsert(tree, element, rest, val) on each
 * and stops at the first failure; HSTAA_PROPAGATE_REMOVE runs HSTAARemove and
 * removes an element left with no values. Any other mode only walks.
 *
 * @param tree    the tree.
 * @param mode    HSTAA_PROPAGATE_INSERT (0) or HSTAA_PROPAGATE_REMOVE (1).
 * @param parent  the node whose children are walked.
 * @param rep     a child of parent; nothing happens unless it is "#" or "##".
 * @param rest    the writable relative path below each element, or null.
 * @param val     the operand.
 * @return true when the walk ran to its end (or there was nothing to walk),
 *         false when an insertion into an element failed.
 * @par Ownership
 * As HSTAAInsert or HSTAARemove for each element. rest is as it was when the
 * call returns.
 * @par Failure
 * false: the elements before the failing one keep the value, that one and
 * those after it do not get it.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API bool HSTAAPropagateVal(HstaaTree *tree, int32_t mode, HstNode *parent, HstNode *rep,
                                  char *rest, CofferVal val);

#ifdef __cplusplus
}
#endif

#endif
