#include "tests/support/SimulatedLocalService.h"

#include <utility>

namespace telvane::testing {

void SimulatedConnection::setExportedObject(std::shared_ptr<ipc::ExportedObject> object) {
  _end->setExportedObject(std::move(object));
}

void SimulatedConnection::setInterruptionHandler(Job handler) { _end->setInterruptionHandler(std::move(handler)); }

void SimulatedConnection::setInvalidationHandler(Job handler) { _end->setInvalidationHandler(std::move(handler)); }

void SimulatedConnection::resume() { _end->resume(); }

void SimulatedConnection::send(ipc::Invocation invocation, ErrorHandler onError) {
  _end->send(std::move(invocation), std::move(onError));
}

void SimulatedConnection::sendWithReply(ipc::Invocation invocation, ipc::ReplyBlock reply, ErrorHandler onError) {
  _end->sendWithReply(std::move(invocation), std::move(reply), std::move(onError));
}

void SimulatedConnection::invalidate() { _end->invalidate(); }

PeerIdentity SimulatedConnection::peerIdentity() const { return _end->peerIdentity(); }

bool SimulatedConnection::hasEnded() const { return _end->hasEnded(); }

bool SimulatedConnection::peerHasEntitlement(const std::string& name) const { return _end->peerHasEntitlement(name); }

std::string SimulatedConnection::description() const { return _end->description(); }

SimulatedListener::SimulatedListener(SimulatedServiceHub& hub,
                                     std::shared_ptr<SimulatedServiceHub::ListenerState> state)
    : _hub(hub), _state(std::move(state)) {
  _state->listener = this;
}

SimulatedListener::~SimulatedListener() {
  stop();
  _state->delegate = nullptr;
  _state->listener = nullptr;
}

Result<std::unique_ptr<ipc::Listener>> SimulatedLocalService::newListener(const std::string& serviceName) {
  auto state = _hub.openListener(_peer, serviceName);
  if (!state) return state.error();
  return std::unique_ptr<ipc::Listener>(std::make_unique<SimulatedListener>(_hub, *state));
}

Result<std::shared_ptr<ipc::Connection>> SimulatedLocalService::newConnection(const std::string& serviceName) {
  return _hub.newConnection(_peer, serviceName);
}

int SimulatedLocalService::checkLookUp(const std::string& serviceName) const {
  return _hub.checkLookUp(*_peer, serviceName);
}

}  // namespace telvane::testing
