#pragma once

#include <condition_variable>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "interfaces/ClientSessionInterface.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/Service.h"

namespace telvane::testing {

// A daemon as a client sees it: takes connections, keeps every call, and answers as the test says. Runs on any
// platform.
class ScriptedDaemon final : private ipc::ListenerDelegate {
 public:
  struct Call {
    ClientSessionOperation operation;
    Array arguments;
    // What the descriptor that came along reads as; nothing when there was none.
    std::optional<std::string> file;
  };
  // Answers a call; the reply is empty for calls that want none.
  using Answer = std::function<void(const Call& call, ipc::ReplyBlock reply)>;

  explicit ScriptedDaemon(ipc::Service& localService);
  ~ScriptedDaemon() override;

  // Until told otherwise, nothing is answered and reply blocks are kept.
  void answer(ClientSessionOperation operation, Answer answer);
  void answer(ClientSessionOperation operation, Array values);
  // Connections from now on are refused.
  void refuse() { _isRefusing = true; }
  // Stops serving.
  void stop() { _listener.reset(); }
  // Stops serving and ends all connections.
  void end();

  std::vector<Call> calls() const;
  std::vector<ClientSessionOperation> operations() const;
  size_t count(ClientSessionOperation operation) const;
  // The last call of that operation. REQUIRES: count() > 0.
  Call last(ClientSessionOperation operation) const;
  // Waits, on a real platform, until that many calls of the operation have come; false when they do not come in time.
  bool waitFor(ClientSessionOperation operation, size_t count);
  // The same for connections that have ended.
  bool waitForEndedConnections(size_t count);

  size_t connectionCount() const;
  size_t endedConnectionCount() const;
  // The connection accepted last. REQUIRES: there is one.
  ipc::Connection& connection() { return *_connections.back(); }
  // Lets the reply blocks go that were kept.
  void dropReplies();

 private:
  class Session;
  bool listener(ipc::Listener& listener, std::shared_ptr<ipc::Connection> shouldAcceptNewConnection) override;
  void invoked(ipc::Invocation invocation, ipc::ReplyBlock reply);

  bool waitUntil(const std::function<bool()>& condition);

  std::unique_ptr<ipc::Listener> _listener;
  bool _isRefusing = false;

  mutable std::mutex _mutex;  // guards what follows
  std::condition_variable _changed;
  std::map<ClientSessionOperation, Answer> _answers;
  std::vector<std::shared_ptr<ipc::Connection>> _connections;
  size_t _connectionCount = 0;
  size_t _endedConnectionCount = 0;
  std::vector<Call> _calls;
  std::vector<ipc::ReplyBlock> _keptReplies;
};

}  // namespace telvane::testing
