#include "foundation/String.h"

#include <gtest/gtest.h>

#include <map>
#include <unordered_set>
#include <vector>

#include "foundation/Key.h"
#include "tests/foundation/AllocationCounter.h"

namespace telvane::testing {
namespace {

TEST(StringTest, isEmptyByDefault) {
  const String text;
  EXPECT_TRUE(text.empty());
  EXPECT_EQ(text.size(), 0u);
  EXPECT_EQ(text.view(), "");
}

TEST(StringTest, copiesTheBytesItIsMadeOf) {
  std::string original = "facetious";
  const String text(original);
  original[0] = 'X';
  EXPECT_EQ(text, "facetious");
  EXPECT_EQ(text.str(), "facetious");
}

TEST(StringTest, keepsZeroBytes) {
  const std::string_view original("a\0b", 3);
  EXPECT_EQ(String(original).size(), 3u);
  EXPECT_EQ(String(original).view(), original);
}

TEST(StringTest, sharesTheBytesWithItsCopies) {
  const String text("shared");
  String copy;
  const size_t allocations = allocationsDuring([&] {
    const String first(text);
    copy = first;
  });
  EXPECT_EQ(allocations, 0u);
  EXPECT_EQ(copy.view().data(), text.view().data());
}

TEST(StringTest, staysAliveThroughItsCopies) {
  String copy;
  {
    const String text("longer than any small buffer could hold it inside");
    copy = text;
  }
  EXPECT_EQ(copy, "longer than any small buffer could hold it inside");
}

TEST(StringTest, isEmptyAfterItWasMovedFrom) {
  String text("moved");
  const char* bytes = text.view().data();
  const String taken(std::move(text));
  EXPECT_EQ(taken.view().data(), bytes);
  EXPECT_TRUE(text.empty());
  text = String("again");
  EXPECT_EQ(text, "again");
}

TEST(StringTest, survivesAssignmentFromItself) {
  String text("same");
  const String& alias = text;
  text = alias;
  EXPECT_EQ(text, "same");
  text = std::move(const_cast<String&>(alias));
  EXPECT_EQ(text, "same");
}

TEST(StringTest, refersToStaticTextWithoutAllocating) {
  static constexpr std::string_view kText = "static text";
  const size_t allocations = allocationsDuring([] {
    const String text = String::fromStatic(kText);
    const String copy(text);
    EXPECT_EQ(copy.view().data(), kText.data());
  });
  EXPECT_EQ(allocations, 0u);
}

TEST(StringTest, needsOneAllocationForItsBytes) {
  EXPECT_EQ(allocationsDuring([] { const String text("one buffer, head and bytes together"); }), 1u);
  EXPECT_EQ(allocationsDuring([] { const String text(""); }), 0u);
}

TEST(StringTest, comparesAndOrdersByBytes) {
  EXPECT_EQ(String("a"), String("a"));
  EXPECT_NE(String("a"), String("A"));
  EXPECT_EQ(String("a"), std::string("a"));
  EXPECT_EQ(std::string_view("a"), String("a"));
  EXPECT_LT(String("a"), String("ab"));
  EXPECT_LT(String("Z"), String("a"));
  EXPECT_GT(String("\xC3\xA4"), String("z"));
}

TEST(StringTest, isAKeyOfStandardContainers) {
  const std::map<String, int> ordered{{"b", 2}, {"a", 1}};
  EXPECT_EQ(ordered.begin()->first, "a");
  const std::unordered_set<String> hashed{"x", "y", "x"};
  EXPECT_EQ(hashed.size(), 2u);
}

TEST(StringTest, isMadeOfAKeyWithoutAllocating) {
  static constexpr Key kKey{"_clientName"};
  const size_t allocations = allocationsDuring([] {
    const String text = kKey;
    EXPECT_TRUE(text == kKey);
    EXPECT_TRUE(kKey == text);
    EXPECT_EQ(text.view().data(), kKey.view().data());
  });
  EXPECT_EQ(allocations, 0u);
}

TEST(StringBufferTest, holdsAllItsStringsInOneAllocation) {
  std::vector<String> slices;
  slices.reserve(3);
  const size_t allocations = allocationsDuring([&] {
    StringBuffer buffer(9);
    for (const char* text : {"one", "two", "six"}) slices.push_back(buffer.append(text));
  });
  EXPECT_EQ(allocations, 1u);
  EXPECT_EQ(slices[0], "one");
  EXPECT_EQ(slices[1], "two");
  EXPECT_EQ(slices[2], "six");
  EXPECT_EQ(slices[0].view().data() + 6, slices[2].view().data());
}

TEST(StringBufferTest, livesUntilTheLastSliceIsGone) {
  auto buffer = std::make_unique<StringBuffer>(64);
  auto first = std::make_unique<String>(buffer->append("first slice of the batch"));
  String second = buffer->append("second slice of the batch");
  buffer.reset();
  first.reset();
  const String copy = second;
  second = String();
  EXPECT_EQ(copy, "second slice of the batch");
}

TEST(StringBufferTest, outlivesItsSlices) {
  StringBuffer buffer(8);
  { const String slice = buffer.append("gone"); }
  EXPECT_EQ(buffer.append("stay"), "stay");
}

TEST(StringBufferTest, givesTextThatDoesNotFitABufferOfItsOwn) {
  StringBuffer buffer(4);
  const String fitting = buffer.append("abc");
  const String tooLong = buffer.append("de");
  const String lastByte = buffer.append("f");
  const String full = buffer.append("g");
  EXPECT_EQ(fitting, "abc");
  EXPECT_EQ(tooLong, "de");
  EXPECT_EQ(lastByte.view().data(), fitting.view().data() + 3);
  EXPECT_EQ(full, "g");
}

TEST(StringBufferTest, needsNoMemoryForEmptyText) {
  const size_t allocations = allocationsDuring([] {
    StringBuffer buffer(0);
    EXPECT_TRUE(buffer.append("").empty());
  });
  EXPECT_EQ(allocations, 0u);
}

}  // namespace
}  // namespace telvane::testing
