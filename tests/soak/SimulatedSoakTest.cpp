#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <iostream>

#include "tests/soak/SimulatedSoak.h"
#include "tests/support/Seeds.h"

namespace telvane::testing {
namespace {

// TELVANE_SOAK_LOG in the environment names the file that gets the log of a run that failed.
void keepLog(const SimulatedSoak& soak, uint64_t seed) {
  const char* file = std::getenv("TELVANE_SOAK_LOG");
  std::cout << "the run of seed " << seed << (file != nullptr ? " is in " : " can be kept with TELVANE_SOAK_LOG=FILE ")
            << (file != nullptr ? file : "") << std::endl;
  if (file != nullptr) std::ofstream(file, std::ios::binary) << soak.log();
}

TEST(SimulatedSoakTest, aLongLifeLeavesNothingBehindAndEveryEventIsAccountedFor) {
  constexpr int kSteps = 600;
  constexpr uint64_t kSeeds = 12;
  forEachSeed(kSeeds, [](uint64_t seed) {
    SimulatedSoak soak(seed);
    soak.live(kSteps);
    if (!HasFailure()) soak.endAndCheck();
    if (HasFailure()) return keepLog(soak, seed);
    // What a run is for must have happened in it.
    EXPECT_GT(soak.ledger().taken(), 0u);
    EXPECT_GT(soak.cutOffSessions(), 0u);
    EXPECT_GT(soak.killedProcesses(), 0u);
    std::cout << "seed " << seed << ": " << soak.ledger().summary() << std::endl;
  });
}

}  // namespace
}  // namespace telvane::testing
