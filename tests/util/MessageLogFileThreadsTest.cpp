// The message log on threads and on the real file system.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <map>
#include <sstream>

#include "platform/dispatch/SystemClock.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/system/FolderSubmittableLogs.h"
#include "platform/system/PosixFileSystem.h"
#include "tests/support/Matchers.h"
#include "tests/support/PlatformWith.h"
#include "tests/support/ScratchFolder.h"
#include "tests/support/SimulatedWorld.h"
#include "util/MessageLogFile.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;

constexpr int kWriters = 8;
constexpr int kMessages = 150;  // of each

// Goes on by a step whenever somebody looks, from far enough ahead that every file of today is expired.
class SteppingClock final : public Clock {
 public:
  SteppingClock(std::chrono::seconds step, std::chrono::hours ahead)
      : _step(step), _start(SystemClock().now().time() + ahead) {}
  Date now() const override { return Date(_start + _looks++ * _step); }
  MonotonicTime monotonicNow() const override { return {}; }

 private:
  const std::chrono::seconds _step;
  const Date::TimePoint _start;
  mutable std::atomic<int> _looks{0};
};

class MessageLogFileThreadsTest : public ::testing::Test {
 protected:
  // A message that shows where it was cut or mixed with another: a writer's letter, many times.
  static std::string message(int writer, int number) {
    const std::string letters((number * 37) % 3000, static_cast<char>('a' + writer));
    return fmt::format("{} {} {} end", writer, number, letters);
  }
  // All writers at once, until all that they have to say is said.
  void writeFromAllThreads(Clock& clock) {
    Platform platform = realFilesPlatform(clock);
    MessageLogFile messageLog(platform);
    const auto queue = dispatch.newConcurrentQueue("writers", QualityOfService::Default);
    const auto done = dispatch.newSemaphore(0);
    for (int writer = 0; writer < kWriters; ++writer) {
      queue->async([&messageLog, done, writer] {
        for (int n = 0; n < kMessages; ++n) messageLog.writeToLogFile("{}", message(writer, n));
        done->signal();
      });
    }
    for (int writer = 0; writer < kWriters; ++writer) ASSERT_TRUE(done->waitFor(60s));
  }
  // Of the system: files, threads and the clock that is given.
  Platform realFilesPlatform(Clock& clock) {
    return platformWith(world.makeProcess("telvaned").platform(), clock, dispatch, log, files, submittableLogs);
  }
  // The messages of all lines of all files of the folder, which must be whole; how often each came.
  std::map<std::string, int> messagesIn(const std::string& path) {
    std::map<std::string, int> found;
    if (!fs::exists(scratch.at(path))) return found;
    for (const auto& file : fs::directory_iterator(scratch.at(path))) {
      EXPECT_EQ(file.status().permissions(), fs::perms(0600)) << file.path();
      std::istringstream lines(scratch.read(path + "/" + file.path().filename().string()));
      for (std::string line; std::getline(lines, line);) ++found[messageOf(line)];
    }
    return found;
  }
  static std::string messageOf(const std::string& line) {
    constexpr size_t kPrefix = 28;  // "(2026-01-01 00:00:00 +0000) "
    EXPECT_THAT(line.substr(0, kPrefix),
                ::testing::MatchesRegex("\\([0-9]+-[0-9]+-[0-9]+ [0-9]+:[0-9]+:[0-9]+ \\+0000\\) "));
    return line.size() < kPrefix ? line : line.substr(kPrefix);
  }
  static void expectEachOnce(std::map<std::string, int> found) {
    for (int writer = 0; writer < kWriters; ++writer) {
      for (int n = 0; n < kMessages; ++n) {
        EXPECT_EQ(found[message(writer, n)], 1) << "writer " << writer << ", message " << n;
      }
    }
    EXPECT_EQ(found.size(), static_cast<size_t>(kWriters * kMessages));
  }

  static constexpr char kRetired[] = "root/var/mobile/Library/Logs/CrashReporter/Retired";
  static constexpr char kSubmission[] = "root/var/mobile/Library/Logs/CrashReporter/Submission";

  ScratchFolder scratch;
  PosixFileSystem files{Paths{.root = scratch.at("root"), .home = scratch.at("home")}};
  FolderSubmittableLogs submittableLogs{Paths{.root = scratch.at("root"), .home = scratch.at("home")}};
  RecordingLog log{nullptr, "telvaned"};
  SimulatedWorld world;
  ThreadedDispatch dispatch;
};

TEST_F(MessageLogFileThreadsTest, linesOfConcurrentWritersStandWhole) {
  SystemClock clock;
  writeFromAllThreads(clock);
  expectEachOnce(messagesIn(kRetired));
  EXPECT_TRUE(hasLines(log, 1, "Created new telvaned log file"));
  EXPECT_TRUE(hasLines(log, kWriters * kMessages, "Saved log message to"));
}

// Whoever may write into the folder could otherwise choose which file the daemon writes to, or have it write nowhere.
TEST_F(MessageLogFileThreadsTest, aLinkOfTheNewFilesNameIsNotTaken) {
  SteppingClock clock(0s, 0h);
  Platform platform = realFilesPlatform(clock);
  MessageLogFolder folder(platform);
  std::optional<std::string> path;
  std::optional<Date> date;
  folder.createNewLogFile(&path, &date);
  ASSERT_TRUE(path.has_value());
  const std::string target = scratch.write("target", "");
  fs::remove(*path);
  fs::create_symlink(target, *path);
  log.expectError("createNewLogFile: ");
  log.expectError("writeToLogFile: Failed to create new telvaned log file " + *path);
  folder.createNewLogFile(&path, &date);
  EXPECT_EQ(path, std::nullopt);
}

// Each call finds its file expired, so files come and go under all writers.
TEST_F(MessageLogFileThreadsTest, noLineIsLostWhileFilesAreRetired) {
  SteppingClock clock(1s, 48h);
  writeFromAllThreads(clock);
  auto found = messagesIn(kSubmission);
  EXPECT_EQ(found.size(), static_cast<size_t>(kWriters * kMessages - 1)) << "all files but the one in use";
  found.merge(messagesIn(kRetired));
  expectEachOnce(std::move(found));
}

}  // namespace
}  // namespace telvane::testing
