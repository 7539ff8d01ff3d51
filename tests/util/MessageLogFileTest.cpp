#include "util/MessageLogFile.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>

#include "tests/support/Matchers.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr auto kDay = 86400s;

// A daemon that is started on New Year's Day at midnight.
class MessageLogFileTest : public ::testing::Test {
 protected:
  using Names = std::vector<std::string>;

  static std::string nameAt(const std::string& time) { return "telvaned_" + time + "_messageLog.ips"; }
  static std::string pathOf(const std::string& name) { return std::string(MessageLogFolder::kPath) + "/" + name; }
  // A file that stands there already and is that old.
  std::string givenFile(const std::string& name, std::chrono::seconds age, std::string_view content = "earlier\n") {
    process.files().place(pathOf(name), content);
    process.files().setCreationDate(pathOf(name), Date(world.clock().now().time() - age));
    return name;
  }
  void write(const char* text = "text") { messageLog.writeToLogFile("[{}] {}", "backend", text); }
  // As another daemon would, that knows of nothing.
  void writeAfterRestart() { MessageLogFile(process.platform()).writeToLogFile("restarted"); }
  void advance(std::chrono::microseconds time) { world.advance(time); }

  std::string content(const std::string& name) { return process.files().content(pathOf(name)); }
  Names namesBelow(const char* folder) {
    return process.files().exists(folder) ? *process.files().filesBelow(folder) : Names();
  }
  Names files() { return namesBelow(MessageLogFolder::kPath); }
  Names submitted() { return namesBelow(MemorySubmittableLogs::kSubmissionArea); }
  RecordingLog& log() { return process.log(); }
  Names logged() {
    Names messages;
    for (const LogLine& line : log().lines()) messages.push_back(line.message);
    return messages;
  }

  SimulatedWorld world;
  SimulatedPlatform& process = world.makeProcess("telvaned");
  MessageLogFile messageLog{process.platform()};
  const std::string newYear = nameAt("2026-01-01-00-00-00");
};

TEST_F(MessageLogFileTest, theFirstMessageMakesFolderFileAndLine) {
  write("hello");
  EXPECT_THAT(files(), ElementsAre(newYear));
  EXPECT_EQ(content(newYear), "(2026-01-01 00:00:00 +0000) [backend] hello\n");
  EXPECT_THAT(
      logged(),
      ElementsAre("writeToLogFile: Creating telvaned log directory at /var/mobile/Library/Logs/CrashReporter/Retired",
                  "writeToLogFile: Created new telvaned log file " + pathOf(newYear) + " (2026-01-01 00:00:00 +0000)",
                  "writeToLogFile: Saved log message to " + pathOf(newYear)));
}

TEST_F(MessageLogFileTest, laterMessagesFollowEachUnderItsOwnDate) {
  write("one");
  advance(61s);
  write("two");
  EXPECT_THAT(files(), ElementsAre(newYear));
  EXPECT_EQ(content(newYear),
            "(2026-01-01 00:00:00 +0000) [backend] one\n"
            "(2026-01-01 00:01:01 +0000) [backend] two\n");
  EXPECT_TRUE(hasLines(log(), 1, "Created new telvaned log file"));
  EXPECT_TRUE(hasLines(log(), 2, "Saved log message to"));
}

TEST_F(MessageLogFileTest, aLineTellsUniversalTimeWhateverTheNameTells) {
  process.locale().setSecondsFromGMT(2h);
  write();
  EXPECT_THAT(files(), ElementsAre(nameAt("2026-01-01-02-00-00")));
  EXPECT_EQ(content(nameAt("2026-01-01-02-00-00")), "(2026-01-01 00:00:00 +0000) [backend] text\n");
}

TEST_F(MessageLogFileTest, aMessageKeepsItsLineFeedsAndBraces) {
  write("{\n  \"events\" : [ {} ]\n}");
  EXPECT_EQ(content(newYear), "(2026-01-01 00:00:00 +0000) [backend] {\n  \"events\" : [ {} ]\n}\n");
}

TEST_F(MessageLogFileTest, whatIsInSubfoldersIsNotTheDaemons) {
  givenFile("telvaned_sub/x_messageLog.ips", 25h);
  givenFile("telvaned_sub/y_messageLog.ips", 1h);
  write();
  EXPECT_THAT(files(), ElementsAre(newYear, "telvaned_sub/x_messageLog.ips", "telvaned_sub/y_messageLog.ips"));
  EXPECT_EQ(content("telvaned_sub/y_messageLog.ips"), "earlier\n");
  EXPECT_THAT(submitted(), IsEmpty());
}

