#pragma once

#include <chrono>
#include <memory>
#include <string>

#include "platform/Dispatch.h"
#include "platform/FileSystem.h"
#include "platform/FlowGate.h"
#include "platform/Log.h"
#include "platform/ipc/Entitlements.h"
#include "platform/ipc/ForkMarker.h"
#include "platform/ipc/Limits.h"
#include "platform/ipc/LoopThread.h"
#include "platform/ipc/Service.h"

namespace telvane::ipc {

// Local services over Unix stream sockets: a service named NAME is the socket /run/telvane/NAME.socket below the
// instance's root, or the one that the service manager passed.
//
// Made by an entry point, or by the client library inside its host; owns the one thread on which all its sockets are
// read and written, which the first connection starts. Touches neither signals nor anything else of the host.
//
// Its destructor waits until what was sent on connections that were let go has been delivered, at most
// Limits::serviceLingerTime. Listeners go before it; connections that still exist are invalidated. In a forked child
// the service is of no use, and its destructor does nothing; the child makes one of its own.
class SocketService final : public Service {
 public:
  // gate: while it is closed no received call is executed; may be null. All references outlive the service.
  SocketService(const FileSystem& files, Dispatch& dispatch, Log& log, const Entitlements& entitlements,
                FlowGate* gate = nullptr, Limits limits = {});
  ~SocketService() override;
  SocketService(const SocketService&) = delete;
  SocketService& operator=(const SocketService&) = delete;

  // Waits until the connections that were let go have delivered what they had, at most this long; every connection is
  // over then, and none can be made any more. For a process that ends without destroying its service.
  void endConnections(std::chrono::milliseconds patience);

  Result<std::unique_ptr<Listener>> newListener(const std::string& serviceName) override;
  Result<std::shared_ptr<Connection>> newConnection(const std::string& serviceName) override;
  int checkLookUp(const std::string& serviceName) const override;

  // Does what the destructor does, with this patience, and leaves the object: for a library, whose host may still call
  // when the process ends. Connections made afterwards lead nowhere. Called once.
  void stop(std::chrono::milliseconds patience);

 private:
  Result<std::string> pathOf(const std::string& serviceName) const;

  const FileSystem& _files;
  Dispatch& _dispatch;
  Log& _log;
  const Entitlements& _entitlements;
  FlowGate* const _gate;
  const Limits _limits;
  const std::shared_ptr<const ForkMarker> _process;
  std::shared_ptr<LoopThread> _loop;
};

}  // namespace telvane::ipc
