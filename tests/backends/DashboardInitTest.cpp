// How a dashboard backend comes to be, or does not.
#include <gmock/gmock.h>

#include <cerrno>
#include <cmath>
#include <system_error>

#include "tests/backends/DashboardFixture.h"
#include "tests/support/NotedTimers.h"
#include "tests/support/PassingDispatch.h"
#include "tests/support/PlatformWith.h"

namespace telvane::testing {
namespace {

class DashboardInitTest : public DashboardFixture {
 protected:
  // Nothing was made and nothing is left.
  void expectNone(const std::string& errorLine) {
    log().expectError(errorLine);
    EXPECT_EQ(tryToMake(), nullptr);
    _world.runUntilIdle();
    EXPECT_EQ(network().openSockets(), 0u);
    EXPECT_TRUE(hasLines(log(), 1, errorLine));
    EXPECT_EQ(log().lines().size(), 1u) << log().text();
  }
  // The period in which the timer looks after what was not acknowledged: the first retransmission comes after two.
  std::chrono::milliseconds periodWith(Value reliable) {
    _profile.set(kProfileReliable, std::move(reliable));
    make();
    dashboard().clear();
    send({});
    _world.advance(std::chrono::minutes(3));
    const auto& arrivals = dashboard().arrivals();
    if (arrivals.size() < 2) return {};
    return std::chrono::duration_cast<std::chrono::milliseconds>(arrivals[1].at - arrivals[0].at) / 2;
  }
};

TEST_F(DashboardInitTest, isMadeByTheFactoryAndEnabled) {
  const auto backend = TelvaneBackend::newBackendWithName(context(), "dashboard", _profile, String("Box"), 6);
  ASSERT_NE(backend, nullptr);
  EXPECT_EQ(backend->name(), "dashboard");
  EXPECT_EQ(backend->updateState(), TelvaneBackendStateEnabled);
  EXPECT_FALSE(backend->isHTTPSPostBackend());
  EXPECT_EQ(backend->displayURL(), std::nullopt);
}

TEST_F(DashboardInitTest, needsAnIP) {
  _profile = Dictionary{{kProfilePort, kPort}};
  expectNone("DashboardBackend(initWithName): can't resolve server IP");
  EXPECT_EQ(network().socketsMade(), 0u);
}

TEST_F(DashboardInitTest, takesAnIPThatIsNoTextForNone) {
  _profile.set(kProfileIP, 3221225991);
  expectNone("DashboardBackend(initWithName): can't resolve server IP");
}

TEST_F(DashboardInitTest, needsAPort) {
  _profile = Dictionary{{kProfileIP, kIP}};
  expectNone("DashboardBackend(initWithName): can't resolve server port");
  EXPECT_EQ(network().socketsMade(), 0u);
}

TEST_F(DashboardInitTest, needsASocket) {
  network().faults().newSocket = EMFILE;
  expectNone("DashboardBackend(initWithName): socket() failed (24)");
}

TEST_F(DashboardInitTest, needsAnAddressWhenThereIsNoProfile) {
  log().expectError("DashboardBackend(initWithName): initWitName with all null params.");
  EXPECT_EQ(DashboardBackend::initWithName(context(), "dashboard", Value(), String("Box")), nullptr);
  EXPECT_EQ(DashboardBackend::initWithName(context(), "dashboard", Value("text"), String("Box")), nullptr);
  EXPECT_EQ(network().socketsMade(), 2u);
  EXPECT_EQ(network().openSockets(), 0u);
}

TEST_F(DashboardInitTest, ofAnAddressSaysNothingWhenThereIsNoIP) {
  EXPECT_EQ(DashboardBackend::initWithName(context(), "dashboard", std::nullopt, kPort, String("Box")), nullptr);
  EXPECT_TRUE(log().lines().empty());
  EXPECT_EQ(network().socketsMade(), 0u);
}

TEST_F(DashboardInitTest, ofAnAddressIsReliableWithAPeriodOf500Milliseconds) {
  take(DashboardBackend::initWithName(context(), "dashboard", String(kIP), kPort, String("Box")));
  send({});
  _world.advance(std::chrono::milliseconds(999));
  EXPECT_EQ(dashboard().arrivals().size(), 1u);
  _world.advance(std::chrono::milliseconds(1));
  EXPECT_EQ(dashboard().arrivals().size(), 2u);
}

TEST_F(DashboardInitTest, prefersTheProfilesAddress) {
  auto& other = network().serve("192.0.2.8", kPort);
  take(DashboardBackend::initWithName(context(), "dashboard", _profile, String("192.0.2.8"), kPort, String("Box")));
  send({});
  EXPECT_EQ(dashboard().arrivals().size(), 1u);
  EXPECT_TRUE(other.arrivals().empty());
}

TEST_F(DashboardInitTest, needsAnIPThatIsADottedAddress) {
  const char* line = "DashboardBackend(initWithName): socket connect() failed.";
  log().expectError(line);
  size_t tried = 0;
  for (const char* ip : {"", "dashboard.example", "localhost", "192.0.2", "192.0.2.256", "192.0.2.7 ", " 192.0.2.7",
                         "192.0.2.7.1", "0x7f.1.1.1", "::1", "192.0.2.-1", "192.0.2.7192.0.2.7192.0.2.7", "\n"}) {
    _profile.set(kProfileIP, ip);
    EXPECT_EQ(tryToMake(), nullptr) << ip;
    EXPECT_TRUE(hasLines(log(), ++tried, line)) << ip;
  }
  _world.runUntilIdle();
  EXPECT_EQ(network().openSockets(), 0u);
}

TEST_F(DashboardInitTest, needsASocketThatConnects) {
  network().faults().connect = EACCES;
  expectNone("DashboardBackend(initWithName): socket connect() failed.");
  log().clear();
  givenReliable();
  expectNone("DashboardBackend(initWithName): socket connect() failed.");
}

TEST_F(DashboardInitTest, takesTheLow16BitsOfAPort) {
  for (const Value& port : {Value(65536 + kPort), Value(9000.9), Value("9000"), Value(int64_t{kPort} - 65536)}) {
    _profile.set(kProfilePort, port);
    dashboard().clear();
    make();
    send({});
    EXPECT_EQ(dashboard().arrivals().size(), 1u) << ::testing::PrintToString(port);
  }
}

TEST_F(DashboardInitTest, bearsPortsOfEveryKind) {
  for (const Value& port : {Value(0), Value(-1), Value("none"), Value(Array{1}), Value(Dictionary()), Value(1e300),
                            Value(std::nan("")), Value(UINT64_MAX), Value(Data::copyOf("x")), Value(Date())}) {
    _profile.set(kProfilePort, port);
    make();
    send({});
    cleanupAndLetGo();
    _world.advance(std::chrono::seconds(20));
    EXPECT_EQ(network().openSockets(), 0u) << ::testing::PrintToString(port);
  }
}

TEST_F(DashboardInitTest, takesTheDisplayURLAndBearsWhatIsNone) {
  _profile.set(kProfileDisplayURL, "https://dashboard.example/show");
  EXPECT_EQ(make().displayURL(), String("https://dashboard.example/show"));
  _profile.set(kProfileDisplayURL, 7);
  _profile.set(kProfilePostURL, Array());
  EXPECT_EQ(make().displayURL(), std::nullopt);
}

TEST_F(DashboardInitTest, takesThePeriodFromReliable) {
  using std::chrono::milliseconds;
  EXPECT_EQ(periodWith(250), milliseconds(250));
  EXPECT_EQ(periodWith("250"), milliseconds(250));
  EXPECT_EQ(periodWith(250.9), milliseconds(250));
}

TEST_F(DashboardInitTest, boundsThePeriod) {
  using std::chrono::milliseconds;
  for (const Value& none : {Value(0), Value(-1), Value(INT64_MIN), Value("no"), Value(Array{1}), Value(std::nan(""))}) {
    EXPECT_EQ(periodWith(none), milliseconds(500)) << ::testing::PrintToString(none);
  }
  for (const Value& brief : {Value(1), Value(9), Value(10), Value(true)}) {
    EXPECT_EQ(periodWith(brief), milliseconds(10)) << ::testing::PrintToString(brief);
  }
  for (const Value& lengthy : {Value(60000), Value(60001), Value(INT64_MAX), Value(1e300)}) {
    EXPECT_EQ(periodWith(lengthy), milliseconds(60000)) << ::testing::PrintToString(lengthy);
  }
}

TEST_F(DashboardInitTest, withoutReliableKeepsNothing) {
  make();
  send({});
  _world.advance(std::chrono::minutes(1));
  EXPECT_EQ(dashboard().arrivals().size(), 1u);
}

TEST_F(DashboardInitTest, staysUnreliableWhenTheSocketCannotBeBound) {
  givenReliable();
  network().faults().bind = EADDRINUSE;
  log().expectError("DashboardBackend(useReliableUDP): can't bind socket, 98");
  make();
  send({});
  _world.advance(std::chrono::minutes(1));
  EXPECT_EQ(dashboard().arrivals().size(), 1u);
  cleanupAndLetGo();
  EXPECT_EQ(network().openSockets(), 0u);
}

TEST_F(DashboardInitTest, staysReliableWithoutAReader) {
  givenReliable();
  network().faults().hasNoReadSources = true;
  log().expectError("DashboardBackend(useReliableUDP): can't create read source");
  make();
  send({});
  acknowledge(1);
  tick(30);
  EXPECT_EQ(dashboard().arrivals().size(), 5u) << "nobody reads the acknowledgement";
  cleanupAndLetGo();
  EXPECT_EQ(network().openSockets(), 0u);
}

// Has so many timers and then none any more, and says so in one of two ways.
class TimerlessDispatch final : public PassingDispatch {
 public:
  TimerlessDispatch(Dispatch& dispatch, bool throws, int timers = 0)
      : PassingDispatch(dispatch), _throws(throws), _timers(timers) {}
  std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                  std::chrono::nanoseconds leeway, Job onFire, Job onCancel) override {
    if (_timers > 0) {
      --_timers;
      return PassingDispatch::newTimer(std::move(queue), delay, leeway, std::move(onFire), std::move(onCancel));
    }
    if (_throws) throw std::system_error(EAGAIN, std::generic_category());
    return nullptr;
  }

