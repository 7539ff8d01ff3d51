#pragma once

#include "platform/FileSystem.h"
#include "platform/system/Paths.h"

namespace telvane {

// The files of this machine, as Paths says. Holds no state; safe from any thread. New files get the process's usual
// permissions.
class PosixFileSystem final : public FileSystem {
 public:
  explicit PosixFileSystem(Paths paths) : _paths(std::move(paths)) {}

  std::string resolve(const std::string& path) const override;
  Result<Data> read(const std::string& path, uint64_t maximumSize) const override;
  Result<void> writeAtomically(const std::string& path, const Data& data) override;
  Result<void> write(const std::string& path, const Data& data) override;
  Result<std::unique_ptr<AppendableFile>> openForAppending(const std::string& path) override;
  Result<std::unique_ptr<TemporaryFile>> newTemporaryFile(const std::string& folder) override;
  Result<void> createDirectory(const std::string& path) override;
  // Removes a file or an empty folder. One that is not there is an error (ENOENT).
  Result<void> remove(const std::string& path) override;
  std::optional<Date> modificationDate(const std::string& path) const override;
  std::optional<Date> creationDate(const std::string& path) const override;
  Result<std::vector<std::string>> filesIn(const std::string& path) const override;
  Result<std::vector<std::string>> filesBelow(const std::string& path) const override;
  // Files are protected by their permissions here, not by class, so there is nothing to do.
  Result<void> setProtectionNone(const std::string& path) override;

 private:
  const Paths _paths;
};

}  // namespace telvane
