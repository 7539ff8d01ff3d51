#include "tests/support/SimulatedWorld.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "tests/support/Matchers.h"
#include "tests/support/Seeds.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::HasSubstr;

constexpr char kService[] = "com.example.relay";
constexpr char kURL[] = "https://collector.example/events";

// A small daemon: takes messages from its clients, holds them while a monitor is taken for a download, posts each, and
// answers when the post is done. It uses every seam that a real one does.
class Relay final : private ipc::ListenerDelegate, public ipc::ExportedObject, public URLSessionDelegate {
 public:
  explicit Relay(Platform& platform)
      : _platform(platform),
        _queue(platform.dispatch.newSerialQueue("relay")),
        _monitor(platform.dispatch.newMonitor()) {
    _listener = *platform.localService.newListener(kService);
    _listener->setDelegate(this);
    _listener->resume();
  }
  void start(std::shared_ptr<Relay> self) { _session = _platform.urlSessions.newSession({}, std::move(self), _queue); }

  void invoke(ipc::Invocation invocation, ipc::ReplyBlock reply) override {
    MonitorLock lock(*_monitor);
    const std::string text(invocation.arguments[0].text());
    _platform.log.message("relaying {} as {}", text, _platform.random.newUUID().string());
    const auto done = _platform.dispatch.newSemaphore(0);
    URLRequest request{kURL, "POST"};
    request.body = Data::copyOf(text);
    _queue->sync([&] {
      auto task = *_session->newDataTask(std::move(request));
      task->setTaskDescription(text);
      _done[text] = done;
      task->resume();
    });
    const bool isInTime = done->waitFor(30s);
    reply({isInTime ? "relayed " + text : "late " + text});
  }
  void didCompleteWithError(URLSession&, URLSessionTask& task, const std::optional<Error>&) override {
    if (const auto done = _done.find(task.taskDescription()); done != _done.end()) done->second->signal();
  }
  void didBecomeInvalidWithError(URLSession&, const std::optional<Error>&) override {}
  void didSendBodyData(URLSession&, URLSessionTask&, int64_t, int64_t) override {}
  ResponseDisposition didReceiveResponse(URLSession&, URLSessionTask&) override { return ResponseDisposition::Allow; }
  void didBecomeDownloadTask(URLSession&, URLSessionTask&) override {}
  void didReceiveData(URLSession&, URLSessionTask&, const Data&) override {}

 private:
  bool listener(ipc::Listener&, std::shared_ptr<ipc::Connection> connection) override {
    connection->setExportedObject(std::shared_ptr<ipc::ExportedObject>(std::shared_ptr<void>(), this));
    connection->resume();
    return true;
  }

  Platform& _platform;
  const std::shared_ptr<SerialQueue> _queue;
  const std::unique_ptr<Monitor> _monitor;
  std::unique_ptr<ipc::Listener> _listener;
  std::unique_ptr<URLSession> _session;
  std::map<std::string, std::shared_ptr<Semaphore>> _done;
};

class SimulatedWorldTest : public ::testing::Test {
 protected:
  // Three clients send five messages each through the relay; returns the log of everybody.
  static std::string run(uint64_t seed, SimulatedScheduler::Interleaving interleaving) {
    SimulatedWorld world(seed);
    world.scheduler().setInterleaving(interleaving);
    world.services().setLatency({0ms, 2ms});
    world.network().answer(kURL, NetworkAnswer::ok().after(10ms));
    auto& daemon = world.makeProcess("relay");
    const auto relay = std::make_shared<Relay>(daemon.platform());
    relay->start(relay);
    std::vector<std::shared_ptr<ipc::Connection>> connections;
    int replies = 0;
    for (int i = 0; i < 3; ++i) {
      Platform& client = world.makeProcess("client" + std::to_string(i)).platform();
      connections.push_back(*client.localService.newConnection(kService));
      connections.back()->resume();
      for (int message = 0; message < 5; ++message) {
        connections.back()->sendWithReply(
            {1, {"message " + std::to_string(i) + "." + std::to_string(message)}},
            [&replies, &client](Array values) {
              ++replies;
              client.log.message("{}", values[0]);
            },
            [](const Error& error) { ADD_FAILURE() << error.description(); });
      }
    }
    EXPECT_TRUE(world.runUntil([&replies] { return replies == 15; }, 10s));
    EXPECT_EQ(world.network().countTo(kURL), 15u);
    world.end();
    return world.text();
  }
};

