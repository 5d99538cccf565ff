// The region heap: exact layouts of small scenarios, a randomized comparison
// with an independent model of the allocator, and the heap checker itself.
#include <gtest/gtest.h>

#include <algorithm>
#include <iterator>
#include <list>
#include <map>
#include <random>

#include "region_test_util.h"

namespace {

using coffer::ShHeapCounts;
using coffer_test::ExpectBlock;
using coffer_test::FillPattern;
using coffer_test::HasPattern;
using coffer_test::HeapSound;
using coffer_test::Region;

constexpr uint32_t kNone = SH_NO_BLOCK;

// ---- formatting ----------------------------------------------------------

TEST(RegionHeapReset, RefusesSizesUpTo32AndWritesNothing) {
  for (uint32_t size : {0u, 1u, 16u, 31u, 32u}) {
    Region r(64);
    auto before = r.Snapshot();
    EXPECT_EQ(SH_Reset(r.base(), size), -1) << size;
    EXPECT_EQ(r.Snapshot(), before) << size;
  }
}

TEST(RegionHeapReset, FormatsOneFreeBlockAndLeavesTheRestAlone) {
  Region r(4096);
  ASSERT_EQ(SH_Reset(r.base(), 4096), 0);
  EXPECT_EQ(r.head()->regionSize, 4096u);
  EXPECT_EQ(r.head()->freeHead, 16u);
  EXPECT_EQ(r.head()->reserved[0], 0xA5A5A5A5u);  // never written
  EXPECT_EQ(r.head()->reserved[1], 0xA5A5A5A5u);
  ExpectBlock(r, 16, 4080, 0, kNone, kNone);
  for (uint32_t i = 32; i < 4096; ++i) ASSERT_EQ(static_cast<uint8_t>(r.bytes()[i]), 0xA5) << i;
  EXPECT_TRUE(HeapSound(r.base()));
}

TEST(RegionHeapReset, SmallestRegionServesOnlySizeZero) {
  Region r(33);
  ASSERT_EQ(SH_Reset(r.base(), 33), 0);
  ExpectBlock(r, 16, 17, 0, kNone, kNone);
  EXPECT_EQ(SH_Alloc(r.base(), 1), nullptr);
  EXPECT_EQ(SH_Alloc(r.base(), 4), nullptr);
  void *p = SH_Alloc(r.base(), 0);
  EXPECT_EQ(r.off(p), 32u);
  ExpectBlock(r, 16, 17, 0, 0, 0);  // taken whole: nothing to split off
  EXPECT_EQ(r.head()->freeHead, kNone);
  EXPECT_EQ(SH_Alloc(r.base(), 0), nullptr);  // the free list is empty
  SH_Free(r.base(), p);
  ExpectBlock(r, 16, 17, 0, kNone, kNone);
  EXPECT_TRUE(HeapSound(r.base()));
}

TEST(RegionHeapReset, ResetDropsEveryBlock) {
  Region r(1024);
  SH_Reset(r.base(), 1024);
  for (int i = 0; i < 5; ++i) SH_Alloc(r.base(), 40);
  ASSERT_EQ(SH_Reset(r.base(), 512), 0);
  EXPECT_EQ(r.head()->regionSize, 512u);
  ExpectBlock(r, 16, 496, 0, kNone, kNone);
  EXPECT_TRUE(HeapSound(r.base()));
}

// ---- allocation ------------------------------------------------------------

TEST(RegionHeapAlloc, SplitsTheFirstBlock) {
  Region r(4096);
  SH_Reset(r.base(), 4096);
  void *p = SH_Alloc(r.base(), 5);
  EXPECT_EQ(p, r.at(32));
  ExpectBlock(r, 16, 24, 0, 0, 0);
  ExpectBlock(r, 40, 4056, 24, kNone, kNone);
  EXPECT_EQ(r.head()->freeHead, 40u);
  // The payload is handed out as it was.
  EXPECT_EQ(static_cast<uint8_t>(r.bytes()[32]), 0xA5);
}

TEST(RegionHeapAlloc, SizeZeroGetsAnEmptyBlockWhenSplitting) {
  Region r(4096);
  SH_Reset(r.base(), 4096);
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 0)), 32u);
  ExpectBlock(r, 16, 16, 0, 0, 0);
  ExpectBlock(r, 32, 4064, 16, kNone, kNone);
}

