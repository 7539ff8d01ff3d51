#pragma once

#include <sys/types.h>

#include <cstdint>
#include <map>
#include <string>

namespace telvane::bench {

// CPU time of this process so far, user and system, in microseconds.
double ownCPUMicroseconds();
// CPU time of the calling thread so far, in microseconds.
double threadCPUMicroseconds();
// CPU time of another process with all threads that it ever had; 0 when it is gone.
double cpuMicrosecondsOf(pid_t pid);
// Its resident memory now, in bytes; 0 when it is gone.
uint64_t residentMemoryOf(pid_t pid);
// Its largest resident memory so far, in bytes; 0 when it is gone.
uint64_t peakMemoryOf(pid_t pid);
// How often each of its threads, by thread number, has gone to sleep and been woken again so far.
std::map<pid_t, uint64_t> switchesOf(pid_t pid);
// How often the threads of a process were woken between two such readings; one that is gone counts as woken once.
uint64_t wakeUpsBetween(const std::map<pid_t, uint64_t>& before, const std::map<pid_t, uint64_t>& after);
// Seconds on the monotonic clock, which all processes share.
double monotonicSeconds();
// The value of "--name VALUE" on a command line, or the fallback.
std::string option(int argc, char** argv, const std::string& name, const std::string& fallback);
// The same for a count; the fallback when there is no number.
uint64_t numberOption(int argc, char** argv, const std::string& name, uint64_t fallback);
// Whether "--name" stands on a command line.
bool hasOption(int argc, char** argv, const std::string& name);

}  // namespace telvane::bench
