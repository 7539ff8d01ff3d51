#include <gmock/gmock.h>

#include "tests/connectivity/ConnectivityHelperFixture.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using Helper = ReportingSessionConnectivityHelper;

class ConnectivityHelperLifetimeTest : public ConnectivityHelperFixture {};

TEST_F(ConnectivityHelperLifetimeTest, decrementingAtZeroLeavesZeroAndStartsTheReleaseTimer) {
  givenActiveHelper(Helper::POSTRequestMode(), 30);
  decrement();
  EXPECT_THAT(toldCounts, IsEmpty());
  EXPECT_EQ(log().count("Starting connectivity helper release timer"), 1u);
  world.advance(std::chrono::seconds(29));
  EXPECT_THAT(toldCounts, IsEmpty());
  world.advance(std::chrono::seconds(2));
  EXPECT_THAT(toldCounts, ElementsAre(0u));
  EXPECT_EQ(log().count("release timer fired"), 1u);
}

TEST_F(ConnectivityHelperLifetimeTest, tellsTheOwnerAtOnceWhenOthersStillUseIt) {
  givenActiveHelper(Helper::POSTRequestMode());
  increment();
  increment();
  decrement();
  EXPECT_THAT(toldCounts, ElementsAre(1u));
  EXPECT_EQ(log().count("is greater than 0. Notifying owner that _usageCount=1, _totalSessionsServedCount=0"), 1u);
}

TEST_F(ConnectivityHelperLifetimeTest, anIncrementWhileTheTimerRunsTellsTheOwnerOnceWithTheNewCount) {
  givenActiveHelper(Helper::POSTRequestMode(), 30);
  increment();
  decrement();
  world.advance(std::chrono::seconds(10));
  increment();
  EXPECT_THAT(toldCounts, ElementsAre(1u));
  world.advance(std::chrono::minutes(10));
  EXPECT_THAT(toldCounts, ElementsAre(1u));
  EXPECT_EQ(log().count("release timer fired"), 0u);
}

TEST_F(ConnectivityHelperLifetimeTest, eachStartedTimerTellsItsOwnerOnceHoweverFastTheyFollow) {
  givenActiveHelper(Helper::POSTRequestMode(), 30);
  for (int i = 0; i < 3; ++i) {
    helper->ownerIncrementUsageCount();
    helper->ownerDecrementUsageCountWithBlock([this](uint32_t count) { toldCounts.push_back(count); }, ownerQueue);
  }
  world.runUntilIdle();
  world.advance(std::chrono::seconds(31));
  EXPECT_EQ(toldCounts.size(), 3u);
  EXPECT_EQ(toldCounts.back(), 0u);
  EXPECT_EQ(log().count("release timer fired"), 1u);
}

TEST_F(ConnectivityHelperLifetimeTest, aReleaseTimeoutOfZeroIsEverLastingAndGivesTransactionsBackAtOnce) {
  givenActiveHelper(Helper::POSTRequestMode(), 0);
  increment();
  helper->incrementTotalSessionsServedCount();
  decrement();
  EXPECT_THAT(toldCounts, ElementsAre(1u));
  EXPECT_THAT(delegate->released, ElementsAre(1u));
  EXPECT_EQ(log().count("Special case of dealing with ever-lasting connectivity helper"), 1u);
  world.advance(std::chrono::hours(24));
  EXPECT_THAT(toldCounts, ElementsAre(1u));
}

TEST_F(ConnectivityHelperLifetimeTest, activatingTwiceOnlyLogsButTakesTheSecondReleaseTimeout) {
  givenActiveHelper(Helper::POSTRequestMode(), 30);
  helper->activate(300);
  world.runUntilIdle();
  EXPECT_EQ(log().count("activate: connectivity helper is already active for NSURLSession with ID <"), 1u);
  EXPECT_EQ(log().count("NSURLSession created and activated with ID <"), 1u);
  decrement();
  world.advance(std::chrono::seconds(299));
  EXPECT_THAT(toldCounts, IsEmpty());
  world.advance(std::chrono::seconds(2));
  EXPECT_THAT(toldCounts, ElementsAre(0u));
}

