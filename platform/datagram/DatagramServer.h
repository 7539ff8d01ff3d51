#pragma once

#include <cstdint>
#include <memory>
#include <span>

#include "foundation/Error.h"
#include "foundation/UniqueFunction.h"
#include "platform/IPv4SocketAddress.h"
#include "platform/dispatch/Thread.h"
#include "platform/system/FileDescriptor.h"

namespace telvane {

// A UDP socket at a fixed address that takes datagrams from anybody and may answer. Owned by who started it; serves on
// a thread of its own until it is let go of. It keeps nothing: what comes while the handler runs waits in the system's
// buffer (about 1 MiB where the system admits it), and beyond that is lost, as datagrams are.
class DatagramServer {
 public:
  static constexpr size_t kLongestDatagram = 65535;  // bytes; more do not come over IPv4

  // Called on the server's thread for each datagram, one at a time. The bytes are borrowed for the length of the call.
  using Handler =
      UniqueFunction<void(DatagramServer& server, std::span<const uint8_t> datagram, const IPv4SocketAddress& peer)>;

  // Opens the socket and starts to serve. Port 0 picks a free one.
  static Result<std::unique_ptr<DatagramServer>> start(const IPv4SocketAddress& address, Handler handler);
  // Closes the socket and waits for the thread. Not from the handler.
  ~DatagramServer();
  DatagramServer(const DatagramServer&) = delete;
  DatagramServer& operator=(const DatagramServer&) = delete;

  // With the port that was picked.
  const IPv4SocketAddress& address() const noexcept { return _address; }
  // Sends one datagram, without waiting for room. Returns whether the system took it. Safe from any thread.
  bool send(const IPv4SocketAddress& peer, std::span<const uint8_t> datagram) const;

 private:
  DatagramServer(FileDescriptor socket, FileDescriptor stopCall, const IPv4SocketAddress& address, Handler handler);
  void run();
  // Takes what has come, up to a number after which the thread looks whether it is to stop.
  void takeDatagrams();

  // Constant after construction.
  const FileDescriptor _socket;
  const FileDescriptor _stopCall;
  const IPv4SocketAddress _address;

  // Confined to the thread.
  Handler _handler;
  const std::unique_ptr<uint8_t[]> _buffer;

  Thread _thread;
};

}  // namespace telvane
