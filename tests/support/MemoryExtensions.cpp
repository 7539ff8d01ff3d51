#include "tests/support/MemoryExtensions.h"

namespace telvane::testing {

std::unique_ptr<SandboxExtension> MemoryExtensions::consume(const std::string&, const ExtensionToken&) {
  return nullptr;
}

}  // namespace telvane::testing