TEST_F(ConnectivityHelperLifetimeTest, invalidatingAnInactiveHelperGivesItsTransactionsBackAtOnce) {
  givenHelper(Helper::POSTRequestMode());
  helper->incrementTotalSessionsServedCount();
  helper->incrementTotalSessionsServedCount();
  helper->invalidate();
  world.runUntilIdle();
  EXPECT_THAT(delegate->released, ElementsAre(2u));
  EXPECT_EQ(log().count("ReportingSessionConnectivityHelper:invalidate: release 2 XPC transactions for inactive "
                        "connectivity helper"),
            1u);
}

TEST_F(ConnectivityHelperLifetimeTest, invalidatingAnActiveHelperLetsRequestsEndBeforeTransactionsComeBack) {
  world.network().answer("https://collector.example/", NetworkAnswer::ok().after(std::chrono::seconds(5)));
  givenActiveHelper(Helper::POSTRequestMode());
  helper->incrementTotalSessionsServedCount();
  post();
  helper->invalidate();
  world.runUntilIdle();
  EXPECT_THAT(delegate->released, IsEmpty());
  world.advance(std::chrono::seconds(6));
  EXPECT_EQ(completions.size(), 1u);
  EXPECT_THAT(delegate->released, ElementsAre(1u));
  EXPECT_EQ(log().count("didBecomeInvalidWithError: release 1 XPC transactions for session "), 1u);
}

TEST_F(ConnectivityHelperLifetimeTest, namesItselfInactiveUntilItHasASession) {
  givenHelper(Helper::POSTRequestMode());
  helper->incrementTotalSessionsServedCount();
  EXPECT_EQ(log().count("Total Sessions Served Count is incremented for NSURLSession with ID <inactive>"), 1u);
  EXPECT_EQ(log().count("ReportingSessionConnectivityHelper created with delegate 0"), 1u);
}

struct ModeRow {
  int32_t mode;
  bool isBackground;
  bool isDiscretionary;
  bool requiresExternalPower;
  bool isBackgroundServiceType;
};

class ConnectivityHelperModeTest : public ConnectivityHelperFixture, public ::testing::WithParamInterface<ModeRow> {};

TEST_P(ConnectivityHelperModeTest, configuresTheURLSession) {
  world.network().answer("https://collector.example/", NetworkAnswer::ok());
  ASSERT_TRUE(process.platform().files.createDirectory(Helper::storageRootFolder()).has_value());
  givenActiveHelper(GetParam().mode);
  const bool isPOST = GetParam().mode == 1 || GetParam().mode == 4;
  if (isPOST)
    post();
  else
    get();
  ASSERT_EQ(world.network().requests().size(), 1u);
  const URLSessionConfiguration& configuration = world.network().requests().front().configuration;
  EXPECT_EQ(configuration.backgroundIdentifier.has_value(), GetParam().isBackground);
  EXPECT_EQ(configuration.isDiscretionary, GetParam().isDiscretionary);
  EXPECT_EQ(configuration.requiresExternalPower, GetParam().requiresExternalPower);
  EXPECT_EQ(configuration.isBackgroundServiceType, GetParam().isBackgroundServiceType);
  EXPECT_TRUE(configuration.waitsForConnectivity);
  EXPECT_EQ(configuration.sourceApplicationBundleIdentifier, "com.corvex.system.diagnostics");
  EXPECT_EQ(configuration.sourceApplicationSecondaryIdentifier, "phone:calls");
}

INSTANTIATE_TEST_SUITE_P(Modes, ConnectivityHelperModeTest,
                         ::testing::Values(ModeRow{1, true, true, true, true}, ModeRow{2, true, true, false, false},
                                           ModeRow{4, false, false, false, false},
                                           ModeRow{8, false, false, false, false}));

TEST_F(ConnectivityHelperLifetimeTest, aModeThatDoesNotExistMakesNoSession) {
  givenActiveHelper(16);
  EXPECT_EQ(log().count("NSURLSession created and activated"), 0u);
}

TEST_F(ConnectivityHelperLifetimeTest, cleaningTheStorageRootDeletesNothing) {
  const std::string container = Helper::storageRootFolder() + "/left.tvndiag";
  ASSERT_TRUE(process.platform().files.createDirectory(Helper::storageRootFolder()).has_value());
  ASSERT_TRUE(process.platform().files.write(container, Data::copyOf("left")).has_value());
  Helper::cleanupStorageRootFolder(process.platform());
  EXPECT_TRUE(process.platform().files.read(container, 10).has_value());
}

}  // namespace
}  // namespace telvane::testing
