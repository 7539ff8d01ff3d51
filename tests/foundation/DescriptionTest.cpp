#include "foundation/Description.h"

#include <gtest/gtest.h>

#include <charconv>
#include <cmath>
#include <limits>

namespace telvane::testing {
namespace {

TEST(DescriptionTest, showsTextBareAtTheTop) {
  EXPECT_EQ(description(Value("plain")), "plain");
  EXPECT_EQ(description(Value("two words, \"quoted\"\n")), "two words, \"quoted\"\n");
  EXPECT_EQ(description(Value("")), "");
}

TEST(DescriptionTest, showsNumbersPlain) {
  EXPECT_EQ(description(Value(true)), "1");
  EXPECT_EQ(description(Value(false)), "0");
  EXPECT_EQ(description(Value(-42)), "-42");
  EXPECT_EQ(description(Value(std::numeric_limits<int64_t>::min())), "-9223372036854775808");
  EXPECT_EQ(description(Value(std::numeric_limits<uint64_t>::max())), "18446744073709551615");
}

TEST(DescriptionTest, showsRealsInTheShortestFormThatReadsBack) {
  EXPECT_EQ(description(Value(1.0)), "1");
  EXPECT_EQ(description(Value(0.1)), "0.1");
  EXPECT_EQ(description(Value(-2.5)), "-2.5");
  EXPECT_EQ(description(Value(1e300)), "1e+300");
  EXPECT_EQ(description(Value(INFINITY)), "inf");
  EXPECT_EQ(description(Value(-INFINITY)), "-inf");
  EXPECT_EQ(description(Value(std::nan(""))), "nan");
  for (const double real : {1.0 / 3.0, 0.1 + 0.2, 1714571110.123456, 5e-324, std::numeric_limits<double>::max()}) {
    EXPECT_EQ(Value(description(Value(real))).realValue(), real) << description(Value(real));
  }
}

TEST(DescriptionTest, showsDataDatesAndNothing) {
  EXPECT_EQ(description(Value(Data::copyOf("\x01\x02"))), "<0102>");
  EXPECT_EQ(description(Value(Date::fromSecondsSince1970(1714571110))), "2024-05-01 13:45:10 +0000");
  EXPECT_EQ(description(Value()), "(null)");
}

TEST(DescriptionTest, indentsArrays) {
  EXPECT_EQ(description(Array{1, 2}), "(\n    1,\n    2\n)");
  EXPECT_EQ(description(Value(Array{1})), "(\n    1\n)");
  EXPECT_EQ(description(Array()), "(\n)");
  EXPECT_EQ(description(Array{Array{1, 2}, Value()}), "(\n    (\n        1,\n        2\n    ),\n    (null)\n)");
}

TEST(DescriptionTest, indentsDictionariesInAscendingKeyOrder) {
  EXPECT_EQ(description(Dictionary{{"b", 2}, {"a", 1}, {"B", 3}}), "{\n    B = 3;\n    a = 1;\n    b = 2;\n}");
  EXPECT_EQ(description(Dictionary()), "{\n}");
  EXPECT_EQ(description(Value(Dictionary{{"outer", Dictionary{{"inner", Array{"x"}}}}})),
            "{\n    outer = {\n        inner = (\n            x\n        );\n    };\n}");
}

TEST(DescriptionTest, quotesTextInsideContainersWhenItIsMoreThanAWord) {
  EXPECT_EQ(description(Array{"Az09_./$"}), "(\n    Az09_./$\n)");
  for (const char* text : {"", "two words", "a-b", "\xC3\xA4", "a=b", "(null)"}) {
    EXPECT_EQ(description(Array{text}), "(\n    \"" + std::string(text) + "\"\n)");
  }
  EXPECT_EQ(description(Dictionary{{"my key", "my value"}}), "{\n    \"my key\" = \"my value\";\n}");
}

TEST(DescriptionTest, marksSpecialCharactersInsideQuotes) {
  EXPECT_EQ(description(Array{"a\"b\\c\nd\re\tf"}), "(\n    \"a\\\"b\\\\c\\nd\\re\\tf\"\n)");
}

TEST(DescriptionTest, quotesDatesInsideContainers) {
  EXPECT_EQ(description(Array{Date()}), "(\n    \"1970-01-01 00:00:00 +0000\"\n)");
}

TEST(DescriptionTest, endsBeyondSixtyFourLevels) {
  const auto nested = [](int containers) {
    Value value = "leaf";
    for (int i = 0; i < containers; ++i) value = Array{value};
    return description(value);
  };
  EXPECT_NE(nested(64).find("leaf"), std::string::npos);
  EXPECT_EQ(nested(64).find("..."), std::string::npos);
  EXPECT_EQ(nested(65).find("leaf"), std::string::npos);
  EXPECT_NE(nested(65).find("..."), std::string::npos);
  EXPECT_EQ(nested(100'000), nested(65));
}

}  // namespace
}  // namespace telvane::testing
