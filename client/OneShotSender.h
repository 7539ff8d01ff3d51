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
//
// A daemon that does not answer must not eat the host process: events count by their bytes until they are answered or
// can no longer be, and beyond the bound the newest is dropped, with an error line when that begins and one with the
// number when half of the room is free again. While too many connections wait for an answer, no other is opened.
class OneShotSender {
 public:
  // As much as the events of a session take: 8 MiB in its reporting queue and 24 MiB in its connection.
  static constexpr uint64_t kMaximumWaitingBytes = 32u << 20;
  // Few of the 1,024 descriptors that a host often has. Each waits for a daemon that keeps five of one client type.
  static constexpr uint32_t kMaximumConnections = 64;

  explicit OneShotSender(ClientContext& context);
  ~OneShotSender();

  // Returns true when the event was taken, or dropped beyond the bound; false with an error for a session info that is
  // not valid (codes 2 and 3), for category 0 and for a payload that is no dictionary (code 4). payload: an absent one
  // is sent as an empty dictionary. error may be null.
  bool sendOneMessageWithSessionInfo(const Value& sessionInfo, const Value& userInfo, uint16_t category, uint16_t type,
                                     const Value& payload, std::optional<Error>* error);

 private:
  class Waiting;
  struct Message;
  static void send(ClientContext& context, Waiting& waiting, Message message);

  ClientContext& _context;
  const std::shared_ptr<SerialQueue> _queue;
  const std::shared_ptr<Waiting> _waiting;
};

}  // namespace telvane
