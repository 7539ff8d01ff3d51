// What a client may hand over, right or wrong, on the whole road: the event that can be saved is sent without what
// cannot, everybody else's events are sent as if nothing had been, and nothing crashes.
#include <gmock/gmock.h>

#include <limits>

#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/endtoend/WireFixture.h"
#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();
constexpr double kInfinity = std::numeric_limits<double>::infinity();
constexpr uint16_t kBad = 21;
constexpr uint16_t kGood = 22;
constexpr int kNestingClientType = 28;
constexpr char kNestingBagName[] = "system";
constexpr int kHuge = 100'000;

class BadInputTest : public WireFixture {
 protected:
  BadInputTest() {
    instance().givenConsent(true);
    givenSection(section("splunk", Array{Value(clientEntry())}));
    givenSection(section("splunk", Array{Value(clientEntry())}), kNestingBagName);
  }
  // Sends the payload between two good events in one batch, and returns what became of it.
  Dictionary sent(const Dictionary& payload, int clientType = kClientType) {
    ClientScript script;
    script.open(sessionInfo(true, clientType), userInfo()).configure();
    script.send(kGood, 1, Dictionary{{"n", 1}}).send(kBad, 1, payload).send(kGood, 1, Dictionary{{"n", 2}}).flush();
    return whatBecameOfIt(script);
  }
  Dictionary whatBecameOfIt(const ClientScript& script) {
    startDaemon();
    EXPECT_THAT(run(script), HasSubstr("flushed: ok")) << instance().daemonLog();
    stopDaemon();
    EXPECT_EQ(arrived(kGood).size(), 2u) << instance().daemonLog();
    const std::vector<Dictionary> events = arrived(kBad);
    EXPECT_EQ(events.size(), 1u) << instance().daemonLog();
    return events.empty() ? Dictionary() : events[0];
  }
  // The text of all posts.
  std::string allJSON() const {
    std::string text;
    for (const WireRequest& post : posts()) text += jsonOf(post) + '\n';
    return text;
  }
  bool saysItRemoved(const std::string& key) {
    return instance().daemonLogHas(
        "<error> HTTPSPostBackend(createMessageForPostAndLogging): NSJSONSerialization unable to handle key: " + key +
        ", value: ");
  }
};

TEST_F(BadInputTest, whatJSONCannotHoldIsLeftOut) {
  const Date date(Date::TimePoint(std::chrono::milliseconds(1500)));
  const Dictionary event = sent({{"nan", kNaN},
                                 {"infinite", kInfinity},
                                 {"negative", -kInfinity},
                                 {"data", Data::copyOf("\x01\x02")},
                                 {"list", Array{1, 2}},
                                 {"dictionary", Dictionary{{"x", 1}}},
                                 {"date", date},
                                 {"largest", std::numeric_limits<uint64_t>::max()},
                                 {"least", std::numeric_limits<int64_t>::min()},
                                 {"tiny", std::numeric_limits<double>::denorm_min()},
                                 {"real", 1.0},
                                 {"yes", true}});
  for (const char* key : {"nan", "infinite", "negative", "data", "list", "dictionary"}) {
    EXPECT_FALSE(event.contains(key)) << key;
    EXPECT_TRUE(saysItRemoved(key)) << key;
  }
  EXPECT_EQ(event["date"], Value(1.5));
  EXPECT_EQ(event["largest"], Value(std::numeric_limits<uint64_t>::max()));
  EXPECT_EQ(event["least"], Value(std::numeric_limits<int64_t>::min()));
  EXPECT_EQ(event["tiny"], Value(std::numeric_limits<double>::denorm_min()));
  EXPECT_EQ(event["real"], Value(1.0));
  EXPECT_EQ(event["yes"], Value(true));
}

TEST_F(BadInputTest, whatIsNestedGoesAsAWholeWhenItCannotBeWritten) {
  const Value good(Dictionary{{"list", Array{1, "two", Value(Array{3.5})}}});
  const Dictionary event = sent({{"good", good},
                                 {"bad", Array{1, Value(Dictionary{{"deep", kNaN}})}},
                                 {"worse", Dictionary{{"bytes", Data::copyOf("x")}}},
                                 {"alone", kNaN}},
                                kNestingClientType);
  EXPECT_EQ(event["good"], good);
  for (const char* key : {"bad", "worse", "alone"}) {
    EXPECT_FALSE(event.contains(key)) << key;
    EXPECT_TRUE(saysItRemoved(key)) << key;
  }
}

