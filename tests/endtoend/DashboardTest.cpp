// Events on their way to a live dashboard: a real daemon, real datagrams, and dashboards that lose, delay, repeat and
// mix up what they do.
#include <gmock/gmock.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <map>
#include <optional>
#include <set>
#include <sstream>

#include "bench/KeptConnection.h"
#include "foundation/Description.h"
#include "interfaces/EventKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "platform/KeyedArchive.h"
#include "tests/endtoend/DatagramRelay.h"
#include "tests/endtoend/LiveDashboard.h"
#include "tests/endtoend/WireFixture.h"

namespace telvane::testing {
namespace {

using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

constexpr uint16_t kEvent = 21;
constexpr uint16_t kLate = 22;
constexpr int kEvents = 5;
// Long enough for an acknowledgement to come between two of them on a busy machine.
constexpr int kPeriod = 100;

class DashboardTest : public WireFixture {
 protected:
  // A bag that sends everything to the dashboard. period: in milliseconds; 0 for a dashboard that is not reliable.
  void givenDashboardAt(uint16_t port, int period) {
    Dictionary profile{{kProfileIP, "127.0.0.1"}, {kProfilePort, port}};
    if (period != 0) profile.set(kProfileReliable, period);
    Dictionary section;
    section.set("dashboard", profile);
    givenSection(section);
  }
  static ClientScript sending(int count = kEvents) {
    ClientScript script;
    script.open(sessionInfo(), userInfo()).configure();
    for (int n = 0; n < count; ++n) script.send(kEvent, 1, Dictionary{{Key("n"), n}});
    return script;
  }
  // The copies that have come of each event of that category.
  static std::vector<int> copies(const LiveDashboard& dashboard, uint16_t category) {
    std::map<uint16_t, int> count;
    for (const auto& datagram : dashboard.datagrams(category)) ++count[datagram.eventID()];
    std::vector<int> copies;
    for (const auto& [eventID, number] : count) copies.push_back(number);
    return copies;
  }
  static bool haveCome(const LiveDashboard& dashboard, uint16_t category, int number) {
    return eventually([&] {
      const std::vector<int> counts = copies(dashboard, category);
      return counts.size() == kEvents &&
             std::all_of(counts.begin(), counts.end(), [number](int n) { return n >= number; });
    });
  }
};

TEST_F(DashboardTest, getsEachEventOfASessionInItsOrder) {
  LiveDashboard dashboard;
  givenDashboardAt(dashboard.port(), 0);
  startDaemon();
  EXPECT_THAT(run(sending()), HasSubstr("configured: [dashboard]"));
  stopDaemon();
  // The daemon ends when each event was tried once; on this machine it has come then.
  ASSERT_TRUE(eventually([&dashboard] { return dashboard.datagrams().size() >= kEvents + 2; }));
  const auto datagrams = dashboard.datagrams();
  ASSERT_EQ(datagrams.size(), kEvents + 2u);
  for (size_t index = 0; index < datagrams.size(); ++index) EXPECT_EQ(datagrams[index].eventID(), index + 1);
  EXPECT_EQ(datagrams.front().category(), 0) << "the session's start";
  EXPECT_EQ(datagrams.front().type(), 0);
  EXPECT_EQ(datagrams.back().category(), 0) << "and its stop";
  EXPECT_EQ(datagrams.back().type(), 1);
  EXPECT_THAT(dashboard.texts(kEvent), ElementsAre(" n=0", " n=1", " n=2", " n=3", " n=4"));
  EXPECT_EQ(datagrams.front().number(62), 0) << "flags: not reliable, from a bag";
}

TEST_F(DashboardTest, getsLostEventsAgainUntilItAcknowledges) {
  LiveDashboard dashboard([](LiveDashboard& self, const LiveDashboard::Datagram& datagram) {
    const bool isTaken = datagram.category() == kEvent && datagram.copy == 3;
    if (isTaken || datagram.category() == 0) self.acknowledge(datagram);
  });
  givenDashboardAt(dashboard.port(), kPeriod);
  startDaemon();
  ClientScript script = sending();
  script.wait().send(kLate, 1, Dictionary());
  const auto client = start(script);
  ASSERT_TRUE(haveCome(dashboard, kEvent, 3)) << instance().daemonLog();
  // One that is never acknowledged shows that time has passed: it comes five times, also when its session has ended,
  // and the others not again.
  expectEnd(*client);
  ASSERT_TRUE(eventually([&dashboard] { return copies(dashboard, kLate) == std::vector{5}; }));
  EXPECT_THAT(copies(dashboard, kEvent), Each(3));
}

TEST_F(DashboardTest, mayAcknowledgeLateInAnyOrderAndMoreThanOnce) {
  Mutex mutex;
  std::vector<LiveDashboard::Datagram> held;
  LiveDashboard dashboard([&](LiveDashboard& self, const LiveDashboard::Datagram& datagram) {
    if (datagram.category() == kLate) return;
    if (datagram.category() != kEvent) return self.acknowledge(datagram);
    MutexLock lock(mutex);
    if (datagram.copy == 1) held.push_back(datagram);
    if (held.size() < kEvents) return;
    for (auto last = held.rbegin(); last != held.rend(); ++last) {
      self.acknowledge(*last);
      self.acknowledge(*last);
    }
  });
  givenDashboardAt(dashboard.port(), kPeriod);
  startDaemon();
  ClientScript script = sending();
  script.send(kLate, 1, Dictionary()).wait();
  const auto client = start(script);
  ASSERT_TRUE(eventually([&dashboard] { return copies(dashboard, kLate) == std::vector{5}; }))
      << instance().daemonLog();
  EXPECT_THAT(copies(dashboard, kEvent), Each(::testing::Lt(5))) << "an acknowledged one is not sent to the end";
  EXPECT_EQ(copies(dashboard, kEvent).size(), static_cast<size_t>(kEvents));
  expectEnd(*client);
}

TEST_F(DashboardTest, doesNotKeepADaemonFromEnding) {
  LiveDashboard dashboard([](LiveDashboard&, const LiveDashboard::Datagram&) {});
  // A minute to the next look at what is not acknowledged, longer than this test waits for an end.
  givenDashboardAt(dashboard.port(), 60000);
  startDaemon();
  EXPECT_THAT(run(sending()), HasSubstr("configured: [dashboard]"));
  instance().daemon().signal(SIGTERM);
  EXPECT_EQ(instance().daemon().wait(), 0);
  EXPECT_TRUE(eventually([&dashboard] { return dashboard.datagrams().size() == kEvents + 2; })) << "each once";
}

TEST_F(DashboardTest, thatIsNotThereHarmsNobody) {
  uint16_t port = 0;
  {
    const LiveDashboard gone;
    port = gone.port();
  }
  givenDashboardAt(port, kPeriod);
  startDaemon();
  EXPECT_THAT(run(sending(100)), HasSubstr("configured: [dashboard]"));
  EXPECT_TRUE(eventually([this] {
    return instance().daemonLogHas("DashboardBackend(myPeriodicTask): scheduled last resort clean-up in 9500 ms.");
  })) << instance().daemonLog();
  EXPECT_THAT(run(sending()), HasSubstr("configured: [dashboard]"));
  stopDaemon();
}

TEST_F(DashboardTest, sessionsEndWhenTheirLastEventsAreAcknowledged) {
  LiveDashboard dashboard([](LiveDashboard& self, const LiveDashboard::Datagram& datagram) {
    if (datagram.copy == 2) self.acknowledge(datagram);
  });
  givenDashboardAt(dashboard.port(), kPeriod);
  startDaemon();
  run(sending());
  EXPECT_TRUE(eventually([this] {
    return instance().daemonLogHas("DashboardBackend(myPeriodicTask): clean up at myPeriodicTask.");
  })) << instance().daemonLog();
  EXPECT_THAT(copies(dashboard, kEvent), Each(2));
  stopDaemon();
}

TEST_F(DashboardTest, isToldWhereUploadedLogDataLie) {
  LiveDashboard dashboard;
  Dictionary section;
  section.set("dashboard", Dictionary{{kProfileIP, "127.0.0.1"},
                                      {kProfilePort, dashboard.port()},
                                      {kProfilePostURL, server().url("/logdata")}});
  givenSection(section);
  givenPostsAnsweredBy([](const WireRequest&) { return WireServer::answer(200, "https://logs.example/7?a=b"); });
  startDaemon();
  const Array logData{Dictionary{{Key("LogData"), "line\n"}, {Key("StartTime"), 1}, {Key("EndTime"), 2}}};
  ClientScript script;
  script.open(sessionInfo(), userInfo()).configure().uploadLogData(logData);
  EXPECT_THAT(run(script), HasSubstr("log data uploaded: yes")) << instance().daemonLog();
  ASSERT_EQ(posts().size(), 1u);
  EXPECT_EQ(posts().front().target(), "/logdata");
  EXPECT_EQ(posts().front().header("Content-Type"), "application/octet-stream");
  const auto archived = keyedarchive::unarchive(Data::copyOf(posts().front().body));
  ASSERT_TRUE(archived.has_value());
  EXPECT_EQ(*archived, Value(logData));
  EXPECT_TRUE(eventually([&dashboard] {
    const std::vector<std::string> texts = dashboard.texts(0);
    return std::find(texts.begin(), texts.end(), " LogDataUploadLocation=https://logs.example/7?a\\=b") != texts.end();
  }));
  stopDaemon();
}

// A dashboard that never acknowledges: what the schedule says happens to everything.
class SilentDashboardTest : public DashboardTest {
 protected:
  static constexpr int kTransmissions = 5;

