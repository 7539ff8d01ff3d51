#include "util/MessageLogFolder.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>

#include "tests/support/Matchers.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr char kNewYearsFile[] =
    "/var/mobile/Library/Logs/CrashReporter/Retired/telvaned_2026-01-01-00-00-00_messageLog.ips";

class MessageLogFolderTest : public ::testing::Test {
 protected:
  RecordingLog& log() { return process.log(); }

  SimulatedWorld world;
  SimulatedPlatform& process = world.makeProcess("telvaned");
  MessageLogFolder folder{process.platform()};
  std::optional<std::string> path;
  std::optional<Date> date;
};

TEST(MessageLogNamesTest, aMessageLogHasThreePartsOfWhichTheFirstAndTheLastAreFixed) {
  EXPECT_TRUE(MessageLogFolder::isMessageLog("telvaned_2024-05-01-13-45-10_messageLog.ips"));
  EXPECT_TRUE(MessageLogFolder::isMessageLog("telvaned__messageLog.ips"));
  for (const char* other :
       {"", "_", "__", "telvaned", "telvaned_messageLog.ips", "telvaned_2024_05_messageLog.ips",
        "telvaned_2024_messageLog.ips_", "_telvaned_messageLog.ips", "other_2024_messageLog.ips",
        "Telvaned_2024_messageLog.ips", "telvaned_2024_messageLog.txt", "telvaned_2024_messageLog.ips.gz",
        "telvaned_2024_", "_2024_messageLog.ips", "folder/telvaned_2024_messageLog.ips"}) {
    EXPECT_FALSE(MessageLogFolder::isMessageLog(other)) << other;
  }
}

