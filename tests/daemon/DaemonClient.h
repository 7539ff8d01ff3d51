#pragma once

#include <memory>
#include <optional>
#include <vector>

#include "interfaces/ClientSessionInterface.h"
#include "platform/ipc/Connection.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {

// What became of a call that wants an answer.
struct Answer {
  std::optional<Array> values;  // nothing while no answer has come
  std::optional<Error> error;
  const Value& operator[](size_t index) const { return values.has_value() ? (*values)[index] : Value::none(); }
};

// One connection to the daemon, as any program could make it: calls go out as they are given, right or wrong. The
// verbs wait until everything has come to rest, but let no time pass.
class DaemonClient {
 public:
  using Operation = ClientSessionOperation;

  DaemonClient(SimulatedWorld& world, SimulatedPlatform& process);
  ~DaemonClient() { close(); }

  void tell(Operation operation, Array arguments);
  Answer ask(Operation operation, Array arguments = {});
  // The same without waiting for anything. descriptor: goes along with the call, or -1.
  std::shared_ptr<Answer> askInPassing(Operation operation, Array arguments = {}, int descriptor = -1);
  // Hands a file over. token: of the daemon's SandboxExtensions.
  Answer upload(const std::string& fileURL, const ExtensionToken& token);
  std::shared_ptr<Answer> uploadInPassing(const std::string& fileURL, const ExtensionToken& token);

  void setSessionInfo(Value sessionInfo, Value userInfo = {}, bool hasAggregationBlock = false) {
    tell(Operation::SetSessionInfo, {std::move(sessionInfo), std::move(userInfo), Value(), hasAggregationBlock});
  }
  Answer start() { return ask(Operation::StartConfig); }
  Answer fetchStates(Value userInfo = {}) { return ask(Operation::FetchStates, {std::move(userInfo)}); }
  Answer sendMessage(Value message) { return ask(Operation::SendMessageWithDictionary, {std::move(message)}); }
  Answer send(int category, int type = 1, Dictionary payload = {});
  Answer flush() { return ask(Operation::FlushMessages); }
  Answer sendOneMessage(Value sessionInfo, Value userInfo, Value payload = {});
  // Lets the connection go.
  void close();

  bool isInvalidated() const { return *_isInvalidated; }
  // The calls that the daemon made.
  const std::vector<Array>& aggregated() const;

 private:
  class AggregationObject;
  SimulatedWorld& _world;
  const std::shared_ptr<bool> _isInvalidated = std::make_shared<bool>(false);
  const std::shared_ptr<AggregationObject> _object;
  std::shared_ptr<ipc::Connection> _connection;
};

}  // namespace telvane::testing
