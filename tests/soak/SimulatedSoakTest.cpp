#include <gtest/gtest.h>

#include <iostream>

#include "tests/soak/SimulatedSoak.h"
#include "tests/support/Seeds.h"

namespace telvane::testing {
namespace {

TEST(SimulatedSoakTest, aLongLifeLeavesNothingBehindAndEveryEventIsAccountedFor) {
  constexpr int kSteps = 600;
  constexpr uint64_t kSeeds = 12;
  forEachSeed(kSeeds, [](uint64_t seed) {
    SimulatedSoak soak(seed);
    soak.live(kSteps);
    if (HasFailure()) return;
    soak.endAndCheck();
    // What a run is for must have happened in it.
    EXPECT_GT(soak.ledger().taken(), 0u);
    EXPECT_GT(soak.cutOffSessions(), 0u);
    EXPECT_GT(soak.killedProcesses(), 0u);
    std::cout << "seed " << seed << ": " << soak.ledger().summary() << std::endl;
  });
}

}  // namespace
}  // namespace telvane::testing
