#pragma once

#include "foundation/Key.h"

// The health report that a session-stop event carries. The first two are joined with a client type's sender name by an
// underscore.
namespace telvane {

inline constexpr Key kHealthSessionsCount{"SessionsCount"};
inline constexpr Key kHealthBatchSize{"BatchSize"};
inline constexpr Key kHealthStorebagsCount{"StorebagsCount"};
inline constexpr Key kHealthStorebagsSize{"StorebagsSize"};
inline constexpr Key kHealthCalculatedMemoryUsage{"CalculatedMemoryUsage"};
inline constexpr Key kHealthProcessMemoryUsage{"ProcessMemoryUsage"};

}  // namespace telvane
