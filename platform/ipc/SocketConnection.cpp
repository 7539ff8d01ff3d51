#include "platform/ipc/SocketConnection.h"

#include <utility>

#include "platform/ipc/ConnectionCore.h"

namespace telvane::ipc {

SocketConnection::SocketConnection(std::shared_ptr<ConnectionCore> core, std::shared_ptr<const ForkMarker> process,
                                   unixsocket::Peer peer, const Entitlements* entitlements)
    : _core(std::move(core)), _process(std::move(process)), _peer(std::move(peer)), _entitlements(entitlements) {}

SocketConnection::~SocketConnection() {
  if (_process->isOriginalProcess()) {
    _core->letGo();
  } else {
    new std::shared_ptr<ConnectionCore>(std::move(_core));  // leaked: its locks and its thread are the parent's
  }
}

void SocketConnection::setExportedObject(std::shared_ptr<ExportedObject> object) {
  if (_process->isOriginalProcess()) _core->setExportedObject(std::move(object));
}

void SocketConnection::setInterruptionHandler(Job handler) {
  if (_process->isOriginalProcess()) _core->setInterruptionHandler(std::move(handler));
}

void SocketConnection::setInvalidationHandler(Job handler) {
  if (_process->isOriginalProcess()) _core->setInvalidationHandler(std::move(handler));
}

void SocketConnection::resume() {
  if (_process->isOriginalProcess()) _core->resume();
}

void SocketConnection::send(Invocation invocation, ErrorHandler onError) {
  if (!_process->isOriginalProcess()) return;
  OutgoingCall call;
  call.invocation = std::move(invocation);
  call.onError = std::move(onError);
  _core->send(std::move(call));
}

void SocketConnection::sendWithReply(Invocation invocation, ReplyBlock reply, ErrorHandler onError) {
  if (!_process->isOriginalProcess()) return;
  OutgoingCall call;
  call.invocation = std::move(invocation);
  call.reply = std::move(reply);
  call.onError = std::move(onError);
  _core->send(std::move(call));
}

void SocketConnection::invalidate() {
  if (_process->isOriginalProcess()) _core->invalidate();
}

bool SocketConnection::peerHasEntitlement(const std::string& name) const {
  return _entitlements != nullptr && _entitlements->isGranted(name, _peer);
}

PeerIdentity SocketConnection::peerIdentity() const {
  return {_peer.userID, _peer.groupID, {_peer.supplementaryGroups.begin(), _peer.supplementaryGroups.end()}};
}

bool SocketConnection::hasEnded() const { return _core->hasEnded(); }

std::string SocketConnection::description() const { return _core->description(); }

}  // namespace telvane::ipc
