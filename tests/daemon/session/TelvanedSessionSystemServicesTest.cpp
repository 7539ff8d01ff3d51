// Sessions whose events go to services of the system: wireless diagnostics and the power log.
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

constexpr char kBundle[] = "/System/Library/PrivateFrameworks/Confluxa.framework/Frameworks/ZPHPerformance.framework";

class TelvanedSessionSystemServicesTest : public DaemonFixture {
 protected:
  TelvanedSessionSystemServicesTest() { process.wirelessDiagnostics().putClass(kBundle, "VDRAdaptor"); }
  // The bag that client types 7, 11, 13 and 20 share.
  void givenConferencingSection(Dictionary section) {
    givenStorebag(StorebagBuilder().set(kEnvironmentRelease, std::move(section)), "conferencing");
  }
  static Dictionary builtInSection() { return {{kTelvaneBackendVDR, Dictionary{{kProfileActive, true}}}}; }
  // What the adaptor was given of a method and status.
  std::vector<Dictionary> handedOver(int method, int status) {
    std::vector<Dictionary> found;
    for (const auto& message : process.wirelessDiagnostics().messages()) {
      if (message.method == method && message.respCode == status) found.push_back(message.dict);
    }
    return found;
  }
};

TEST_F(TelvanedSessionSystemServicesTest, eventsOfThreeClientTypesGoToWirelessDiagnostics) {
  givenConferencingSection(builtInSection());
  for (const int type : {7, 11, 13}) {
    const auto client = openSession(sessionInfo(type, static_cast<uint32_t>(type)));
    EXPECT_EQ(client->start()[0], Value(Array{"vdr"})) << type;
    EXPECT_EQ(client->send(42, type, {{Key("rating"), 5}})[0], Value()) << "there is no text for the client";
    ASSERT_EQ(handedOver(42, type).size(), 1u) << type;
    EXPECT_EQ(handedOver(42, type)[0], (Dictionary{{Key("rating"), 5}}));
  }
}

TEST_F(TelvanedSessionSystemServicesTest, aTypeOfTheSameBagThatTheServiceDoesNotTakeHasNoBackend) {
  givenConferencingSection(builtInSection());
  log().expectError("VDRBackend(initWithName): No matching bundle found for client type 20");
  const auto client = openSession(sessionInfo(20));
  EXPECT_EQ(client->start()[0], Value());
  client->send(42);
  EXPECT_TRUE(process.wirelessDiagnostics().messages().empty());
}

TEST_F(TelvanedSessionSystemServicesTest, theUsersConsentIsNotAskedFor) {
  process.consent().set(false);
  givenConferencingSection(builtInSection());
  const auto client = startSession(sessionInfo(7));
  client->send(42, 1);
  EXPECT_EQ(handedOver(42, 1).size(), 1u);
}

TEST_F(TelvanedSessionSystemServicesTest, bothEndsOfASessionAreHandedOverToo) {
  givenConferencingSection(builtInSection());
  auto client = startSession(sessionInfo(7));
  EXPECT_EQ(handedOver(0, 0).size(), 1u);
  client.reset();
  world.advance(std::chrono::minutes(1));
  EXPECT_EQ(handedOver(0, 1).size(), 1u);
  EXPECT_EQ(process.wirelessDiagnostics().liveAdaptors(), 0u);
  EXPECT_EQ(process.wirelessDiagnostics().liveBundles(), 0u);
}

TEST_F(TelvanedSessionSystemServicesTest, aMessageWithoutASessionIsHandedOverAsItIs) {
  givenConferencingSection(builtInSection());
  const auto client = connect();
  EXPECT_EQ(client->sendOneMessage(sessionInfo(11), userInfo(), Dictionary{{Key("k"), 1}})[0], Value("finished"));
  ASSERT_EQ(handedOver(7, 2).size(), 1u) << log().text();
  EXPECT_EQ(handedOver(7, 2)[0][Key("k")], Value(1));
}

TEST_F(TelvanedSessionSystemServicesTest, whatAHierarchySharesIsNotHandedOver) {
  givenConferencingSection(builtInSection());
  Dictionary info = sessionInfoIn("call", 0);
  info.set(kTelvaneSessionInfoClientType, 7);
  const auto client = startSession(info);
  client->tell(DaemonClient::Operation::UpdateSharedDataForKey, {"shared", "by somebody"});
  client->send(42, 1, {{Key("own"), 1}});
  client->sendMessage(Dictionary{{kTelvaneMessageParametersCategory, 42}, {kTelvaneMessageParametersType, 2}});
  ASSERT_EQ(handedOver(42, 1).size(), 1u);
  EXPECT_EQ(handedOver(42, 1)[0], (Dictionary{{Key("own"), 1}}));
  ASSERT_EQ(handedOver(42, 2).size(), 1u);
  EXPECT_EQ(handedOver(42, 2)[0], Dictionary()) << "the client sent nothing with it";
}

TEST_F(TelvanedSessionSystemServicesTest, aDeviceWithoutTheServiceLosesEventsAndGoesOn) {
  givenConferencingSection(builtInSection());
  process.wirelessDiagnostics().removeBundle(kBundle);
  log().expectError("VDRBackend(sendMessage): VDR adaptor (null) does not respond to forwarding selector");
  const auto client = startSession(sessionInfo(7));
  EXPECT_TRUE(client->send(42).values.has_value());
  EXPECT_FALSE(client->isInvalidated());
}

TEST_F(TelvanedSessionSystemServicesTest, thePowerLogIsEnabledAndGetsNothing) {
  givenSection({{kTelvaneBackendWattbook, Dictionary()}});
  const auto client = openSession();
  EXPECT_EQ(client->start()[0], Value(Array{"power"}));
  client->send(42, 1, {{Key("k"), 1}});
  EXPECT_TRUE(process.powerLog().entries().empty());
}

TEST_F(TelvanedSessionSystemServicesTest, aSystemServiceBesideACollectorChangesNothingOfWhatIsPosted) {
  Dictionary section = StorebagBuilder::section("splunk");
  section.set(kTelvaneBackendVDR, Dictionary{{kProfileActive, true}});
  section.set(kTelvaneBackendWattbook, Dictionary());
  givenConferencingSection(section);
  const auto client = startSession(sessionInfo(7));
  client->send(42, 1, {{Key("k"), 1}});
  client->flush();
  ASSERT_EQ(postedEvents(42, 1).size(), 1u) << log().text();
  EXPECT_THAT(postedEvents(42, 1)[0], HasEntry("k", 1));
  ASSERT_EQ(handedOver(42, 1).size(), 1u);
  EXPECT_EQ(handedOver(42, 1)[0], (Dictionary{{Key("k"), 1}}));
}

// The bag of the house is offered when the first fetch fails, but it has no envelope, so no session gets it.
TEST_F(TelvanedSessionSystemServicesTest, theBuiltInBagIsOfferedAndRefused) {
  givenDefault(kTelvaneDefaultsSuite, kDefaultsStorebagURL, "https://bags.example");
  log().allowErrors();
  const auto client = openSession(sessionInfo(7));
  EXPECT_EQ(client->start()[0], Value());
  EXPECT_TRUE(hasLine(log(), "fetchNetworkStorebag: Loading default storebag 'conferencing'"));
  EXPECT_TRUE(hasLine(log(), "fetchStorebagWithName: Signature is missing"));
  EXPECT_TRUE(process.wirelessDiagnostics().openedPaths().empty());
}

}  // namespace
}  // namespace telvane::testing
