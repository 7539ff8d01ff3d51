#include "platform/system/PosixFileSystem.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <filesystem>

#include "tests/platform/system/Expect.h"
#include "tests/support/ScratchFolder.h"

namespace telvane {
namespace {

using telvane::testing::failsWith;
using telvane::testing::succeeds;

constexpr uint64_t kEnough = 1u << 20;

class PosixFileSystemTest : public ::testing::Test {
 protected:
  Data bytes(std::string_view text) { return Data::copyOf(text); }
  // What stands in the folder, at any depth, hidden files included.
  std::vector<std::string> listing() {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(_folder.path())) {
      names.push_back(entry.path().lexically_relative(_folder.path()).string());
    }
    std::sort(names.begin(), names.end());
    return names;
  }

  // Asks in a process of its own that has no rights beyond a user's; returns the answer, 0 to 255, or -1.
  template <class Question>
  static int asNobody(Question&& question) {
    constexpr uid_t kNobody = 65534;
    const pid_t child = ::fork();
    if (child == 0) {
      if (::geteuid() == 0 && ::setuid(kNobody) != 0) ::_exit(255);
      ::_exit(question());
    }
    int status = 0;
    if (child < 0 || ::waitpid(child, &status, 0) != child || !WIFEXITED(status)) return -1;
    return WEXITSTATUS(status);
  }
  template <class T>
  static int errorOf(const Result<T>& result) {
    return result.has_value() ? 0 : static_cast<int>(result.error().code());
  }

