#include "platform/log/StandardErrorLog.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <future>
#include <optional>
#include <sstream>
#include <thread>
#include <vector>

#include "tests/platform/log/ReadingEnd.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

class StoppedClock final : public Clock {
 public:
  explicit StoppedClock(Date now) : _now(now) {}
  Date now() const override { return _now; }
  MonotonicTime monotonicNow() const override { return {}; }

 private:
  const Date _now;
};

// 2026-11-20T23:17:51.123456Z
constexpr Date kNow{Date::TimePoint(1795216671123456us)};

class StandardErrorLogTest : public ::testing::Test {
 protected:
  StandardErrorLogTest() {
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
    _readingEnd = ends[0];
    _writingEnd = ends[1];
  }
  ~StandardErrorLogTest() override {
    closeReadingEnd();
    closeWritingEnd();
  }

  StandardErrorLog& givenLog(LogLevel leastImportant, LineWriter::Options options = {}, Date now = kNow) {
    return _log.emplace(leastImportant, "telvaned", std::make_shared<StoppedClock>(now), _writingEnd, options);
  }
  // Lets go of the log and returns all that came out of it.
  std::string endLogAndRead() {
    auto text = std::async(std::launch::async, [this] { return readAll(_readingEnd); });
    _log.reset();
    closeWritingEnd();
    return text.get();
  }
  void closeReadingEnd() {
    if (_readingEnd >= 0) close(std::exchange(_readingEnd, -1));
  }
  void closeWritingEnd() {
    if (_writingEnd >= 0) close(std::exchange(_writingEnd, -1));
  }
  // What stands before each message.
  static std::string prefix(const std::string& level, const std::string& time = "2026-11-20T23:17:51.123456Z") {
    return time + " telvaned[" + std::to_string(getpid()) + "] <" + level + "> ";
  }

  // The number that stands in the line behind that beginning, if the line begins so.
  static std::optional<int> numberAfter(const std::string& beginning, const std::string& line) {
    if (line.compare(0, beginning.size(), beginning) != 0) return std::nullopt;
    return std::atoi(line.c_str() + beginning.size());
  }

  int _readingEnd = -1;
  int _writingEnd = -1;
  std::optional<StandardErrorLog> _log;
};

TEST_F(StandardErrorLogTest, writesTimeProgramProcessLevelAndMessage) {
  StandardErrorLog& log = givenLog(LogLevel::Info);
  log.message("storebag for client type {}", 7);
  log.info("info");
  log.error("error");
  EXPECT_EQ(endLogAndRead(), prefix("default") + "storebag for client type 7\n" + prefix("info") + "info\n" +
                                 prefix("error") + "error\n");
}

TEST_F(StandardErrorLogTest, writesALineAtOnceWithoutWaitingForMore) {
  givenLog(LogLevel::Default).message("alone");
  EXPECT_EQ(readLine(_readingEnd), prefix("default") + "alone\n");
}

TEST_F(StandardErrorLogTest, leavesOutWhatIsLessImportant) {
  StandardErrorLog& log = givenLog(LogLevel::Error);
  log.message("default");
  log.info("info");
  log.error("error");
  EXPECT_EQ(endLogAndRead(), prefix("error") + "error\n");
}

TEST_F(StandardErrorLogTest, writesAMessageOfSeveralLinesAsOne) {
  StandardErrorLog& log = givenLog(LogLevel::Default);
  log.message("{}", "{\n    a = 1;\n}\n");
  log.message("");
  EXPECT_EQ(endLogAndRead(), prefix("default") + "{\\n    a = 1;\\n}\\n\n" + prefix("default") + "\n");
}

// A client's path or name may hold them, and an operator reads lines in a terminal.
TEST_F(StandardErrorLogTest, writesNoControlCharacterThatATerminalWouldActOn) {
  givenLog(LogLevel::Default)
      .message("{}", "bell\a esc\x1b[2J del\x7f csi\xc2\x9b m tab\t; \xc2\xa0\xc3\xa9, a lone \xc2");
  EXPECT_EQ(endLogAndRead(),
            prefix("default") + "bell\\x07 esc\\x1b[2J del\\x7f csi\\x9b m tab\\x09; \xc2\xa0\xc3\xa9, a lone \xc2\n");
}

TEST_F(StandardErrorLogTest, cutsAMessageThatGrowsBeyondTheBufferByBeingWrittenSo) {
  givenLog(LogLevel::Default, {.maximumBytes = 1000}).message("{}", std::string(900, '\a'));
  const std::string text = endLogAndRead();
  EXPECT_EQ(text.size(), 1000u);
  EXPECT_EQ(text.substr(prefix("default").size(), 8), "\\x07\\x07");
}

TEST_F(StandardErrorLogTest, padsEachPartOfTheTime) {
  givenLog(LogLevel::Default, {}, Date(Date::TimePoint(5us))).message("x");
  EXPECT_EQ(endLogAndRead(), prefix("default", "1970-01-01T00:00:00.000005Z") + "x\n");
}

