#pragma once

#include <memory>
#include <string>

#include "platform/ipc/Connection.h"
#include "platform/ipc/Entitlements.h"
#include "platform/ipc/ForkMarker.h"
#include "platform/ipc/UnixSocket.h"

namespace telvane::ipc {

class ConnectionCore;

// A connection over a Unix stream socket: what its owner holds of the core that does the work.
//
// Letting it go ends it like invalidate(), what was sent before is still delivered, but no handler that was set runs
// any more: only the error handlers of calls whose answer can no longer come.
//
// In a process forked from the one that made it, it does nothing: calls are let go of without a word, because the queue
// on which their handlers ran has no thread there. The line stays the parent's.
class SocketConnection final : public Connection {
 public:
  // peer and entitlements: of the accepting side only.
  SocketConnection(std::shared_ptr<ConnectionCore> core, std::shared_ptr<const ForkMarker> process,
                   unixsocket::Peer peer = {}, const Entitlements* entitlements = nullptr);
  ~SocketConnection() override;
  SocketConnection(const SocketConnection&) = delete;
  SocketConnection& operator=(const SocketConnection&) = delete;

  void setExportedObject(std::shared_ptr<ExportedObject> object) override;
  void setInterruptionHandler(Job handler) override;
  void setInvalidationHandler(Job handler) override;
  void resume() override;
  void send(Invocation invocation, ErrorHandler onError) override;
  void sendWithReply(Invocation invocation, ReplyBlock reply, ErrorHandler onError) override;
  void invalidate() override;
  bool peerHasEntitlement(const std::string& name) const override;
  PeerIdentity peerIdentity() const override;
  bool hasEnded() const override;
  std::string description() const override;

 private:
  std::shared_ptr<ConnectionCore> _core;
  const std::shared_ptr<const ForkMarker> _process;
  const unixsocket::Peer _peer;
  const Entitlements* const _entitlements;
};

}  // namespace telvane::ipc
