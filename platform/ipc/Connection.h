#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <utility>

#include "foundation/Error.h"
#include "foundation/ExtensionToken.h"
#include "foundation/UniqueFunction.h"
#include "foundation/Value.h"

namespace telvane::ipc {

// An open file descriptor that travels with a call; closes it at its end.
class Descriptor {
 public:
  Descriptor() noexcept = default;
  explicit Descriptor(int fd) noexcept : _fd(fd) {}
  Descriptor(Descriptor&& other) noexcept;
  Descriptor& operator=(Descriptor&& other) noexcept;
  ~Descriptor();
  int get() const noexcept { return _fd; }
  bool isValid() const noexcept { return _fd >= 0; }
  // Gives the descriptor up to the caller, who closes it.
  int release() noexcept { return std::exchange(_fd, -1); }

 private:
  int _fd = -1;
};

// The block of a call that wants an answer: takes the answer's values, called at most once. Dropping it unanswered
// tells the caller's error handler.
using ReplyBlock = UniqueFunction<void(Array values)>;

// One call: the operation's number, its arguments in the order of its own list, perhaps a descriptor. Absent arguments
// are absent values.
struct Invocation {
  uint16_t operation = 0;
  Array arguments;
  Descriptor descriptor;
  // Whether the call is one of many that may be lost when too many wait: it is then dropped without its error handler
  // being called, since a notice for each would take what the bound saves. The connection's log line says how many.
  bool isDroppedSilently = false;
};

// The object that this process exports on a connection. Held by the connection until that has been invalidated or set
// another one; its calls come one at a time, in the order in which they were made.
class ExportedObject {
 public:
  virtual ~ExportedObject() = default;
  // Serves one call. reply is empty when the caller wants no answer; it may be kept and called later from any thread.
  // Unknown operations and arguments of a wrong type are for the object to refuse; it never throws.
  virtual void invoke(Invocation invocation, ReplyBlock reply) = 0;
};

// One end of a local connection: a private line between two processes over which each calls the object that the other
// exports. Owned by who made it (client) or by the listener's delegate (daemon); kept alive by nothing else.
//
// Calls are asynchronous, delivered in order, gathered into batches while one is under way. What was sent before the
// connection is let go or invalidated on this side is still delivered.
//
// Two ends of a connection:
// - invalidated: refused at acceptance, no such service, or invalidate() here. The invalidation handler runs once;
//   every later call fails through its error handler.
// - interrupted: the other process ended, or ended the connection, after it had accepted. The interruption handler
//   runs, calls in flight fail through their error handlers, and on the connecting side the next call connects again.
//   On the accepting side the line cannot be taken up again, so it is invalidated too (interruption handler first).
//
// Handlers, replies and exported calls run on the connection's own serial queue. Set handlers and the exported object
// before resume(). Safe from any thread.
class Connection {
 public:
  using ErrorHandler = UniqueFunction<void(const Error& error)>;
  virtual ~Connection() = default;

  virtual void setExportedObject(std::shared_ptr<ExportedObject> object) = 0;
  virtual void setInterruptionHandler(Job handler) = 0;  // kept and called at each interruption
  virtual void setInvalidationHandler(Job handler) = 0;  // called once, then released
  // Starts delivery. Until then nothing is sent or received.
  virtual void resume() = 0;
  // Calls an operation of the other side's object without an answer. onError may be empty; at most one of its calls.
  virtual void send(Invocation invocation, ErrorHandler onError) = 0;
  // Calls an operation with an answer: exactly one of reply and onError is called, once; neither for a call that is
  // dropped silently.
  virtual void sendWithReply(Invocation invocation, ReplyBlock reply, ErrorHandler onError) = 0;
  // Ends the connection; calls already made are still delivered. Releases handlers and exported object after the
  // invalidation handler has run.
  virtual void invalidate() = 0;
  // Whether the other process holds the named entitlement as a boolean that is true. REQUIRES: accepting side.
  virtual bool peerHasEntitlement(const std::string& name) const = 0;
  // The user and groups of the other process when it connected. REQUIRES: accepting side.
  virtual PeerIdentity peerIdentity() const = 0;
  // Whether the other side has ended the connection, or this one has: true at once, also while the connection's queue
  // is busy and the handlers that tell of it have to wait. REQUIRES: accepting side.
  virtual bool hasEnded() const = 0;
  // Names the other end in log lines: "pid 123 (/usr/bin/app)".
  virtual std::string description() const = 0;
};

}  // namespace telvane::ipc