  // Copies of the event with that ID.
  int copiesOf(uint16_t eventID) const {
    const auto datagrams = _dashboard.datagrams();
    return static_cast<int>(std::count_if(datagrams.begin(), datagrams.end(),
                                          [eventID](const auto& datagram) { return datagram.eventID() == eventID; }));
  }
  bool comeFiveTimes(uint16_t first, uint16_t last) const {
    return eventually([this, first, last] {
      for (uint16_t eventID = first; eventID <= last; ++eventID) {
        if (copiesOf(eventID) < kTransmissions) return false;
      }
      return true;
    });
  }
  bool isWaiting(int times) {
    return eventually([this, times] {
      const std::string said = instance().read("client.out");
      int count = 0;
      for (size_t at = 0; (at = said.find("waiting\n", at)) != std::string::npos; ++at) ++count;
      return count >= times;
    });
  }

  const LiveDashboard _dashboard{[](LiveDashboard&, const LiveDashboard::Datagram&) {}};
};

// In the order in which they were sent, each time. A tick may be late, never early: the n-th behind an event comes n -
// 1 whole periods later at the soonest.
TEST_F(SilentDashboardTest, getsEachEventFiveTimesAtTheTimesOfTheSchedule) {
  constexpr std::chrono::milliseconds kTestPeriod{150};
  constexpr std::array<int, kTransmissions> kTicks = {0, 2, 5, 10, 19};
  givenDashboardAt(_dashboard.port(), kTestPeriod.count());
  startDaemon();
  ClientScript script;
  script.open(sessionInfo(), userInfo()).configure().wait();
  for (int n = 0; n < kEvents; ++n) script.send(kEvent, 1, Dictionary{{Key("n"), n}});
  const auto client = start(script.wait());
  ASSERT_TRUE(isWaiting(1));
  const auto begin = LiveDashboard::Clock::now();
  client->writeLine();
  // The session's start is event 1.
  ASSERT_TRUE(comeFiveTimes(2, kEvents + 1)) << instance().daemonLog();
  // What ends the session is sent as often, which takes as long again.
  expectEnd(*client);
  ASSERT_TRUE(comeFiveTimes(kEvents + 2, kEvents + 2)) << instance().daemonLog();
  EXPECT_THAT(copies(_dashboard, kEvent), Each(kTransmissions)) << "and then no more";
  std::map<int, std::vector<uint16_t>> orderOfCopies;
  for (const LiveDashboard::Datagram& datagram : _dashboard.datagrams(kEvent)) {
    orderOfCopies[datagram.copy].push_back(datagram.eventID());
    const int ticks = kTicks.at(static_cast<size_t>(datagram.copy) - 1);
    EXPECT_GE(datagram.at - begin, kTestPeriod * std::max(ticks - 1, 0))
        << "copy " << datagram.copy << " of event " << datagram.eventID();
  }
  ASSERT_EQ(orderOfCopies.size(), kTicks.size()) << "each time the same bytes";
  for (const auto& [copy, order] : orderOfCopies) EXPECT_THAT(order, ElementsAre(2, 3, 4, 5, 6)) << copy;
}

TEST_F(SilentDashboardTest, getsTheFiftyNewestEventsAgainAndNoneThatTheyDropped) {
  constexpr uint16_t kWaiting = 50;
  constexpr uint16_t kLast = 61;  // the session's start and 60 events
  givenDashboardAt(_dashboard.port(), 200);
  startDaemon();
  ClientScript script = sending(kLast - 1);
  const auto client = start(script.wait());
  ASSERT_TRUE(comeFiveTimes(kLast - kWaiting + 1, kLast)) << instance().daemonLog();
  expectEnd(*client);
  stopDaemon();
  std::map<uint16_t, std::pair<size_t, size_t>> firstAndLast;
  const auto datagrams = _dashboard.datagrams();
  for (size_t at = 0; at < datagrams.size(); ++at) {
    firstAndLast.try_emplace(datagrams[at].eventID(), at, at).first->second.second = at;
  }
  for (uint16_t eventID = 1; eventID <= kLast; ++eventID) {
    ASSERT_EQ(firstAndLast.count(eventID), 1u) << eventID;
    if (eventID > kLast - kWaiting) {
      EXPECT_EQ(copiesOf(eventID), kTransmissions) << eventID;
    } else {
      EXPECT_LT(copiesOf(eventID), kTransmissions) << eventID;
      EXPECT_LT(firstAndLast[eventID].second, firstAndLast[eventID + kWaiting].first)
          << eventID << " came again although it was dropped";
    }
  }
}

// Whatever is not acknowledged by then.
TEST_F(SilentDashboardTest, isLetGoOf9500MillisecondsAfterTheSessionsEnd) {
  givenDashboardAt(_dashboard.port(), 1000);
  startDaemon();
  ClientScript script = sending(1);
  const auto client = start(script.wait());
  ASSERT_TRUE(eventually([this] { return copiesOf(2) == 1; })) << instance().daemonLog();
  const auto end = LiveDashboard::Clock::now();
  expectEnd(*client);
  const std::string line = "DashboardBackend(myPeriodicTask): scheduled last resort clean-up in 9500 ms.";
  ASSERT_TRUE(eventually([&] { return instance().daemonLogHas(line); })) << instance().daemonLog();
  EXPECT_TRUE(isUDPSocketConnectedTo(_dashboard.port())) << "the daemon's is open as long";
  ASSERT_TRUE(eventually([this] { return !isUDPSocketConnectedTo(_dashboard.port()); })) << instance().daemonLog();
  EXPECT_GE(LiveDashboard::Clock::now() - end, std::chrono::milliseconds(9500));
  const std::string log = instance().daemonLog();
  EXPECT_EQ(log.find(line), log.rfind(line)) << "once";
  EXPECT_FALSE(instance().daemonLogHas("DashboardBackend(myPeriodicTask): clean up at myPeriodicTask."));
  EXPECT_GE(copiesOf(3), 2) << "the session's stop came again meanwhile";
  EXPECT_LT(copiesOf(3), kTransmissions) << "but not to the end of the schedule";
  stopDaemon();
}

// The same bytes from the same port of another address end no wait; those from the dashboard itself do.
TEST_F(DashboardTest, isAloneInAcknowledging) {
  Mutex mutex;
  std::unique_ptr<DatagramServer> stranger;
  int strangersAcknowledgements = 0;
  LiveDashboard dashboard([&](LiveDashboard& self, const LiveDashboard::Datagram& datagram) {
    if (datagram.copy == 3) return self.acknowledge(datagram);
    const std::string bytes = LiveDashboard::acknowledgementOf(datagram);
    MutexLock lock(mutex);
    if (stranger->send(datagram.peer, {reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size()})) {
      ++strangersAcknowledgements;
    }
  });
  auto started = DatagramServer::start({{127, 0, 0, 2}, dashboard.port()}, [](auto&&...) {});
  ASSERT_TRUE(started.has_value()) << started.error().description();
  {
    MutexLock lock(mutex);
    stranger = std::move(*started);
  }
  givenDashboardAt(dashboard.port(), 200);
  startDaemon();
  EXPECT_THAT(run(sending()), HasSubstr("configured: [dashboard]"));
  ASSERT_TRUE(eventually([&dashboard] { return !isUDPSocketConnectedTo(dashboard.port()); })) << instance().daemonLog();
  for (const uint16_t category : {uint16_t{0}, kEvent}) EXPECT_THAT(copies(dashboard, category), Each(3));
  EXPECT_EQ(dashboard.datagrams().size(), 3u * (kEvents + 2));
  stopDaemon();
  MutexLock lock(mutex);
  EXPECT_EQ(strangersAcknowledgements, 2 * (kEvents + 2));
}

// The collector as the dashboard, over a network that loses datagrams and acknowledgements.
class DashboardCollectorTest : public ::testing::Test {
 protected:
  // The seed decides of each event by its number and by how often it came. With this one, of the events here three get
  // lost at first and the acknowledgements of two others, and none more than twice; so no event is lost for good.
  static constexpr char kLossPercent[] = "20";
  static constexpr char kSeed[] = "3";
  static constexpr int kSent = 20;
  static constexpr int64_t kAll = kSent + 2;  // with the session's start and stop

