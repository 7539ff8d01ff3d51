#include "tests/platform/ipc/HostilePeer.h"

#include <capnp/capability.h>
#include <capnp/message.h>
#include <capnp/rpc.capnp.h>
#include <capnp/serialize.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <stdexcept>

#include "interfaces/Wire.capnp.h"

namespace telvane::testing {

namespace {

constexpr uint32_t kOpenQuestion = 1;
constexpr int kDeadlineMilliseconds = 30'000;

std::string flat(capnp::MessageBuilder& message) {
  const auto words = capnp::messageToFlatArray(message);
  const auto bytes = words.asBytes();
  return {reinterpret_cast<const char*>(bytes.begin()), bytes.size()};
}

}  // namespace

HostilePeer::HostilePeer(const std::string& socketPath) {
  auto socket = ipc::unixsocket::connectTo(socketPath);
  if (!socket) throw std::runtime_error(socket.error().description());
  _socket = std::move(*socket);
}

bool HostilePeer::write(std::string_view bytes) {
  while (!bytes.empty()) {
    const auto written = ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (written > 0) {
      bytes.remove_prefix(static_cast<size_t>(written));
      continue;
    }
    if (errno != EAGAIN) return false;
    pollfd ready{_socket.get(), POLLOUT, 0};
    if (::poll(&ready, 1, kDeadlineMilliseconds) != 1) return false;
  }
  return true;
}

bool HostilePeer::waitForEnd() {
  char buffer[65536];
  for (;;) {
    pollfd ready{_socket.get(), POLLIN, 0};
    if (::poll(&ready, 1, kDeadlineMilliseconds) != 1) return false;
    const auto size = ::read(_socket.get(), buffer, sizeof buffer);
    if (size == 0 || (size < 0 && errno != EAGAIN)) return true;
  }
}

bool HostilePeer::open() {
  capnp::MallocMessageBuilder bootstrap;
  bootstrap.initRoot<capnp::rpc::Message>().initBootstrap().setQuestionId(0);
  capnp::MallocMessageBuilder open;
  auto call = open.initRoot<capnp::rpc::Message>().initCall();
  call.setQuestionId(kOpenQuestion);
  call.initTarget().initPromisedAnswer().setQuestionId(0);
  call.setInterfaceId(capnp::typeId<wire::Acceptor>());
  call.setMethodId(0);
  auto params = call.initParams();
  params.initCapTable(1)[0].setSenderHosted(0);
  capnp::BuilderCapabilityTable capabilities;
  capabilities.imbue(params.getContent())
      .initAs<wire::Acceptor::OpenParams>()
      .setClient(capnp::Capability::Client(kj::Exception(kj::Exception::Type::FAILED, "", 0)).castAs<wire::Endpoint>());
  return write(flat(bootstrap)) && write(flat(open)) && readMessage() && readMessage();
}

bool HostilePeer::askAgain() {
  capnp::MallocMessageBuilder bootstrap;
  bootstrap.initRoot<capnp::rpc::Message>().initBootstrap().setQuestionId(++_question);
  return write(flat(bootstrap));
}

bool HostilePeer::read(size_t count) {
  _read.resize(count);
  for (size_t done = 0; done < count;) {
    pollfd ready{_socket.get(), POLLIN, 0};
    if (::poll(&ready, 1, kDeadlineMilliseconds) != 1) return false;
    const auto size = ::read(_socket.get(), _read.data() + done, count - done);
    if (size <= 0) return false;
    done += static_cast<size_t>(size);
  }
  return true;
}

// Reads a message of one segment.
bool HostilePeer::readMessage() {
  if (!read(8) || _read.substr(0, 4) != std::string(4, '\0')) return false;
  uint32_t words = 0;
  for (int i = 3; i >= 0; --i) words = words << 8 | static_cast<uint8_t>(_read[4 + static_cast<size_t>(i)]);
  return read(8 * size_t{words});
}

// Calls the endpoint that the answer of open will hold: its first pointer.
template <class Fill>
bool HostilePeer::call(Fill fill) {
  capnp::MallocMessageBuilder message;
  auto call = message.initRoot<capnp::rpc::Message>().initCall();
  call.setQuestionId(++_question);
  auto answer = call.initTarget().initPromisedAnswer();
  answer.setQuestionId(kOpenQuestion);
  answer.initTransform(1)[0].setGetPointerField(0);
  call.setInterfaceId(capnp::typeId<wire::Endpoint>());
  call.setMethodId(0);
  auto params = call.initParams().getContent().initAs<wire::Endpoint::DeliverParams>();
  fill(params.initInvocations(1)[0]);
  return write(flat(message));
}

bool HostilePeer::deliver(uint16_t operation, std::string_view text, uint32_t replyID) {
  return call([&](wire::Invocation::Builder invocation) {
    invocation.setOperation(operation);
    invocation.setReplyID(replyID);
    auto argument = invocation.initArguments(1)[0].initString(static_cast<unsigned>(text.size()));
    std::copy(text.begin(), text.end(), argument.begin());
  });
}

bool HostilePeer::deliverNested(size_t levels) {
  return call([&](wire::Invocation::Builder invocation) {
    auto value = invocation.initArguments(1)[0];
    for (size_t i = 0; i < levels; ++i) value = value.initArray(1)[0];
    value.setInteger(1);
  });
}

bool HostilePeer::deliverArguments(unsigned count) {
  return call([&](wire::Invocation::Builder invocation) { invocation.initArguments(count); });
}

}  // namespace telvane::testing
