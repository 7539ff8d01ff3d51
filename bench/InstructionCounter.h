#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace telvane::bench {

// Counts the instructions that a process executes outside the kernel. Unlike time they do not depend on what else the
// host does. Many virtual machines have no such counter and some systems refuse it; then there is a reason instead.
class InstructionCounter {
 public:
  // Counts from now on, in all threads that the process has now and in those that they make.
  explicit InstructionCounter(pid_t pid);
  ~InstructionCounter();
  InstructionCounter(const InstructionCounter&) = delete;
  InstructionCounter& operator=(const InstructionCounter&) = delete;

  // Instructions so far; nothing when they cannot be counted.
  std::optional<uint64_t> count() const;
  // Why not; empty when they can.
  const std::string& refusal() const noexcept { return _refusal; }

 private:
  void countThread(pid_t thread);

  std::vector<int> _counters;  // owned descriptors, one per thread
  std::string _refusal;
};

}  // namespace telvane::bench
