#pragma once

#include <string>

#include "foundation/Error.h"

namespace telvane {

// Makes an error of kPlatformErrorDomain with this description.
Error platformError(int code, std::string text);
// The same for a failed system call: "WHAT: reason of the errno value".
Error errnoError(int code, const std::string& what);

}  // namespace telvane
