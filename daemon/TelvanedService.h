#pragma once

#include <memory>

#include "daemon/TelvanedAgent.h"
#include "foundation/Error.h"
#include "platform/ipc/Service.h"

namespace telvane {

// The daemon as an object: everything that serves clients, on whatever platform it is given. The program makes one on
// the real platform, a simulation several on simulated ones.
//
// Made and owned by the entry point; must outlive its connections and the platform's queues' jobs. Safe from one
// thread.
class TelvanedService {
 public:
  // platform: must outlive the service.
  explicit TelvanedService(Platform& platform);
  ~TelvanedService();
  TelvanedService(const TelvanedService&) = delete;
  TelvanedService& operator=(const TelvanedService&) = delete;

  // Opens the service and starts to accept. An error (another daemon serves already, no right to make the socket)
  // leaves nothing open.
  Result<void> start();
  // Stops accepting, ends the connections, lets sessions send what they still hold and helpers finish their requests.
  // Returns at once; the work is done when the last transaction has ended. Idempotent.
  void shutDown();

  TelvanedAgent& agent() noexcept { return *_agent; }

 private:
  Platform& _platform;
  const ProcessContext _context;
  ConnectivityShared _connectivityShared;
  SessionShared _sessionShared;
  const std::shared_ptr<TelvanedAgent> _agent;
  std::unique_ptr<ipc::Listener> _listener;
};

}  // namespace telvane
