// SPDX-License-Identifier: MIT
/* Containers shared by processes, found by name.
 *
 * The parent creates a shared memory object, formats it as a heap region
 * under a process-shared lock kept in the object, gives the region a
 * directory of named roots and builds three containers there under names:
 * an associative array with an array template, a red-black tree and a
 * sorted string array. Worker processes then map the object at addresses of
 * their own, attach a pool with size 0, open each container by its name and
 * change them concurrently, each container call under a lock of the demo's
 * own (the containers take none). Last, the parent checks every container
 * and the heap, and shows in a private copy of the region that freeing every
 * container leaves it whole. The object stays, for coffer-inspect:
 *
 *   shared_demo [NAME]        (NAME defaults to /coffer-demo)
 *   coffer-inspect stats --shm NAME --offset 64 */
#define _GNU_SOURCE
#include <coffer/coffer.h>
#include <coffer/platform.h>

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

enum { WORKERS = 4, ITEMS = 250, REGION_SIZE = 4 << 20, LIMIT = 100 };

/* The head of the shared object: two locks. The heap region follows it;
 * everything else is found in the region, by name. */
typedef struct Shared {
  TandelExclLock heapLock; /* held by the pool for one allocator call */
  TandelExclLock demoLock; /* held by the demo around each container call */
} Shared;

#define REGION(sh) ((void *)((char *)(sh) + sizeof(Shared)))

/* Values of the associative array are counters: insertion adds the
 * operand, removal takes it away, and copies are plain. */
static bool AddVal(HstaaTree *t, CofferVal cur, CofferVal op, CofferVal *out) {
  (void)t;
  *out = cur + op;
  return true;
}
static bool SubVal(HstaaTree *t, CofferVal cur, CofferVal op, CofferVal *out) {
  (void)t;
  if (cur < op) return false;
  *out = cur - op;
  return true;
}
static bool CopyVal(HstTree *t, CofferVal v, CofferVal *out) {
  (void)t;
  *out = v;
  return true;
}

/* Process-local handles around the shared records. */
typedef struct Handles {
  MemPool pool;
  HstaaTree aa;
  RbtTree rbt;
  EsaArray esa;
} Handles;

/* Opens every container by its name in the region that pool runs. */
static bool OpenHandles(Handles *h) {
  if (!HST_OpenNamedTree(&h->aa.hst, &h->pool, "workers") ||
      !RBT_OpenNamedTree(&h->rbt, &h->pool, "even-items") ||
      !ESA_OpenNamedArray(&h->esa, &h->pool, "all-items"))
    return false;
  h->aa.cloneValFn = CopyVal;
  h->aa.insertValFn = AddVal;
  h->aa.removeValFn = SubVal;
  return true;
}

static bool AttachHandles(Handles *h, Shared *sh) {
  MemPool_InitOnSharedHeap(&h->pool, REGION(sh), 0, &sh->heapLock); /* attach */
  return OpenHandles(h);
}

