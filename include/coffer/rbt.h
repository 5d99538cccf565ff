// SPDX-License-Identifier: MIT
/** @file
 * coffer red-black trees: ordered (key, value) trees with duplicates,
 * addressed by node. Three families share one handle and node layout and
 * offer the same twenty calls under their own prefix:
 * - RBT_* with string keys, copied into the pool and ordered byte by byte with
 *   each byte read as signed (-128 to 127, the NUL as 0): "ab" before "abc"
 *   before "b", but a key whose first byte is 0x80 or above comes before "A"
 *   and before the empty string. This is not strcmp order.
 * - RbtInt32_* with int32_t keys in serial order: a comes before b when
 *   a - b, wrapped to 32 bits, is negative. That is the signed order as long
 *   as the keys of one tree lie less than 2^31 apart; spread wider, the order
 *   is not transitive, traversal is not sorted and a search can miss a key
 *   that is present.
 * - RbtVoidPtr_* with pointer keys in unsigned address order; a key is never
 *   dereferenced, so it means something only in the process that made it.
 *
 * Equal keys stay in insertion order. A handle made by one family is used
 * with that family's calls only. Node pointers stay valid, with their key and
 * value, until that very node is removed (or the tree is cleared or freed):
 * no operation moves a key or value from one node to another, so a walk may
 * remove the node it stands on once it has taken the next one.
 *
 * Reading a node: node->val is the value. The key of an RBT_* node is the
 * string at (const char *)((uintptr_t)tree->mp.base + node->key) (an offset
 * from the pool's base, added as an integer: the base may be 0), of an
 * RbtInt32_* node (int32_t)node->key, of an RbtVoidPtr_* node
 * (const void *)(uintptr_t)node->key.
 * The trees take no lock: serialise the calls on one tree, and on all trees
 * that share a sentinel (removal writes the sentinel's parent field).
 */
#ifndef COFFER_RBT_H
#define COFFER_RBT_H

#include <coffer/mempool.h>

