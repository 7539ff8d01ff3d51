#include "storebag/BackendCreation.h"

#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/backends/BackendFixture.h"
#include "tests/support/PlatformWith.h"

namespace telvane::testing {
namespace {

// Time goes on with each look at it.
class TickingClock final : public Clock {
 public:
  Date now() const override { return Date(SimulatedClock::kCalendarStart.time() + std::chrono::seconds(_looks++)); }
  MonotonicTime monotonicNow() const override { return {}; }
  int looks() const { return _looks; }

 private:
  mutable int _looks = 0;
};

class BackendCreationTest : public BackendFixture {
 protected:
  BackendTable create(const Dictionary& section) {
    auto table = createBackends(context(), section, _sessionInfo, _userInfo, "device-id");
    EXPECT_TRUE(table.has_value());
    return table.has_value() ? *std::move(table) : BackendTable();
  }
  std::shared_ptr<TelvaneBackend> createOne() {
    const BackendTable table = create(section());
    EXPECT_EQ(table.size(), 1u);
    return table.empty() ? nullptr : table.front().second;
  }
  Dictionary section() const { return {{Key("splunk"), profile()}}; }
  bool allowsNestedDataFor(int32_t type) {
    _sessionInfo.set(kTelvaneSessionInfoClientType, type);
    return createOne()->allowNestedData();
  }

