#pragma once

#include <string>

#include "foundation/Value.h"

namespace telvane {

// A daemon's status as a person reads it, one line per fact, without a line feed at its end.
std::string statusText(const Dictionary& status);

}  // namespace telvane
