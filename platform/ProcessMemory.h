#pragma once

#include <cstdint>

namespace telvane {

// The memory that only this process uses, in bytes; 0 when the system does not tell.
uint64_t taskMemory();

// The number of this process.
int64_t currentProcessID();

}  // namespace telvane
