#pragma once

#include <capnp/serialize-async.h>
#include <sys/uio.h>

#include <cstdint>
#include <deque>
#include <string>
#include <vector>

#include "platform/ipc/Connection.h"
#include "platform/ipc/EpollPort.h"

namespace telvane::ipc {

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wnon-virtual-dtor"  // the base of the library has none; nobody deletes through it
// Messages over one connected Unix stream socket, in the library's own framing, with open files beside them.
//
// It differs from the library's stream in what matters here: a read takes as many messages as have come, a write never
// raises SIGPIPE, and a peer that closes after sending is read to the end although answers to it can no longer be
// written.
//
// Owned by its line, confined to the loop. A message over the limit, or a header that is none, breaks the read with an
// error; failure() then says why in a text for the log.
class SocketStream final : public capnp::MessageStream {
 public:
  // Takes the socket over, which must not block.
  SocketStream(EpollPort& port, Descriptor socket);
  ~SocketStream();

  kj::Promise<kj::Maybe<capnp::MessageReaderAndFds>> tryReadMessage(kj::ArrayPtr<kj::AutoCloseFd> fdSpace,
                                                                    capnp::ReaderOptions options,
                                                                    kj::ArrayPtr<capnp::word> scratchSpace) override;
  kj::Promise<void> writeMessage(kj::ArrayPtr<const int> fds,
                                 kj::ArrayPtr<const kj::ArrayPtr<const capnp::word>> segments) override;
  kj::Promise<void> writeMessages(kj::ArrayPtr<kj::ArrayPtr<const kj::ArrayPtr<const capnp::word>>> messages) override;
  kj::Maybe<int> getSendBufferSize() override { return nullptr; }
  kj::Promise<void> end() override;

  // Lets the peer send no more than that, until the restriction is lifted: what the library keeps for a peer grows with
  // its messages, and one that has not been accepted yet may be anybody.
  void restrictTo(size_t messages, size_t bytesEach);
  void liftRestriction();

  // Why reading ended: empty for an orderly end between two messages, or when it has not ended.
  const std::string& failure() const noexcept { return _failure; }
  bool hasEnded() const noexcept { return _hasEnded; }

 private:
  struct IncomingMessage {
    kj::Array<capnp::word> words;
    size_t filledBytes = 0;
    std::vector<Descriptor> descriptors;
    bool isComplete() const noexcept { return filledBytes == words.asBytes().size(); }
  };
  struct PendingWrite;
  void takeIn(size_t bytes, std::vector<Descriptor> descriptors, const capnp::ReaderOptions& options);
  void sortBuffer(const capnp::ReaderOptions& options);
  size_t messageWords(kj::ArrayPtr<const kj::byte> bytes, const capnp::ReaderOptions& options);
  capnp::MessageReaderAndFds handOut(kj::ArrayPtr<kj::AutoCloseFd> fdSpace, const capnp::ReaderOptions& options);
  kj::Maybe<capnp::MessageReaderAndFds> endOfInput();
  [[noreturn]] void fail(std::string reason);
  kj::Promise<void> finishWrite(kj::Own<PendingWrite> pending);

  Descriptor _socket;
  EpollPort::Watch _watch;
  std::string _failure;
  bool _hasEnded = false;
  bool _canWrite = true;
  size_t _messagesLeft = SIZE_MAX;
  size_t _mostBytes = SIZE_MAX;

  // Bytes that have come and belong to no message yet: a partial header at most once sortBuffer has run.
  kj::Array<kj::byte> _buffer;
  size_t _buffered = 0;
  std::vector<Descriptor> _unassigned;    // descriptors that came with a partial header
  std::deque<IncomingMessage> _messages;  // the last one may be incomplete
};
#pragma GCC diagnostic pop

}  // namespace telvane::ipc
