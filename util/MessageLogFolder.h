#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "foundation/Date.h"
#include "platform/Platform.h"

namespace telvane {

// The folder of message logs: finds the daemon's files in it, makes new ones, and hands old ones to the diagnostics
// submission service. The folder also holds other programs' logs, which are left alone.
//
// Owned by the MessageLogFile, whose calls come one at a time. Holds no state but where the folder is.
class MessageLogFolder {
 public:
  static constexpr char kPath[] = "/var/mobile/Library/Logs/CrashReporter/Retired";
  static constexpr std::string_view kLogType = "224";
  // A file that is older than this is expired.
  static constexpr std::chrono::seconds kMaximumAge{86400};

  // platform: must outlive this object.
  explicit MessageLogFolder(Platform& platform);

  static bool isExpired(Date creationDate, Date now) { return now.time() - creationDate.time() > kMaximumAge; }
  // Whether a file of that name is a message log of the daemon: "telvaned_TIME_messageLog.ips".
  static bool isMessageLog(std::string_view name);

  // Returns the paths of the daemon's files, in ascending order; subfolders are not looked into. A folder that is not
  // there is made. When it cannot be read, that is logged and there are none.
  std::vector<std::string> messageLogs();
  // Makes a file named after the time and sets both to it; to nothing, with an error line, when it cannot be made. The
  // creation date is the one that the file system tells, if it does. With a null pointer it only logs the error.
  void createNewLogFile(std::optional<std::string>* logFilePath, std::optional<Date>* logFileCreationDate);
  // Hands the file to the submission service; removes it when the service refuses it.
  void deleteExpiredLogFile(const std::string& path, const std::optional<Date>& creationDate);

 private:
  // Whether a regular file of that name is there. A link is none: what it leads to is not ours to write.
  bool hasFile(const std::string& name) const;

  Platform& _platform;
  const std::string _path;
};

}  // namespace telvane