TEST_F(MessageLogFileTest, aRestartedDaemonGoesOnWithTheFileOfTheDay) {
  write("one");
  advance(23h);
  writeAfterRestart();
  EXPECT_THAT(files(), ElementsAre(newYear));
  EXPECT_EQ(content(newYear),
            "(2026-01-01 00:00:00 +0000) [backend] one\n"
            "(2026-01-01 23:00:00 +0000) restarted\n");
  EXPECT_THAT(submitted(), IsEmpty());
}

TEST_F(MessageLogFileTest, aFileIsUsedForADayAndNotLonger) {
  write("first");
  advance(kDay);
  write("last");
  EXPECT_THAT(submitted(), IsEmpty());
  log().clear();
  advance(1us);
  write("next");
  const std::string next = nameAt("2026-01-02-00-00-00");
  EXPECT_THAT(files(), ElementsAre(next));
  EXPECT_EQ(content(next), "(2026-01-02 00:00:00 +0000) [backend] next\n");
  EXPECT_THAT(submitted(), ElementsAre(newYear));
  EXPECT_THAT(logged(), ElementsAre("deleteExpiredLogFile: QueueLogForUpload succesfully submitted log file " +
                                        pathOf(newYear) + " (2026-01-01 00:00:00 +0000)",
                                    "writeToLogFile: Created new telvaned log file " + pathOf(next) +
                                        " (2026-01-02 00:00:00 +0000)",
                                    "writeToLogFile: Saved log message to " + pathOf(next)));
}

TEST_F(MessageLogFileTest, aFileIsLogType224FromItsMakingToItsSubmission) {
  write();
  advance(kDay + 1s);
  write();
  EXPECT_THAT(process.submittableLogs().calls(),
              ElementsAre("create 224 " + pathOf(newYear), "submit 224 " + pathOf(newYear),
                          ::testing::StartsWith("create 224 ")));
}

TEST_F(MessageLogFileTest, oneFileComesEachDay) {
  for (int day = 0; day < 5; ++day) {
    write();
    advance(kDay + 1s);
  }
  EXPECT_EQ(files().size(), 1u);
  EXPECT_EQ(submitted().size(), 4u);
}

TEST_F(MessageLogFileTest, ofTwoYoungFilesTheOlderIsSubmittedAndTheNewerUsed) {
  givenFile(nameAt("a"), 2h);
  givenFile(nameAt("b"), 1h);
  write();
  EXPECT_THAT(files(), ElementsAre(nameAt("b")));
  EXPECT_EQ(content(nameAt("b")), "earlier\n(2026-01-01 00:00:00 +0000) [backend] text\n");
  EXPECT_THAT(submitted(), ElementsAre(nameAt("a")));
  EXPECT_TRUE(hasNoLine(log(), "Created new"));
}

TEST_F(MessageLogFileTest, whichOfTwoIsNewerItsDateTellsAndNotItsName) {
  givenFile(nameAt("a"), 1h);
  givenFile(nameAt("b"), 2h);
  write();
  EXPECT_THAT(files(), ElementsAre(nameAt("a")));
  EXPECT_THAT(submitted(), ElementsAre(nameAt("b")));
}

TEST_F(MessageLogFileTest, ofTwoFilesOfOneAgeOneStays) {
  givenFile(nameAt("a"), 1h);
  givenFile(nameAt("b"), 1h);
  write();
  EXPECT_THAT(files(), ElementsAre(nameAt("a")));
  EXPECT_THAT(submitted(), ElementsAre(nameAt("b")));
}

TEST_F(MessageLogFileTest, ofManyFilesTheNewestYoungOneStays) {
  givenFile(nameAt("a"), kDay + 1s);
  givenFile(nameAt("b"), 3h);
  givenFile(nameAt("c"), 1h);
  givenFile(nameAt("d"), 2h);
  givenFile(nameAt("e"), 10 * kDay);
  write();
  EXPECT_THAT(files(), ElementsAre(nameAt("c")));
  EXPECT_THAT(submitted(), ElementsAre(nameAt("a"), nameAt("b"), nameAt("d"), nameAt("e")));
}

TEST_F(MessageLogFileTest, aFileFromTheFutureIsYoung) {
  givenFile(nameAt("a"), -48h);
  write();
  EXPECT_THAT(files(), ElementsAre(nameAt("a")));
}

TEST_F(MessageLogFileTest, aNewerFileOfSomebodyElsesIsSeenWhenTheCurrentOneExpires) {
  write();
  advance(kDay + 1s);
  givenFile(nameAt("0"), 2h);  // its name comes before that of the current one
  givenFile(nameAt("9"), 1h);
  write("next");
  EXPECT_THAT(files(), ElementsAre(nameAt("9")));
  EXPECT_THAT(submitted(), ElementsAre(nameAt("0"), newYear));
  EXPECT_TRUE(hasLines(log(), 2, "succesfully submitted"));
  EXPECT_TRUE(hasNoLine(log(), "Deleted expired"));
}

