#pragma once

#include <memory>
#include <string>

#include "platform/ipc/Service.h"
#include "tests/support/SimulatedServiceHub.h"

namespace telvane::testing {

// What the owner of a connection holds of it; its end lets the connection go.
class SimulatedConnection final : public ipc::Connection {
 public:
  explicit SimulatedConnection(std::shared_ptr<SimulatedConnectionEnd> end) : _end(std::move(end)) {}
  ~SimulatedConnection() override { _end->letGo(); }

  void setExportedObject(std::shared_ptr<ipc::ExportedObject> object) override;
  void setInterruptionHandler(Job handler) override;
  void setInvalidationHandler(Job handler) override;
  void resume() override;
  void send(ipc::Invocation invocation, ErrorHandler onError) override;
  void sendWithReply(ipc::Invocation invocation, ipc::ReplyBlock reply, ErrorHandler onError) override;
  void invalidate() override;
  bool peerHasEntitlement(const std::string& name) const override;
  PeerIdentity peerIdentity() const override;
  bool hasEnded() const override;
  std::string description() const override;

 private:
  const std::shared_ptr<SimulatedConnectionEnd> _end;
};

// The accepting side of a name, in one process.
class SimulatedListener final : public ipc::Listener {
 public:
  SimulatedListener(SimulatedServiceHub& hub, std::shared_ptr<SimulatedServiceHub::ListenerState> state);
  ~SimulatedListener() override;

  void setDelegate(ipc::ListenerDelegate* delegate) override { _state->delegate = delegate; }
  void resume() override { _hub.resumeListener(_state); }
  void stop() override { _hub.stopListener(_state); }

 private:
  SimulatedServiceHub& _hub;
  const std::shared_ptr<SimulatedServiceHub::ListenerState> _state;
};

// The machine's local services, as one process sees them.
class SimulatedLocalService final : public ipc::Service {
 public:
  SimulatedLocalService(SimulatedServiceHub& hub, std::shared_ptr<SimulatedPeer> peer)
      : _hub(hub), _peer(std::move(peer)) {}

  Result<std::unique_ptr<ipc::Listener>> newListener(const std::string& serviceName) override;
  Result<std::shared_ptr<ipc::Connection>> newConnection(const std::string& serviceName) override;
  int checkLookUp(const std::string& serviceName) const override;

 private:
  SimulatedServiceHub& _hub;
  const std::shared_ptr<SimulatedPeer> _peer;
};

}  // namespace telvane::testing