  // Starts a collector that loses, and what stands before it.
  void startLosingCollector() {
    _instance.startCollector({"--events", _instance.path("events.jsonl"), "--dashboard", "127.0.0.1:0",
                              "--dashboard-loss", kLossPercent, "--dashboard-seed", kSeed});
    ASSERT_TRUE(
        eventually([this] { return lineOf(3).find("--dashboard-seed " + std::string(kSeed)) != std::string::npos; }));
    const std::string address = lineOf(2);
    const auto port = static_cast<uint16_t>(std::stoi(address.substr(address.rfind(':') + 1)));
    _relay.emplace(IPv4SocketAddress{{127, 0, 0, 1}, port});
  }
  std::string lineOf(size_t number) const {
    std::istringstream lines(_instance.read("collector.out"));
    std::string line;
    for (size_t count = 0; count < number; ++count) std::getline(lines, line);
    return line;
  }
  void givenBag() {
    Dictionary bag = openBag(_instance.collectorURL("/events"));
    Dictionary section;
    section.set("dashboard",
                Dictionary{{kProfileIP, "127.0.0.1"}, {kProfilePort, _relay->port()}, {kProfileReliable, 100}});
    bag.set(kEnvironmentRelease, section);
    _instance.givenStorebag("conferencing", bag);
  }
  // What the collector says of itself; an empty dictionary when it says nothing.
  Dictionary statistics() {
    bench::KeptConnection collector(_instance.collectorURL("/statistics"), _instance.authorityFile(), {});
    const Result<Value> parsed = json::parse(collector.get().value_or(""));
    if (parsed.has_error() || !parsed->isDictionary()) return {};
    const Dictionary* counts = (*parsed->dictionary())["dashboard"].dictionary();
    return counts != nullptr ? *counts : Dictionary();
  }
  static std::set<int64_t> eventIDsOf(const std::vector<Dictionary>& lines) {
    std::set<int64_t> eventIDs;
    for (const Dictionary& line : lines)
      eventIDs.insert((*line["event"].dictionary())[kEventEventNumber].integerValue());
    return eventIDs;
  }

