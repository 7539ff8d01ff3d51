#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <limits>

#include "tests/platform/ipc/LocalServiceFixture.h"

namespace telvane::testing {
namespace {

using Operation = TalkingObject::Operation;

class SocketConnectionTest : public LocalServiceFixture {};

Value nested(size_t levels) {
  Value value(1);
  for (size_t i = 0; i < levels; ++i) value = Array({value});
  return value;
}

TEST_F(SocketConnectionTest, answersACallOnceAccepted) {
  serve();
  const auto connection = connected();
  const auto outcome = callAndWait(*connection, Operation::kEcho, {Value("hello"), Value(), Value(7)});
  ASSERT_TRUE(outcome.values) << outcome.error.description();
  EXPECT_EQ(*outcome.values, Array({Value("hello"), Value(), Value(7)}));
}

TEST_F(SocketConnectionTest, carriesEveryKindOfValueUnchanged) {
  serve();
  const auto connection = connected();
  Dictionary dictionary;
  dictionary.set(String("b"), Value(1));
  dictionary.set(String("a"), Value("zwei"));
  const Array values = {Value(true),
                        Value(false),
                        Value(std::numeric_limits<int64_t>::min()),
                        Value(std::numeric_limits<uint64_t>::max()),
                        Value(0.1),
                        Value(std::string("nul\0inside", 10)),
                        Value(""),
                        Value(Data::copyOf(std::string_view("\x00\xff", 2))),
                        Value(Date(Date::TimePoint(std::chrono::microseconds(-1234567)))),
                        Value(Array{}),
                        Value(dictionary),
                        nested(63)};
  const auto outcome = callAndWait(*connection, Operation::kEcho, values);
  ASSERT_TRUE(outcome.values) << outcome.error.description();
  ASSERT_EQ(outcome.values->size(), values.size());
  for (size_t i = 0; i < values.size(); ++i) EXPECT_EQ((*outcome.values)[i], values[i]) << "at " << i;
  EXPECT_EQ((*outcome.values)[10].dictionary()->begin()->key, "b") << "the order of entries is lost";
}

TEST_F(SocketConnectionTest, refusesAnArgumentNestedTooDeepWhereItIsSent) {
  serve();
  const auto connection = connected();
  const auto outcome = callAndWait(*connection, Operation::kEcho, {nested(65)});
  ASSERT_FALSE(outcome.values);
  EXPECT_EQ(outcome.error.code(), EINVAL) << outcome.error.description();
  EXPECT_TRUE(callAndWait(*connection, Operation::kEcho, {nested(64)}).values) << "the connection did not live on";
}

TEST_F(SocketConnectionTest, isInvalidatedOnceWhenRefused) {
  delegate.accepts = false;
  serve();
  const auto connection = connected();
  const auto first = callAndWait(*connection, Operation::kEcho, {});
  EXPECT_FALSE(first.values);
  ASSERT_TRUE(clientEvents.waitFor(1));
  const auto second = callAndWait(*connection, Operation::kEcho, {});
  EXPECT_EQ(second.error.code(), ECANCELED) << second.error.description();
  EXPECT_EQ(clientEvents.items(), std::vector<std::string>{"invalidated"});
  EXPECT_EQ(delegate.object->calls().size(), 0u);
}

TEST_F(SocketConnectionTest, isInvalidatedWhenThereIsNoSuchService) {
  const auto connection = connected();
  ASSERT_TRUE(clientEvents.waitFor(1));
  EXPECT_EQ(clientEvents.items(), std::vector<std::string>{"invalidated"});
  EXPECT_EQ(callAndWait(*connection, Operation::kEcho, {}).error.code(), ECANCELED);
}

TEST_F(SocketConnectionTest, tellsWhyThereIsNoSuchService) {
  const auto connection = newConnection();
  call(*connection, Operation::kEcho, {});
  connection->resume();
  const auto all = outcomes.take(1);
  ASSERT_EQ(all.size(), 1u);
  EXPECT_EQ(all[0].error.code(), ENOENT) << all[0].error.description();
  EXPECT_EQ(all[0].error.domain(), kPlatformErrorDomain.view());
}

TEST_F(SocketConnectionTest, sendsNothingBeforeItIsResumed) {
  serve();
  const auto connection = newConnection();
  send(*connection, Operation::kRemember, {Value(1)});
  expectServing();
  EXPECT_EQ(delegate.object->calls().size(), 1u) << "only the other connection's call was due";
  connection->resume();
  ASSERT_TRUE(delegate.object->calls().waitFor(2));
}

TEST_F(SocketConnectionTest, failsLaterCallsAfterInvalidateHere) {
  serve();
  const auto connection = connected();
  ASSERT_TRUE(callAndWait(*connection, Operation::kEcho, {}).values);
  send(*connection, Operation::kRemember, {Value("before")});
  connection->invalidate();
  connection->invalidate();
  EXPECT_EQ(callAndWait(*connection, Operation::kEcho, {}).error.code(), ECANCELED);
  ASSERT_TRUE(clientEvents.waitFor(1));
  ASSERT_TRUE(delegate.object->calls().waitFor(2)) << "what was sent before was not delivered";
  ASSERT_TRUE(delegate.events.waitFor(2));
  EXPECT_EQ(delegate.events.items(), (std::vector<std::string>{"interrupted", "invalidated"}));
  EXPECT_EQ(clientEvents.items(), std::vector<std::string>{"invalidated"});
}

TEST_F(SocketConnectionTest, deliversWhatWasSentBeforeItWasLetGo) {
  serve();
  constexpr int kCount = 20'000;
  auto connection = connected();
  for (int i = 0; i < kCount; ++i) send(*connection, Operation::kRemember, {Value(i)});
  connection.reset();
  const auto calls = delegate.object->calls().take(kCount);
  ASSERT_EQ(calls.size(), size_t{kCount});
  for (int i = 0; i < kCount; ++i) ASSERT_EQ(calls[static_cast<size_t>(i)][0].integerValue(), i);
}

TEST_F(SocketConnectionTest, deliversWhatWasSentBeforeTheServiceWentAway) {
  serve();
  constexpr int kCount = 5'000;
  auto connection = connected();
  for (int i = 0; i < kCount; ++i) send(*connection, Operation::kRemember, {Value(i)});
  connection.reset();
  client.reset();
  EXPECT_EQ(delegate.object->calls().size(), size_t{kCount}) << "the service did not wait for its connections";
}

TEST_F(SocketConnectionTest, everyConnectionIsOverOnceTheServiceHasEndedThem) {
  serve();
  const auto used = connected();
  ASSERT_TRUE(callAndWait(*used, Operation::kEcho, {}).values);
  const auto unused = newConnection();
  client->endConnections(std::chrono::seconds(5));
  client->endConnections(std::chrono::seconds(5));
  ASSERT_TRUE(clientEvents.waitFor(1));
  unused->resume();
  for (const auto& connection : {used, unused, connected()}) {
    EXPECT_EQ(callAndWait(*connection, Operation::kEcho, {}).error.code(), ECANCELED);
  }
  EXPECT_TRUE(clientEvents.waitFor(3)) << clientEvents.size();
}

TEST_F(SocketConnectionTest, runsNoHandlersAfterItWasLetGo) {
  serve();
  auto connection = connected();
  ASSERT_TRUE(callAndWait(*connection, Operation::kEcho, {}).values);
  call(*connection, Operation::kKeep, {});
  ASSERT_TRUE(delegate.object->calls().waitFor(2));
  connection.reset();
  const auto all = outcomes.take(2);
  ASSERT_EQ(all.size(), 2u);
  EXPECT_EQ(all[1].error.code(), ECANCELED) << "a caller that waits for an answer was not told";
  client.reset();
  EXPECT_EQ(clientEvents.size(), 0u);
}

TEST_F(SocketConnectionTest, keepsTheOrderOfItsCalls) {
  serve();
  constexpr int kCount = 30'000;
  const auto connection = connected();
  for (int i = 0; i < kCount; ++i) {
    if (i % 3 == 0) {
      call(*connection, Operation::kEcho, {Value(i)});
    } else {
      send(*connection, Operation::kRemember, {Value(i)});
    }
  }
  const auto calls = delegate.object->calls().take(kCount);
  const auto answers = outcomes.take(kCount / 3);
  ASSERT_EQ(calls.size(), size_t{kCount});
  for (int i = 0; i < kCount; ++i) ASSERT_EQ(calls[static_cast<size_t>(i)][0].integerValue(), i);
  for (size_t i = 0; i < answers.size(); ++i) {
    ASSERT_TRUE(answers[i].values) << answers[i].error.description();
    ASSERT_EQ((*answers[i].values)[0].integerValue(), static_cast<int64_t>(3 * i));
  }
}

TEST_F(SocketConnectionTest, aLateReplyHoldsBackNoOther) {
  serve();
  const auto connection = connected();
  call(*connection, Operation::kKeep, {});
  for (int i = 0; i < 500; ++i) call(*connection, Operation::kEcho, {Value(i)});
  ASSERT_TRUE(outcomes.waitFor(500));
  EXPECT_EQ(outcomes.size(), 500u);
  delegate.object->answerKept();
  const auto all = outcomes.take(501);
  ASSERT_EQ(all.size(), 501u);
  EXPECT_EQ(all[500].values, Array({Value(0)}));
}

TEST_F(SocketConnectionTest, tellsTheCallerThatAReplyWasDropped) {
  serve();
  const auto connection = connected();
  EXPECT_EQ(callAndWait(*connection, Operation::kDrop, {}).error.code(), ENOMSG);
  call(*connection, Operation::kKeep, {});
  ASSERT_TRUE(delegate.object->calls().waitFor(2));
  expectServing();  // so that the kept call's batch has been answered
  delegate.object->dropKept();
  const auto all = outcomes.take(3);
  ASSERT_EQ(all.size(), 3u);
  EXPECT_EQ(all[2].error.code(), ENOMSG) << all[2].error.description();
}

TEST_F(SocketConnectionTest, givesEachCallOneAnswerOrOneErrorWhenTheOtherSideEnds) {
  serve();
  constexpr size_t kCount = 3'000;
  const auto connection = connected();
  for (size_t i = 0; i < kCount; ++i) {
    constexpr uint16_t kOperations[] = {Operation::kEcho, Operation::kKeep, Operation::kDrop};
    call(*connection, kOperations[i % 3], {Value(i)});
    if (i == kCount / 2) delegate.object->answerKept();
  }
  ASSERT_TRUE(delegate.object->calls().waitFor(kCount));
  stopServing();
  ASSERT_TRUE(outcomes.waitFor(kCount));
  delegate.object->answerKept();
  connection->invalidate();
  client.reset();
  EXPECT_EQ(outcomes.size(), kCount);
}

TEST_F(SocketConnectionTest, connectsAgainWithTheNextCallAfterAnInterruption) {
  serve();
  const auto connection = connected();
  call(*connection, Operation::kKeep, {});
  ASSERT_TRUE(delegate.object->calls().waitFor(1));
  stopServing();
  const auto all = outcomes.take(1);
  ASSERT_EQ(all.size(), 1u);
  EXPECT_EQ(all[0].error.code(), ECONNRESET) << all[0].error.description();
  ASSERT_TRUE(clientEvents.waitFor(1));
  serve();
  const auto again = callAndWait(*connection, Operation::kEcho, {Value("again")});
  ASSERT_TRUE(again.values) << again.error.description();
  EXPECT_EQ(clientEvents.items(), std::vector<std::string>{"interrupted"});
  EXPECT_EQ(delegate.connections.size(), 2u) << "the second line is a new connection to the daemon";
}

TEST_F(SocketConnectionTest, theAcceptingSideCallsTheClient) {
  serve();
  const auto object = std::make_shared<TalkingObject>(dispatch);
  const auto connection = newConnection();
  connection->setExportedObject(object);
  connection->resume();
  const auto accepted = delegate.connections.take(1);
  ASSERT_EQ(accepted.size(), 1u);
  const auto back = accepted[0].lock();
  ASSERT_TRUE(back);
  const auto outcome = callAndWait(*back, Operation::kEcho, {Value("from the daemon")});
  ASSERT_TRUE(outcome.values) << outcome.error.description();
  EXPECT_EQ(object->calls().items(), std::vector<Array>{Array({Value("from the daemon")})});
}

TEST_F(SocketConnectionTest, deliversAReplyThatWasGivenBeforeTheAcceptingSideEnded) {
  class Ending final : public ipc::ExportedObject {
   public:
    explicit Ending(std::weak_ptr<ipc::Connection> connection) : _connection(std::move(connection)) {}
    void invoke(ipc::Invocation, ipc::ReplyBlock reply) override {
      reply({Value("finished")});
      if (const auto connection = _connection.lock()) connection->invalidate();
    }

   private:
    const std::weak_ptr<ipc::Connection> _connection;
  };
  serve();
  const auto connection = connected();
  const auto accepted = delegate.connections.take(1);
  ASSERT_EQ(accepted.size(), 1u);
  accepted[0].lock()->setExportedObject(std::make_shared<Ending>(accepted[0]));
  const auto outcome = callAndWait(*connection, 1, {});
  ASSERT_TRUE(outcome.values) << outcome.error.description();
  EXPECT_EQ(*outcome.values, Array({Value("finished")}));
  ASSERT_TRUE(clientEvents.waitFor(1));
  EXPECT_EQ(clientEvents.items()[0], "interrupted");
}

TEST_F(SocketConnectionTest, passesAnOpenFile) {
  serve();
  const auto connection = connected();
  for (int i = 0; i < 40; ++i) {
    const std::string text = "file number " + std::to_string(i);
    ipc::Invocation invocation;
    invocation.operation = Operation::kReadFile;
    invocation.descriptor = ipc::Descriptor(::open(scratch.write("file" + std::to_string(i), text).c_str(), O_RDONLY));
    connection->sendWithReply(
        std::move(invocation),
        [this](Array values) {
          outcomes.add({std::move(values), {}});
        },
        [this](const Error& error) {
          outcomes.add({{}, error});
        });
    send(*connection, Operation::kRemember, {});
  }
  const auto all = outcomes.take(40);
  ASSERT_EQ(all.size(), 40u);
  for (size_t i = 0; i < all.size(); ++i) {
    ASSERT_TRUE(all[i].values) << all[i].error.description();
    EXPECT_EQ((*all[i].values)[0].text(), "file number " + std::to_string(i));
  }
}

TEST_F(SocketConnectionTest, dropsTheNewestAboveItsBoundAndSaysSoOncePerBurst) {
  log.expectError("were dropped");
  clientLimits.maximumWaitingBytes = 1u << 20;
  serve();
  gate.add(2000);
  const auto connection = connected();
  constexpr int kCount = 100;
  Gathered<int> dropped;
  for (int i = 0; i < kCount; ++i) {
    ipc::Invocation invocation;
    invocation.operation = Operation::kRemember;
    invocation.arguments = {Value(i), Value(std::string(50'000, 'x'))};
    connection->send(std::move(invocation), [&dropped, i](const Error& error) {
      EXPECT_EQ(error.code(), ENOBUFS) << error.description();
      dropped.add(i);
    });
  }
  ASSERT_TRUE(dropped.waitFor(75)) << "only " << dropped.size() << " were dropped";
  gate.subtract(2000);
  connection->invalidate();
  client.reset();
  const auto calls = delegate.object->calls().items();
  EXPECT_EQ(calls.size() + dropped.size(), size_t{kCount});
  for (size_t i = 0; i < calls.size(); ++i) EXPECT_EQ(calls[i][0].integerValue(), static_cast<int64_t>(i));
  EXPECT_EQ(log.count(LogLevel::Error, "were dropped"), 1u) << log.text();
  EXPECT_EQ(log.count(std::to_string(dropped.size()) + " calls to service com.corvex.test were dropped"), 1u)
      << log.text();
}

TEST_F(SocketConnectionTest, dropsWhatMayBeDroppedSilentlyWithNothingButTheLine) {
  log.expectError("calls to service com.corvex.test were dropped");
  clientLimits.maximumWaitingBytes = 1u << 20;
  serve();
  gate.add(2000);
  const auto connection = connected();
  constexpr int kCount = 100;
  for (int i = 0; i < kCount; ++i) {
    ipc::Invocation invocation;
    invocation.operation = Operation::kEcho;
    invocation.arguments = {Value(std::string(50'000, 'x'))};
    invocation.isDroppedSilently = true;
    connection->sendWithReply(
        std::move(invocation),
        [this](Array values) {
          outcomes.add({std::move(values), {}});
        },
        [this](const Error& error) {
          outcomes.add({{}, error});
        });
  }
  gate.subtract(2000);
  connection->invalidate();
  client.reset();
  const auto all = outcomes.items();
  EXPECT_LT(all.size(), 25u) << "hardly more than the bound may be told of";
  EXPECT_EQ(std::count_if(all.begin(), all.end(), [](const auto& outcome) { return outcome.error.code() == ENOBUFS; }),
            0);
  EXPECT_EQ(log.count(LogLevel::Error, "were dropped"), 1u) << log.text();
}

TEST_F(SocketConnectionTest, executesNothingWhileTheGateIsClosedAndLosesNothing) {
  serve();
  const auto connection = connected();
  ASSERT_TRUE(callAndWait(*connection, Operation::kEcho, {}).values);
  gate.add(2000);
  constexpr int kCount = 2'000;
  for (int i = 0; i < kCount; ++i) call(*connection, Operation::kEcho, {Value(i)});
  // The daemon goes on accepting meanwhile.
  const auto other = connected();
  ASSERT_TRUE(delegate.connections.waitFor(2));
  EXPECT_EQ(delegate.object->calls().size(), 1u) << "calls were executed though the gate was closed";
  gate.subtract(2000);
  const auto all = outcomes.take(kCount + 1);
  ASSERT_EQ(all.size(), size_t{kCount + 1});
  for (int i = 0; i < kCount; ++i) {
    ASSERT_EQ(all[static_cast<size_t>(i) + 1].values, Array({Value(i)}));
  }
}

TEST_F(SocketConnectionTest, executesWhatCameBeforeTheClientEnded) {
  serve();
  clientLimits.serviceLingerTime = std::chrono::milliseconds(100);
  clientLimits.lingerTime = std::chrono::milliseconds(100);
  log.expectError("could not be delivered in time");
  gate.add(2000);
  auto connection = connected();
  for (int i = 0; i < 50; ++i) send(*connection, Operation::kRemember, {Value(i)});
  ASSERT_TRUE(delegate.connections.waitFor(1));
  connection.reset();
  client.reset();
  EXPECT_EQ(delegate.object->calls().size(), 0u);
  gate.subtract(2000);
  EXPECT_TRUE(delegate.object->calls().waitFor(50)) << delegate.object->calls().size();
  ASSERT_TRUE(delegate.events.waitFor(2));
}

TEST_F(SocketConnectionTest, serves300ConnectionsAtOnce) {
  serve();
  std::vector<std::shared_ptr<ipc::Connection>> connections;
  for (int i = 0; i < 300; ++i) connections.push_back(connected());
  for (size_t i = 0; i < connections.size(); ++i) call(*connections[i], Operation::kEcho, {Value(i)});
  const auto all = outcomes.take(300);
  ASSERT_EQ(all.size(), 300u);
  for (const auto& outcome : all) EXPECT_TRUE(outcome.values) << outcome.error.description();
  EXPECT_EQ(delegate.connections.size(), 300u);
  connections.clear();
  EXPECT_TRUE(delegate.events.waitFor(600)) << delegate.events.size();
}

TEST_F(SocketConnectionTest, aBusyConnectionDelaysNoOther) {
  serve();
  const auto busy = connected();
  call(*busy, Operation::kBlock, {});
  for (int i = 0; i < 1000; ++i) send(*busy, Operation::kRemember, {Value(std::string(10'000, 'x'))});
  ASSERT_TRUE(delegate.object->calls().waitFor(1));
  expectServing();
  delegate.object->release();
  ASSERT_TRUE(delegate.object->calls().waitFor(1002));
}

volatile std::sig_atomic_t signalsSeen = 0;

TEST_F(SocketConnectionTest, leavesTheHostsSignalHandlingAlone) {
  struct sigaction mine {};
  mine.sa_handler = [](int) { signalsSeen = signalsSeen + 1; };
  const int watched[] = {SIGPIPE, SIGUSR1, SIGUSR2, SIGCHLD, SIGIO};
  struct sigaction before[std::size(watched)];
  for (size_t i = 0; i < std::size(watched); ++i) ASSERT_EQ(sigaction(watched[i], &mine, &before[i]), 0);
  signalsSeen = 0;
  serve();
  {
    const auto connection = connected();
    ASSERT_TRUE(callAndWait(*connection, Operation::kEcho, {}).values);
    stopServing();
    ASSERT_TRUE(clientEvents.waitFor(1));
    call(*connection, Operation::kEcho, {});  // to a service that has gone
    ASSERT_TRUE(outcomes.waitFor(2));
  }
  client.reset();
  for (size_t i = 0; i < std::size(watched); ++i) {
    struct sigaction now {};
    ASSERT_EQ(sigaction(watched[i], &before[i], &now), 0);
    EXPECT_EQ(now.sa_handler, mine.sa_handler) << "signal " << watched[i];
  }
  EXPECT_EQ(signalsSeen, 0);
}

}  // namespace
}  // namespace telvane::testing
