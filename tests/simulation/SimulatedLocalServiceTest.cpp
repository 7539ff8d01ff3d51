#include "tests/support/SimulatedLocalService.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <functional>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "tests/support/Matchers.h"
#include "tests/support/Seeds.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::StartsWith;

constexpr char kService[] = "com.example.service";

// An exported object made of a function.
class Exported final : public ipc::ExportedObject {
 public:
  using Serve = std::function<void(ipc::Invocation& invocation, ipc::ReplyBlock& reply)>;
  explicit Exported(Serve serve) : _serve(std::move(serve)) {}
  void invoke(ipc::Invocation invocation, ipc::ReplyBlock reply) override { _serve(invocation, reply); }

 private:
  const Serve _serve;
};

// A server in a process of its own, which writes down what happens to it.
class Server final : private ipc::ListenerDelegate {
 public:
  Server(SimulatedPlatform& itsProcess, std::vector<std::string>& itsStory) : process(itsProcess), story(itsStory) {
    auto made = process.platform().localService.newListener(kService);
    if (!made) throw SimulationFailure(made.error().description());
    _listener = std::move(*made);
    _listener->setDelegate(this);
    _listener->resume();
  }
  void stopListening() { _listener = nullptr; }

  SimulatedPlatform& process;
  std::vector<std::string>& story;
  bool accepts = true;
  bool resumes = true;
  // How a call is served, beside being written down; by default a reply is its argument sent back.
  Exported::Serve serve = [](ipc::Invocation& invocation, ipc::ReplyBlock& reply) {
    if (reply) reply(invocation.arguments);
  };
  std::vector<std::weak_ptr<ipc::Connection>> connections;

 private:
  bool listener(ipc::Listener&, std::shared_ptr<ipc::Connection> connection) override {
    story.push_back("server asked by " + connection->description());
    connection->setExportedObject(std::make_shared<Exported>([this](auto& invocation, auto& reply) {
      story.push_back("served " + std::to_string(invocation.operation));
      serve(invocation, reply);
    }));
    connection->setInterruptionHandler([this] { story.push_back("server interrupted"); });
    connection->setInvalidationHandler([this] { story.push_back("server invalidated"); });
    connections.push_back(connection);
    if (accepts && resumes) connection->resume();
    return accepts;
  }

  std::unique_ptr<ipc::Listener> _listener;
};

class SimulatedLocalServiceTest : public ::testing::Test {
 protected:
  ~SimulatedLocalServiceTest() override { _world.end(); }

  void givenServer() {
    auto& process = _server ? _world.restart(_server->process) : _world.makeProcess("server");
    _server = std::make_unique<Server>(process, _story);
  }
  void givenConnection() {
    _connection = *_client.platform().localService.newConnection(kService);
    _connection->setInterruptionHandler([this] { _story.push_back("interrupted"); });
    _connection->setInvalidationHandler([this] { _story.push_back("invalidated"); });
    _connection->resume();
  }
  void send(uint16_t operation) {
    _connection->send({operation}, [this, operation](const Error& error) { noteError(operation, error); });
  }
  void ask(uint16_t operation, Value argument = "?") {
    _connection->sendWithReply(
        {operation, {std::move(argument)}},
        [this, operation](Array values) {
          _story.push_back("reply " + std::to_string(operation) + " " + std::string(values[0].text()));
        },
        [this, operation](const Error& error) { noteError(operation, error); });
  }
  void noteError(uint16_t operation, const Error& error) {
    _story.push_back("error " + std::to_string(operation) + " " + strerrorname_np(static_cast<int>(error.code())));
  }
  // Runs everything and takes what happened since.
  std::vector<std::string> happened() {
    _world.runUntilIdle();
    return std::exchange(_story, {});
  }

  std::vector<std::string> _story;
  SimulatedWorld _world{1};
  SimulatedPlatform& _client = _world.makeProcess("client");
  std::unique_ptr<Server> _server;
  std::shared_ptr<ipc::Connection> _connection;
};

TEST_F(SimulatedLocalServiceTest, servesACallAndBringsItsReply) {
  givenServer();
  givenConnection();
  ask(5, "text");
  EXPECT_THAT(happened(), ElementsAre("server asked by pid 101 (client)", "served 5", "reply 5 text"));
}

TEST_F(SimulatedLocalServiceTest, sendsNothingBeforeItIsResumed) {
  givenServer();
  _connection = *_client.platform().localService.newConnection(kService);
  ask(1);
  EXPECT_THAT(happened(), ElementsAre());
  _connection->resume();
  EXPECT_THAT(happened(), ElementsAre("server asked by pid 101 (client)", "served 1", "reply 1 ?"));
}

