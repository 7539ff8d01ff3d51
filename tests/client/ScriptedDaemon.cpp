#include "tests/client/ScriptedDaemon.h"

#include <unistd.h>

#include <algorithm>
#include <stdexcept>

namespace telvane::testing {
namespace {

std::optional<std::string> contentOf(const ipc::Descriptor& descriptor) {
  if (!descriptor.isValid()) return std::nullopt;
  std::string content(65536, '\0');
  const ssize_t size = ::read(descriptor.get(), content.data(), content.size());
  content.resize(size > 0 ? static_cast<size_t>(size) : 0);
  return content;
}

}  // namespace

class ScriptedDaemon::Session final : public ipc::ExportedObject {
 public:
  explicit Session(ScriptedDaemon& daemon) : _daemon(daemon) {}
  void invoke(ipc::Invocation invocation, ipc::ReplyBlock reply) override {
    _daemon.invoked(std::move(invocation), std::move(reply));
  }

 private:
  ScriptedDaemon& _daemon;
};

ScriptedDaemon::ScriptedDaemon(ipc::Service& localService) {
  Result<std::unique_ptr<ipc::Listener>> listener = localService.newListener(kTelvanedServiceName);
  if (!listener) throw std::runtime_error("the scripted daemon cannot listen: " + listener.error().description());
  _listener = std::move(*listener);
  _listener->setDelegate(this);
  _listener->resume();
}

ScriptedDaemon::~ScriptedDaemon() = default;

void ScriptedDaemon::answer(ClientSessionOperation operation, Answer answer) {
  const std::lock_guard lock(_mutex);
  _answers[operation] = std::move(answer);
}

void ScriptedDaemon::answer(ClientSessionOperation operation, Array values) {
  answer(operation, [values = std::move(values)](const Call&, ipc::ReplyBlock reply) {
    if (reply) reply(values);
  });
}

bool ScriptedDaemon::listener(ipc::Listener&, std::shared_ptr<ipc::Connection> connection) {
  if (_isRefusing) return false;
  connection->setExportedObject(std::make_shared<Session>(*this));
  connection->setInvalidationHandler([this] {
    const std::lock_guard lock(_mutex);
    ++_endedConnectionCount;
    _changed.notify_all();
  });
  connection->resume();
  const std::lock_guard lock(_mutex);
  ++_connectionCount;
  _connections.push_back(std::move(connection));
  return true;
}

void ScriptedDaemon::invoked(ipc::Invocation invocation, ipc::ReplyBlock reply) {
  const Call call{static_cast<ClientSessionOperation>(invocation.operation), std::move(invocation.arguments),
                  contentOf(invocation.descriptor)};
  Answer answer;
  {
    const std::lock_guard lock(_mutex);
    _calls.push_back(call);
    _changed.notify_all();
    const auto found = _answers.find(call.operation);
    if (found != _answers.end()) {
      answer = found->second;
    } else if (reply) {
      _keptReplies.push_back(std::move(reply));
    }
  }
  if (answer) answer(call, std::move(reply));
}

std::vector<ScriptedDaemon::Call> ScriptedDaemon::calls() const {
  const std::lock_guard lock(_mutex);
  return _calls;
}

std::vector<ClientSessionOperation> ScriptedDaemon::operations() const {
  std::vector<ClientSessionOperation> operations;
  for (const Call& call : calls()) operations.push_back(call.operation);
  return operations;
}

size_t ScriptedDaemon::count(ClientSessionOperation operation) const {
  const std::vector<ClientSessionOperation> all = operations();
  return static_cast<size_t>(std::count(all.begin(), all.end(), operation));
}

ScriptedDaemon::Call ScriptedDaemon::last(ClientSessionOperation operation) const {
  const std::vector<Call> all = calls();
  const auto call =
      std::find_if(all.rbegin(), all.rend(), [operation](const Call& other) { return other.operation == operation; });
  if (call == all.rend()) throw std::runtime_error("the scripted daemon has not had this call");
  return *call;
}

size_t ScriptedDaemon::connectionCount() const {
  const std::lock_guard lock(_mutex);
  return _connectionCount;
}

size_t ScriptedDaemon::endedConnectionCount() const {
  const std::lock_guard lock(_mutex);
  return _endedConnectionCount;
}

void ScriptedDaemon::dropReplies() {
  std::vector<ipc::ReplyBlock> dropped;
  const std::lock_guard lock(_mutex);
  dropped.swap(_keptReplies);
}

void ScriptedDaemon::end() {
  stop();
  dropReplies();
  std::vector<std::shared_ptr<ipc::Connection>> connections;
  const std::lock_guard lock(_mutex);
  connections.swap(_connections);
}

bool ScriptedDaemon::waitFor(ClientSessionOperation operation, size_t count) {
  return waitUntil([this, operation, count] {
    return static_cast<size_t>(std::count_if(_calls.begin(), _calls.end(), [operation](const Call& call) {
             return call.operation == operation;
           })) >= count;
  });
}

bool ScriptedDaemon::waitForEndedConnections(size_t count) {
  return waitUntil([this, count] { return _endedConnectionCount >= count; });
}

bool ScriptedDaemon::waitUntil(const std::function<bool()>& condition) {
  std::unique_lock lock(_mutex);
  return _changed.wait_for(lock, std::chrono::seconds(30), condition);
}

}  // namespace telvane::testing
