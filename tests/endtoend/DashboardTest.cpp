// Events on their way to a live dashboard: a real daemon, real datagrams, and dashboards that lose, delay, repeat and
// mix up what they do.
#include <gmock/gmock.h>

#include <algorithm>
#include <csignal>
#include <map>
#include <sstream>

#include "interfaces/StorebagKeys.h"
#include "platform/KeyedArchive.h"
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

// The collector as the dashboard, over a network that loses every tenth datagram and acknowledgement.
class DashboardCollectorTest : public ::testing::Test {
 protected:
  Instance _instance;
};

TEST_F(DashboardCollectorTest, storesEachEventOnce) {
  _instance.startCollector({"--events", _instance.path("events.jsonl"), "--dashboard", "127.0.0.1:0",
                            "--dashboard-loss", "10", "--dashboard-seed", "4"});
  const auto lineOf = [this](size_t number) {
    std::istringstream lines(_instance.read("collector.out"));
    std::string line;
    for (size_t count = 0; count < number; ++count) std::getline(lines, line);
    return line;
  };
  ASSERT_TRUE(eventually([&lineOf] { return lineOf(3).find("--dashboard-seed 4") != std::string::npos; }));
  const std::string address = lineOf(2);
  const auto port = std::stoi(address.substr(address.rfind(':') + 1));
  Dictionary bag = openBag(_instance.collectorURL("/events"));
  Dictionary section;
  section.set("dashboard", Dictionary{{kProfileIP, "127.0.0.1"}, {kProfilePort, port}, {kProfileReliable, 20}});
  bag.set(kEnvironmentRelease, section);
  _instance.givenStorebag("conferencing", bag);
  _instance.startDaemon();
  EXPECT_THAT(_instance.sendEvents({"--count", "20"}), HasSubstr("configured: [dashboard]"));
  EXPECT_TRUE(eventually([this] { return _instance.arrivedWithCategory(21).size() >= 20; })) << _instance.daemonLog();
  const auto lines = _instance.arrivedWithCategory(21);
  EXPECT_EQ(lines.size(), 20u);
  EXPECT_TRUE(eventually([this] { return _instance.read("collector.out").find(" method 21 ") != std::string::npos; }));
  _instance.daemon().signal(SIGTERM);
  EXPECT_EQ(_instance.daemon().wait(), 0);
}

}  // namespace
}  // namespace telvane::testing
