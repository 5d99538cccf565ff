// SPDX-License-Identifier: MIT
/** @file
 * coffer named roots: a small directory inside a heap region that maps names
 * to the containers kept there, so that every process mapping the region
 * finds them by name, and handles opened around those containers.
 *
 * The directory is found through the two reserved words of the region
 * header, which the region heap never reads or writes: the first holds
 * ROOTS_REGION_MAGIC, the second the PoolOffset of the RootsDirectory
 * record. Its entries (name, kind, record) are kept in name order in a block
 * of their own. Every call here takes a pool whose base is a formatted heap
 * region (a shared-heap or simple-heap pool, attached or formatted) and whose
 * lock word is 0 or the handle of the lock held around every heap call.
 *
 * What is guaranteed about old bytes. The reserved words outlive a format
 * (SH_Reset leaves them as they were) and payloads are never cleared, so a
 * region formatted again still holds the old directory's words and record.
 * A directory is therefore trusted only when all of these hold, checked on
 * every call before anything is followed:
 * - the first reserved word is ROOTS_REGION_MAGIC;
 * - the record and its entry block lie inside the region, on 4-byte
 *   boundaries, and each is the payload of an allocated block large enough
 *   for it, found by walking the block tiling from the first block (under the
 *   pool's lock). After a format the region is one free block, so an old
 *   directory lies inside it and is refused; the same holds once later
 *   allocations have cut that block up, unless one of them starts exactly
 *   where the old directory's block did;
 * - the record holds ROOTS_DIRECTORY_MAGIC and its own offset, a count
 *   within its capacity, and every entry in use a terminated, non-empty name
 *   in strictly ascending order, a known kind and a record inside the region.
 * The one case no check can tell apart: after a format, new blocks placed
 *   exactly where the old directory and its entries were, with the same
 *   sizes, whose payloads nobody has written yet. A program that formats a
 *   region which may hold old bytes calls Roots_DestroyDirectory (or
 *   Roots_CreateDirectory) right after formatting: both write the reserved
 *   words before any other block exists.
 *
 * A root names a container; it does not own it. Freeing a container leaves
 * its root in place: remove the root first. Opening a handle checks the
 * record and, for trees, the sentinel (a constant-time check, not a walk of
 * the container).
 *
 * Concurrency. Directory changes, and reads concurrent with them, are
 * serialised by the caller with a lock of its own, as for any container. The
 * calls take the pool's lock only while they walk the block tiling, and
 * release it before they allocate.
 */
#ifndef COFFER_ROOTS_H
#define COFFER_ROOTS_H

#include <coffer/esa.h>
#include <coffer/hst.h>
#include <coffer/rbt.h>

