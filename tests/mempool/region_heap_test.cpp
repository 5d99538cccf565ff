// The region heap: exact layouts of sharp small cases, a randomized comparison
// with an independent model of the allocator, and the heap checker itself.
#include <gtest/gtest.h>

#include <algorithm>
#include <iterator>
#include <list>
#include <map>
#include <random>

#include "region_test_util.h"

namespace {

using namespace coffer_test;

// A fresh region with n blocks of the given size allocated from its start.
std::vector<void *> Carve(Region &r, uint32_t regionSize, int n, uint32_t size) {
  EXPECT_EQ(SH_Reset(r.base(), regionSize), 0);
  std::vector<void *> p;
  for (int i = 0; i < n; ++i) p.push_back(SH_Alloc(r.base(), size));
  return p;
}

TEST(RegionHeap, ResetRefusesTinySizesAndFormatsOneBlock) {
  for (uint32_t size : {0u, 1u, 16u, 32u}) {
    Region r(64);
    auto before = r.Snapshot();
    EXPECT_EQ(SH_Reset(r.base(), size), -1) << size;
    EXPECT_EQ(r.Snapshot(), before) << size;
  }
  Region r(4096);
  ASSERT_EQ(SH_Reset(r.base(), 4096), 0);
  EXPECT_EQ(r.head()->regionSize, 4096u);
  EXPECT_EQ(r.head()->freeHead, 16u);
  EXPECT_EQ(r.head()->reserved[0], 0xA5A5A5A5u);  // never written
  EXPECT_EQ(r.head()->reserved[1], 0xA5A5A5A5u);
  ExpectBlock(r, 16, 4080, 0, kNone, kNone);
  for (uint32_t i = 32; i < 4096; ++i) ASSERT_EQ(static_cast<uint8_t>(r.bytes()[i]), 0xA5) << i;
}

TEST(RegionHeap, SmallestRegionServesOnlySizeZero) {
  Region r(33);
  ASSERT_EQ(SH_Reset(r.base(), 33), 0);
  ExpectBlock(r, 16, 17, 0, kNone, kNone);
  EXPECT_EQ(SH_Alloc(r.base(), 1), nullptr);
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 0)), 32u);
  ExpectBlock(r, 16, 17, 0, 0, 0);  // taken whole: nothing to split off
  EXPECT_EQ(r.head()->freeHead, kNone);
  EXPECT_EQ(SH_Alloc(r.base(), 0), nullptr);  // the free list is empty
}

TEST(RegionHeap, AllocSplitsOnlyWhenTheRestHasRoom) {
  Region r(4096);
  SH_Reset(r.base(), 4096);
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 5)), 32u);
  ExpectBlock(r, 16, 24, 0, 0, 0);
  ExpectBlock(r, 40, 4056, 24, kNone, kNone);
  EXPECT_EQ(r.head()->freeHead, 40u);
  EXPECT_EQ(static_cast<uint8_t>(r.bytes()[32]), 0xA5);  // the payload is not cleared
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 0)), 56u);          // an empty block, split off
  ExpectBlock(r, 40, 16, 24, 0, 0);
  ExpectBlock(r, 56, 4040, 16, kNone, kNone);

  Region a(64), b(64);
  SH_Reset(a.base(), 64);
  SH_Reset(b.base(), 64);
  EXPECT_EQ(a.off(SH_Alloc(a.base(), 16)), 32u);
  ExpectBlock(a, 16, 48, 0, 0, 0);  // 16 bytes left over stay inside
  EXPECT_EQ(b.off(SH_Alloc(b.base(), 12)), 32u);
  ExpectBlock(b, 16, 28, 0, 0, 0);
  ExpectBlock(b, 44, 20, 28, kNone, kNone);
}

