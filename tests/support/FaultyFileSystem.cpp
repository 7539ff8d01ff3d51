#include "tests/support/FaultyFileSystem.h"

#include <cerrno>
#include <cstring>
#include <utility>

namespace telvane::testing {

namespace {

Error failure(int errorNumber, const std::string& path) {
  return Error::withDescription(kPlatformErrorDomain, errorNumber, path + ": " + std::strerror(errorNumber));
}

}  // namespace

class FaultyFileSystem::OpenFile final : public AppendableFile {
 public:
  OpenFile(const FaultyFileSystem& files, std::string path, std::unique_ptr<AppendableFile> target)
      : _files(files), _path(std::move(path)), _target(std::move(target)) {}
  Result<void> append(std::string_view text) override {
    if (auto fault = _files.writeFault(_path)) return *std::move(fault);
    if (_files.isDiskFull()) return failure(ENOSPC, _path);
    return _target->append(text);
  }

 private:
  const FaultyFileSystem& _files;
  const std::string _path;
  const std::unique_ptr<AppendableFile> _target;
};

class FaultyFileSystem::OpenTemporaryFile final : public TemporaryFile {
 public:
  OpenTemporaryFile(const FaultyFileSystem& files, std::string folder, std::unique_ptr<TemporaryFile> target)
      : _files(files), _folder(std::move(folder)), _target(std::move(target)) {}
  uint64_t size() const noexcept override { return _target->size(); }
  int64_t read(uint64_t offset, std::span<char> buffer) const override {
    return _files.readFault(_folder) ? -1 : _target->read(offset, buffer);
  }
  Result<void> append(std::string_view bytes) override {
    if (auto fault = _files.writeFault(_folder)) return *std::move(fault);
    if (_files.isDiskFull()) return failure(ENOSPC, _folder);
    return _target->append(bytes);
  }

 private:
  const FaultyFileSystem& _files;
  const std::string _folder;
  const std::unique_ptr<TemporaryFile> _target;
};

void FaultyFileSystem::failReads(int errorNumber, std::string pathPart) {
  MutexLock lock(_mutex);
  _readFaults.push_back(Fault{errorNumber, std::move(pathPart)});
}

void FaultyFileSystem::failWrites(int errorNumber, std::string pathPart) {
  MutexLock lock(_mutex);
  _writeFaults.push_back(Fault{errorNumber, std::move(pathPart)});
}

void FaultyFileSystem::fillDisk() {
  MutexLock lock(_mutex);
  _isDiskFull = true;
}

void FaultyFileSystem::heal() {
  MutexLock lock(_mutex);
  _readFaults.clear();
  _writeFaults.clear();
  _isDiskFull = false;
}

Result<Data> FaultyFileSystem::read(const std::string& path, uint64_t maximumSize) const {
  if (auto fault = readFault(path)) return *std::move(fault);
  return _target.read(path, maximumSize);
}

Result<void> FaultyFileSystem::writeAtomically(const std::string& path, const Data& data) {
  if (auto fault = writeFault(path)) return *std::move(fault);
  if (isDiskFull()) return failure(ENOSPC, path);
  return _target.writeAtomically(path, data);
}

Result<void> FaultyFileSystem::write(const std::string& path, const Data& data) {
  if (auto fault = writeFault(path)) return *std::move(fault);
  if (!isDiskFull()) return _target.write(path, data);
  auto written = _target.write(path, Data::copyOf(data.view().substr(0, data.size() / 2)));
  if (!written) return written;
  return failure(ENOSPC, path);
}

Result<std::unique_ptr<AppendableFile>> FaultyFileSystem::openForAppending(const std::string& path) {
  if (auto fault = writeFault(path)) return *std::move(fault);
  Result<std::unique_ptr<AppendableFile>> opened = _target.openForAppending(path);
  if (!opened) return opened;
  return std::unique_ptr<AppendableFile>(std::make_unique<OpenFile>(*this, path, std::move(*opened)));
}

Result<std::unique_ptr<TemporaryFile>> FaultyFileSystem::newTemporaryFile(const std::string& folder) {
  if (auto fault = writeFault(folder)) return *std::move(fault);
  Result<std::unique_ptr<TemporaryFile>> made = _target.newTemporaryFile(folder);
  if (!made) return made;
  return std::unique_ptr<TemporaryFile>(std::make_unique<OpenTemporaryFile>(*this, folder, std::move(*made)));
}

Result<void> FaultyFileSystem::createDirectory(const std::string& path) {
  if (auto fault = writeFault(path)) return *std::move(fault);
  if (isDiskFull() && !_target.modificationDate(path)) return failure(ENOSPC, path);
  return _target.createDirectory(path);
}

Result<void> FaultyFileSystem::remove(const std::string& path) {
  if (auto fault = writeFault(path)) return *std::move(fault);
  return _target.remove(path);
}

std::optional<Date> FaultyFileSystem::modificationDate(const std::string& path) const {
  if (readFault(path)) return std::nullopt;
  return _target.modificationDate(path);
}

std::optional<Date> FaultyFileSystem::creationDate(const std::string& path) const {
  if (readFault(path)) return std::nullopt;
  return _target.creationDate(path);
}

Result<std::vector<std::string>> FaultyFileSystem::filesIn(const std::string& path) const {
  if (auto fault = readFault(path)) return *std::move(fault);
  return _target.filesIn(path);
}

Result<std::vector<std::string>> FaultyFileSystem::filesBelow(const std::string& path) const {
  if (auto fault = readFault(path)) return *std::move(fault);
  return _target.filesBelow(path);
}

Result<void> FaultyFileSystem::setProtectionNone(const std::string& path) {
  if (auto fault = writeFault(path)) return *std::move(fault);
  return _target.setProtectionNone(path);
}

std::optional<Error> FaultyFileSystem::readFault(const std::string& path) const {
  MutexLock lock(_mutex);
  for (const Fault& fault : _readFaults) {
    if (path.find(fault.pathPart) != std::string::npos) return failure(fault.errorNumber, path);
  }
  return std::nullopt;
}

std::optional<Error> FaultyFileSystem::writeFault(const std::string& path) const {
  MutexLock lock(_mutex);
  for (const Fault& fault : _writeFaults) {
    if (path.find(fault.pathPart) != std::string::npos) return failure(fault.errorNumber, path);
  }
  return std::nullopt;
}

bool FaultyFileSystem::isDiskFull() const {
  MutexLock lock(_mutex);
  return _isDiskFull;
}

}  // namespace telvane::testing