#ifdef __cplusplus
extern "C" {
#endif

/** The first reserved word of a region header that holds a directory. */
#define ROOTS_REGION_MAGIC 0x746F6F52u
/** The first word of a directory record. */
#define ROOTS_DIRECTORY_MAGIC 0x72694452u
/** The longest name of a root, in bytes, without its terminator. */
#define ROOTS_NAME_MAX 39

/** The kinds of container a root names, by the record it names. */
#define ROOTS_KIND_ARRAY 1       /**< sorted string array: an EsaArrayData */
#define ROOTS_KIND_RBT 2         /**< string-keyed red-black tree: an RbtTreeData */
#define ROOTS_KIND_RBT_INT32 3   /**< 32-bit integer keys: an RbtTreeData */
#define ROOTS_KIND_RBT_VOIDPTR 4 /**< pointer keys: an RbtTreeData */
#define ROOTS_KIND_HST 5         /**< string tree, associative arrays too: an HstTreeData */

/** The directory record (a shared-memory format). */
typedef struct RootsDirectory {
  uint32_t magic;     /**< ROOTS_DIRECTORY_MAGIC */
  PoolOffset self;    /**< this record's own offset */
  PoolOffset entries; /**< the entry block; 0 while capacity is 0 */
  int32_t count;      /**< entries in use, in name order */
  int32_t capacity;   /**< entries the block holds */
} RootsDirectory;

/** One entry of the directory (a shared-memory format). */
typedef struct RootsEntry {
  char name[ROOTS_NAME_MAX + 1]; /**< NUL-terminated, zero-padded */
  uint32_t kind;                 /**< a ROOTS_KIND_* */
  PoolOffset record;             /**< the container's data record */
} RootsEntry;

/**
 * Gives the pool's region a directory, empty, unless it has one already.
 *
 * @param pool  a pool whose base is a formatted heap region.
 * @return true when the region has a directory afterwards.
 * @par Ownership
 * The directory lives in the region; Roots_DestroyDirectory releases it.
 * @par Failure
 * false, with the region as it was, when pool has no base or refuses the
 * record, or when the record it hands out is not a block of the region.
 * @par Panic
 * When the pool panics on exhaustion (the shared-heap pool).
 */
COFFER_API bool Roots_CreateDirectory(MemPool *pool);

/**
 * Releases the region's directory, if it has one, and clears both reserved
 * words of the region header. On a region just formatted it makes sure that
 * no old directory is ever found.
 *
 * @param pool  a pool whose base is a formatted heap region.
 * @par Ownership
 * The containers the roots named are left as they are.
 * @par Failure
 * None: without a directory only the reserved words are written.
 * @par Panic
 * Never.
 */
COFFER_API void Roots_DestroyDirectory(MemPool *pool);

/**
 * Names a container: inserts the root, or replaces the kind and record of the
 * root of that name.
 *
 * @param pool       a pool whose base is the region holding the directory.
 * @param name       1 to ROOTS_NAME_MAX bytes, NUL-terminated; copied.
 * @param kind       a ROOTS_KIND_* that matches the container's family.
 * @param container  a handle whose data record lies in the region; read
 *                   during this call only.
 * @return true when the root is set.
 * @par Ownership
 * The root refers to the container's record and does not own it.
 * @par Failure
 * false, with the directory as it was, when there is no directory, the name
 * is empty or too long, the kind unknown, the record outside the region or
 * not sound for that kind, or the pool refuses a larger entry block.
 * @par Panic
 * When the pool panics on exhaustion (the shared-heap pool).
 */
COFFER_API bool Roots_Set(MemPool *pool, const char *name, int32_t kind,
                          const CollectionHeader *container);

/**
 * Finds a root by name.
 *
 * @param pool       a pool whose base is the region holding the directory.
 * @param name       the name, NUL-terminated.
 * @param outKind    receives the root's ROOTS_KIND_* (may be null).
 * @param outRecord  receives the PoolOffset of its record (may be null).
 * @return true when the root exists.
 * @par Ownership
 * Nothing changes hands.
 * @par Failure
 * false, the outputs untouched, without a directory or such a root.
 * @par Panic
 * Never.
 */
COFFER_API bool Roots_Get(MemPool *pool, const char *name, int32_t *outKind,
                          PoolOffset *outRecord);

/**
 * Removes a root; the container it named stays as it is.
 *
 * @param pool  a pool whose base is the region holding the directory.
 * @param name  the name, NUL-terminated.
 * @return true when a root was removed.
 * @par Ownership
 * Nothing is released but the entry (the entry block keeps its size).
 * @par Failure
 * false, the directory as it was, without a directory or such a root.
 * @par Panic
 * Never.
 */
COFFER_API bool Roots_Remove(MemPool *pool, const char *name);

/**
 * Counts the roots.
 *
 * @param pool  a pool whose base is a formatted heap region.
 * @return the number of roots, or -1 when the region has no directory.
 * @par Ownership
 * Nothing changes hands.
 * @par Failure
 * -1 without a directory.
 * @par Panic
 * Never.
 */
COFFER_API int32_t Roots_GetCount(MemPool *pool);

/**
 * Reads the root at index, in name order.
 *
 * @param pool       a pool whose base is the region holding the directory.
 * @param index      0 .. Roots_GetCount(pool) - 1.
 * @param outName    receives the name, inside the region (may be null); it
 *                   stays valid until the next change of the directory.
 * @param outKind    receives the ROOTS_KIND_* (may be null).
 * @param outRecord  receives the PoolOffset of the record (may be null).
 * @return true when there is a root at index.
 * @par Ownership
 * The name belongs to the directory.
 * @par Failure
 * false, the outputs untouched, without a directory or for an index out of
 * range.
 * @par Panic
 * Never.
 */
COFFER_API bool Roots_GetAt(MemPool *pool, int32_t index, const char **outName,
                            int32_t *outKind, PoolOffset *outRecord);

/**
 * Opens a handle around the array whose record is at record in the pool's
 * region: mp is a copy of *pool, no release callbacks, ownsHandle false,
 * data the record's address.
 *
 * @param arr     the caller's handle to fill.
 * @param pool    a pool whose base is the region; copied.
 * @param record  the PoolOffset of an EsaArrayData.
 * @return true when the handle was filled.
 * @par Ownership
 * The caller owns the handle; ESA_FreeArray on it frees the array in the
 * region and leaves the handle alone.
 * @par Failure
 * false, the handle untouched, when the record is not the payload of an
 * allocated block of the region or its size, capacity or entry block are not
 * sound.
 * @par Panic
 * Never.
 */
COFFER_API bool ESA_OpenArray(EsaArray *arr, MemPool *pool, PoolOffset record);

/**
 * Opens a handle around the array named name in the region's directory, as
 * ESA_OpenArray does.
 *
 * @param arr   the caller's handle to fill.
 * @param pool  a pool whose base is the region; copied.
 * @param name  the root's name.
 * @return true when the handle was filled.
 * @par Ownership
 * As ESA_OpenArray.
 * @par Failure
 * false, the handle untouched, without a directory, without such a root, for
 * a root of another kind, or as ESA_OpenArray.
 * @par Panic
 * Never.
 */
COFFER_API bool ESA_OpenNamedArray(EsaArray *arr, MemPool *pool, const char *name);

/**
 * Opens a handle around the string-keyed red-black tree whose record is at
 * record in the pool's region: mp is a copy of *pool, no release callbacks,
 * ownsHandle false, data the record's address.
 *
 * @param tree    the caller's handle to fill.
 * @param pool    a pool whose base is the region; copied.
 * @param record  the PoolOffset of an RbtTreeData.
 * @return true when the handle was filled.
 * @par Ownership
 * The caller owns the handle; RBT_FreeTree on it frees the tree in the region
 * and leaves the handle alone.
 * @par Failure
 * false, the handle untouched, when the record is not the payload of an
 * allocated block of the region, or its sentinel or root lie outside the
 * region, or the sentinel is not black with both children itself, owned and
 * without a value.
 * @par Panic
 * Never.
 */
COFFER_API bool RBT_OpenTree(RbtTree *tree, MemPool *pool, PoolOffset record);

/**
 * Opens a handle around the string-keyed red-black tree named name in the
 * region's directory, as RBT_OpenTree does.
 *
 * @param tree  the caller's handle to fill.
 * @param pool  a pool whose base is the region; copied.
 * @param name  the root's name.
 * @return true when the handle was filled.
 * @par Ownership
 * As RBT_OpenTree.
 * @par Failure
 * false, the handle untouched, without a directory, without such a root, for
 * a root of another kind, or as RBT_OpenTree.
 * @par Panic
 * Never.
 */
COFFER_API bool RBT_OpenNamedTree(RbtTree *tree, MemPool *pool, const char *name);

/**
 * As RBT_OpenTree, for a tree of 32-bit integer keys.
 *
 * @param tree    the caller's handle to fill.
 * @param pool    a pool whose base is the region; copied.
 * @param record  the PoolOffset of an RbtTreeData.
 * @return true when the handle was filled.
 * @par Ownership
 * As RBT_OpenTree.
 * @par Failure
 * As RBT_OpenTree.
 * @par Panic
 * Never.
 */
COFFER_API bool RbtInt32_OpenTree(RbtTree *tree, MemPool *pool, PoolOffset record);

/**
 * As RBT_OpenNamedTree, for a root of kind ROOTS_KIND_RBT_INT32.
 *
 * @param tree  the caller's handle to fill.
 * @param pool  a pool whose base is the region; copied.
 * @param name  the root's name.
 * @return true when the handle was filled.
 * @par Ownership
 * As RBT_OpenTree.
 * @par Failure
 * As RBT_OpenNamedTree.
 * @par Panic
 * Never.
 */
COFFER_API bool RbtInt32_OpenNamedTree(RbtTree *tree, MemPool *pool, const char *name);

/**
 * As RBT_OpenTree, for a tree of pointer keys.
 *
 * @param tree    the caller's handle to fill.
 * @param pool    a pool whose base is the region; copied.
 * @param record  the PoolOffset of an RbtTreeData.
 * @return true when the handle was filled.
 * @par Ownership
 * As RBT_OpenTree.
 * @par Failure
 * As RBT_OpenTree.
 * @par Panic
 * Never.
 */
COFFER_API bool RbtVoidPtr_OpenTree(RbtTree *tree, MemPool *pool, PoolOffset record);

/**
 * As RBT_OpenNamedTree, for a root of kind ROOTS_KIND_RBT_VOIDPTR.
 *
 * @param tree  the caller's handle to fill.
 * @param pool  a pool whose base is the region; copied.
 * @param name  the root's name.
 * @return true when the handle was filled.
 * @par Ownership
 * As RBT_OpenTree.
 * @par Failure
 * As RBT_OpenNamedTree.
 * @par Panic
 * Never.
 */
COFFER_API bool RbtVoidPtr_OpenNamedTree(RbtTree *tree, MemPool *pool, const char *name);

/**
 * Opens a handle around the string tree whose record is at record in the
 * pool's region: mp is a copy of *pool, no release callbacks, ownsHandle
 * false, data the record's address. For an associative array, open its hst
 * member and then set the three callbacks.
 *
 * @param tree    the caller's handle to fill.
 * @param pool    a pool whose base is the region; copied.
 * @param record  the PoolOffset of an HstTreeData.
 * @return true when the handle was filled.
 * @par Ownership
 * The caller owns the handle; HST_FreeTree on it frees the tree in the region
 * and leaves the handle alone.
 * @par Failure
 * false, the handle untouched, when the record is not the payload of an
 * allocated block of the region, its size is below 1, or its root lies
 * outside the region, has a parent or a name other than "".
 * @par Panic
 * Never.
 */
COFFER_API bool HST_OpenTree(HstTree *tree, MemPool *pool, PoolOffset record);

/**
 * Opens a handle around the string tree named name in the region's
 * directory, as HST_OpenTree does.
 *
 * @param tree  the caller's handle to fill.
 * @param pool  a pool whose base is the region; copied.
 * @param name  the root's name.
 * @return true when the handle was filled.
 * @par Ownership
 * As HST_OpenTree.
 * @par Failure
 * false, the handle untouched, without a directory, without such a root, for
 * a root of another kind, or as HST_OpenTree.
 * @par Panic
 * Never.
 */
COFFER_API bool HST_OpenNamedTree(HstTree *tree, MemPool *pool, const char *name);

#ifdef __cplusplus
}
#endif

#endif