TEST_F(StandardErrorLogTest, tellsTimesBefore1970) {
  givenLog(LogLevel::Default, {}, Date(Date::TimePoint(-1us))).message("x");
  EXPECT_EQ(endLogAndRead(), prefix("default", "1969-12-31T23:59:59.999999Z") + "x\n");
}

TEST_F(StandardErrorLogTest, keepsLinesOfSeveralThreadsApartAndEachThreadsLinesInOrder) {
  constexpr int kThreads = 4;
  constexpr int kLines = 2000;
  StandardErrorLog& log = givenLog(LogLevel::Default, {.maximumBytes = 64u << 20});
  auto text = std::async(std::launch::async, [this] { return readAll(_readingEnd); });
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([&log, thread] {
      for (int line = 0; line < kLines; ++line) log.message("{} {} {}", thread, line, std::string(thread * 100, 'x'));
    });
  }
  for (std::thread& thread : threads) thread.join();
  _log.reset();
  closeWritingEnd();
  std::istringstream lines(text.get());
  std::vector<int> next(kThreads, 0);
  int count = 0;
  for (std::string line; std::getline(lines, line); ++count) {
    ASSERT_EQ(line.substr(0, prefix("default").size()), prefix("default"));
    std::istringstream words(line.substr(prefix("default").size()));
    int thread = -1, number = -1;
    std::string filling;
    words >> thread >> number >> filling;
    ASSERT_TRUE(thread >= 0 && thread < kThreads) << line;
    EXPECT_EQ(number, next[thread]++) << line;
    EXPECT_EQ(filling, std::string(thread * 100, 'x'));
  }
  EXPECT_EQ(count, kThreads * kLines);
}

TEST_F(StandardErrorLogTest, writesLinesLongerThanAPipeTakesAtOnce) {
  const std::string text(300000, 'y');
  givenLog(LogLevel::Default).message("{}", text);
  EXPECT_EQ(endLogAndRead(), prefix("default") + text + "\n");
}

TEST_F(StandardErrorLogTest, cutsAMessageThatWouldFillTheWholeBuffer) {
  givenLog(LogLevel::Default, {.maximumBytes = 1000}).message("{}", std::string(5000, 'z'));
  const std::string text = endLogAndRead();
  EXPECT_EQ(text, prefix("default") + std::string(1000 - prefix("default").size() - 1, 'z') + "\n");
}

// Nobody reads: the pipe takes 64 KiB, the buffer 100 kB more, and the writer still comes to its end.
TEST_F(StandardErrorLogTest, dropsTheOldestLinesAndCountsThemWhenNobodyReads) {
  constexpr int kLines = 20000;
  StandardErrorLog& log = givenLog(LogLevel::Default, {.maximumBytes = 100000});
  for (int line = 0; line < kLines; ++line) log.message("line {}", line);
  std::istringstream lines(endLogAndRead());
  int next = 0;
  int reports = 0;
  for (std::string line; std::getline(lines, line);) {
    if (const std::optional<int> number = numberAfter(prefix("default") + "line ", line)) {
      EXPECT_EQ(*number, next++);
    } else if (const std::optional<int> dropped = numberAfter(prefix("error"), line)) {
      EXPECT_EQ(line, prefix("error") + std::to_string(*dropped) +
                          " log lines were dropped here: standard error takes them too slowly");
      next += *dropped;
      ++reports;
    } else {
      ADD_FAILURE() << "neither a line nor a report: " << line;
    }
  }
  EXPECT_EQ(next, kLines) << "lines and dropped lines do not add up, or the newest line is missing";
  EXPECT_GE(reports, 1);
}

TEST_F(StandardErrorLogTest, endsAlthoughNobodyReads) {
  StandardErrorLog& log = givenLog(LogLevel::Default, {.flushTime = 1ms});
  for (int line = 0; line < 5000; ++line) log.message("line {}", line);
  auto end = std::async(std::launch::async, [this] { _log.reset(); });
  EXPECT_EQ(end.wait_for(30s), std::future_status::ready) << "a blocked standard error holds up the process";
  closeReadingEnd();
}

TEST_F(StandardErrorLogTest, survivesAClosedPipe) {
  StandardErrorLog& log = givenLog(LogLevel::Default);
  closeReadingEnd();
  for (int line = 0; line < 100; ++line) log.message("line {}", line);
  _log.reset();
  // SIGPIPE, had the write raised it, would have ended this process.
  struct sigaction action;
  ASSERT_EQ(sigaction(SIGPIPE, nullptr, &action), 0);
  EXPECT_EQ(action.sa_handler, SIG_DFL);
}

TEST_F(StandardErrorLogTest, survivesAStandardErrorThatIsNotOpen) {
  closeWritingEnd();
  _log.emplace(LogLevel::Default, "telvaned", std::make_shared<StoppedClock>(kNow), 1000000, LineWriter::Options{});
  _log->message("lost");
  _log.reset();
  EXPECT_EQ(readAll(_readingEnd), "");
}

}  // namespace
}  // namespace telvane::testing
