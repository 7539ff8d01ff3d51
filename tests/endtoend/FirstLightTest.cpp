#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "interfaces/EventKeys.h"
#include "tests/endtoend/Instance.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;

class FirstLightTest : public ::testing::Test {
 protected:
  FirstLightTest() {
    instance.startCollector();
    instance.givenStorebag("conferencing", openBag(instance.collectorURL("/events")));
    instance.startDaemon();
  }
  bool arrives(size_t count) {
    return eventually([this, count] { return instance.arrivedWithCategory(21).size() >= count; });
  }
  Instance instance;
};

TEST_F(FirstLightTest, anEventTravelsFromAClientProcessToTheCollector) {
  const std::string said = instance.sendEvents({"--count", "3"});
  EXPECT_THAT(said, HasSubstr("configured: [splunk]"));
  EXPECT_THAT(said, HasSubstr("flushed: ok"));
  ASSERT_TRUE(arrives(3)) << instance.daemonLog();
  const auto events = instance.arrivedWithCategory(21);
  ASSERT_EQ(events.size(), 3u);
  const Dictionary& event = *events[1]["event"].dictionary();
  EXPECT_EQ(event["number"], Value(1));
  EXPECT_EQ(event["text"], Value("event 1"));
  EXPECT_EQ(event["isEven"], Value(false));
  EXPECT_EQ(event[kEventSender], Value("CONFERENCE"));
  EXPECT_EQ(event[kEventClientVersion], Value(3));
  EXPECT_EQ(event["_clientName"], Value("sender"));
  const Dictionary& headers = *events[1]["headers"].dictionary();
  EXPECT_EQ(headers["X-TVN-Client-Name"], Value("sender"));
  EXPECT_EQ(headers["X-TVN-Sender"], Value("CONFERENCE"));
  EXPECT_EQ(headers["Content-Encoding"], Value("gzip"));
}

TEST_F(FirstLightTest, aSessionSaysWhenItStartsAndWhenItStops) {
  instance.sendEvents({});
  ASSERT_TRUE(eventually([this] { return instance.arrivedWithCategory(0).size() >= 2; })) << instance.daemonLog();
  const auto events = instance.arrivedWithCategory(0);
  EXPECT_EQ((*events[0]["event"].dictionary())[kEventStatus], Value(0));
  EXPECT_EQ((*events[0]["event"].dictionary())[kEventLocale], Value("US"));
  EXPECT_EQ((*events[1]["event"].dictionary())[kEventStatus], Value(1));
  EXPECT_EQ((*events[1]["event"].dictionary())[kEventStorebagVersion], Value("test-1"));
  EXPECT_EQ((*events[1]["event"].dictionary())[kEventGracefulTermination].booleanValue(), true);
}

TEST_F(FirstLightTest, whatWasSentBeforeTheSessionWasLetGoStillArrives) {
  instance.sendEvents({"--count", "20", "--no-flush"});
  EXPECT_TRUE(arrives(20)) << instance.daemonLog();
}

TEST_F(FirstLightTest, aThousandEventsArriveOnceEach) {
  instance.sendEvents({"--count", "1000"});
  ASSERT_TRUE(arrives(1000));
  std::set<int64_t> numbers;
  for (const Dictionary& line : instance.arrivedWithCategory(21)) {
    numbers.insert((*line["event"].dictionary())["number"].integerValue());
  }
  EXPECT_EQ(instance.arrivedWithCategory(21).size(), 1000u);
  EXPECT_EQ(numbers.size(), 1000u);
}

TEST_F(FirstLightTest, theStorebagIsCachedAsItWasSigned) {
  instance.sendEvents({});
  EXPECT_EQ(instance.read("home/Library/Caches/telvaned/storebags/conferencing"),
            instance.read("storebags/conferencing"));
  EXPECT_TRUE(eventually([this] {
    return instance.daemonLogHas("storebag 'conferencing' has been saved to disk cache");
  })) << instance.daemonLog();
}

TEST_F(FirstLightTest, theCachedStorebagServesADaemonWhoseServerIsGone) {
  instance.sendEvents({});
  ASSERT_TRUE(arrives(3));
  instance.daemon().signal(SIGTERM);
  instance.daemon().wait();
  instance.givenStorebagServer("https://127.0.0.1:1/storebags");
  instance.startDaemon();
  EXPECT_THAT(instance.sendEvents({}), HasSubstr("configured: [splunk]"));
  EXPECT_TRUE(arrives(6));
}

TEST_F(FirstLightTest, aClientTypeWithoutAPublishedBagIsToldNothing) {
  EXPECT_THAT(instance.sendEvents({"--client-type", "8"}), HasSubstr("configured: nothing"));
}

}  // namespace
}  // namespace telvane::testing
