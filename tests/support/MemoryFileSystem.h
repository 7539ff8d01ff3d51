#pragma once

#include <map>
#include <set>
#include <string>
#include <vector>

#include "platform/Clock.h"
#include "platform/FileSystem.h"
#include "platform/Mutex.h"

namespace telvane::testing {

// Files in memory, dated by a clock. Folders must exist before files are written into them, as on a disk; the root, the
// home folder and /tmp exist. Safe from any thread.
class MemoryFileSystem final : public FileSystem {
 public:
  static constexpr char kHome[] = "/home/user";

  // root: what is put in front of the system's folders; empty for none.
  explicit MemoryFileSystem(const Clock& clock, std::string root = "");

  std::string resolve(const std::string& path) const override;
  Result<Data> read(const std::string& path, uint64_t maximumSize) const override;
  Result<void> writeAtomically(const std::string& path, const Data& data) override;
  Result<void> write(const std::string& path, const Data& data) override;
  Result<std::unique_ptr<AppendableFile>> openForAppending(const std::string& path) override;
  Result<std::unique_ptr<TemporaryFile>> newTemporaryFile(const std::string& folder) override;
  Result<void> createDirectory(const std::string& path) override;
  // Removes a file, or a folder that is empty.
  Result<void> remove(const std::string& path) override;
  std::optional<Date> modificationDate(const std::string& path) const override;
  std::optional<Date> creationDate(const std::string& path) const override;
  Result<std::vector<std::string>> filesIn(const std::string& path) const override;
  Result<std::vector<std::string>> filesBelow(const std::string& path) const override;
  Result<void> setProtectionNone(const std::string& path) override;

  // Puts a file there with the folders above it.
  void place(const std::string& path, std::string_view content);
  // Dates an existing file, as somebody else's tool may.
  void setModificationDate(const std::string& path, Date date);
  // Gives an existing file another creation date, or takes it away, as on a file system that keeps none.
  void setCreationDate(const std::string& path, std::optional<Date> date);
  bool exists(const std::string& path) const;
  // The file's content; empty when there is none.
  std::string content(const std::string& path) const;
  // Files and folders whose protection was taken away, in ascending order.
  std::vector<std::string> unprotectedPaths() const;

 private:
  struct File {
    Data content;
    Date modified;
    std::optional<Date> created;
  };
  class OpenFile;
  class BufferFile;
  void addFolders(const std::string& resolved) REQUIRES(_mutex);
  // A file of that name keeps its creation date.
  void setContent(const std::string& resolved, const Data& data) REQUIRES(_mutex);
  Result<void> store(const std::string& path, const Data& data);
  Result<void> append(const std::string& resolved, std::string_view text);

  const Clock& _clock;
  const std::string _root;
  mutable Mutex _mutex;
  std::map<std::string, File> _files GUARDED_BY(_mutex);
  std::map<std::string, Date> _folders GUARDED_BY(_mutex);
  std::set<std::string> _unprotected GUARDED_BY(_mutex);
};

}  // namespace telvane::testing
