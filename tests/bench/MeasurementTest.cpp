#include "bench/Measurement.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include "bench/InstructionCounter.h"

namespace telvane::bench {
namespace {

// Keeps the processor busy for so long of its own time.
void work(double microseconds) {
  const double end = threadCPUMicroseconds() + microseconds;
  while (threadCPUMicroseconds() < end) {
  }
}

TEST(MeasurementTest, anotherProcessIsMeasuredLikeOneself) {
  const double before = cpuMicrosecondsOf(getpid());
  work(20000);
  const double spent = cpuMicrosecondsOf(getpid()) - before;
  EXPECT_GE(spent, 20000);
  EXPECT_NEAR(cpuMicrosecondsOf(getpid()), ownCPUMicroseconds(), 20000);
}

TEST(MeasurementTest, aProcessThatIsGoneHasNothing) {
  constexpr pid_t kNobody = 0x7ffffffe;
  EXPECT_EQ(cpuMicrosecondsOf(kNobody), 0);
  EXPECT_EQ(residentMemoryOf(kNobody), 0u);
  EXPECT_TRUE(switchesOf(kNobody).empty());
}

TEST(MeasurementTest, wakeUpsAreCountedThreadByThread) {
  EXPECT_EQ(wakeUpsBetween({{1, 10}, {2, 5}}, {{1, 10}, {2, 5}}), 0u);
  EXPECT_EQ(wakeUpsBetween({{1, 10}, {2, 5}}, {{1, 12}, {2, 6}}), 3u);
  // One thread has ended, for which it woke up; another is new.
  EXPECT_EQ(wakeUpsBetween({{1, 10}, {2, 5000}}, {{1, 10}, {3, 2}}), 3u);
}

TEST(MeasurementTest, instructionsAreCountedOrRefusedWithAReason) {
  const InstructionCounter counter(getpid());
  work(1000);
  const auto count = counter.count();
  EXPECT_EQ(count.has_value(), counter.refusal().empty());
  // A processor does more than one of them per microsecond.
  if (count.has_value()) {
    EXPECT_GT(*count, 1000u);
  }
}

TEST(MeasurementTest, optionsStandBehindTheirNames) {
  char program[] = "program";
  char name[] = "--events";
  char number[] = "12";
  char flag[] = "--held";
  char* arguments[] = {program, name, number, flag};
  EXPECT_EQ(numberOption(4, arguments, "events", 5), 12u);
  EXPECT_EQ(numberOption(4, arguments, "rounds", 5), 5u);
  EXPECT_TRUE(hasOption(4, arguments, "held"));
  EXPECT_FALSE(hasOption(4, arguments, "quick"));
}

}  // namespace
}  // namespace telvane::bench
