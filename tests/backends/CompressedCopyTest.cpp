#include "backends/CompressedCopy.h"

#include <algorithm>
#include <cerrno>

#include "tests/backends/UploadFixture.h"

namespace telvane::testing {
namespace {

// A file whose content is the test's, at each moment.
class ScriptedExtension final : public SandboxExtension {
 public:
  bool isRegularFile() const override { return true; }
  Result<uint64_t> size() const override {
    ADD_FAILURE() << "a client could have changed it since it was counted";
    return content.size();
  }
  Result<size_t> readAt(uint64_t offset, char* buffer, size_t length) const override {
    if (offset >= failsFrom) return Error("D", EIO);
    const std::string_view rest = std::string_view(content).substr(std::min<uint64_t>(offset, content.size()));
    return rest.copy(buffer, length);
  }
  Result<void> removeFile() override { return {}; }

  std::string content;
  uint64_t failsFrom = UINT64_MAX;
};

class CompressedCopyTest : public UploadFixture {
 protected:
  using Outcome = CompressedCopy::Outcome;
  CompressedCopy copy() {
    return compressedCopyOf(_file, _sizeAtTheStart, process().platform().files, [this] { return _pieces-- == 0; });
  }
  // What the copy holds, or "(none)".
  std::string copied() {
    const CompressedCopy made = copy();
    if (made.outcome != Outcome::Made) return "(none)";
    URLRequest request;
    request.headers = {{"Content-Encoding", "gzip"}};
    request.bodyFile = made.file;
    return RecordingConnectivity::bodyText(request);
  }
  ScriptedExtension _file;
  uint64_t _sizeAtTheStart = 0;
  // After so many pieces it is cancelled.
  int _pieces = 1'000'000;
};

TEST_F(CompressedCopyTest, isOfTheFileAsLargeAsItWasAtTheStart) {
  _file.content = "0123456789";
  _sizeAtTheStart = 4;
  EXPECT_EQ(copied(), "0123");
}

TEST_F(CompressedCopyTest, isOfWhatIsThereWhenTheFileShrinks) {
  _file.content = "0123456789";
  _sizeAtTheStart = 4'000'000;
  EXPECT_EQ(copied(), "0123456789");
}

TEST_F(CompressedCopyTest, endsBetweenPiecesWhenItIsCancelled) {
  _file.content = std::string(1'000'000, 'x');
  _sizeAtTheStart = _file.content.size();
  _pieces = 2;
  EXPECT_EQ(copy().outcome, Outcome::NotMade);
  EXPECT_EQ(_pieces, -1) << "asked once more after it had said yes, or never";
}

TEST_F(CompressedCopyTest, isOfEveryPieceOfALargeFile) {
  std::string content;
  for (int i = 0; i < 200'000; ++i) content += std::to_string(i) + " ";
  _file.content = content;
  _sizeAtTheStart = content.size();
  EXPECT_EQ(copied(), content);
}

TEST_F(CompressedCopyTest, thereIsNoneOfAFileThatIsGoneOrCannotBeReadToItsEnd) {
  EXPECT_EQ(copy().outcome, Outcome::NothingToRead);
  _sizeAtTheStart = 10;
  EXPECT_EQ(copy().outcome, Outcome::NothingToRead);
  _file.content = std::string(1'000'000, 'x');
  _sizeAtTheStart = _file.content.size();
  _file.failsFrom = 1;
  EXPECT_EQ(copy().outcome, Outcome::NothingToRead);
}

TEST_F(CompressedCopyTest, thereIsNoneWithoutRoom) {
  _file.content = "text";
  _sizeAtTheStart = 4;
  process().fileFaults().fillDisk();
  EXPECT_EQ(copy().outcome, Outcome::NotMade);
  process().fileFaults().heal();
  process().fileFaults().failWrites(EACCES, "uploads");
  EXPECT_EQ(copy().outcome, Outcome::NotMade);
}

}  // namespace
}  // namespace telvane::testing
