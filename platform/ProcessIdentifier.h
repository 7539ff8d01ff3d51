#pragma once

#include <cstdint>

namespace telvane {

// The number of this process.
int64_t currentProcessID();

}  // namespace telvane
