#include "foundation/Error.h"

#include <gtest/gtest.h>

#include <memory>
#include <stdexcept>

namespace telvane::testing {
namespace {

constexpr Key kDomain{"TelvaneErrorDomain"};

Result<int64_t> half(int64_t number) {
  if (number % 2 != 0) return Error(kDomain, 5);
  return number / 2;
}

Result<void> check(bool isGood) {
  if (!isGood) return Error::withDescription(kDomain, 6, "not good");
  return {};
}

Result<Dictionary> settings(bool isThere) {
  if (!isThere) return Error{kPlatformErrorDomain, 2};
  return Dictionary{{"a", 1}};
}

Result<std::unique_ptr<int>> resource() { return std::make_unique<int>(7); }

TEST(ErrorTest, isDescribedByItsText) {
  const Error error = Error::withDescription(kDomain, 3, "Something went wrong");
  EXPECT_EQ(error.domain(), kDomain);
  EXPECT_EQ(error.code(), 3);
  EXPECT_EQ(error.description(), "Something went wrong");
  EXPECT_EQ(error.userInfo(), (Dictionary{{Error::kLocalizedDescription, "Something went wrong"}}));
}

TEST(ErrorTest, isDescribedByDomainAndCodeWithoutAText) {
  EXPECT_EQ(Error(kDomain, -3).description(), "TelvaneErrorDomain error -3");
  EXPECT_EQ(Error("other", 1, Dictionary{{Error::kLocalizedDescription, 12}}).description(), "other error 1");
}

TEST(ErrorTest, keepsAnEmptyText) { EXPECT_EQ(Error::withDescription(kDomain, 3, "").description(), ""); }

TEST(ErrorTest, comparesDomainCodeAndUserInfo) {
  EXPECT_EQ(Error(kDomain, 1), Error(kDomain, 1));
  EXPECT_NE(Error(kDomain, 1), Error(kDomain, 2));
  EXPECT_NE(Error(kDomain, 1), Error("other", 1));
  EXPECT_NE(Error(kDomain, 1), Error::withDescription(kDomain, 1, "text"));
}

TEST(ResultTest, holdsAValue) {
  const auto result = half(4);
  ASSERT_TRUE(result.has_value());
  EXPECT_TRUE(static_cast<bool>(result));
  EXPECT_EQ(*result, 2);
  EXPECT_EQ(result.value(), 2);
}

TEST(ResultTest, holdsAnError) {
  const auto result = half(3);
  ASSERT_FALSE(result);
  EXPECT_EQ(result.error(), Error(kDomain, 5));
  EXPECT_EQ(settings(false).error().domain(), kPlatformErrorDomain);
}

TEST(ResultTest, mayHoldNothing) {
  EXPECT_TRUE(check(true));
  ASSERT_FALSE(check(false));
  EXPECT_EQ(check(false).error().description(), "not good");
}

TEST(ResultTest, movesItsValueOut) {
  auto result = resource();
  ASSERT_TRUE(result);
  const std::unique_ptr<int> owned = std::move(result).value();
  EXPECT_EQ(*owned, 7);
  EXPECT_EQ((*settings(true))["a"], 1);
}

TEST(ResultTest, passesAnErrorOn) {
  const auto outer = []() -> Result<Dictionary> {
    auto inner = half(1);
    if (!inner) return inner.error();
    return Dictionary();
  };
  EXPECT_EQ(outer().error().code(), 5);
}

TEST(ResultTest, throwsWhenTheValueOfAFailureIsRead) {
  EXPECT_THROW((void)half(3).value(), std::logic_error);
  EXPECT_THROW(check(false).value(), std::logic_error);
}

}  // namespace
}  // namespace telvane::testing
