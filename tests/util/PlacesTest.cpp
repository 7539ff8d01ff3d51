#include "util/Places.h"

#include <gtest/gtest.h>

#include <optional>

namespace telvane::testing {
namespace {

TEST(PlacesTest, areAsManyAsWereSaidAndCanBeTakenAgain) {
  Places places(2);
  Places::Place one = places.take();
  const Places::Place two = places.take();
  EXPECT_NE(one, nullptr);
  EXPECT_NE(two, nullptr);
  EXPECT_EQ(places.take(), nullptr);
  EXPECT_EQ(places.take(), nullptr) << "a refusal takes nothing";
  one.reset();
  EXPECT_NE(places.take(), nullptr);
}

TEST(PlacesTest, mayOutliveWhatTheyAreOf) {
  std::optional<Places> places(std::in_place, 1u);
  Places::Place place = places->take();
  places.reset();
  EXPECT_NE(place, nullptr);
  place.reset();
}

}  // namespace
}  // namespace telvane::testing
