#include "foundation/Key.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

constexpr Key kKey{"_clientName"};

TEST(KeyTest, knowsTextAndHashAtCompileTime) {
  static_assert(kKey.view() == "_clientName");
  static_assert(kKey.hash() == keyHash("_clientName"));
  EXPECT_EQ(kKey.string(), "_clientName");
}

TEST(KeyTest, hashesAsFNV1aDoes) {
  EXPECT_EQ(keyHash(""), 0x811c9dc5u);
  EXPECT_EQ(keyHash("a"), 0xe40c292cu);
  EXPECT_EQ(keyHash("foobar"), 0xbf9cf968u);
}

TEST(KeyTest, comparesByText) {
  EXPECT_TRUE(kKey == Key("_clientName"));
  EXPECT_TRUE(kKey == std::string_view("_clientName"));
  EXPECT_TRUE(kKey == String("_clientName"));
  EXPECT_FALSE(kKey == Key("_clientname"));
}

}  // namespace
}  // namespace telvane::testing
