// A post as it is on the wire: every byte of its head, the framing of its body, its digest. Nothing here is read with
// our own code where the code could be wrong in the same way twice.
#include <gmock/gmock.h>
#include <openssl/hmac.h>
#include <zlib.h>

#include <array>
#include <fstream>
#include <set>

#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/PropertyList.h"
#include "tests/endtoend/WireFixture.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAreArray;
using ::testing::HasSubstr;
using ::testing::Not;

constexpr size_t kGzipHead = 10;
constexpr size_t kGzipTail = 8;

// The names in the first column of a section's table in the protocol's page.
std::set<std::string> namesIn(const std::string& section) {
  std::ifstream file(TELVANE_SOURCE_DIR "/docs/collector-protocol.md");
  std::set<std::string> names;
  bool isInside = false;
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with("## ")) isInside = line == "## " + section;
    if (isInside && line.starts_with("| `")) names.insert(line.substr(3, line.find('`', 3) - 3));
  }
  return names;
}

std::string withPlaceholder(std::string key) {
  constexpr std::string_view kSender = "_CONFERENCE";
  if (key.ends_with(kSender)) key.replace(key.size() - kSender.size(), kSender.size(), "_<sender>");
  return key;
}

uint32_t littleEndian(const std::string& bytes, size_t at) {
  uint32_t number = 0;
  for (size_t i = 4; i-- > 0;) number = number << 8 | static_cast<uint8_t>(bytes[at + i]);
  return number;
}

// Raw deflate between a gzip head and tail; the test looks at those itself.
std::string inflatedRaw(std::string_view deflated, size_t size) {
  std::string text(size + 1, '\0');
  z_stream stream{};
  EXPECT_EQ(inflateInit2(&stream, -15), Z_OK);
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(deflated.data()));
  stream.avail_in = static_cast<uInt>(deflated.size());
  stream.next_out = reinterpret_cast<Bytef*>(text.data());
  stream.avail_out = static_cast<uInt>(text.size());
  EXPECT_EQ(inflate(&stream, Z_FINISH), Z_STREAM_END);
  EXPECT_EQ(stream.avail_in, 0u) << "bytes between the text and the tail";
  text.resize(stream.total_out);
  inflateEnd(&stream);
  return text;
}

std::string digestOf(const std::string& key, const std::string& json) {
  std::array<unsigned char, 20> digest{};
  unsigned size = 0;
  HMAC(EVP_sha1(), key.data(), static_cast<int>(key.size()), reinterpret_cast<const unsigned char*>(json.data()),
       json.size(), digest.data(), &size);
  EXPECT_EQ(size, digest.size());
  std::string text = "<";
  for (size_t i = 0; i < digest.size(); ++i) {
    std::array<char, 3> digits{};
    snprintf(digits.data(), digits.size(), "%02x", digest[i]);
    if (i > 0 && i % 4 == 0) text += ' ';
    text += digits.data();
  }
  return text + ">";
}

class RequestBytesTest : public WireFixture {
 protected:
  RequestBytesTest() { instance().givenConsent(true); }

  // The only post with this event map.
  WireRequest postOf(const std::string& eventMap) {
    std::vector<WireRequest> found = posts();
    std::erase_if(found, [&eventMap](const WireRequest& post) { return post.header("X-TVN-Event-Map") != eventMap; });
    EXPECT_EQ(found.size(), 1u) << "posts of the event " << eventMap << "\n" << instance().daemonLog();
    return found.empty() ? WireRequest() : found.front();
  }
  // The only post of a batch with events of this category.
  WireRequest batchOf(int64_t category) {
    std::vector<WireRequest> found = posts();
    std::erase_if(found, [category](const WireRequest& post) {
      return post.header("X-TVN-Event-Map").has_value() || eventsOf({post}, category).empty();
    });
    EXPECT_EQ(found.size(), 1u) << "batches with category " << category << "\n" << instance().daemonLog();
    return found.empty() ? WireRequest() : found.front();
  }
  // Runs it with a fresh daemon, and waits until everything has left.
  void sendAll(const ClientScript& script) {
    startDaemon();
    run(script);
    stopDaemon();
    EXPECT_TRUE(server().strays().empty()) << server().strays().front();
  }
  static ClientScript session(bool batches) {
    ClientScript script;
    script.open(sessionInfo(batches), userInfo()).configure();
    return script;
  }
  static Dictionary longPayload() { return {{Key("text"), std::string(500, 'x')}}; }
};

