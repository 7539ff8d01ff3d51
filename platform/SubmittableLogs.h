#pragma once

#include <string>
#include <string_view>

#include "foundation/Error.h"

namespace telvane {

// The system's diagnostics submission: logs that it knows of while they are written, and the area from which it takes
// finished ones. A log type is the number, as text, under which the service sorts what it is given. Paths are as in
// FileSystem. Safe from any thread. Errors are of kPlatformErrorDomain with errno as code.
class SubmittableLogs {
 public:
  virtual ~SubmittableLogs() = default;
  // Makes an empty file, which only its owner may read, and the folders above it. What stands there already, a link
  // included, is an error (EEXIST) and stays as it is.
  virtual Result<void> createTemporaryLog(std::string_view logType, const std::string& path) = 0;
  // Moves a finished log into the submission area, under its own name. On an error it stays where it is; what stands in
  // the area is never replaced (EEXIST).
  virtual Result<void> moveToSubmissionArea(std::string_view logType, const std::string& path) = 0;
};

}  // namespace telvane
