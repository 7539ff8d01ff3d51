#include "foundation/Value.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <type_traits>

#include "tests/foundation/AllocationCounter.h"

namespace telvane::testing {
namespace {

enum Fruit { kApple };

Value nested(size_t depth) {
  Value value = "leaf";
  for (size_t i = 1; i < depth; ++i) {
    value = i % 2 == 0 ? Value(Array{0, value}) : Value(Dictionary{{"first", 0}, {"inner", value}});
  }
  return value;
}

// One value of each kind, twice: equal within a pair, different between pairs.
std::vector<Value> oneOfEachKind() {
  return {Value(),
          true,
          1,
          std::numeric_limits<uint64_t>::max(),
          1.0,
          "1",
          Data::copyOf("1"),
          Date(Date::TimePoint(std::chrono::microseconds(1))),
          Array{1},
          Dictionary{{"1", 1}}};
}

TEST(ValueTest, isAbsentByDefault) {
  EXPECT_EQ(Value().kind(), Value::Kind::None);
  EXPECT_FALSE(Value().isPresent());
  EXPECT_FALSE(Value::none().isPresent());
  EXPECT_EQ(&Value::none(), &Value::none());
}

TEST(ValueTest, knowsItsKind) {
  const auto values = oneOfEachKind();
  for (size_t i = 0; i < values.size(); ++i) EXPECT_EQ(static_cast<size_t>(values[i].kind()), i);
  EXPECT_TRUE(Value(true).isNumber());
  EXPECT_TRUE(Value(~uint64_t{0}).isNumber());
  EXPECT_TRUE(Value(1.5).isNumber());
  EXPECT_FALSE(Value("1").isNumber());
  EXPECT_FALSE(Value().isNumber());
  EXPECT_TRUE(Value("1").isString());
  EXPECT_TRUE(Value(Array()).isArray());
  EXPECT_TRUE(Value(Dictionary()).isDictionary());
}

TEST(ValueTest, givesItsContentOnlyAsItsOwnKind) {
  for (const Value& value : oneOfEachKind()) {
    const auto kind = value.kind();
    EXPECT_EQ(value.boolean().has_value(), kind == Value::Kind::Boolean);
    EXPECT_EQ(value.integer().has_value(), kind == Value::Kind::Integer);
    EXPECT_EQ(value.unsignedInteger().has_value(), kind == Value::Kind::UnsignedInteger);
    EXPECT_EQ(value.real().has_value(), kind == Value::Kind::Real);
    EXPECT_EQ(value.string() != nullptr, kind == Value::Kind::String);
    EXPECT_EQ(value.data() != nullptr, kind == Value::Kind::Data);
    EXPECT_EQ(value.date() != nullptr, kind == Value::Kind::Date);
    EXPECT_EQ(value.array() != nullptr, kind == Value::Kind::Array);
    EXPECT_EQ(value.dictionary() != nullptr, kind == Value::Kind::Dictionary);
    EXPECT_EQ(value.text(), kind == Value::Kind::String ? "1" : "");
  }
}

TEST(ValueTest, keepsItsContent) {
  EXPECT_EQ(Value(false).boolean(), false);
  EXPECT_EQ(Value(-5).integer(), -5);
  EXPECT_EQ(Value(std::numeric_limits<int64_t>::min()).integer(), std::numeric_limits<int64_t>::min());
  EXPECT_EQ(Value(~uint64_t{0}).unsignedInteger(), ~uint64_t{0});
  EXPECT_EQ(Value(0.25f).real(), 0.25);
  EXPECT_EQ(Value("text").text(), "text");
  EXPECT_EQ(*Value(Data::copyOf("bytes")).data(), Data::copyOf("bytes"));
  EXPECT_EQ(Value(Date::fromSecondsSince1970(2.5)).date()->secondsSince1970(), 2.5);
  EXPECT_EQ(*Value(Array{1}).array(), (Array{1}));
  EXPECT_EQ(*Value(Dictionary{{"a", 1}}).dictionary(), (Dictionary{{"a", 1}}));
}

TEST(ValueTest, holdsUnsignedNumbersAsIntegersWhereTheyFit) {
  EXPECT_EQ(Value(uint64_t{1} << 63).kind(), Value::Kind::UnsignedInteger);
  EXPECT_EQ(Value((uint64_t{1} << 63) - 1).kind(), Value::Kind::Integer);
  EXPECT_EQ(Value(uint16_t{65535}).integer(), 65535);
  EXPECT_EQ(Value(uint32_t{4294967295}).integer(), 4294967295);
  EXPECT_EQ(Value(int8_t{-1}).integer(), -1);
}

TEST(ValueTest, isNotMadeOfPointersOrEnumerations) {
  static_assert(!std::is_convertible_v<int*, Value>);
  static_assert(!std::is_convertible_v<const void*, Value>);
  static_assert(!std::is_convertible_v<Fruit, Value>);
  static_assert(std::is_convertible_v<bool, Value>);
  static_assert(std::is_convertible_v<const char*, Value>);
  static_assert(std::is_nothrow_move_constructible_v<Value> && std::is_nothrow_copy_constructible_v<Value>);
  EXPECT_EQ(Value(static_cast<int>(kApple)).integer(), 0);
}

TEST(ValueTest, equalsOnlyTheSameKindWithTheSameContent) {
  const auto values = oneOfEachKind();
  const auto again = oneOfEachKind();
  for (size_t i = 0; i < values.size(); ++i) {
    for (size_t j = 0; j < values.size(); ++j) {
      EXPECT_EQ(values[i] == again[j], i == j) << i << " and " << j;
    }
  }
  EXPECT_NE(Value("a"), Value("b"));
  EXPECT_NE(Value(1), Value(2));
  EXPECT_NE(Value(true), Value(false));
  EXPECT_NE(Value(0), Value(0.0));
  EXPECT_NE(Value(int64_t{-1}), Value(~uint64_t{0}));
}

TEST(ValueTest, comparesRealsByValue) {
  EXPECT_EQ(Value(0.0), Value(-0.0));
  const Value notANumber = std::nan("");
  EXPECT_NE(notANumber, notANumber);
  const Array array{notANumber};
  EXPECT_NE(array, array);
}

TEST(ValueTest, isCopiedWithoutAllocating) {
  const auto values = oneOfEachKind();
  std::vector<Value> copies;
  copies.reserve(values.size());
  const size_t allocations = allocationsDuring([&] {
    for (const Value& value : values) copies.push_back(value);
  });
  EXPECT_EQ(allocations, 0u);
  EXPECT_EQ(copies, values);
  EXPECT_EQ(copies[5].text().data(), values[5].text().data());
  EXPECT_EQ(copies[6].data()->bytes(), values[6].data()->bytes());
  EXPECT_EQ(copies[8].array()->begin(), values[8].array()->begin());
}

TEST(ValueTest, isAbsentAfterItWasMovedFrom) {
  for (Value& value : oneOfEachKind()) {
    const Value copy = value;
    const Value taken = std::move(value);
    EXPECT_EQ(taken, copy);
    EXPECT_FALSE(value.isPresent());
    value = 1;
    EXPECT_EQ(value, 1);
  }
}

TEST(ValueTest, takesOnAnyOtherKind) {
  for (const Value& from : oneOfEachKind()) {
    for (const Value& to : oneOfEachKind()) {
      Value copied = from;
      copied = to;
      EXPECT_EQ(copied, to);
      Value moved = from;
      Value source = to;
      moved = std::move(source);
      EXPECT_EQ(moved, to);
      EXPECT_FALSE(source.isPresent());
    }
  }
}

TEST(ValueTest, survivesAssignmentFromItselfAndFromWithin) {
  Value value = "text";
  const Value& alias = value;
  value = alias;
  EXPECT_EQ(value, "text");
  value = std::move(const_cast<Value&>(alias));
  EXPECT_EQ(value, "text");
  Value outer = Array{Value(Array{"inner"})};
  outer = (*outer.array())[0];
  EXPECT_EQ(outer, (Array{"inner"}));
}

TEST(ValueTest, leavesACopyAloneWhenTheOriginalChanges) {
  Dictionary dictionary{{"a", 1}};
  const Value value = dictionary;
  dictionary.set("a", 2);
  EXPECT_EQ(value, (Dictionary{{"a", 1}}));
}

TEST(ValueTest, countsItsDepth) {
  EXPECT_EQ(Value().depth(64), 1u);
  EXPECT_EQ(Value("text").depth(64), 1u);
  EXPECT_EQ(Value(Array()).depth(64), 1u);
  EXPECT_EQ(Value(Array{1, Array{2, 3}}).depth(64), 3u);
  EXPECT_EQ(Value(Dictionary{{"a", Dictionary{{"b", Array{1}}}}, {"c", 1}}).depth(64), 4u);
  EXPECT_EQ(nested(64).depth(100), 64u);
}

TEST(ValueTest, stopsCountingItsDepthAtTheLimit) {
  EXPECT_EQ(nested(64).depth(64), 64u);
  EXPECT_EQ(nested(65).depth(64), 64u);
  EXPECT_EQ(nested(3).depth(2), 2u);
  EXPECT_EQ(nested(3).depth(1), 1u);
  EXPECT_EQ(nested(3).depth(0), 0u);
  EXPECT_EQ(nested(20'000).depth(64), 64u);
}

TEST(ValueTest, isDestroyedAndComparedAtAnyDepthThatDecodersAdmit) {
  const Value value = nested(64);
  EXPECT_EQ(value, nested(64));
  EXPECT_NE(value, nested(63));
}

// Beyond what decoders admit: a program may nest its own payload as deep as it likes before anything is refused.
TEST(ValueTest, isDestroyedAtAMillionLevels) {
  auto value = std::make_unique<Value>(nested(1'000'000));
  const Value inner = (*value->dictionary())["inner"];
  value.reset();
  EXPECT_EQ(inner.depth(3), 3u);
}

}  // namespace
}  // namespace telvane::testing
