// Every family against its model on seeded random operations, and under the
// failure-injection driver.
#include <gtest/gtest.h>

#include "support/driver.h"

namespace coffer_test {
namespace {

using Runner = std::string (*)(Ops &, Arena);
const std::pair<const char *, Runner> kRunners[] = {
    {"esa", RunEsaModel}, {"rbt", RunRbtModel}, {"hst", RunHstModel}, {"hstaa", RunHstaaModel}};

TEST(Models, AgreeOnSeededOperations) {
  for (auto [name, run] : kRunners)
    for (uint32_t seed = 1; seed <= 40; seed++) {
      TestPool tp;
      Ops ops(RandomBytes(seed, 3000));
      EXPECT_EQ(run(ops, Arena{tp.pool(), &tp}), "") << name << " seed " << seed;
      EXPECT_EQ(tp.held(), 0u) << name << " seed " << seed;
      EXPECT_EQ(tp.misuse, "") << name << " seed " << seed;
    }
}

TEST(Models, RollBackEveryRefusedAllocation) {
  for (auto [name, run] : kRunners)
    for (uint32_t seed = 100; seed <= 110; seed++) {
      std::vector<uint8_t> bytes = RandomBytes(seed, 300);
      EXPECT_EQ(ForEachFailure([&](Arena a) {
                  Ops ops(bytes);
                  return run(ops, a);
                }),
                "")
          << name << " seed " << seed;
    }
}

}  // namespace
}  // namespace coffer_test
