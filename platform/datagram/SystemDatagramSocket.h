#pragma once

#include "platform/DatagramSocket.h"
#include "platform/datagram/ReadableLoop.h"
#include "platform/system/FileDescriptor.h"

namespace telvane {

// A UDP socket of the system. Made by SystemDatagramSockets.
class SystemDatagramSocket final : public DatagramSocket {
 public:
  SystemDatagramSocket(FileDescriptor descriptor, std::shared_ptr<ReadableLoop> loop)
      : _descriptor(std::move(descriptor)), _loop(std::move(loop)) {}

  Result<void> bind() override;
  Result<void> connect(const IPv4SocketAddress& address) override;
  Result<size_t> send(const uint8_t* bytes, size_t length) override;
  Result<size_t> receive(uint8_t* buffer, size_t capacity) override;
  std::unique_ptr<ReadSource> newReadSource(std::shared_ptr<SerialQueue> queue, UniqueFunction<void()> onReadable,
                                            Job onCancel) override;

 private:
  const FileDescriptor _descriptor;
  const std::shared_ptr<ReadableLoop> _loop;
};

}  // namespace telvane