TEST(RegionHeap, LowerOfTheFirstTwoFitsWins) {
  Region r(1024);
  auto p = Carve(r, 1024, 5, 16);
  for (int i = 0; i < 5; ++i) EXPECT_EQ(r.off(p[i]), 32u + 32u * i);
  SH_Free(r.base(), p[1]);
  SH_Free(r.base(), p[3]);
  EXPECT_EQ(r.head()->freeHead, 112u);  // the fourth block heads the list
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 16)), 64u);
}

TEST(RegionHeap, FreeMergesWithBothNeighbours) {
  Region r(1024);
  auto p = Carve(r, 1024, 6, 16);
  SH_Free(r.base(), p[2]);  // 80: alone
  SH_Free(r.base(), p[1]);  // 48: absorbs 80 forward
  ExpectBlock(r, 48, 64, 32, 208, kNone);
  SH_Free(r.base(), p[3]);  // 112: absorbed backward into 48
  EXPECT_EQ(r.head()->freeHead, 48u);
  ExpectBlock(r, 48, 96, 32, 208, kNone);
  EXPECT_EQ(r.block(144)->prevBlockSize, 96u);
}

TEST(RegionHeap, ReallocMovesUnlessTheCapacityMatches) {
  Region r(1024);
  SH_Reset(r.base(), 1024);
  void *p = SH_Alloc(r.base(), 21);  // capacity 24
  FillPattern(p, 24, 1);
  EXPECT_EQ(SH_Realloc(r.base(), p, 24), p);
  void *q = SH_Realloc(r.base(), p, 8);  // smaller still moves
  EXPECT_NE(q, p);
  EXPECT_TRUE(HasPattern(q, 8, 1));
  EXPECT_EQ(r.head()->freeHead, 16u);  // p is free again
}

// Refusals write nothing: the largest sizes do not wrap when rounded, and a
// block is never resized in place, though p and its free neighbour would
// hold 200 bytes together.
TEST(RegionHeap, RefusalsAndNullFreeChangeNothing) {
  Region r(256);
  SH_Reset(r.base(), 256);
  void *p = SH_Alloc(r.base(), 100);
  FillPattern(p, 100, 9);
  auto before = r.Snapshot();
  for (uint32_t size : {0xFFFFFFFFu, 0xFFFFFFFDu, 0xFFFFFFFCu, 109u}) {
    EXPECT_EQ(SH_Alloc(r.base(), size), nullptr) << size;
    EXPECT_EQ(SH_Realloc(r.base(), p, size), nullptr) << size;
  }
  EXPECT_EQ(SH_Realloc(r.base(), p, 200), nullptr);
  SH_Free(r.base(), nullptr);
  EXPECT_EQ(r.Snapshot(), before);
  EXPECT_EQ(r.off(SH_Alloc(r.base(), 108)), 148u);  // exactly the capacity left
}

TEST(RegionHeapCheck, DetectsEachKindOfDamage) {
  const std::pair<void (*)(Region &), const char *> damages[] = {
      {[](Region &r) { r.block(208)->blockSize += 4; },
       "block runs past region end (block at 208)"},
      {[](Region &r) { r.block(16)->blockSize = 30; },
       "inner blockSize not a multiple of 4 (block at 16)"},
      {[](Region &r) { r.block(80)->prevBlockSize = 36; }, "prevBlockSize mismatch (block at 80)"},
      {[](Region &r) { r.block(80)->nextFree = r.block(80)->prevFree = kNone; },
       "two adjacent free blocks (block at 80)"},
      {[](Region &r) { r.block(48)->prevFree = 0; }, "free block with a 0 link (block at 48)"},
      {[](Region &r) { r.block(112)->nextFree = 208; },
       "prevFree does not name the previous block on the free list (block at 208)"},
      {[](Region &r) { r.head()->freeHead = 116; },
       "free list names something that is not a free block (block at 116)"},
      {[](Region &r) { r.block(208)->nextFree = 112; },
       "free list visits a block twice (block at 112)"},
      {[](Region &r) { r.head()->freeHead = kNone; },
       "free block missing from the free list (block at 48)"},
  };
  for (const auto &[damage, found] : damages) {
    Region r(1024);
    auto p = Carve(r, 1024, 6, 16);
    SH_Free(r.base(), p[1]);
    SH_Free(r.base(), p[3]);  // free list: 112, 48, 208
    ASSERT_TRUE(HeapSound(r.base()));
    damage(r);
    std::string why;
    EXPECT_FALSE(coffer::SHCheckHeap(r.base(), nullptr, &why));
    EXPECT_EQ(why, found);
  }
}