TEST_F(RequestBytesTest, aSingleEventIsThisHeadAndNothingElse) {
  givenSection(section("qrs", Array{Value(entryWith(kClientEntryIncludeSessionID, 1))}));
  Dictionary top = sessionInfo(false);
  top.set(kTelvaneSessionInfoHierarchyToken, Dictionary{{"token", "t"}, {"level", 0}});
  Dictionary below = sessionInfo(false);
  below.set(kTelvaneSessionInfoHierarchyToken, Dictionary{{"token", "t"}, {"level", 1}});
  ClientScript script;
  script.open(top, userInfo("parent")).configure().open(below, userInfo()).configure();
  script.setDigestKey("secret").send(21, 3, longPayload());
  sendAll(script);

  const WireRequest post = postOf("21 3");
  const std::string json = jsonOf(post);
  const std::vector<Dictionary> events = eventsOf({post});
  ASSERT_EQ(events.size(), 1u);
  const std::string sessionID(events[0][kEventSessionID].text());
  EXPECT_EQ(sessionID.size(), 49u) << "two identifiers and a full stop";
  const std::vector<std::string> expected = {"POST /events HTTP/1.1",
                                             "Host: " + server().address(),
                                             "X-TVN-Client-Name: sender",
                                             "X-TVN-Service-Name: endtoend",
                                             "User-Agent: Telvane/8.0 (Box2,1; 12.5)",
                                             "X-TVN-Client-Version: 3",
                                             "X-TVN-Sender: CONFERENCE",
                                             "X-TVN-Event-Map: 21 3",
                                             "Accept: application/json",
                                             "Content-Type: application/json",
                                             "Content-Length: " + std::to_string(post.body.size()),
                                             "Content-Encoding: gzip",
                                             "X-TVN-Session-ID: " + sessionID.substr(0, 40),
                                             "X-TVN-DIGEST: " + digestOf("secret", json)};
  EXPECT_THAT(post.lines(), ElementsAreArray(expected));
  EXPECT_THAT(post.head, ::testing::EndsWith("\r\n\r\n"));
}

TEST_F(RequestBytesTest, aBatchHasNoEventMap) {
  givenSection(section("splunk", Array{Value(clientEntry())}));
  sendAll(session(true).send(21, 1, longPayload()).send(22, 2, longPayload()).flush());
  const WireRequest post = batchOf(21);
  const std::vector<std::string> expected = {"POST /events HTTP/1.1",
                                             "Host: " + server().address(),
                                             "X-TVN-Client-Name: sender",
                                             "X-TVN-Service-Name: endtoend",
                                             "User-Agent: Telvane/8.0 (Box2,1; 12.5)",
                                             "X-TVN-Client-Version: 3",
                                             "X-TVN-Sender: CONFERENCE",
                                             "Accept: application/json",
                                             "Content-Type: application/json",
                                             "Content-Length: " + std::to_string(post.body.size()),
                                             "Content-Encoding: gzip"};
  EXPECT_THAT(post.lines(), ElementsAreArray(expected));
  EXPECT_EQ(eventsOf({post}, 22).size(), 1u);
}

TEST_F(RequestBytesTest, theBodyIsOneGzipMemberAroundCompactJSON) {
  givenSection(section("splunk", Array{Value(clientEntry())}));
  sendAll(session(false).send(21, 1, longPayload()));
  const std::string& body = postOf("21 1").body;
  ASSERT_GT(body.size(), kGzipHead + kGzipTail);
  EXPECT_EQ(body.substr(0, 4), std::string("\x1f\x8b\x08\x00", 4)) << "gzip, deflate, no extra fields";
  EXPECT_EQ(body.substr(4, 4), std::string(4, '\0')) << "no time";
  const size_t tail = body.size() - kGzipTail;
  const uint32_t size = littleEndian(body, tail + 4);
  const std::string json = inflatedRaw(std::string_view(body).substr(kGzipHead, tail - kGzipHead), size);
  EXPECT_EQ(json.size(), size);
  EXPECT_EQ(crc32(0, reinterpret_cast<const Bytef*>(json.data()), static_cast<uInt>(json.size())),
            littleEndian(body, tail));
  EXPECT_THAT(json, ::testing::StartsWith("{\"postTime\":1"));
  EXPECT_THAT(json, HasSubstr(",\"clientId\":\""));
  EXPECT_THAT(json, HasSubstr("\",\"events\":[{\"text\":\"" + std::string(500, 'x') + "\","));
  EXPECT_THAT(json, ::testing::EndsWith("}]}"));
  EXPECT_THAT(json, Not(HasSubstr("\n")));
  EXPECT_THAT(json, Not(HasSubstr("\": ")));
}

TEST_F(RequestBytesTest, aBodyThatDoesNotShrinkIsSentAsItIs) {
  const Dictionary filter{{kFilterKey, "events"}, {kFilterAction, "remove"}};
  givenSection(section("qrs", Array{Value(entryWith(kClientEntryFilters, Array{Value(filter)}))}));
  sendAll(session(false).setDigestKey("secret").send(21, 1));
  const WireRequest post = postOf("21 1");
  EXPECT_EQ(post.header("Content-Encoding"), std::nullopt);
  EXPECT_THAT(post.head, Not(HasSubstr("Encoding")));
  EXPECT_THAT(post.body, ::testing::MatchesRegex("\\{\"postTime\":[0-9.]+,\"clientId\":\"[-0-9A-Fa-f]+\"\\}"));
  EXPECT_EQ(post.header("Content-Length"), std::to_string(post.body.size()));
  EXPECT_EQ(post.header("X-TVN-DIGEST"), digestOf("secret", post.body));
}