static Shared *MapObject(int fd, size_t size) {
  void *p = mmap(NULL, size, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
  if (p == MAP_FAILED) {
    perror("mmap");
    exit(1);
  }
  return (Shared *)p;
}

static void Worker(int fd, size_t size, Shared *inherited, int w) {
  /* Map the object anew while the inherited mapping still occupies its
   * range, so this process sees the region at another address. */
  Shared *sh = MapObject(fd, size);
  Handles h;
  char path[64], key[32];
  int i;
  munmap(inherited, size);
  if (!AttachHandles(&h, sh)) {
    printf("worker %d: the containers are not found by name\n", w);
    _exit(1);
  }
  printf("worker %d: region mapped at %p\n", w, REGION(sh));
  fflush(stdout);
  for (i = 0; i < ITEMS; i++) {
    snprintf(path, sizeof path, "/workers/#%d/done", w);
    snprintf(key, sizeof key, "w%d-%03d", w, i);
    Tandel_AcquireExclLock(&sh->demoLock);
    HSTAA_Insert(&h.aa, path, 1);
    Tandel_ReleaseExclLock(&sh->demoLock);

    Tandel_AcquireExclLock(&sh->demoLock);
    RBT_Insert(&h.rbt, key, (CofferVal)(w * 1000 + i));
    Tandel_ReleaseExclLock(&sh->demoLock);

    Tandel_AcquireExclLock(&sh->demoLock);
    ESA_Insert(&h.esa, key, (CofferVal)(w * 1000 + i));
    Tandel_ReleaseExclLock(&sh->demoLock);
  }
  /* Take every odd item out of the tree again. */
  for (i = 1; i < ITEMS; i += 2) {
    RbtNode *n;
    snprintf(key, sizeof key, "w%d-%03d", w, i);
    Tandel_AcquireExclLock(&sh->demoLock);
    n = RBT_Find(&h.rbt, key);
    if (n) RBT_Remove(&h.rbt, n);
    Tandel_ReleaseExclLock(&sh->demoLock);
  }
  munmap(sh, size);
  _exit(0);
}

/* Walks the region's blocks: they must tile it exactly, and the free list
 * must hold exactly the free blocks. Returns the number of blocks. */
static int CheckHeap(void *region, int *freeBlocks) {
  ShRegionHeader *hdr = (ShRegionHeader *)region;
  uint32_t o = 16, listed = 0, f;
  int blocks = 0, nfree = 0;
  uint32_t prev = 0;
  while (o < hdr->regionSize) {
    ShBlockHeader *b = (ShBlockHeader *)((char *)region + o);
    if (b->prevBlockSize != prev || b->blockSize < 16) return -1;
    if (b->nextFree || b->prevFree) nfree++;
    blocks++;
    prev = b->blockSize;
    o += b->blockSize;
  }
  if (o != hdr->regionSize) return -1;
  for (f = hdr->freeHead; f != SH_NO_BLOCK; f = ((ShBlockHeader *)((char *)region + f))->nextFree)
    if (++listed > (uint32_t)blocks) return -1;
  if ((int)listed != nfree) return -1;
  *freeBlocks = nfree;
  return blocks;
}

static int Fail(const char *what) {
  printf("FAILED: %s\n", what);
  return 1;
}

/* Builds the three containers and names them. From then on every process,
 * this one included, reaches them by name, so the handles made with them
 * are released at once (a container's handle is a block of the pool). */
static bool MakeContainers(MemPool *pool) {
  HstTree *hst = HST_AllocTreeEx(pool, '/', 0, 4, 4);
  RbtTree *rbt = RBT_AllocTreeEx(pool);
  EsaArray *esa = ESA_AllocArrayEx(pool, 16, 64);
  bool named = hst && rbt && esa && Roots_Set(pool, "workers", ROOTS_KIND_HST, hst) &&
               Roots_Set(pool, "even-items", ROOTS_KIND_RBT, rbt) &&
               Roots_Set(pool, "all-items", ROOTS_KIND_ARRAY, esa);
  pool->free(pool, hst);
  pool->free(pool, rbt);
  pool->free(pool, esa);
  return named;
}

/* In a private copy of the region, at yet another address: open every
 * container by name, free it and the directory; the copy must then be one
 * free block. Returns the number of failures. */
static int FreeInCopy(void *region) {
  Handles c;
  int blocks, freeBlocks, errors = 0;
  void *copy = malloc(REGION_SIZE);
  if (!copy) return Fail("memory for the copy");
  memcpy(copy, region, REGION_SIZE);
  MemPool_InitOnSimpleHeap(&c.pool, copy, 0);
  if (!OpenHandles(&c)) {
    free(copy);
    return Fail("containers found by name in the copy");
  }
  HST_FreeTree(&c.aa.hst);
  RBT_FreeTree(&c.rbt);
  ESA_FreeArray(&c.esa);
  Roots_DestroyDirectory(&c.pool);
  blocks = CheckHeap(copy, &freeBlocks);
  if (blocks != 1 || freeBlocks != 1) errors += Fail("region whole again after freeing");
  printf("parent: in a copy, freeing every container leaves %s\n",
         blocks == 1 ? "one free block again" : "NOT a whole region");
  free(copy);
  return errors;
}

int main(int argc, char **argv) {
  const char *name = argc > 1 ? argv[1] : "/coffer-demo";
  size_t size = sizeof(Shared) + REGION_SIZE;
  Shared *sh;
  Handles h;
  HstNode *root;
  int fd, w, i, status, blocks, freeBlocks, errors = 0;
  pid_t pids[WORKERS];

  /* The object outlives the demo, so that coffer-inspect can read it. */
  fd = shm_open(name, O_RDWR | O_CREAT | O_TRUNC, 0600);
  if (fd < 0 || ftruncate(fd, (off_t)size) != 0) {
    perror(name);
    return 1;
  }
  sh = MapObject(fd, size);
  Tandel_InitExclLock(&sh->heapLock);
  Tandel_InitExclLock(&sh->demoLock);

  /* Format the region, give it a directory and build the containers. */
  MemPool_InitOnSharedHeap(&h.pool, REGION(sh), REGION_SIZE, &sh->heapLock);
  if (!Roots_CreateDirectory(&h.pool) || !MakeContainers(&h.pool) || !OpenHandles(&h))
    return Fail("creating and naming the containers");
  /* The array template: every worker's element starts as a copy of it. */
  HSTAA_Insert(&h.aa, "/workers/#/limit", LIMIT);
  printf("parent: region of %d bytes at %p, template /workers/#/limit = %d\n", REGION_SIZE,
         REGION(sh), LIMIT);
  fflush(stdout);

  for (w = 0; w < WORKERS; w++) {
    pids[w] = fork();
    if (pids[w] == 0) Worker(fd, size, sh, w);
  }
  for (w = 0; w < WORKERS; w++)
    if (waitpid(pids[w], &status, 0) < 0 || !WIFEXITED(status) || WEXITSTATUS(status) != 0)
      errors += Fail("a worker did not finish cleanly");

  /* Every container must hold exactly what the workers put there. */
  root = HST_GetRoot(&h.aa.hst);
  if (HSTAA_GetSubtreeValCount(&h.aa, root) != 1 + WORKERS * (1 + ITEMS))
    errors += Fail("value count of the associative array");
  for (w = 0; w < WORKERS; w++) {
    char path[64];
    HstNode *n;
    snprintf(path, sizeof path, "/workers/#%d/done", w);
    n = HST_Find(&h.aa.hst, path);
    if (!n || HST_GetVal(&h.aa.hst, n) != ITEMS) errors += Fail(path);
    snprintf(path, sizeof path, "/workers/#%d/limit", w);
    n = HST_Find(&h.aa.hst, path);
    if (!n || HST_GetVal(&h.aa.hst, n) != LIMIT) errors += Fail(path);
  }
  if (ESA_GetSize(&h.esa) != WORKERS * ITEMS) errors += Fail("size of the sorted array");
  for (i = 1; i < ESA_GetSize(&h.esa); i++)
    if (strcmp(ESA_GetKey(&h.esa, i - 1), ESA_GetKey(&h.esa, i)) >= 0)
      errors += Fail("order of the sorted array");
  if (RBT_GetSize(&h.rbt) != WORKERS * ((ITEMS + 1) / 2)) errors += Fail("size of the tree");
  {
    RbtNode *n = RBT_First(&h.rbt);
    for (i = 0; n; n = RBT_Next(&h.rbt, n), i++) {
      if ((n->val % 1000) % 2 != 0) errors += Fail("an odd item is still in the tree");
    }
    if (i != RBT_GetSize(&h.rbt)) errors += Fail("walk of the tree");
  }
  blocks = CheckHeap(REGION(sh), &freeBlocks);
  if (blocks < 0) errors += Fail("heap consistency");
  printf("parent: %d workers done; tree %d nodes, array %d entries, %d values in the "
         "associative array; heap %d blocks (%d free)\n",
         WORKERS, (int)RBT_GetSize(&h.rbt), (int)ESA_GetSize(&h.esa),
         (int)HSTAA_GetSubtreeValCount(&h.aa, root), blocks, freeBlocks);

  errors += FreeInCopy(REGION(sh));
  munmap(sh, size);
  close(fd);
  printf("parent: the region stays in the shared memory object %s, %u bytes in: try\n"
         "  coffer-inspect stats --shm %s --offset %u\n",
         name, (unsigned)sizeof(Shared), name, (unsigned)sizeof(Shared));
  printf(errors ? "demo FAILED\n" : "demo OK\n");
  return errors ? 1 : 0;
}
