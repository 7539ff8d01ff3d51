#pragma once

#include "platform/SubmittableLogs.h"
#include "platform/system/Paths.h"

namespace telvane {

// Submission by folders: the submission service collects what it finds in the area, whatever its type. Holds no state;
// safe from any thread.
class FolderSubmittableLogs final : public SubmittableLogs {
 public:
  static constexpr char kSubmissionArea[] = "/var/mobile/Library/Logs/CrashReporter/Submission";

  explicit FolderSubmittableLogs(Paths paths) : _paths(std::move(paths)) {}

  Result<void> createTemporaryLog(std::string_view logType, const std::string& path) override;
  // Makes the area if need be. Moves regular files only, and only into a real folder: through a link, what the daemon
  // may write or read would end where somebody else wants it. The area is on the file system of the log.
  Result<void> moveToSubmissionArea(std::string_view logType, const std::string& path) override;

 private:
  const Paths _paths;
};

}  // namespace telvane
