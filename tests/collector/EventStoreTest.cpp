#include "collector/EventStore.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/Compression.h"
#include "platform/JSON.h"
#include "tests/support/Matchers.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;

constexpr char kTwoEvents[] =
    R"({"postTime":12.5,"clientId":"me","events":[{"_eventNumber":1,"text":"a"},{"_eventNumber":2,"ok":true}]})";

class EventStoreTest : public ::testing::Test {
 protected:
  EventStoreTest() : _store(AppendFile::open(_scratch.at("events")).value()) {}

  HTTPServer::Response post(std::string_view body, std::vector<HTTPServer::Header> headers = {}) {
    return postTo(_store, body, std::move(headers));
  }
  static HTTPServer::Response postTo(EventStore& store, std::string_view body,
                                     std::vector<HTTPServer::Header> headers = {}) {
    HTTPServer::Request request;
    request.method = "POST";
    request.target = "/events";
    request.headers = std::move(headers);
    request.body = Data::copyOf(body);
    return store.take(request);
  }
  static std::string gzip(std::string_view text) {
    const auto compressed = compression::deflate(compression::Framing::Gzip, text);
    return compressed.has_value() ? std::string(compressed->view()) : std::string();
  }
  std::vector<Dictionary> lines() const {
    std::vector<Dictionary> lines;
    std::string text = _scratch.read("events");
    for (size_t start = 0, end; (end = text.find('\n', start)) != std::string::npos; start = end + 1) {
      lines.push_back(*json::parse(std::string_view(text).substr(start, end - start)).value().dictionary());
    }
    return lines;
  }
  void expectRefused(const HTTPServer::Response& response, const std::string& reason) {
    EXPECT_EQ(response.status, 400);
    EXPECT_THAT(std::string(response.body.view()), HasSubstr(reason));
    EXPECT_EQ(_scratch.read("events"), "");
    EXPECT_EQ(_store.posts(), 0u);
  }

  ScratchFolder _scratch;
  EventStore _store;
};

TEST_F(EventStoreTest, writesOneLinePerEventWithClientTimeAndHeaders) {
  EXPECT_EQ(post(kTwoEvents, {{"X-TVN-Sender", "MEDIA"}}).status, 200);
  ASSERT_EQ(lines().size(), 2u);
  const Dictionary second = lines()[1];
  EXPECT_THAT(second["event"], HasEntry("_eventNumber", 2));
  EXPECT_THAT(second["event"], HasEntry("ok", true));
  EXPECT_EQ(second["clientId"], Value("me"));
  EXPECT_EQ(second["postTime"], Value(12.5));
  EXPECT_THAT(second["headers"], HasEntry("X-TVN-Sender", "MEDIA"));
}

TEST_F(EventStoreTest, takesCompressedPosts) {
  EXPECT_EQ(post(gzip(kTwoEvents), {{"content-encoding", "gzip"}}).status, 200);
  EXPECT_EQ(lines().size(), 2u);
}

TEST_F(EventStoreTest, countsEventsPostsAndBytesAsTheyCame) {
  const std::string compressed = gzip(kTwoEvents);
  post(kTwoEvents);
  post(compressed, {{"Content-Encoding", "gzip"}});
  EXPECT_EQ(_store.events(), 4u);
  EXPECT_EQ(_store.posts(), 2u);
  EXPECT_EQ(_store.bytes(), std::string_view(kTwoEvents).size() + compressed.size());
}

TEST_F(EventStoreTest, countsWithoutAFile) {
  EventStore counting(nullptr);
  EXPECT_EQ(postTo(counting, kTwoEvents).status, 200);
  EXPECT_EQ(counting.events(), 2u);
}

TEST_F(EventStoreTest, refusesWhatIsNoJSON) {
  expectRefused(post(""), "");
  expectRefused(post("{\"events\":["), "");
  expectRefused(post(std::string("\0\xff", 2)), "");
}

TEST_F(EventStoreTest, refusesJSONWithoutEvents) {
  for (const char* body : {"[]", "5", "{}", R"({"events":{}})", R"({"events":"x"})"}) {
    expectRefused(post(body), "\"events\"");
  }
}

TEST_F(EventStoreTest, refusesGzipThatIsNone) {
  const std::string whole = gzip(kTwoEvents);
  expectRefused(post(kTwoEvents, {{"Content-Encoding", "gzip"}}), "");
  expectRefused(post(whole.substr(0, whole.size() / 2), {{"Content-Encoding", "gzip"}}), "");
}

TEST_F(EventStoreTest, refusesAnotherEncodingAndNamesIt) {
  expectRefused(post(kTwoEvents, {{"Content-Encoding", "br"}}), "br");
}

TEST_F(EventStoreTest, refusesABombWithoutInflatingAllOfIt) {
  const std::string bomb = gzip(std::string((64u << 20) + 1, ' '));
  ASSERT_LT(bomb.size(), 100000u);
  expectRefused(post(bomb, {{"Content-Encoding", "gzip"}}), "");
}

TEST_F(EventStoreTest, refusesNestingWithoutEnd) {
  expectRefused(post(R"({"events":)" + std::string(100000, '[')), "");
}

TEST_F(EventStoreTest, saysWhenTheFileCannotTakeMore) {
  EventStore full(AppendFile::open("/dev/full").value());
  EXPECT_EQ(postTo(full, kTwoEvents).status, 500);
  EXPECT_EQ(full.events(), 0u);
}

}  // namespace
}  // namespace telvane::testing
