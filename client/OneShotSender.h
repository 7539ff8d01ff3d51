#pragma once

#include <cstdint>
#include <memory>
#include <optional>

#include "client/ClientContext.h"
#include "foundation/Error.h"
#include "foundation/Value.h"

namespace telvane {

// Sends single events without a session, one after another on a serial queue of its own, each over a connection that
// lives until the daemon has answered. One per process; what it has been given keeps its queue alive. Safe from any
// thread.
class OneShotSender {
 public:
  explicit OneShotSender(ClientContext& context);

  // Returns true when the event was taken; false with an error for a session info that is not valid (codes 2 and 3)
  // and for category 0 (code 4). payload: an absent one is sent as an empty dictionary. error may be null.
  bool sendOneMessageWithSessionInfo(const Value& sessionInfo, const Value& userInfo, uint16_t category, uint16_t type,
                                     const Value& payload, std::optional<Error>* error);

 private:
  struct Message {
    Dictionary sessionInfo;
    Value userInfo;
    uint16_t category;
    uint16_t type;
    Dictionary payload;
  };
  static void send(ClientContext& context, Message message);

  ClientContext& _context;
  const std::shared_ptr<SerialQueue> _queue;
};

}  // namespace telvane
