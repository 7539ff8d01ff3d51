#include "platform/ipc/SocketStream.h"

#include <capnp/serialize.h>
#include <fmt/format.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace telvane::ipc {

namespace {

constexpr size_t kBufferBytes = 64u << 10;
constexpr size_t kMostDescriptors = 16;
constexpr uint32_t kMostSegments = 512;

using Segments = kj::ArrayPtr<const kj::ArrayPtr<const capnp::word>>;

// The header: the number of segments less one, the size of each in words, filled up to whole words.
size_t headerWords(size_t segments) { return segments / 2 + 1; }

uint32_t headerField(const kj::byte* header, size_t index) {
  const kj::byte* at = header + 4 * index;
  return static_cast<uint32_t>(at[0]) | static_cast<uint32_t>(at[1]) << 8 | static_cast<uint32_t>(at[2]) << 16 |
         static_cast<uint32_t>(at[3]) << 24;
}

void appendField(std::vector<uint8_t>& header, uint32_t value) {
  for (int shift = 0; shift < 32; shift += 8) header.push_back(static_cast<uint8_t>(value >> shift));
}

std::vector<uint8_t> newHeader(Segments segments) {
  std::vector<uint8_t> header;
  header.reserve(8 * headerWords(segments.size()));
  appendField(header, static_cast<uint32_t>(segments.size() - 1));
  for (const auto& segment : segments) appendField(header, static_cast<uint32_t>(segment.size()));
  header.resize(8 * headerWords(segments.size()));
  return header;
}

std::vector<Descriptor> takeDescriptors(msghdr& message) {
  std::vector<Descriptor> taken;
  for (cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr; part = CMSG_NXTHDR(&message, part)) {
    if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) continue;
    const size_t count = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (size_t i = 0; i < count; ++i) {
      int fd = -1;
      std::memcpy(&fd, CMSG_DATA(part) + i * sizeof fd, sizeof fd);
      taken.emplace_back(fd);
    }
  }
  return taken;
}

// Owns the words that its base reads, so the base is given them before they are moved in.
class OwningReader final : public capnp::FlatArrayMessageReader {
 public:
  OwningReader(kj::Array<capnp::word> words, const capnp::ReaderOptions& readerOptions)
      : FlatArrayMessageReader(words.asPtr(), readerOptions), _words(kj::mv(words)) {}

 private:
  kj::Array<capnp::word> _words;
};

}  // namespace

// What is left of a message that the socket did not take at once.
struct SocketStream::PendingWrite {
  std::vector<uint8_t> header;
  std::vector<iovec> parts;
  size_t firstPart = 0;
  std::vector<int> descriptors;

  bool isDone() const noexcept { return firstPart == parts.size(); }

  void skip(size_t bytes) {
    while (!isDone() && bytes >= parts[firstPart].iov_len) bytes -= parts[firstPart++].iov_len;
    if (isDone()) return;
    parts[firstPart].iov_base = static_cast<char*>(parts[firstPart].iov_base) + bytes;
    parts[firstPart].iov_len -= bytes;
  }

  ssize_t write(int socket) {
    msghdr message{};
    message.msg_iov = parts.data() + firstPart;
    message.msg_iovlen = std::min<size_t>(parts.size() - firstPart, IOV_MAX);
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * kMostDescriptors)] = {};
    if (!descriptors.empty()) {
      const size_t size = sizeof(int) * std::min(descriptors.size(), kMostDescriptors);
      message.msg_control = control;
      message.msg_controllen = CMSG_SPACE(size);
      cmsghdr* part = CMSG_FIRSTHDR(&message);
      part->cmsg_level = SOL_SOCKET;
      part->cmsg_type = SCM_RIGHTS;
      part->cmsg_len = CMSG_LEN(size);
      std::memcpy(CMSG_DATA(part), descriptors.data(), size);
    }
    const ssize_t written = ::sendmsg(socket, &message, MSG_NOSIGNAL | MSG_DONTWAIT);
    if (written > 0) descriptors.clear();
    return written;
  }
};