TEST_F(SimulatedWorldTest, runsTheSameToTheByteOfTheLogForTheSameSeed) {
  for (const auto interleaving :
       {SimulatedScheduler::Interleaving::AtWaits, SimulatedScheduler::Interleaving::AtCalls}) {
    forEachSeed(10, [interleaving](uint64_t seed) {
      const std::string log = run(seed, interleaving);
      EXPECT_THAT(log, HasSubstr("relay <default> relaying message 2.4 as "));
      EXPECT_EQ(log, run(seed, interleaving));
    });
  }
}

TEST_F(SimulatedWorldTest, runsDifferentlyForDifferentSeeds) {
  std::set<std::string> logs;
  for (uint64_t seed = 1; seed <= 10; ++seed) logs.insert(run(seed, SimulatedScheduler::Interleaving::AtWaits));
  EXPECT_EQ(logs.size(), 10u);
}

TEST_F(SimulatedWorldTest, givesEachProcessItsOwnParts) {
  SimulatedWorld world;
  auto& a = world.makeProcess("a");
  auto& b = world.makeProcess("b");
  EXPECT_NE(a.processIdentifier(), b.processIdentifier());
  a.files().place("~/file", "a's");
  EXPECT_TRUE(isOk(a.platform().userDefaults.setObject("suite", "key", 1)));
  EXPECT_FALSE(b.files().exists("~/file"));
  EXPECT_EQ(b.platform().userDefaults.objectForKey("suite", "key"), Value());
  EXPECT_NE(a.platform().random.newUUID(), b.platform().random.newUUID());
  a.platform().log.message("only a's");
  EXPECT_TRUE(hasLine(a.log(), "only a's"));
  EXPECT_TRUE(hasNoLine(b.log(), "only a's"));
  EXPECT_EQ(world.text(), "1000.000000 a <default> only a's\n");
}

TEST_F(SimulatedWorldTest, sharesStorageBetweenProcessesOfOneUser) {
  SimulatedWorld world;
  auto& a = world.makeProcess("a");
  auto& b = world.makeProcess("b", {.storage = a.storage()});
  EXPECT_TRUE(isOk(a.platform().userDefaults.setObject("suite", "key", 1)));
  EXPECT_EQ(b.platform().userDefaults.objectForKey("suite", "key"), Value(1));
}

TEST_F(SimulatedWorldTest, keepsStorageAndEntitlementsOverARestart) {
  SimulatedWorld world;
  auto& before = world.makeProcess("daemon", {.entitlements = {"right"}});
  before.files().place("/var/file", "content");
  EXPECT_THROW(world.restart(before), SimulationFailure);
  before.kill();
  before.kill();
  auto& after = world.restart(before);
  EXPECT_FALSE(before.isAlive());
  EXPECT_TRUE(after.isAlive());
  EXPECT_EQ(after.files().content("/var/file"), "content");
  EXPECT_EQ(after.entitlements(), (std::set<std::string>{"right"}));
}

TEST_F(SimulatedWorldTest, runsNothingOfAKilledProcess) {
  SimulatedWorld world;
  auto& process = world.makeProcess("a");
  const auto queue = process.dispatch().newSerialQueue("queue");
  int runs = 0;
  queue->async([&runs] { ++runs; });
  queue->asyncAfter(1s, [&runs] { ++runs; });
  process.spawn("thread", [&runs] { ++runs; });
  process.kill();
  queue->async([&runs] { ++runs; });
  world.advance(1h);
  EXPECT_EQ(runs, 0);
}

// A process may die while one of its jobs waits for an answer with a lock held and objects on its stack.
TEST_F(SimulatedWorldTest, killsTheRelayInTheMiddleOfItsWork) {
  forEachSeed(20, [](uint64_t seed) {
    SimulatedWorld world(seed);
    world.network().answer(kURL, NetworkAnswer::silence());
    auto& daemon = world.makeProcess("relay");
    const auto relay = std::make_shared<Relay>(daemon.platform());
    relay->start(relay);
    Platform& client = world.makeProcess("client").platform();
    const auto connection = *client.localService.newConnection(kService);
    connection->resume();
    int failures = 0;
    for (int i = 0; i < 3; ++i) {
      connection->sendWithReply(
          {1, {"text"}}, [](Array) { ADD_FAILURE() << "a reply from the dead"; }, [&failures](auto&) { ++failures; });
    }
    world.advance(1s);
    daemon.kill();
    world.runUntilIdle();
    EXPECT_EQ(failures, 3);
    EXPECT_EQ(world.scheduler().waiting(), "");
    world.end();
  });
}

}  // namespace
}  // namespace telvane::testing
