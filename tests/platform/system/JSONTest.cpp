#include "platform/JSON.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cmath>
#include <limits>

#include "tests/platform/system/Expect.h"

namespace telvane::json {
namespace {

using telvane::testing::failsWith;
using telvane::testing::holds;
using telvane::testing::succeeds;

std::string written(const Value& value, Style style = Style::Compact) {
  const Result<std::string> text = serialize(value, style);
  return text ? *text : "error: " + text.error().description();
}

Value nested(size_t levels) {
  Value value(1);
  for (size_t i = 1; i < levels; ++i) value = Array{value};
  return value;
}

TEST(JSONTest, writesEveryKindToTheByte) {
  EXPECT_EQ(written(true), "true");
  EXPECT_EQ(written(false), "false");
  EXPECT_EQ(written(0), "0");
  EXPECT_EQ(written(std::numeric_limits<int64_t>::min()), "-9223372036854775808");
  EXPECT_EQ(written(std::numeric_limits<uint64_t>::max()), "18446744073709551615");
  EXPECT_EQ(written("text"), "\"text\"");
  EXPECT_EQ(written(Array()), "[]");
  EXPECT_EQ(written(Dictionary()), "{}");
  EXPECT_EQ(written(Array{1, "a", Array{true}}), "[1,\"a\",[true]]");
}

TEST(JSONTest, keepsTheOrderOfADictionary) {
  EXPECT_EQ(written(Dictionary{{"z", 1}, {"a", 2.5}, {"m", Dictionary{{"k", "v"}}}}),
            "{\"z\":1,\"a\":2.5,\"m\":{\"k\":\"v\"}}");
}

TEST(JSONTest, indentsThePrettyForm) {
  EXPECT_EQ(written(Dictionary{{"a", Array{1, 2}}, {"b", Dictionary()}}, Style::Pretty),
            "{\n  \"a\": [\n    1,\n    2\n  ],\n  \"b\": {}\n}");
}

TEST(JSONTest, writesRealsAsShortAsTheyReadBackAndNeverAsIntegers) {
  EXPECT_EQ(written(1.0), "1.0");
  EXPECT_EQ(written(-0.0), "-0.0");
  EXPECT_EQ(written(0.1), "0.1");
  EXPECT_EQ(written(5e-324), "5e-324");
  EXPECT_EQ(written(1e300), "1e+300");
  EXPECT_EQ(written(123456789.125), "123456789.125");
  for (const double number : {0.1 + 0.2, 1.7976931348623157e308, 1234567.0, 1e15, 1e22, 3.141592653589793}) {
    EXPECT_TRUE(holds(parse(written(number)), Value(number))) << written(number);
  }
}

TEST(JSONTest, escapesWhatQuotesCannotHold) {
  EXPECT_EQ(written(std::string_view("\"\\/\b\f\n\r\t\x01\x1f\0 \x7f", 13)),
            "\"\\\"\\\\/\\b\\f\\n\\r\\t\\u0001\\u001F\\u0000 \x7f\"");
  EXPECT_EQ(written("grün €"), "\"grün €\"");
  // The mark may stand anywhere in the word that is looked at at once.
  for (size_t position = 0; position < 20; ++position) {
    std::string text(20, 'a');
    text[position] = '"';
    EXPECT_EQ(written(text), "\"" + text.substr(0, position) + "\\\"" + text.substr(position + 1) + "\"");
  }
}

TEST(JSONTest, replacesInvalidTextInKeysAndValues) {
  Dictionary dictionary;
  dictionary.set(String("k\xFF"), "v\xC3");
  EXPECT_EQ(written(dictionary), "{\"k\xEF\xBF\xBD\":\"v\xEF\xBF\xBD\"}");
}

TEST(JSONTest, writesTextLongerThanItsBuffer) {
  const std::string longText(5000, 'x');
  EXPECT_EQ(written(Array{longText, "a", longText}), "[\"" + longText + "\",\"a\",\"" + longText + "\"]");
}

TEST(JSONTest, failsOnWhatJSONHasNoFormForAndTakesItOffAgain) {
  Array withAbsent;
  withAbsent.append(Value());
  for (const Value& value : {Value(Data::copyOf("x")), Value(Date()), Value(), Value(withAbsent), Value(NAN),
                             Value(INFINITY), Value(Array{"written before", Date()})}) {
    std::string buffer = "kept";
    EXPECT_TRUE(failsWith(append(value, Style::Compact, buffer), EINVAL)) << description(value);
    EXPECT_EQ(buffer, "kept");
  }
}

TEST(JSONTest, appendsToWhatIsThere) {
  std::string buffer = "kept ";
  ASSERT_TRUE(succeeds(append(Array{1}, Style::Compact, buffer)));
  EXPECT_EQ(buffer, "kept [1]");
}

TEST(JSONTest, writesSixtyFourLevelsAndNoMore) {
  EXPECT_EQ(written(nested(64)), std::string(63, '[') + "1" + std::string(63, ']'));
  EXPECT_TRUE(failsWith(serialize(nested(65)), EINVAL));
}

TEST(JSONTest, readsBackWhatItWrote) {
  const Value value = Dictionary{{"b", true},
                                 {"i", -5},
                                 {"u", std::numeric_limits<uint64_t>::max()},
                                 {"r", 1.0},
                                 {"s", "a\n\"grün\""},
                                 {"e", Array{Array(), Dictionary(), ""}}};
  for (const Style style : {Style::Compact, Style::Pretty}) EXPECT_TRUE(holds(parse(written(value, style)), value));
}

TEST(JSONTest, readsNumbersByTheirForm) {
  EXPECT_TRUE(holds(parse("9223372036854775807"), Value(std::numeric_limits<int64_t>::max())));
  EXPECT_TRUE(holds(parse("9223372036854775808"), Value(uint64_t{9223372036854775808u})));
  EXPECT_TRUE(holds(parse("18446744073709551616"), Value(18446744073709551616.0)));
  EXPECT_TRUE(holds(parse("-9223372036854775809"), Value(-9223372036854775809.0)));
  EXPECT_TRUE(holds(parse("1e2"), Value(100.0)));
  EXPECT_TRUE(holds(parse("1.0"), Value(1.0)));
}

// Found by fuzzing: a zero with a large exponent led the library's conversion into the undefined.
TEST(JSONTest, readsZeroWithAnyExponent) {
  for (const char* text : {"0e77", "0E-400", "0.0e999999", "-0e777777777777"}) {
    const Result<Value> read = parse(text);
    EXPECT_TRUE(!read || read->real() == 0.0) << text << ": " << description(*read);
  }
  EXPECT_TRUE(holds(parse("0e77"), 0.0));
}

TEST(JSONTest, readsWhatIsTooSmallAsZero) {
  EXPECT_TRUE(holds(parse("1e-400"), 0.0));
  EXPECT_TRUE(holds(parse("0." + std::string(400, '0') + "1"), 0.0));
  EXPECT_TRUE(failsWith(parse("1e400"), EINVAL));
  EXPECT_TRUE(failsWith(parse(std::string(400, '9')), EINVAL));
}

TEST(JSONTest, readsNullAsAbsence) {
  Array array;
  array.append(Value());
  array.append(1);
  EXPECT_TRUE(holds(parse("[null,1]"), array));
  EXPECT_TRUE(holds(parse("{\"a\":null,\"b\":1}"), Dictionary{{"b", 1}}));
  EXPECT_TRUE(holds(parse("null"), Value()));
}

TEST(JSONTest, takesTheLastOfEqualKeys) { EXPECT_TRUE(holds(parse("{\"a\":1,\"a\":2}"), Dictionary{{"a", 2}})); }

TEST(JSONTest, refusesWhatIsNoJSON) {
  for (const char* text : {"", " ", "{", "[1,]", "{\"a\"}", "{a:1}", "01", "+1", "1.", "NaN", "1e999", "[1]x", "'a'",
                           "\"\x01\"", "\"\xFF\"", "\"\\ud800\"", "[1 2]", "/* */1", "tru"}) {
    EXPECT_TRUE(failsWith(parse(text), EINVAL)) << text;
  }
  EXPECT_TRUE(failsWith(parse(std::string_view("1\0", 2)), EINVAL));
  EXPECT_TRUE(failsWith(parse(std::string_view("[1]\0x", 5)), EINVAL));
}

TEST(JSONTest, boundsDepthAndSizeOfWhatItReads) {
  EXPECT_TRUE(holds(parse(std::string(63, '[') + "1" + std::string(63, ']')), nested(64)));
  EXPECT_TRUE(failsWith(parse(std::string(64, '[') + "1" + std::string(64, ']')), ELOOP));
  EXPECT_TRUE(failsWith(parse(std::string(1000000, '[')), ELOOP));
  EXPECT_TRUE(failsWith(parse("[1,2]", {.maximumBytes = 4}), EFBIG));
}

}  // namespace
}  // namespace telvane::json