SocketStream::SocketStream(EpollPort& port, Descriptor socket)
    : _socket(std::move(socket)), _watch(port, _socket.get()), _buffer(kj::heapArray<kj::byte>(kBufferBytes)) {}

// A forked child may hold the same socket, so closing it here would not tell the peer.
SocketStream::~SocketStream() { ::shutdown(_socket.get(), SHUT_RDWR); }

kj::Promise<kj::Maybe<capnp::MessageReaderAndFds>> SocketStream::tryReadMessage(
    kj::ArrayPtr<kj::AutoCloseFd> fdSpace, capnp::ReaderOptions options, kj::ArrayPtr<capnp::word> scratchSpace) {
  for (;;) {
    if (!_messages.empty() && _messages.front().isComplete()) {
      return kj::Maybe<capnp::MessageReaderAndFds>(handOut(fdSpace, options));
    }
    if (_hasEnded) return endOfInput();
    const size_t bytesBefore = _buffered;
    std::vector<Descriptor> descriptors;
    IncomingMessage* partial = _messages.empty() ? nullptr : &_messages.back();
    iovec parts[2] = {};
    if (partial != nullptr) {
      parts[0] = {partial->words.asBytes().begin() + partial->filledBytes,
                  partial->words.asBytes().size() - partial->filledBytes};
    }
    parts[1] = {_buffer.begin() + bytesBefore, _buffer.size() - bytesBefore};
    msghdr message{};
    message.msg_iov = parts;
    message.msg_iovlen = 2;
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * kMostDescriptors)];
    message.msg_control = control;
    message.msg_controllen = sizeof control;
    const ssize_t received = ::recvmsg(_socket.get(), &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
    if (received < 0 && errno == EINTR) continue;
    if (received < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
      return _watch.whenReadable().then(
          [this, fdSpace, options, scratchSpace] { return tryReadMessage(fdSpace, options, scratchSpace); });
    }
    if (received <= 0) {
      _hasEnded = true;
      continue;
    }
    takeIn(static_cast<size_t>(received), takeDescriptors(message), options);
  }
}

// The socket hands out the descriptors of one write at a time and no byte of a later one with them; and a message with
// descriptors is written on its own. So they belong to the message that was begun last.
void SocketStream::takeIn(size_t bytes, std::vector<Descriptor> descriptors, const capnp::ReaderOptions& options) {
  if (!_messages.empty()) {
    auto& partial = _messages.back();
    const size_t taken = std::min(bytes, partial.words.asBytes().size() - partial.filledBytes);
    partial.filledBytes += taken;
    bytes -= taken;
  }
  _buffered += bytes;
  sortBuffer(options);
  if (descriptors.empty()) return;
  auto& owner = _buffered > 0 || _messages.empty() ? _unassigned : _messages.back().descriptors;
  for (auto& descriptor : descriptors) {
    if (owner.size() < kMostDescriptors) owner.push_back(std::move(descriptor));
  }
}

void SocketStream::sortBuffer(const capnp::ReaderOptions& options) {
  size_t used = 0;
  while (const size_t words = messageWords(_buffer.slice(used, _buffered), options)) {
    IncomingMessage message;
    message.words = kj::heapArray<capnp::word>(words);
    message.filledBytes = std::min(_buffered - used, words * sizeof(capnp::word));
    std::memcpy(message.words.begin(), _buffer.begin() + used, message.filledBytes);
    message.descriptors = std::move(_unassigned);
    _unassigned.clear();
    used += message.filledBytes;
    _messages.push_back(std::move(message));
  }
  _buffered -= used;
  if (used > 0 && _buffered > 0) std::memmove(_buffer.begin(), _buffer.begin() + used, _buffered);
}

