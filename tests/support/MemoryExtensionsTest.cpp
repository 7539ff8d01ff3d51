#include "tests/support/MemoryExtensions.h"

#include <cerrno>

#include "tests/support/Matchers.h"
#include "tests/support/MemoryFileSystem.h"
#include "tests/support/SimulatedClock.h"
#include "tests/support/SimulatedScheduler.h"

namespace telvane::testing {
namespace {

class MemoryExtensionsTest : public ::testing::Test {
 protected:
  MemoryExtensionsTest() { _files.place("/tmp/log", "0123456789"); }
  static std::string read(const SandboxExtension& extension, uint64_t offset, size_t length) {
    std::string buffer(length, '?');
    const Result<size_t> count = extension.readAt(offset, buffer.data(), length);
    return count.has_value() ? buffer.substr(0, *count) : "(error)";
  }

  SimulatedScheduler _scheduler{1};
  SimulatedClock _clock{_scheduler};
  MemoryFileSystem _files{_clock};
  MemoryExtensions _extensions{_files};
};

TEST_F(MemoryExtensionsTest, aTokenGivesItsFile) {
  const auto extension = _extensions.consume("/tmp/log", _extensions.newToken("/tmp/log"));
  ASSERT_NE(extension, nullptr);
  EXPECT_TRUE(extension->isRegularFile());
  EXPECT_EQ(*extension->size(), 10u);
  EXPECT_EQ(read(*extension, 8, 5), "89");
  EXPECT_EQ(read(*extension, 20, 5), "");
  EXPECT_TRUE(isOk(extension->removeFile()));
  EXPECT_FALSE(_files.exists("/tmp/log"));
  EXPECT_FALSE(extension->isRegularFile());
}

TEST_F(MemoryExtensionsTest, nothingElseDoes) {
  _files.place("/tmp/other", "x");
  EXPECT_EQ(_extensions.consume("/tmp/log", ExtensionToken()), nullptr);
  EXPECT_EQ(_extensions.consume("/tmp/log", ExtensionToken{.descriptor = 3}), nullptr);
  EXPECT_FALSE(_extensions.consume("/tmp/log", _extensions.newToken("/tmp/other"))->isRegularFile());
  EXPECT_FALSE(_extensions.consume("/tmp", _extensions.newToken("/tmp"))->isRegularFile());
  const ExtensionToken token = _extensions.newToken("/tmp/log");
  _extensions.replace("/tmp/log");
  EXPECT_FALSE(_extensions.consume("/tmp/log", token)->isRegularFile());
  EXPECT_FALSE(_extensions.consume("/tmp/log", token)->removeFile().has_value());
}

TEST_F(MemoryExtensionsTest, refusesAsItIsTold) {
  const auto extension = _extensions.consume("/tmp/log", _extensions.newToken("/tmp/log"));
  _extensions.refuseReading();
  EXPECT_EQ(read(*extension, 0, 5), "(error)");
  _extensions.refuseRemoval("no");
  EXPECT_TRUE(isError(extension->removeFile(), EACCES, "no"));
  EXPECT_TRUE(_files.exists("/tmp/log"));
}

TEST_F(MemoryExtensionsTest, countsWhatIsHeld) {
  {
    const auto extension = _extensions.consume("/tmp/log", _extensions.newToken("/tmp/log"));
    EXPECT_EQ(_extensions.heldExtensions(), 1);
  }
  EXPECT_EQ(_extensions.heldExtensions(), 0);
}

}  // namespace
}  // namespace telvane::testing
