#include "platform/log/JournalLog.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <atomic>
#include <mutex>
#include <optional>
#include <queue>

#include "tests/platform/log/ReadingEnd.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

// Stands in for the journal: each stream that a log opens is a socket pair whose other end is taken with accept.
class JournalLogTest : public ::testing::Test {
 protected:
  JournalLog::OpenStream stream() {
    return [this]() -> int {
      if (_isAway) return -1;
      int ends[2];
      if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return -1;
      const std::lock_guard lock(_mutex);
      _accepted.push(ends[0]);
      return ends[1];
    };
  }
  int accept() {
    const std::lock_guard lock(_mutex);
    if (_accepted.empty()) return -1;
    const int end = _accepted.front();
    _accepted.pop();
    return end;
  }
  // Waits for the next stream.
  int acceptNext() {
    const auto deadline = std::chrono::steady_clock::now() + 30s;
    int end = -1;
    while (end < 0 && std::chrono::steady_clock::now() < deadline) end = accept();
    return end;
  }

  std::atomic<bool> _isAway{false};
  std::mutex _mutex;
  std::queue<int> _accepted;
};

TEST_F(JournalLogTest, writesOneLineWithItsPriorityPerMessage) {
  std::optional<JournalLog> log(std::in_place, LogLevel::Info, stream());
  log->error("an error of {} lines:\n{}", 2, "second");
  log->message("default");
  log->info("info");
  log.reset();
  const int journal = accept();
  EXPECT_EQ(readAll(journal), "<3>an error of 2 lines:\\nsecond\n<5>default\n<6>info\n");
  close(journal);
}

TEST_F(JournalLogTest, opensItsStreamWithTheFirstLine) {
  { const JournalLog log(LogLevel::Info, stream()); }
  EXPECT_EQ(accept(), -1);
}

TEST_F(JournalLogTest, looksForTheJournalAgainWhenItHasGoneAway) {
  JournalLog log(LogLevel::Default, stream(), {.gatherTime = 0ms});
  log.message("first");
  // The journal restarts: until that has been noticed, lines are lost.
  int journal = acceptNext();
  ASSERT_EQ(readLine(journal), "<5>first\n");
  close(journal);
  journal = -1;
  const auto deadline = std::chrono::steady_clock::now() + 30s;
  while (journal < 0 && std::chrono::steady_clock::now() < deadline) {
    log.message("again");
    journal = accept();
  }
  ASSERT_GE(journal, 0) << "no second stream was opened";
  EXPECT_EQ(readLine(journal), "<5>again\n");
  close(journal);
}

TEST_F(JournalLogTest, losesLinesQuietlyWhileThereIsNoJournal) {
  _isAway = true;
  std::optional<JournalLog> log(std::in_place, LogLevel::Default, stream());
  log->message("lost");
  log.reset();
  EXPECT_EQ(accept(), -1);
}

TEST_F(JournalLogTest, neverWaitsForAJournalThatDoesNotRead) {
  std::optional<JournalLog> log(std::in_place, LogLevel::Default, stream(),
                                LineWriter::Options{.maximumBytes = 10000, .flushTime = 1ms});
  log->message("line");
  const int journal = acceptNext();
  EXPECT_EQ(readLine(journal), "<5>line\n");
  for (int line = 0; line < 50000; ++line) log->message("line {}", line);
  log.reset();
  close(journal);
}

}  // namespace
}  // namespace telvane::testing
