#include "platform/system/AppendFile.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>

#include "tests/platform/system/Expect.h"
#include "tests/support/ScratchFolder.h"

namespace telvane {
namespace {

using telvane::testing::failsWith;
using telvane::testing::succeeds;

// A disk that is full once a file has that many bytes.
class SmallDisk {
 public:
  explicit SmallDisk(rlim_t largestFile) : _former(::signal(SIGXFSZ, SIG_IGN)) {
    ::getrlimit(RLIMIT_FSIZE, &_formerLimit);
    const rlimit limit{largestFile, _formerLimit.rlim_max};
    ::setrlimit(RLIMIT_FSIZE, &limit);
  }
  ~SmallDisk() {
    ::setrlimit(RLIMIT_FSIZE, &_formerLimit);
    ::signal(SIGXFSZ, _former);
  }
  SmallDisk(const SmallDisk&) = delete;
  SmallDisk& operator=(const SmallDisk&) = delete;

 private:
  void (*const _former)(int);
  rlimit _formerLimit{};
};

class AppendFileTest : public ::testing::Test {
 protected:
  testing::ScratchFolder _folder;
};

TEST_F(AppendFileTest, makesAFileForItsOwnerOnly) {
  const auto file = AppendFile::open(_folder.at("file"));
  ASSERT_TRUE(succeeds(file));
  EXPECT_TRUE(succeeds((*file)->append("one\n")));
  EXPECT_TRUE(succeeds((*file)->append("two\n")));
  EXPECT_EQ(_folder.read("file"), "one\ntwo\n");
  EXPECT_EQ(std::filesystem::status(_folder.at("file")).permissions() & std::filesystem::perms(0077),
            std::filesystem::perms::none);
}

TEST_F(AppendFileTest, addsToAFileThatIsThere) {
  _folder.write("file", "one\n");
  const auto file = AppendFile::openExisting(_folder.at("file"));
  ASSERT_TRUE(succeeds(file));
  EXPECT_TRUE(succeeds((*file)->append("two\n")));
  EXPECT_EQ(_folder.read("file"), "one\ntwo\n");
}

TEST_F(AppendFileTest, opensNothingButARegularFile) {
  EXPECT_TRUE(failsWith(AppendFile::openExisting(_folder.at("none")), ENOENT));
  EXPECT_FALSE(std::filesystem::exists(_folder.at("none")));
  _folder.write("file", "");
  std::filesystem::create_symlink(_folder.at("file"), _folder.at("link"));
  EXPECT_TRUE(failsWith(AppendFile::openExisting(_folder.at("link")), ELOOP));
  EXPECT_TRUE(failsWith(AppendFile::openExisting(_folder.path()), EISDIR));
  ASSERT_EQ(::mkfifo(_folder.at("pipe").c_str(), 0600), 0);
  EXPECT_TRUE(failsWith(AppendFile::openExisting(_folder.at("pipe")), ENXIO));
  EXPECT_TRUE(failsWith(AppendFile::openExisting("/dev/null"), EINVAL));
}

TEST_F(AppendFileTest, aDiskThatIsFullInTheMiddleLeavesNoPart) {
  _folder.write("file", "1234567\n");
  const auto file = AppendFile::openExisting(_folder.at("file"));
  ASSERT_TRUE(succeeds(file));
  Result<void> added;
  {
    const SmallDisk disk(12);
    added = (*file)->append("does not fit\n");
  }
  EXPECT_TRUE(failsWith(added, EFBIG));
  EXPECT_EQ(_folder.read("file"), "1234567\n");
  EXPECT_TRUE(succeeds((*file)->append("fits again\n")));
  EXPECT_EQ(_folder.read("file"), "1234567\nfits again\n");
}

}  // namespace
}  // namespace telvane