TEST(RegionHeapAlloc, TakesTheWholeBlockWhenTheRestWouldHaveNoRoom) {
  Region a(64);
  SH_Reset(a.base(), 64);
  EXPECT_EQ(a.off(SH_Alloc(a.base(), 16)), 32u);
  ExpectBlock(a, 16, 48, 0, 0, 0);  // 16 bytes left over stay inside
  EXPECT_EQ(a.head()->freeHead, kNone);

  Region b(64);
  SH_Reset(b.base(), 64);
  EXPECT_EQ(b.off(SH_Alloc(b.base(), 12)), 32u);
  ExpectBlock(b, 16, 28, 0, 0, 0);
  ExpectBlock(b, 44, 20, 28, kNone, kNone);
  EXPECT_EQ(b.head()->freeHead, 44u);
}

TEST(RegionHeapAlloc, RoundsUpToFourAndNeverWraps) {
  Region r(4096);
  SH_Reset(r.base(), 4096);
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 1)), 32u);
  ExpectBlock(r, 16, 20, 0, 0, 0);
  auto before = r.Snapshot();
  for (uint32_t size : {0xFFFFFFFFu, 0xFFFFFFFEu, 0xFFFFFFFDu, 0xFFFFFFFCu, 4096u, 4045u}) {
    EXPECT_EQ(SH_Alloc(r.base(), size), nullptr) << size;
    EXPECT_EQ(r.Snapshot(), before) << size;
  }
  // The free block left is 4060 bytes: capacity 4044.
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 4044)), 52u);
  EXPECT_EQ(r.head()->freeHead, kNone);
}

TEST(RegionHeapAlloc, LowerOfTheFirstTwoFitsWins) {
  Region r(1024);
  SH_Reset(r.base(), 1024);
  std::vector<void *> p;
  for (int i = 0; i < 5; ++i) p.push_back(SH_Alloc(r.base(), 16));
  for (int i = 0; i < 5; ++i) EXPECT_EQ(r.off(p[i]), 32u + 32u * i);
  SH_Free(r.base(), p[1]);
  SH_Free(r.base(), p[3]);
  EXPECT_EQ(r.head()->freeHead, 112u);  // the fourth block heads the list
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 16)), 64u);
  EXPECT_TRUE(HeapSound(r.base()));
}

TEST(RegionHeapAlloc, StopsAtTheSecondFit) {
  Region r(1024);
  SH_Reset(r.base(), 1024);
  std::vector<void *> p;
  for (int i = 0; i < 7; ++i) p.push_back(SH_Alloc(r.base(), 16));  // blocks at 16, 48, ..., 208
  SH_Free(r.base(), p[1]);  // 48: lowest, ends up third on the list
  SH_Free(r.base(), p[3]);  // 112
  SH_Free(r.base(), p[5]);  // 176: first on the list
  // 176 and 112 fit first; 48, lower still, is never looked at.
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 16)), 128u);
  // Only the list order decides: with 176 and 48 left, 48 wins.
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 16)), 64u);
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 16)), 192u);
  EXPECT_TRUE(HeapSound(r.base()));
}

TEST(RegionHeapAlloc, SplitRemainderTakesThePlaceOnTheList) {
  Region r(1024);
  SH_Reset(r.base(), 1024);
  std::vector<void *> p;
  for (int i = 0; i < 5; ++i) p.push_back(SH_Alloc(r.base(), 60));  // blocks of 76
  SH_Free(r.base(), p[3]);                                          // list: 244, 396(tail)
  SH_Free(r.base(), p[1]);                                          // list: 92, 244, 396
  // 92 and 244 fit; 92 is split and its remainder sits between nothing and 244.
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 20)), 108u);
  ExpectBlock(r, 92, 36, 76, 0, 0);
  ExpectBlock(r, 128, 40, 36, 244, kNone);
  EXPECT_EQ(r.head()->freeHead, 128u);
  EXPECT_EQ(r.block(244)->prevFree, 128u);
  EXPECT_EQ(r.block(168)->prevBlockSize, 40u);  // the successor learns the new size
  EXPECT_TRUE(HeapSound(r.base()));
}

// ---- release and merging ------------------------------------------------------

