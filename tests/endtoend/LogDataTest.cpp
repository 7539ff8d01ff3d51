// Log data on their way from real clients through a real daemon: to the real collector, and to servers that do not
// answer.
#include <gmock/gmock.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <csignal>
#include <mutex>

#include "bench/KeptConnection.h"
#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "platform/KeyedArchive.h"
#include "tests/endtoend/WireFixture.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;

// What a daemon may take to end, and something for a machine that is busy.
constexpr auto kLongestEnd = std::chrono::seconds(25 + 15);

Array logDataOf(const char* text) { return {Dictionary{{Key("LogData"), text}, {Key("StartTime"), 1}}}; }

// The collector is the dashboard, too, and its events file says what that was told.
class LogDataTest : public ::testing::Test {
 protected:
  void start(std::vector<std::string> options) {
    _instance.grant("telvane-scripted-client");
    options.insert(options.end(), {"--events", _instance.path("events.jsonl"), "--dashboard", "127.0.0.1:0"});
    _instance.startCollector(options);
    ASSERT_TRUE(eventually([this] { return dashboardPort() != 0; }));
    Dictionary section;
    section.set("dashboard", Dictionary{{kProfileIP, "127.0.0.1"},
                                        {kProfilePort, dashboardPort()},
                                        {kProfilePostURL, _instance.collectorURL("/logdata")}});
    Dictionary bag = openBag(_instance.collectorURL("/events"));
    bag.set(kEnvironmentRelease, section);
    _instance.givenStorebag("conferencing", bag);
    _instance.startDaemon();
  }
  // Of the second line, which may not be there yet.
  uint16_t dashboardPort() const {
    const std::string text = _instance.read("collector.out");
    const size_t line = text.find('\n') + 1;
    const size_t end = text.find('\n', line);
    if (end == std::string::npos) return 0;
    return static_cast<uint16_t>(std::stoi(text.substr(text.rfind(':', end) + 1)));
  }
  // Has a client upload these, one after the other, and returns what it said.
  std::string upload(const std::vector<Array>& all) {
    ClientScript script;
    const Dictionary info{{kTelvaneSessionInfoClientType, 7}, {kTelvaneSessionInfoSessionID, 77}};
    // Without names a session has no connectivity helper, and so posts nothing.
    script.open(info, Dictionary{{kTelvaneUserInfoClientName, "sender"}, {kTelvaneUserInfoServiceName, "endtoend"}});
    script.configure();
    for (const Array& logData : all) script.uploadLogData(logData);
    _instance.givenFile("client.script", script.text());
    const auto client = _instance.startProgram("telvane-scripted-client", {_instance.path("client.script")}, "client");
    client->closeInput();
    EXPECT_EQ(client->wait(), 0) << _instance.read("client.err") << _instance.daemonLog();
    return _instance.read("client.out");
  }
  // The locations that the dashboard was told. Behind the session's stop there are no more.
  std::vector<std::string> locations() {
    std::vector<std::string> found;
    EXPECT_TRUE(eventually([&] {
      found.clear();
      bool hasStopped = false;
      for (const Dictionary& line : _instance.arrived()) {
        const Dictionary& event = *line["event"].dictionary();
        if (event[kEventMethod] != Value(0)) continue;
        hasStopped = hasStopped || event[kEventStatus] == Value(1);
        const Value& location = (*event["fields"].dictionary())[kEventLogDataUploadLocation];
        if (location.isPresent()) found.emplace_back(location.text());
      }
      return hasStopped;
    })) << _instance.read("events.jsonl");
    return found;
  }
  Dictionary statistics() {
    bench::KeptConnection collector(_instance.collectorURL("/statistics"), _instance.authorityFile(), {});
    const Result<Value> parsed = json::parse(collector.get().value_or(""));
    return parsed.has_value() && parsed->isDictionary() ? *parsed->dictionary() : Dictionary();
  }

  Instance _instance;
};

TEST_F(LogDataTest, areKeptByTheCollectorAndTheDashboardIsToldWhere) {
  start({"--uploads", _instance.path("uploads")});
  const std::vector<Array> all{logDataOf("first"), logDataOf("second\n\x01")};
  const std::string said = upload(all);
  EXPECT_EQ(said.find("log data uploaded: no"), std::string::npos) << said << _instance.daemonLog();
  EXPECT_THAT(said, HasSubstr("log data uploaded: yes\nlog data uploaded: yes"));
  uint64_t bytes = 0;
  const char* const names[] = {"logdata.plist", "2-logdata.plist"};
  for (size_t i = 0; i < all.size(); ++i) {
    const std::string kept = _instance.read(std::string("uploads/") + names[i]);
    bytes += kept.size();
    const auto archived = keyedarchive::unarchive(Data::copyOf(kept));
    ASSERT_TRUE(archived.has_value()) << names[i];
    EXPECT_EQ(*archived, Value(all[i]));
  }
  EXPECT_THAT(locations(), ::testing::ElementsAre("/uploads/logdata.plist", "/uploads/2-logdata.plist"));
  const Dictionary counted = statistics();
  EXPECT_EQ(counted["logData"], Value(2));
  EXPECT_EQ(counted["uploads"], Value(0));
  EXPECT_EQ(counted["uploadBytes"], Value(bytes));
  bench::KeptConnection file(_instance.collectorURL("/upload?filename=log&raw=true"), _instance.authorityFile(), {});
  EXPECT_TRUE(file.post("seven b"));
  EXPECT_EQ(statistics()["uploads"], Value(1));
  EXPECT_EQ(statistics()["logData"], Value(2));
  EXPECT_EQ(statistics()["uploadBytes"], Value(bytes + 7));
}

