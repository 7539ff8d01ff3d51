#include "platform/system/DescriptorExtensions.h"

#include <fcntl.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <linux/securebits.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <filesystem>
#include <functional>

#include "platform/system/FileDescriptor.h"
#include "tests/platform/system/Expect.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

namespace fs = std::filesystem;

constexpr uint32_t kClient = 54321;
constexpr uint32_t kOther = 54322;

// Files of the test's own, and tokens for them as a client makes them.
class DescriptorExtensionsTest : public ::testing::Test {
 protected:
  DescriptorExtensionsTest() { ::chmod(_folder.path().c_str(), 0755); }

  // The client opens the path, as its library does; the descriptor lives as long as the test.
  ExtensionToken tokenFor(const std::string& path, int flags = O_RDONLY | O_NONBLOCK) {
    _descriptors.push_back(FileDescriptor(::open(path.c_str(), flags | O_CLOEXEC)));
    EXPECT_TRUE(_descriptors.back().isOpen()) << path;
    return {_descriptors.back().get(), PeerIdentity{::geteuid(), ::getegid(), {}}};
  }
  std::unique_ptr<SandboxExtension> consume(const std::string& path, const ExtensionToken& token) {
    return _extensions.consume(path, token);
  }
  bool isRegular(const std::string& path, const ExtensionToken& token) {
    const auto extension = consume(path, token);
    return extension != nullptr && extension->isRegularFile();
  }
  static std::string readAll(const SandboxExtension& extension, uint64_t offset = 0) {
    std::array<char, 100> buffer{};
    const Result<size_t> count = extension.readAt(offset, buffer.data(), buffer.size());
    return count.has_value() ? std::string(buffer.data(), *count) : "(error)";
  }
  // Runs the question in a process of its own without a user's other rights; returns the answer, or -1.
  static int as(uid_t user, const std::function<int()>& question) {
    const pid_t child = ::fork();
    if (child == 0) {
      const gid_t group = user;
      const bool isChanged =
          ::setgroups(0, nullptr) == 0 && ::setresgid(group, group, group) == 0 && ::setresuid(user, user, user) == 0;
      ::_exit(isChanged ? question() : 254);
    }
    int status = 0;
    return ::waitpid(child, &status, 0) == child && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  ScratchFolder _folder;
  DescriptorExtensions _extensions;
  std::vector<FileDescriptor> _descriptors;
};

TEST_F(DescriptorExtensionsTest, readsTheFileThroughItsDescriptor) {
  const std::string path = _folder.write("log", "0123456789");
  const auto extension = consume(path, tokenFor(path));
  ASSERT_NE(extension, nullptr);
  EXPECT_TRUE(extension->isRegularFile());
  EXPECT_EQ(*extension->size(), 10u);
  EXPECT_EQ(readAll(*extension), "0123456789");
  EXPECT_EQ(readAll(*extension, 4), "456789");
  EXPECT_EQ(readAll(*extension, 10), "");
}

TEST_F(DescriptorExtensionsTest, aTokenWithoutADescriptorIsWorthNothing) {
  EXPECT_EQ(consume(_folder.write("log", "x"), ExtensionToken()), nullptr);
}

TEST_F(DescriptorExtensionsTest, takesNoSymbolicLinkNotEvenToTheFile) {
  const std::string path = _folder.write("log", "x");
  fs::create_symlink(path, _folder.at("link"));
  EXPECT_FALSE(isRegular(_folder.at("link"), tokenFor(_folder.at("link"))));
  EXPECT_TRUE(isRegular(path, tokenFor(_folder.at("link"))));
}

TEST_F(DescriptorExtensionsTest, takesNothingThatWasPutInTheFilesPlace) {
  const std::string path = _folder.write("log", "mine");
  const std::string secret = _folder.write("secret", "not mine");
  const ExtensionToken token = tokenFor(path);
  fs::rename(path, _folder.at("moved"));
  EXPECT_FALSE(isRegular(path, token)) << "nothing";
  fs::create_symlink(secret, path);
  EXPECT_FALSE(isRegular(path, token)) << "a link";
  fs::remove(path);
  fs::create_hard_link(secret, path);
  EXPECT_FALSE(isRegular(path, token)) << "another file";
  const auto extension = consume(path, token);
  EXPECT_EQ(readAll(*extension), "mine");
  EXPECT_FALSE(extension->removeFile().has_value());
  EXPECT_TRUE(fs::exists(secret));
  EXPECT_TRUE(fs::exists(path));
}

TEST_F(DescriptorExtensionsTest, takesNoTokenForAnotherFile) {
  const std::string path = _folder.write("log", "x");
  EXPECT_FALSE(isRegular(path, tokenFor(_folder.write("other", "y"))));
}

TEST_F(DescriptorExtensionsTest, takesNoPipeFolderOrDevice) {
  ASSERT_EQ(::mkfifo(_folder.at("pipe").c_str(), 0600), 0);
  fs::create_directory(_folder.at("folder"));
  EXPECT_FALSE(isRegular(_folder.at("pipe"), tokenFor(_folder.at("pipe"))));
  EXPECT_FALSE(isRegular(_folder.at("folder"), tokenFor(_folder.at("folder"))));
  EXPECT_FALSE(isRegular("/dev/null", tokenFor("/dev/null")));
}

TEST_F(DescriptorExtensionsTest, takesNoDeletedFile) {
  const std::string path = _folder.write("log", "x");
  const ExtensionToken token = tokenFor(path);
  fs::remove(path);
  EXPECT_FALSE(isRegular(path, token));
  EXPECT_FALSE(isRegular(path + " (deleted)", token)) << "which is what the kernel calls it now";
}

// Memory of the client's, sealed or not, and a file that it has given no name: the kernel has a name for either.
TEST_F(DescriptorExtensionsTest, takesNoFileThatNeverHadAName) {
  _descriptors.push_back(FileDescriptor(::memfd_create("log", MFD_CLOEXEC | MFD_ALLOW_SEALING)));
  _descriptors.push_back(FileDescriptor(::open(_folder.path().c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600)));
  for (const FileDescriptor& descriptor : _descriptors) {
    ASSERT_TRUE(descriptor.isOpen());
    ASSERT_EQ(::write(descriptor.get(), "x", 1), 1);
    ::fcntl(descriptor.get(), F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_WRITE);
    const ExtensionToken token{descriptor.get(), PeerIdentity{::geteuid(), ::getegid(), {}}};
    const std::string known = fs::read_symlink("/proc/self/fd/" + std::to_string(descriptor.get())).string();
    ASSERT_TRUE(known.ends_with(" (deleted)")) << known;
    EXPECT_FALSE(isRegular(known, token)) << known;
    EXPECT_FALSE(isRegular(known.substr(0, known.rfind(' ')), token)) << known;
  }
}

// Which are links, and stand for another file in each process that follows them.
TEST_F(DescriptorExtensionsTest, takesNoPathThroughADescriptor) {
  const std::string path = _folder.write("log", "x");
  const ExtensionToken token = tokenFor(path);
  const std::string name = std::to_string(token.descriptor);
  for (const std::string& way : {"/proc/self/fd/" + name, "/proc/thread-self/fd/" + name,
                                 "/proc/" + std::to_string(::getpid()) + "/fd/" + name, "/dev/fd/" + name}) {
    ASSERT_EQ(fs::read_symlink(way), path);
    EXPECT_FALSE(isRegular(way, token)) << way;
    EXPECT_FALSE(consume(way, token)->removeFile().has_value()) << way;
  }
  EXPECT_TRUE(fs::exists(path));
}

TEST_F(DescriptorExtensionsTest, deletesNothingThroughTheRootOfAProcess) {
  const std::string path = _folder.write("log", "x");
  EXPECT_FALSE(consume("/proc/self/root" + path, tokenFor(path))->removeFile().has_value());
  EXPECT_FALSE(consume("/proc/self/cwd/../../.." + path, tokenFor(path))->removeFile().has_value());
  EXPECT_TRUE(fs::exists(path));
}

TEST_F(DescriptorExtensionsTest, takesNoPathThatIsTooLongOrNone) {
  const std::string path = _folder.write("log", "x");
  const ExtensionToken token = tokenFor(path);
  std::string way = _folder.path();
  while (way.size() < PATH_MAX) way += "/.";
  for (const std::string& hostile : {way + "/log", std::string(), std::string("log"), path + "/", path + "/."}) {
    EXPECT_FALSE(isRegular(hostile, token)) << hostile.size() << " bytes";
  }
}

TEST_F(DescriptorExtensionsTest, aPipeThatTakesTheFilesPlaceIsNotWaitedFor) {
  const std::string path = _folder.write("log", "x");
  const ExtensionToken token = tokenFor(path);
  const auto extension = consume(path, token);
  fs::remove(path);
  ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);
  EXPECT_FALSE(extension->isRegularFile());
  EXPECT_FALSE(extension->removeFile().has_value());
  EXPECT_TRUE(fs::is_fifo(path));
}

