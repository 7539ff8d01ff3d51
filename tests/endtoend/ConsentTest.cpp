// Nothing leaves this machine without its user's consent, unless the bag overrides it or names a dashboard. All roads
// out of the daemon end in this test: every storebag, every post and every connection at one server, every dashboard
// datagram at one socket. The daemon's own end is the barrier, since it ends only when everything that it held has
// left. Each bag is tried twice: with consent the same events do arrive, so a silence is the consent's work and not the
// bag's.
#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <set>
#include <stdexcept>

#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/PropertyList.h"
#include "tests/endtoend/WireFixture.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

constexpr uint16_t kEvent = 21;
constexpr uint16_t kEventOfOthers = 22;
constexpr uint16_t kOneShot = 23;
// All that mean something, and some that do not.
constexpr uint32_t kFlags[] = {0, 1, 2, 3, 4, 5, 7, 8, 255, 65537, 0x80000000, 0xFFFFFFFF};

// A bound socket, as a dashboard has one.
class DatagramSocket {
 public:
  DatagramSocket() : _socket(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t size = sizeof address;
    auto* const raw = reinterpret_cast<sockaddr*>(&address);
    if (bind(_socket, raw, size) != 0 || getsockname(_socket, raw, &size) != 0) throw std::runtime_error("no port");
    _port = ntohs(address.sin_port);
  }
  ~DatagramSocket() { close(_socket); }
  DatagramSocket(const DatagramSocket&) = delete;
  DatagramSocket& operator=(const DatagramSocket&) = delete;

  uint16_t port() const { return _port; }
  // Takes what has come so far.
  std::vector<std::string> takeAll() const {
    std::vector<std::string> datagrams;
    char bytes[2000];
    for (ssize_t size = 0; (size = recv(_socket, bytes, sizeof bytes, MSG_DONTWAIT)) >= 0;) {
      datagrams.emplace_back(bytes, static_cast<size_t>(size));
    }
    return datagrams;
  }

 private:
  const int _socket;
  uint16_t _port = 0;
};

class ConsentFixture : public WireFixture {
 protected:
  // A session that does all that a session can do to get its events out.
  static void addSession(ClientScript& script, bool batches) {
    script.open(sessionInfo(batches), userInfo()).configure();
    script.setDigestKey("secret").share({{"shared", true}});
    for (const uint32_t flag : kFlags) script.send(kEvent, 1, Dictionary{{"flag", flag}}, flag);
    script.flush();
    script.fetchStates(userInfo("somebody else"));
    for (const uint32_t flag : kFlags) script.send(kEventOfOthers, 1, Dictionary{{"flag", flag}}, flag);
    script.flush();
  }
  static ClientScript everything() {
    ClientScript script;
    // First, because nobody is told when it is through, and a process that ends waits only so long for it.
    script.sendOneShot(sessionInfo(), userInfo(), kOneShot, 1, Dictionary{{"flag", -1}});
    addSession(script, true);
    addSession(script, false);
    return script;
  }
  void givenConsent(bool isGiven) { instance().givenConsent(isGiven); }
  // Runs it with a daemon of its own and returns what the client was told.
  std::string runToTheEnd(const ClientScript& script = everything()) {
    startDaemon();
    const std::string said = run(script);
    stopDaemon();
    return said;
  }
  void expectNothingHasLeft() {
    EXPECT_EQ(posts().size(), 0u) << posts().front().head << jsonOf(posts().front());
    EXPECT_TRUE(server().strays().empty()) << server().strays().front();
    EXPECT_THAT(_dashboard.takeAll(), ::testing::IsEmpty());
    std::set<size_t> connections;
    for (const WireRequest& request : server().requests()) {
      EXPECT_THAT(request.head, ::testing::StartsWith("GET /bags/")) << request.head;
      EXPECT_EQ(request.body, "");
      connections.insert(request.connection);
    }
    EXPECT_EQ(server().connections(), connections.size()) << "a connection that asked for no bag";
  }
  std::multiset<int64_t> flagsArrived(uint16_t category) const {
    std::multiset<int64_t> flags;
    for (const Dictionary& event : arrived(category)) flags.insert(event["flag"].integerValue());
    return flags;
  }
  // That each flag has arrived under both names from both sessions, and the one-shot: copies times.
  void expectEverythingHasArrived(size_t copies = 1) {
    for (const uint16_t category : {kEvent, kEventOfOthers}) {
      const std::multiset<int64_t> flags = flagsArrived(category);
      for (const uint32_t flag : kFlags) EXPECT_EQ(flags.count(flag), 2 * copies) << category << " with " << flag;
    }
    EXPECT_EQ(flagsArrived(kOneShot).size(), copies);
    if (HasFailure()) std::cerr << instance().daemonLog();
  }
  const DatagramSocket& dashboard() const { return _dashboard; }

