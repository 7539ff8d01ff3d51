#include "platform/log/KeptLog.h"

#include <gtest/gtest.h>

namespace telvane {
namespace {

TEST(KeptLogTest, givesWhatWasWrittenSinceTheLastTime) {
  KeptLog log;
  log.message("first {}", 1);
  log.error("second\nline");
  const std::vector<KeptLog::Line> lines = log.take();
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_EQ(lines[0].level, LogLevel::Default);
  EXPECT_EQ(lines[0].message, "first 1");
  EXPECT_EQ(lines[1].level, LogLevel::Error);
  EXPECT_EQ(lines[1].message, "second\nline");
  EXPECT_TRUE(log.take().empty());
  log.message("third");
  EXPECT_EQ(log.take().size(), 1u);
}

TEST(KeptLogTest, keepsNothingBelowItsLevel) {
  KeptLog log(LogLevel::Error);
  log.message("unimportant");
  log.info("less important still");
  EXPECT_TRUE(log.take().empty());
}

}  // namespace
}  // namespace telvane
