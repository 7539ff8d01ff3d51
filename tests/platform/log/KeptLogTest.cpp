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

TEST(KeptLogTest, saysHowManyLinesFoundNoRoom) {
  KeptLog log;
  const std::string megabyte(1u << 20, 'x');
  for (int n = 0; n < 6; ++n) log.message("{}", megabyte);
  const std::vector<KeptLog::Line> lines = log.take();
  ASSERT_EQ(lines.size(), 5u);
  EXPECT_EQ(lines[3].message, megabyte);
  EXPECT_EQ(lines[4].level, LogLevel::Error);
  EXPECT_EQ(lines[4].message, "2 more lines found no room");
  log.message("room again");
  EXPECT_EQ(log.take().size(), 1u);
}

}  // namespace
}  // namespace telvane