  Instance _instance;
  std::optional<DatagramRelay> _relay;
};

TEST_F(DashboardCollectorTest, storesEachEventOnceAndCountsWhatItLoses) {
  startLosingCollector();
  givenBag();
  _instance.startDaemon();
  EXPECT_THAT(_instance.sendEvents({"--count", std::to_string(kSent)}), HasSubstr("configured: [dashboard]"));
  // The session waits for its last acknowledgement. Copies that were sent before it came may still be on their way.
  ASSERT_TRUE(eventually([this] { return !isUDPSocketConnectedTo(_relay->port()); })) << _instance.daemonLog();
  Dictionary counted;
  DatagramRelay::Counts relayed;
  // Each datagram brings an acknowledgement, unless one of the two is lost.
  ASSERT_TRUE(eventually([&] {
    relayed = _relay->counts();
    counted = statistics();
    return counted["lost"].integerValue() == relayed.toServer - relayed.toClient;
  })) << relayed.toServer
      << " datagrams, " << relayed.toClient << " acknowledgements, " << description(counted);

  EXPECT_EQ(counted["events"], Value(kAll));
  EXPECT_EQ(counted["refused"], Value(0));
  const int64_t lost = counted["lost"].integerValue();
  const int64_t repeated = counted["repeated"].integerValue();
  const int64_t lostDatagrams = relayed.toServer - kAll - repeated;
  EXPECT_GE(lostDatagrams, 1);
  EXPECT_GE(lost - lostDatagrams, 1) << "acknowledgements";
  EXPECT_GE(repeated, lost - lostDatagrams) << "without its acknowledgement an event comes again";
  EXPECT_EQ(_instance.arrived().size(), static_cast<size_t>(kAll)) << "each once";
  EXPECT_EQ(eventIDsOf(_instance.arrived()).size(), static_cast<size_t>(kAll));
  EXPECT_EQ(_instance.arrivedWithCategory(21).size(), static_cast<size_t>(kSent));
  const std::string shown = _instance.read("collector.out");
  EXPECT_THAT(shown, HasSubstr(" method 21 "));
  EXPECT_EQ(std::count(shown.begin(), shown.end(), '\n'), 3 + kAll) << "a line for each event, behind the first three";
  _instance.daemon().signal(SIGTERM);
  EXPECT_EQ(_instance.daemon().wait(), 0);
}

}  // namespace
}  // namespace telvane::testing
