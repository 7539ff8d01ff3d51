#include "platform/url/UploadFile.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <filesystem>

#include "tests/support/ScratchFolder.h"

namespace telvane::testing {

class UploadFileTest : public ::testing::Test {
 protected:
  static std::string readAt(const UploadFile& file, uint64_t offset) {
    std::array<char, 100> buffer;
    const int64_t count = file.read(offset, buffer);
    return count < 0 ? "failed" : std::string(buffer.data(), static_cast<size_t>(count));
  }
  ScratchFolder _folder;
};

TEST_F(UploadFileTest, readsFromAnyOffsetUpToItsEnd) {
  const auto file = UploadFile::open(_folder.write("f", "0123456789"));
  ASSERT_TRUE(file.has_value());
  EXPECT_EQ((*file)->size(), 10u);
  EXPECT_EQ(readAt(**file, 0), "0123456789");
  EXPECT_EQ(readAt(**file, 7), "789");
  EXPECT_EQ(readAt(**file, 10), "");
  EXPECT_EQ(readAt(**file, 1000), "");
}

TEST_F(UploadFileTest, readsOnWhenItsFileWasRemoved) {
  const std::string path = _folder.write("f", "content");
  const auto file = UploadFile::open(path);
  ASSERT_TRUE(file.has_value());
  std::filesystem::remove(path);
  EXPECT_EQ(readAt(**file, 0), "content");
}

TEST_F(UploadFileTest, keepsTheSizeThatItHadWhenItWasOpened) {
  const std::string path = _folder.write("f", "one");
  const auto file = UploadFile::open(path);
  ASSERT_TRUE(file.has_value());
  _folder.write("f", "one and more");
  EXPECT_EQ(readAt(**file, 0), "one");
  _folder.write("f", "");
  EXPECT_EQ(readAt(**file, 0), "failed");
}

TEST_F(UploadFileTest, opensOnlyRegularFiles) {
  const std::string pipe = _folder.at("pipe");
  ASSERT_EQ(mkfifo(pipe.c_str(), 0600), 0);
  EXPECT_EQ(UploadFile::open(pipe).error().code(), EINVAL);
  EXPECT_EQ(UploadFile::open(_folder.path()).error().code(), EINVAL);
  EXPECT_EQ(UploadFile::open(_folder.at("missing")).error().code(), ENOENT);
}

}  // namespace telvane::testing