TEST(RegionHeapFree, MergesWithBothNeighbours) {
  Region r(1024);
  SH_Reset(r.base(), 1024);
  std::vector<void *> p;
  for (int i = 0; i < 6; ++i) p.push_back(SH_Alloc(r.base(), 16));
  SH_Free(r.base(), p[2]);  // 80: alone
  SH_Free(r.base(), p[1]);  // 48: absorbs 80 forward
  ExpectBlock(r, 48, 64, 32, 208, kNone);
  SH_Free(r.base(), p[3]);  // 112: absorbed backward into 48
  EXPECT_EQ(r.head()->freeHead, 48u);
  ExpectBlock(r, 48, 96, 32, 208, kNone);
  EXPECT_EQ(r.block(144)->prevBlockSize, 96u);
  ShHeapCounts c;
  EXPECT_TRUE(HeapSound(r.base(), &c));
  EXPECT_EQ(c.freeBlocks, 2u);
  EXPECT_EQ(c.allocatedBlocks, 3u);
}

TEST(RegionHeapFree, PredecessorKeepsItsPlaceOnTheList) {
  Region r(1024);
  SH_Reset(r.base(), 1024);
  std::vector<void *> p;
  for (int i = 0; i < 6; ++i) p.push_back(SH_Alloc(r.base(), 16));  // 16, 48, ..., 176
  SH_Free(r.base(), p[1]);                                          // list: 48, 208
  SH_Free(r.base(), p[4]);                                          // list: 144, 48, 208
  SH_Free(r.base(), p[2]);  // 80 goes into 48, which stays second
  EXPECT_EQ(r.head()->freeHead, 144u);
  ExpectBlock(r, 48, 64, 32, 208, 144);
  EXPECT_EQ(r.block(112)->prevBlockSize, 64u);
  SH_Free(r.base(), p[3]);  // 112 takes 144 forward and goes into 48
  EXPECT_EQ(r.head()->freeHead, 48u);
  ExpectBlock(r, 48, 128, 32, 208, kNone);
  EXPECT_EQ(r.block(176)->prevBlockSize, 128u);
  SH_Free(r.base(), p[5]);  // the last hole closes
  ExpectBlock(r, 48, 976, 32, kNone, kNone);
  SH_Free(r.base(), p[0]);
  ExpectBlock(r, 16, 1008, 0, kNone, kNone);
  EXPECT_EQ(r.head()->freeHead, 16u);
  EXPECT_TRUE(HeapSound(r.base()));
}

TEST(RegionHeapFree, NullChangesNothing) {
  Region r(256);
  SH_Reset(r.base(), 256);
  SH_Alloc(r.base(), 10);
  auto before = r.Snapshot();
  SH_Free(r.base(), nullptr);
  EXPECT_EQ(r.Snapshot(), before);
}

TEST(RegionHeapFree, OddRegionSizeLastBlock) {
  Region r(103);
  SH_Reset(r.base(), 103);
  void *a = SH_Alloc(r.base(), 8);
  void *b = SH_Alloc(r.base(), 44);  // the last block, 63 bytes, is taken whole
  EXPECT_EQ(r.off(b), 56u);
  ExpectBlock(r, 40, 63, 24, 0, 0);
  SH_Free(r.base(), a);
  SH_Free(r.base(), b);
  ExpectBlock(r, 16, 87, 0, kNone, kNone);
  EXPECT_TRUE(HeapSound(r.base()));
}

// ---- resizing ---------------------------------------------------------------

TEST(RegionHeapRealloc, SameCapacityStaysOtherSizesMove) {
  Region r(1024);
  SH_Reset(r.base(), 1024);
  void *p = SH_Alloc(r.base(), 21);  // capacity 24
  FillPattern(p, 24, 1);
  EXPECT_EQ(SH_Realloc(r.base(), p, 24), p);
  void *q = SH_Realloc(r.base(), p, 8);  // smaller still moves
  EXPECT_NE(q, p);
  EXPECT_TRUE(HasPattern(q, 8, 1));
  EXPECT_EQ(r.head()->freeHead, 16u);  // p is free again
  void *g = SH_Realloc(r.base(), q, 200);
  EXPECT_TRUE(HasPattern(g, 8, 1));
  EXPECT_TRUE(HeapSound(r.base()));
}

