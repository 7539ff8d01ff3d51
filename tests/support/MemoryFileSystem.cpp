#include "tests/support/MemoryFileSystem.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <utility>

namespace telvane::testing {

namespace {

Error failure(int errorNumber, const std::string& path) {
  return Error::withDescription(kPlatformErrorDomain, errorNumber, path + ": " + std::strerror(errorNumber));
}

std::string parentOf(const std::string& path) { return std::filesystem::path(path).parent_path().string(); }

bool isBelow(const std::string& path, const std::string& folder) {
  if (folder == "/") return path.size() > 1;
  return path.size() > folder.size() + 1 && path.compare(0, folder.size(), folder) == 0 && path[folder.size()] == '/';
}

}  // namespace

// An open file by its name: one that is removed meanwhile cannot be added to.
class MemoryFileSystem::OpenFile final : public AppendableFile {
 public:
  OpenFile(MemoryFileSystem& files, std::string resolved) : _files(files), _resolved(std::move(resolved)) {}
  Result<void> append(std::string_view text) override { return _files.append(_resolved, text); }

 private:
  MemoryFileSystem& _files;
  const std::string _resolved;
};

class MemoryFileSystem::BufferFile final : public TemporaryFile {
 public:
  uint64_t size() const noexcept override { return _bytes.size(); }
  int64_t read(uint64_t offset, std::span<char> buffer) const override {
    const std::string_view rest = std::string_view(_bytes).substr(std::min<uint64_t>(offset, _bytes.size()));
    return static_cast<int64_t>(rest.copy(buffer.data(), buffer.size()));
  }
  Result<void> append(std::string_view bytes) override {
    _bytes += bytes;
    return {};
  }

