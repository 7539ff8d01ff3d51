#include "bench/Measurement.h"

#include <sys/resource.h>
#include <time.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <sstream>

namespace telvane::bench {
namespace {

double microseconds(const timeval& time) {
  return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_usec);
}

uint64_t statusNumber(const std::string& path, const std::string& key) {
  std::ifstream file(path);
  std::string line;
  while (std::getline(file, line)) {
    if (line.compare(0, key.size(), key) == 0) return std::stoull(line.substr(key.size()));
  }
  return 0;
}

}  // namespace

double ownCPUMicroseconds() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return microseconds(usage.ru_utime) + microseconds(usage.ru_stime);
}

double threadCPUMicroseconds() {
  timespec time{};
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
  return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_nsec) / 1e3;
}

double cpuMicrosecondsOf(pid_t pid) {
  // schedstat counts in nanoseconds, per thread; stat in ticks of 10 ms.
  double nanoseconds = 0;
  std::error_code error;
  for (const auto& thread : std::filesystem::directory_iterator("/proc/" + std::to_string(pid) + "/task", error)) {
    std::ifstream file(thread.path() / "schedstat");
    double running = 0;
    if (file >> running) nanoseconds += running;
  }
  std::ifstream stat("/proc/" + std::to_string(pid) + "/stat");
  std::string text((std::istreambuf_iterator<char>(stat)), {});
  const size_t name = text.rfind(')');
  if (name == std::string::npos) return 0;
  std::istringstream fields(text.substr(name + 2));
  std::string skipped;
  for (int i = 0; i < 11; ++i) fields >> skipped;
  double user = 0;
  double system = 0;
  fields >> user >> system;
  const double ticks = (user + system) * 1e6 / static_cast<double>(sysconf(_SC_CLK_TCK));
  // Threads that have ended are in the ticks only.
  return std::max(ticks, nanoseconds / 1e3);
}

uint64_t peakMemoryOf(pid_t pid) { return statusNumber("/proc/" + std::to_string(pid) + "/status", "VmHWM:") * 1024; }

uint64_t wakeUpsOf(pid_t pid) {
  uint64_t switches = 0;
  std::error_code error;
  for (const auto& thread : std::filesystem::directory_iterator("/proc/" + std::to_string(pid) + "/task", error)) {
    switches += statusNumber((thread.path() / "status").string(), "voluntary_ctxt_switches:");
  }
  return switches;
}

double monotonicSeconds() {
  return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

std::string option(int argc, char** argv, const std::string& name, const std::string& fallback) {
  for (int i = 1; i + 1 < argc; ++i) {
    if (argv[i] == "--" + name) return argv[i + 1];
  }
  return fallback;
}

}  // namespace telvane::bench