TEST(RegionHeapRealloc, NullAndZero) {
  Region a(1024), b(1024);
  SH_Reset(a.base(), 1024);
  SH_Reset(b.base(), 1024);
  EXPECT_EQ(a.off(SH_Realloc(a.base(), nullptr, 0)), b.off(SH_Alloc(b.base(), 0)));
  EXPECT_EQ(a.off(SH_Realloc(a.base(), nullptr, 30)), b.off(SH_Alloc(b.base(), 30)));
  EXPECT_EQ(a.Snapshot(), b.Snapshot());
  void *p = SH_Alloc(a.base(), 10);
  EXPECT_EQ(SH_Realloc(a.base(), p, 0), nullptr);
  SH_Alloc(b.base(), 10);
  SH_Free(b.base(), b.at(a.off(p)));
  EXPECT_EQ(a.Snapshot(), b.Snapshot());
}

TEST(RegionHeapRealloc, FailureLeavesTheBlockIntact) {
  Region r(256);
  SH_Reset(r.base(), 256);
  void *p = SH_Alloc(r.base(), 100);
  FillPattern(p, 100, 9);
  auto before = r.Snapshot();
  // p and the free block after it would hold 200 together, but a block is
  // never resized in place.
  EXPECT_EQ(SH_Realloc(r.base(), p, 200), nullptr);
  EXPECT_EQ(SH_Realloc(r.base(), p, 0xFFFFFFFFu), nullptr);
  EXPECT_EQ(r.Snapshot(), before);
  EXPECT_TRUE(HasPattern(p, 100, 9));
}

// ---- the checker --------------------------------------------------------------

TEST(RegionHeapCheck, DetectsEachKindOfDamage) {
  auto fresh = [](Region &r) {
    SH_Reset(r.base(), 1024);
    std::vector<void *> p;
    for (int i = 0; i < 6; ++i) p.push_back(SH_Alloc(r.base(), 16));
    SH_Free(r.base(), p[1]);
    SH_Free(r.base(), p[3]);  // free: 112, 48, 208 (tail)
  };
  struct Damage {
    const char *name;
    void (*apply)(Region &);
    const char *found;  // the checker's explanation
  };
  const Damage damages[] = {
      {"overrun", [](Region &r) { r.block(208)->blockSize += 4; },
       "block runs past region end (block at 208)"},
      {"shrunk", [](Region &r) { r.block(16)->blockSize = 28; },
       "block runs past region end (block at 44)"},
      {"prev size", [](Region &r) { r.block(80)->prevBlockSize = 36; },
       "prevBlockSize mismatch (block at 80)"},
      {"adjacent", [](Region &r) { r.block(80)->nextFree = r.block(80)->prevFree = kNone; },
       "two adjacent free blocks (block at 80)"},
      {"half-linked", [](Region &r) { r.block(48)->prevFree = 0; },
       "free block with a 0 link (block at 48)"},
      {"skip", [](Region &r) { r.block(112)->nextFree = 208; },
       "prevFree does not name the previous block on the free list (block at 208)"},
      {"into payload", [](Region &r) { r.head()->freeHead = 116; },
       "free list names something that is not a free block (block at 116)"},
      {"cycle", [](Region &r) { r.block(208)->nextFree = 112; },
       "free list visits a block twice (block at 112)"},
      {"back link", [](Region &r) { r.block(48)->prevFree = 208; },
       "prevFree does not name the previous block on the free list (block at 48)"},
      {"allocated listed", [](Region &r) { r.block(208)->nextFree = 16; },
       "free list names something that is not a free block (block at 16)"},
      {"empty list", [](Region &r) { r.head()->freeHead = kNone; },
       "free block missing from the free list (block at 48)"},
      {"region size", [](Region &r) { r.head()->regionSize = 1000; },
       "block runs past region end (block at 208)"},
  };
  for (const Damage &d : damages) {
    Region r(1024);
    fresh(r);
    ASSERT_TRUE(HeapSound(r.base()));
    d.apply(r);
    std::string why;
    EXPECT_FALSE(coffer::SHCheckHeap(r.base(), nullptr, &why)) << d.name;
    EXPECT_EQ(why, d.found) << d.name;
  }
}

// ---- randomized comparison with a model -----------------------------------------