TEST_F(MessageLogFileTest, aYoungFileUnderTheNameOfTheCurrentOneTakesItsPlace) {
  write();
  advance(kDay + 1s);
  givenFile(newYear, 1h, "put there by somebody\n");
  write("next");
  EXPECT_THAT(files(), ElementsAre(newYear));
  EXPECT_EQ(content(newYear), "put there by somebody\n(2026-01-02 00:00:01 +0000) [backend] next\n");
  EXPECT_THAT(submitted(), IsEmpty());
}

TEST_F(MessageLogFileTest, theFolderIsNotLookedAtWhileTheFileIsYoung) {
  write();
  givenFile(nameAt("2026-01-01-12-00-00"), -12h);
  process.fileFaults().failReads(EIO, "Retired");
  advance(kDay);
  write();
  EXPECT_EQ(files().size(), 2u);
  EXPECT_TRUE(hasLines(log(), 2, "Saved log message to " + pathOf(newYear)));
}

TEST_F(MessageLogFileTest, aFileWithoutACreationDateIsUsedForEver) {
  givenFile(nameAt("a"), 0s);
  process.files().setCreationDate(pathOf(nameAt("a")), std::nullopt);
  write();
  process.fileFaults().failReads(EIO, "Retired");
  advance(100 * kDay);
  write();
  EXPECT_THAT(files(), ElementsAre(nameAt("a")));
  EXPECT_TRUE(hasLines(log(), 2, "Saved log message to " + pathOf(nameAt("a"))));
}

TEST_F(MessageLogFileTest, aFileWithADateTakesThePlaceOfOneWithout) {
  givenFile(nameAt("a"), 0s);
  process.files().setCreationDate(pathOf(nameAt("a")), std::nullopt);
  givenFile(nameAt("b"), 3h);
  write();
  EXPECT_THAT(files(), ElementsAre(nameAt("a"), nameAt("b")));
  EXPECT_EQ(content(nameAt("a")), "earlier\n");
  EXPECT_THAT(content(nameAt("b")), ::testing::HasSubstr("text"));
}

TEST_F(MessageLogFileTest, aFileWithoutADateGivesWayToOneWith) {
  givenFile(nameAt("a"), 3h);
  givenFile(nameAt("b"), 0s);
  process.files().setCreationDate(pathOf(nameAt("b")), std::nullopt);
  write();
  EXPECT_THAT(files(), ElementsAre(nameAt("a")));
  EXPECT_THAT(submitted(), ElementsAre(nameAt("b")));
  EXPECT_TRUE(hasLine(log(), "succesfully submitted log file " + pathOf(nameAt("b")) + " ((null))"));
}

TEST_F(MessageLogFileTest, filesOfOthersAreLeftAlone) {
  const Names others = {"folder/telvaned_old_messageLog.ips", "other_old_messageLog.ips", "telvaned_a_b_messageLog.ips",
                        "telvaned_messageLog.ips", "telvaned_old_other.ips"};
  for (const std::string& name : others) givenFile(name, 10 * kDay);
  write();
  Names expected = others;
  expected.push_back(newYear);
  EXPECT_THAT(files(), ::testing::UnorderedElementsAreArray(expected));
  EXPECT_THAT(submitted(), IsEmpty());
  for (const std::string& name : others) EXPECT_EQ(content(name), "earlier\n") << name;
}

TEST_F(MessageLogFileTest, whatTheServiceRefusesIsDeleted) {
  givenFile(nameAt("a"), kDay + 1s);
  process.submittableLogs().setRefusing(true);
  write();
  EXPECT_THAT(files(), ElementsAre(newYear));
  EXPECT_THAT(submitted(), IsEmpty());
  EXPECT_TRUE(hasLine(log(), LogLevel::Default,
                      "deleteExpiredLogFile: Deleted expired telvaned log file " + pathOf(nameAt("a")) +
                          " (2025-12-30 23:59:59 +0000)"));
}

TEST_F(MessageLogFileTest, anExpiredFileThatCannotBeMovedIsNotWrittenOnto) {
  givenFile(nameAt("a"), kDay + 1s);
  process.submittableLogs().setRefusing(true);
  process.fileFaults().failWrites(EACCES, nameAt("a"));
  log().expectError("deleteExpiredLogFile: neither submitted (");
  write();
  EXPECT_EQ(content(nameAt("a")), "earlier\n");
  EXPECT_EQ(content(newYear), "(2026-01-01 00:00:00 +0000) [backend] text\n");
}