TEST_F(DescriptorExtensionsTest, deletesNothingInAFolderThatTookTheFoldersPlace) {
  const std::string path = _folder.write("folder/log", "mine");
  const auto extension = consume(path, tokenFor(path));
  fs::rename(_folder.at("folder"), _folder.at("moved"));
  _folder.write("folder/log", "another");
  EXPECT_TRUE(failsWith(extension->removeFile(), ESTALE));
  fs::remove_all(_folder.at("folder"));
  fs::create_directory_symlink(_folder.at("moved"), _folder.at("folder"));
  EXPECT_FALSE(extension->removeFile().has_value()) << "through a link, though to the very file";
  EXPECT_EQ(_folder.read("moved/log"), "mine");
}

TEST_F(DescriptorExtensionsTest, deletesOneNameOfAFileThatHasMore) {
  const std::string path = _folder.write("log", "x");
  fs::create_hard_link(path, _folder.at("other"));
  EXPECT_TRUE(isRegular(_folder.at("other"), tokenFor(path)));
  EXPECT_TRUE(succeeds(consume(_folder.at("other"), tokenFor(path))->removeFile()));
  EXPECT_TRUE(fs::exists(path));
  EXPECT_FALSE(fs::exists(_folder.at("other")));
}

TEST_F(DescriptorExtensionsTest, aDescriptorThatGivesNoRightToReadGivesNone) {
  const std::string path = _folder.write("log", "x");
  for (const int flags : {O_PATH, O_WRONLY}) {
    const auto extension = consume(path, tokenFor(path, flags));
    EXPECT_FALSE(extension->isRegularFile()) << flags;
    EXPECT_EQ(readAll(*extension), "(error)") << flags;
  }
}

