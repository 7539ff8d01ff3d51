#include "tests/platform/url/URLSessionFixture.h"

#include <chrono>

namespace telvane::testing {

URLSessionFixture::URLSessionFixture()
    : _certificates(_folder.path()),
      _queue(_dispatch.newSerialQueue("delegate", QualityOfService::Default)),
      _delegate(std::make_shared<RecordingURLSessionDelegate>(_queue)) {
  const TestCertificates::Server files = _certificates.valid();
  _serverOptions.certificateFile = files.certificateFile;
  _serverOptions.privateKeyFile = files.privateKeyFile;
  _options.caFile = _certificates.authorityFile();
}

URLSessionFixture::~URLSessionFixture() {
  _tasks.clear();
  _session = nullptr;
  _provider = nullptr;
  _server = nullptr;
}

HTTPServer& URLSessionFixture::server() {
  if (_server) return *_server;
  Server::Handler handler = _handler;
  if (!handler) {
    handler = [this](const Server::Request&, std::shared_ptr<Server::Responder> responder) {
      const std::lock_guard lock(_mutex);
      _responders.push_back(std::move(responder));
      _requestCame.notify_all();
    };
  }
  auto started = Server::start(_serverOptions, std::move(handler), _sinkMaker);
  if (!started) throw std::runtime_error(started.error().description());
  _server = std::move(*started);
  return *_server;
}

URLSession& URLSessionFixture::session() {
  if (!_provider) _provider = std::make_unique<CurlURLSessionProvider>(*_sessionDispatch, _log, &_gate, _options);
  if (!_session) _session = _provider->newSession(_configuration, _delegate, _queue);
  return *_session;
}

void URLSessionFixture::dropSession() { _session = nullptr; }

void URLSessionFixture::dropProvider() { _provider = nullptr; }

std::string URLSessionFixture::url(const std::string& path) {
  const char* scheme = _serverOptions.certificateFile.empty() ? "http" : "https";
  return std::string(scheme) + "://localhost:" + std::to_string(server().port()) + path;
}

std::shared_ptr<URLSessionTask> URLSessionFixture::start(URLRequest request) {
  auto task = session().newDataTask(std::move(request));
  if (!task) throw std::runtime_error(task.error().description());
  _tasks.push_back(*task);
  (*task)->setTaskDescription(std::to_string(_tasks.size()));
  (*task)->resume();
  return *task;
}

TaskOutcome URLSessionFixture::run(URLRequest request) { return _delegate->waitFor(start(std::move(request))); }

std::vector<std::shared_ptr<HTTPServer::Responder>> URLSessionFixture::waitForRequests(size_t count) {
  std::unique_lock lock(_mutex);
  const bool came = _requestCame.wait_for(lock, std::chrono::seconds(30), [&] { return _responders.size() >= count; });
  EXPECT_TRUE(came) << "expected " << count << " requests, " << _responders.size() << " came";
  return _responders;
}

URLRequest URLSessionFixture::post(std::string url, std::string body) {
  return {.url = std::move(url), .method = "POST", .body = Data(std::move(body))};
}

void expectError(const TaskOutcome& outcome, URLErrorCode code) {
  EXPECT_EQ(outcome.completions, 1);
  ASSERT_TRUE(outcome.error.has_value()) << "expected error " << static_cast<int64_t>(code) << ", came success";
  EXPECT_EQ(outcome.error->code(), static_cast<int64_t>(code)) << outcome.error->description();
  EXPECT_EQ(outcome.error->domain(), String(kPlatformErrorDomain));
}

}  // namespace telvane::testing
