#include "platform/log/LogFactory.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/log/NullLog.h"

namespace telvane::testing {
namespace {

TEST(LogFactoryTest, knowsTheLevelsByName) {
  EXPECT_EQ(logLevelFromName("error"), LogLevel::Error);
  EXPECT_EQ(logLevelFromName("default"), LogLevel::Default);
  EXPECT_EQ(logLevelFromName("info"), LogLevel::Info);
  for (const char* name : {"", "Error", "debug", "info "}) EXPECT_EQ(logLevelFromName(name), std::nullopt) << name;
}

TEST(LogFactoryTest, knowsTheTargetsByName) {
  EXPECT_EQ(logTargetFromName("stderr"), LogTarget::StandardError);
  EXPECT_EQ(logTargetFromName("journal"), LogTarget::Journal);
  for (const char* name : {"", "stdout", "Journal"}) EXPECT_EQ(logTargetFromName(name), std::nullopt) << name;
}

TEST(LogFactoryTest, makesALogOnStandardErrorWithTheProgramsName) {
  ::testing::internal::CaptureStderr();
  newLog(LogTarget::StandardError, LogLevel::Default, "program")->message("hello");
  EXPECT_THAT(::testing::internal::GetCapturedStderr(),
              ::testing::MatchesRegex("[0-9]+-[0-9]+-[0-9]+T[0-9]+:[0-9]+:[0-9]+[.][0-9]+Z program\\[[0-9]+\\] "
                                      "<default> hello\n"));
}

TEST(LogFactoryTest, makesALibrarysLogThatNeverPrints) {
  ::testing::internal::CaptureStderr();
  ::testing::internal::CaptureStdout();
  newLog(LogTarget::JournalOrNothing, LogLevel::Info, "telvane-log-test")->error("an error of the library's own test");
  EXPECT_EQ(::testing::internal::GetCapturedStderr(), "");
  EXPECT_EQ(::testing::internal::GetCapturedStdout(), "");
}

TEST(LogFactoryTest, makesALogThatKeepsNothing) {
  ::testing::internal::CaptureStderr();
  NullLog().error("nobody reads this");
  EXPECT_EQ(::testing::internal::GetCapturedStderr(), "");
}

}  // namespace
}  // namespace telvane::testing
