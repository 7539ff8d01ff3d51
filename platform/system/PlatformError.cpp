#include "platform/system/PlatformError.h"

#include <system_error>

namespace telvane {

Error platformError(int code, std::string text) { return Error::withDescription(kPlatformErrorDomain, code, text); }

Error errnoError(int code, const std::string& what) {
  return platformError(code, what + ": " + std::generic_category().message(code));
}

}  // namespace telvane