 private:
  const DatagramSocket _dashboard;
};

// A bag that does not override consent, as a section over the places where events can go.
struct Bag {
  const char* name;
  std::function<Dictionary(const Dictionary& entry, const WireServer& server)> section;
  size_t backends = 1;
};

void PrintTo(const Bag& bag, std::ostream* stream) { *stream << bag.name; }

Dictionary sectionOf(std::initializer_list<std::pair<const char*, Array>> backends) {
  Dictionary section;
  for (const auto& [name, entries] : backends) section.set(name, Dictionary{{kProfileClients, entries}});
  return section;
}

// A bag whose only entry has these keys beside those that let everybody report.
Bag entryWithKeys(const char* name, std::vector<std::pair<Key, Value>> keys) {
  return {name, [keys = std::move(keys)](Dictionary entry, const WireServer&) {
            for (const auto& [key, value] : keys) entry.set(key, value);
            return sectionOf({{"splunk", Array{Value(entry)}}});
          }};
}

Bag entryOverriding(const char* name, Value value) { return entryWithKeys(name, {{kClientEntryOverrideDNU, value}}); }

Dictionary with(Dictionary entry, const Key& key, Value value) {
  entry.set(key, std::move(value));
  return entry;
}

std::vector<Bag> bagsThatRespectConsent() {
  const Dictionary anywhere{{kPerCountryCountry, Array{"US"}}, {kPerCountryThreshold, 1.0}};
  std::vector<Bag> bags = {
      entryWithKeys("plain", {}),
      entryWithKeys("whitelist", {{kClientEntryEventWhitelist, Array{0, kEvent, kEventOfOthers, kOneShot}}}),
      entryWithKeys("expedite", {{kClientEntryExpedite, 1}}),
      entryWithKeys("batching", {{kClientEntryExpedite, 0}}),
      entryWithKeys("lowThreshold", {{kClientEntryEventThreshold, -1}}),
      entryWithKeys("highestSampling", {{kClientEntrySamplingThreshold, 1e9}, {kClientEntryOverrideSampling, 1}}),
      entryWithKeys("samplingPerCountry", {{kClientEntrySamplingThreshold, 0},
                                           {kClientEntryPerCountrySamplingThresholds, Array{Value(anywhere)}}}),
      entryWithKeys("customClientId", {{kClientEntryCustomClientId, true}, {kClientEntryExtrasOnInternal, 1}}),
      entryWithKeys("sessionIdInHeader", {{kClientEntryIncludeSessionID, 1}, {kClientEntryUseWiFiOnly, 1}}),
      entryWithKeys("allDevices", {{kClientEntryDeviceWhitelist, Array()}, {kClientEntryDeviceBlacklist, Array()}}),
      {"realtimeURL",
       [](const Dictionary& entry, const WireServer& server) {
         return sectionOf({{"splunk", Array{Value(with(entry, kClientEntryRealtimePostURL, server.url("/now")))}}});
       }},
      {"severalBackends",
       [](const Dictionary& entry, const WireServer&) {
         const Array entries{Value(entry)};
         return sectionOf({{"splunk", entries}, {"gonzo", entries}, {"qrs", entries}, {"my_splunk_2", entries}});
       },
       4},
      {"anOverrideInALaterEntry",
       [](const Dictionary& entry, const WireServer&) {
         return sectionOf({{"splunk", Array{Value(entry), Value(with(entry, kClientEntryOverrideDNU, 1))}}});
       }},
      {"anOverrideForAnotherClient",
       [](const Dictionary& entry, const WireServer&) {
         const Dictionary other = with(with(entry, kClientEntryOverrideDNU, 1), kClientEntryClient, "nobody");
         return sectionOf({{"splunk", Array{Value(other), Value(entry)}}});
       }},
      {"anOverrideForANewerVersion",
       [](const Dictionary& entry, const WireServer&) {
         const Dictionary newer = with(with(entry, kClientEntryOverrideDNU, 1), kClientEntryEnabledSince, "99");
         return sectionOf({{"splunk", Array{Value(newer), Value(entry)}}});
       }},
      {"anOverrideBesideTheEntries",
       [](const Dictionary& entry, const WireServer&) {
         Dictionary profile{{kProfileClients, Array{Value(entry)}}};
         profile.set(kClientEntryOverrideDNU, 1);
         Dictionary section{{"splunk", profile}};
         section.set(kClientEntryOverrideDNU, 1);
         return section;
       }},
  };
  for (Bag& bag :
       std::vector<Bag>{entryOverriding("overrideZero", 0), entryOverriding("overrideTwo", 2),
                        entryOverriding("overrideMinusOne", -1), entryOverriding("overrideFalse", false),
                        entryOverriding("overrideBelowOne", 0.99), entryOverriding("overrideOneInLowBits", 4294967297),
                        entryOverriding("overrideTextTrue", "true"), entryOverriding("overrideTextYes", "YES"),
                        entryOverriding("overrideNoText", ""), entryOverriding("overrideArray", Array{1}),
                        entryOverriding("overrideDictionary", Dictionary{{"override_dnu", 1}}),
                        entryOverriding("overrideData", Data::copyOf("1")), entryOverriding("overrideDate", Date())}) {
    bags.push_back(std::move(bag));
  }
  return bags;
}

