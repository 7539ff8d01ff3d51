#pragma once

#include "platform/DatagramSocket.h"
#include "platform/datagram/ReadableLoop.h"

namespace telvane {

// UDP sockets of the system. Opens nothing before it is used: the thread that waits for all of them starts with the
// first read source and ends with this object.
class SystemDatagramSockets final : public DatagramSockets {
 public:
  SystemDatagramSockets() = default;
  ~SystemDatagramSockets() override { _loop->stop(); }
  SystemDatagramSockets(const SystemDatagramSockets&) = delete;
  SystemDatagramSockets& operator=(const SystemDatagramSockets&) = delete;

  Result<std::unique_ptr<DatagramSocket>> newSocket() override;

 private:
  const std::shared_ptr<ReadableLoop> _loop = std::make_shared<ReadableLoop>();
};

}  // namespace telvane