// The allocator restated over a block map in address order and a free list
// in list order, without offsets inside the region.
class Model {
 public:
  explicit Model(uint32_t regionSize) : regionSize_(regionSize) {
    blocks_[16] = {regionSize - 16, true};
    freeList_.push_back(16);
  }

  // Block offset handed out, or 0.
  uint32_t Alloc(uint32_t size) {
    if (size > 0xFFFFFFFCu) return 0;
    uint64_t need = (uint64_t{size} + 3) / 4 * 4 + 16;
    auto chosen = freeList_.end();
    for (auto it = freeList_.begin(); it != freeList_.end(); ++it) {
      if (need > blocks_[*it].size) continue;
      if (chosen == freeList_.end()) {
        chosen = it;
      } else {
        if (*it < *chosen) chosen = it;
        break;
      }
    }
    if (chosen == freeList_.end()) return 0;
    uint32_t off = *chosen;
    Blk &b = blocks_[off];
    if (b.size - need > 16) {
      uint32_t rest = off + static_cast<uint32_t>(need);
      blocks_[rest] = {b.size - static_cast<uint32_t>(need), true};
      b.size = static_cast<uint32_t>(need);
      *chosen = rest;
    } else {
      freeList_.erase(chosen);
    }
    b.free = false;
    return off;
  }

  void Free(uint32_t off) {
    freeList_.push_front(off);
    auto it = blocks_.find(off);
    it->second.free = true;
    auto next = std::next(it);
    if (next != blocks_.end() && next->second.free) {
      freeList_.remove(next->first);
      it->second.size += next->second.size;
      blocks_.erase(next);
    }
    if (it != blocks_.begin()) {
      auto prev = std::prev(it);
      if (prev->second.free) {
        freeList_.remove(off);
        prev->second.size += it->second.size;
        blocks_.erase(it);
      }
    }
  }

  // The new block offset (off itself when unchanged), or 0.
  uint32_t Realloc(uint32_t off, uint32_t size) {
    if (off == 0) return Alloc(size);
    if (size == 0) {
      Free(off);
      return 0;
    }
    if (Capacity(off) == size) return off;
    uint32_t n = Alloc(size);
    if (n) Free(off);
    return n;
  }

  uint32_t Capacity(uint32_t off) const { return blocks_.at(off).size - 16; }
  uint32_t FreeBlocks() const { return static_cast<uint32_t>(freeList_.size()); }
  uint32_t Blocks() const { return static_cast<uint32_t>(blocks_.size()); }

  // Compares the region's header and every block header, byte for byte.
  ::testing::AssertionResult Matches(Region &r) const {
    std::map<uint32_t, std::pair<uint32_t, uint32_t>> links;  // off -> (next, prev)
    uint32_t prev = kNone;
    for (auto it = freeList_.begin(); it != freeList_.end(); ++it) {
      auto n = std::next(it);
      links[*it] = {n == freeList_.end() ? kNone : *n, prev};
      prev = *it;
    }
    uint32_t head[2] = {regionSize_, freeList_.empty() ? kNone : freeList_.front()};
    if (std::memcmp(r.head(), head, sizeof head) != 0)
      return ::testing::AssertionFailure()
             << "region header: freeHead " << r.head()->freeHead << " expected " << head[1];
    uint32_t prevSize = 0;
    for (const auto &[off, b] : blocks_) {
      ShBlockHeader want = {b.size, prevSize, 0, 0};
      if (b.free) want.nextFree = links.at(off).first, want.prevFree = links.at(off).second;
      const ShBlockHeader *got = r.block(off);
      if (std::memcmp(got, &want, sizeof want) != 0)
        return ::testing::AssertionFailure()
               << "block " << off << ": got {" << got->blockSize << ", " << got->prevBlockSize
               << ", " << got->nextFree << ", " << got->prevFree << "} want {" << want.blockSize
               << ", " << want.prevBlockSize << ", " << want.nextFree << ", " << want.prevFree
               << "}";
      prevSize = b.size;
    }
    return ::testing::AssertionSuccess();
  }

 private:
  struct Blk {
    uint32_t size;
    bool free;
  };
  uint32_t regionSize_;
  std::map<uint32_t, Blk> blocks_;
  std::list<uint32_t> freeList_;
};