TEST_F(DescriptorExtensionsTest, tellsTheSizeOfTheMoment) {
  const std::string path = _folder.write("log", "x");
  const auto extension = consume(path, tokenFor(path));
  EXPECT_EQ(*extension->size(), 1u);
  _folder.write("log", "more");
  EXPECT_EQ(*extension->size(), 4u);
  EXPECT_EQ(readAll(*extension), "more");
  fs::resize_file(path, 0);
  EXPECT_EQ(*extension->size(), 0u);
}

// The folder is the client's alone, so that the daemon may not look the path up; what it has is the descriptor.
TEST_F(DescriptorExtensionsTest, goesByTheKernelsNameWhereItMayNotLookThePathUp) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs root, to be another user";
  const std::string path = _folder.write("private/log", "x");
  const std::string other = _folder.write("private/other", "y");
  fs::create_symlink(path, _folder.at("private/link"));
  ASSERT_EQ(::chmod(_folder.at("private").c_str(), 0700), 0);
  const ExtensionToken token = tokenFor(path);
  const auto taken = [this, &token](const std::string& named) {
    return as(kOther, [&] { return isRegular(named, token) ? 1 : 0; });
  };
  EXPECT_EQ(taken(path), 1);
  EXPECT_EQ(taken(other), 0);
  EXPECT_EQ(taken(_folder.at("private/link")), 0);
  fs::rename(path, _folder.at("private/moved"));
  EXPECT_EQ(taken(path), 0);
}

TEST_F(DescriptorExtensionsTest, deletesTheFileByItsPath) {
  const std::string path = _folder.write("log", "x");
  const auto extension = consume(path, tokenFor(path));
  EXPECT_TRUE(succeeds(extension->removeFile()));
  EXPECT_FALSE(fs::exists(path));
  EXPECT_TRUE(failsWith(extension->removeFile(), ENOENT));
}

TEST_F(DescriptorExtensionsTest, deletesNothingForNobody) {
  const std::string path = _folder.write("log", "x");
  ExtensionToken token = tokenFor(path);
  token.holder.reset();
  EXPECT_TRUE(failsWith(consume(path, token)->removeFile(), EPERM));
  EXPECT_TRUE(fs::exists(path));
}