TEST(MessageLogAgeTest, aFileIsExpiredOnceItIsOlderThanADay) {
  const Date made(Date::TimePoint(std::chrono::seconds(1'000'000)));
  EXPECT_FALSE(MessageLogFolder::isExpired(made, Date(made.time() + std::chrono::seconds(86400))));
  EXPECT_TRUE(MessageLogFolder::isExpired(made, Date(made.time() + std::chrono::microseconds(86'400'000'001))));
  EXPECT_FALSE(MessageLogFolder::isExpired(made, Date(made.time() - std::chrono::hours(100))));
}

TEST_F(MessageLogFolderTest, aNewFileIsASubmittableLogNamedByTheTime) {
  path = "/former/path";
  date = Date();
  folder.createNewLogFile(&path, &date);
  EXPECT_EQ(path, kNewYearsFile);
  EXPECT_EQ(date, world.clock().now());
  EXPECT_THAT(process.submittableLogs().calls(), ElementsAre(std::string("create 224 ") + kNewYearsFile));
  EXPECT_TRUE(hasLine(
      log(), LogLevel::Default,
      std::string("writeToLogFile: Created new telvaned log file ") + kNewYearsFile + " (2026-01-01 00:00:00 +0000)"));
}

TEST_F(MessageLogFolderTest, aNameCarriesLocalTime) {
  process.locale().setSecondsFromGMT(std::chrono::hours(-3) - std::chrono::minutes(30));
  folder.createNewLogFile(&path, &date);
  EXPECT_EQ(path, std::string(MessageLogFolder::kPath) + "/telvaned_2025-12-31-20-30-00_messageLog.ips");
}

TEST_F(MessageLogFolderTest, aFileOfThatNameIsTakenAsItIs) {
  process.files().place(kNewYearsFile, "earlier\n");
  folder.createNewLogFile(&path, &date);
  EXPECT_EQ(path, kNewYearsFile);
  EXPECT_EQ(process.files().content(kNewYearsFile), "earlier\n");
}

TEST_F(MessageLogFolderTest, aFileThatCannotBeMadeLeavesNothing) {
  path = "/former/path";
  date = Date();
  process.fileFaults().failWrites(EROFS);
  log().expectError(std::string("writeToLogFile: Failed to create new telvaned log file ") + kNewYearsFile);
  log().expectError("createNewLogFile: ");
  folder.createNewLogFile(&path, &date);
  EXPECT_EQ(path, std::nullopt);
  EXPECT_EQ(date, std::nullopt);
}

TEST_F(MessageLogFolderTest, withoutAPlaceForPathAndDateNoFileIsMade) {
  log().expectError("createNewLogFile: both logFilePath and logFileCreationDate must not be nil");
  path = "/former/path";
  folder.createNewLogFile(nullptr, &date);
  folder.createNewLogFile(&path, nullptr);
  EXPECT_TRUE(hasLines(log(), 2, "createNewLogFile: both logFilePath and logFileCreationDate must not be nil"));
  EXPECT_EQ(path, "/former/path");
  EXPECT_THAT(process.submittableLogs().calls(), IsEmpty());
}

TEST_F(MessageLogFolderTest, anExpiredFileGoesToTheSubmissionService) {
  process.files().place(kNewYearsFile, "text\n");
  folder.deleteExpiredLogFile(kNewYearsFile, world.clock().now());
  EXPECT_FALSE(process.files().exists(kNewYearsFile));
  EXPECT_EQ(process.files().content(std::string(MemorySubmittableLogs::kSubmissionArea) +
                                    "/telvaned_2026-01-01-00-00-00_messageLog.ips"),
            "text\n");
  EXPECT_THAT(process.submittableLogs().calls(), ElementsAre(std::string("submit 224 ") + kNewYearsFile));
  EXPECT_TRUE(hasLine(log(), LogLevel::Default,
                      std::string("deleteExpiredLogFile: QueueLogForUpload succesfully submitted log file ") +
                          kNewYearsFile + " (2026-01-01 00:00:00 +0000)"));
}

TEST_F(MessageLogFolderTest, aRefusedFileIsDeleted) {
  process.files().place(kNewYearsFile, "text\n");
  process.submittableLogs().setRefusing(true);
  folder.deleteExpiredLogFile(kNewYearsFile, std::nullopt);
  EXPECT_FALSE(process.files().exists(kNewYearsFile));
  EXPECT_TRUE(
      hasLine(log(), LogLevel::Default,
              std::string("deleteExpiredLogFile: Deleted expired telvaned log file ") + kNewYearsFile + " ((null))"));
  EXPECT_TRUE(hasNoLine(log(), "succesfully"));
}

TEST_F(MessageLogFolderTest, aFileThatStaysIsNotSaidToBeDeleted) {
  process.files().place(kNewYearsFile, "text\n");
  process.submittableLogs().setRefusing(true);
  process.fileFaults().failWrites(EACCES);
  log().expectError("deleteExpiredLogFile: neither submitted (");
  folder.deleteExpiredLogFile(kNewYearsFile, world.clock().now());
  EXPECT_TRUE(process.files().exists(kNewYearsFile));
  EXPECT_TRUE(hasNoLine(log(), "Deleted expired"));
}

TEST_F(MessageLogFolderTest, aFolderThatIsNotThereIsMade) {
  EXPECT_THAT(folder.messageLogs(), IsEmpty());
  EXPECT_TRUE(process.files().exists(MessageLogFolder::kPath));
  EXPECT_TRUE(hasLine(log(), LogLevel::Default,
                      "writeToLogFile: Creating telvaned log directory at "
                      "/var/mobile/Library/Logs/CrashReporter/Retired"));
  folder.messageLogs();
  EXPECT_TRUE(hasLines(log(), 1, "Creating telvaned log directory"));
}

TEST_F(MessageLogFolderTest, aFolderThatCannotBeReadIsAnErrorAndEmpty) {
  process.files().place(kNewYearsFile, "text\n");
  process.fileFaults().failReads(EACCES, "Retired");
  log().expectError(
      "writeToLogFile: Error reading from log directory: "
      "/var/mobile/Library/Logs/CrashReporter/Retired: Permission denied");
  EXPECT_THAT(folder.messageLogs(), IsEmpty());
  EXPECT_TRUE(hasNoLine(log(), "Creating telvaned log directory"));
}

TEST_F(MessageLogFolderTest, aFolderThatCannotBeMadeIsAnErrorWithItsReason) {
  process.fileFaults().failWrites(EROFS);
  log().expectError(
      "writeToLogFile: /var/mobile/Library/Logs/CrashReporter/Retired: "
      "Read-only file system");
  EXPECT_THAT(folder.messageLogs(), IsEmpty());
}

}  // namespace
}  // namespace telvane::testing
