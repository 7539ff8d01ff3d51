#include "platform/ipc/WireCoding.h"

#include <capnp/message.h>
#include <gtest/gtest.h>

#include <memory>

#include "platform/ipc/Limits.h"

namespace telvane::testing {
namespace {

class WireCodingTest : public ::testing::Test {
 protected:
  static Array nested(size_t levels) {
    Array values = {Value(1)};
    for (size_t i = 0; i < levels; ++i) values = {Value(values)};
    return values;
  }
  capnp::List<wire::Value>::Reader encoded(const Array& values) {
    auto arguments = message.initRoot<wire::Invocation>().initArguments(static_cast<unsigned>(values.size()));
    ipc::wirecoding::encode(values, arguments);
    return arguments.asReader();
  }

  const std::unique_ptr<capnp::MallocMessageBuilder> owned = std::make_unique<capnp::MallocMessageBuilder>();
  capnp::MallocMessageBuilder& message = *owned;
};

TEST_F(WireCodingTest, measuresWhatTheWireTakes) {
  Dictionary dictionary;
  dictionary.set(String("key"), Value("text"));
  dictionary.set(String("longer key"), Value(Data::copyOf(std::string_view("12345"))));
  const Array values = {Value(dictionary), Value(Array({Value(1), Value()})), Value("")};
  const auto measure = ipc::wirecoding::measure(values);
  encoded(values);
  const size_t root = 8 + 8 + 16;  // the root's pointer and its own words
  EXPECT_EQ(measure.wireBytes + root, message.sizeInWords() * 8);
  EXPECT_EQ(measure.textBytes, 3u + 4 + 10);
  EXPECT_FALSE(measure.isTooDeep);
}

TEST_F(WireCodingTest, admitsAsMuchNestingAsTheOtherCoders) {
  EXPECT_FALSE(ipc::wirecoding::measure(nested(ipc::kMaximumNesting)).isTooDeep);
  EXPECT_TRUE(ipc::wirecoding::measure(nested(ipc::kMaximumNesting + 1)).isTooDeep);
}

TEST_F(WireCodingTest, decodesWithAWrongHintToo) {
  const Array values = {Value("some text"), Value("and more")};
  const auto list = encoded(values);
  for (const uint64_t hint : {0ull, 3ull, 17ull, ~0ull}) {
    ipc::wirecoding::Decoder decoder(hint, 100);
    EXPECT_EQ(decoder.decode(list), values) << "hint " << hint;
  }
}

TEST_F(WireCodingTest, refusesMoreValuesThanAllowedInAllListsTogether) {
  const auto list = encoded({Value(Array({Value(1), Value(2)})), Value(3)});
  EXPECT_NO_THROW(ipc::wirecoding::Decoder(0, 4).decode(list));
  EXPECT_THROW(ipc::wirecoding::Decoder(0, 3).decode(list), kj::Exception);
}

TEST_F(WireCodingTest, aKeyThatComesTwiceCountsWithItsLastValue) {
  auto entries = message.initRoot<wire::Invocation>().initArguments(1)[0].initDictionary(2);
  entries[0].setKey("key");
  entries[0].setInteger(1);
  entries[1].setKey("key");
  entries[1].setInteger(2);
  ipc::wirecoding::Decoder decoder(0, 100);
  const Array values = decoder.decode(message.getRoot<wire::Invocation>().asReader().getArguments());
  Dictionary expected;
  expected.set(String("key"), Value(2));
  EXPECT_EQ(values, Array({Value(expected)}));
}

}  // namespace
}  // namespace telvane::testing
