#include "tests/support/RecordingLog.h"

#include <gmock/gmock.h>
#include <gtest/gtest-spi.h>
#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "tests/support/Matchers.h"
#include "tests/support/SimulatedClock.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

TEST(RecordingLogTest, keepsLinesWithLevelTimeAndProcess) {
  SimulatedScheduler scheduler(1);
  SimulatedClock clock(scheduler);
  RecordingLog log(&clock, "daemon");
  log.expectError("broken");
  log.message("started {}", 1);
  scheduler.advance(1500ms);
  log.error("broken\nin two");
  log.info("detail");
  EXPECT_EQ(log.text(),
            "1000.000000 daemon <default> started 1\n"
            "1001.500000 daemon <error> broken\\nin two\n"
            "1001.500000 daemon <info> detail\n");
  EXPECT_EQ(log.lines()[1].level, LogLevel::Error);
}

TEST(RecordingLogTest, countsLinesByTextAndLevel) {
  RecordingLog log;
  log.message("one fish");
  log.message("two fish");
  log.info("red fish");
  EXPECT_EQ(log.count("fish"), 3u);
  EXPECT_EQ(log.count(LogLevel::Default, "fish"), 2u);
  EXPECT_TRUE(log.contains("red"));
  EXPECT_FALSE(log.contains("blue"));
  log.clear();
  EXPECT_EQ(log.count(""), 0u);
}

TEST(RecordingLogTest, formatsNothingOfALevelThatIsOff) {
  RecordingLog log(nullptr, "test", LogLevel::Default);
  log.info("detail");
  log.message("line");
  EXPECT_EQ(log.count(""), 1u);
}

TEST(RecordingLogTest, showsEachLineToItsObserver) {
  std::vector<std::string> seen;
  RecordingLog log(nullptr, "test", LogLevel::Info, [&seen](const LogLine& line) { seen.push_back(line.message); });
  log.message("a");
  log.info("b");
  EXPECT_THAT(seen, ::testing::ElementsAre("a", "b"));
}

TEST(RecordingLogTest, failsTheTestForAnUndeclaredError) {
  EXPECT_NONFATAL_FAILURE(
      {
        RecordingLog log;
        log.error("nobody expected this");
      },
      "an error line that was not declared: 0.000000 test <error> nobody expected this");
}

TEST(RecordingLogTest, failsTheTestForADeclaredErrorThatDoesNotCome) {
  EXPECT_NONFATAL_FAILURE(
      {
        RecordingLog log;
        log.expectError("cannot open");
      },
      "a declared error line did not come: cannot open");
}

TEST(RecordingLogTest, isContentWithDeclaredErrors) {
  RecordingLog log;
  log.expectError("cannot open");
  log.error("cannot open a");
  log.error("cannot open b");
  EXPECT_EQ(log.undeclared(), "");
}

TEST(RecordingLogTest, allowsEveryErrorWhenToldTo) {
  RecordingLog log;
  log.allowErrors();
  log.error("anything");
  EXPECT_EQ(log.undeclared(), "");
}

TEST(RecordingLogTest, takesLinesFromSeveralThreads) {
  RecordingLog log;
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([&log] {
      for (int line = 0; line < 100; ++line) log.message("line {}", line);
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(log.count("line"), 400u);
}

}  // namespace
}  // namespace telvane::testing