  testing::ScratchFolder _folder;
  PosixFileSystem _files{Paths{.root = _folder.at("root"), .home = _folder.at("home")}};
};

TEST_F(PosixFileSystemTest, readsWhatItWrote) {
  const std::string path = _folder.at("file");
  for (const std::string& text : {std::string(), std::string("one"), std::string(200000, 'x'), std::string("two")}) {
    ASSERT_TRUE(succeeds(_files.writeAtomically(path, bytes(text))));
    ASSERT_TRUE(succeeds(_files.read(path, kEnough)));
    EXPECT_TRUE(_files.read(path, kEnough)->view() == text);
    ASSERT_TRUE(succeeds(_files.write(path, bytes(text + "!"))));
    EXPECT_TRUE(_files.read(path, kEnough)->view() == text + "!");
  }
}

TEST_F(PosixFileSystemTest, leavesNothingBesideTheFile) {
  ASSERT_TRUE(succeeds(_files.writeAtomically(_folder.at("file"), bytes("x"))));
  ASSERT_TRUE(succeeds(_files.createDirectory(_folder.at("folder"))));
  EXPECT_FALSE(_files.writeAtomically(_folder.at("folder"), bytes("x")).has_value());  // a folder is in the way
  EXPECT_EQ(listing(), (std::vector<std::string>{"file", "folder"}));
}

TEST_F(PosixFileSystemTest, putsANewFileInPlaceOfTheOldOne) {
  const std::string path = _folder.at("file");
  ASSERT_TRUE(succeeds(_files.writeAtomically(path, bytes("old"))));
  std::filesystem::create_hard_link(path, _folder.at("held"));
  ASSERT_TRUE(succeeds(_files.writeAtomically(path, bytes("new"))));
  EXPECT_EQ(_folder.read("held"), "old");  // who has it open still sees all of it
  EXPECT_EQ(_folder.read("file"), "new");
}

TEST_F(PosixFileSystemTest, tellsWhyAFileCannotBeRead) {
  EXPECT_TRUE(failsWith(_files.read(_folder.at("none"), kEnough), ENOENT));
  EXPECT_TRUE(failsWith(_files.read(_folder.path(), kEnough), EISDIR));
  ASSERT_EQ(::mkfifo(_folder.at("pipe").c_str(), 0600), 0);
  EXPECT_TRUE(failsWith(_files.read(_folder.at("pipe"), kEnough), EINVAL));
  ASSERT_TRUE(succeeds(_files.write(_folder.at("file"), bytes("12345"))));
  EXPECT_TRUE(succeeds(_files.read(_folder.at("file"), 5)));
  EXPECT_TRUE(failsWith(_files.read(_folder.at("file"), 4), EFBIG));
  // A file whose size is not known beforehand is bounded all the same.
  EXPECT_TRUE(failsWith(_files.read("/proc/self/maps", 10), EFBIG));
}

TEST_F(PosixFileSystemTest, tellsWhyAFileCannotBeWritten) {
  EXPECT_TRUE(failsWith(_files.writeAtomically(_folder.at("none/file"), bytes("x")), ENOENT));
  EXPECT_TRUE(failsWith(_files.write(_folder.at("none/file"), bytes("x")), ENOENT));
  EXPECT_TRUE(failsWith(_files.write("/dev/full", bytes("x")), ENOSPC));
}

TEST_F(PosixFileSystemTest, createsFoldersAndIsContentWithThoseThatAre) {
  EXPECT_TRUE(succeeds(_files.createDirectory("~/a/b/c")));
  EXPECT_TRUE(succeeds(_files.createDirectory("~/a/b/c")));
  EXPECT_TRUE(std::filesystem::is_directory(_folder.at("home/a/b/c")));
  ASSERT_TRUE(succeeds(_files.write("~/a/file", bytes("x"))));
  EXPECT_FALSE(_files.createDirectory("~/a/file/b").has_value());
}

TEST_F(PosixFileSystemTest, removesFilesAndEmptyFolders) {
  ASSERT_TRUE(succeeds(_files.createDirectory("~/a")));
  ASSERT_TRUE(succeeds(_files.write("~/a/file", bytes("x"))));
  EXPECT_FALSE(_files.remove("~/a").has_value());
  EXPECT_TRUE(succeeds(_files.remove("~/a/file")));
  EXPECT_TRUE(succeeds(_files.remove("~/a")));
  EXPECT_TRUE(failsWith(_files.remove("~/a"), ENOENT));
}

TEST_F(PosixFileSystemTest, tellsTheModificationDate) {
  ASSERT_TRUE(succeeds(_files.write(_folder.at("file"), bytes("x"))));
  const timespec times[2] = {{1000, 0}, {1714570000, 250000999}};
  ASSERT_EQ(::utimensat(AT_FDCWD, _folder.at("file").c_str(), times, 0), 0);
  const std::optional<Date> date = _files.modificationDate(_folder.at("file"));
  ASSERT_TRUE(date.has_value());
  EXPECT_EQ(date->wholeSeconds(), 1714570000);
  EXPECT_EQ(date->microseconds(), 250000);
  EXPECT_FALSE(_files.modificationDate(_folder.at("none")).has_value());
}

TEST_F(PosixFileSystemTest, aFileIsDatedByItsMakingHoweverOftenItGrows) {
  const auto before = std::chrono::system_clock::now() - std::chrono::seconds(2);  // the kernel's clock is coarse
  _folder.write("file", "one");
  const std::optional<Date> made = _files.creationDate(_folder.at("file"));
  ASSERT_TRUE(made.has_value());
  EXPECT_GE(made->time(), before);
  EXPECT_LE(made->time(), std::chrono::system_clock::now());
  const Result<std::unique_ptr<AppendableFile>> file = _files.openForAppending(_folder.at("file"));
  ASSERT_TRUE(succeeds(file));
  ASSERT_TRUE(succeeds((*file)->append(" and two")));
  EXPECT_EQ(_folder.read("file"), "one and two");
  EXPECT_EQ(_files.creationDate(_folder.at("file")), made);
  EXPECT_FALSE(_files.creationDate(_folder.at("none")).has_value());
}

TEST_F(PosixFileSystemTest, aLinkIsDatedByItselfAndLeadsToNoAppending) {
  std::filesystem::create_symlink(_folder.at("none"), _folder.at("link"));
  EXPECT_TRUE(_files.creationDate(_folder.at("link")).has_value());
  EXPECT_TRUE(failsWith(_files.openForAppending(_folder.at("link")), ELOOP));
  EXPECT_TRUE(failsWith(_files.openForAppending(_folder.at("none")), ENOENT));
}

TEST_F(PosixFileSystemTest, listsRegularFilesAtAnyDepthInOrder) {
  _folder.write("top/b", "1");
  _folder.write("top/a/z", "2");
  _folder.write("top/a/b/c", "3");
  _folder.write("outside/secret", "4");
  std::filesystem::create_symlink(_folder.at("outside"), _folder.at("top/linkedFolder"));
  std::filesystem::create_symlink(_folder.at("outside/secret"), _folder.at("top/linkedFile"));
  const Result<std::vector<std::string>> files = _files.filesBelow(_folder.at("top"));
  ASSERT_TRUE(succeeds(files));
  EXPECT_EQ(*files, (std::vector<std::string>{"a/b/c", "a/z", "b"}));
  EXPECT_TRUE(failsWith(_files.filesBelow(_folder.at("none")), ENOENT));
}

TEST_F(PosixFileSystemTest, listsTheFilesOfOneFolderWithoutItsSubfolders) {
  for (const char* path : {"top/b", "top/a", "top/below/c"}) _folder.write(path, "x");
  std::filesystem::create_symlink(_folder.at("top/b"), _folder.at("top/link"));
  const Result<std::vector<std::string>> names = _files.filesIn(_folder.at("top"));
  ASSERT_TRUE(succeeds(names));
  EXPECT_EQ(*names, (std::vector<std::string>{"a", "b"}));
  EXPECT_TRUE(failsWith(_files.filesIn(_folder.at("none")), ENOENT));
  EXPECT_TRUE(failsWith(_files.filesIn(_folder.at("top/b")), ENOTDIR));
}

// A folder that may not be read once passed for an empty one, so its files were neither found nor missed.
TEST_F(PosixFileSystemTest, aFolderThatMayNotBeReadIsNoEmptyOne) {
  _folder.write("top/closed/file", "x");
  _folder.write("top/open", "x");
  chmod(_folder.path().c_str(), 0755);
  chmod(_folder.at("top/closed").c_str(), 0);
  const std::string closed = _folder.at("top/closed");
  EXPECT_EQ(asNobody([&] { return errorOf(_files.filesIn(closed)); }), EACCES);
  EXPECT_EQ(asNobody([&] { return errorOf(_files.filesBelow(closed)); }), EACCES);
  const auto otherFiles = [&] { return static_cast<int>(_files.filesBelow(_folder.at("top"))->size()); };
  EXPECT_EQ(asNobody(otherFiles), 1) << "a closed subfolder hides only what is in it";
  chmod(closed.c_str(), 0755);
}

TEST_F(PosixFileSystemTest, livesBelowTheRootOfItsInstance) {
  ASSERT_TRUE(succeeds(_files.createDirectory("/var/mobile")));
  ASSERT_TRUE(succeeds(_files.write("/var/mobile/file", bytes("x"))));
  EXPECT_EQ(_folder.read("root/var/mobile/file"), "x");
  EXPECT_TRUE(succeeds(_files.setProtectionNone("/var/mobile/file")));
}

TEST_F(PosixFileSystemTest, aTemporaryFileHasNoNameAndGivesBackWhatWasPutIn) {
  PosixFileSystem files(Paths{});
  const std::string folder = _folder.at("a/b");
  const auto file = files.newTemporaryFile(folder);
  ASSERT_TRUE(succeeds(file));
  EXPECT_EQ((*file)->size(), 0u);
  EXPECT_TRUE(succeeds((*file)->append("0123")));
  EXPECT_TRUE(succeeds((*file)->append("456789")));
  EXPECT_EQ((*file)->size(), 10u);
  std::array<char, 4> buffer{};
  EXPECT_EQ((*file)->read(0, buffer), 4);
  EXPECT_EQ(std::string_view(buffer.data(), 4), "0123");
  EXPECT_EQ((*file)->read(8, buffer), 2);
  EXPECT_EQ(std::string_view(buffer.data(), 2), "89");
  EXPECT_EQ((*file)->read(10, buffer), 0);
  EXPECT_EQ((*file)->read(11, buffer), 0);
  EXPECT_EQ(listing(), (std::vector<std::string>{"a", "a/b"}));
}

TEST_F(PosixFileSystemTest, makesNoTemporaryFileWhereThereIsNoFolder) {
  PosixFileSystem files(Paths{});
  EXPECT_FALSE(files.newTemporaryFile(_folder.write("file", "x")).has_value());
}

}  // namespace
}  // namespace telvane
