#include "bench/Measurement.h"

#include <sys/resource.h>
#include <time.h>

#include <charconv>
#include <chrono>
#include <filesystem>
#include <fstream>

namespace telvane::bench {
namespace {

double microseconds(const timeval& time) {
  return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_usec);
}

double microsecondsOn(clockid_t clock) {
  timespec time{};
  if (clock_gettime(clock, &time) != 0) return 0;
  return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_nsec) / 1e3;
}

std::string processFolder(pid_t pid) { return "/proc/" + std::to_string(pid); }

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

double threadCPUMicroseconds() { return microsecondsOn(CLOCK_THREAD_CPUTIME_ID); }

double cpuMicrosecondsOf(pid_t pid) {
  clockid_t clock{};
  return clock_getcpuclockid(pid, &clock) == 0 ? microsecondsOn(clock) : 0;
}

uint64_t residentMemoryOf(pid_t pid) { return statusNumber(processFolder(pid) + "/status", "VmRSS:") * 1024; }

uint64_t peakMemoryOf(pid_t pid) { return statusNumber(processFolder(pid) + "/status", "VmHWM:") * 1024; }

std::map<pid_t, uint64_t> switchesOf(pid_t pid) {
  std::map<pid_t, uint64_t> switches;
  std::error_code error;
  for (const auto& thread : std::filesystem::directory_iterator(processFolder(pid) + "/task", error)) {
    switches[std::stoi(thread.path().filename().string())] =
        statusNumber((thread.path() / "status").string(), "voluntary_ctxt_switches:");
  }
  return switches;
}

uint64_t wakeUpsBetween(const std::map<pid_t, uint64_t>& before, const std::map<pid_t, uint64_t>& after) {
  uint64_t count = 0;
  for (const auto& [thread, switches] : after) {
    const auto earlier = before.find(thread);
    count += switches - (earlier != before.end() ? earlier->second : 0);
  }
  for (const auto& [thread, switches] : before) {
    if (after.count(thread) == 0) ++count;
  }
  return count;
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

uint64_t numberOption(int argc, char** argv, const std::string& name, uint64_t fallback) {
  const std::string text = option(argc, argv, name, "");
  uint64_t number = fallback;
  std::from_chars(text.data(), text.data() + text.size(), number);
  return number;
}

bool hasOption(int argc, char** argv, const std::string& name) {
  for (int i = 1; i < argc; ++i) {
    if (argv[i] == "--" + name) return true;
  }
  return false;
}

}  // namespace telvane::bench
