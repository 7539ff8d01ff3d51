#include "platform/ipc/SocketService.h"

#include <fmt/format.h>

#include <cerrno>
#include <utility>

#include "platform/ipc/ConnectionCore.h"
#include "platform/ipc/SocketConnection.h"
#include "platform/ipc/SocketListener.h"
#include "platform/ipc/UnixSocket.h"

namespace telvane::ipc {

namespace {
constexpr const char* kSocketFolder = "/run/telvane";
}

SocketService::SocketService(const FileSystem& files, Dispatch& dispatch, Log& log, const Entitlements& entitlements,
                             FlowGate* gate, Limits limits)
    : _files(files),
      _dispatch(dispatch),
      _log(log),
      _entitlements(entitlements),
      _gate(gate),
      _limits(limits),
      _process(std::make_shared<ForkMarker>()),
      _loop(std::make_shared<LoopThread>(log)) {}

SocketService::~SocketService() {
  if (_process->isOriginalProcess()) {
    endConnections(_limits.serviceLingerTime);
  } else {
    new std::shared_ptr<LoopThread>(std::move(_loop));  // leaked: the thread is the parent's
  }
}

void SocketService::stop(std::chrono::milliseconds patience) {
  if (_process->isOriginalProcess()) _loop->stop(patience);
}

void SocketService::endConnections(std::chrono::milliseconds patience) {
  if (_process->isOriginalProcess()) _loop->stop(patience);
}

Result<std::string> SocketService::pathOf(const std::string& serviceName) const {
  if (serviceName.empty() || serviceName.find('/') != std::string::npos) {
    return Error::withDescription(kPlatformErrorDomain, EINVAL,
                                  fmt::format("No service can be named \"{}\"", serviceName));
  }
  if (!_process->isOriginalProcess()) {
    return Error::withDescription(kPlatformErrorDomain, ECHILD, "The process has forked; make a service of its own");
  }
  return _files.resolve(fmt::format("{}/{}.socket", kSocketFolder, serviceName));
}

Result<std::unique_ptr<Listener>> SocketService::newListener(const std::string& serviceName) {
  auto path = pathOf(serviceName);
  if (!path) return path.error();
  SocketListener::Parts parts{.loop = _loop,
                              .process = _process,
                              .dispatch = _dispatch,
                              .log = _log,
                              .entitlements = _entitlements,
                              .gate = _gate,
                              .limits = _limits};
  if (auto passed = unixsocket::passedSocket(serviceName)) {
    return std::unique_ptr<Listener>(
        std::make_unique<SocketListener>(std::move(parts), serviceName, std::move(*passed), std::string()));
  }
  auto socket = unixsocket::listenAt(*path);
  if (!socket) return socket.error();
  return std::unique_ptr<Listener>(
      std::make_unique<SocketListener>(std::move(parts), serviceName, std::move(*socket), *path));
}

Result<std::shared_ptr<Connection>> SocketService::newConnection(const std::string& serviceName) {
  auto path = pathOf(serviceName);
  if (!path) return path.error();
  auto core = ConnectionCore::newConnecting({.loop = _loop,
                                             .queue = _dispatch.newSerialQueue("connection to " + serviceName),
                                             .log = _log,
                                             .gate = nullptr,
                                             .limits = _limits,
                                             .description = "service " + serviceName},
                                            *path);
  return std::shared_ptr<Connection>(std::make_shared<SocketConnection>(std::move(core), _process));
}

int SocketService::checkLookUp(const std::string& serviceName) const {
  const auto path = pathOf(serviceName);
  return path ? unixsocket::checkAccess(*path) : 0;
}

}  // namespace telvane::ipc