TEST_F(DescriptorExtensionsTest, goesThroughNoLinkAndNoDotsToDelete) {
  const std::string path = _folder.write("folder/log", "x");
  fs::create_directory_symlink(_folder.at("folder"), _folder.at("way"));
  const ExtensionToken token = tokenFor(path);
  for (const std::string& way : {_folder.at("way/log"), _folder.at("folder/../folder/log"), std::string("log"),
                                 path + "/", std::string("/"), std::string()}) {
    EXPECT_FALSE(consume(way, token)->removeFile().has_value()) << way;
  }
  EXPECT_TRUE(fs::exists(path));
  EXPECT_TRUE(succeeds(consume(_folder.at("folder//./log"), token)->removeFile()));
}

// A daemon that runs as root and a client that does not: what the client could not delete stays.
class FileRemovalForAClientTest : public DescriptorExtensionsTest {
 protected:
  void SetUp() override {
    if (::geteuid() != 0) GTEST_SKIP() << "needs root, to own files as somebody else";
  }
  void makeFolder(const std::string& name, uid_t owner, gid_t group, mode_t mode) {
    fs::create_directories(_folder.at(name));
    ASSERT_EQ(::chown(_folder.at(name).c_str(), owner, group), 0);
    ASSERT_EQ(::chmod(_folder.at(name).c_str(), mode), 0);
  }
  std::string makeFile(const std::string& name, uid_t owner) {
    const std::string path = _folder.write(name, "x");
    EXPECT_EQ(::chown(path.c_str(), owner, owner), 0);
    return path;
  }
  // Whether the daemon deletes it for the client.
  bool removes(const std::string& path, std::vector<uint32_t> groups = {}) {
    ExtensionToken token = tokenFor(path);
    token.holder = PeerIdentity{kClient, kClient, std::move(groups)};
    const bool isRemoved = consume(path, token)->removeFile().has_value();
    EXPECT_EQ(fs::exists(path), !isRemoved);
    return isRemoved;
  }
};

TEST_F(FileRemovalForAClientTest, holdsToTheRulesOfTheLastFolder) {
  constexpr uint32_t kTeam = 60000;
  struct Case {
    const char* what;
    uid_t folderOwner;
    gid_t folderGroup;
    mode_t mode;
    uid_t fileOwner;
    bool isRemoved;
  };
  const std::vector<Case> cases{
      {"its own folder", kClient, kClient, 0700, kClient, true},
      {"its own folder, somebody else's file", kClient, kClient, 0700, kOther, true},
      {"its own folder without the right to write", kClient, kClient, 0500, kClient, false},
      {"its own folder without the right to search", kClient, kClient, 0600, kClient, false},
      {"an owner who has less than all others", kClient, kClient, 0077, kClient, false},
      {"a group's folder", kOther, kTeam, 0770, kClient, true},
      {"a group's folder without the right to write", kOther, kTeam, 0757, kClient, false},
      {"a folder for all", kOther, kOther, 0777, kClient, true},
      {"a folder for all to look at", kOther, kOther, 0755, kClient, false},
      {"its own file in a sticky folder", kOther, kOther, 01777, kClient, true},
      {"somebody else's file in a sticky folder", kOther, kOther, 01777, kOther, false},
      {"somebody else's file in its own sticky folder", kClient, kClient, 01777, kOther, true},
      {"root's folder", 0, 0, 0755, kClient, false},
  };
  int number = 0;
  for (const Case& one : cases) {
    const std::string name = "case" + std::to_string(++number);
    makeFolder(name, one.folderOwner, one.folderGroup, one.mode);
    EXPECT_EQ(removes(makeFile(name + "/log", one.fileOwner), {kTeam}), one.isRemoved) << one.what;
  }
}

TEST_F(FileRemovalForAClientTest, goesOnlyWhereTheClientMaySearch) {
  makeFolder("closed", kOther, kOther, 0700);
  makeFolder("closed/open", kClient, kClient, 0777);
  const std::string path = makeFile("closed/open/log", kClient);
  EXPECT_FALSE(removes(path));
  makeFolder("closed", kOther, kOther, 0711);
  EXPECT_TRUE(removes(path));
}

