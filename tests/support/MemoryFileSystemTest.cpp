#include "tests/support/MemoryFileSystem.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <array>
#include <cerrno>

#include "tests/support/FaultyFileSystem.h"
#include "tests/support/Matchers.h"
#include "tests/support/MemorySubmittableLogs.h"
#include "tests/support/SimulatedClock.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

class MemoryFileSystemTest : public ::testing::Test {
 protected:
  SimulatedScheduler _scheduler{1};
  SimulatedClock _clock{_scheduler};
  MemoryFileSystem _files{_clock, "/root"};
};

TEST_F(MemoryFileSystemTest, resolvesTheHomeAndTheSystemsFolders) {
  EXPECT_EQ(_files.resolve("~/Library/x"), "/home/user/Library/x");
  EXPECT_EQ(_files.resolve("~"), "/home/user");
  EXPECT_EQ(_files.resolve("/etc/telvane"), "/root/etc/telvane");
  EXPECT_EQ(_files.resolve("/var/mobile//Library/"), "/root/var/mobile/Library");
  EXPECT_EQ(_files.resolve("/tmp/tvnstorage/a"), "/root/tmp/tvnstorage/a");
  EXPECT_EQ(_files.resolve("/tmp/else"), "/tmp/else");
  EXPECT_EQ(_files.resolve("/variable"), "/variable");
  EXPECT_EQ(MemoryFileSystem(_clock).resolve("/etc/telvane"), "/etc/telvane");
}

TEST_F(MemoryFileSystemTest, readsWhatWasWritten) {
  EXPECT_TRUE(isOk(_files.createDirectory("/var/a/b")));
  EXPECT_TRUE(isOk(_files.write("/var/a/b/file", Data::copyOf("one"))));
  EXPECT_TRUE(isOk(_files.writeAtomically("/var/a/b/file", Data::copyOf("two"))));
  const auto read = _files.read("/var/a/b/file", 3);
  ASSERT_TRUE(isOk(read));
  EXPECT_EQ(*read, Data::copyOf("two"));
  EXPECT_TRUE(isError(_files.read("/var/a/b/file", 2), EFBIG));
}

TEST_F(MemoryFileSystemTest, failsAsADiskDoes) {
  EXPECT_TRUE(isError(_files.read("/var/absent", 10), ENOENT));
  EXPECT_TRUE(isError(_files.write("/var/absent/file", Data()), ENOENT));
  _files.place("/var/file", "x");
  EXPECT_TRUE(isError(_files.read("/var", 10), EISDIR));
  EXPECT_TRUE(isError(_files.write("/var", Data()), EISDIR));
  EXPECT_TRUE(isError(_files.write("/var/file/below", Data()), ENOTDIR));
  EXPECT_TRUE(isError(_files.createDirectory("/var/file"), EEXIST));
  EXPECT_TRUE(isError(_files.createDirectory("/var/file/below"), ENOTDIR));
  EXPECT_TRUE(isOk(_files.createDirectory("/var")));
  EXPECT_TRUE(isError(_files.remove("/var"), ENOTEMPTY));
  EXPECT_TRUE(isError(_files.remove("/var/absent"), ENOENT));
  EXPECT_TRUE(isError(_files.filesBelow("/var/absent"), ENOENT));
  EXPECT_TRUE(isError(_files.filesBelow("/var/file"), ENOTDIR));
  EXPECT_TRUE(isError(_files.setProtectionNone("/var/absent"), ENOENT));
}

TEST_F(MemoryFileSystemTest, removesFilesAndEmptyFolders) {
  _files.place("/var/folder/file", "x");
  EXPECT_TRUE(isOk(_files.remove("/var/folder/file")));
  EXPECT_TRUE(isOk(_files.remove("/var/folder")));
  EXPECT_FALSE(_files.exists("/var/folder"));
  EXPECT_TRUE(_files.exists("/var"));
}

TEST_F(MemoryFileSystemTest, datesFilesByItsClock) {
  _files.place("/var/file", "x");
  const auto first = _files.modificationDate("/var/file");
  EXPECT_EQ(first, _clock.now());
  _scheduler.advance(10s);
  EXPECT_EQ(_files.modificationDate("/var/file"), first);
  EXPECT_TRUE(isOk(_files.writeAtomically("/var/file", Data())));
  EXPECT_EQ(_files.modificationDate("/var/file"), _clock.now());
  _files.setModificationDate("/var/file", Date());
  EXPECT_EQ(_files.modificationDate("/var/file"), Date());
  EXPECT_EQ(_files.modificationDate("/var/absent"), std::nullopt);
}

