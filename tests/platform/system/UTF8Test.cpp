#include "platform/system/UTF8.h"

#include <gtest/gtest.h>

namespace telvane::utf8 {
namespace {

TEST(UTF8Test, acceptsWellFormedTextOfEveryLength) {
  for (const char* text : {"", "a", "12345678", "123456789", "\xC2\x80", "\xE2\x82\xAC", "\xED\x9F\xBF", "\xEE\x80\x80",
                           "\xF0\x90\x80\x80", "\xF4\x8F\xBF\xBF", "12345678\xC3\xA4"}) {
    EXPECT_TRUE(isValid(text)) << text;
    EXPECT_EQ(repaired(text), text);
  }
}

TEST(UTF8Test, refusesOverlongFormsSurrogatesAndCutSequences) {
  for (const char* text : {"\x80", "\xC0\x80", "\xC1\xBF", "\xE0\x80\x80", "\xED\xA0\x80", "\xF0\x80\x80\x80",
                           "\xF4\x90\x80\x80", "\xF5\x80\x80\x80", "\xFF", "\xE2\x82", "12345678\xC3"}) {
    EXPECT_FALSE(isValid(text)) << text;
  }
}

TEST(UTF8Test, putsOneReplacementForEachMalformedPiece) {
  EXPECT_EQ(repaired("a\xFFz"), "a\xEF\xBF\xBDz");
  EXPECT_EQ(repaired("a\xE2\x82z"), "a\xEF\xBF\xBDz");
  EXPECT_EQ(repaired("\xE2\x82"), "\xEF\xBF\xBD");
  EXPECT_EQ(repaired("\xC0\x80"), "\xEF\xBF\xBD\xEF\xBF\xBD");
  EXPECT_EQ(repaired("\xF0\x9F\x98\xE2\x82\xAC"), "\xEF\xBF\xBD\xE2\x82\xAC");
  EXPECT_TRUE(isValid(repaired("\xED\xA0\x80\xF4\x90\x80\x80")));
}

}  // namespace
}  // namespace telvane::utf8
