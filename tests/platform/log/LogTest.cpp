#include "platform/Log.h"

#include <gtest/gtest.h>

#include <vector>

namespace telvane::testing {
namespace {

// A value that counts how often it was made into text.
struct Counted {
  int* formatted;
};

class CollectingLog final : public Log {
 public:
  explicit CollectingLog(LogLevel leastImportant) : Log(leastImportant) {}
  std::vector<std::pair<LogLevel, std::string>> lines;

 private:
  void write(LogLevel level, std::string_view message) override { lines.emplace_back(level, message); }
};

using Lines = std::vector<std::pair<LogLevel, std::string>>;

}  // namespace
}  // namespace telvane::testing

template <>
struct fmt::formatter<telvane::testing::Counted> : fmt::formatter<int> {
  auto format(const telvane::testing::Counted& counted, format_context& context) const {
    ++*counted.formatted;
    return fmt::formatter<int>::format(*counted.formatted, context);
  }
};

namespace telvane::testing {
namespace {

void writeOneOfEach(Log& log, int* formatted) {
  log.error("error {}", Counted{formatted});
  log.message("message {}", Counted{formatted});
  log.info("info {}", Counted{formatted});
}

TEST(LogTest, keepsEverythingAtTheLevelInfo) {
  CollectingLog log(LogLevel::Info);
  int formatted = 0;
  writeOneOfEach(log, &formatted);
  EXPECT_EQ(log.lines,
            (Lines{{LogLevel::Error, "error 1"}, {LogLevel::Default, "message 2"}, {LogLevel::Info, "info 3"}}));
}

TEST(LogTest, formatsNothingOfALevelThatIsOff) {
  CollectingLog log(LogLevel::Error);
  int formatted = 0;
  writeOneOfEach(log, &formatted);
  EXPECT_EQ(log.lines, (Lines{{LogLevel::Error, "error 1"}}));
  EXPECT_EQ(formatted, 1);
}

TEST(LogTest, keepsErrorsAndMessagesAtTheLevelDefault) {
  CollectingLog log(LogLevel::Default);
  int formatted = 0;
  writeOneOfEach(log, &formatted);
  EXPECT_EQ(log.lines, (Lines{{LogLevel::Error, "error 1"}, {LogLevel::Default, "message 2"}}));
  EXPECT_EQ(formatted, 2);
  EXPECT_TRUE(log.isEnabled(LogLevel::Default));
  EXPECT_FALSE(log.isEnabled(LogLevel::Info));
}

TEST(LogTest, takesMessagesOfAnyLength) {
  CollectingLog log(LogLevel::Info);
  const std::string text(100000, 'x');
  log.info("{}", text);
  ASSERT_EQ(log.lines.size(), 1u);
  EXPECT_EQ(log.lines[0].second, text);
}

TEST(LogTest, writesTheFormatWhenItsArgumentsCannotBeTold) {
  CollectingLog log(LogLevel::Info);
  log.error("width {:{}}", 1, -1);
  EXPECT_EQ(log.lines, (Lines{{LogLevel::Error, "width {:{}}"}}));
}

}  // namespace
}  // namespace telvane::testing
