#include "platform/system/Environment.h"

#include <stdlib.h>

namespace telvane {
namespace {

std::optional<std::string> variable(const char* name) {
  const char* value = ::secure_getenv(name);
  if (value == nullptr || *value == '\0') return std::nullopt;
  return std::string(value);
}

}  // namespace

Environment Environment::read() {
  return {.root = variable("TELVANE_ROOT"),
          .bundle = variable("TELVANE_BUNDLE"),
          .certificates = variable("TELVANE_CA_FILE"),
          .home = variable("HOME"),
          .localeAll = variable("LC_ALL"),
          .localeDefault = variable("LANG")};
}

}  // namespace telvane
