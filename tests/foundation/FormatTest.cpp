#include "foundation/Format.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

constexpr Key kKey{"_clientName"};

TEST(FormatTest, writesValuesAsTheirDescriptions) {
  EXPECT_EQ(fmt::format("{}", String("text")), "text");
  EXPECT_EQ(fmt::format("{}", kKey), "_clientName");
  EXPECT_EQ(fmt::format("{} {} {}", Value(), Value(1.5), Value("a b")), "(null) 1.5 a b");
  EXPECT_EQ(fmt::format("{}", Array{"a b"}), "(\n    \"a b\"\n)");
  EXPECT_EQ(fmt::format("{}", Dictionary{{"a", 1}}), "{\n    a = 1;\n}");
  EXPECT_EQ(fmt::format("{}", Data::copyOf("\x0f")), "<0f>");
  EXPECT_EQ(fmt::format("{}", Date()), "1970-01-01 00:00:00 +0000");
  EXPECT_EQ(fmt::format("{}", Error::withDescription("domain", 1, "went wrong")), "went wrong");
  EXPECT_EQ(fmt::format("{}", UUID()), "00000000-0000-0000-0000-000000000000");
}

TEST(FormatTest, followsWidthAndAlignment) {
  EXPECT_EQ(fmt::format("[{:>6}]", Value(42)), "[    42]");
  EXPECT_EQ(fmt::format("[{:<6}]", String("ab")), "[ab    ]");
}

}  // namespace
}  // namespace telvane::testing
