// Which section of a bag is handed out, and what goes with it.
#include "tests/storebag/StorebagFixture.h"

namespace telvane::testing {
namespace {

class StorebagEnvironmentTest : public StorebagFixture {
 protected:
  // A section that tells its own name by the one backend in it.
  static Dictionary named(const char* name) { return StorebagBuilder::section(name); }
  static StorebagBuilder allSections() {
    return StorebagBuilder()
        .set(kEnvironmentDevelopment, named("d"))
        .set(kEnvironmentInternal, named("i"))
        .set(kEnvironmentSeed, named("s"))
        .set(kEnvironmentRelease, named("r"));
  }
  // The name of the section that a device with that "environmentType" gets.
  std::string sectionFor(Value environmentType) {
    givenDefault(kDefaultsEnvironmentType, std::move(environmentType));
    givenCachedEnvelope(allSections().envelope());
    const auto section = fetch().section;
    return section.has_value() ? std::string(section->begin()->key.view()) : "nothing";
  }
  int32_t maxAgeFor(Value refreshCycle) {
    givenCachedEnvelope(StorebagBuilder().set(kStorebagRefreshCycle, std::move(refreshCycle)).envelope(), 77);
    return fetch().maxAge;
  }
};

TEST_F(StorebagEnvironmentTest, theDefaultsChooseTheSection) {
  EXPECT_EQ(sectionFor(1), "d");
  EXPECT_EQ(sectionFor(2), "i");
  EXPECT_EQ(sectionFor(3), "s");
  EXPECT_EQ(sectionFor(4), "r");
  EXPECT_TRUE(hasLine(log(), "userDefaultsEnvironment: Environment type 3"));
}

TEST_F(StorebagEnvironmentTest, withoutADefaultACustomersDeviceGetsRelease) { EXPECT_EQ(sectionFor(Value()), "r"); }

TEST_F(StorebagEnvironmentTest, withoutADefaultAnInternalDeviceGetsInternal) {
  process.deviceAnswers().set("ReleaseType", "Internal");
  EXPECT_EQ(sectionFor(Value()), "i");
}

TEST_F(StorebagEnvironmentTest, aNumberBeyondTheKnownOnesCountsAsInternal) {
  log().expectError("userDefaultsEnvironment: Invalid environment type 7");
  EXPECT_EQ(sectionFor(7), "i");
}

TEST_F(StorebagEnvironmentTest, aNegativeNumberCountsAsInternal) {
  log().expectError("userDefaultsEnvironment: Invalid environment type 4294967295");
  EXPECT_EQ(sectionFor(-1), "i");
}

TEST_F(StorebagEnvironmentTest, environment0HasNoSection) {
  log().expectError(
      "fetchStorebagForEnvironmentAndClientType: Could not find storebag for client type 6 with (null) environment");
  EXPECT_EQ(sectionFor(0), "nothing");
}

TEST_F(StorebagEnvironmentTest, theDefaultIsReadAnewEachTime) {
  EXPECT_EQ(sectionFor(1), "d");
  EXPECT_EQ(sectionFor(4), "r");
}

TEST_F(StorebagEnvironmentTest, seedFallsBackToRelease) {
  givenDefault(kDefaultsEnvironmentType, 3);
  givenCachedEnvelope(StorebagBuilder().envelope());
  log().expectError("fetchStorebagForEnvironmentAndClientType: Seed section is missing in the storebag.");
  EXPECT_EQ(fetch().section, StorebagBuilder::section("splunk"));
  EXPECT_TRUE(hasLines(log(), 2, "userDefaultsEnvironment: Environment type 3"));
}

TEST_F(StorebagEnvironmentTest, noOtherSectionFallsBack) {
  givenDefault(kDefaultsEnvironmentType, 1);
  givenCachedEnvelope(StorebagBuilder().envelope());
  log().expectError("Could not find storebag for client type 6 with development environment");
  EXPECT_FALSE(fetch().section.has_value());
}

TEST_F(StorebagEnvironmentTest, aSectionThatIsNoDictionaryCountsAsAbsent) {
  log().expectError("Could not find storebag for client type 6 with release environment");
  for (const Value& section : {Value("text"), Value(1), Value(Array{1}), Value(true)}) {
    givenCachedEnvelope(StorebagBuilder().set(kEnvironmentRelease, section).envelope());
    EXPECT_FALSE(fetch().section.has_value()) << description(section);
  }
}

TEST_F(StorebagEnvironmentTest, theReleaseTimeoutTravelsInTheSection) {
  givenCachedEnvelope(StorebagBuilder().set(kStorebagReleaseTimeout, 60).envelope());
  const auto section = fetch().section;
  ASSERT_TRUE(section.has_value());
  EXPECT_EQ((*section)[kStorebagReleaseTimeout], Value(60));
  EXPECT_TRUE(section->contains("splunk"));
}

TEST_F(StorebagEnvironmentTest, theRefreshCycleOverridesTheServersMaxAge) {
  EXPECT_EQ(maxAgeFor(60), 60);
  EXPECT_TRUE(hasLine(log(), "fetchStorebagForEnvironmentAndClientType: Store bag override MaxAge=60"));
}
TEST_F(StorebagEnvironmentTest, theRefreshCycleIsADayAtMost) { EXPECT_EQ(maxAgeFor(100000), 86400); }
TEST_F(StorebagEnvironmentTest, aNegativeRefreshCyclePassesThrough) { EXPECT_EQ(maxAgeFor(-5), -5); }
TEST_F(StorebagEnvironmentTest, anAbsentRefreshCycleLeavesTheServersMaxAge) { EXPECT_EQ(maxAgeFor(Value()), 77); }
TEST_F(StorebagEnvironmentTest, aRefreshCycleThatIsNoNumberCountsAs0) { EXPECT_EQ(maxAgeFor(Array{1}), 0); }

TEST_F(StorebagEnvironmentTest, clientTypesWithoutANameGetNothing) {
  for (const int32_t type : {0, 4, 31, -1}) {
    log().expectError(fmt::format("Could not find storebag name for client type {}", type));
    EXPECT_FALSE(fetch(type).section.has_value()) << type;
  }
  EXPECT_TRUE(world.network().requests().empty());
}

TEST(StorebagNamesTest, areSharedBySomeTypesAndElseOnesOwn) {
  const auto name = StorebagRetriever::storebagNameForClientType;
  EXPECT_EQ(name(6), name(14));
  EXPECT_EQ(name(6), name(15));
  for (const int32_t type : {11, 13, 20}) EXPECT_EQ(name(7), name(type)) << type;
  std::set<std::string_view> names;
  for (int32_t type = 5; type <= 30; ++type) names.insert(name(type).value());
  EXPECT_EQ(names.size(), 21u);
  EXPECT_EQ(name(4), std::nullopt);
  EXPECT_EQ(name(31), std::nullopt);
}

}  // namespace
}  // namespace telvane::testing
