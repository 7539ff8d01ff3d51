#include "platform/system/FileSizeSignal.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "platform/system/UnnamedFile.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

constexpr rlim_t kLargestFile = 1000;

// Writes more into a file than the process may, in a process of its own; returns how that ended.
int statusOfAWriteBeyondTheLimit(const std::string& folder, bool isTakenAsError) {
  const pid_t child = ::fork();
  if (child == 0) {
    const rlimit limit{kLargestFile, kLargestFile};
    ::signal(SIGXFSZ, SIG_DFL);
    if (isTakenAsError) takeFileSizeLimitAsError();
    const auto file = UnnamedFile::open(folder);
    if (!file.has_value() || ::setrlimit(RLIMIT_FSIZE, &limit) != 0) ::_exit(0);
    const Result<void> written = (*file)->append(std::string(kLargestFile + 1, 'x'));
    ::_exit(written.has_error() ? static_cast<int>(written.error().code()) : 0);
  }
  int status = 0;
  return ::waitpid(child, &status, 0) == child ? status : 0;
}

TEST(FileSizeSignalTest, aFileThatMayNotGrowIsAnErrorAndNotTheEnd) {
  const ScratchFolder folder;
  const int status = statusOfAWriteBeyondTheLimit(folder.path(), true);
  ASSERT_TRUE(WIFEXITED(status)) << "signal " << WTERMSIG(status);
  EXPECT_EQ(WEXITSTATUS(status), EFBIG);
}

// What the other test would see if nothing were done.
TEST(FileSizeSignalTest, byItselfItEndsAProcess) {
  const ScratchFolder folder;
  const int status = statusOfAWriteBeyondTheLimit(folder.path(), false);
  ASSERT_TRUE(WIFSIGNALED(status));
  EXPECT_EQ(WTERMSIG(status), SIGXFSZ);
}

}  // namespace
}  // namespace telvane::testing
