#pragma once

#include "platform/FileSystem.h"
#include "platform/SandboxExtensions.h"

namespace telvane::testing {

// Tokens of files in memory. Part of a SimulatedPlatform.
class MemoryExtensions final : public SandboxExtensions {
 public:
  // REQUIRES: the files outlive this object.
  explicit MemoryExtensions(FileSystem& files) : _files(files) {}
  std::unique_ptr<SandboxExtension> consume(const std::string& path, const ExtensionToken& token) override;

 private:
  [[maybe_unused]] FileSystem& _files;
};

}  // namespace telvane::testing