class ConsentOverBagsTest : public ConsentFixture, public ::testing::WithParamInterface<Bag> {};

TEST_P(ConsentOverBagsTest, isNeededForAnyEventToLeave) {
  givenSection(GetParam().section(clientEntry(), server()));
  const std::string silent = runToTheEnd();
  expectNothingHasLeft();
  EXPECT_THAT(silent, HasSubstr("configured: []"));
  EXPECT_THAT(silent, Not(HasSubstr("flushed: ok")));

  givenConsent(true);
  const std::string told = runToTheEnd();
  EXPECT_THAT(told, Not(HasSubstr("[]"))) << instance().daemonLog();
  expectEverythingHasArrived(GetParam().backends);
}

INSTANTIATE_TEST_SUITE_P(Bags, ConsentOverBagsTest, ::testing::ValuesIn(bagsThatRespectConsent()),
                         [](const auto& bag) { return std::string(bag.param.name); });

// What counts as the number 1, by the readings that hold for every number of a bag.
class ConsentOverriddenTest : public ConsentFixture, public ::testing::WithParamInterface<Bag> {};

TEST_P(ConsentOverriddenTest, isNotNeededAndTheCollectorIsToldSo) {
  givenSection(GetParam().section(clientEntry(), server()));
  EXPECT_THAT(runToTheEnd(), HasSubstr("configured: [splunk]"));
  expectEverythingHasArrived();
  for (const Dictionary& event : arrived(0)) {
    if (event[kEventStatus] == Value(1)) {
      EXPECT_EQ(event[kEventOpt], Value(1));
    }
  }
  const auto defaults =
      propertylist::parse(Data::copyOf(instance().read("home/Library/Preferences/com.corvex.telvane.plist")));
  ASSERT_TRUE(defaults.has_value());
  ASSERT_FALSE(posts().empty());
  EXPECT_EQ(bodyOf(posts().front())[kBodyClientId], (*defaults->dictionary())["uuidOverrideDNU"]);
}

