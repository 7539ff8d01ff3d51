#include "client/TelvaneAggregationObject.h"

namespace telvane {
namespace {

constexpr size_t kArgumentCount = 5;

bool isWellFormed(const Array& arguments) {
  if (arguments.size() > kArgumentCount) return false;
  const Value& client = arguments[0];
  const Value& payload = arguments[4];
  return (!client.isPresent() || client.isDictionary()) && arguments[1].isNumber() && arguments[2].isNumber() &&
         arguments[3].isNumber() && (!payload.isPresent() || payload.isDictionary());
}

}  // namespace

void TelvaneAggregationObject::invoke(ipc::Invocation invocation, ipc::ReplyBlock) {
  if (invocation.operation != static_cast<uint16_t>(ClientSessionReplyOperation::SendMessageToClient) ||
      !isWellFormed(invocation.arguments)) {
    _log.error("The daemon called operation {} of the client with arguments that it does not take",
               invocation.operation);
    return;
  }
  const Array& arguments = invocation.arguments;
  sendMessageToClient(arguments[0], arguments[1].realValue(), arguments[2].low16Bits(), arguments[3].low16Bits(),
                      arguments[4]);
}

void TelvaneAggregationObject::sendMessageToClient(Value client, double timestamp, uint16_t category, uint16_t type,
                                                   Value payload) {
  _log.message("sendMessageToClient: {}, {}", category, type);
  if (!_aggregationBlock) return;
  try {
    _aggregationBlock(client, timestamp, category, type, payload);
  } catch (...) {
    _log.error("sendMessageToClient: Exception during invocation of aggregation block. Disabling aggregation");
    _aggregationBlock = nullptr;
  }
}

}  // namespace telvane
