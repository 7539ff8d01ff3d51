#pragma once

#include "daemon/TelvanedOptions.h"
#include "platform/system/TerminationSignals.h"

namespace telvane {

// Runs the daemon on the real system until it is asked to end or has nothing to do.
//
// signals: made before any thread, must outlive the call. Ends the process with status 0 when the daemon is asked to
// end or idle, after the log has been written, and with 1 (and one line on standard error) when the service cannot be
// opened. Threads that still wait for something are not waited for.
[[noreturn]] void runTelvaned(const TelvanedOptions& options, TerminationSignals& signals);

}  // namespace telvane
