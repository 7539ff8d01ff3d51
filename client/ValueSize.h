#pragma once

#include <cstdint>

#include "foundation/Value.h"

namespace telvane {

// Estimates the bytes of memory that a value and all it contains take, for bounding what waits. Shared storage counts
// each time it is met.
uint64_t estimatedSize(const Value& value) noexcept;
uint64_t estimatedSize(const Dictionary& dictionary) noexcept;
uint64_t estimatedSize(const Array& array) noexcept;

}  // namespace telvane