// The size of the message that begins here, header included; 0 when the header has not come whole.
size_t SocketStream::messageWords(kj::ArrayPtr<const kj::byte> bytes, const capnp::ReaderOptions& options) {
  if (bytes.size() < sizeof(capnp::word)) return 0;
  const uint32_t segments = headerField(bytes.begin(), 0) + 1;
  if (segments == 0 || segments > kMostSegments) fail("what came is no message of this protocol");
  const size_t header = headerWords(segments);
  if (bytes.size() < header * sizeof(capnp::word)) return 0;
  uint64_t words = header;
  for (uint32_t i = 0; i < segments; ++i) words += headerField(bytes.begin(), i + 1);
  if (words > options.traversalLimitInWords) {
    fail(fmt::format("a message of {} bytes is over the limit of {}", words * sizeof(capnp::word),
                     options.traversalLimitInWords * sizeof(capnp::word)));
  }
  if (words * sizeof(capnp::word) > _mostBytes || _messagesLeft == 0) fail("sent too much before it was accepted");
  --_messagesLeft;
  return words;
}

void SocketStream::restrictTo(size_t messages, size_t bytesEach) {
  _messagesLeft = messages;
  _mostBytes = bytesEach;
}

void SocketStream::liftRestriction() { restrictTo(SIZE_MAX, SIZE_MAX); }

capnp::MessageReaderAndFds SocketStream::handOut(kj::ArrayPtr<kj::AutoCloseFd> fdSpace,
                                                 const capnp::ReaderOptions& options) {
  IncomingMessage message = std::move(_messages.front());
  _messages.pop_front();
  const size_t count = std::min(fdSpace.size(), message.descriptors.size());
  for (size_t i = 0; i < count; ++i) fdSpace[i] = kj::AutoCloseFd(message.descriptors[i].release());
  return {kj::heap<OwningReader>(kj::mv(message.words), options), fdSpace.slice(0, count)};
}

kj::Maybe<capnp::MessageReaderAndFds> SocketStream::endOfInput() {
  if (!_messages.empty() || _buffered > 0) fail("the peer closed in the middle of a message");
  return nullptr;
}

void SocketStream::fail(std::string reason) {
  _failure = std::move(reason);
  _hasEnded = true;
  kj::throwFatalException(kj::Exception(kj::Exception::Type::DISCONNECTED, "", 0, kj::heapString(_failure.c_str())));
}

kj::Promise<void> SocketStream::writeMessage(kj::ArrayPtr<const int> fds, Segments segments) {
  auto pending = kj::heap<PendingWrite>();
  pending->header = newHeader(segments);
  pending->parts.reserve(segments.size() + 1);
  pending->parts.push_back({pending->header.data(), pending->header.size()});
  for (const auto& segment : segments) {
    const auto bytes = segment.asBytes();
    if (bytes.size() > 0) pending->parts.push_back({const_cast<kj::byte*>(bytes.begin()), bytes.size()});
  }
  pending->descriptors.assign(fds.begin(), fds.end());
  return finishWrite(kj::mv(pending));
}

kj::Promise<void> SocketStream::writeMessages(kj::ArrayPtr<Segments> messages) {
  if (messages.size() == 0) return kj::READY_NOW;
  auto rest = messages.slice(1, messages.size());
  return writeMessage(nullptr, messages[0]).then([this, rest] { return writeMessages(rest); });
}

// What cannot be written any more is let go: reading tells of the end, after all that the peer sent before it.
kj::Promise<void> SocketStream::finishWrite(kj::Own<PendingWrite> pending) {
  while (_canWrite && !pending->isDone()) {
    const ssize_t written = pending->write(_socket.get());
    if (written >= 0) {
      pending->skip(static_cast<size_t>(written));
    } else if (errno == EAGAIN || errno == EWOULDBLOCK) {
      return _watch.whenWritable().then(
          [this, pending = kj::mv(pending)]() mutable { return finishWrite(kj::mv(pending)); });
    } else if (errno != EINTR) {
      _canWrite = false;
    }
  }
  return kj::READY_NOW;
}

kj::Promise<void> SocketStream::end() {
  ::shutdown(_socket.get(), SHUT_WR);
  return kj::READY_NOW;
}

}  // namespace telvane::ipc