INSTANTIATE_TEST_SUITE_P(Bags, ConsentOverriddenTest,
                         ::testing::Values(entryOverriding("one", 1), entryOverriding("yes", true),
                                           entryOverriding("text", "1"), entryOverriding("real", 1.0),
                                           entryOverriding("cutReal", 1.9), entryOverriding("wordyText", " +1 please")),
                         [](const auto& bag) { return std::string(bag.param.name); });

// A setting that is no plain yes.
struct Setting {
  const char* name;
  Value value;
};

void PrintTo(const Setting& setting, std::ostream* stream) { *stream << setting.name; }

class ConsentSettingTest : public ConsentFixture, public ::testing::WithParamInterface<Setting> {};

TEST_P(ConsentSettingTest, thatIsNoYesMeansNo) {
  givenSection(section("splunk", Array{Value(clientEntry())}));
  Dictionary setting;
  setting.set("AutoSubmit", GetParam().value);
  instance().givenFile("home/Library/Preferences/com.corvex.diagnostics.plist",
                       propertylist::serialize(setting, propertylist::Format::Binary).value().view());
  runToTheEnd();
  expectNothingHasLeft();
}

INSTANTIATE_TEST_SUITE_P(Settings, ConsentSettingTest,
                         ::testing::Values(Setting{"absent", Value()}, Setting{"no", false}, Setting{"number", 1},
                                           Setting{"text", "YES"}, Setting{"list", Array{true}}),
                         [](const auto& setting) { return std::string(setting.param.name); });

class ConsentTest : public ConsentFixture {
 protected:
  // One session of that name that sends one event.
  static ClientScript oneSession(const char* clientName) {
    ClientScript script;
    script.open(sessionInfo(), userInfo(clientName)).configure().send(kEvent, 1, Dictionary(), 1).flush();
    return script;
  }
  std::set<std::string> clientsHeardOf() const {
    std::set<std::string> names;
    for (const Dictionary& event : eventsOf(posts())) {
      names.emplace(event[kTelvaneUserInfoClientName].text());
    }
    return names;
  }
};

TEST_F(ConsentTest, countsForEachSessionAsItIsWhenTheSessionStarts) {
  givenSection(section("splunk", Array{Value(clientEntry())}));
  startDaemon();
  run(oneSession("before"));
  givenConsent(true);
  run(oneSession("during"));
  givenConsent(false);
  run(oneSession("after"));
  givenConsent(true);
  run(oneSession("again"));
  stopDaemon();
  EXPECT_THAT(clientsHeardOf(), ::testing::ElementsAre("again", "during"));
}

TEST_F(ConsentTest, isNeededWithACachedBagToo) {
  givenSection(section("splunk", Array{Value(clientEntry())}));
  givenConsent(true);
  runToTheEnd();
  const size_t before = posts().size();
  EXPECT_GT(before, 0u);
  givenConsent(false);
  instance().givenStorebagServer("https://127.0.0.1:1/bags");
  EXPECT_THAT(runToTheEnd(), HasSubstr("configured: []"));
  EXPECT_EQ(posts().size(), before);
  givenConsent(true);
  EXPECT_THAT(runToTheEnd(), HasSubstr("configured: [splunk]"));
  expectEverythingHasArrived(2);
}

TEST_F(ConsentTest, isNeededAlsoWhereTheUserDefaultsSayWhereToPost) {
  Dictionary entry = clientEntry();
  entry.set(kClientEntryPostURL, Value());
  givenSection(section("splunk", Array{Value(entry)}));
  const Dictionary defaults{{"httpsPostURL", server().url("/mine")},
                            {"httpsRealtimePostURL", server().url("/mine/now")},
                            {"forceEventLogging", "YES"}};
  instance().givenFile("root/etc/telvane/defaults/com.corvex.telvane.plist",
                       propertylist::serialize(defaults, propertylist::Format::XML).value().view());
  runToTheEnd();
  expectNothingHasLeft();
  givenConsent(true);
  runToTheEnd();
  expectEverythingHasArrived();
}

