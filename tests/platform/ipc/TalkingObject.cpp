#include "tests/platform/ipc/TalkingObject.h"

#include <unistd.h>

#include <utility>

namespace telvane::testing {

namespace {

std::string contentOf(const ipc::Descriptor& descriptor) {
  std::string content(1024, '\0');
  const auto size = ::pread(descriptor.get(), content.data(), content.size(), 0);
  content.resize(size > 0 ? static_cast<size_t>(size) : 0);
  return content;
}

}  // namespace

void TalkingObject::invoke(ipc::Invocation invocation, ipc::ReplyBlock reply) {
  // Kept before the call is told of: who waits for the call may want the kept reply at once.
  if (invocation.operation == kKeep) keep(std::move(reply));
  _calls.add(invocation.arguments);
  switch (invocation.operation) {
    case kBlock:
      _blocked->wait();
      [[fallthrough]];
    case kEcho:
      if (reply) reply(std::move(invocation.arguments));
      return;
    case kReadFile:
      return reply({Value(contentOf(invocation.descriptor))});
    default:
      return;
  }
}

void TalkingObject::keep(ipc::ReplyBlock reply) {
  const std::lock_guard lock(_mutex);
  _kept.push_back(std::move(reply));
}

size_t TalkingObject::keptReplies() const {
  const std::lock_guard lock(_mutex);
  return _kept.size();
}

std::vector<ipc::ReplyBlock> TalkingObject::takeKept() {
  const std::lock_guard lock(_mutex);
  return std::exchange(_kept, {});
}

void TalkingObject::answerKept() {
  int number = 0;
  for (auto& reply : takeKept()) reply({Value(number++)});
}

void TalkingObject::answerKept(const Array& values) {
  for (auto& reply : takeKept()) reply(values);
}

void TalkingObject::dropKept() { takeKept(); }

void TalkingObject::release(unsigned count) {
  for (unsigned i = 0; i < count; ++i) _blocked->signal();
}

}  // namespace telvane::testing