TEST_F(BadInputTest, controlCharactersArriveAsTheyWere) {
  std::string every;
  for (char c = 0; c < ' '; ++c) every += c;
  every += "\x7f\"\\/";
  Dictionary payload{{"value", every}, {"", "no key"}};
  payload.set(String(every), "key");
  const Dictionary event = sent(payload);
  EXPECT_EQ(event["value"].text(), every);
  EXPECT_EQ(event[std::string_view(every)], Value("key"));
  EXPECT_EQ(event[""], Value("no key"));
  EXPECT_THAT(allJSON(), HasSubstr("\\u0000\\u0001"));
  std::string json = allJSON();
  std::erase(json, '\n');
  for (char c = 0; c < ' '; ++c) EXPECT_EQ(json.find(c), std::string::npos) << static_cast<int>(c);
}

TEST_F(BadInputTest, bytesThatAreNoTextAreReplaced) {
  const Dictionary event = sent({{"latin", "caf\xe9!"},
                                 {"cut", "abc\xe2\x82"},
                                 {"overlong", "\xc0\xaf"},
                                 {"surrogate", "<\xed\xa0\x80>"},
                                 {"beyond", "\xf5\x80\x80\x80"},
                                 {"k\xff", 1},
                                 {"good", "\u20ac\U0001f600"}});
  EXPECT_EQ(event["latin"], Value("caf\ufffd!"));
  EXPECT_EQ(event["cut"], Value("abc\ufffd"));
  EXPECT_EQ(event["overlong"], Value("\ufffd\ufffd"));
  EXPECT_EQ(event["surrogate"], Value("<\ufffd\ufffd\ufffd>"));
  EXPECT_EQ(event["beyond"], Value("\ufffd\ufffd\ufffd\ufffd"));
  EXPECT_EQ(event["k\ufffd"], Value(1));
  EXPECT_EQ(event["good"], Value("\u20ac\U0001f600"));
}

// A collector's parser would take the escape for half a character; the text was its six letters.
TEST_F(BadInputTest, anEscapeInTextStaysText) {
  const Dictionary event = sent({{"half", "\\ud800"}, {"\\udfff", 1}, {"nothing", "\\u0000\\"}});
  EXPECT_EQ(event["half"], Value("\\ud800"));
  EXPECT_EQ(event["\\udfff"], Value(1));
  EXPECT_EQ(event["nothing"], Value("\\u0000\\"));
  EXPECT_THAT(allJSON(), HasSubstr("\"half\":\"\\\\ud800\""));
}

TEST_F(BadInputTest, halfACharacterInAnEscapeIsRefusedWhereJSONIsRead) {
  instance().grant("telvanectl");
  startDaemon();
  const auto send = [this](const std::string& payload) {
    auto tool = instance().startProgram("telvanectl",
                                        {"send", "--client-type", "7", "--client-name", "sender", "--category", "21",
                                         "--type", "1", "--flush", "--payload", payload},
                                        "tool");
    return tool->wait();
  };
  EXPECT_EQ(send(R"({"half": "\ud800"})"), 1);
  EXPECT_EQ(send(R"({"half": "\udc00\ud800"})"), 1);
  EXPECT_EQ(send(R"({"whole": "\ud83d\ude00"})"), 0) << instance().read("tool.err");
  stopDaemon();
  const std::vector<Dictionary> events = arrived(kBad);
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ(events[0]["whole"], Value("\U0001f600"));
}

TEST_F(BadInputTest, aHundredThousandEntriesArrive) {
  Dictionary payload;
  payload.reserve(kHuge);
  for (int i = 0; i < kHuge; ++i) payload.set(String("key" + std::to_string(i)), i);
  const Dictionary event = sent(payload);
  EXPECT_GE(event.size(), static_cast<size_t>(kHuge));
  EXPECT_EQ(event["key0"], Value(0));
  EXPECT_EQ(event["key99999"], Value(kHuge - 1));
}