TEST_F(RequestBytesTest, realtimeEventsGoToTheirOwnURL) {
  givenSection(section("splunk", Array{Value(entryWith(kClientEntryRealtimePostURL, server().url("/now?fast=1")))}));
  sendAll(session(true).send(21, 1, longPayload()).send(22, 2, longPayload(), 1));
  EXPECT_EQ(batchOf(21).target(), "/events");
  const WireRequest realtime = postOf("22 2");
  EXPECT_EQ(realtime.target(), "/now?fast=1");
  EXPECT_EQ(realtime.lines().front(), "POST /now?fast=1 HTTP/1.1");
}

TEST_F(RequestBytesTest, aCustomersDevicePostsOverTLSWhereTheBagSaysHTTP) {
  givenSection(section("splunk", Array{Value(entryPostingTo("http://" + server().address() + "/events"))}));
  sendAll(session(false).send(21, 1));
  EXPECT_EQ(postOf("21 1").target(), "/events");
}

// The server speaks plainly here, so what arrives was sent plainly.
TEST_F(RequestBytesTest, anInternalBuildPostsAsTheBagSaysAndSaysWhatItIs) {
  givenInternalBuild();
  WireServer plain(std::nullopt, [](const WireRequest&) { return WireServer::answer(200); });
  givenSection(section("splunk", Array{Value(entryPostingTo(plain.url("/events")))}));
  sendAll(session(false).send(21, 1));
  std::vector<WireRequest> found = plain.posts();
  std::erase_if(found, [](const WireRequest& post) { return post.header("X-TVN-Event-Map") != "21 1"; });
  ASSERT_EQ(found.size(), 1u) << instance().daemonLog();
  const std::vector<std::string> lines = found[0].lines();
  ASSERT_GT(lines.size(), 4u);
  EXPECT_EQ(lines[2], "X-TVN-Client-Name: sender");
  EXPECT_EQ(lines[4], "X-TVN-Internal-Build: 1");
  EXPECT_EQ(eventsOf(found)[0][kEventInternal], Value(1));
  EXPECT_TRUE(posts().empty());
}

TEST_F(RequestBytesTest, aNameCannotBecomeAHeaderOfItsOwn) {
  givenSection(section("splunk", Array{Value(clientEntry())}));
  Dictionary forged = userInfo("a\r\nX-TVN-Internal-Build: 1\r\n\r\nPOST /forged HTTP/1.1");
  forged.set(kTelvaneUserInfoServiceName, std::string("b\0c\nd", 5));
  ClientScript script;
  script.open(sessionInfo(false), forged).configure().send(21, 1);
  sendAll(script);
  const std::vector<std::string> lines = postOf("21 1").lines();
  ASSERT_GT(lines.size(), 4u);
  EXPECT_EQ(lines[2], "X-TVN-Client-Name: aX-TVN-Internal-Build: 1POST /forged HTTP/1.1");
  EXPECT_EQ(lines[3], "X-TVN-Service-Name: bcd");
  EXPECT_THAT(lines[4], ::testing::StartsWith("User-Agent: "));
  for (const WireRequest& post : posts()) EXPECT_EQ(post.target(), "/events");
}

TEST_F(RequestBytesTest, theClientIdentifierIsTheOneThatRespectsTheUsersWish) {
  givenSection(section("splunk", Array{Value(clientEntry())}));
  sendAll(session(false).send(21, 1));
  const auto defaults =
      propertylist::parse(Data::copyOf(instance().read("home/Library/Preferences/com.corvex.telvane.plist")));
  ASSERT_TRUE(defaults.has_value());
  const Value identifier = (*defaults->dictionary())["uuidRespectDNU"];
  EXPECT_EQ(identifier.text().size(), 36u);
  EXPECT_EQ(bodyOf(postOf("21 1"))[kBodyClientId], identifier);
}

// Both of a session of an internal build, which says most. What the page names per client type has a placeholder.
TEST_F(RequestBytesTest, thePageOfTheProtocolNamesEveryKeyOfTheDaemonsOwnEvents) {
  givenInternalBuild();
  givenSection(section("splunk", Array{Value(clientEntry())}));
  sendAll(session(true));
  const std::vector<Dictionary> own = arrived(0);
  ASSERT_EQ(own.size(), 2u);
  std::set<std::string> sent;
  for (const Dictionary& event : own) {
    for (const DictionaryEntry& entry : event) sent.insert(withPlaceholder(std::string(entry.key.view())));
  }
  std::set<std::string> named = namesIn("The daemon's own events");
  EXPECT_GT(named.size(), 15u);
  named.merge(namesIn("An event"));
  named.merge(std::set<std::string>{"_clientName", "_serviceName"});
  named.erase("_bytesSentSinceLastReport");
  EXPECT_EQ(sent, named);
}

}  // namespace
}  // namespace telvane::testing
