// A region for the tests of named roots and of coffer-inspect.
#ifndef COFFER_TESTS_ROOTS_REGION_H
#define COFFER_TESTS_ROOTS_REGION_H

#include <coffer/roots.h>

#include <vector>

#include "mempool/pool.h"

namespace coffer_test {

constexpr uint32_t kSize = 1 << 16;

// A formatted region holding one container of each kind, two entries each.
struct Region {
  std::vector<uint32_t> words = std::vector<uint32_t>(kSize / 4, 0xA5A5A5A5u);
  MemPool pool;
  CollectionHeader *c[5];
  Region() {
    MemPool_InitOnSimpleHeap(&pool, words.data(), kSize);
    c[0] = ESA_AllocArrayEx(&pool, 2, 2), c[1] = RBT_AllocTreeEx(&pool), c[2] = RbtInt32_AllocTreeEx(&pool);
    c[3] = RbtVoidPtr_AllocTreeEx(&pool), c[4] = HST_AllocTreeEx(&pool, '/', 0, 1, 1);
    for (const char *k : {"x", "y"})
      ESA_Insert(c[0], k, 1), RBT_Insert(c[1], k, 2), RbtInt32_Insert(c[2], k[0], 3),
          RbtVoidPtr_Insert(c[3], k, 4), HST_Insert(c[4], k[0] == 'x' ? "/x" : "/x/y", 5);
  }
  uint32_t &word(uint32_t off) { return words[off / 4]; }
  PoolOffset rec(int i) { return coffer::AddrToOffset(&pool, c[i]->data); }
};

}  // namespace coffer_test

#endif
