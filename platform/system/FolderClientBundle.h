#pragma once

#include <atomic>
#include <string>

#include "platform/ClientBundle.h"
#include "platform/Log.h"
#include "platform/system/DictionaryFiles.h"
#include "platform/system/Environment.h"
#include "platform/system/Paths.h"

namespace telvane {

// The folder Telvane.bundle: Info.plist and publicKey.der. What cannot be used counts as absent, with one error line.
class FolderClientBundle final : public ClientBundle {
 public:
  FolderClientBundle(std::string folder, Log& log) : _folder(std::move(folder)), _log(log), _files(log) {}
  // Returns the folder of TELVANE_BUNDLE as it is, else the one of this installation below the root.
  static std::string folderFor(const Environment& environment, const Paths& paths);

  std::optional<String> version() const override;
  std::optional<Data> publicKey() const override;

 private:
  const std::string _folder;
  Log& _log;
  mutable DictionaryFiles _files;  // what it keeps shows in nothing but speed
  mutable std::atomic<bool> _isWrongTypeReported = false;
  mutable std::atomic<int64_t> _reportedKeyFailure = 0;  // the last code of a failed read, until one succeeds
};

}  // namespace telvane
