// Collectors that do not do what they should while events keep coming.
#include <gmock/gmock.h>

#include <atomic>

#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/endtoend/Latch.h"
#include "tests/endtoend/WireFixture.h"
#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using Answer = WireServer::Answer;
using Then = WireServer::Then;

constexpr uint16_t kEvent = 21;

bool hasEvent(const WireRequest& post, int64_t number) {
  return post.header("X-TVN-Event-Map") == "21 " + std::to_string(number);
}

class CollectorStreamTest : public WireFixture {
 protected:
  CollectorStreamTest() {
    instance().givenConsent(true);
    givenSection(section("splunk", Array{Value(clientEntry())}));
  }
  static ClientScript session(bool batches, const char* clientName = "sender") {
    ClientScript script;
    script.open(sessionInfo(batches), userInfo(clientName)).configure();
    return script;
  }
  // The numbers of the events that have arrived, one for each time that one arrived.
  std::vector<int64_t> numbers() const {
    std::vector<int64_t> result;
    for (const Dictionary& event : arrived(kEvent)) result.push_back(event["n"].integerValue());
    return result;
  }
  static Dictionary numbered(int64_t number) { return {{"n", number}}; }
  // Answers posts that carry the event with that number in this way, all others well.
  void givenAnswerTo(int64_t number, const Answer& bad) {
    givenPostsAnsweredBy([number, bad](const WireRequest& post) {
      for (const Dictionary& event : eventsOf({post}, kEvent)) {
        if (event["n"] == Value(number)) return bad;
      }
      return WireServer::answer(200);
    });
  }
};

TEST_F(CollectorStreamTest, a503InTheMiddleEndsTheStreamForGood) {
  givenAnswerTo(2, WireServer::answer(503));
  ClientScript script = session(true);
  for (int n = 0; n < 3; ++n) script.send(kEvent, 1, numbered(n)).flush();
  for (int n = 3; n < 200; ++n) script.send(kEvent, 1, numbered(n), n % 5);
  script.flush().fetchStates(userInfo("other")).send(kEvent, 1, numbered(1000), 3).flush();
  startDaemon();
  const std::string said = run(script);
  stopDaemon();
  EXPECT_THAT(said, HasSubstr("configured: [splunk]\nflushed: ok\nflushed: ok\n"
                              "flushed: error 503 backend splunk disabled by server 503 return code\n"
                              "flushed: error -1 Nothing to flush\nstates: []\n"
                              "flushed: error -1 Nothing to flush"));
  EXPECT_THAT(numbers(), ::testing::ElementsAre(0, 1, 2)) << "nothing goes to a server that said stop";
}

TEST_F(CollectorStreamTest, a503ToOneBackendLeavesTheOthersAlone) {
  Dictionary both = section("splunk", Array{Value(clientEntry())});
  both.addEntriesFrom(section("gonzo", Array{Value(entryPostingTo(server().url("/gonzo")))}));
  givenSection(both);
  givenPostsAnsweredBy(
      [](const WireRequest& post) { return WireServer::answer(post.target() == "/events" ? 500 : 200); });
  ClientScript script = session(true);
  script.send(kEvent, 1, numbered(0)).flush().send(kEvent, 1, numbered(1)).flush().fetchStates(userInfo());
  startDaemon();
  EXPECT_THAT(run(script), HasSubstr("states: [gonzo]"));
  stopDaemon();
  std::vector<WireRequest> gonzo = posts();
  std::erase_if(gonzo, [](const WireRequest& post) { return post.target() != "/gonzo"; });
  EXPECT_EQ(eventsOf(gonzo, kEvent).size(), 2u);
  EXPECT_EQ(numbers().size(), 3u);
}

TEST_F(CollectorStreamTest, anyAnswerButAServerErrorIsTaken) {
  static constexpr int kStatuses[] = {200, 204, 302, 400, 404, 413, 429, 499};
  givenPostsAnsweredBy([](const WireRequest& post) {
    for (const Dictionary& event : eventsOf({post}, kEvent)) {
      return WireServer::answer(kStatuses[event["n"].integerValue()], "");
    }
    return WireServer::answer(200);
  });
  ClientScript script = session(true);
  for (size_t n = 0; n < std::size(kStatuses); ++n) script.send(kEvent, 1, numbered(static_cast<int64_t>(n))).flush();
  startDaemon();
  const std::string said = run(script);
  stopDaemon();
  EXPECT_THAT(said, ::testing::Not(HasSubstr("error")));
  EXPECT_THAT(numbers(), ::testing::ElementsAre(0, 1, 2, 3, 4, 5, 6, 7)) << "each once, also when it was refused";
}

// The connection is a fresh one, so that nobody can take the break for a kept connection that had grown old.
TEST_F(CollectorStreamTest, aConnectionThatBreaksCostsItsEventsOnly) {
  givenPostsAnsweredBy([](const WireRequest& post) {
    const auto events = eventsOf({post}, kEvent);
    Answer answer = WireServer::answer(200);
    const bool isBad = !events.empty() && events[0]["n"] == Value(1);
    if (isBad) answer.bytes.clear();
    answer.then = isBad ? Then::Reset : Then::Close;
    return answer;
  });
  ClientScript script = session(true);
  for (int n = 0; n < 4; ++n) script.send(kEvent, 1, numbered(n)).flush();
  startDaemon();
  const std::string said = run(script);
  stopDaemon();
  EXPECT_THAT(said, HasSubstr("flushed: error -"));
  EXPECT_THAT(said, ::testing::EndsWith("flushed: ok\nflushed: ok\n"));
  EXPECT_TRUE(
      eventually([this] { return instance().daemonLogHas("HTTPSPostBackend(postJsonMessage): post error: "); }));
  EXPECT_THAT(numbers(), ::testing::ElementsAre(0, 1, 2, 3)) << "and nothing is sent a second time";
}