 private:
  std::string _bytes;
};

MemoryFileSystem::MemoryFileSystem(const Clock& clock, std::string root) : _clock(clock), _root(std::move(root)) {
  MutexLock lock(_mutex);
  addFolders(kHome);
  addFolders("/tmp");
}

std::string MemoryFileSystem::resolve(const std::string& path) const {
  std::string resolved = path;
  if (path == "~" || path.rfind("~/", 0) == 0) {
    resolved = kHome + path.substr(1);
  } else {
    for (const char* prefix : {"/run", "/etc", "/var", "/tmp/tvnstorage"}) {
      if (path == prefix || isBelow(path, prefix)) resolved = _root + path;
    }
  }
  resolved = std::filesystem::path(resolved).lexically_normal().string();
  if (resolved.size() > 1 && resolved.back() == '/') resolved.pop_back();
  return resolved;
}

Result<Data> MemoryFileSystem::read(const std::string& path, uint64_t maximumSize) const {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  if (_folders.count(resolved) != 0) return failure(EISDIR, path);
  const auto found = _files.find(resolved);
  if (found == _files.end()) return failure(ENOENT, path);
  if (found->second.content.size() > maximumSize) return failure(EFBIG, path);
  return found->second.content;
}

Result<void> MemoryFileSystem::writeAtomically(const std::string& path, const Data& data) { return store(path, data); }

Result<void> MemoryFileSystem::write(const std::string& path, const Data& data) { return store(path, data); }

Result<void> MemoryFileSystem::store(const std::string& path, const Data& data) {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  if (_folders.count(resolved) != 0) return failure(EISDIR, path);
  const auto folder = _folders.find(parentOf(resolved));
  if (folder == _folders.end()) {
    return failure(_files.count(parentOf(resolved)) != 0 ? ENOTDIR : ENOENT, path);
  }
  if (_files.count(resolved) == 0) folder->second = _clock.now();
  setContent(resolved, data);
  return {};
}

void MemoryFileSystem::setContent(const std::string& resolved, const Data& data) {
  const auto found = _files.find(resolved);
  const std::optional<Date> created = found != _files.end() ? found->second.created : _clock.now();
  _files[resolved] = File{data, _clock.now(), created};
}

Result<std::unique_ptr<AppendableFile>> MemoryFileSystem::openForAppending(const std::string& path) {
  std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  if (_folders.count(resolved) != 0) return failure(EISDIR, path);
  if (_files.count(resolved) == 0) return failure(ENOENT, path);
  return std::unique_ptr<AppendableFile>(std::make_unique<OpenFile>(*this, std::move(resolved)));
}

Result<void> MemoryFileSystem::append(const std::string& resolved, std::string_view text) {
  MutexLock lock(_mutex);
  const auto found = _files.find(resolved);
  if (found == _files.end()) return failure(ENOENT, resolved);
  found->second.content = Data(std::string(found->second.content.view()).append(text));
  found->second.modified = _clock.now();
  return {};
}

Result<std::unique_ptr<TemporaryFile>> MemoryFileSystem::newTemporaryFile(const std::string& folder) {
  const Result<void> made = createDirectory(folder);
  if (!made) return made.error();
  return std::unique_ptr<TemporaryFile>(std::make_unique<BufferFile>());
}

Result<void> MemoryFileSystem::createDirectory(const std::string& path) {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  for (std::string part = resolved; part.size() > 1; part = parentOf(part)) {
    if (_files.count(part) != 0) return failure(part == resolved ? EEXIST : ENOTDIR, path);
  }
  addFolders(resolved);
  return {};
}

Result<void> MemoryFileSystem::remove(const std::string& path) {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  if (_files.erase(resolved) != 0) return {};
  if (_folders.count(resolved) == 0) return failure(ENOENT, path);
  auto isInside = [&resolved](const auto& entry) { return isBelow(entry.first, resolved); };
  for (const auto& entry : _files) {
    if (isInside(entry)) return failure(ENOTEMPTY, path);
  }
  for (const auto& entry : _folders) {
    if (isInside(entry)) return failure(ENOTEMPTY, path);
  }
  _folders.erase(resolved);
  return {};
}

std::optional<Date> MemoryFileSystem::modificationDate(const std::string& path) const {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  if (const auto found = _files.find(resolved); found != _files.end()) return found->second.modified;
  if (const auto found = _folders.find(resolved); found != _folders.end()) return found->second;
  return std::nullopt;
}

std::optional<Date> MemoryFileSystem::creationDate(const std::string& path) const {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  if (const auto found = _files.find(resolved); found != _files.end()) return found->second.created;
  if (const auto found = _folders.find(resolved); found != _folders.end()) return found->second;
  return std::nullopt;
}

Result<std::vector<std::string>> MemoryFileSystem::filesIn(const std::string& path) const {
  Result<std::vector<std::string>> files = filesBelow(path);
  if (files.has_value()) {
    std::erase_if(*files, [](const std::string& file) { return file.find('/') != std::string::npos; });
  }
  return files;
}

Result<std::vector<std::string>> MemoryFileSystem::filesBelow(const std::string& path) const {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  if (_folders.count(resolved) == 0) return failure(_files.count(resolved) != 0 ? ENOTDIR : ENOENT, path);
  std::vector<std::string> found;
  const size_t prefix = resolved == "/" ? 1 : resolved.size() + 1;
  for (const auto& entry : _files) {
    if (isBelow(entry.first, resolved)) found.push_back(entry.first.substr(prefix));
  }
  return found;
}

Result<void> MemoryFileSystem::setProtectionNone(const std::string& path) {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  if (_files.count(resolved) == 0 && _folders.count(resolved) == 0) return failure(ENOENT, path);
  _unprotected.insert(resolved);
  return {};
}

void MemoryFileSystem::place(const std::string& path, std::string_view content) {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  addFolders(parentOf(resolved));
  setContent(resolved, Data::copyOf(content));
}

void MemoryFileSystem::setCreationDate(const std::string& path, std::optional<Date> date) {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  const auto found = _files.find(resolved);
  if (found == _files.end()) {
    ADD_FAILURE() << "setCreationDate: there is no file " << resolved;
    return;
  }
  found->second.created = date;
}

void MemoryFileSystem::setModificationDate(const std::string& path, Date date) {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  const auto found = _files.find(resolved);
  if (found == _files.end()) {
    ADD_FAILURE() << "setModificationDate: there is no file " << resolved;
    return;
  }
  found->second.modified = date;
}

bool MemoryFileSystem::exists(const std::string& path) const { return modificationDate(path).has_value(); }

std::string MemoryFileSystem::content(const std::string& path) const {
  const std::string resolved = resolve(path);
  MutexLock lock(_mutex);
  const auto found = _files.find(resolved);
  return found == _files.end() ? std::string() : std::string(found->second.content.view());
}

std::vector<std::string> MemoryFileSystem::unprotectedPaths() const {
  MutexLock lock(_mutex);
  return {_unprotected.begin(), _unprotected.end()};
}

void MemoryFileSystem::addFolders(const std::string& resolved) {
  for (std::string folder = resolved; !folder.empty(); folder = parentOf(folder)) {
    _folders.emplace(folder, _clock.now());
    if (folder == "/") return;
  }
}

}  // namespace telvane::testing
