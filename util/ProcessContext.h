#pragma once

#include "foundation/String.h"
#include "platform/Platform.h"
#include "util/Places.h"
#include "util/RunningUploads.h"

namespace telvane {

// What every object of one daemon shares and what is worked out once in its life. Made by the entry point, handed down
// by reference, outlives all that it is handed to; constant after construction, so safe from any thread.
class ProcessContext {
 public:
  explicit ProcessContext(Platform& platform);

  Platform& platform() const noexcept { return _platform; }
  Log& log() const noexcept { return _platform.log; }
  // Whether the device answer "ReleaseType" is "Internal".
  bool isInternalBuild() const noexcept { return _isInternalBuild; }
  // A UUID text made once per process.
  const String& processInstanceIdentifier() const noexcept { return _processInstanceIdentifier; }
  // "CFBundleVersion" of the client bundle, "8.0" when it has none.
  const String& clientFrameworkVersion() const noexcept { return _clientFrameworkVersion; }
  // Of all sessions together.
  RunningUploads& runningUploads() const noexcept { return *_runningUploads; }
  // Of dashboards that wait for acknowledgements when their session has gone; each has a socket.
  Places& lingeringDashboards() const noexcept { return *_lingeringDashboards; }

 private:
  Platform& _platform;
  const bool _isInternalBuild;
  const String _processInstanceIdentifier;
  const String _clientFrameworkVersion;
  const std::unique_ptr<RunningUploads> _runningUploads;
  const std::unique_ptr<Places> _lingeringDashboards;
};

}  // namespace telvane
