// Eight processes change containers of every family kept in one heap region,
// each mapping the region at its own address, each container under a lock of
// its own; between changes each moves a block of its own around the heap.
// Every process works on its own keys drawn from its own seed, so the parent
// can replay what each did into models: at the end every container must
// match its model, and the heap must check clean and, once the containers
// are freed, hold nothing.
#include <coffer/coffer.h>
#include <coffer/platform.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <map>
#include <memory>
#include <random>

#include "mempool/region_heap.h"

namespace {

#ifdef COFFER_CHECKS  // every heap call walks the whole region: fewer changes
constexpr int kOps = 300;
#else
constexpr int kOps = 4000;
#endif
constexpr int kProcs = 8, kFamilies = 6;  // ESA, RBT, RbtInt32, RbtVoidPtr, HST, HSTAA
constexpr uint32_t kRegion = 1 << 18;

// The head of the shared object; the region follows it. It holds offsets
// only, since every process maps the object at its own address.
struct Shared {
  TandelExclLock heapLock, locks[kFamilies];
  PoolOffset data[kFamilies];  // each container's data record
  char *Region() { return reinterpret_cast<char *>(this + 1); }
};

// The associative array's values count insertions: +1 in, -1 out.
bool Add(HstaaTree *, CofferVal cur, CofferVal op, CofferVal *out) { return *out = cur + op, true; }
bool Sub(HstaaTree *, CofferVal cur, CofferVal op, CofferVal *out) {
  return cur >= op && (*out = cur - op, true);
}

// Process-local handles around the shared records.
struct Handles {
  MemPool pool;
  CollectionHeader c[kFamilies];  // the last is aa's
  HstaaTree aa;
  explicit Handles(Shared *s) {
    MemPool_InitOnSharedHeap(&pool, s->Region(), 0, &s->heapLock);
    for (int f = 0; f < kFamilies; ++f)
      c[f] = {pool, nullptr, nullptr, false, s->Region() + s->data[f]};
    aa = {c[5], nullptr, Add, Sub};
  }
};

std::string Path(int id, int k) { return "/p" + std::to_string(id) + "/k" + std::to_string(k); }
int32_t IntKey(int id, int k) { return id * 1000 + k + 1; }  // also a small "pointer"

// A value set (in the associative array: counted) at a key, or the key taken out.
void Change(Handles &h, int f, int id, int k, bool put, CofferVal v) {
  std::string path = Path(id, k);
  const char *key = path.c_str();
  const void *ptrKey = reinterpret_cast<const void *>(uintptr_t(IntKey(id, k)));
  int32_t at;
  bool inEsa = f == 0 && ESA_Find(&h.c[0], key, &at);
  RbtNode *n = f == 1   ? RBT_Find(&h.c[1], key)
               : f == 2 ? RbtInt32_Find(&h.c[2], IntKey(id, k))
               : f == 3 ? RbtVoidPtr_Find(&h.c[3], ptrKey)
                        : nullptr;
  HstNode *node = f == 4 ? HST_Find(&h.c[4], key) : nullptr;
  if (put && inEsa) ESA_SetVal(&h.c[0], at, v);
  if (put && n) n->val = v;
  if (put && !inEsa && !n) {
    if (f == 0) ESA_Insert(&h.c[0], key, v);
    if (f == 1) RBT_Insert(&h.c[1], key, v);
    if (f == 2) RbtInt32_Insert(&h.c[2], IntKey(id, k), v);
    if (f == 3) RbtVoidPtr_Insert(&h.c[3], ptrKey, v);
    if (f == 4) HST_Insert(&h.c[4], key, v);
    if (f == 5) HSTAA_Insert(&h.aa, key, 1);
  } else if (!put) {
    if (inEsa) ESA_Remove(&h.c[0], at);
    if (n) (f == 1 ? RBT_Remove : f == 2 ? RbtInt32_Remove : RbtVoidPtr_Remove)(&h.c[f], n);
    if (node) HST_RemoveSubtree(&h.c[4], node);
    if (f == 5) HSTAA_Remove(&h.aa, key, 1);
  }
}

using Model = std::map<std::string, CofferVal>;

// Process id's work, drawn from its seed; with shared, done there (each
// change under its container's lock) as well as recorded in the models.
void Work(int id, Shared *shared, Model *models) {
  std::mt19937 rng(7000 + id);
  std::unique_ptr<Handles> h(shared ? new Handles(shared) : nullptr);
  uint8_t *own = nullptr;
  for (uint32_t i = 0, size = 0; i < kOps; ++i) {
    int f = rng() % kFamilies, k = rng() % 40;
    bool put = rng() % 3 != 0;
    CofferVal v = rng();
    if (shared) {
      Tandel_AcquireExclLock(&shared->locks[f]);
      Change(*h, f, id, k, put, v);
      Tandel_ReleaseExclLock(&shared->locks[f]);
      for (uint32_t j = 0; j < size; ++j)
        if (own[j] != uint8_t(id + j)) _exit(4);
      own = static_cast<uint8_t *>(h->pool.realloc(&h->pool, own, size = 1 + v % 300));
      for (uint32_t j = 0; j < size; ++j) own[j] = uint8_t(id + j);
    }
    std::string key = f == 2 || f == 3 ? std::to_string(IntKey(id, k)) : Path(id, k);
    CofferVal &m = models[f][key];
    if (f == 5 ? (m += put ? 1 : m ? -1 : 0) == 0 : !put)
      models[f].erase(key);
    else if (f != 5)
      m = v;
  }
  if (shared) h->pool.free(&h->pool, own);
}

// What each container holds, in the models' terms.
void Dump(Handles &h, Model *out) {
  for (int i = 0; i < ESA_GetSize(&h.c[0]); ++i)
    out[0][ESA_GetKey(&h.c[0], i)] = ESA_GetVal(&h.c[0], i);
  for (RbtNode *n = RBT_First(&h.c[1]); n; n = RBT_Next(&h.c[1], n))
    out[1][static_cast<char *>(h.pool.base) + n->key] = n->val;
  for (RbtNode *n = RbtInt32_First(&h.c[2]); n; n = RbtInt32_Next(&h.c[2], n))
    out[2][std::to_string(n->key)] = n->val;
  for (RbtNode *n = RbtVoidPtr_First(&h.c[3]); n; n = RbtVoidPtr_Next(&h.c[3], n))
    out[3][std::to_string(n->key)] = n->val;
  for (int f : {4, 5}) {
    HstTree *t = f == 4 ? &h.c[4] : &h.aa.hst;
    for (int i = 0; i < HST_GetNumChildren(t, HST_GetRoot(t)); ++i) {
      HstNode *p = HST_GetChild(t, HST_GetRoot(t), i);
      for (int j = 0; j < HST_GetNumChildren(t, p); ++j) {
        HstNode *k = HST_GetChild(t, p, j);
        out[f][std::string("/") + HST_GetKey(t, p) + "/" + HST_GetKey(t, k)] = HST_GetVal(t, k);
      }
    }
  }
}

TEST(RegionStress, EightProcessesEveryFamilyOneRegion) {
  const size_t bytes = sizeof(Shared) + kRegion;
  int fd = memfd_create("coffer-stress", 0);
  ASSERT_EQ(ftruncate(fd, bytes), 0);
  auto map = [&] {
    return static_cast<Shared *>(mmap(nullptr, bytes, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0));
  };
  Shared *s = map();
  ASSERT_NE(s, MAP_FAILED);
  ASSERT_EQ(Tandel_InitExclLock(&s->heapLock), 0);
  for (TandelExclLock &l : s->locks) ASSERT_EQ(Tandel_InitExclLock(&l), 0);
  MemPool pool;
  ASSERT_TRUE(MemPool_InitOnSharedHeap(&pool, s->Region(), kRegion, &s->heapLock));
  HstaaTree aa = {{pool, nullptr, nullptr, false, nullptr}, nullptr, Add, Sub};
  ASSERT_TRUE(HST_CreateTreeData(&aa.hst, '/', 0, 4, 8));
  CollectionHeader *made[] = {ESA_AllocArrayEx(&pool, 0, 8),        RBT_AllocTreeEx(&pool),
                              RbtInt32_AllocTreeEx(&pool),          RbtVoidPtr_AllocTreeEx(&pool),
                              HST_AllocTreeEx(&pool, '/', 0, 4, 8), &aa.hst};
  for (int f = 0; f < kFamilies; ++f)
    s->data[f] = PoolOffset(static_cast<char *>(made[f]->data) - s->Region());

  pid_t pids[kProcs];
  int start[2];  // closed once all are forked, so that they start together
  ASSERT_EQ(pipe(start), 0);
  for (int id = 0; id < kProcs; ++id) {
    if ((pids[id] = fork()) == 0) {
      Shared *mine = map();  // while the inherited mapping still holds its range
      munmap(s, bytes);
      close(start[1]);
      char c;
      if (mine == s || read(start[0], &c, 1) != 0) _exit(3);
      Work(id, mine, std::vector<Model>(kFamilies).data());
      _exit(0);
    }
  }
  close(start[0]);
  close(start[1]);
  for (pid_t pid : pids) {
    int status = -1;
    waitpid(pid, &status, 0);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
  }

  Model want[kFamilies], got[kFamilies];
  CofferVal values = 0;
  for (int id = 0; id < kProcs; ++id) Work(id, nullptr, want);
  for (const auto &kv : want[5]) values += kv.second;
  Handles h(s);
  Dump(h, got);
  for (int f = 0; f < kFamilies; ++f) EXPECT_EQ(got[f], want[f]) << "family " << f;
  EXPECT_EQ(HSTAA_GetSubtreeValCount(&h.aa, HST_GetRoot(&h.aa.hst)), int32_t(values));
  coffer::ShHeapCounts c;
  EXPECT_EQ(coffer::SHCheckRegion(s->Region(), kRegion, &c, nullptr, nullptr),
            coffer::ShHeapState::kSound);
  void (*release[])(CollectionHeader *) = {ESA_FreeArray,       RBT_FreeTree, RbtInt32_FreeTree,
                                           RbtVoidPtr_FreeTree, HST_FreeTree, HST_FreeTree};
  for (int f = 0; f < kFamilies; ++f) release[f](made[f]);
  EXPECT_EQ(coffer::SHCheckRegion(s->Region(), kRegion, &c, nullptr, nullptr),
            coffer::ShHeapState::kSound);
  EXPECT_EQ(c.allocatedBlocks, 0u);
  munmap(s, bytes);
  close(fd);
}

}  // namespace
