#pragma once

#include <memory>

#include "interfaces/ClientSessionInterface.h"
#include "platform/Log.h"
#include "platform/ipc/Connection.h"

namespace telvane {

// Answers, for any client, what the daemon is and holds.
class DaemonStatusProvider {
 public:
  virtual ~DaemonStatusProvider() = default;
  // Counts and names only, never an event's content.
  virtual Dictionary daemonStatus() = 0;
};

// Turns the calls that arrive on a connection into operations of its session, and their replies back. Held by the
// connection as its exported object; called on the connection's queue. Everything in a call is the client's word:
// a missing or wrongly typed argument counts as absent, an operation that does not exist is refused with an error line
// and its reply block dropped, which the client's error handler hears of.
class ClientSessionDispatcher : public ipc::ExportedObject {
 public:
  ClientSessionDispatcher(Log& log, std::shared_ptr<ClientSessionInterface> session,
                          std::shared_ptr<DaemonStatusProvider> status, PeerIdentity client);
  void invoke(ipc::Invocation invocation, ipc::ReplyBlock reply) override;

 private:
  void invokeUpload(const ipc::Invocation& invocation, ipc::ReplyBlock reply);
  void invokeOneMessage(const Array& arguments, ipc::ReplyBlock reply);

  Log& _log;
  const std::shared_ptr<ClientSessionInterface> _session;
  const std::shared_ptr<DaemonStatusProvider> _status;
  const PeerIdentity _client;
};

}  // namespace telvane
