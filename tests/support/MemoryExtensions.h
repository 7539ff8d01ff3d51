#pragma once

#include <cstdint>
#include <map>
#include <string>

#include "platform/FileSystem.h"
#include "platform/Mutex.h"
#include "platform/SandboxExtensions.h"
#include "platform/system/FileDescriptor.h"

namespace telvane::testing {

// Tokens of files in memory: a token stands for the file that had the path when it was made, whatever the path names
// later. Part of a SimulatedPlatform. Safe from any thread.
class MemoryExtensions final : public SandboxExtensions {
 public:
  // REQUIRES: the files outlive this object.
  explicit MemoryExtensions(FileSystem& files) : _files(files) {}

  // Makes a token for the path. Its descriptor is a real one, of nothing, so that it may cross a connection; it belongs
  // to this object, which knows its duplicates, too.
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
    FileDescriptor descriptor;
    std::string path;
    bool isReplaced = false;
  };

  FileSystem& _files;
  mutable Mutex _mutex;
  std::map<uint64_t, Grant> _grants GUARDED_BY(_mutex);  // by the descriptor's inode
  bool _isReadingRefused GUARDED_BY(_mutex) = false;
  std::string _removalRefusal GUARDED_BY(_mutex);
  int _heldExtensions GUARDED_BY(_mutex) = 0;
};

}  // namespace telvane::testing