TEST_F(FileRemovalForAClientTest, isWhatTheKernelLetsTheClientDoItself) {
  for (const mode_t mode : {0700, 0500, 0600, 0300, 0770, 0070, 0007, 0777, 01777, 01755, 01707, 0}) {
    for (const uid_t folderOwner : {uid_t{0}, uid_t{kClient}, uid_t{kOther}}) {
      for (const uid_t fileOwner : {uid_t{kClient}, uid_t{kOther}}) {
        makeFolder("place", folderOwner, folderOwner, mode);
        const std::string path = makeFile("place/log", fileOwner);
        const bool isRemoved = removes(path);
        makeFile("place/log", fileOwner);
        const bool couldItself = as(kClient, [&path] { return ::unlink(path.c_str()) == 0 ? 1 : 0; }) == 1;
        EXPECT_EQ(isRemoved, couldItself) << std::oct << mode << std::dec << " " << folderOwner << " " << fileOwner;
      }
    }
  }
}

// A container, or a service that may only read its home: the client's view of the disks is not the daemon's.
TEST_F(FileRemovalForAClientTest, keepsWhatTheClientMayOnlyReadInItsOwnViewOfTheDisks) {
  makeFolder("place", kClient, kClient, 0700);
  makeFolder("view", 0, 0, 0755);
  const std::string path = makeFile("place/log", kClient);
  const std::string place = _folder.at("place");
  const std::string view = _folder.at("view");
  constexpr int kNoView = 2;
  const int answer = as(0, [&] {
    const bool isMounted = ::unshare(CLONE_NEWNS) == 0 &&
                           ::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
                           ::mount(place.c_str(), view.c_str(), nullptr, MS_BIND, nullptr) == 0 &&
                           ::mount(nullptr, view.c_str(), nullptr, MS_BIND | MS_REMOUNT | MS_RDONLY, nullptr) == 0;
    if (!isMounted) return kNoView;
    const FileDescriptor file(::open((view + "/log").c_str(), O_RDONLY | O_CLOEXEC));
    const ExtensionToken token{file.get(), PeerIdentity{kClient, kClient, {}}};
    return _extensions.consume(path, token)->removeFile().has_value() ? 1 : 0;
  });
  if (answer == kNoView) GTEST_SKIP() << "no mounts of its own here";
  EXPECT_EQ(answer, 0);
  ASSERT_TRUE(fs::exists(path));
  EXPECT_TRUE(removes(path)) << "the same file, seen as the daemon sees it";
}

// A link to a stranger's file in a folder of its own: the client may delete that name, and no other.
TEST_F(FileRemovalForAClientTest, deletesALinkToSomebodyElsesFileAndNotTheFile) {
  makeFolder("own", kClient, kClient, 0700);
  makeFolder("theirs", kOther, kOther, 01777);
  const std::string theirs = makeFile("theirs/log", kOther);
  fs::create_hard_link(theirs, _folder.at("own/log"));
  EXPECT_FALSE(removes(theirs));
  EXPECT_TRUE(removes(_folder.at("own/log")));
  EXPECT_TRUE(fs::exists(theirs));
}

// Set up so, the kernel would not have the last word: it lets such a daemon delete what its client could not.
TEST_F(FileRemovalForAClientTest, deletesNothingForADaemonThatKeepsItsPowersAsSomebodyElse) {
  makeFolder("place", kClient, kClient, 0700);
  const std::string path = makeFile("place/log", kClient);
  ExtensionToken token = tokenFor(path);
  token.holder = PeerIdentity{kClient, kClient, {}};
  constexpr int kNoSuchSetting = 2;
  const auto removesAs = [&](uid_t user) {
    return as(0, [&] {
      if (::prctl(PR_SET_SECUREBITS, SECBIT_NO_SETUID_FIXUP) != 0) return kNoSuchSetting;
      if (::setresuid(user, user, user) != 0) return kNoSuchSetting;
      return consume(path, token)->removeFile().has_value() ? 1 : 0;
    });
  };
  EXPECT_EQ(removesAs(0), 0);
  EXPECT_EQ(removesAs(kOther), 0);
  EXPECT_EQ(removesAs(kClient), 0) << "in doubt, although it could";
  ASSERT_TRUE(fs::exists(path));
  EXPECT_TRUE(removes(path)) << "without that setting";
}

TEST_F(FileRemovalForAClientTest, leavesTheDaemonWithItsOwnRights) {
  makeFolder("place", kClient, kClient, 0700);
  const std::string own = _folder.write("own", "x");
  ASSERT_EQ(::chmod(own.c_str(), 0), 0);
  EXPECT_TRUE(removes(makeFile("place/log", kClient)));
  EXPECT_EQ(_folder.read("own"), "x") << "which only root may read";
}

}  // namespace
}  // namespace telvane::testing
