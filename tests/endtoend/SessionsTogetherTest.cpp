// Sessions of several processes that meet in one daemon.
#include <gmock/gmock.h>

#include "interfaces/AgentKeys.h"
#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/endtoend/HierarchyFixture.h"
#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr int kMany = 60;  // more than fit into one batch

class SessionsTogetherTest : public HierarchyFixture {
 protected:
  // A client that configures itself, sends many events and waits.
  void startSender(const std::string& name, Dictionary info, int count = kMany) {
    ClientScript script;
    script.openAggregating(std::move(info), userInfo(name.c_str())).configure();
    script.sendMany(kCategory, name, count);
    startUntilWaiting(script.flush().wait(), name);
  }
  // The session ID that all events of the sender carry.
  std::string sessionIDOf(const std::string& from) {
    std::set<std::string> found;
    for (const Dictionary& event : eventsFrom(from)) found.emplace(event[kEventSessionID].text());
    EXPECT_EQ(found.size(), 1u) << from;
    return found.empty() ? "" : *found.begin();
  }
};

TEST_F(SessionsTogetherTest, eachEventReachesTheRootsClientAndTheCollectorOnce) {
  startDaemon();
  startSender("root", infoIn("t", 0));
  startSender("child", infoIn("t", 1));
  startSender("grandchild", infoIn("t", 2));
  for (const char* from : {"root", "child", "grandchild"}) {
    EXPECT_TRUE(hears("root", from, kMany)) << from;
    EXPECT_EQ(heard("root", from), upTo(kMany)) << from;
    expectEachOnce(from, kMany);
  }
  endAll();
  stopDaemon();
  for (const char* from : {"root", "child", "grandchild"}) {
    EXPECT_THAT(heard("child", from), IsEmpty()) << from;
    EXPECT_THAT(heard("grandchild", from), IsEmpty()) << from;
    EXPECT_EQ(heard("root", from), upTo(kMany)) << from;
    EXPECT_EQ(numbersFrom(from), upTo(kMany)) << from;
  }
  EXPECT_EQ(timesSaid("child", "aggregated: end"), 1u) << "that it hears no more";
  EXPECT_EQ(timesSaid("grandchild", "aggregated: end"), 1u);
}

TEST_F(SessionsTogetherTest, eventsAndHeadersNameTheWholeChain) {
  givenSection(section("splunk", Array{Value(entryWith(kClientEntryIncludeSessionID, 1))}));
  startDaemon();
  startSender("root", infoIn("t", 0), 1);
  startSender("child", infoIn("t", 1), 1);
  startSender("grandchild", infoIn("t", 2), 1);
  endAll();
  stopDaemon();
  const std::string root = sessionIDOf("root");
  const std::string child = sessionIDOf("child");
  const std::string grandchild = sessionIDOf("grandchild");
  EXPECT_THAT(child, ::testing::StartsWith(root + "."));
  EXPECT_THAT(grandchild, ::testing::StartsWith(child + "."));
  EXPECT_EQ(root.size(), 24u);
  EXPECT_EQ(grandchild.size(), 3 * root.size() + 2);
  constexpr size_t kHeaderLength = 40;
  std::map<std::string, std::string> headers;
  for (const WireRequest& post : posts()) {
    for (const Dictionary& event : eventsOf({post}, kCategory)) {
      headers[std::string(event["from"].text())] = post.header("X-TVN-Session-ID").value_or("none");
    }
  }
  EXPECT_EQ(headers["root"], root);
  EXPECT_EQ(headers["child"], child.substr(0, kHeaderLength));
  EXPECT_EQ(headers["grandchild"], grandchild.substr(0, kHeaderLength));
}

TEST_F(SessionsTogetherTest, sharedDataIsSeenInItsHierarchyAloneAndGoesWithItsLastSession) {
  startDaemon();
  ClientScript sharing;
  sharing.open(infoIn("t", 0), userInfo("first")).configure();
  sharing.share(Dictionary{{"scene", "one"}}).flush().wait();
  sharing.sendMany(kCategory, "first", 1);
  startUntilWaiting(sharing.flush().wait(), "first");
  ClientScript adding;
  adding.open(infoIn("t", 1), userInfo("second")).configure().share(Dictionary{{"more", 2}});
  adding.sendMany(kCategory, "second", 1);
  startUntilWaiting(adding.flush().wait(), "second");
  startSender("stranger", infoIn("u", 0), 1);
  startSender("alone", sessionInfo(), 1);
  client("first").writeLine();
  EXPECT_TRUE(says("first", "waiting", 2));
  for (const char* from : {"first", "second", "stranger", "alone"}) expectEachOnce(from, 1);
  for (const char* from : {"first", "second"}) {
    EXPECT_THAT(eventsFrom(from).at(0), HasEntry("scene", "one")) << from;
    EXPECT_THAT(eventsFrom(from).at(0), HasEntry("more", 2)) << from;
  }
  for (const char* from : {"stranger", "alone"}) {
    EXPECT_FALSE(eventsFrom(from).at(0).contains("scene")) << from;
    EXPECT_FALSE(eventsFrom(from).at(0).contains("more")) << from;
  }

  end("first");
  EXPECT_TRUE(comesToHave(3, 2));
  startSender("third", infoIn("t", 2), 1);
  expectEachOnce("third", 1);
  EXPECT_THAT(eventsFrom("third").at(0), HasEntry("scene", "one")) << "the hierarchy lives on";
  end("second");
  end("third");
  EXPECT_TRUE(comesToHave(2, 1));
  startSender("heir", infoIn("t", 0), 1);
  expectEachOnce("heir", 1);
  EXPECT_FALSE(eventsFrom("heir").at(0).contains("scene"));
  endAll();
}