// ---- randomized comparison with a model ----------------------------------------

// The allocator restated over a block map in address order and a free list in
// list order. It deals in payload offsets (block offset + 16); 0 is "none".
class Model {
 public:
  explicit Model(uint32_t regionSize) : regionSize_(regionSize) {
    blocks_[16] = {regionSize - 16, true};
    freeList_.push_back(16);
  }

  uint32_t Alloc(uint32_t size) {
    uint64_t need = (uint64_t{size} + 3) / 4 * 4 + 16;  // never wraps
    auto chosen = freeList_.end();
    for (auto it = freeList_.begin(); it != freeList_.end(); ++it) {
      if (need > blocks_[*it].size) continue;
      if (chosen != freeList_.end()) {
        if (*it < *chosen) chosen = it;
        break;
      }
      chosen = it;
    }
    if (chosen == freeList_.end()) return 0;
    uint32_t off = *chosen;
    Blk &b = blocks_[off];
    if (b.size - need > 16) {
      *chosen = off + static_cast<uint32_t>(need);
      blocks_[*chosen] = {b.size - static_cast<uint32_t>(need), true};
      b.size = static_cast<uint32_t>(need);
    } else {
      freeList_.erase(chosen);
    }
    b.free = false;
    return off + 16;
  }

  void Free(uint32_t payload) {
    uint32_t off = payload - 16;
    freeList_.push_front(off);
    auto it = blocks_.find(off);
    it->second.free = true;
    auto next = std::next(it);
    if (next != blocks_.end() && next->second.free) {
      freeList_.remove(next->first);
      it->second.size += next->second.size;
      blocks_.erase(next);
    }
    if (it != blocks_.begin() && std::prev(it)->second.free) {
      freeList_.remove(off);
      std::prev(it)->second.size += it->second.size;
      blocks_.erase(it);
    }
  }

  uint32_t Realloc(uint32_t payload, uint32_t size) {
    if (payload == 0) return Alloc(size);
    if (size == 0) return Free(payload), 0;
    if (Capacity(payload) == size) return payload;
    uint32_t n = Alloc(size);
    if (n) Free(payload);
    return n;
  }

  uint32_t Capacity(uint32_t payload) const { return blocks_.at(payload - 16).size - 16; }
  size_t FreeBlocks() const { return freeList_.size(); }

