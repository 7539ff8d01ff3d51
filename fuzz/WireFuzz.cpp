#include <capnp/message.h>
#include <capnp/serialize.h>

#include <cstring>
#include <optional>
#include <vector>

#include "fuzz/FuzzInput.h"
#include "platform/ipc/Limits.h"
#include "platform/ipc/WireCoding.h"

namespace {

using telvane::Array;
namespace ipc = telvane::ipc;
namespace wire = telvane::wire;

// Small, so that the bound is reached within the bytes of an attempt.
constexpr size_t kMostValues = 4096;
// As for a connection: a list and a struct deeper than a value's own nesting.
constexpr capnp::ReaderOptions kOptions{.traversalLimitInWords = 1u << 20,
                                        .nestingLimit = 2 * static_cast<int>(ipc::kMaximumNesting) + 32};

// Words start where the machine wants them to. What is left over at the end is cut off.
std::vector<capnp::word> wordsOf(const uint8_t* data, size_t size) {
  std::vector<capnp::word> words(size / sizeof(capnp::word));
  if (!words.empty()) std::memcpy(words.data(), data, words.size() * sizeof(capnp::word));
  return words;
}

// What was read from a peer can be handed on to another, and arrives there as it was.
void requireToArriveAgain(const Array& values) {
  const ipc::wirecoding::Measure measure = ipc::wirecoding::measure(values);
  telvane::fuzz::require(!measure.isTooDeep);
  capnp::MallocMessageBuilder message;
  ipc::wirecoding::encode(values, message.initRoot<wire::Invocation>().initArguments(values.size()));
  const Array again = ipc::wirecoding::Decoder(measure.textBytes, kMostValues)
                          .decode(message.getRoot<wire::Invocation>().asReader().getArguments());
  telvane::fuzz::require(again.size() == values.size());
  telvane::fuzz::require(ipc::wirecoding::measure(again).textBytes == measure.textBytes);
}

}  // namespace

// A message that is an invocation, with whatever sum the peer may say for its texts: its first byte does.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  const uint64_t claimedTextBytes = data[0] == 0xff ? UINT64_MAX : data[0];
  const std::vector<capnp::word> words = wordsOf(data + 1, size - 1);
  std::optional<Array> values;
  try {
    capnp::FlatArrayMessageReader message(kj::arrayPtr(words.data(), words.size()), kOptions);
    ipc::wirecoding::Decoder decoder(claimedTextBytes, kMostValues);
    values = decoder.decode(message.getRoot<wire::Invocation>().getArguments());
  } catch (const kj::Exception&) {
    return 0;
  }
  requireToArriveAgain(*values);
  return 0;
}
