#pragma once

#include <string>

#include "foundation/Date.h"

namespace telvane {

// The date as HTTP headers carry it (RFC 9110, 5.6.7): "Sun, 06 Nov 1994 08:49:37 GMT".
std::string httpDate(Date date);

}  // namespace telvane
