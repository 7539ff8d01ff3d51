#include "tests/support/ScriptedNetwork.h"

#include <algorithm>
#include <utility>

#include "tests/support/ScriptedURLSession.h"
#include "tests/support/ScriptedURLSessionTask.h"

namespace telvane::testing {

namespace {

// What the owner of a session holds; its end is the end of the session, if it was not told to finish its tasks.
class Handle final : public URLSession {
 public:
  explicit Handle(std::shared_ptr<ScriptedURLSession> session) : _session(std::move(session)) {}
  ~Handle() override { _session->cancelUnlessFinishing(); }

  const std::string& sessionDescription() const override { return _session->sessionDescription(); }
  void setSessionDescription(std::string description) override {
    _session->setSessionDescription(std::move(description));
  }
  Result<std::shared_ptr<URLSessionTask>> newDataTask(URLRequest request) override {
    return _session->newDataTask(std::move(request));
  }
  Result<std::shared_ptr<URLSessionTask>> newUploadTask(URLRequest request, const std::string& path) override {
    return _session->newUploadTask(std::move(request), path);
  }
  void finishTasksAndInvalidate() override { _session->finishTasksAndInvalidate(); }

 private:
  const std::shared_ptr<ScriptedURLSession> _session;
};

class Provider final : public URLSessionProvider {
 public:
  using Remember = std::function<void(const std::shared_ptr<ScriptedURLSession>& session)>;
  Provider(ScriptedURLSessionEnvironment environment, Remember remember)
      : _environment(std::move(environment)), _remember(std::move(remember)) {}

  std::unique_ptr<URLSession> newSession(URLSessionConfiguration configuration,
                                         std::shared_ptr<URLSessionDelegate> delegate,
                                         std::shared_ptr<SerialQueue> delegateQueue) override {
    auto session = std::make_shared<ScriptedURLSession>(_environment, std::move(configuration), std::move(delegate),
                                                        std::move(delegateQueue));
    _remember(session);
    return std::make_unique<Handle>(std::move(session));
  }

 private:
  const ScriptedURLSessionEnvironment _environment;
  const Remember _remember;
};

}  // namespace

void ScriptedNetwork::answer(std::string url, NetworkAnswer answer) {
  answerWith(std::move(url), [answer = std::move(answer)](const URLRequest&) { return answer; });
}

void ScriptedNetwork::answerWith(std::string url, Script script) {
  _rules.push_back(Rule{std::move(url), std::move(script), false});
}

void ScriptedNetwork::answerOnce(std::string url, NetworkAnswer answer) {
  Rule rule{std::move(url), [answer = std::move(answer)](const URLRequest&) { return answer; }, true};
  // The rules that serve once stand in front, in their order.
  const auto firstStanding =
      std::find_if(_rules.begin(), _rules.end(), [](const Rule& other) { return !other.isOnce; });
  _rules.insert(firstStanding, std::move(rule));
}

void ScriptedNetwork::restoreConnectivity() {
  _isConnected = true;
  for (const auto& task : runningTasks()) task->connectivityCame();
}

void ScriptedNetwork::breakConnections() {
  for (const auto& task : runningTasks()) task->connectionBroke();
}

std::vector<RecordedRequest> ScriptedNetwork::requestsTo(std::string_view url) const {
  std::vector<RecordedRequest> found;
  for (const RecordedRequest& request : _requests) {
    if (applies(std::string(url), request.request.url)) found.push_back(request);
  }
  return found;
}

std::unique_ptr<URLSessionProvider> ScriptedNetwork::newProvider(std::string processName,
                                                                 SimulatedScheduler::ProcessID process,
                                                                 const FileSystem& files, FlowGate* gate) {
  return std::make_unique<Provider>(
      ScriptedURLSessionEnvironment{*this, _scheduler, std::move(processName), process, files, gate},
      [this](const std::shared_ptr<ScriptedURLSession>& session) { remember(session); });
}

void ScriptedNetwork::endProcess(SimulatedScheduler::ProcessID process) {
  for (const auto& session : sessions()) {
    if (session->environment().process == process) session->vanish();
  }
}

bool ScriptedNetwork::applies(const std::string& rule, std::string_view url) {
  const bool isWholeURL = rule.find("://") != std::string::npos;
  return isWholeURL ? url.rfind(rule, 0) == 0 : url.find(rule) != std::string_view::npos;
}

NetworkAnswer ScriptedNetwork::answerFor(const URLRequest& request) {
  for (auto rule = _rules.begin(); rule != _rules.end() && rule->isOnce; ++rule) {
    if (!applies(rule->url, request.url)) continue;
    const Script script = std::move(rule->script);
    _rules.erase(rule);
    return script(request);
  }
  for (auto rule = _rules.rbegin(); rule != _rules.rend() && !rule->isOnce; ++rule) {
    if (applies(rule->url, request.url)) return Script(rule->script)(request);
  }
  return NetworkAnswer::failure(URLErrorCode::CannotFindHost);
}

RecordedRequest& ScriptedNetwork::record(RecordedRequest request) {
  _requests.push_back(std::move(request));
  return _requests.back();
}

void ScriptedNetwork::remember(const std::shared_ptr<ScriptedURLSession>& session) {
  std::erase_if(_sessions, [](const auto& known) { return known.expired(); });
  _sessions.push_back(session);
}

std::vector<std::shared_ptr<ScriptedURLSession>> ScriptedNetwork::sessions() const {
  std::vector<std::shared_ptr<ScriptedURLSession>> alive;
  for (const auto& known : _sessions) {
    if (auto session = known.lock()) alive.push_back(std::move(session));
  }
  return alive;
}

std::vector<std::shared_ptr<ScriptedURLSessionTask>> ScriptedNetwork::runningTasks() const {
  std::vector<std::shared_ptr<ScriptedURLSessionTask>> running;
  for (const auto& session : sessions()) {
    running.insert(running.end(), session->runningTasks().begin(), session->runningTasks().end());
  }
  return running;
}

}  // namespace telvane::testing