TEST_F(SimulatedLocalServiceTest, holdsCallsUntilTheAcceptingSideIsResumed) {
  givenServer();
  _server->resumes = false;
  givenConnection();
  ask(1);
  EXPECT_THAT(happened(), ElementsAre("server asked by pid 101 (client)"));
  _server->connections[0].lock()->resume();
  EXPECT_THAT(happened(), ElementsAre("served 1", "reply 1 ?"));
}

TEST_F(SimulatedLocalServiceTest, keepsTheOrderOfCallsUnderEverySeedAndLatency) {
  forEachSeed(20, [](uint64_t seed) {
    std::vector<std::string> story;
    SimulatedWorld world(seed);
    world.services().setLatency({1ms, 50ms});
    auto& client = world.makeProcess("client");
    Server server(world.makeProcess("server"), story);
    const auto connection = *client.platform().localService.newConnection(kService);
    connection->resume();
    std::vector<std::string> expected{"server asked by pid 101 (client)"};
    for (uint16_t i = 1; i <= 20; ++i) {
      connection->send({i}, nullptr);
      expected.push_back("served " + std::to_string(i));
    }
    world.runUntilIdle();
    EXPECT_LT(story.size(), 2u);
    world.advance(2s);
    EXPECT_EQ(story, expected);
    world.end();
  });
}

TEST_F(SimulatedLocalServiceTest, letsTheSeedChooseBetweenConnections) {
  std::set<std::vector<std::string>> stories;
  for (uint64_t seed = 1; seed <= 10; ++seed) {
    std::vector<std::string> story;
    SimulatedWorld world(seed);
    Server server(world.makeProcess("server"), story);
    std::vector<std::shared_ptr<ipc::Connection>> connections;
    for (uint16_t i = 1; i <= 3; ++i) {
      auto& client = world.makeProcess("client");
      connections.push_back(*client.platform().localService.newConnection(kService));
      connections.back()->resume();
      connections.back()->send({i}, nullptr);
    }
    world.runUntilIdle();
    stories.insert(story);
    world.end();
  }
  EXPECT_GE(stories.size(), 4u);
}

TEST_F(SimulatedLocalServiceTest, invalidatesARefusedConnection) {
  givenServer();
  _server->accepts = false;
  givenConnection();
  ask(1);
  send(2);
  const auto story = happened();
  EXPECT_THAT(story, ::testing::UnorderedElementsAre("server asked by pid 101 (client)", "server invalidated",
                                                     "error 1 ECONNREFUSED", "error 2 ECONNREFUSED", "invalidated"));
  EXPECT_EQ(story.front(), "server asked by pid 101 (client)");
  ask(3);
  EXPECT_THAT(happened(), ElementsAre("error 3 ECANCELED"));
  EXPECT_TRUE(_server->connections[0].expired());
}

TEST_F(SimulatedLocalServiceTest, invalidatesAConnectionToNobody) {
  givenConnection();
  ask(1);
  EXPECT_THAT(happened(), ElementsAre("error 1 ENOENT", "invalidated"));
}

TEST_F(SimulatedLocalServiceTest, invalidatesAConnectionToAStoppedListener) {
  givenServer();
  _server->stopListening();
  EXPECT_FALSE(_world.services().isServed(kService));
  givenConnection();
  EXPECT_THAT(happened(), ElementsAre("invalidated"));
}

TEST_F(SimulatedLocalServiceTest, keepsAcceptedConnectionsWhenTheListenerStops) {
  givenServer();
  givenConnection();
  happened();
  _server->stopListening();
  ask(1);
  EXPECT_THAT(happened(), ElementsAre("served 1", "reply 1 ?"));
}

TEST_F(SimulatedLocalServiceTest, refusesTheNameToASecondListener) {
  givenServer();
  EXPECT_TRUE(isError(_client.platform().localService.newListener(kService), EADDRINUSE, kService));
}

TEST_F(SimulatedLocalServiceTest, deliversWhatWasSentBeforeItIsInvalidated) {
  givenServer();
  givenConnection();
  send(1);
  send(2);
  _connection->invalidate();
  _connection->invalidate();
  send(3);
  const auto story = happened();
  EXPECT_THAT(story, ::testing::IsSupersetOf({"served 1", "served 2", "server interrupted", "server invalidated",
                                              "error 3 ECANCELED", "invalidated"}));
  EXPECT_EQ(story.back(), "server invalidated");
  EXPECT_EQ(std::count(story.begin(), story.end(), "invalidated"), 1);
}

TEST_F(SimulatedLocalServiceTest, deliversWhatWasSentBeforeItIsLetGo) {
  givenServer();
  givenConnection();
  send(1);
  ask(2);
  _connection = nullptr;
  const auto story = happened();
  EXPECT_THAT(story, ::testing::IsSupersetOf({"served 1", "served 2", "error 1 ECANCELED", "error 2 ECANCELED"}));
  EXPECT_THAT(story, ::testing::Not(::testing::Contains("invalidated")));
  EXPECT_TRUE(_server->connections[0].expired());
}

