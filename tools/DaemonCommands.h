#pragma once

#include <memory>

#include "client/ClientContext.h"
#include "client/ClientSession.h"
#include "tools/MessageOptions.h"
#include "tools/Printer.h"

namespace telvane {

// What telvanectl does with a daemon: asks for its status, and reports through it as any client does. Each command
// waits for its answers and prints them; an error that it returns says what to do. Each asks for the status first, so
// that a daemon that is not there, or does not let this program in, is told from one that has nothing to say.
class DaemonCommands {
 public:
  // Both outlive this object; the context also outlives what is then still under way.
  DaemonCommands(ClientContext& context, Printer& printer) : _context(context), _printer(printer) {}

  enum class StatusForm { Readable, JSON };
  Result<void> status(StatusForm form);
  // Opens a session, configures it, sends the messages, flushes if asked to, and finishes the session.
  Result<void> send(const MessageOptions& options);
  // Sends one message without a session.
  Result<void> oneShot(const MessageOptions& options);
  // Opens a session, configures it, and uploads the file, of which the daemon leaves nothing behind when the server has
  // said "success".
  Result<void> upload(const MessageOptions& options);

 private:
  Result<Dictionary> fetchStatus();
  // A configured session, and the names of its backends as the daemon told them: the session knows them a moment later.
  struct OpenSession {
    std::shared_ptr<ClientSession> session;
    Value backendNames;
  };
  // Opens and configures a session whose textual answers are printed.
  Result<OpenSession> openSession(const MessageOptions& options);
  Result<Value> configure(ClientSession& session);
  // Hands the file over and waits as long as the daemon takes for it.
  Result<void> handOver(ClientSession& session, const std::string& file);
  Result<void> sendMessages(ClientSession& session, const MessageOptions& options);
  Result<void> flush(ClientSession& session);
  // Waits until everything that was sent has been answered.
  Result<void> settle(const std::shared_ptr<ClientSession>& session);

  ClientContext& _context;
  Printer& _printer;
};

}  // namespace telvane