  // Compares the region header and every block header, word by word.
  ::testing::AssertionResult Matches(Region &r) const {
    std::map<uint32_t, std::pair<uint32_t, uint32_t>> links;  // off -> (next, prev)
    uint32_t prev = kNone, prevSize = 0;
    for (auto it = freeList_.begin(); it != freeList_.end(); prev = *it++)
      links[*it] = {std::next(it) == freeList_.end() ? kNone : *std::next(it), prev};
    std::vector<uint32_t> want = {regionSize_, freeList_.empty() ? kNone : freeList_.front()};
    std::vector<uint32_t> got = {r.head()->regionSize, r.head()->freeHead};
    for (const auto &[off, b] : blocks_) {
      const ShBlockHeader *h = r.block(off);
      auto link = b.free ? links.at(off) : std::make_pair(0u, 0u);
      want.insert(want.end(), {off, b.size, prevSize, link.first, link.second});
      got.insert(got.end(), {off, h->blockSize, h->prevBlockSize, h->nextFree, h->prevFree});
      prevSize = b.size;
    }
    if (want == got) return ::testing::AssertionSuccess();
    size_t i = std::mismatch(want.begin(), want.end(), got.begin()).first - want.begin();
    uint32_t block = i < 2 ? 0 : want[i - (i + 3) % 5];  // 0: the region header
    return ::testing::AssertionFailure()
           << "header word " << i << " (block " << block << "): " << got[i] << " not " << want[i];
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
  static const uint32_t huge[] = {0xFFFFFFFFu, 0xFFFFFFFEu, 0xFFFFFFFDu, 0xFFFFFFFCu, 0x80000000u};
  uint32_t k = rng() % 100;
  if (k < 5) return 0;
  if (k < 45) return 1 + rng() % 32;
  if (k < 85) return 33 + rng() % 480;
  return k < 95 ? rng() % regionSize : huge[rng() % 5];
}

// Random allocations, releases and resizes (to 0, to the same capacity,
// from null) on the heap and the model, which must agree on every header
// after every step; every live block keeps the pattern written into it.
void RunAgainstModel(uint32_t regionSize, uint32_t seed) {
  SCOPED_TRACE("region " + std::to_string(regionSize) + " seed " + std::to_string(seed));
  std::mt19937 rng(seed);
  Region r(regionSize, static_cast<uint8_t>(seed));
  ASSERT_EQ(SH_Reset(r.base(), regionSize), 0);
  Model m(regionSize);
  std::map<uint32_t, std::pair<uint32_t, uint32_t>> live;  // payload offset -> (size, tag)
  auto intact = [&](uint32_t off) {
    return HasPattern(r.at(off), live[off].first, live[off].second);
  };
  for (uint32_t step = 1; step <= 4000; ++step) {
    uint32_t k = rng() % 100, size = RandomSize(rng, regionSize), off = 0, want = 0;
    if (!live.empty() && k >= 45 && (k < 75 || rng() % 20 != 0))
      off = std::next(live.begin(), rng() % live.size())->first;
    ASSERT_TRUE(!off || intact(off));
    void *p = nullptr;
    if (k < 45 || live.empty()) {
      want = m.Alloc(size);
      p = SH_Alloc(r.base(), size);
    } else if (k < 75) {
      size = 0;  // a release, for the bookkeeping below
      m.Free(off);
      SH_Free(r.base(), r.at(off));
    } else {
      if (rng() % 10 < 3) size = rng() % 3 == 0 ? 0 : off ? m.Capacity(off) : size;
      want = m.Realloc(off, size);
      p = SH_Realloc(r.base(), off ? r.at(off) : nullptr, size);
      ASSERT_TRUE(!p || !off || HasPattern(p, std::min(live[off].first, size), live[off].second));
    }
    ASSERT_EQ(r.off(p), want) << "step " << step << " k " << k << " off " << off << " size "
                              << size;
    if (off && (p || size == 0)) live.erase(off);
    if (p) {
      FillPattern(p, size, step);
      live[want] = {size, step};
    }
    ASSERT_TRUE(m.Matches(r)) << "step " << step;
    coffer::ShHeapCounts c;
    ASSERT_TRUE(HeapSound(r.base(), &c));
    ASSERT_EQ(c.freeBlocks, m.FreeBlocks());
    ASSERT_EQ(c.allocatedBlocks, live.size());
    for (const auto &blk : live) ASSERT_TRUE(step % 64 || intact(blk.first));
  }
  for (const auto &blk : live) SH_Free(r.base(), r.at(blk.first));
  ExpectBlock(r, 16, regionSize - 16, 0, kNone, kNone);
}

TEST(RegionHeapModel, RandomOperationsMatchTheModel) {
  for (uint32_t size : {33u, 64u, 257u, 1024u, 4099u, 65536u})
    for (uint32_t seed = 1; seed <= 3; ++seed) {
      RunAgainstModel(size, seed * 7919 + size);
      if (HasFatalFailure()) return;
    }
}

}  // namespace
