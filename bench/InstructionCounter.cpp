#include "bench/InstructionCounter.h"

#include <linux/perf_event.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <system_error>

namespace telvane::bench {

InstructionCounter::InstructionCounter(pid_t pid) {
  std::error_code error;
  for (const auto& thread : std::filesystem::directory_iterator("/proc/" + std::to_string(pid) + "/task", error)) {
    countThread(std::stoi(thread.path().filename().string()));
  }
  if (_counters.empty() && _refusal.empty()) _refusal = "the process is gone";
}

InstructionCounter::~InstructionCounter() {
  for (const int counter : _counters) close(counter);
}

void InstructionCounter::countThread(pid_t thread) {
  perf_event_attr attributes{};
  attributes.size = sizeof(attributes);
  attributes.type = PERF_TYPE_HARDWARE;
  attributes.config = PERF_COUNT_HW_INSTRUCTIONS;
  attributes.inherit = 1;
  attributes.exclude_kernel = 1;
  attributes.exclude_hv = 1;
  const long counter = syscall(SYS_perf_event_open, &attributes, thread, -1, -1, PERF_FLAG_FD_CLOEXEC);
  if (counter >= 0) {
    _counters.push_back(static_cast<int>(counter));
  } else if (errno != ESRCH) {  // a thread may end meanwhile
    _refusal = errno == ENOENT ? "this machine has no counter for it" : std::generic_category().message(errno);
  }
}

std::optional<uint64_t> InstructionCounter::count() const {
  if (!_refusal.empty()) return std::nullopt;
  uint64_t sum = 0;
  for (const int counter : _counters) {
    uint64_t value = 0;
    if (read(counter, &value, sizeof(value)) != sizeof(value)) return std::nullopt;
    sum += value;
  }
  return sum;
}

}  // namespace telvane::bench
