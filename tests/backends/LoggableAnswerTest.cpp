#include "backends/LoggableAnswer.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

TEST(LoggableAnswerTest, isWhatTheServerSaidWhereThatIsText) {
  EXPECT_EQ(loggableAnswer(""), "");
  EXPECT_EQ(loggableAnswer("a\nb \xC3\xA4~"), "a\nb \xC3\xA4~") << "the log writes line feeds as it does everywhere";
}

TEST(LoggableAnswerTest, hasBlanksForControls) {
  EXPECT_EQ(loggableAnswer(std::string("\0\x1b[2J\r\t\x7f.", 9)), "  [2J   .");
  EXPECT_EQ(loggableAnswer("\xC2\x9B"
                           "2J \xC2\x80\xC2\xA0"),
            "  2J   \xC2\xA0")
      << "those of two bytes, but not what stands behind them";
}

TEST(LoggableAnswerTest, isCutOffBetweenTwoCharactersAndTellsTheLength) {
  const std::string most(kMostLoggedAnswer, 'x');
  EXPECT_EQ(loggableAnswer(most), most);
  EXPECT_EQ(loggableAnswer(most + "y"), most + "... (4097 bytes)");
  const std::string all = most.substr(1) + "\xC3\xA4";
  EXPECT_EQ(loggableAnswer(all), most.substr(1) + "... (4097 bytes)");
  EXPECT_EQ(loggableAnswer(std::string(5000, '\x80')), "... (5000 bytes)") << "bytes that are no characters";
}

}  // namespace
}  // namespace telvane::testing
