#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/ipc/UnixSocket.h"

namespace telvane::testing {

// A peer that writes what it likes to a service's socket and reads only when it is told to. Its well-formed messages
// are made by hand from the protocol's description, so that they can be as wrong in one thing as a test wants.
class HostilePeer {
 public:
  // Throws when nobody listens there.
  explicit HostilePeer(const std::string& socketPath);

  // Writes the bytes; returns false once the other side has closed.
  bool write(std::string_view bytes);
  void close() { _socket = ipc::Descriptor(); }
  // Reads until the other side closes; returns false when it has not within the deadline.
  bool waitForEnd();

  // Asks for the line, as every client begins, and waits for the answer.
  bool open();
  // Asks for the bootstrap capability once more than anybody needs.
  bool askAgain();
  // Calls the operation with one text, and wants an answer when replyID is not 0.
  bool deliver(uint16_t operation, std::string_view text, uint32_t replyID);
  // Calls with one value that is nested that deep.
  bool deliverNested(size_t levels);
  // Calls with that many absent arguments.
  bool deliverArguments(unsigned count);

 private:
  template <class Fill>
  bool call(Fill fill);
  bool readMessage();
  bool read(size_t count);

  ipc::Descriptor _socket;
  uint32_t _question = 1;
  std::string _read;
};

}  // namespace telvane::testing
