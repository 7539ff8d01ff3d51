// Sessions whose events go to a live dashboard.
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;

constexpr char kIP[] = "192.0.2.7";
constexpr uint16_t kPort = 9000;

class TelvanedSessionDashboardTest : public DaemonFixture {
 protected:
  static Dictionary dashboardProfile() {
    return {{kProfileIP, kIP}, {kProfilePort, kPort}, {kProfileReliable, 100}, {kProfileDisplayURL, "https://show"}};
  }
  static Dictionary onlyADashboard() {
    Dictionary section;
    section.set("dashboard", dashboardProfile());
    return section;
  }
  SimulatedDatagramNetwork::Server& dashboard() { return world.datagrams().serve(kIP, kPort); }
  // The texts that have come for events of that method, each arrival one.
  std::vector<std::string> texts(int method) {
    std::vector<std::string> texts;
    for (const auto& arrival : dashboard().arrivals()) {
      if ((arrival.bytes.at(16) << 8 | arrival.bytes.at(17)) != method) continue;
      texts.emplace_back(arrival.bytes.begin() + 64, arrival.bytes.end());
    }
    return texts;
  }
  void givenAcknowledgements() {
    dashboard().onArrival([this](const auto& arrival) { dashboard().answer(arrival.from, arrival.bytes); });
  }
};

TEST_F(TelvanedSessionDashboardTest, theClientIsAnsweredWithTheLine) {
  givenAcknowledgements();
  givenSection(onlyADashboard());
  const auto client = openSession();
  EXPECT_EQ(client->start()[0], Value(Array{"dashboard"}));
  EXPECT_THAT(client->send(7, 2, {{Key("k"), "v"}})[0].text(),
              HasSubstr("127.0.0.1 MEDIA     3    42     2     7     2  k=v"));
  EXPECT_THAT(texts(7), ::testing::ElementsAre(" k=v"));
  EXPECT_EQ(client->ask(ClientSessionOperation::FetchDisplayURL)[0], Value("https://show"));
}

TEST_F(TelvanedSessionDashboardTest, anHTTPSBackendsAnswerGoesFirst) {
  givenAcknowledgements();
  Dictionary section = sectionOf({{"splunk", clientWith(kClientEntryExpedite, 1)}});
  section.set("dashboard", dashboardProfile());
  givenSection(section);
  const auto client = startSession();
  EXPECT_THAT(client->send(7, 2)[0].text(), ::testing::Not(HasSubstr("127.0.0.1 MEDIA")));
}

TEST_F(TelvanedSessionDashboardTest, whatSessionsShareIsNotSent) {
  givenAcknowledgements();
  givenSection(onlyADashboard());
  const auto root = startSession(sessionInfoIn("call", 0, 1));
  const auto client = startSession(sessionInfoIn("call", 1, 2));
  const Dictionary shared{{Key("shared"), 1}};
  root->tell(ClientSessionOperation::UpdateSharedDataWithDictionary, {shared});
  ASSERT_EQ(agent().sharedDataForSession(*sessions().back()), shared) << "both have it";
  client->send(7, 2, {{Key("own"), 2}});
  client->sendMessage(Dictionary{{kTelvaneMessageParametersCategory, 8}, {kTelvaneMessageParametersType, 2}});
  EXPECT_THAT(texts(7), ::testing::ElementsAre(" own=2"));
  EXPECT_THAT(texts(8), ::testing::ElementsAre("")) << "a message without a payload";
}

TEST_F(TelvanedSessionDashboardTest, aOneShotMessageIsSentAndItsSocketClosed) {
  givenAcknowledgements();
  givenSection(onlyADashboard());
  auto client = connect();
  client->sendOneMessage(sessionInfo(), userInfo(), Dictionary{{Key("k"), "v"}});
  client.reset();
  world.advance(std::chrono::minutes(1));
  bool hasCome = false;
  for (const auto& arrival : dashboard().arrivals()) {
    hasCome = hasCome || std::string(arrival.bytes.begin() + 64, arrival.bytes.end()) == " k=v";
  }
  EXPECT_TRUE(hasCome);
  EXPECT_EQ(world.datagrams().openSockets(), 0u);
}

TEST_F(TelvanedSessionDashboardTest, aOneShotMessageInTheMidstOfASessionLeavesNoSocketBehind) {
  givenSection(onlyADashboard());
  auto client = startSession();
  client->send(7, 2);
  for (int n = 0; n < 5; ++n) client->sendOneMessage(sessionInfo(), userInfo(), Dictionary());
  EXPECT_EQ(world.datagrams().openSockets(), 6u) << "they wait for acknowledgements";
  world.advance(std::chrono::seconds(20));
  EXPECT_EQ(world.datagrams().openSockets(), 1u) << "the session's own";
  client.reset();
  world.advance(std::chrono::seconds(20));
  EXPECT_EQ(world.datagrams().openSockets(), 0u);
}

TEST_F(TelvanedSessionDashboardTest, aCrowdOfOneShotMessagesDoesNotTakeAllSockets) {
  givenSection(onlyADashboard());
  auto client = connect();
  constexpr int kCrowd = 100;
  for (int n = 0; n < kCrowd; ++n) client->sendOneMessage(sessionInfo(), userInfo(), Dictionary());
  EXPECT_EQ(world.datagrams().openSockets(), 65u) << "64 that wait for acknowledgements, and the last one";
  client.reset();
  world.advance(std::chrono::seconds(30));
  EXPECT_EQ(world.datagrams().openSockets(), 0u);
}

TEST_F(TelvanedSessionDashboardTest, theEndOfASessionIsSentAgainUntilItIsAcknowledgedButHoldsNoTransaction) {
  givenSection(onlyADashboard());
  // Without names there is no connectivity helper, which would hold one for its own reasons.
  auto client = startSession(sessionInfo(), Value());
  dashboard().clear();
  client.reset();
  world.advance(std::chrono::milliseconds(1));
  EXPECT_THAT(texts(0), ::testing::SizeIs(1));
  EXPECT_EQ(process.transactions().open(), 0);
  EXPECT_EQ(world.datagrams().openSockets(), 1u);
  world.advance(std::chrono::seconds(20));
  EXPECT_THAT(texts(0), ::testing::SizeIs(::testing::Ge(5))) << "the start, too, was not acknowledged";
  EXPECT_EQ(world.datagrams().openSockets(), 0u);
}

TEST_F(TelvanedSessionDashboardTest, consentIsNotAskedFor) {
  process.consent().set(false);
  givenAcknowledgements();
  Dictionary section = sectionOf({{"splunk", clientWith(kClientEntryExpedite, 1)}});
  section.set("dashboard", dashboardProfile());
  givenSection(section);
  const auto client = openSession();
  EXPECT_EQ(client->start()[0], Value(Array{"dashboard"}));
  client->send(7, 2);
  EXPECT_THAT(texts(7), ::testing::SizeIs(1));
  EXPECT_TRUE(postedEvents().empty());
}

}  // namespace
}  // namespace telvane::testing