TEST_F(SimulatedLocalServiceTest, endsTheServersSideOfAConnectionLetGoBeforeItWasAccepted) {
  givenServer();
  givenConnection();
  _connection = nullptr;
  EXPECT_THAT(happened(), ElementsAre("server asked by pid 101 (client)", "server interrupted", "server invalidated"));
  EXPECT_TRUE(_server->connections[0].expired());
}

TEST_F(SimulatedLocalServiceTest, repliesAtMostOnce) {
  givenServer();
  _server->serve = [](ipc::Invocation&, ipc::ReplyBlock& reply) {
    reply({"first"});
    reply({"second"});
  };
  givenConnection();
  ask(1);
  EXPECT_THAT(happened(), ElementsAre(StartsWith("server asked"), "served 1", "reply 1 first"));
}

TEST_F(SimulatedLocalServiceTest, tellsTheCallerOfADroppedReply) {
  givenServer();
  _server->serve = [](ipc::Invocation&, ipc::ReplyBlock& reply) { reply = nullptr; };
  givenConnection();
  ask(1);
  EXPECT_THAT(happened(), ElementsAre(StartsWith("server asked"), "served 1", "error 1 ENOMSG"));
}

TEST_F(SimulatedLocalServiceTest, bringsALateReplyWithoutHoldingBackOthers) {
  givenServer();
  ipc::ReplyBlock late;
  _server->serve = [&late](ipc::Invocation& invocation, ipc::ReplyBlock& reply) {
    if (invocation.operation == 1) {
      late = std::move(reply);
    } else {
      reply({"now"});
    }
  };
  givenConnection();
  ask(1);
  ask(2);
  EXPECT_THAT(happened(), ElementsAre(StartsWith("server asked"), "served 1", "served 2", "reply 2 now"));
  late({"late"});
  EXPECT_THAT(happened(), ElementsAre("reply 1 late"));
}

TEST_F(SimulatedLocalServiceTest, callsTheClientsObjectToo) {
  givenServer();
  givenConnection();
  _connection->setExportedObject(std::make_shared<Exported>(
      [this](auto& invocation, auto&) { _story.push_back("client served " + std::to_string(invocation.operation)); }));
  happened();
  _server->connections[0].lock()->send({9}, nullptr);
  EXPECT_THAT(happened(), ElementsAre("client served 9"));
}

TEST_F(SimulatedLocalServiceTest, interruptsTheClientOfAKilledServer) {
  givenServer();
  ipc::ReplyBlock kept;
  _server->serve = [&kept](ipc::Invocation&, ipc::ReplyBlock& reply) { kept = std::move(reply); };
  givenConnection();
  ask(1);
  happened();
  _server->process.kill();
  EXPECT_THAT(happened(), ElementsAre("error 1 ECONNRESET", "interrupted"));
  kept({"from beyond"});
  EXPECT_THAT(happened(), ElementsAre());
}

TEST_F(SimulatedLocalServiceTest, connectsAgainWithTheNextCallAfterAnInterruption) {
  givenServer();
  givenConnection();
  happened();
  _server->process.kill();
  EXPECT_THAT(happened(), ElementsAre("interrupted"));
  givenServer();
  EXPECT_THAT(happened(), ElementsAre());
  ask(2);
  EXPECT_THAT(happened(), ElementsAre("server asked by pid 101 (client)", "served 2", "reply 2 ?"));
}

TEST_F(SimulatedLocalServiceTest, isInvalidatedWhenNobodyIsThereToConnectToAgain) {
  givenServer();
  givenConnection();
  happened();
  _server->process.kill();
  happened();
  ask(2);
  EXPECT_THAT(happened(), ElementsAre("error 2 ENOENT", "invalidated"));
}

TEST_F(SimulatedLocalServiceTest, startsTheServerOnDemandOnceForAllWhoConnect) {
  int launches = 0;
  _world.services().setLauncher(kService, [this, &launches] {
    ++launches;
    _world.scheduler().sleep(1s);  // starting takes a while
    givenServer();
  });
  givenConnection();
  ask(1);
  const auto second = *_client.platform().localService.newConnection(kService);
  second->resume();
  _world.advance(1s);
  EXPECT_EQ(launches, 1);
  EXPECT_THAT(happened(), ::testing::IsSupersetOf({"served 1", "reply 1 ?"}));
  _server->process.kill();
  happened();
  ask(2);
  _world.advance(1s);
  EXPECT_EQ(launches, 2);
  EXPECT_THAT(happened(), ::testing::IsSupersetOf({"served 2", "reply 2 ?"}));
}

