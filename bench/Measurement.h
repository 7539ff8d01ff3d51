#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>

namespace telvane::bench {

// CPU time of this process so far, user and system, in microseconds.
double ownCPUMicroseconds();
// CPU time of the calling thread so far, in microseconds.
double threadCPUMicroseconds();
// CPU time of another process; 0 when it is gone.
double cpuMicrosecondsOf(pid_t pid);
// Its largest resident memory so far, in bytes; 0 when it is gone.
uint64_t peakMemoryOf(pid_t pid);
// How often its threads have been switched to, in all; what an idle process should not add to.
uint64_t wakeUpsOf(pid_t pid);
// Seconds on the monotonic clock.
double monotonicSeconds();
// The value of "--name VALUE" on a command line, or the fallback.
std::string option(int argc, char** argv, const std::string& name, const std::string& fallback);

}  // namespace telvane::bench