// Each client type has a bag of its own: the parents' say out and in, the children's would always be in.
TEST_F(SessionsTogetherTest, aChildIsSampledInAndOutWithItsParent) {
  constexpr int kAlwaysInType = 9;
  constexpr double kParentsThreshold = 2.0;
  givenSection(section("splunk", Array{Value(entryWith(kClientEntrySamplingThreshold, 0.0))}));
  givenSection(section("splunk", Array{Value(entryWith(kClientEntrySamplingThreshold, kParentsThreshold))}),
               kOtherBagName);
  givenSection(section("splunk", Array{Value(clientEntry())}), "camera");
  startDaemon();
  startSender("out", infoIn("out", 0), 1);
  startSender("childOfOut", infoIn("out", 1, kAlwaysInType), 1);
  startSender("in", infoIn("in", 0, kOtherClientType), 1);
  startSender("childOfIn", infoIn("in", 1, kAlwaysInType), 1);
  startSender("childOfNobody", infoIn("nobody", 1, kAlwaysInType), 1);
  for (const char* name : {"out", "childOfOut"}) EXPECT_EQ(timesSaid(name, "configured: []"), 1u) << name;
  for (const char* name : {"in", "childOfIn", "childOfNobody"}) {
    EXPECT_EQ(timesSaid(name, "configured: [splunk]"), 1u) << name;
  }
  endAll();
  stopDaemon();
  for (const char* name : {"out", "childOfOut"}) EXPECT_THAT(eventsFrom(name), IsEmpty()) << name;
  for (const char* name : {"in", "childOfIn", "childOfNobody"}) EXPECT_EQ(numbersFrom(name), upTo(1)) << name;
  EXPECT_TRUE(eventually([this] {
    return instance().daemonLogHas("splunk: state and sampling rate updated to 2, 2.00%");
  })) << instance().daemonLog();
}

TEST_F(SessionsTogetherTest, theSixthSessionOfAClientTypeIsCutOffUntilOneOfTheFiveEnds) {
  startDaemon();
  for (int i = 1; i <= 5; ++i) startSender("client" + std::to_string(i), sessionInfo(), 1);
  ClientScript sixth;
  sixth.open(sessionInfo(), userInfo("sixth")).fetchStates(userInfo("sixth")).wait();
  sixth.sendMany(kCategory, "sixth", 1);
  startUntilWaiting(sixth.flush(), "sixth");
  EXPECT_EQ(timesSaid("sixth", "states: nothing"), 1u);
  EXPECT_TRUE(eventually([this] {
    return instance().daemonLogHas("exceeds number of allowed active connections for clientType 7. Session terminated");
  })) << instance().daemonLog();
  startSender("otherType", sessionInfo(true, kOtherClientType), 1);
  end("sixth");
  EXPECT_TRUE(comesToHave(6, 0));
  end("client3");
  EXPECT_TRUE(comesToHave(5, 0));
  startSender("seventh", sessionInfo(), 1);
  EXPECT_EQ(timesSaid("seventh", "configured: [splunk]"), 1u);
  endAll();
  stopDaemon();
  for (const char* from : {"client1", "client2", "client3", "client4", "client5", "otherType", "seventh"}) {
    EXPECT_EQ(numbersFrom(from), upTo(1)) << from;
  }
  EXPECT_THAT(eventsFrom("sixth"), IsEmpty());
}

TEST_F(SessionsTogetherTest, namesThatDifferInCaseAloneShareOneHelper) {
  startDaemon();
  const auto startAs = [this](const char* name, const char* clientName, const char* serviceName, int clientType) {
    ClientScript script;
    script.open(sessionInfo(true, clientType),
                Dictionary{{kTelvaneUserInfoClientName, clientName}, {kTelvaneUserInfoServiceName, serviceName}});
    script.configure().sendMany(kCategory, name, 1);
    startUntilWaiting(script.flush().wait(), name);
  };
  startAs("first", "Foo", "Bar", kClientType);
  startAs("second", "foo", "bar", kClientType);
  startAs("third", "fOO", "BAR", kOtherClientType);
  const auto helpers = [this] { return status()[kStatusConnectivityHelpers]; };
  EXPECT_EQ(helpers(), Value(1));
  startAs("other", "foo", "baz", kClientType);
  EXPECT_EQ(helpers(), Value(2));
  EXPECT_TRUE(eventually([this] {
    return instance().daemonLogHas("Found existing shared connectivity helper for userInfoKey foo:bar");
  })) << instance().daemonLog();
  end("first");
  for (const char* from : {"first", "second", "third", "other"}) expectEachOnce(from, 1);
  endAll();
  stopDaemon();
}

}  // namespace
}  // namespace telvane::testing
