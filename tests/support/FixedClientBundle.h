#pragma once

#include <utility>

#include "platform/ClientBundle.h"
#include "platform/Mutex.h"

namespace telvane::testing {

// A client bundle that the test fills. Safe from any thread.
class FixedClientBundle final : public ClientBundle {
 public:
  explicit FixedClientBundle(std::optional<String> version = String("1.0"), std::optional<Data> publicKey = {})
      : _version(std::move(version)), _publicKey(std::move(publicKey)) {}

  void setVersion(std::optional<String> version) {
    MutexLock lock(_mutex);
    _version = std::move(version);
  }
  void setPublicKey(std::optional<Data> publicKey) {
    MutexLock lock(_mutex);
    _publicKey = std::move(publicKey);
  }

  std::optional<String> version() const override {
    MutexLock lock(_mutex);
    return _version;
  }
  std::optional<Data> publicKey() const override {
    MutexLock lock(_mutex);
    return _publicKey;
  }

 private:
  mutable Mutex _mutex;
  std::optional<String> _version GUARDED_BY(_mutex);
  std::optional<Data> _publicKey GUARDED_BY(_mutex);
};

}  // namespace telvane::testing
