#include "client/ValueSize.h"

#include <gtest/gtest.h>

#include <string>

namespace telvane::testing {
namespace {

TEST(ValueSizeTest, countsTextAndDataAtAnyDepth) {
  const std::string text(1000, 'x');
  const Value value = Array{Dictionary{{Key("a"), text}}, Data(text)};
  EXPECT_GE(estimatedSize(value), 2000u);
  EXPECT_LE(estimatedSize(value), 2400u);
}

TEST(ValueSizeTest, countsKeys) {
  Dictionary dictionary;
  dictionary.set(String(std::string(500, 'k')), 1);
  EXPECT_GE(estimatedSize(dictionary), 500u);
}

TEST(ValueSizeTest, countsEveryElement) {
  Array many;
  for (int i = 0; i < 1000; ++i) many.append(i);
  EXPECT_GE(estimatedSize(many), 1000 * sizeof(Value));
}

TEST(ValueSizeTest, doesNotFollowNestingForEver) {
  Value nested = 1;
  for (int i = 0; i < 100'000; ++i) nested = Array{std::move(nested)};
  EXPECT_LE(estimatedSize(nested), 100 * sizeof(Value));
}

}  // namespace
}  // namespace telvane::testing
