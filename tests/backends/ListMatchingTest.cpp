#include "backends/ListMatching.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

TEST(ListMatchingTest, anEmptyListAnswersWithTheFlag) {
  for (const bool flag : {true, false}) {
    EXPECT_EQ(matchExactStringWithList({}, "name", flag), flag);
    EXPECT_EQ(matchStringWithList({}, "name", flag), flag);
    EXPECT_EQ(matchExactStringWithList({}, {}, flag), flag) << "the list counts before the text";
  }
}

TEST(ListMatchingTest, absentTextAnswersWithTheOppositeOfTheFlag) {
  for (const bool flag : {true, false}) {
    EXPECT_EQ(matchExactStringWithList({"name"}, {}, flag), !flag);
    EXPECT_EQ(matchStringWithList({"name"}, {}, flag), !flag);
  }
}

TEST(ListMatchingTest, exactMatchingDisregardsCaseAndNothingElse) {
  EXPECT_TRUE(matchExactStringWithList({"a", "Player"}, "pLAYER", false));
  EXPECT_FALSE(matchExactStringWithList({"Player"}, "Players", true));
  EXPECT_FALSE(matchExactStringWithList({" Player"}, "Player", true));
}

TEST(ListMatchingTest, partMatchingFindsAnElementInTheTextWithoutRegardToCase) {
  EXPECT_TRUE(matchStringWithList({"media"}, "StreamMediaPlayer", false));
  EXPECT_FALSE(matchStringWithList({"StreamMediaPlayer"}, "media", true));
}

TEST(ListMatchingTest, anEmptyElementIsInNoText) {
  EXPECT_FALSE(matchStringWithList({""}, "US", true));
  EXPECT_FALSE(matchExactStringWithList({""}, "US", true));
  EXPECT_TRUE(matchExactStringWithList({""}, "", false));
}

TEST(ListMatchingTest, splitsTextAtCommasAndKeepsBlanks) {
  const Value text("A, B,,");
  EXPECT_EQ(namesSeparatedByCommas(text), (NameList{"A", " B", "", ""}));
  EXPECT_EQ(namesSeparatedByCommas(Value("")), NameList{""});
  EXPECT_TRUE(namesSeparatedByCommas(Value(5)).empty());
  EXPECT_TRUE(namesSeparatedByCommas(Value()).empty());
}

TEST(ListMatchingTest, anElementThatIsNoTextMatchesNothingButKeepsTheListFromBeingEmpty) {
  const Value list(Array{5, "US"});
  EXPECT_EQ(namesOfArray(list), (NameList{"", "US"}));
  EXPECT_FALSE(matchStringWithList(namesOfArray(Value(Array{5})), "5", true));
  EXPECT_TRUE(namesOfArray(Value("US")).empty());
}

}  // namespace
}  // namespace telvane::testing
