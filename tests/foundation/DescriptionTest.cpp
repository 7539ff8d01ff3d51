#include "foundation/Description.h"

#include <gtest/gtest.h>

#include <charconv>
#include <cmath>
#include <limits>

#include "foundation/ShortDescription.h"

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

TEST(DescriptionTest, aShortOneIsTheBeginningOfTheWhole) {
  const Value values[] = {"plain text",
                          12345678,
                          Value(),
                          2.5,
                          Data::copyOf("\x01\x02\x03\x04\x05\x06\x07\x08\x09"),
                          Date(),
                          Array{"a", "two words, quoted", 3, Data::copyOf("bytes"), Value(Array{1, 2, 3})},
                          Dictionary{{"b", 2}, {"my key", "x"}, {"a", Array{"y", "a-b"}}, {"c", Dictionary{{"d", 1}}}}};
  for (const Value& value : values) {
    const std::string whole = description(value);
    for (size_t limit = 0; limit < whole.size(); ++limit) {
      EXPECT_EQ(shortDescription(value, limit), whole.substr(0, limit) + "...") << limit;
    }
    EXPECT_EQ(shortDescription(value, whole.size()), whole);
    EXPECT_EQ(shortDescription(value, whole.size() + 1), whole);
  }
}

TEST(DescriptionTest, aShortOneDoesNotCutACharacter) {
  EXPECT_EQ(shortDescription("a\xC3\xA4z", 2), "a...");
  EXPECT_EQ(shortDescription("a\xC3\xA4z", 3), "a\xC3\xA4...");
}

TEST(DescriptionTest, aShortOneOfMuchTakesNoMoreThanItShows) {
  constexpr size_t kMuch = 50u << 20;
  Array list;
  for (int index = 0; index < 1'000'000; ++index) list.append(index);
  for (const Value& value : {Value(std::string(kMuch, 'x')), Value(Data(std::string(kMuch, 'x'))), Value(list),
                             Value(Array{std::string(kMuch, '"')})}) {
    const std::string text = shortDescription(value, 100);
    EXPECT_EQ(text.size(), 103u);
    EXPECT_LT(text.capacity(), 1000u) << "what is not shown was not made";
  }
}

}  // namespace
}  // namespace telvane::testing