uint32_t RandomSize(std::mt19937 &rng, uint32_t regionSize) {
  uint32_t k = rng() % 100;
  if (k < 5) return 0;
  if (k < 45) return 1 + rng() % 32;
  if (k < 85) return 33 + rng() % 480;
  if (k < 95) return rng() % regionSize;
  static const uint32_t huge[] = {0xFFFFFFFFu, 0xFFFFFFFEu, 0xFFFFFFFDu, 0xFFFFFFFCu, 0x80000000u};
  return huge[rng() % 5];
}

struct LiveBlock {
  uint32_t size;  // bytes of pattern written
  uint32_t tag;
};

void RunAgainstModel(uint32_t regionSize, uint32_t seed, int steps) {
  SCOPED_TRACE("region " + std::to_string(regionSize) + " seed " + std::to_string(seed));
  std::mt19937 rng(seed);
  Region r(regionSize, static_cast<uint8_t>(seed));
  ASSERT_EQ(SH_Reset(r.base(), regionSize), 0);
  Model m(regionSize);
  std::map<uint32_t, LiveBlock> live;  // by block offset
  uint32_t nextTag = 1;

  auto randomLive = [&]() {
    auto it = live.begin();
    std::advance(it, rng() % live.size());
    return it->first;
  };
  auto place = [&](uint32_t off, uint32_t size) {
    uint32_t tag = nextTag++;
    FillPattern(r.at(off + 16), size, tag);
    live[off] = {size, tag};
  };

  for (int step = 0; step < steps; ++step) {
    SCOPED_TRACE("step " + std::to_string(step));
    uint32_t k = rng() % 100;
    if (k < 45 || live.empty()) {
      uint32_t size = RandomSize(rng, regionSize);
      uint32_t want = m.Alloc(size);
      void *p = SH_Alloc(r.base(), size);
      ASSERT_EQ(r.off(p), want ? want + 16 : 0) << "alloc " << size;
      if (p) place(want, size);
    } else if (k < 75) {
      uint32_t off = randomLive();
      ASSERT_TRUE(HasPattern(r.at(off + 16), live[off].size, live[off].tag));
      m.Free(off);
      SH_Free(r.base(), r.at(off + 16));
      live.erase(off);
    } else {
      // realloc: to 0, to the same capacity, or anywhere else; rarely from null
      uint32_t off = rng() % 20 == 0 ? 0 : randomLive();
      uint32_t j = rng() % 10, size;
      if (j == 0)
        size = 0;
      else if (j < 3 && off)
        size = m.Capacity(off);
      else
        size = RandomSize(rng, regionSize);
      uint32_t want = m.Realloc(off, size);
      void *p = SH_Realloc(r.base(), off ? r.at(off + 16) : nullptr, size);
      ASSERT_EQ(r.off(p), want ? want + 16 : 0) << "realloc " << off << " to " << size;
      if (off && (p || size == 0)) {
        LiveBlock old = live[off];
        live.erase(off);
        if (p) {
          ASSERT_TRUE(HasPattern(p, std::min(old.size, size), old.tag));
          place(want, size);
        }
      } else if (!off && p) {
        place(want, size);
      }
    }
    ASSERT_TRUE(m.Matches(r));
    ShHeapCounts c;
    ASSERT_TRUE(HeapSound(r.base(), &c));
    ASSERT_EQ(c.freeBlocks, m.FreeBlocks());
    ASSERT_EQ(c.allocatedBlocks, live.size());
    if (step % 64 == 0) {
      for (const auto &[off, b] : live) ASSERT_TRUE(HasPattern(r.at(off + 16), b.size, b.tag));
    }
  }
  for (const auto &[off, b] : live) SH_Free(r.base(), r.at(off + 16));
  ExpectBlock(r, 16, regionSize - 16, 0, kNone, kNone);
}

TEST(RegionHeapModel, RandomOperationsMatchTheModel) {
  const uint32_t sizes[] = {33, 64, 257, 1024, 4099, 65536};
  for (uint32_t size : sizes) {
    for (uint32_t seed = 1; seed <= 3; ++seed) {
      RunAgainstModel(size, seed * 7919 + size, 4000);
      if (HasFatalFailure()) return;
    }
  }
}

}  // namespace