TEST_F(MessageLogFileTest, aFolderThatCannotBeListedGetsANewFileAllTheSame) {
  givenFile(nameAt("a"), 1h);
  process.fileFaults().failReads(EACCES, "Retired");
  log().expectError("writeToLogFile: Error reading from log directory: " + std::string(MessageLogFolder::kPath) +
                    ": Permission denied");
  log().expectError("writeToLogFile: Failed to create new telvaned log file " + pathOf(newYear));
  write("lost, since nobody can see whether the file was made");
  process.fileFaults().heal();
  write("kept");
  EXPECT_THAT(content(nameAt("a")) + content(newYear), ::testing::HasSubstr("kept"));
}

TEST_F(MessageLogFileTest, anExpiredFileStaysInUseWhileTheFolderCannotBeListed) {
  write("one");
  process.fileFaults().failReads(EIO, "Retired");
  advance(kDay + 1s);
  log().expectError("writeToLogFile: Error reading from log directory");
  write("two");
  EXPECT_THAT(content(newYear), ::testing::HasSubstr("two"));
  process.fileFaults().heal();
  write("three");
  EXPECT_THAT(submitted(), ElementsAre(newYear));
  EXPECT_EQ(content(nameAt("2026-01-02-00-00-01")), "(2026-01-02 00:00:01 +0000) [backend] three\n");
}

TEST_F(MessageLogFileTest, aMessageWithoutAFileIsDroppedAndTheNextOneTriesAnew) {
  process.fileFaults().failWrites(EROFS);
  log().expectError("writeToLogFile: " + std::string(MessageLogFolder::kPath) + ": Read-only file system");
  log().expectError("createNewLogFile: ");
  log().expectError("writeToLogFile: Failed to create new telvaned log file " + pathOf(newYear));
  write("lost");
  EXPECT_TRUE(hasNoLine(log(), "Saved"));
  process.fileFaults().heal();
  write("kept");
  EXPECT_EQ(content(newYear), "(2026-01-01 00:00:00 +0000) [backend] kept\n");
}

TEST_F(MessageLogFileTest, aFileThatCannotBeOpenedIsReplacedAtTheCostOfTheMessage) {
  write("one");
  advance(1s);
  process.fileFaults().failWrites(EACCES, newYear);
  log().expectError("writeToLogFile: Message lost: " + pathOf(newYear) + ": Permission denied");
  write("lost");
  const std::string next = nameAt("2026-01-01-00-00-01");
  EXPECT_EQ(content(next), "");
  EXPECT_TRUE(hasLine(log(), "writeToLogFile: Created new telvaned log file " + pathOf(next)));
  write("two");
  EXPECT_EQ(content(newYear), "(2026-01-01 00:00:00 +0000) [backend] one\n");
  EXPECT_EQ(content(next), "(2026-01-01 00:00:01 +0000) [backend] two\n");
  EXPECT_TRUE(hasLines(log(), 2, "Saved log message to"));
}

TEST_F(MessageLogFileTest, aFileThatSomebodyRemovedIsMadeAnew) {
  write("one");
  EXPECT_TRUE(isOk(process.files().remove(pathOf(newYear))));
  log().expectError("writeToLogFile: Message lost: ");
  write("lost");
  write("two");
  EXPECT_EQ(content(newYear), "(2026-01-01 00:00:00 +0000) [backend] two\n");
}

TEST_F(MessageLogFileTest, aFullDiskLosesTheMessageAndMakesNoFile) {
  write("one");
  advance(1s);
  process.fileFaults().fillDisk();
  log().expectError("writeToLogFile: Message lost: " + pathOf(newYear) + ": No space left on device");
  write("lost");
  EXPECT_THAT(files(), ElementsAre(newYear));
  EXPECT_TRUE(hasLines(log(), 1, "Saved log message to"));
  process.fileFaults().heal();
  write("two");
  EXPECT_EQ(content(newYear),
            "(2026-01-01 00:00:00 +0000) [backend] one\n"
            "(2026-01-01 00:00:01 +0000) [backend] two\n");
}

TEST_F(MessageLogFileTest, aCalendarThatIsSetBackRetiresNothing) {
  write("one");
  world.clock().jumpCalendar(-48h);
  write("two");
  EXPECT_THAT(files(), ElementsAre(newYear));
  EXPECT_THAT(content(newYear), ::testing::EndsWith("(2025-12-30 00:00:00 +0000) [backend] two\n"));
}

}  // namespace
}  // namespace telvane::testing
