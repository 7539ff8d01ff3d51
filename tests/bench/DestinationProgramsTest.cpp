// The measurements of the other destinations, with counts so small that they take seconds: whether they measure what
// they say, not how fast it is.
#include <gmock/gmock.h>

#include "tests/bench/BenchProgram.h"

namespace telvane::testing {
namespace {

using ::testing::ContainsRegex;

class DashboardProgramTest : public BenchProgramTest {
 protected:
  DashboardProgramTest() : BenchProgramTest("dashboard") {}
};

// Few enough for the receiver's buffer to hold all of them.
TEST_F(DashboardProgramTest, allOfAFewEventsComeWithAndWithoutAcknowledgements) {
  ASSERT_EQ(run({"--events", "40", "--rounds", "2"}), 0) << errors();
  for (const char* how : {"once each", "reliable"}) {
    const std::string row(how);
    EXPECT_THAT(output(), ContainsRegex("events per second, " + row + " +\\| [0-9.]*[1-9]"));
    EXPECT_THAT(output(), ContainsRegex("daemon's CPU per event, " + row + " +\\| [0-9.]*[1-9]"));
    EXPECT_THAT(output(), ContainsRegex("datagrams that came, " + row + " +\\| 100\\.0 %"));
  }
}

class UploadProgramTest : public BenchProgramTest {
 protected:
  UploadProgramTest() : BenchProgramTest("upload") {}
};

TEST_F(UploadProgramTest, measuresAnUploadBesideGzipAndBarePosts) {
  ASSERT_EQ(run({"--megabytes", "1", "--rounds", "1"}), 0) << errors();
  EXPECT_THAT(output(), ContainsRegex("1 MiB through telvanectl and daemon .CPU: the daemon's.: time +\\| [0-9]"));
  EXPECT_THAT(output(), ContainsRegex("bare post of what gzip made: CPU +\\| [0-9]"));
  EXPECT_THAT(output(), ContainsRegex("upload: time against gzip and bare post +\\| [0-9]"));
  EXPECT_THAT(output(), ContainsRegex("daemon: peak memory +\\| [1-9]"));
  EXPECT_THAT(output(), ContainsRegex("compressed size: [1-9][0-9]* KiB")) << "gzip did something";
}

}  // namespace
}  // namespace telvane::testing
