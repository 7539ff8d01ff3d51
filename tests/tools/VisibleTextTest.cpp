#include "tools/VisibleText.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

TEST(VisibleTextTest, leavesWhatAReaderSees) {
  for (const char* text : {"", "plain", "\u00c4\u20ac\U0001F600", "a\\n \"b\""}) EXPECT_EQ(visibleText(text), text);
}

TEST(VisibleTextTest, escapesWhatATerminalActsOn) {
  EXPECT_EQ(visibleText("a\nb\tc\rd"), "a\\nb\\tc\\rd");
  EXPECT_EQ(visibleText("\x1b[2J\x7f"), "\\u001b[2J\\u007f");
  EXPECT_EQ(visibleText("\u0080\u009b\u009f\u00a0"), "\\u0080\\u009b\\u009f\u00a0");
  EXPECT_EQ(visibleText("\u202a\u202e\u2066\u2069\u200f\u2028\ufeff\u200b"),
            "\\u202a\\u202e\\u2066\\u2069\\u200f\\u2028\\ufeff\\u200b");
  EXPECT_EQ(visibleText(std::string_view("\0", 1)), "\\u0000");
}

TEST(VisibleTextTest, showsTheBytesOfWhatIsNoUTF8) {
  EXPECT_EQ(visibleText("a\x9b"
                        "b"),
            "a\\x9bb");
  EXPECT_EQ(visibleText("\xc2"), "\\xc2");
  EXPECT_EQ(visibleText("\xc0\x9b"), "\\xc0\\x9b");
  EXPECT_EQ(visibleText("\xe0\x80\x80"), "\\xe0\\x80\\x80");
  EXPECT_EQ(visibleText("\xff\xfe"), "\\xff\\xfe");
}

}  // namespace
}  // namespace telvane::testing
