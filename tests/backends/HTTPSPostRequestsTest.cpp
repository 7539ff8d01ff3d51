// The request, byte by byte.
#include "interfaces/EventKeys.h"
#include "interfaces/MessageFlags.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/Compression.h"
#include "platform/Crypto.h"
#include "tests/backends/BackendFixture.h"

namespace telvane::testing {
namespace {

using Header = std::pair<std::string, std::string>;

std::vector<Header> headersOf(const URLRequest& request) {
  std::vector<Header> headers;
  for (const URLRequest::Header& header : request.headers) headers.emplace_back(header.name, header.value);
  return headers;
}

// Written here once more, so that the test does not prove the code with itself.
std::string digestOf(std::string_view key, const std::string& text) {
  const auto asBytes = [](std::string_view view) {
    return std::span<const uint8_t>(reinterpret_cast<const uint8_t*>(view.data()), view.size());
  };
  const std::string hex = crypto::lowercaseHex(crypto::hmacSHA1(asBytes(key), asBytes(text)));
  std::string result = "<" + hex.substr(0, 8);
  for (size_t group = 8; group < hex.size(); group += 8) result += " " + hex.substr(group, 8);
  return result + ">";
}

class HTTPSPostRequestsTest : public BackendFixture {
 protected:
  URLRequest postedRequest(Dictionary payload = {}, uint32_t flag = 0) {
    backend().setBatchEvents(false);
    send(std::move(payload), 7, 2, flag);
    return posts().lastRequest();
  }
  std::optional<std::string> postedHeader(std::string_view name) {
    return RecordingConnectivity::header(postedRequest(), name);
  }
  std::string urlPosted(const char* url) {
    _client.set(kClientEntryPostURL, url);
    makeBackend();
    return postedRequest().url;
  }
};

TEST_F(HTTPSPostRequestsTest, aSingleEventCarriesEveryHeaderInOrder) {
  _isInternal = true;
  _selfVersion = "8.1.2";
  _client.set(kClientEntryIncludeSessionID, 1);
  makeBackend();
  backend().setCombinedSessionIDString("parent.child");
  backend().setDigestKey(Data::copyOf("key"));
  const URLRequest request = postedRequest({{Key("text"), std::string(500, 'x')}});
  const std::string size = std::to_string(request.body.size());
  const std::string json = RecordingConnectivity::bodyText(request);
  const std::vector<Header> expected = {{"X-TVN-Client-Name", "player"},
                                        {"X-TVN-Service-Name", "StreamMediaPlayer"},
                                        {"X-TVN-Internal-Build", "1"},
                                        {"User-Agent", "Telvane/8.1.2 (Box2,1; 12.5)"},
                                        {"X-TVN-Client-Version", "3"},
                                        {"X-TVN-Sender", "MEDIA"},
                                        {"X-TVN-Event-Map", "7 2"},
                                        {"Accept", "application/json"},
                                        {"Content-Type", "application/json"},
                                        {"Content-Length", size},
                                        {"Content-Encoding", "gzip"},
                                        {"X-TVN-Session-ID", "parent.child"},
                                        {"X-TVN-DIGEST", digestOf("key", json)}};
  EXPECT_EQ(headersOf(request), expected);
  EXPECT_EQ(request.method, "POST");
  EXPECT_EQ(request.url, kPostURL);
  EXPECT_TRUE(request.allowsCellularAccess);
  EXPECT_EQ(request.timeout, std::nullopt);
  EXPECT_EQ(request.cachePolicy, URLRequest::CachePolicy::UseProtocol);
}

TEST_F(HTTPSPostRequestsTest, aBatchCarriesTheLeast) {
  _requiresUserInfo = false;
  _userInfo = Value();
  _hardwareType = std::nullopt;
  makeBackend();
  send({{Key("text"), std::string(500, 'x')}});
  flush();
  const URLRequest request = posts().lastRequest();
  const std::vector<Header> expected = {{"User-Agent", "Telvane/8.1 ((null); 12.5)"},
                                        {"X-TVN-Client-Version", "3"},
                                        {"X-TVN-Sender", "MEDIA"},
                                        {"Accept", "application/json"},
                                        {"Content-Type", "application/json"},
                                        {"Content-Length", std::to_string(request.body.size())},
                                        {"Content-Encoding", "gzip"}};
  EXPECT_EQ(headersOf(request), expected);
}

TEST_F(HTTPSPostRequestsTest, theBodyIsAGzipFileOfTheJSON) {
  makeBackend();
  const URLRequest request = postedRequest({{Key("text"), std::string(500, 'x')}});
  const std::string_view body = request.body.view();
  ASSERT_GT(body.size(), 18u);
  EXPECT_EQ(body.substr(0, 3), std::string_view("\x1f\x8b\x08"));
  const auto lastByte = [body](size_t back) { return static_cast<uint8_t>(body[body.size() - back]); };
  const size_t length = lastByte(4) + (lastByte(3) << 8) + (lastByte(2) << 16) + (size_t{lastByte(1)} << 24);
  const Result<Data> plain = compression::inflate(body, 1 << 20);
  ASSERT_TRUE(isOk(plain));
  EXPECT_EQ(plain->size(), length);
  EXPECT_EQ(plain->view().substr(0, 12), "{\"postTime\":");
}

TEST_F(HTTPSPostRequestsTest, aBodyThatDoesNotShrinkGoesAsItIs) {
  // Without what makes events long and alike, what remains has nothing to repeat.
  _client.set(kClientEntryFilters, Array{Value(Dictionary{{kFilterKey, "events"}, {kFilterAction, "remove"}})});
  makeBackend();
  backend().setDigestKey(Data::copyOf("key"));
  const URLRequest request = postedRequest();
  EXPECT_EQ(RecordingConnectivity::header(request, "Content-Encoding"), std::nullopt);
  EXPECT_TRUE(request.body.view().starts_with("{\"postTime\":")) << request.body.view();
  EXPECT_TRUE(request.body.view().ends_with("\"}")) << request.body.view();
  EXPECT_EQ(RecordingConnectivity::header(request, "Content-Length"), std::to_string(request.body.size()));
  EXPECT_EQ(RecordingConnectivity::header(request, "X-TVN-DIGEST"), digestOf("key", std::string(request.body.view())));
}

TEST_F(HTTPSPostRequestsTest, withoutAKeyOrWithAnotherAlgorithmThereIsNoDigest) {
  makeBackend();
  EXPECT_EQ(postedHeader("X-TVN-DIGEST"), std::nullopt);
  backend().setDigestKey("text is no key");
  EXPECT_EQ(postedHeader("X-TVN-DIGEST"), std::nullopt);
  backend().setDigestKey(Data::copyOf("key"));
  backend().setDigestAlgorithm(1);
  EXPECT_EQ(postedHeader("X-TVN-DIGEST"), std::nullopt);
  backend().setDigestAlgorithm(0);
  EXPECT_NE(postedHeader("X-TVN-DIGEST"), std::nullopt);
  backend().setDigestKey(Data());
  EXPECT_NE(postedHeader("X-TVN-DIGEST"), std::nullopt) << "a key without bytes is one";
}

TEST_F(HTTPSPostRequestsTest, theDigestIsTheOneThatAnybodyComputes) {
  // RFC 2202, case 2.
  EXPECT_EQ(digestOf("Jefe", "what do ya want for nothing?"), "<effcdf6a e5eb2fa2 d27416d5 f184df9c 259a7c79>");
}

TEST_F(HTTPSPostRequestsTest, realtimeEventsGoToTheirURL) {
  makeBackend();
  EXPECT_EQ(postedRequest({}, kOrdinaryFlag).url, kPostURL);
  EXPECT_EQ(postedRequest({}, kRealtimeFlag).url, kRealtimeURL);
  EXPECT_EQ(postedRequest({}, kPromotingFlag).url, kPostURL);
  EXPECT_EQ(postedRequest({}, kRealtimeAndPromotingFlag).url, kRealtimeURL);
  EXPECT_EQ(postedRequest({}, kPeriodicReportFlag).url, kPostURL);
}

TEST_F(HTTPSPostRequestsTest, customersDevicesPostEncryptedWhateverTheURLSays) {
  EXPECT_EQ(urlPosted("http://collector.example/a"), "https://collector.example/a");
  EXPECT_EQ(urlPosted("HTTPS://collector.example/a"), "HTTPS://collector.example/a");
  EXPECT_EQ(urlPosted("ftp://collector.example"), "https://collector.example");
  EXPECT_EQ(urlPosted("http://a.example/b://c"), "https://a.example/b");
  EXPECT_EQ(urlPosted("https://a.example/b://c"), "https://a.example/b://c");
  EXPECT_EQ(urlPosted("collector.example"), "https://") << "which no session takes";
  EXPECT_EQ(urlPosted(""), "https://");
}

TEST_F(HTTPSPostRequestsTest, internalBuildsPostAsTheURLSays) {
  givenInternalBuild();
  EXPECT_EQ(urlPosted("http://collector.example/a"), "http://collector.example/a");
}

TEST_F(HTTPSPostRequestsTest, theStorebagMayKeepRequestsOffCellularNetworks) {
  _client.set(kClientEntryUseWiFiOnly, 1);
  makeBackend();
  EXPECT_FALSE(postedRequest().allowsCellularAccess);
}

TEST_F(HTTPSPostRequestsTest, theSessionIdentifierIsCutAtFortyCharacters) {
  _client.set(kClientEntryIncludeSessionID, 1);
  makeBackend();
  EXPECT_EQ(postedHeader("X-TVN-Session-ID"), std::nullopt) << "none is set";
  const std::string sixty = std::string(39, 'a') + std::string(21, 'b');
  backend().setCombinedSessionIDString(sixty);
  EXPECT_EQ(postedHeader("X-TVN-Session-ID"), sixty.substr(0, 40));
  std::string umlauts;
  for (int i = 0; i < 60; ++i) umlauts += "\u00e4";
  backend().setCombinedSessionIDString(umlauts);
  EXPECT_EQ(postedHeader("X-TVN-Session-ID"), umlauts.substr(0, 80)) << "characters, not bytes";
  backend().setCombinedSessionIDString("short");
  EXPECT_EQ(postedHeader("X-TVN-Session-ID"), "short");
}

TEST_F(HTTPSPostRequestsTest, theSessionIdentifierIsLeftOutUnlessAskedFor) {
  makeBackend();
  backend().setCombinedSessionIDString("short");
  EXPECT_EQ(postedHeader("X-TVN-Session-ID"), std::nullopt);
}

TEST_F(HTTPSPostRequestsTest, aNameCannotSmuggleInAHeader) {
  _userInfo = Dictionary{{kTelvaneUserInfoClientName, "a\r\nX-Evil: 1"}, {kTelvaneUserInfoServiceName, 5}};
  makeBackend();
  const URLRequest request = postedRequest();
  EXPECT_EQ(RecordingConnectivity::header(request, "X-TVN-Client-Name"), "aX-Evil: 1");
  EXPECT_EQ(RecordingConnectivity::header(request, "X-TVN-Service-Name"), std::nullopt) << "a number is no name";
}

TEST_F(HTTPSPostRequestsTest, bytesOfBodiesAreCountedAlsoWhenDropped) {
  makeBackend();
  const auto size = static_cast<int64_t>(postedRequest().body.size());
  backend().setReportingSessionConnectivityDelegate({});
  send({});
  const auto helper = std::make_shared<RecordingConnectivity>();
  backend().setReportingSessionConnectivityDelegate(helper);
  send({}, 0, 1);
  const Array events = helper->events(0);
  ASSERT_EQ(events.size(), 1u);
  EXPECT_GT((*events[0].dictionary())[kEventTotalBytesSent].integerValue(), size);
}

}  // namespace
}  // namespace telvane::testing
