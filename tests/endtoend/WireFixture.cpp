#include "tests/endtoend/WireFixture.h"

#include <signal.h>
#include <zlib.h>

#include <filesystem>

#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "platform/PropertyList.h"

namespace telvane::testing {
namespace {

constexpr std::string_view kBagsPath = "/bags/";
constexpr int kGzipOnly = 31;
constexpr size_t kLargestJSON = 64u << 20;

std::string plist(const Value& value) {
  return std::string(propertylist::serialize(value, propertylist::Format::XML).value().view());
}

// By zlib itself, and strictly as a gzip file without anything behind it.
std::string gunzipped(const std::string& bytes) {
  z_stream stream{};
  EXPECT_EQ(inflateInit2(&stream, kGzipOnly), Z_OK);
  std::string text(1u << 16, '\0');
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));
  stream.avail_in = static_cast<uInt>(bytes.size());
  int code = Z_OK;
  while (code == Z_OK && text.size() <= kLargestJSON) {
    if (stream.total_out == text.size()) text.resize(2 * text.size());
    stream.next_out = reinterpret_cast<Bytef*>(text.data() + stream.total_out);
    stream.avail_out = static_cast<uInt>(text.size() - stream.total_out);
    code = inflate(&stream, Z_NO_FLUSH);
  }
  EXPECT_EQ(code, Z_STREAM_END);
  EXPECT_EQ(stream.avail_in, 0u) << "bytes behind the end";
  text.resize(stream.total_out);
  inflateEnd(&stream);
  return text;
}

}  // namespace

WireFixture::WireFixture() : _respondToPost([](const WireRequest&) { return WireServer::answer(200); }) {
  _instance.grant(kClient);
  _server = std::make_unique<WireServer>(_instance.serverCertificate(),
                                         [this](const WireRequest& request) { return answer(request); });
  _instance.givenStorebagServer(_server->url("/bags"));
  writeDevice(false);
}

WireFixture::~WireFixture() = default;

void WireFixture::writeDevice(bool isInternal) {
  Dictionary device{{"UniqueDeviceID", "0123456789abcdef"},
                    {"ProductVersion", "12.5"},
                    {"BuildVersion", "6.1.0"},
                    {"ProductType", "Box2,1"},
                    {"DeviceName", "TelvaneBox"}};
  if (isInternal) device.set("ReleaseType", "Internal");
  _instance.givenFile("root/etc/telvane/device.plist", plist(device));
}

void WireFixture::givenInternalBuild() { writeDevice(true); }

Dictionary WireFixture::entryPostingTo(const std::string& url) {
  return {{kClientEntryPostURL, url},
          {kClientEntryLocaleWhitelist, Array{"US"}},
          {kClientEntryFilters, Array()},
          {kClientEntrySamplingThreshold, 1.0}};
}

Dictionary WireFixture::entryWith(const Key& key, Value value) const {
  Dictionary entry = clientEntry();
  entry.set(key, std::move(value));
  return entry;
}

Dictionary WireFixture::section(const std::string& backendName, Array entries) {
  Dictionary result;
  result.set(String(backendName), Dictionary{{kProfileClients, std::move(entries)}});
  return result;
}

void WireFixture::givenSection(const Dictionary& section, const std::string& bagName) {
  const Dictionary bag{{kEnvironmentRelease, section},
                       {kEnvironmentInternal, section},
                       {kStorebagVersion, "test-1"},
                       {kStorebagRefreshCycle, 3600}};
  const std::lock_guard lock(_mutex);
  _envelopes[bagName] = _instance.signedEnvelope(bag);
}

void WireFixture::givenPostsAnsweredBy(Respond respond) {
  const std::lock_guard lock(_mutex);
  _respondToPost = std::move(respond);
}

WireServer::Answer WireFixture::answer(const WireRequest& request) {
  Respond respondToPost;
  {
    const std::lock_guard lock(_mutex);
    if (request.isGet()) {
      const std::string target = request.target();
      const std::string path = target.substr(0, target.find('?'));
      const auto found =
          path.starts_with(kBagsPath) ? _envelopes.find(path.substr(kBagsPath.size())) : _envelopes.end();
      return found != _envelopes.end() ? WireServer::answer(200, found->second) : WireServer::answer(404);
    }
    respondToPost = _respondToPost;
  }
  return respondToPost(request);
}

void WireFixture::stopDaemon() {
  _instance.daemon().signal(SIGTERM);
  ASSERT_EQ(_instance.daemon().wait(), 0) << _instance.daemonLog();
}

Dictionary WireFixture::sessionInfo(bool batches, int clientType) {
  return {{kTelvaneSessionInfoClientType, clientType},
          {kTelvaneSessionInfoClientVersion, 3},
          {kTelvaneSessionInfoSessionID, 77},
          {kTelvaneSessionInfoBatchEvent, batches},
          {kTelvaneSessionInfoRequireUserInfo, true}};
}

Dictionary WireFixture::userInfo(const char* clientName) {
  return {{kTelvaneUserInfoClientName, clientName}, {kTelvaneUserInfoServiceName, "endtoend"}};
}

std::unique_ptr<ChildProcess> WireFixture::start(const ClientScript& script, const std::string& name) {
  _instance.givenFile(name + ".script", script.text());
  std::filesystem::remove(_instance.path(name + ".out"));
  return _instance.startProgram(kClient, {_instance.path(name + ".script")}, name);
}

std::string WireFixture::run(const ClientScript& script) {
  expectEnd(*start(script));
  return _instance.read("client.out");
}

void WireFixture::expectEnd(ChildProcess& client) {
  client.closeInput();
  EXPECT_EQ(client.wait(), 0) << _instance.read("client.err") << _instance.daemonLog();
}

std::string WireFixture::jsonOf(const WireRequest& post) {
  return post.header("Content-Encoding") == "gzip" ? gunzipped(post.body) : post.body;
}

Dictionary WireFixture::bodyOf(const WireRequest& post) {
  const Result<Value> parsed = json::parse(jsonOf(post), {.maximumBytes = kLargestJSON});
  EXPECT_TRUE(parsed.has_value() && parsed->isDictionary()) << jsonOf(post).substr(0, 1000);
  return parsed.has_value() && parsed->isDictionary() ? *parsed->dictionary() : Dictionary();
}

std::vector<Dictionary> WireFixture::eventsOf(const std::vector<WireRequest>& posts) {
  std::vector<Dictionary> events;
  for (const WireRequest& post : posts) {
    const Dictionary body = bodyOf(post);
    const Array* list = body[kBodyEvents].array();
    if (list == nullptr) continue;
    for (const Value& event : *list) events.push_back(*event.dictionary());
  }
  return events;
}

std::vector<Dictionary> WireFixture::eventsOf(const std::vector<WireRequest>& posts, int64_t category) {
  std::vector<Dictionary> events = eventsOf(posts);
  std::erase_if(events, [category](const Dictionary& event) { return event[kEventMethod].integerValue() != category; });
  return events;
}

}  // namespace telvane::testing