TEST_F(MemoryFileSystemTest, addsToFilesThatAreThere) {
  EXPECT_TRUE(isError(_files.openForAppending("/var/file"), ENOENT));
  _files.place("/var/file", "one");
  EXPECT_TRUE(isError(_files.openForAppending("/var"), EISDIR));
  const auto made = _clock.now();
  _scheduler.advance(10s);
  const auto file = _files.openForAppending("/var/file");
  ASSERT_TRUE(isOk(file));
  EXPECT_TRUE(isOk((*file)->append(" two")));
  EXPECT_EQ(_files.content("/var/file"), "one two");
  EXPECT_EQ(_files.creationDate("/var/file"), made);
  EXPECT_EQ(_files.modificationDate("/var/file"), _clock.now());
  EXPECT_TRUE(isOk(_files.remove("/var/file")));
  EXPECT_TRUE(isError((*file)->append("three"), ENOENT));
}

TEST_F(MemoryFileSystemTest, aCreationDateStaysUntilTheTestTakesItAway) {
  _files.place("/var/file", "x");
  const auto made = _clock.now();
  _scheduler.advance(10s);
  EXPECT_TRUE(isOk(_files.write("/var/file", Data())));
  EXPECT_EQ(_files.creationDate("/var/file"), made);
  _files.setCreationDate("/var/file", Date());
  EXPECT_EQ(_files.creationDate("/var/file"), Date());
  _files.setCreationDate("/var/file", std::nullopt);
  EXPECT_EQ(_files.creationDate("/var/file"), std::nullopt);
  EXPECT_TRUE(_files.exists("/var/file"));
}

TEST_F(MemoryFileSystemTest, listsFilesBelowAFolderInOrder) {
  for (const char* path : {"/var/b", "/var/a/z", "/var/a/b/c", "/variable"}) _files.place(path, "x");
  const auto files = _files.filesBelow("/var");
  ASSERT_TRUE(isOk(files));
  EXPECT_THAT(*files, ElementsAre("a/b/c", "a/z", "b"));
  const auto names = _files.filesIn("/var");
  ASSERT_TRUE(isOk(names));
  EXPECT_THAT(*names, ElementsAre("b"));
  EXPECT_TRUE(isError(_files.filesIn("/var/absent"), ENOENT));
}

TEST_F(MemoryFileSystemTest, remembersWhatIsUnprotected) {
  _files.place("/var/file", "x");
  EXPECT_TRUE(isOk(_files.setProtectionNone("/var/file")));
  EXPECT_THAT(_files.unprotectedPaths(), ElementsAre("/root/var/file"));
}

class FaultyFileSystemTest : public MemoryFileSystemTest {
 protected:
  FaultyFileSystemTest() { _files.place("/var/file", "old content"); }
  FaultyFileSystem _faulty{_files};
};

TEST_F(FaultyFileSystemTest, isNotFeltWithoutAFault) {
  EXPECT_TRUE(isOk(_faulty.read("/var/file", 100)));
  EXPECT_TRUE(isOk(_faulty.write("/var/file", Data::copyOf("new"))));
  EXPECT_TRUE(isOk(_faulty.createDirectory("/var/folder")));
  EXPECT_TRUE(isOk(_faulty.setProtectionNone("/var/folder")));
  EXPECT_TRUE(isOk(_faulty.filesBelow("/var")));
  EXPECT_TRUE(isOk(_faulty.remove("/var/folder")));
  EXPECT_EQ(_files.content("/var/file"), "new");
  EXPECT_EQ(_faulty.resolve("~"), _files.resolve("~"));
}

TEST_F(FaultyFileSystemTest, failsReadsOfSomePaths) {
  _files.place("/var/other", "x");
  _faulty.failReads(EACCES, "file");
  EXPECT_TRUE(isError(_faulty.read("/var/file", 100), EACCES, "/var/file"));
  EXPECT_EQ(_faulty.modificationDate("/var/file"), std::nullopt);
  EXPECT_TRUE(isOk(_faulty.read("/var/other", 100)));
  _faulty.heal();
  EXPECT_TRUE(isOk(_faulty.read("/var/file", 100)));
}

TEST_F(FaultyFileSystemTest, failsWritesAndLeavesTheOldContent) {
  _faulty.failWrites(EROFS);
  EXPECT_TRUE(isError(_faulty.write("/var/file", Data()), EROFS));
  EXPECT_TRUE(isError(_faulty.writeAtomically("/var/file", Data()), EROFS));
  EXPECT_TRUE(isError(_faulty.createDirectory("/var/folder"), EROFS));
  EXPECT_TRUE(isError(_faulty.remove("/var/file"), EROFS));
  EXPECT_EQ(_files.content("/var/file"), "old content");
}

