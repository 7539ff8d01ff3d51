#pragma once

#include <cstdint>
#include <functional>

#include "interfaces/ClientSessionInterface.h"
#include "platform/Log.h"
#include "platform/ipc/Connection.h"

namespace telvane {

// What a client exports on its connection: takes the messages that the daemon hands over for aggregation and gives them
// to the client's aggregation block, if it has one. Owned by the connection only. Called one call at a time on the
// connection's queue, where the block runs, too.
//
// A block that throws is let go: every later message is only logged.
class TelvaneAggregationObject final : public ipc::ExportedObject, public ClientSessionReplyInterface {
 public:
  using AggregationBlock = std::function<void(const Value& client, double timestamp, uint16_t category, uint16_t type,
                                              const Value& payload)>;

  // aggregationBlock: may be empty.
  TelvaneAggregationObject(AggregationBlock aggregationBlock, Log& log)
      : _log(log), _aggregationBlock(std::move(aggregationBlock)) {}

  // Passes over anything but a whole call of sendMessageToClient, with an error line.
  void invoke(ipc::Invocation invocation, ipc::ReplyBlock reply) override;
  void sendMessageToClient(Value client, double timestamp, uint16_t category, uint16_t type, Value payload) override;

 private:
  Log& _log;
  AggregationBlock _aggregationBlock;  // confined to the connection's queue
};

}  // namespace telvane
