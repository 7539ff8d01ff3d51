#include "tests/support/MemoryExtensions.h"

#include <cerrno>

namespace telvane::testing {
namespace {

constexpr int kFirstToken = 1 << 24;

Error refusal(int code, const std::string& reason) {
  return Error::withDescription(kPlatformErrorDomain, code, reason);
}

}  // namespace

class MemoryExtensions::Extension final : public SandboxExtension {
 public:
  Extension(MemoryExtensions& owner, int token, std::string path)
      : _owner(owner), _token(token), _path(std::move(path)) {
    MutexLock lock(_owner._mutex);
    ++_owner._heldExtensions;
  }
  ~Extension() override {
    MutexLock lock(_owner._mutex);
    --_owner._heldExtensions;
  }

  bool isRegularFile() const override {
    const Grant granted = grant();
    return granted.path == _path && !granted.isReplaced && content().has_value();
  }
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
    if (grant().isReplaced) return refusal(ESTALE, "its path names another file now");
    {
      MutexLock lock(_owner._mutex);
      if (!_owner._removalRefusal.empty()) return refusal(EACCES, _owner._removalRefusal);
    }
    return _owner._files.remove(_path);
  }

 private:
  Grant grant() const {
    MutexLock lock(_owner._mutex);
    return _owner._grants.at(_token);
  }
  Result<Data> content() const { return _owner._files.read(grant().path, UINT64_MAX); }

  MemoryExtensions& _owner;
  const int _token;
  const std::string _path;
};

ExtensionToken MemoryExtensions::newToken(const std::string& path) {
  MutexLock lock(_mutex);
  const int token = kFirstToken + static_cast<int>(_grants.size());
  _grants[token] = Grant{path};
  return {.descriptor = token, .holder = PeerIdentity()};
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
  {
    MutexLock lock(_mutex);
    if (_grants.count(token.descriptor) == 0) return nullptr;
  }
  return std::make_unique<Extension>(*this, token.descriptor, path);
}

}  // namespace telvane::testing
