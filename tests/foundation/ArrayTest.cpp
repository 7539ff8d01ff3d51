#include <gtest/gtest.h>

#include "foundation/Value.h"
#include "tests/foundation/AllocationCounter.h"

namespace telvane::testing {
namespace {

TEST(ArrayTest, isEmptyByDefaultWithoutAllocating) {
  const size_t allocations = allocationsDuring([] {
    const Array array;
    EXPECT_TRUE(array.empty());
    EXPECT_EQ(array.begin(), array.end());
  });
  EXPECT_EQ(allocations, 0u);
}

TEST(ArrayTest, listsItsElementsInOrder) {
  const Array array{1, "two", 3.0, true};
  ASSERT_EQ(array.size(), 4u);
  EXPECT_EQ(array[0], 1);
  EXPECT_EQ(array[1], "two");
  EXPECT_EQ(array[2], 3.0);
  EXPECT_EQ(array[3], true);
  EXPECT_EQ(array.end() - array.begin(), 4);
}

TEST(ArrayTest, givesAnAbsentValueBeyondItsEnd) {
  EXPECT_FALSE(Array()[0].isPresent());
  EXPECT_FALSE((Array{1})[1].isPresent());
  EXPECT_FALSE((Array{1})[SIZE_MAX].isPresent());
}

TEST(ArrayTest, appendsAndReplaces) {
  Array array;
  for (int i = 0; i < 100; ++i) array.append(i);
  array.replace(50, "fifty");
  EXPECT_EQ(array.size(), 100u);
  EXPECT_EQ(array[49], 49);
  EXPECT_EQ(array[50], "fifty");
}

TEST(ArrayTest, sharesItsStorageWithCopies) {
  const Array array{1, 2, 3};
  const size_t allocations = allocationsDuring([&] {
    const Array copy = array;
    EXPECT_EQ(copy.begin(), array.begin());
  });
  EXPECT_EQ(allocations, 0u);
}

TEST(ArrayTest, changesOnlyTheCopyThatIsChanged) {
  const Array original{1, 2};
  Array appended = original;
  appended.append(3);
  Array replaced = original;
  replaced.replace(0, "one");
  Array reserved = original;
  reserved.reserve(10);
  EXPECT_EQ(original, (Array{1, 2}));
  EXPECT_EQ(appended, (Array{1, 2, 3}));
  EXPECT_EQ(replaced, (Array{"one", 2}));
  EXPECT_EQ(reserved, original);
}

TEST(ArrayTest, changesInPlaceWhenItIsTheOnlyOwner) {
  Array array;
  array.reserve(10);
  const Value* place = array.begin();
  { const Array copy = array; }
  for (int i = 0; i < 10; ++i) array.append(i);
  EXPECT_EQ(array.begin(), place);
}

TEST(ArrayTest, holdsItselfAsItWas) {
  Array array{1};
  array.append(array);
  EXPECT_EQ(array, (Array{1, Array{1}}));
}

TEST(ArrayTest, isEmptyAfterItWasMovedFrom) {
  Array array{1, 2};
  const Array taken = std::move(array);
  EXPECT_TRUE(array.empty());
  EXPECT_EQ(taken.size(), 2u);
}

TEST(ArrayTest, mayBeAssignedFromWithinItself) {
  Array array{Value(Array{1, 2})};
  array = *array[0].array();
  EXPECT_EQ(array, (Array{1, 2}));
  const Array& alias = array;
  array = alias;
  EXPECT_EQ(array, (Array{1, 2}));
}

TEST(ArrayTest, keepsAbsentValues) {
  const Array array{Value(), 1};
  EXPECT_EQ(array.size(), 2u);
  EXPECT_FALSE(array[0].isPresent());
}

TEST(ArrayTest, comparesElementByElement) {
  EXPECT_EQ((Array{1, Array{"x"}}), (Array{1, Array{"x"}}));
  EXPECT_NE((Array{1, 2}), (Array{2, 1}));
  EXPECT_NE((Array{1}), (Array{1, 2}));
  EXPECT_NE((Array{1}), (Array{true}));
  EXPECT_EQ(Array(), Array{});
}

TEST(ArrayTest, givesAnElementAwayAndKeepsItsPlace) {
  Array array{1, "two", 3};
  EXPECT_EQ(array.take(1), Value("two"));
  EXPECT_EQ(array, (Array{1, Value(), 3}));
  EXPECT_FALSE(array.take(3).isPresent());
}

TEST(ArrayTest, leavesOtherOwnersWhatItGivesAway) {
  Array array{1, "two"};
  const Array other = array;
  EXPECT_EQ(array.take(1), Value("two"));
  EXPECT_EQ(other, (Array{1, "two"}));
}

TEST(ArrayTest, costsOneAllocationWithItsElements) {
  EXPECT_EQ(allocationsDuring([] {
              Array array;
              array.reserve(40);
              for (int i = 0; i < 40; ++i) array.append(i);
            }),
            1u);
}

}  // namespace
}  // namespace telvane::testing
