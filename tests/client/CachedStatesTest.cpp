#include "client/CachedStates.h"

#include <gtest/gtest.h>

#include <thread>

namespace telvane::testing {
namespace {

TEST(CachedStatesTest, letsEverythingPassBeforeTheFirstAnswer) {
  const CachedStates states;
  EXPECT_TRUE(states.isWhitelistedEvent(1));
  EXPECT_FALSE(states.isBlacklistedEvent(1));
  EXPECT_TRUE(states.mayBeSent(65535));
  EXPECT_FALSE(states.enabledBackendNames().isPresent());
}

TEST(CachedStatesTest, letsOnlyWhitelistedCategoriesPass) {
  CachedStates states;
  states.store({}, Array{7, 9}, {});
  EXPECT_TRUE(states.mayBeSent(7));
  EXPECT_TRUE(states.mayBeSent(9));
  EXPECT_FALSE(states.mayBeSent(8));
  EXPECT_FALSE(states.isWhitelistedEvent(8));
}

TEST(CachedStatesTest, refusesBlacklistedCategoriesEvenWhenTheyAreWhitelisted) {
  CachedStates states;
  states.store({}, Array{7}, Array{7});
  EXPECT_TRUE(states.isWhitelistedEvent(7));
  EXPECT_TRUE(states.isBlacklistedEvent(7));
  EXPECT_FALSE(states.mayBeSent(7));
}

TEST(CachedStatesTest, takesEmptyListsForNoLists) {
  CachedStates states;
  states.store({}, Array{}, Array{});
  EXPECT_TRUE(states.isWhitelistedEvent(8));
  EXPECT_FALSE(states.isBlacklistedEvent(8));
}

TEST(CachedStatesTest, readsTheElementsOfAListAsIntegers) {
  CachedStates states;
  states.store({}, Array{"7", 8.9, true}, {});
  EXPECT_TRUE(states.mayBeSent(7));
  EXPECT_TRUE(states.mayBeSent(8));
  EXPECT_TRUE(states.mayBeSent(1));
  EXPECT_FALSE(states.mayBeSent(9));
}

TEST(CachedStatesTest, comparesWholeNumbersNotTheirLowBits) {
  CachedStates states;
  states.store({}, Array{65543, -1}, {});
  EXPECT_FALSE(states.mayBeSent(7)) << "65543 has the low 16 bits of 7, but is another number";
  EXPECT_FALSE(states.mayBeSent(65535)) << "-1 has the low 16 bits of 65535, but is another number";
}

TEST(CachedStatesTest, takesWhatIsNoArrayForAbsent) {
  CachedStates states;
  states.store("splunk", "7", Dictionary{{Key("7"), 7}});
  EXPECT_TRUE(states.mayBeSent(8));
  EXPECT_TRUE(states.mayBeSent(7));
  EXPECT_FALSE(states.enabledBackendNames().isPresent());
}

TEST(CachedStatesTest, forgetsTheListsOfAnEarlierAnswer) {
  CachedStates states;
  states.store(Array{"splunk"}, Array{7}, Array{9});
  states.store({}, {}, {});
  EXPECT_TRUE(states.mayBeSent(8));
  EXPECT_TRUE(states.mayBeSent(9));
  EXPECT_FALSE(states.enabledBackendNames().isPresent());
}

TEST(CachedStatesTest, isReadWhileItIsWritten) {
  CachedStates states;
  std::thread writer([&states] {
    for (int i = 0; i < 2000; ++i) {
      states.store({}, Array{7}, Array{7});
      states.store({}, Array{8}, {});
    }
  });
  int passes = 0;
  for (int i = 0; i < 2000; ++i) passes += states.mayBeSent(7) ? 1 : 0;
  writer.join();
  EXPECT_LE(passes, 2000);
  EXPECT_FALSE(states.mayBeSent(7));
  EXPECT_TRUE(states.mayBeSent(8));
}

}  // namespace
}  // namespace telvane::testing