// Without a byte of an answer on a connection that was kept, the client cannot tell a server that had hung up before
// from one that read everything and then broke: it asks once more, and the collector may have heard it twice.
TEST_F(CollectorStreamTest, aKeptConnectionThatBreaksBringsItsRequestOnceMore) {
  std::atomic<int> arrivals = 0;
  givenPostsAnsweredBy([&arrivals](const WireRequest& post) {
    const auto events = eventsOf({post}, kEvent);
    const bool isBad = !events.empty() && events[0]["n"] == Value(1) && ++arrivals == 1;
    return isBad ? Answer{"", Then::Reset} : WireServer::answer(200);
  });
  ClientScript script = session(true);
  for (int n = 0; n < 3; ++n) script.send(kEvent, 1, numbered(n)).flush();
  startDaemon();
  EXPECT_THAT(run(script), ::testing::EndsWith("flushed: ok\nflushed: ok\nflushed: ok\n"));
  stopDaemon();
  EXPECT_THAT(numbers(), ::testing::ElementsAre(0, 1, 1, 2));
  std::vector<WireRequest> twice = posts();
  std::erase_if(twice, [](const WireRequest& post) {
    const auto events = eventsOf({post}, kEvent);
    return events.empty() || events[0]["n"] != Value(1);
  });
  ASSERT_EQ(twice.size(), 2u);
  EXPECT_EQ(twice[0].head, twice[1].head);
  EXPECT_EQ(twice[0].body, twice[1].body);
}

TEST_F(CollectorStreamTest, anAnswerThatBreaksOffIsAnErrorAndNoMore) {
  givenAnswerTo(1, {"HTTP/1.1 200 OK\r\nContent-Length: 1000\r\n\r\n{", Then::Close});
  ClientScript script = session(true);
  for (int n = 0; n < 3; ++n) script.send(kEvent, 1, numbered(n)).flush();
  startDaemon();
  const std::string said = run(script);
  stopDaemon();
  EXPECT_THAT(said, HasSubstr("flushed: ok\nflushed: error -"));
  EXPECT_THAT(said, ::testing::EndsWith("flushed: ok\n"));
  EXPECT_THAT(numbers(), ::testing::ElementsAre(0, 1, 2));
}

TEST_F(CollectorStreamTest, anAnswerThatIsNoHTTPIsAnErrorAndNoMore) {
  givenAnswerTo(1, {std::string("\x00\x01garbage\r\n\r\n", 13), Then::Close});
  ClientScript script = session(true);
  for (int n = 0; n < 3; ++n) script.send(kEvent, 1, numbered(n)).flush();
  startDaemon();
  const std::string said = run(script);
  stopDaemon();
  EXPECT_THAT(said, HasSubstr("flushed: ok\nflushed: error -"));
  EXPECT_THAT(said, ::testing::EndsWith("flushed: ok\n"));
}

TEST_F(CollectorStreamTest, aSlowAnswerHoldsUpNobodyElse) {
  Latch latch;
  givenPostsAnsweredBy([&latch](const WireRequest& post) {
    for (const Dictionary& event : eventsOf({post}, kEvent)) {
      if (event["n"] == Value(1)) latch.wait();
    }
    return WireServer::answer(200);
  });
  startDaemon();
  ClientScript waiting = session(true, "waiting");
  waiting.send(kEvent, 1, numbered(1)).flush();
  const auto client = start(waiting, "waiting");
  EXPECT_TRUE(eventually([this] { return numbers().size() == 1; })) << instance().daemonLog();
  ClientScript other = session(true, "other");
  EXPECT_THAT(run(other.send(kEvent, 1, numbered(2)).flush()), HasSubstr("flushed: ok"));
  EXPECT_THAT(instance().read("waiting.out"), ::testing::Not(HasSubstr("flushed"))) << "its answer has not come";
  latch.open();
  EXPECT_EQ(client->wait(), 0);
  EXPECT_THAT(instance().read("waiting.out"), HasSubstr("flushed: ok"));
  stopDaemon();
  EXPECT_THAT(numbers(), ::testing::ElementsAre(1, 2));
}

// The daemon is asked to end while a collector still owes it an answer: it waits, and what waited is sent.
TEST_F(CollectorStreamTest, aDaemonThatIsToEndWaitsForASlowAnswer) {
  Latch latch;
  givenPostsAnsweredBy([&latch](const WireRequest& post) {
    if (hasEvent(post, 5)) latch.wait();
    return WireServer::answer(200);
  });
  ClientScript script = session(false);
  script.send(kEvent, 5, numbered(5)).wait();
  startDaemon();
  const auto client = start(script);
  EXPECT_TRUE(eventually([this] { return numbers().size() == 1; })) << instance().daemonLog();
  instance().daemon().signal(SIGTERM);
  EXPECT_TRUE(eventually([this] { return arrived(0).size() == 2; })) << "the session's last event\n"
                                                                     << instance().daemonLog();
  EXPECT_TRUE(instance().daemon().isRunning());
  latch.open();
  EXPECT_EQ(instance().daemon().wait(), 0);
  expectEnd(*client);
}

}  // namespace
}  // namespace telvane::testing
