#include "platform/KeyedArchive.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

Data listOf(Dictionary dictionary) {
  return propertylist::serialize(std::move(dictionary), propertylist::Format::Binary).value();
}

Value nested(int levels) {
  Value value = 1;
  for (int level = 1; level < levels; ++level) value = Array{std::move(value)};
  return value;
}

TEST(KeyedArchiveTest, givesBackWhatWasArchived) {
  for (const Value& value : {Value(Array()), Value(Array{1, "two", 3.5, true}), Value("text"), Value(INT64_MIN),
                             Value(Dictionary{{Key("$version"), 7}, {Key("root"), Data::copyOf("x")}})}) {
    const auto archive = keyedarchive::archive(value);
    ASSERT_TRUE(isOk(archive));
    const auto root = keyedarchive::unarchive(*archive);
    ASSERT_TRUE(isOk(root));
    EXPECT_EQ(*root, value);
  }
}

TEST(KeyedArchiveTest, isABinaryPropertyListOfVersionAndRoot) {
  const auto archive = keyedarchive::archive(Array{1});
  ASSERT_TRUE(isOk(archive));
  EXPECT_TRUE(archive->view().starts_with("bplist00"));
  const auto list = propertylist::parse(*archive);
  ASSERT_TRUE(isOk(list));
  EXPECT_EQ(*list, Value(Dictionary{{Key("$version"), 1}, {Key("root"), Array{1}}}));
}

TEST(KeyedArchiveTest, refusesWhatAPropertyListCannotHold) {
  EXPECT_TRUE(isError(keyedarchive::archive(Value()), EINVAL));
  EXPECT_TRUE(isError(keyedarchive::archive(std::string("a\0b", 3)), EINVAL));
  EXPECT_TRUE(isOk(keyedarchive::archive(nested(63))));
  EXPECT_TRUE(isError(keyedarchive::archive(nested(64)), EINVAL));
}

TEST(KeyedArchiveTest, refusesWhatIsNoArchive) {
  EXPECT_TRUE(keyedarchive::unarchive(Data::copyOf("text")).has_error());
  EXPECT_TRUE(isError(keyedarchive::unarchive(listOf({{Key("root"), 1}})), EINVAL));
  EXPECT_TRUE(isError(keyedarchive::unarchive(listOf({{Key("$version"), 1}})), EINVAL));
  EXPECT_TRUE(isError(keyedarchive::unarchive(listOf({{Key("$version"), "1"}, {Key("root"), 1}})), EINVAL));
  EXPECT_TRUE(isError(keyedarchive::unarchive(listOf({{Key("$version"), 2}, {Key("root"), 1}})), ENOTSUP, "version 2"));
}

TEST(KeyedArchiveTest, readsNoMoreThanItIsAllowed) {
  const auto archive = keyedarchive::archive(Array{"some text"});
  ASSERT_TRUE(isOk(archive));
  EXPECT_TRUE(keyedarchive::unarchive(*archive, {.maximumBytes = archive->size() - 1}).has_error());
  EXPECT_TRUE(isOk(keyedarchive::unarchive(*archive, {.maximumBytes = archive->size()})));
}

}  // namespace
}  // namespace telvane::testing