// Its answer must not be taken for a location.
TEST_F(LogDataTest, areRefusedByACollectorThatHasNoFolderForThem) {
  start({});
  EXPECT_THAT(upload({logDataOf("text")}), HasSubstr("log data uploaded: no")) << _instance.daemonLog();
  EXPECT_THAT(locations(), ::testing::IsEmpty());
  EXPECT_TRUE(_instance.daemonLogHas("DashboardBackend(uploadLogData): Error uploading log data array ((null))"));
  EXPECT_EQ(statistics()["logData"], Value(0));
}

// A server for log data that answers when the test is over, and a collector for events beside it.
class HangingLogDataTest : public WireFixture {
 protected:
  HangingLogDataTest() {
    givenPostsAnsweredBy([this](const WireRequest& post) {
      if (post.target() == "/logdata") waitForTheEnd();
      return WireServer::answer(200);
    });
    Dictionary section = WireFixture::section("splunk", Array{Value(clientEntry())});
    // Nobody is at that address; an event that does not come is no matter here.
    section.set("dashboard",
                Dictionary{{kProfileIP, "127.0.0.1"}, {kProfilePort, 9}, {kProfilePostURL, server().url("/logdata")}});
    givenSection(section);
    instance().givenConsent(true);
    startDaemon();
  }
  ~HangingLogDataTest() override { letTheServerAnswer(); }
  void letTheServerAnswer() {
    {
      const std::lock_guard lock(_mutex);
      _isOver = true;
    }
    _changed.notify_all();
  }
  static ClientScript sendingAndUploading(const std::string& clientName = "sender") {
    ClientScript script;
    script.open(sessionInfo(), userInfo(clientName.c_str())).configure().send(21, 1, Dictionary{{"n", 1}});
    return script.uploadLogData(logDataOf("text"));
  }
  size_t logDataPosts() const {
    size_t count = 0;
    for (const WireRequest& post : posts()) count += post.target() == "/logdata" ? 1 : 0;
    return count;
  }
  std::vector<Dictionary> arrivedEvents() const {
    std::vector<WireRequest> events = posts();
    std::erase_if(events, [](const WireRequest& post) { return post.target() != "/events"; });
    return eventsOf(events, 21);
  }
  bool hasCome(size_t count) {
    return eventually([this, count] { return logDataPosts() == count; });
  }
  void expectAnEndInBoundedTime() {
    const auto before = std::chrono::steady_clock::now();
    instance().daemon().signal(SIGTERM);
    EXPECT_EQ(instance().daemon().wait(2 * kLongestEnd), 0) << instance().daemonLog();
    EXPECT_LT(std::chrono::steady_clock::now() - before, kLongestEnd);
  }

 private:
  void waitForTheEnd() {
    std::unique_lock lock(_mutex);
    _changed.wait(lock, [this] { return _isOver; });
  }
  std::mutex _mutex;
  std::condition_variable _changed;
  bool _isOver = false;
};

TEST_F(HangingLogDataTest, aServerThatDoesNotAnswerKeepsTheDaemonNeitherFromEndingNorFromSendingItsSessionsEvents) {
  const auto client = start(sendingAndUploading());
  ASSERT_TRUE(hasCome(1)) << instance().daemonLog();
  EXPECT_TRUE(arrivedEvents().empty()) << "they wait in a batch";
  expectAnEndInBoundedTime();
  EXPECT_EQ(arrivedEvents().size(), 1u) << instance().daemonLog();
  expectEnd(*client);
  EXPECT_THAT(instance().read("client.out"), HasSubstr("log data uploaded: no"));
}

// Each holds a thread of the daemon's; what is refused does not. They have names of their own, since those of one name
// share their connections, of which there are few.
TEST_F(HangingLogDataTest, clientsThatLeaveOneAfterTheOtherTakeNoMorePlacesThanThereAre) {
  constexpr size_t kPlaces = 16;
  constexpr size_t kClients = kPlaces + 4;
  for (size_t i = 0; i < kClients; ++i) {
    const std::string name = "client" + std::to_string(i);
    const auto client = start(sendingAndUploading(name), name);
    const size_t expected = std::min(i + 1, kPlaces);
    ASSERT_TRUE(hasCome(expected)) << i << instance().daemonLog();
    const bool isRefused = i >= kPlaces;
    ASSERT_TRUE(eventually([&] {
      return !isRefused || instance().read(name + ".out").find("log data uploaded: no") != std::string::npos;
    })) << instance().daemonLog();
    client->signal(SIGKILL);
    client->wait();
  }
  EXPECT_TRUE(instance().daemonLogHas("DashboardBackend(uploadLogData): Too much is being uploaded already"));
  ClientScript other;
  other.open(sessionInfo(), userInfo("other")).configure().send(22, 1, Dictionary{{"n", 1}}).flush();
  EXPECT_THAT(run(other), HasSubstr("flushed: ok")) << instance().daemonLog();
  letTheServerAnswer();
  stopDaemon();
  EXPECT_EQ(logDataPosts(), kPlaces);
  EXPECT_EQ(arrivedEvents().size(), kClients) << "of all sessions, their clients gone or not";
}

}  // namespace
}  // namespace telvane::testing
