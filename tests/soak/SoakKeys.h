#pragma once

#include "foundation/Key.h"

namespace telvane::testing {

// What a soak's events carry, and how they are told apart.
inline constexpr Key kSoakNumber{"soakNumber"};
inline constexpr int kSoakCategory = 21;
inline constexpr int kSoakBarredCategory = 22;

}  // namespace telvane::testing
