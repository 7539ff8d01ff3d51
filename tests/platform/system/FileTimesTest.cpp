#include "platform/system/FileTimes.h"

#include <gtest/gtest.h>

namespace telvane {
namespace {

// What a file system tells of a file: which of the times, in seconds since 1970.
struct statx told(unsigned mask, int64_t born, int64_t read, int64_t written) {
  struct statx status {};
  status.stx_mask = mask;
  status.stx_btime.tv_sec = born;
  status.stx_atime.tv_sec = read;
  status.stx_mtime.tv_sec = written;
  return status;
}

std::optional<Date> at(int64_t seconds) { return Date(Date::TimePoint(std::chrono::seconds(seconds))); }

TEST(FileTimesTest, aFileIsAsOldAsItsBirth) {
  EXPECT_EQ(creationDateOf(told(STATX_BTIME | STATX_ATIME | STATX_MTIME, 100, 50, 60)), at(100));
  EXPECT_EQ(creationDateOf(told(STATX_BTIME, 100, 0, 0)), at(100));
}

TEST(FileTimesTest, withoutABirthTheEarlierOfReadingAndWritingCounts) {
  EXPECT_EQ(creationDateOf(told(STATX_ATIME | STATX_MTIME, 7, 100, 200)), at(100));
  EXPECT_EQ(creationDateOf(told(STATX_ATIME | STATX_MTIME, 7, 300, 200)), at(200));
}

TEST(FileTimesTest, nothingIsMadeUp) {
  EXPECT_EQ(creationDateOf(told(0, 1, 2, 3)), std::nullopt);
  EXPECT_EQ(creationDateOf(told(STATX_MTIME, 1, 2, 3)), std::nullopt);
  EXPECT_EQ(creationDateOf(told(STATX_ATIME, 1, 2, 3)), std::nullopt);
}

TEST(FileTimesTest, partsOfASecondCountToTheMicrosecond) {
  struct statx status = told(STATX_BTIME, 100, 0, 0);
  status.stx_btime.tv_nsec = 250'000'999;
  EXPECT_EQ(creationDateOf(status), Date(Date::TimePoint(std::chrono::microseconds(100'250'000))));
}

}  // namespace
}  // namespace telvane
