// SPDX-License-Identifier: MIT
/** @file
 * coffer hierarchical string tree: nodes named by strings, each holding one
 * value, addressed by walking named children or by paths such as /a/b. Each
 * node keeps its children in a sorted string array (strcmp order), so
 * children come back in name order and a name is found by bisection.
 *
 * Paths. A path is at least one character long. Its first character stands
 * for the leading separator and is never examined (xa/b finds what /a/b
 * finds); the rest is names cut at the tree's separator. A one-character path
 * names the root. Two separators in a row name a child with the empty name
 * (/a//b), and a separator that ends the path ends the walk there (/a/b/ names
 * what /a/b names). A NUL separator never cuts. Path calls copy the path into
 * a buffer from malloc (never the pool) and free it before they return; the
 * caller's string is never written.
 *
 * Values belong to the tree from the moment they are stored until they are
 * released through the tree's release callback when their node goes, values
 * equal to the tree's default value included. Replacing a value never
 * releases the old one. The tree takes no lock; callbacks run in the middle
 * of the call and must not change the tree.
 */
#ifndef COFFER_HST_H
#define COFFER_HST_H

#include <coffer/esa.h>

#ifdef __cplusplus
extern "C" {
#endif

/** A string tree's handle. */
typedef CollectionHeader HstTree;

/** The pool-resident record of a tree (a shared-memory format). */
typedef struct HstTreeData {
  PoolOffset root;
  int32_t size; /**< live nodes, the root included */
  char separator;
  uint8_t reserved[3];
  CofferVal defaultVal; /**< value of the root and of nodes made by paths */
  int32_t childCapacity;
  int32_t childCapacityIncrement;
} HstTreeData;

/** A node (a shared-memory format). */
typedef struct HstNode {
  PoolOffset parent;   /**< 0 for the root and for a detached node */
  PoolOffset children; /**< EsaArrayData of the children; 0 until the first */
  PoolOffset key;      /**< the node's own copy of its name */
  CofferVal val;
  int32_t subtreeValCount; /**< kept by the associative-array layer */
} HstNode;

/** Copies a value for HST_CloneSubtree: writes the copy to *out (which starts
 * as 0) and returns true, or returns false and keeps no copy. The copy then
 * belongs to the tree. */
typedef bool (*HstCloneValFn)(HstTree *tree, CofferVal val, CofferVal *out);

/**
 * Makes a tree on the process heap holding only its root, which has the empty
 * name and the value defaultVal.
 *
 * @param separator               the path separator, e.g. '/'.
 * @param defaultVal              the value of the root and of every node that
 *                                path insertion makes on the way.
 * @param childCapacity           initial capacity of every child array (a
 *                                negative one makes every child array fail).
 * @param childCapacityIncrement  capacity increment of every child array.
 * @return the new tree, or null.
 * @par Ownership
 * The tree owns its handle: HST_FreeTree releases it with everything else.
 * The root's value is the tree's, and is released like any other.
 * @par Failure
 * None (the process heap does not fail, it panics).
 * @par Panic
 * When the process heap is exhausted.
 */
COFFER_API HstTree *HST_AllocTree(char separator, CofferVal defaultVal, int32_t childCapacity,
                                  int32_t childCapacityIncrement);

/**
 * As HST_AllocTree, with the handle and every record from pool.
 *
 * @param pool                    the pool; read during this call only.
 * @param separator               the path separator.
 * @param defaultVal              the value of the root and of nodes made by paths.
 * @param childCapacity           initial capacity of every child array.
 * @param childCapacityIncrement  capacity increment of every child array.
 * @return the new tree, or null.
 * @par Ownership
 * The tree owns its handle: HST_FreeTree releases it with everything else.
 * @par Failure
 * null when the pool refuses the handle, the data record or the root; nothing
 * stays allocated.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API HstTree *HST_AllocTreeEx(MemPool *pool, char separator, CofferVal defaultVal,
                                    int32_t childCapacity, int32_t childCapacityIncrement);

/**
 * Gives a caller-built handle a tree: allocates the data record and the root
 * through the handle and stores the record in tree->data, overwriting
 * whatever was there. This is how an HstaaTree is set up.
 *
 * @param tree                    a handle whose mp is filled in (set the
 *                                callbacks, ownsHandle and data yourself).
 * @param separator               the path separator.
 * @param defaultVal              the value of the root and of nodes made by paths.
 * @param childCapacity           initial capacity of every child array.
 * @param childCapacityIncrement  capacity increment of every child array.
 * @return true on success.
 * @par Ownership
 * The records belong to the tree; the handle stays the caller's unless
 * ownsHandle is set. A data record tree->data held before is not released.
 * @par Failure
 * false with tree->data null and nothing allocated.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API bool HST_CreateTreeData(HstTree *tree, char separator, CofferVal defaultVal,
                                   int32_t childCapacity, int32_t childCapacityIncrement);

/**
 * Tells how many nodes the tree holds.
 *
 * @param tree  the tree.
 * @return the live nodes, the root included (1 for a fresh or cleared tree),
 *         detached nodes made with HSTAllocNode too.
 * @par Ownership
 * Unchanged.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API int32_t HST_GetSize(HstTree *tree);

/**
 * Sets the callback that releases the values the tree drops, and clears the
 * MpFreeValFn one.
 *
 * @param tree  the tree.
 * @param fn    the callback, or null for none.
 * @return the FreeValFn set before (not the MpFreeValFn this call clears).
 * @par Ownership
 * Every value of a node that goes from now on is handed to fn (default values
 * included), and so is every value given to HSTFreeVal.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API FreeValFn HST_SetFreeValFn(HstTree *tree, FreeValFn fn);

/**
 * Sets the callback that releases dropped values with the tree's handle as its
 * pool argument, and clears the FreeValFn one.
 *
 * @param tree  the tree.
 * @param fn    the callback, or null for none.
 * @return the MpFreeValFn set before (not the FreeValFn this call clears).
 * @par Ownership
 * As HST_SetFreeValFn, with fn receiving tree as the pool.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API MpFreeValFn HST_SetMpFreeValFn(HstTree *tree, MpFreeValFn fn);

/**
 * Gives the root.
 *
 * @param tree  the tree.
 * @return the root node (never null for a live tree).
 * @par Ownership
 * The node stays the tree's; it lives as long as the tree.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API HstNode *HST_GetRoot(HstTree *tree);

/**
 * Gives a node's parent.
 *
 * @param tree  the tree.
 * @param node  a node of this tree.
 * @return the parent, or null for the root and for a detached node.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API HstNode *HST_GetParent(HstTree *tree, HstNode *node);

/**
 * Gives a node's name.
 *
 * @param tree  the tree.
 * @param node  a node of this tree.
 * @return the node's own copy of its name; the empty string for the root.
 * @par Ownership
 * The string stays the tree's, valid while the node lives; do not change it.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API const char *HST_GetKey(HstTree *tree, HstNode *node);

/**
 * Gives a node's value.
 *
 * @param tree  the tree.
 * @param node  a node of this tree.
 * @return the value.
 * @par Ownership
 * The value stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API CofferVal HST_GetVal(HstTree *tree, HstNode *node);

/**
 * Replaces a node's value.
 *
 * @param tree  the tree.
 * @param node  a node of this tree.
 * @param val   the new value.
 * @par Ownership
 * The old value is not released: it is the caller's again. val belongs to the
 * tree.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void HST_SetVal(HstTree *tree, HstNode *node, CofferVal val);

/**
 * Tells how many children a node has.
 *
 * @param tree  the tree.
 * @param node  a node of this tree.
 * @return the number of children; 0 for a node without a child array.
 * @par Ownership
 * Unchanged.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API int32_t HST_GetNumChildren(HstTree *tree, HstNode *node);

/**
 * Gives a child by position in name order (strcmp order; equal names in the
 * order they were added).
 *
 * @param tree   the tree.
 * @param node   a node of this tree.
 * @param index  the position, 0 to HST_GetNumChildren - 1.
 * @return the child, or null for an index out of range.
 * @par Ownership
 * The node stays the tree's. Positions change when children are added or
 * removed.
 * @par Failure
 * null for an index out of range.
 * @par Panic
 * Never.
 */
COFFER_API HstNode *HST_GetChild(HstTree *tree, HstNode *node, int32_t index);

/**
 * Finds a child by its exact name (strcmp, case included).
 *
 * @param tree  the tree.
 * @param node  a node of this tree.
 * @param key   the name, not null.
 * @return the child, or null. If several children share the name, the one the
 *         bisection meets first.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API HstNode *HST_FindChild(HstTree *tree, HstNode *node, const char *key);

/**
 * Finds the node a path names (see the path syntax above).
 *
 * @param tree  the tree.
 * @param path  the path, at least one character.
 * @return the node, or null when a name on the way is missing.
 * @par Ownership
 * The node stays the tree's; path is not written.
 * @par Failure
 * null also for an empty path and when malloc cannot copy the path.
 * @par Panic
 * Never.
 */
COFFER_API HstNode *HST_Find(HstTree *tree, const char *path);

/**
 * Makes a child named key holding val under parent, at its place in name
 * order. An existing child of the same name is not looked for: the new one
 * goes after it, and both are reachable by position.
 *
 * @param tree    the tree.
 * @param parent  a node of this tree.
 * @param key     the name, not null.
 * @param val     the value.
 * @return the new child, or null.
 * @par Ownership
 * The tree makes two copies of key (the node's and the child array's) and owns
 * the node; val belongs to the tree until the node goes.
 * @par Failure
 * null for a null key or when the pool refuses the child array, the node, its
 * name or the array entry: the new node is released again, val is neither
 * stored nor released, and a child array made on the way stays, empty.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API HstNode *HST_InsertChild(HstTree *tree, HstNode *parent, const char *key,
                                    CofferVal val);

/* Node primitives, exported for the associative-array layer and for callers
 * that build trees by hand. */

/**
 * Makes a detached node (no parent, no children) named key holding val.
 *
 * @param tree  the tree.
 * @param key   the name, or null (then null is returned).
 * @param val   the value.
 * @return the new node, or null.
 * @par Ownership
 * The node is the tree's but reachable only through the returned pointer until
 * HSTInsertChildNode attaches it; it counts in HST_GetSize. Release a node that
 * stays detached with HSTFreeSubtree (value included) or HSTFreeNode (value
 * not released).
 * @par Failure
 * null when key is null or the pool refuses the key copy or the node; whichever
 * was granted is released again.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API HstNode *HSTAllocNode(HstTree *tree, const char *key, CofferVal val);

/**
 * Gives a node an empty child array.
 *
 * @param tree  the tree.
 * @param node  a node of this tree without a child array.
 * @return true when the array was made; false when the node already has one or
 *         the pool refuses it.
 * @par Ownership
 * The array belongs to the node; it goes with the node.
 * @par Failure
 * false changes nothing.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API bool HSTAllocChild(HstTree *tree, HstNode *node);

/**
 * Attaches a detached node under parent, at the place of its name. Sibling
 * names are not checked.
 *
 * @param tree    the tree.
 * @param parent  a node of this tree.
 * @param node    a detached node of this tree (from HSTAllocNode).
 * @return node, or null.
 * @par Ownership
 * The node and its subtree are now part of the tree.
 * @par Failure
 * null when the pool refuses the parent's child array or the entry: node stays
 * detached and untouched; a child array made on the way stays, empty.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API HstNode *HSTInsertChildNode(HstTree *tree, HstNode *parent, HstNode *node);

/**
 * Releases one node: its child array (but not the children), its name and the
 * node itself. It neither releases the value nor removes the node's entry from
 * its parent's child array.
 *
 * @param tree  the tree.
 * @param node  a detached node, or one whose parent entry and children the
 *              caller takes care of.
 * @par Ownership
 * The value is the caller's again; the children, if any, are orphaned.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void HSTFreeNode(HstTree *tree, HstNode *node);

/**
 * Stores val at the node a path names, making every missing node on the way
 * with the tree's default value.
 *
 * @param tree  the tree.
 * @param path  the path (see above), at least one character.
 * @param val   the value.
 * @return the node, now holding val, or null.
 * @par Ownership
 * val belongs to the tree. A value the node held is overwritten, not
 * released: it is the caller's again.
 * @par Failure
 * null for an empty path, when malloc cannot copy the path (tree unchanged) or
 * when the pool refuses a node: the nodes made before it stay, holding the
 * default value, and val is neither stored nor released.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API HstNode *HST_Insert(HstTree *tree, const char *path, CofferVal val);

/**
 * Releases a value as the tree releases the values it drops: through the
 * FreeValFn if set, else the MpFreeValFn with the tree as pool, else not at
 * all.
 *
 * @param tree  the tree.
 * @param val   the value.
 * @par Ownership
 * val has gone to the callback.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void HSTFreeVal(HstTree *tree, CofferVal val);

/**
 * Releases a node with its whole subtree, depth first (children in name order
 * before their parent), each value through the release callback. The node's
 * entry in its parent's child array is not touched: use it on a detached
 * subtree, or use HST_RemoveSubtree.
 *
 * @param tree  the tree.
 * @param node  the subtree's top.
 * @par Ownership
 * Every value of the subtree has gone to the release callback.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void HSTFreeSubtree(HstTree *tree, HstNode *node);

/**
 * Unlinks a node from its parent's child array (its own entry, even among
 * siblings of the same name) and releases it with its subtree as
 * HSTFreeSubtree does. Given the root, it empties the tree as HST_Clear does.
 *
 * @param tree  the tree.
 * @param node  a node of this tree.
 * @par Ownership
 * Every value of the subtree has gone to the release callback.
 * @par Failure
 * None.
 * @par Panic
 * When the pool panics on exhaustion: removing the entry may shrink the
 * parent's child array, which asks the pool for a new, smaller block.
 */
COFFER_API void HST_RemoveSubtree(HstTree *tree, HstNode *node);

/**
 * Releases every node but the root, each value through the release callback,
 * then the root's value; the root gets the default value again and a value
 * count of 0. Separator, default value and capacities stay.
 *
 * @param tree  the tree.
 * @par Ownership
 * Every value, the root's included, has gone to the release callback once.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void HST_Clear(HstTree *tree);

/**
 * Frees a tree: clears it as HST_Clear does, releases the root and the data
 * record, sets tree->data to null, and releases the handle if the tree owns
 * it.
 *
 * @param tree  the tree, or null (nothing happens). A handle whose data is null
 *              has only the handle released (if owned).
 * @par Ownership
 * Every value has gone to the release callback once.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void HST_FreeTree(HstTree *tree);

/**
 * Renames a detached node. Its entry in a parent's child array would keep the
 * old name and place, so attach the node only afterwards.
 *
 * @param tree    the tree.
 * @param node    a detached node of this tree.
 * @param newKey  the new name, not null.
 * @return true on success.
 * @par Ownership
 * The node keeps its own copy of newKey; the old copy is released.
 * @par Failure
 * false when the pool refuses the copy; the node keeps its old name.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API bool HSTReplaceKey(HstTree *tree, HstNode *node, const char *newKey);

/**
 * Copies the subtree of src, inside the same tree, and attaches the copy under
 * dstParent. A value equal to the default value is copied as it is; every
 * other value goes through cloneValFn (parents before children, siblings in
 * name order). Each copied node keeps its source's value count; nothing else
 * is counted. The children of src are counted before the copy is attached, so
 * a copy under src itself does not contain itself.
 *
 * @param tree        the tree.
 * @param src         the subtree's top.
 * @param cloneValFn  copies one value; may be null when every value of the
 *                    subtree equals the default value.
 * @param newKey      the copy's name, or null to keep src's name; descendants
 *                    keep their names.
 * @param dstParent   the node to attach the copy under.
 * @return the top of the copy, or null.
 * @par Ownership
 * The copy and the values cloneValFn made for it belong to the tree.
 * @par Failure
 * null when cloneValFn refuses or the pool refuses a node, name, child array or
 * entry: src is unchanged, nothing is attached to dstParent, and every value
 * copied so far went to the release callback again, with the default value
 * of every copied node that held it (a child array made for dstParent stays,
 * empty).
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API HstNode *HST_CloneSubtree(HstTree *tree, HstNode *src, HstCloneValFn cloneValFn,
                                     const char *newKey, HstNode *dstParent);

/**
 * Adds delta to the value count (subtreeValCount) of node and of every
 * ancestor up to the root, with 32-bit wrap-around. The associative-array
 * layer keeps the counts with it.
 *
 * @param tree   the tree.
 * @param node   a node of this tree, or null (nothing happens).
 * @param delta  the change; 0 does nothing.
 * @par Ownership
 * Unchanged.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void HSTAAAdjustSubtreeValCount(HstTree *tree, HstNode *node, int32_t delta);

#ifdef __cplusplus
}
#endif

#endif
