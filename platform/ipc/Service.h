#pragma once

#include <memory>
#include <string>

#include "foundation/Error.h"
#include "platform/ipc/Connection.h"

namespace telvane::ipc {

// Decides about new connections of a listener.
class ListenerDelegate {
 public:
  virtual ~ListenerDelegate() = default;
  // Configures and resumes the connection and returns true, or returns false to refuse it (it is then invalidated).
  // Called on the listener's own serial queue. The listener holds an accepted connection until it is invalidated.
  virtual bool listener(class Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) = 0;
};

// The accepting side of a service. Letting it go stops accepting; accepted connections live on.
class Listener {
 public:
  virtual ~Listener() = default;
  // Not owned; must outlive the listener. Set before resume().
  virtual void setDelegate(ListenerDelegate* delegate) = 0;
  virtual void resume() = 0;
  // Stops accepting and removes the socket that this process made. Idempotent.
  virtual void stop() = 0;
};

// Local services by name: makes listeners and connections.
class Service {
 public:
  virtual ~Service() = default;
  // Opens the service: takes the descriptor passed by the service manager, or makes the socket (replacing a stale one).
  // Fails when another process serves the name already (EADDRINUSE), or the socket cannot be made.
  virtual Result<std::unique_ptr<Listener>> newListener(const std::string& serviceName) = 0;
  // Makes a connection; connecting happens after resume(), so this fails only for lack of resources.
  virtual Result<std::shared_ptr<Connection>> newConnection(const std::string& serviceName) = 0;
  // Whether this process may look the service up: 0, or an errno value that says why not (EACCES, EPERM). A service
  // that is not there, or not there yet, is no reason.
  virtual int checkLookUp(const std::string& serviceName) const = 0;
};

}  // namespace telvane::ipc