TEST_F(ConsentTest, isNeededOnAnInternalBuildToo) {
  givenInternalBuild();
  givenSection(section("splunk", Array{Value(entryWith(kClientEntryExtrasOnInternal, 1))}));
  runToTheEnd();
  expectNothingHasLeft();
  givenConsent(true);
  runToTheEnd();
  expectEverythingHasArrived();
}

TEST_F(ConsentTest, isNeededThroughoutAHierarchy) {
  givenSection(section("splunk", Array{Value(clientEntry())}));
  ClientScript script;
  for (int level = 0; level < 3; ++level) {
    Dictionary info = sessionInfo(level == 1);
    info.set(kTelvaneSessionInfoHierarchyToken, Dictionary{{"token", "t"}, {"level", level}});
    script.open(info, userInfo()).configure().share({{"level", level}});
    for (const uint32_t flag : kFlags) script.send(kEvent, 1, Dictionary{{"flag", flag}}, flag);
    script.flush();
  }
  runToTheEnd(script);
  expectNothingHasLeft();
  givenConsent(true);
  runToTheEnd(script);
  EXPECT_EQ(arrived(kEvent).size(), 3 * std::size(kFlags));
}

// An entry for one name overrides, the one for the other does not: after the change nothing leaves any more.
TEST_F(ConsentTest, isNeededAgainWhenTheUserInfoLeavesTheEntryThatOverrides) {
  Dictionary overriding = entryWith(kClientEntryOverrideDNU, 1);
  overriding.set(kClientEntryClient, "sender");
  givenSection(section("splunk", Array{Value(overriding), Value(clientEntry())}));
  runToTheEnd();
  EXPECT_EQ(flagsArrived(kEvent).size(), 2 * std::size(kFlags));
  EXPECT_EQ(flagsArrived(kEventOfOthers).size(), 0u);
  EXPECT_EQ(flagsArrived(kOneShot).size(), 1u);
}

// A dashboard gets everything that it is named for, whatever the user says; the collector beside it gets nothing.
TEST_F(ConsentTest, isNotAskedForByADashboardButStillByTheCollectorBesideIt) {
  Dictionary besideADashboard = sectionOf({{"splunk", Array{Value(clientEntry())}}});
  besideADashboard.set("dashboard", Dictionary{{kProfileIP, "127.0.0.1"}, {kProfilePort, dashboard().port()}});
  givenSection(besideADashboard);
  const std::string told = runToTheEnd();
  EXPECT_THAT(told, HasSubstr("configured: [dashboard]"));
  EXPECT_THAT(told, Not(HasSubstr("splunk")));
  const std::vector<std::string> datagrams = dashboard().takeAll();
  std::multiset<std::string> texts;
  for (const std::string& datagram : datagrams) {
    ASSERT_GE(datagram.size(), 64u);
    texts.insert(datagram.substr(64));
  }
  // Under two names from two sessions.
  for (const uint32_t flag : kFlags) EXPECT_EQ(texts.count(" flag=" + std::to_string(flag)), 4u) << flag;
  EXPECT_EQ(texts.count(" flag=-1"), 1u) << "the one-shot";
  expectNothingHasLeft();  // to the collector, that is

  givenConsent(true);
  EXPECT_THAT(runToTheEnd(), HasSubstr("splunk"));
  expectEverythingHasArrived();
  EXPECT_EQ(dashboard().takeAll().size(), datagrams.size()) << "as many as without consent";
}

// Another exception, so that nobody takes it for an accident.
TEST_F(ConsentTest, isNotAskedForBySessionsThatRequireNoUserInfo) {
  givenSection(section("splunk", Array{Value(clientEntry())}));
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoRequireUserInfo, false);
  ClientScript script;
  script.open(info, userInfo()).configure().send(kEvent, 1, Dictionary{{"flag", 0}}).flush();
  EXPECT_THAT(runToTheEnd(script), HasSubstr("configured: [splunk]\nflushed: ok"));
  EXPECT_EQ(flagsArrived(kEvent).size(), 1u);
}

}  // namespace
}  // namespace telvane::testing