TEST_F(BadInputTest, userInfoMayOverwriteWhatAnEventSaysButNotWhatTheBodySays) {
  Dictionary user = userInfo();
  user.addEntriesFrom({{"_clientVersion", "forged"},
                       {"_eventNumber", Array{1}},
                       {"_internal", 1},
                       {"eventTime", kNaN},
                       {"postTime", 1},
                       {"clientId", "forged"},
                       {"events", "forged"}});
  ClientScript script;
  script.open(sessionInfo(), user).configure();
  script.send(kGood, 1).send(kBad, 1, Dictionary{{"n", 1}}).send(kGood, 1).flush();
  const Dictionary event = whatBecameOfIt(script);
  EXPECT_EQ(event["n"], Value(1));
  EXPECT_EQ(event[kEventClientVersion], Value("forged"));
  EXPECT_EQ(event[kEventInternal], Value(1));
  EXPECT_FALSE(event.contains(kEventEventNumber)) << "no list may stand in an event";
  EXPECT_FALSE(event.contains(kEventEventTime));
  EXPECT_EQ(event["clientId"], Value("forged"));
  for (const WireRequest& post : posts()) {
    const Dictionary body = bodyOf(post);
    EXPECT_EQ(body.size(), 3u);
    EXPECT_EQ(body[kBodyClientId].text().size(), 36u);
    EXPECT_TRUE(body[kBodyEvents].isArray());
    EXPECT_GT(body[kBodyPostTime].realValue(), 1.0e9);
  }
}

// The whitelist is asked with the category that the client gave, and once more with the one that the event says.
TEST_F(BadInputTest, userInfoCannotCarryAnEventPastTheWhitelist) {
  givenSection(section("splunk", Array{Value(entryWith(kClientEntryEventWhitelist, Array{0, kGood}))}));
  Dictionary user = userInfo();
  user.set(kEventMethod, kGood);
  ClientScript script;
  // Before it is configured, a client knows no lists and sends everything; what the daemon has no backends for is gone.
  script.open(sessionInfo(false), user).configure().send(kBad, 1, Dictionary{{"secret", 1}}, 1);
  script.open(sessionInfo(false), userInfo()).configure().send(kGood, 1).wait();
  startDaemon();
  const auto client = start(script);
  EXPECT_TRUE(eventually([this] { return arrived(kGood).size() > 0; })) << instance().daemonLog();
  expectEnd(*client);
  stopDaemon();
  EXPECT_THAT(allJSON(), Not(HasSubstr("secret")));
}

TEST_F(BadInputTest, sessionInfosOfAnyKindHarmNobodyElse) {
  for (const Value& odd : {Value("x"), Value(Array{1}), Value(kNaN), Value(Data::copyOf("x")), Value(Dictionary())}) {
    Dictionary info = sessionInfo();
    for (const Key& key : {kTelvaneSessionInfoClientVersion, kTelvaneSessionInfoSessionID,
                           kTelvaneSessionInfoBatchEvent, kTelvaneSessionInfoHierarchyToken}) {
      info.set(key, odd);
    }
    ClientScript script;
    script.open(info, userInfo()).configure().send(kGood, 1, Dictionary(), 1).flush();
    startDaemon();
    EXPECT_THAT(run(script), HasSubstr("configured: [splunk]")) << instance().daemonLog();
    stopDaemon();
  }
  EXPECT_EQ(arrived(kGood).size(), 5u);
}

TEST_F(BadInputTest, messagesOfAnyShapeHarmNobodyElse) {
  ClientScript script;
  script.open(sessionInfo(), userInfo()).configure();
  for (const Value& odd : {Value("x"), Value(Array{1}), Value(7), Value(Data::copyOf("x")), Value(Date())}) {
    script.send(kGood, 9, odd);
  }
  script.send(kGood, 1).send(kBad, 1, Dictionary{{"n", 1}}).send(kGood, 1).flush();
  startDaemon();
  EXPECT_THAT(run(script), HasSubstr("flushed: ok")) << instance().daemonLog();
  stopDaemon();
  EXPECT_EQ(arrived(kBad).size(), 1u);
  EXPECT_EQ(arrived(kGood).size(), 7u) << "a payload that is no dictionary counts as none";
}

}  // namespace
}  // namespace telvane::testing
