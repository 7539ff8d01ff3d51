// The daemon as a whole, with real clients of the library on the same simulated machine.
#include <regex>

#include "client/ClientContext.h"
#include "client/TelvaneFactory.h"
#include "client/include/telvane/Telvane.h"
#include "interfaces/EventKeys.h"
#include "tests/daemon/DaemonFixture.h"
#include "tests/support/RecordingConnectivity.h"
#include "tests/support/Seeds.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

class TelvanedServiceTest : public DaemonFixture {
 protected:
  // A run of a daemon that fetches its bag, two client processes and a slow network; returns everybody's log.
  static std::string run(uint64_t seed, SimulatedScheduler::Interleaving interleaving);
};

Dictionary clientSessionInfo() {
  return {{kTelvaneSessionInfoClientType, 6},
          {kTelvaneSessionInfoClientVersion, 3},
          {kTelvaneSessionInfoBatchEvent, true},
          {kTelvaneSessionInfoRequireUserInfo, true}};
}

// A client names its session by its address, which is no part of the simulation.
std::string withoutAddresses(const std::string& text) {
  return std::regex_replace(text, std::regex("client session 0x[0-9a-f]+"), "client session");
}

// One client process that configures a session, sends ten events, flushes and ends.
class ReportingProcess {
 public:
  ReportingProcess(SimulatedWorld& world, const char* name)
      : _context(world.makeProcess(name, {.entitlements = {kTelvanedEntitlement}}).platform()),
        _session(TelvaneFactory::initWithSessionInfo(
            _context, clientSessionInfo(),
            Dictionary{{kTelvaneUserInfoClientName, name}, {kTelvaneUserInfoServiceName, "movies"}})) {
    _session->startConfigurationWithCompletionHandler({});
    for (int n = 0; n < 10; ++n) {
      EXPECT_TRUE(_session->sendMessageWithCategory(7, 1, Dictionary{{Key("from"), name}, {Key("n"), n}}));
    }
    _session->flushMessagesWithCompletion([this](const std::optional<Error>& error) {
      _isFlushed = true;
      EXPECT_FALSE(error.has_value()) << error->description();
    });
  }
  bool isFlushed() const { return _isFlushed; }
  void end() { _session.reset(); }

 private:
  ClientContext _context;
  std::shared_ptr<Telvane> _session;
  bool _isFlushed = false;
};

std::string TelvanedServiceTest::run(uint64_t seed, SimulatedScheduler::Interleaving interleaving) {
  SimulatedWorld world(seed);
  world.scheduler().setInterleaving(interleaving);
  world.services().setLatency({0ms, 2ms});
  SimulatedPlatform& daemon = world.makeProcess("telvaned");
  daemon.clientBundle().setPublicKey(StorebagBuilder::publicKey());
  EXPECT_TRUE(isOk(daemon.userDefaults().setObject(kTelvaneDefaultsSuite.view(), kDefaultsStorebagURL.view(),
                                                   "https://bags.example")));
  daemon.log().expectError("loadStorebagFromDisk");
  world.network().answer("https://bags.example", NetworkAnswer::ok(StorebagBuilder().envelope()).after(3s));
  world.network().answer(StorebagBuilder::kPostURL, NetworkAnswer::ok().after(20ms));
  TelvanedService service(daemon.platform());
  EXPECT_TRUE(isOk(service.start()));
  ReportingProcess first(world, "first");
  ReportingProcess second(world, "second");
  EXPECT_TRUE(world.runUntil([&] { return first.isFlushed() && second.isFlushed(); }, 1min));
  first.end();
  second.end();
  EXPECT_TRUE(
      world.runUntil([&] { return daemon.transactions().begun() == 1 && daemon.transactions().open() == 0; }, 2min));
  size_t events = 0;
  for (const RecordedRequest& request : world.network().requestsTo(StorebagBuilder::kPostURL)) {
    const Value body = RecordingConnectivity::bodyValue(request.request);
    events += (*body.dictionary())[kBodyEvents].array()->size();
  }
  EXPECT_EQ(events, 24u) << "ten events, a start and a stop of each";
  world.end();
  return withoutAddresses(world.text());
}

TEST_F(TelvanedServiceTest, startsByOpeningItsServiceAndSaysSo) {
  startDaemon();
  EXPECT_TRUE(world.services().isServed(kTelvanedServiceName));
  EXPECT_TRUE(hasLines(log(), 1, "startLogging: Daemon starts logging..."));
  EXPECT_TRUE(hasLines(log(), 1, "main: Listener resumes with sandbox, start loop."));
}

TEST_F(TelvanedServiceTest, aSecondDaemonOnTheSameNameFails) {
  startDaemon();
  SimulatedPlatform& other = world.makeProcess("second");
  TelvanedService second(other.platform());
  EXPECT_FALSE(isOk(second.start()));
  EXPECT_TRUE(hasNoLine(other.log(), "main: Listener resumes"));
}

TEST_F(TelvanedServiceTest, runsTheSameToTheByteOfTheLogForTheSameSeed) {
  for (const auto interleaving :
       {SimulatedScheduler::Interleaving::AtWaits, SimulatedScheduler::Interleaving::AtCalls}) {
    forEachSeed(5, [interleaving](uint64_t seed) {
      const std::string log = run(seed, interleaving);
      EXPECT_THAT(log, ::testing::HasSubstr("telvaned <default> sendMessageWithDictionary: Sending message"));
      EXPECT_EQ(log, run(seed, interleaving));
    });
  }
}

TEST_F(TelvanedServiceTest, losesNothingWhateverRunsFirst) {
  forEachSeed(30, [](uint64_t seed) { run(seed, SimulatedScheduler::Interleaving::AtCalls); });
}

TEST_F(TelvanedServiceTest, aClientKilledInMidSessionLeavesNothingBehind) {
  givenStorebag();
  startDaemon();
  SimulatedPlatform& victim = world.makeProcess("victim", {.entitlements = {kTelvanedEntitlement}});
  DaemonClient client(world, victim);
  client.setSessionInfo(sessionInfo(), userInfo());
  client.start();
  client.send(7);
  victim.kill();
  world.runUntilIdle();
  EXPECT_TRUE(sessions().empty());
  EXPECT_EQ(postedEvents(7, 1).size(), 1u);
  world.advance(31s);
  EXPECT_EQ(process.transactions().open(), 0);
}

TEST_F(TelvanedServiceTest, aThousandSessionsInARowLeaveNothingBehind) {
  givenStorebag();
  for (int i = 0; i < 1000; ++i) startSession()->send(7);
  EXPECT_TRUE(sessions().empty());
  EXPECT_EQ(postedEvents(7, 1).size(), 1000u);
  world.advance(31s);
  EXPECT_EQ(process.transactions().open(), 0);
  EXPECT_EQ(process.transactions().surplusEnds(), 0);
}

}  // namespace
}  // namespace telvane::testing
