#include <gmock/gmock.h>

#include "tests/bench/BenchProgram.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

class RoadProgramTest : public BenchProgramTest {
 protected:
  RoadProgramTest() : BenchProgramTest("road") {}
};

TEST_F(RoadProgramTest, everyEventOfEveryPartArrivesOnce) {
  const int status = run({"--events", "300", "--rounds", "1", "--posts", "5", "--session-events", "3",
                          "--memory-events", "2000", "--idle-seconds", "0"});
  ASSERT_EQ(status, 0) << errors();
  // A session adds two of its own to a batched run; real-time events are preceded by 50 to warm up.
  constexpr int kBatched = 300 + 4 * (300 + 2);
  constexpr int kRealTime = 50 + 5;
  constexpr int kSessions = 26 * 4 * (3 + 2);
  constexpr int kMemory = 2000 + 2;
  const std::string all = std::to_string(kBatched + kRealTime + kSessions + kMemory);
  EXPECT_THAT(output(), HasSubstr("| " + all + " of " + all + " "));
}

TEST_F(RoadProgramTest, aPartAloneSaysNothingOfTheOthers) {
  ASSERT_EQ(run({"--only", "batched", "--events", "300", "--rounds", "2"}), 0) << errors();
  EXPECT_THAT(output(), HasSubstr("daemon, filters and white list: CPU ratio to ceiling"));
  EXPECT_THAT(output(), HasSubstr("at most 1.60"));
  EXPECT_THAT(output(), HasSubstr("log at default: CPU ratio to log at error"));
  EXPECT_THAT(output(), HasSubstr("with a digest in every event: CPU ratio to ceiling"));
  EXPECT_THAT(output(), HasSubstr("2 rounds"));
  for (const char* other : {"eal-time", "104 sessions", "quarter of the run"})
    EXPECT_THAT(output(), Not(HasSubstr(other)));
}

TEST_F(RoadProgramTest, wrongUsageIsSaidInOneLineAndEndsWithTwo) {
  EXPECT_EQ(run({"--rounds", "0"}), 2);
  EXPECT_THAT(errors(), HasSubstr("--rounds"));
  EXPECT_EQ(output(), "");
  EXPECT_EQ(run({"--only", "everything"}), 2);
}

}  // namespace
}  // namespace telvane::testing
