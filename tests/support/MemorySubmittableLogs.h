#pragma once

#include <atomic>
#include <string>
#include <vector>

#include "platform/FileSystem.h"
#include "platform/Mutex.h"
#include "platform/SubmittableLogs.h"

namespace telvane::testing {

// Submission within a file system of the test: logs are files of it, and so is what was submitted. The file system's
// faults are felt here too. Safe from any thread.
class MemorySubmittableLogs final : public SubmittableLogs {
 public:
  static constexpr char kSubmissionArea[] = "/var/mobile/Library/Logs/CrashReporter/Submission";

  // files: outlives this object.
  explicit MemorySubmittableLogs(FileSystem& files) : _files(files) {}

  // From now on every log is refused (EPERM), or taken again.
  void setRefusing(bool isRefusing) { _isRefusing = isRefusing; }
  // What was asked for, in order: "create 224 /path", "submit 224 /path".
  std::vector<std::string> calls() const;

  Result<void> createTemporaryLog(std::string_view logType, const std::string& path) override;
  Result<void> moveToSubmissionArea(std::string_view logType, const std::string& path) override;

 private:
  void note(std::string_view operation, std::string_view logType, const std::string& path);

  FileSystem& _files;
  std::atomic<bool> _isRefusing{false};
  mutable Mutex _mutex;
  std::vector<std::string> _calls GUARDED_BY(_mutex);
};

}  // namespace telvane::testing
