#pragma once

#include "platform/Log.h"
#include "platform/WirelessDiagnostics.h"
#include "platform/system/Paths.h"

namespace telvane {

// Adaptors that are shared objects, loaded into this process. A bundle is a folder; the shared object in it bears the
// folder's base name and exports the functions of <telvane/VDRAdaptor.h>. Code that was loaded stays until the process
// ends, since an adaptor may have threads.
//
// Logged: at the default level that there is no bundle, which is how most devices are; as errors that a bundle is of no
// use, that it has no such class, and what its functions throw, which ends here.
class LoadedWirelessDiagnostics final : public WirelessDiagnostics {
 public:
  // log: outlives this and all that it opened.
  LoadedWirelessDiagnostics(Paths paths, Log& log) : _paths(std::move(paths)), _log(log) {}

  std::unique_ptr<WirelessDiagnosticsBundle> openBundleAtPath(const std::string& path) override;

 private:
  const Paths _paths;
  Log& _log;
};

}  // namespace telvane