#ifdef __cplusplus
extern "C" {
#endif

/** A red-black tree's handle, for all three families. */
typedef CollectionHeader RbtTree;

/** The pool-resident record of a tree (a shared-memory format). */
typedef struct RbtTreeData {
  PoolOffset root;  /**< equal to nil while the tree is empty */
  PoolOffset nil;   /**< the sentinel */
  uint32_t ownsNil; /**< the tree allocated the sentinel */
  uint32_t size;    /**< nodes in the tree, the sentinel not counted */
} RbtTreeData;

/** A node (a shared-memory format); also the layout of a sentinel. */
typedef struct RbtNode {
  PoolOffset parent;
  PoolOffset left;
  PoolOffset right;
  uint32_t key;     /**< RBT_*: PoolOffset of the key copy; typed trees: the key */
  uint8_t color;    /**< 1 red, 0 black */
  uint8_t ownsNode; /**< the tree allocated the node */
  uint8_t reserved[2];
  CofferVal val;
} RbtNode;

/* ---- string keys ----------------------------------------------------------- */

/**
 * Makes an empty tree on the process heap, with a sentinel of its own.
 *
 * @return the new tree.
 * @par Ownership
 * The tree owns its handle and sentinel: RBT_FreeTree releases them.
 * @par Failure
 * None (the process heap does not fail, it panics).
 * @par Panic
 * When the process heap is exhausted.
 */
COFFER_API RbtTree *RBT_AllocTree(void);

/**
 * Makes an empty tree whose handle, records and sentinel come from pool;
 * the same as RBT_AllocTreeWithNil(pool, NULL).
 *
 * @param pool  the pool; the tree keeps a copy of the record, read during this
 *              call only.
 * @return the new tree, or null.
 * @par Ownership
 * The tree owns its handle and sentinel: RBT_FreeTree releases them.
 * @par Failure
 * null when the pool refuses the handle, the data record or the sentinel;
 * nothing stays allocated.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API RbtTree *RBT_AllocTreeEx(MemPool *pool);

/**
 * Makes an empty tree from pool that uses the caller's sentinel node. Several
 * trees of one pool may share one sentinel, which saves a node per tree.
 *
 * @param pool  the pool; read during this call only.
 * @param nil   a 24-byte RbtNode that pool's base can address (inside the
 *              region for a region pool), or null for a sentinel of the tree's
 *              own. Every field but key is written.
 * @return the new tree, or null.
 * @par Ownership
 * The tree owns its handle. A caller's sentinel stays the caller's: it is
 * never released and must outlive every tree that uses it.
 * @par Failure
 * null when the pool refuses the handle, the data record or the sentinel;
 * nothing stays allocated.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API RbtTree *RBT_AllocTreeWithNil(MemPool *pool, RbtNode *nil);

/**
 * Gives a caller-built handle an empty tree: allocates the data record (and,
 * without nil, a sentinel) through the handle and stores the record in
 * tree->data, overwriting whatever was there.
 *
 * @param tree  a handle whose mp is filled in (set the callbacks, ownsHandle
 *              and data yourself, e.g. to zero).
 * @param nil   the caller's sentinel, as for RBT_AllocTreeWithNil, or null.
 * @return 1 on success, 0 on failure.
 * @par Ownership
 * The records belong to the tree; the handle stays the caller's unless
 * ownsHandle is set. A data record tree->data held before is not released.
 * @par Failure
 * 0 with tree->data null and nothing allocated; the handle is never released.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API int32_t RBT_CreateTreeData(RbtTree *tree, RbtNode *nil);

/**
 * Frees a tree: removes every node as RBT_Clear does (values to the release
 * callback in ascending order), releases the sentinel if the tree made it and
 * the data record, sets tree->data to null, and releases the handle if the
 * tree owns it.
 *
 * @param tree  the tree, or null (nothing happens). A handle whose data is
 *              null has only the handle released (if owned).
 * @par Ownership
 * Everything the tree allocated is gone, key copies included. Nodes and a
 * sentinel that the caller supplied are the caller's again.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void RBT_FreeTree(RbtTree *tree);

/**
 * Removes every node, one at a time in ascending order, each exactly as
 * RBT_Remove does; the tree stays usable with its sentinel and callbacks.
 *
 * @param tree  the tree.
 * @par Ownership
 * Each value went to the release callback before its key copy and node were
 * released. Nodes the caller supplied are not released (their key copies are).
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void RBT_Clear(RbtTree *tree);

/**
 * Tells how many nodes the tree holds.
 *
 * @param tree  the tree.
 * @return the number of nodes, the sentinel not counted.
 * @par Ownership
 * Unchanged.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API int32_t RBT_GetSize(RbtTree *tree);

/**
 * Sets the callback that releases the values the tree drops, and clears the
 * MpFreeValFn one.
 *
 * @param tree  the tree.
 * @param fn    the callback, or null for none.
 * @return the FreeValFn set before (not the MpFreeValFn this call clears).
 * @par Ownership
 * Every value dropped from now on (node removed, tree cleared or freed) goes to
 * fn, while its node is still in the tree and counted; fn must not change the
 * tree.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API FreeValFn RBT_SetFreeValFn(RbtTree *tree, FreeValFn fn);

/**
 * Sets the callback that releases dropped values with the tree's handle as its
 * pool argument, and clears the FreeValFn one.
 *
 * @param tree  the tree.
 * @param fn    the callback, or null for none.
 * @return the MpFreeValFn set before (not the FreeValFn this call clears).
 * @par Ownership
 * As RBT_SetFreeValFn, with fn receiving tree as the pool.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API MpFreeValFn RBT_SetMpFreeValFn(RbtTree *tree, MpFreeValFn fn);

/**
 * Exchanges the contents of two trees of the same family and pool: their data
 * records swap root, sentinel, sentinel ownership and size. Each handle keeps
 * its pool, callbacks and ownership; no node moves and nothing is allocated.
 *
 * @param tree   one tree.
 * @param other  the other tree, in the same pool (offsets count from its base).
 * @par Ownership
 * Each tree now owns what the other owned, its sentinel included.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void RBT_Swap(RbtTree *tree, RbtTree *other);

/**
 * Inserts a node with a copy of key, after every node with an equal key.
 *
 * @param tree  the tree.
 * @param key   a NUL-terminated string.
 * @param val   the value.
 * @return the new node, or null.
 * @par Ownership
 * The tree stores its own copy of key (length + 1 bytes from the pool) and
 * owns the node. val belongs to the tree until the node is removed.
 * @par Failure
 * null for a null key, or when the pool refuses the key copy or the node; the
 * tree is unchanged, nothing stays allocated and val is not released.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API RbtNode *RBT_Insert(RbtTree *tree, const char *key, CofferVal val);

/**
 * As RBT_Insert, into a node the caller supplies.
 *
 * @param tree  the tree.
 * @param node  a 24-byte RbtNode that the pool's base can address, not in any
 *              tree; every field is written. Null: as RBT_Insert.
 * @param key   a NUL-terminated string.
 * @param val   the value.
 * @return node (or the node the tree made), or null.
 * @par Ownership
 * The key copy comes from the pool and belongs to the tree. The node's memory
 * stays the caller's: removal releases its key copy and value but not the
 * node, which may then be used again.
 * @par Failure
 * null for a null key or when the pool refuses the key copy (or the node, when
 * none was given); node is left untouched and val is not released.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API RbtNode *RBT_InsertNoAlloc(RbtTree *tree, RbtNode *node, const char *key,
                                      CofferVal val);

/**
 * Removes a node: its value goes to the release callback while the node is
 * still linked and counted, then the node is unlinked (its successor node,
 * not its contents, takes its place) and its key copy and, if the tree made
 * it, the node are released.
 *
 * @param tree  the tree.
 * @param node  a node of this tree.
 * @par Ownership
 * The value has gone to the release callback. Every other node pointer stays
 * valid.
 * @par Failure
 * None.
 * @par Panic
 * Never: removal allocates nothing.
 */
COFFER_API void RBT_Remove(RbtTree *tree, RbtNode *node);

/**
 * Removes the nodes from first up to but not including end, in ascending
 * order, each as RBT_Remove does.
 *
 * @param tree   the tree.
 * @param first  a node of this tree.
 * @param end    a node of this tree at or after first, or null for "to the last
 *               node". end == first removes nothing.
 * @par Ownership
 * As RBT_Remove, for every node of the range.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API void RBT_RemoveRange(RbtTree *tree, RbtNode *first, RbtNode *end);

/**
 * Finds a node whose key equals key: the first equal node on the path from the
 * root, which is not necessarily the first of an equal run (use
 * RBT_LowerBound for that).
 *
 * @param tree  the tree.
 * @param key   a NUL-terminated string, not null.
 * @return the node, or null when no key is equal.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RBT_Find(RbtTree *tree, const char *key);

/**
 * Finds the first node, in order, whose key is not less than key. With
 * RBT_UpperBound it delimits the run of nodes equal to key.
 *
 * @param tree  the tree.
 * @param key   a NUL-terminated string, not null.
 * @return the node, or null when every key is less.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RBT_LowerBound(RbtTree *tree, const char *key);

/**
 * Finds the first node, in order, whose key is greater than key.
 *
 * @param tree  the tree.
 * @param key   a NUL-terminated string, not null.
 * @return the node, or null when no key is greater.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RBT_UpperBound(RbtTree *tree, const char *key);

/**
 * Gives the first node in order.
 *
 * @param tree  the tree.
 * @return the node, or null when the tree is empty.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RBT_First(RbtTree *tree);

/**
 * Gives the node after node in order.
 *
 * @param tree  the tree.
 * @param node  a node of this tree, not null.
 * @return the next node, or null after the last.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RBT_Next(RbtTree *tree, RbtNode *node);

/**
 * Gives the node before node in order; with a null node, the last node, so
 * RBT_Prev(tree, NULL) starts a descending walk.
 *
 * @param tree  the tree.
 * @param node  a node of this tree, or null.
 * @return the previous (or last) node, or null before the first (or for an
 *         empty tree).
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RBT_Prev(RbtTree *tree, RbtNode *node);

/* ---- 32-bit integer keys ---------------------------------------------------
 * The same calls as RBT_*, with an int32_t key kept in the node itself in
 * serial order (see the top of this file). Nothing about a key is allocated:
 * insertion allocates the node only, and with a node of the caller's makes no
 * pool call at all. */

/** @copydoc RBT_AllocTree */
COFFER_API RbtTree *RbtInt32_AllocTree(void);
/** @copydoc RBT_AllocTreeEx */
COFFER_API RbtTree *RbtInt32_AllocTreeEx(MemPool *pool);
/** @copydoc RBT_AllocTreeWithNil */
COFFER_API RbtTree *RbtInt32_AllocTreeWithNil(MemPool *pool, RbtNode *nil);
/** @copydoc RBT_CreateTreeData */
COFFER_API int32_t RbtInt32_CreateTreeData(RbtTree *tree, RbtNode *nil);
/** @copydoc RBT_FreeTree */
COFFER_API void RbtInt32_FreeTree(RbtTree *tree);
/** @copydoc RBT_Clear */
COFFER_API void RbtInt32_Clear(RbtTree *tree);
/** @copydoc RBT_GetSize */
COFFER_API int32_t RbtInt32_GetSize(RbtTree *tree);
/** @copydoc RBT_SetFreeValFn */
COFFER_API FreeValFn RbtInt32_SetFreeValFn(RbtTree *tree, FreeValFn fn);
/** @copydoc RBT_SetMpFreeValFn */
COFFER_API MpFreeValFn RbtInt32_SetMpFreeValFn(RbtTree *tree, MpFreeValFn fn);
/** @copydoc RBT_Swap */
COFFER_API void RbtInt32_Swap(RbtTree *tree, RbtTree *other);

/**
 * Inserts a node with key, after every node with an equal key.
 *
 * @param tree  the tree.
 * @param key   the key, any int32_t value.
 * @param val   the value.
 * @return the new node, or null.
 * @par Ownership
 * The tree owns the node; val belongs to the tree until the node is removed.
 * @par Failure
 * null when the pool refuses the node; the tree is unchanged and val is not
 * released.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API RbtNode *RbtInt32_Insert(RbtTree *tree, int32_t key, CofferVal val);

/**
 * As RbtInt32_Insert, into a node the caller supplies; then no pool call is
 * made and the call cannot fail.
 *
 * @param tree  the tree.
 * @param node  a 24-byte RbtNode that the pool's base can address, not in any
 *              tree; every field is written. Null: as RbtInt32_Insert.
 * @param key   the key.
 * @param val   the value.
 * @return node (or the node the tree made), or null.
 * @par Ownership
 * The node's memory stays the caller's: removal drops its value but does not
 * release the node, which may then be used again.
 * @par Failure
 * Only without a node: null when the pool refuses one.
 * @par Panic
 * Only without a node, when the pool panics on exhaustion.
 */
COFFER_API RbtNode *RbtInt32_InsertNoAlloc(RbtTree *tree, RbtNode *node, int32_t key,
                                           CofferVal val);

/** @copydoc RBT_Remove */
COFFER_API void RbtInt32_Remove(RbtTree *tree, RbtNode *node);
/** @copydoc RBT_RemoveRange */
COFFER_API void RbtInt32_RemoveRange(RbtTree *tree, RbtNode *first, RbtNode *end);

/**
 * Finds a node whose key equals key: the first equal node on the path from the
 * root, not necessarily the first of an equal run.
 *
 * @param tree  the tree.
 * @param key   the key.
 * @return the node, or null when no key is equal.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RbtInt32_Find(RbtTree *tree, int32_t key);

/**
 * Finds the first node, in serial order, whose key does not come before key.
 *
 * @param tree  the tree.
 * @param key   the key.
 * @return the node, or null when every key comes before key.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RbtInt32_LowerBound(RbtTree *tree, int32_t key);

/**
 * Finds the first node, in serial order, whose key comes after key.
 *
 * @param tree  the tree.
 * @param key   the key.
 * @return the node, or null when no key comes after key.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RbtInt32_UpperBound(RbtTree *tree, int32_t key);

/** @copydoc RBT_First */
COFFER_API RbtNode *RbtInt32_First(RbtTree *tree);
/** @copydoc RBT_Next */
COFFER_API RbtNode *RbtInt32_Next(RbtTree *tree, RbtNode *node);
/** @copydoc RBT_Prev */
COFFER_API RbtNode *RbtInt32_Prev(RbtTree *tree, RbtNode *node);

/* ---- pointer keys ------------------------------------------------------------
 * The same calls as RBT_*, with a pointer key kept in the node itself in
 * unsigned address order. The address is stored and compared as a number,
 * never dereferenced nor turned into an offset; null is an ordinary key.
 * Insertion allocates the node only, and with a node of the caller's makes no
 * pool call at all. */

/** @copydoc RBT_AllocTree */
COFFER_API RbtTree *RbtVoidPtr_AllocTree(void);
/** @copydoc RBT_AllocTreeEx */
COFFER_API RbtTree *RbtVoidPtr_AllocTreeEx(MemPool *pool);
/** @copydoc RBT_AllocTreeWithNil */
COFFER_API RbtTree *RbtVoidPtr_AllocTreeWithNil(MemPool *pool, RbtNode *nil);
/** @copydoc RBT_CreateTreeData */
COFFER_API int32_t RbtVoidPtr_CreateTreeData(RbtTree *tree, RbtNode *nil);
/** @copydoc RBT_FreeTree */
COFFER_API void RbtVoidPtr_FreeTree(RbtTree *tree);
/** @copydoc RBT_Clear */
COFFER_API void RbtVoidPtr_Clear(RbtTree *tree);
/** @copydoc RBT_GetSize */
COFFER_API int32_t RbtVoidPtr_GetSize(RbtTree *tree);
/** @copydoc RBT_SetFreeValFn */
COFFER_API FreeValFn RbtVoidPtr_SetFreeValFn(RbtTree *tree, FreeValFn fn);
/** @copydoc RBT_SetMpFreeValFn */
COFFER_API MpFreeValFn RbtVoidPtr_SetMpFreeValFn(RbtTree *tree, MpFreeValFn fn);
/** @copydoc RBT_Swap */
COFFER_API void RbtVoidPtr_Swap(RbtTree *tree, RbtTree *other);

/**
 * Inserts a node with key, after every node with an equal key.
 *
 * @param tree  the tree.
 * @param key   the key, any address (null included); not dereferenced.
 * @param val   the value.
 * @return the new node, or null.
 * @par Ownership
 * The tree owns the node; what key points to stays the caller's. val belongs
 * to the tree until the node is removed.
 * @par Failure
 * null when the pool refuses the node; the tree is unchanged and val is not
 * released.
 * @par Panic
 * When the pool panics on exhaustion.
 */
COFFER_API RbtNode *RbtVoidPtr_Insert(RbtTree *tree, const void *key, CofferVal val);

/**
 * As RbtVoidPtr_Insert, into a node the caller supplies; then no pool call is
 * made and the call cannot fail.
 *
 * @param tree  the tree.
 * @param node  a 24-byte RbtNode that the pool's base can address, not in any
 *              tree; every field is written. Null: as RbtVoidPtr_Insert.
 * @param key   the key.
 * @param val   the value.
 * @return node (or the node the tree made), or null.
 * @par Ownership
 * The node's memory stays the caller's: removal drops its value but does not
 * release the node, which may then be used again.
 * @par Failure
 * Only without a node: null when the pool refuses one.
 * @par Panic
 * Only without a node, when the pool panics on exhaustion.
 */
COFFER_API RbtNode *RbtVoidPtr_InsertNoAlloc(RbtTree *tree, RbtNode *node, const void *key,
                                             CofferVal val);

/** @copydoc RBT_Remove */
COFFER_API void RbtVoidPtr_Remove(RbtTree *tree, RbtNode *node);
/** @copydoc RBT_RemoveRange */
COFFER_API void RbtVoidPtr_RemoveRange(RbtTree *tree, RbtNode *first, RbtNode *end);

/**
 * Finds a node whose key is the address key: the first equal node on the path
 * from the root, not necessarily the first of an equal run.
 *
 * @param tree  the tree.
 * @param key   the key.
 * @return the node, or null when no key is equal.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RbtVoidPtr_Find(RbtTree *tree, const void *key);

/**
 * Finds the first node, in address order, whose key is not below key.
 *
 * @param tree  the tree.
 * @param key   the key.
 * @return the node, or null when every key is below key.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RbtVoidPtr_LowerBound(RbtTree *tree, const void *key);

/**
 * Finds the first node, in address order, whose key is above key.
 *
 * @param tree  the tree.
 * @param key   the key.
 * @return the node, or null when no key is above key.
 * @par Ownership
 * The node stays the tree's.
 * @par Failure
 * None.
 * @par Panic
 * Never.
 */
COFFER_API RbtNode *RbtVoidPtr_UpperBound(RbtTree *tree, const void *key);

/** @copydoc RBT_First */
COFFER_API RbtNode *RbtVoidPtr_First(RbtTree *tree);
/** @copydoc RBT_Next */
COFFER_API RbtNode *RbtVoidPtr_Next(RbtTree *tree, RbtNode *node);
/** @copydoc RBT_Prev */
COFFER_API RbtNode *RbtVoidPtr_Prev(RbtTree *tree, RbtNode *node);

#ifdef __cplusplus
}
#endif

#endif
