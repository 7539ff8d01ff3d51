#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

#include "foundation/Error.h"
#include "foundation/UniqueFunction.h"
#include "platform/Dispatch.h"
#include "platform/IPv4SocketAddress.h"

namespace telvane {

// Tells when a socket has something to be read. Owned by who made it, who cancels it or lets it go, which cancels too.
// Safe from any thread.
class ReadSource {
 public:
  virtual ~ReadSource() = default;
  // The cancel handler runs once on the queue; the event handler is not called any more behind it, nor after a cancel
  // on the queue. A second cancel does nothing.
  virtual void cancel() = 0;
};

// One IPv4 UDP socket, which never makes its caller wait and never raises SIGPIPE. Owned by who made it, used by one
// thread at a time; closed when it is let go of. Errors are of kPlatformErrorDomain with errno as code.
class DatagramSocket {
 public:
  virtual ~DatagramSocket() = default;
  // Binds to the wildcard address and any free port.
  virtual Result<void> bind() = 0;
  // From then on it exchanges datagrams with this address only.
  virtual Result<void> connect(const IPv4SocketAddress& address) = 0;
  // Sends one datagram and returns how many of its bytes went out; an error when none did (EAGAIN when there is no room
  // now; ECONNREFUSED when a datagram before found nobody listening, EINVAL for port 0).
  virtual Result<size_t> send(const uint8_t* bytes, size_t length) = 0;
  // Takes one datagram that has come and returns its length, cut to the capacity; EAGAIN when there is none. What went
  // wrong with a datagram before (ECONNREFUSED) is told once, here or by send.
  virtual Result<size_t> receive(uint8_t* buffer, size_t capacity) = 0;
  // Makes and starts a read source: onReadable is called as a job of the queue when there is something to be read (or
  // an error to be told), again and again as long as there is, never twice at once. So a handler that takes one
  // datagram each time sees all of them. onCancel may be empty. Null when there are no resources.
  // REQUIRES: the socket lives until the cancel handler runs.
  virtual std::unique_ptr<ReadSource> newReadSource(std::shared_ptr<SerialQueue> queue,
                                                    UniqueFunction<void()> onReadable, Job onCancel) = 0;
};

// Makes UDP sockets: of the system in a real process, of a scripted network in the simulation. Safe from any thread;
// outlives the read sources of its sockets.
class DatagramSockets {
 public:
  virtual ~DatagramSockets() = default;
  virtual Result<std::unique_ptr<DatagramSocket>> newSocket() = 0;
};

}  // namespace telvane
