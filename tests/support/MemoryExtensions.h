#pragma once

#include <map>
#include <string>

#include "platform/FileSystem.h"
#include "platform/Mutex.h"
#include "platform/SandboxExtensions.h"

namespace telvane::testing {

// Tokens of files in memory: a token stands for the file that had the path when it was made, whatever the path names
// later. Part of a SimulatedPlatform. Safe from any thread.
class MemoryExtensions final : public SandboxExtensions {
 public:
  // REQUIRES: the files outlive this object.
  explicit MemoryExtensions(FileSystem& files) : _files(files) {}

  // Makes a token for the path; its descriptor is a number that no open file has, so it may be closed like one.
  ExtensionToken newToken(const std::string& path) EXCLUDES(_mutex);
  // From now on the path is that of something else: a symbolic link, a pipe, a folder or another file.
  void replace(const std::string& path) EXCLUDES(_mutex);
  // From now on nothing is read, as through a descriptor that gives no right to it.
  void refuseReading() EXCLUDES(_mutex);
  // From now on no file is deleted, for this reason.
  void refuseRemoval(const std::string& reason) EXCLUDES(_mutex);
  // How many extensions were consumed and not let go of yet.
  int heldExtensions() const EXCLUDES(_mutex);

  std::unique_ptr<SandboxExtension> consume(const std::string& path, const ExtensionToken& token) override;

 private:
  class Extension;
  struct Grant {
    std::string path;
    bool isReplaced = false;
  };

  FileSystem& _files;
  mutable Mutex _mutex;
  std::map<int, Grant> _grants GUARDED_BY(_mutex);
  bool _isReadingRefused GUARDED_BY(_mutex) = false;
  std::string _removalRefusal GUARDED_BY(_mutex);
  int _heldExtensions GUARDED_BY(_mutex) = 0;
};

}  // namespace telvane::testing