TEST_F(SimulatedLocalServiceTest, interruptsAndInvalidatesTheServersSideOfAKilledClient) {
  givenServer();
  givenConnection();
  happened();
  _client.kill();
  EXPECT_THAT(happened(), ElementsAre("server interrupted", "server invalidated"));
  EXPECT_TRUE(_server->connections[0].expired());
}

TEST_F(SimulatedLocalServiceTest, interruptsTheClientWhenTheServerInvalidates) {
  givenServer();
  givenConnection();
  happened();
  _server->connections[0].lock()->invalidate();
  const auto story = happened();
  EXPECT_THAT(story, ::testing::UnorderedElementsAre("server invalidated", "interrupted"));
}

TEST_F(SimulatedLocalServiceTest, losesSomeOfWhatAKilledClientSentButNeverReordersIt) {
  std::set<size_t> served;
  for (uint64_t seed = 1; seed <= 20; ++seed) {
    std::vector<std::string> story;
    SimulatedWorld world(seed);
    world.services().setLatency({1ms, 1ms});
    auto& client = world.makeProcess("client");
    Server server(world.makeProcess("server"), story);
    const auto connection = *client.platform().localService.newConnection(kService);
    connection->resume();
    world.advance(10ms);
    story.clear();
    for (uint16_t i = 1; i <= 5; ++i) connection->send({i}, nullptr);
    client.kill();
    world.advance(10ms);
    const size_t count = story.size() - 2;  // the end is told of in two lines
    for (size_t i = 0; i < count; ++i) EXPECT_EQ(story[i], "served " + std::to_string(i + 1));
    served.insert(count);
    world.end();
  }
  EXPECT_GE(served.size(), 3u);
}

TEST_F(SimulatedLocalServiceTest, asksForThePeersEntitlementAtEachCall) {
  givenServer();
  givenConnection();
  happened();
  const auto connection = _server->connections[0].lock();
  EXPECT_FALSE(connection->peerHasEntitlement("com.example.right"));
  _client.grant("com.example.right");
  EXPECT_TRUE(connection->peerHasEntitlement("com.example.right"));
  EXPECT_FALSE(connection->peerHasEntitlement("com.example.other"));
}

TEST_F(SimulatedLocalServiceTest, passesADescriptorOfTheReceiversOwn) {
  givenServer();
  std::string content;
  int received = -1;
  _server->serve = [&](ipc::Invocation& invocation, ipc::ReplyBlock&) {
    received = invocation.descriptor.get();
    char buffer[16];
    const ssize_t size = ::read(received, buffer, sizeof buffer);
    content.assign(buffer, static_cast<size_t>(std::max<ssize_t>(size, 0)));
  };
  int ends[2];
  ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
  ASSERT_EQ(::write(ends[1], "through", 7), 7);
  const ipc::Descriptor writer(ends[1]);
  givenConnection();
  _connection->send({1, {}, ipc::Descriptor(ends[0])}, nullptr);
  happened();
  EXPECT_EQ(content, "through");
  EXPECT_NE(received, ends[0]);
  EXPECT_EQ(::fcntl(received, F_GETFD), -1) << "the descriptor is closed with the call";
  EXPECT_EQ(::fcntl(ends[0], F_GETFD), -1) << "the sender's is closed too";
}

TEST_F(SimulatedLocalServiceTest, holdsCallsWhileTheServersGateIsClosed) {
  givenServer();
  givenConnection();
  happened();
  _server->process.flowGate().add(FlowGate::kDefaultLimit + 1);
  ask(1);
  EXPECT_THAT(happened(), ElementsAre());
  _server->process.flowGate().subtract(FlowGate::kDefaultLimit + 1);
  EXPECT_THAT(happened(), ElementsAre("served 1", "reply 1 ?"));
}

TEST_F(SimulatedLocalServiceTest, hidesAServiceFromAProcess) {
  givenServer();
  EXPECT_EQ(_client.platform().localService.checkLookUp(kService), 0);
  _world.services().denyLookUp("client", kService, EPERM);
  EXPECT_EQ(_client.platform().localService.checkLookUp(kService), EPERM);
  givenConnection();
  ask(1);
  EXPECT_THAT(happened(), ElementsAre("error 1 EPERM", "invalidated"));
}

TEST_F(SimulatedLocalServiceTest, givesEachSideItsOwnCopyOfAValue) {
  givenServer();
  Dictionary seen;
  _server->serve = [&seen](ipc::Invocation& invocation, ipc::ReplyBlock&) {
    seen = *invocation.arguments[0].dictionary();
    seen.set(Key("added"), true);
  };
  givenConnection();
  Dictionary sent{{"key", 1}};
  _connection->send({1, {sent}}, nullptr);
  sent.set(Key("key"), 2);
  happened();
  EXPECT_EQ(seen, (Dictionary{{"key", 1}, {"added", true}}));
  EXPECT_EQ(sent, (Dictionary{{"key", 2}}));
}

}  // namespace
}  // namespace telvane::testing
