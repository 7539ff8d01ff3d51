#include "tests/support/MemoryExtensions.h"

#include <sys/mman.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>

namespace telvane::testing {
namespace {

// What all duplicates of a descriptor have in common; 0 for what is none.
uint64_t nodeOf(int descriptor) {
  struct stat status {};
  return ::fstat(descriptor, &status) == 0 ? status.st_ino : 0;
}

Error refusal(int code, const std::string& reason) {
  return Error::withDescription(kPlatformErrorDomain, code, reason);
}

}  // namespace

class MemoryExtensions::Extension final : public SandboxExtension {
 public:
  Extension(MemoryExtensions& owner, uint64_t token, std::string path)
      : _owner(owner), _token(token), _path(std::move(path)) {
    MutexLock lock(_owner._mutex);
    ++_owner._heldExtensions;
  }
  ~Extension() override {
    MutexLock lock(_owner._mutex);
    --_owner._heldExtensions;
  }

  bool isRegularFile() const override { return grantedPath() == _path && !isReplaced() && content().has_value(); }
  Result<uint64_t> size() const override {
    const Result<Data> bytes = content();
    if (bytes.has_error()) return bytes.error();
    return uint64_t{bytes->size()};
  }
  Result<size_t> readAt(uint64_t offset, char* buffer, size_t length) const override {
    {
      MutexLock lock(_owner._mutex);
      if (_owner._isReadingRefused) return refusal(EBADF, "not open for reading");
    }
    const Result<Data> bytes = content();
    if (bytes.has_error()) return bytes.error();
    return bytes->view().substr(std::min<uint64_t>(offset, bytes->size())).copy(buffer, length);
  }
  Result<void> removeFile() override {
    if (isReplaced()) return refusal(ESTALE, "its path names another file now");
    {
      MutexLock lock(_owner._mutex);
      if (!_owner._removalRefusal.empty()) return refusal(EACCES, _owner._removalRefusal);
    }
    return _owner._files.remove(_path);
  }

 private:
  std::string grantedPath() const {
    MutexLock lock(_owner._mutex);
    return _owner._grants.at(_token).path;
  }
  bool isReplaced() const {
    MutexLock lock(_owner._mutex);
    return _owner._grants.at(_token).isReplaced;
  }
  Result<Data> content() const { return _owner._files.read(grantedPath(), UINT64_MAX); }

  MemoryExtensions& _owner;
  const uint64_t _token;
  const std::string _path;
};

ExtensionToken MemoryExtensions::newToken(const std::string& path) {
  MutexLock lock(_mutex);
  FileDescriptor descriptor(::memfd_create("token", MFD_CLOEXEC));
  const int number = descriptor.get();
  _grants[nodeOf(number)] = Grant{std::move(descriptor), path};
  return {.descriptor = number, .holder = PeerIdentity()};
}

void MemoryExtensions::replace(const std::string& path) {
  MutexLock lock(_mutex);
  for (auto& [token, grant] : _grants) grant.isReplaced = grant.isReplaced || grant.path == path;
}

void MemoryExtensions::refuseReading() {
  MutexLock lock(_mutex);
  _isReadingRefused = true;
}

void MemoryExtensions::refuseRemoval(const std::string& reason) {
  MutexLock lock(_mutex);
  _removalRefusal = reason;
}

int MemoryExtensions::heldExtensions() const {
  MutexLock lock(_mutex);
  return _heldExtensions;
}

std::unique_ptr<SandboxExtension> MemoryExtensions::consume(const std::string& path, const ExtensionToken& token) {
  const uint64_t node = nodeOf(token.descriptor);
  {
    MutexLock lock(_mutex);
    if (_grants.count(node) == 0) return nullptr;
  }
  return std::make_unique<Extension>(*this, node, path);
}

}  // namespace telvane::testing
