#pragma once

#include <string>
#include <vector>

#include "platform/FileSystem.h"
#include "platform/Mutex.h"

namespace telvane::testing {

// Passes everything on to another file system, except where it is told to fail. Without a fault it is not felt. Safe
// from any thread.
class FaultyFileSystem final : public FileSystem {
 public:
  // target: outlives this object.
  explicit FaultyFileSystem(FileSystem& target) : _target(target) {}

  // Reads of paths that contain the text (an empty one: of all) fail with the error number. Looking for dates and
  // listing folders are reads.
  void failReads(int errorNumber, std::string pathPart = "");
  // The same for writing, creating and removing.
  void failWrites(int errorNumber, std::string pathPart = "");
  // Nothing can be written any more: ENOSPC. A plain write leaves the first half of its bytes behind, as a disk does;
  // an atomic one leaves nothing. Removing still works.
  void fillDisk();
  void heal();

  std::string resolve(const std::string& path) const override { return _target.resolve(path); }
  Result<Data> read(const std::string& path, uint64_t maximumSize) const override;
  Result<void> writeAtomically(const std::string& path, const Data& data) override;
  Result<void> write(const std::string& path, const Data& data) override;
  // The file that it opens feels the faults too, also those that come later.
  Result<std::unique_ptr<AppendableFile>> openForAppending(const std::string& path) override;
  // So does a temporary one, in the folder that it was made for.
  Result<std::unique_ptr<TemporaryFile>> newTemporaryFile(const std::string& folder) override;
  Result<void> createDirectory(const std::string& path) override;
  Result<void> remove(const std::string& path) override;
  std::optional<Date> modificationDate(const std::string& path) const override;
  std::optional<Date> creationDate(const std::string& path) const override;
  Result<std::vector<std::string>> filesIn(const std::string& path) const override;
  Result<std::vector<std::string>> filesBelow(const std::string& path) const override;
  Result<void> setProtectionNone(const std::string& path) override;

 private:
  class OpenFile;
  class OpenTemporaryFile;
  struct Fault {
    int errorNumber;
    std::string pathPart;
  };
  std::optional<Error> readFault(const std::string& path) const;
  std::optional<Error> writeFault(const std::string& path) const;
  bool isDiskFull() const;

  FileSystem& _target;
  mutable Mutex _mutex;
  std::vector<Fault> _readFaults GUARDED_BY(_mutex);
  std::vector<Fault> _writeFaults GUARDED_BY(_mutex);
  bool _isDiskFull GUARDED_BY(_mutex) = false;
};

}  // namespace telvane::testing