 private:
  const bool _throws;
  int _timers;
};

// So that a device with many such timers wakes up for several of them at once.
TEST_F(DashboardInitTest, letsEachTickComeUpTo100MillisecondsLate) {
  NotedTimers noted(_process.platform().dispatch);
  Platform platform = platformWith(_process.platform(), noted);
  const ProcessContext context(platform);
  givenReliable();
  take(DashboardBackend::initWithName(context, "dashboard", _profile, String("Box")));
  tick(2);
  EXPECT_THAT(noted.leeways(), ::testing::ElementsAre(std::chrono::milliseconds(100), std::chrono::milliseconds(100),
                                                      std::chrono::milliseconds(100)));
  letGo();
  _world.runUntilIdle();
}

class DashboardWithoutATimerTest : public DashboardInitTest, public ::testing::WithParamInterface<bool> {};

TEST_P(DashboardWithoutATimerTest, isNotMade) {
  const Platform& usual = _process.platform();
  TimerlessDispatch timerless(usual.dispatch, GetParam());
  Platform platform = platformWith(usual, timerless);
  const ProcessContext withoutTimers(platform);
  const char* line = "DashboardBackend(initWithName): can't create timer source.";
  log().expectError(line);
  EXPECT_EQ(DashboardBackend::initWithName(withoutTimers, "dashboard", _profile, String("Box")), nullptr);
  givenReliable();
  EXPECT_EQ(DashboardBackend::initWithName(withoutTimers, "dashboard", _profile, String("Box")), nullptr);
  _world.runUntilIdle();
  EXPECT_TRUE(hasLines(log(), 2, line));
  EXPECT_EQ(network().openSockets(), 0u);
}

TEST_P(DashboardWithoutATimerTest, saysOnceThatItHasNoneAnyMoreAndStillSendsEachEventOnce) {
  // For three ticks.
  TimerlessDispatch timerless(_process.platform().dispatch, GetParam(), 3);
  Platform platform = platformWith(_process.platform(), timerless);
  const ProcessContext fading(platform);
  const char* line = "DashboardBackend(myPeriodicTask): no timer for the next tick. Nothing is sent again any more";
  log().expectError(line);
  givenReliable();
  take(DashboardBackend::initWithName(fading, "dashboard", _profile, String("Box")));
  send({});
  tick(30);
  EXPECT_THAT(arrivalPeriods(), ::testing::ElementsAre(0, 2));
  EXPECT_TRUE(hasLines(log(), 1, line));
  send({});
  tick(30);
  EXPECT_THAT(arrivalPeriods(), ::testing::ElementsAre(0, 2, 30));
  cleanupAndLetGo();
  _world.advance(std::chrono::seconds(10));
  EXPECT_EQ(network().openSockets(), 0u);
}

INSTANTIATE_TEST_SUITE_P(Ways, DashboardWithoutATimerTest, ::testing::Bool(),
                         [](const auto& way) { return way.param ? "thrown" : "null"; });

}  // namespace
}  // namespace telvane::testing
