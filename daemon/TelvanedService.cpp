#include "daemon/TelvanedService.h"

#include "interfaces/ClientSessionInterface.h"

namespace telvane {

TelvanedService::TelvanedService(Platform& platform)
    : _platform(platform),
      _context(platform),
      _sessionShared(platform),
      _agent(std::make_shared<TelvanedAgent>(_context, _connectivityShared, _sessionShared,
                                             std::make_shared<StorebagRetriever>(_context, _connectivityShared))) {}

TelvanedService::~TelvanedService() = default;

Result<void> TelvanedService::start() {
  _platform.log.message("startLogging: Daemon starts logging...");
  ReportingSessionConnectivityHelper::cleanupStorageRootFolder(_platform);
  Result<std::unique_ptr<ipc::Listener>> listener = _platform.localService.newListener(kTelvanedServiceName);
  if (listener.has_error()) return listener.error();
  _listener = std::move(*listener);
  _listener->setDelegate(_agent.get());
  _listener->resume();
  _platform.log.message("main: Listener resumes with sandbox, start loop.");
  return {};
}

void TelvanedService::shutDown() {
  if (_listener != nullptr) _listener->stop();
  _agent->shutDown();
}

}  // namespace telvane