TEST_F(FaultyFileSystemTest, fillsTheDisk) {
  _faulty.fillDisk();
  EXPECT_TRUE(isError(_faulty.writeAtomically("/var/file", Data::copyOf("abcdef")), ENOSPC));
  EXPECT_EQ(_files.content("/var/file"), "old content");
  EXPECT_TRUE(isError(_faulty.write("/var/file", Data::copyOf("abcdef")), ENOSPC));
  EXPECT_EQ(_files.content("/var/file"), "abc") << "a plain write leaves what fitted";
  EXPECT_TRUE(isError(_faulty.createDirectory("/var/folder"), ENOSPC));
  EXPECT_TRUE(isOk(_faulty.createDirectory("/var")));
  EXPECT_TRUE(isOk(_faulty.remove("/var/file")));
}

TEST_F(FaultyFileSystemTest, anOpenFileFeelsTheFaults) {
  const auto file = _faulty.openForAppending("/var/file");
  ASSERT_TRUE(isOk(file));
  EXPECT_TRUE(isOk((*file)->append("!")));
  _faulty.fillDisk();
  EXPECT_TRUE(isError((*file)->append("?"), ENOSPC));
  _faulty.failWrites(EACCES, "file");
  EXPECT_TRUE(isError((*file)->append("?"), EACCES));
  EXPECT_TRUE(isError(_faulty.openForAppending("/var/file"), EACCES));
  _faulty.failReads(EIO);
  EXPECT_EQ(_faulty.creationDate("/var/file"), std::nullopt);
  _faulty.heal();
  EXPECT_TRUE(isOk((*file)->append("?")));
  EXPECT_EQ(_files.content("/var/file"), "old content!?");
  EXPECT_TRUE(_faulty.creationDate("/var/file").has_value());
}

class MemorySubmittableLogsTest : public FaultyFileSystemTest {
 protected:
  static constexpr char kLog[] = "/var/logs/one.ips";
  static constexpr char kSubmitted[] = "/var/mobile/Library/Logs/CrashReporter/Submission/one.ips";
  MemorySubmittableLogs _logs{_faulty};
};

TEST_F(MemorySubmittableLogsTest, makesAndSubmitsLogsAndTellsWhatItWasAskedFor) {
  EXPECT_TRUE(isOk(_logs.createTemporaryLog("224", kLog)));
  EXPECT_TRUE(_files.exists(kLog));
  EXPECT_TRUE(isError(_logs.createTemporaryLog("224", kLog), EEXIST));
  EXPECT_TRUE(isOk(_logs.moveToSubmissionArea("225", kLog)));
  EXPECT_FALSE(_files.exists(kLog));
  EXPECT_TRUE(_files.exists(kSubmitted));
  EXPECT_THAT(_logs.calls(), ElementsAre("create 224 /var/logs/one.ips", "create 224 /var/logs/one.ips",
                                         "submit 225 /var/logs/one.ips"));
}

TEST_F(MemorySubmittableLogsTest, leavesTheLogWhenItCannotBeSubmitted) {
  EXPECT_TRUE(isError(_logs.moveToSubmissionArea("224", kLog), ENOENT));
  _files.place(kLog, "text");
  _logs.setRefusing(true);
  EXPECT_TRUE(isError(_logs.moveToSubmissionArea("224", kLog), EPERM));
  _logs.setRefusing(false);
  _files.place(kSubmitted, "earlier");
  EXPECT_TRUE(isError(_logs.moveToSubmissionArea("224", kLog), EEXIST));
  _faulty.failWrites(EROFS);
  EXPECT_TRUE(isError(_logs.createTemporaryLog("224", "/var/logs/two.ips"), EROFS));
  EXPECT_EQ(_files.content(kLog), "text");
  EXPECT_EQ(_files.content(kSubmitted), "earlier");
}

TEST_F(MemoryFileSystemTest, aTemporaryFileHasNoNameAndFeelsFaults) {
  FaultyFileSystem faulty(_files);
  const auto file = faulty.newTemporaryFile("/tmp/new");
  ASSERT_TRUE(isOk(file));
  EXPECT_TRUE(isOk((*file)->append("0123456789")));
  EXPECT_EQ((*file)->size(), 10u);
  std::array<char, 4> buffer{};
  EXPECT_EQ((*file)->read(7, buffer), 3);
  EXPECT_EQ(std::string_view(buffer.data(), 3), "789");
  EXPECT_EQ((*file)->read(20, buffer), 0);
  EXPECT_TRUE(_files.filesBelow("/tmp")->empty());
  faulty.fillDisk();
  EXPECT_TRUE(isError((*file)->append("x"), ENOSPC));
  faulty.heal();
  faulty.failReads(EIO, "/tmp/new");
  EXPECT_EQ((*file)->read(0, buffer), -1);
  faulty.failWrites(EACCES, "/tmp/new");
  EXPECT_TRUE(isError(faulty.newTemporaryFile("/tmp/new"), EACCES));
}

}  // namespace
}  // namespace telvane::testing