  Dictionary _sessionInfo{{kTelvaneSessionInfoClientType, 6}, {kTelvaneSessionInfoSessionID, 4711}};
};

TEST_F(BackendCreationTest, withoutAStorebagThereIsNothing) {
  log().expectError("createBackends: Attempted to create backends with nil storebag");
  EXPECT_EQ(createBackends(context(), Value(), _sessionInfo, _userInfo, ""), std::nullopt);
  EXPECT_EQ(createBackends(context(), Value(Array()), _sessionInfo, _userInfo, ""), std::nullopt);
  EXPECT_TRUE(hasLines(log(), 2, "createBackends: Attempted to create backends with nil storebag"));
}

TEST_F(BackendCreationTest, withoutSessionInfoThereIsNothing) {
  log().expectError("createBackends: Attempted to create backends with nil session info");
  EXPECT_EQ(createBackends(context(), section(), Value(), _userInfo, ""), std::nullopt);
  EXPECT_EQ(createBackends(context(), section(), Value("text"), _userInfo, ""), std::nullopt);
}

TEST_F(BackendCreationTest, anEmptySectionMakesNone) { EXPECT_TRUE(create({}).empty()); }

TEST_F(BackendCreationTest, entriesThatAreNoBackendsAreLeftOut) {
  log().expectError("TelvaneBackend(newBackendWithName): release_timeout");
  log().expectError("VDRBackend(initWithName): No matching bundle found for client type 6");
  const BackendTable table = create({{Key("vdr"), Dictionary{{Key("active"), true}}},
                                     {Key("release_timeout"), 60},
                                     {Key("my-splunk"), profile()},
                                     {Key("gonzo"), profile()},
                                     {Key("qrs"), 5}});
  ASSERT_EQ(table.size(), 2u);
  EXPECT_EQ(table[0].first, "my-splunk");
  EXPECT_EQ(table[0].second->name(), "my-splunk");
  EXPECT_EQ(table[1].first, "gonzo");
}

TEST_F(BackendCreationTest, theSectionOfTheBuiltInBagMakesOneBackendForThoseClientTypesThatItIsFor) {
  log().expectError("TelvaneBackend(newBackendWithName): release_timeout");
  const Dictionary builtIn{{Key("vdr"), Dictionary{{kProfileActive, true}}}, {Key("release_timeout"), 60}};
  for (const int32_t type : {7, 11, 13}) {
    _sessionInfo.set(kTelvaneSessionInfoClientType, type);
    const BackendTable table = create(builtIn);
    ASSERT_EQ(table.size(), 1u) << type;
    EXPECT_EQ(table[0].first, "vdr");
  }
  // The type 20 shares the bag with them.
  log().expectError("VDRBackend(initWithName): No matching bundle found for client type 20");
  _sessionInfo.set(kTelvaneSessionInfoClientType, 20);
  EXPECT_TRUE(create(builtIn).empty());
}

TEST_F(BackendCreationTest, aDeviceWithoutANameHasNoHTTPSBackend) {
  process().deviceAnswers().remove("DeviceName");
  EXPECT_TRUE(create(section()).empty());
}

TEST_F(BackendCreationTest, userInfoIsRequiredUnlessTheSessionSaysNo) {
  EXPECT_TRUE(createOne()->requireUserInfo());
  _sessionInfo.set(kTelvaneSessionInfoRequireUserInfo, false);
  EXPECT_FALSE(createOne()->requireUserInfo());
  _sessionInfo.set(kTelvaneSessionInfoRequireUserInfo, "no number");
  EXPECT_FALSE(createOne()->requireUserInfo());
}

TEST_F(BackendCreationTest, eventsAreBatchedOnlyWhenTheSessionSaysSo) {
  EXPECT_FALSE(createOne()->batchEvents());
  _sessionInfo.set(kTelvaneSessionInfoBatchEvent, true);
  EXPECT_TRUE(createOne()->batchEvents());
}

TEST_F(BackendCreationTest, theClientVersionIsCutTo16Bits) {
  _sessionInfo.set(kTelvaneSessionInfoClientVersion, 65537);
  EXPECT_EQ(createOne()->clientVersion(), 1);
}

TEST_F(BackendCreationTest, nestedDataIsForOneClientTypeAndForAnotherOnInternalBuilds) {
  EXPECT_TRUE(allowsNestedDataFor(28));
  EXPECT_FALSE(allowsNestedDataFor(7));
  EXPECT_FALSE(allowsNestedDataFor(6));
}

TEST_F(BackendCreationTest, internalBuildsAllowNestedDataToThatOther) {
  givenInternalBuild();
  EXPECT_TRUE(allowsNestedDataFor(28));
  EXPECT_TRUE(allowsNestedDataFor(7));
  EXPECT_FALSE(allowsNestedDataFor(6));
}

TEST_F(BackendCreationTest, stampsWhatEventsTell) {
  process().deviceAnswers().set("ProductType", "Box9,9");
  process().clientBundle().setVersion(String("9.1.2"));
  _sessionInfo.set(kTelvaneSessionInfoClientVersion, 12);
  const auto backend = createOne();
  const auto helper = std::make_shared<RecordingConnectivity>();
  backend->setReportingSessionConnectivityDelegate(helper);
  backend->updateState();
  _world.runUntilIdle();
  _world.advance(std::chrono::seconds(5));
  backend->sendMessage({}, _world.clock().now(), 7, 2, 0);
  const Array events = helper->events(0);
  ASSERT_EQ(events.size(), 1u);
  const Dictionary& event = *events[0].dictionary();
  EXPECT_EQ(event[kEventProductFamily], Value("simulated")) << "the device's name";
  EXPECT_EQ(event[kEventProductModel], Value("Box9,9"));
  EXPECT_EQ(event[kEventOSVersion], Value("12.5"));
  EXPECT_EQ(event[kEventBuild], Value("6.1.0-13"));
  EXPECT_EQ(event[kEventReportVers], Value("9.1.2"));
  EXPECT_EQ(event[kEventClientVersion], Value(12));
  EXPECT_EQ(event[kEventClientTS].realValue() - event[kEventStartTS].realValue(), 5.0);
  EXPECT_EQ(event[kTelvaneUserInfoClientName], Value("player"));
}

TEST_F(BackendCreationTest, withoutABundleTheFrameworkIsVersionEight) {
  process().clientBundle().setVersion(std::nullopt);
  const auto backend = createOne();
  const auto helper = std::make_shared<RecordingConnectivity>();
  backend->setReportingSessionConnectivityDelegate(helper);
  backend->updateState();
  backend->sendMessage({}, _world.clock().now(), 7, 2, 0);
  EXPECT_EQ(RecordingConnectivity::header(helper->request(0), "User-Agent"), "Telvane/8.0 (Simulated1,1; 12.5)");
}

TEST_F(BackendCreationTest, allBackendsOfACallStartAtTheSameTime) {
  TickingClock clock;
  Platform ticking = platformWith(process().platform(), clock);
  const ProcessContext tickingContext{ticking};
  const Dictionary both{{Key("splunk"), profile()}, {Key("gonzo"), profile()}};
  const auto table = createBackends(tickingContext, both, _sessionInfo, _userInfo, "device-id");
  ASSERT_TRUE(table.has_value());
  ASSERT_EQ(table->size(), 2u);
  EXPECT_GT(clock.looks(), 0) << "the time must be that of the clock";
  std::vector<double> times;
  for (const auto& [name, backend] : *table) {
    const auto helper = std::make_shared<RecordingConnectivity>();
    backend->setReportingSessionConnectivityDelegate(helper);
    backend->updateState();
    backend->sendMessage({}, _world.clock().now(), 7, 2, 0);
    times.push_back((*helper->events(0)[0].dictionary())[kEventClientTS].realValue());
  }
  EXPECT_EQ(times[0], times[1]);
}

TEST_F(BackendCreationTest, sessionInfoOfWrongTypesIsReadLeniently) {
  for (const Key& key : {kTelvaneSessionInfoClientType, kTelvaneSessionInfoSessionID, kTelvaneSessionInfoClientVersion,
                         kTelvaneSessionInfoRequireUserInfo, kTelvaneSessionInfoBatchEvent}) {
    for (const Value& value : {Value("text"), Value(Array{1}), Value(-1), Value(1e300), Value(Date())}) {
      _sessionInfo.set(key, value);
      const auto backend = createOne();
      ASSERT_NE(backend, nullptr);
      backend->updateState();
      backend->sendMessage({}, _world.clock().now(), 7, 2, 0);
    }
  }
}

}  // namespace
}  // namespace telvane::testing
