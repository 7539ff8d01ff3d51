#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "foundation/Value.h"

namespace telvane::testing {
namespace {

constexpr int64_t kLargest = std::numeric_limits<int64_t>::max();
constexpr int64_t kSmallest = std::numeric_limits<int64_t>::min();
constexpr uint64_t kLargestUnsigned = std::numeric_limits<uint64_t>::max();

TEST(ValueConversionsTest, countsAsZeroWhatIsNoNumber) {
  for (const Value& value : {Value(), Value("word"), Value(""), Value(Data::copyOf("1")),
                             Value(Date::fromSecondsSince1970(1)), Value(Array{1}), Value(Dictionary{{"1", 1}})}) {
    EXPECT_EQ(value.integerValue(), 0);
    EXPECT_EQ(value.unsignedValue(), 0u);
    EXPECT_EQ(value.realValue(), 0.0);
    EXPECT_EQ(value.low16Bits(), 0);
    EXPECT_FALSE(value.booleanValue());
  }
}

TEST(ValueConversionsTest, readsIntegers) {
  EXPECT_EQ(Value(true).integerValue(), 1);
  EXPECT_EQ(Value(false).integerValue(), 0);
  EXPECT_EQ(Value(-7).integerValue(), -7);
  EXPECT_EQ(Value(kLargestUnsigned).integerValue(), -1);
  EXPECT_EQ(Value(kLargestUnsigned).unsignedValue(), kLargestUnsigned);
  EXPECT_EQ(Value(-1).unsignedValue(), kLargestUnsigned);
}

TEST(ValueConversionsTest, truncatesAndClampsReals) {
  EXPECT_EQ(Value(2.9).integerValue(), 2);
  EXPECT_EQ(Value(-2.9).integerValue(), -2);
  EXPECT_EQ(Value(1e19).integerValue(), kLargest);
  EXPECT_EQ(Value(9223372036854775808.0).integerValue(), kLargest);
  EXPECT_EQ(Value(-9223372036854775808.0).integerValue(), kSmallest);
  EXPECT_EQ(Value(-1e300).integerValue(), kSmallest);
  EXPECT_EQ(Value(INFINITY).integerValue(), kLargest);
  EXPECT_EQ(Value(-INFINITY).integerValue(), kSmallest);
  EXPECT_EQ(Value(std::nan("")).integerValue(), 0);
  EXPECT_EQ(Value(-1.0).unsignedValue(), kLargestUnsigned);
}

TEST(ValueConversionsTest, readsIntegersFromTheBeginningOfText) {
  EXPECT_EQ(Value("42").integerValue(), 42);
  EXPECT_EQ(Value("  -12abc").integerValue(), -12);
  EXPECT_EQ(Value("\t\n+7 8").integerValue(), 7);
  EXPECT_EQ(Value("007").integerValue(), 7);
  EXPECT_EQ(Value("3.99").integerValue(), 3);
  EXPECT_EQ(Value("0x1A").integerValue(), 0);
  EXPECT_EQ(Value("- 5").integerValue(), 0);
  EXPECT_EQ(Value("--5").integerValue(), 0);
  EXPECT_EQ(Value("+-5").integerValue(), 0);
  EXPECT_EQ(Value("-").integerValue(), 0);
  EXPECT_EQ(Value("   ").integerValue(), 0);
}

TEST(ValueConversionsTest, clampsTextToTheRange) {
  EXPECT_EQ(Value("9223372036854775807").integerValue(), kLargest);
  EXPECT_EQ(Value("9223372036854775808").integerValue(), kLargest);
  EXPECT_EQ(Value("-9223372036854775808").integerValue(), kSmallest);
  EXPECT_EQ(Value("-9223372036854775809").integerValue(), kSmallest);
  EXPECT_EQ(Value("99999999999999999999999").integerValue(), kLargest);
  EXPECT_EQ(Value("-99999999999999999999999").integerValue(), kSmallest);
}

TEST(ValueConversionsTest, cutsToLowBits) {
  EXPECT_EQ(Value(70000).low16Bits(), 4464);
  EXPECT_EQ(Value(65536).low16Bits(), 0);
  EXPECT_EQ(Value(-1).low16Bits(), 65535);
  EXPECT_EQ(Value("70000").low16Bits(), 4464);
  EXPECT_EQ(Value(int64_t{1} << 31).int32Value(), std::numeric_limits<int32_t>::min());
  EXPECT_EQ(Value((int64_t{1} << 32) + 5).int32Value(), 5);
  EXPECT_EQ(Value((int64_t{1} << 32) + 5).uint32Value(), 5u);
  EXPECT_EQ(Value(-1).uint32Value(), 4294967295u);
}

TEST(ValueConversionsTest, readsReals) {
  EXPECT_EQ(Value(true).realValue(), 1.0);
  EXPECT_EQ(Value(-3).realValue(), -3.0);
  EXPECT_EQ(Value(kLargestUnsigned).realValue(), 18446744073709551615.0);
  EXPECT_EQ(Value(0.1).realValue(), 0.1);
  EXPECT_TRUE(std::isnan(Value(std::nan("")).realValue()));
}

TEST(ValueConversionsTest, readsRealsFromTheBeginningOfText) {
  EXPECT_EQ(Value("  -12.5abc").realValue(), -12.5);
  EXPECT_EQ(Value("+1e3").realValue(), 1000.0);
  EXPECT_EQ(Value(".5").realValue(), 0.5);
  EXPECT_EQ(Value("5.").realValue(), 5.0);
  EXPECT_EQ(Value("1e").realValue(), 1.0);
  EXPECT_EQ(Value("1,5").realValue(), 1.0);
  for (const char* text : {"inf", "nan", "-infinity", ".", "e5", "--1", "+-1", "- 1", ".e1"}) {
    EXPECT_EQ(Value(text).realValue(), 0.0) << text;
  }
}

TEST(ValueConversionsTest, readsTextBeyondTheRangeAsInfiniteOrZero) {
  EXPECT_EQ(Value("1e999").realValue(), INFINITY);
  EXPECT_EQ(Value("-1e999").realValue(), -INFINITY);
  EXPECT_EQ(Value("1e-999").realValue(), 0.0);
  EXPECT_EQ(Value(std::string(400, '9')).realValue(), INFINITY);
  EXPECT_EQ(Value("0." + std::string(400, '0') + "1").realValue(), 0.0);
}

TEST(ValueConversionsTest, readsBooleansOfNumbers) {
  EXPECT_TRUE(Value(true).booleanValue());
  EXPECT_FALSE(Value(false).booleanValue());
  EXPECT_TRUE(Value(-1).booleanValue());
  EXPECT_FALSE(Value(0).booleanValue());
  EXPECT_TRUE(Value(0.25).booleanValue());
  EXPECT_FALSE(Value(-0.0).booleanValue());
  EXPECT_FALSE(Value(std::nan("")).booleanValue());
  EXPECT_TRUE(Value(kLargestUnsigned).booleanValue());
}

TEST(ValueConversionsTest, readsBooleansOfText) {
  for (const char* text : {"YES", "y", "true", "T", "1", "9x", "  +007", "-1", "0y", "text"}) {
    EXPECT_TRUE(Value(text).booleanValue()) << text;
  }
  for (const char* text : {"NO", "no", "false", "0", "000", "", " ", "-", "x1", "on", "0.5", "+ 1"}) {
    EXPECT_FALSE(Value(text).booleanValue()) << text;
  }
}

}  // namespace
}  // namespace telvane::testing
