#pragma once

#include <sys/stat.h>

#include <optional>

#include "foundation/Date.h"

namespace telvane {

// When the file was made: its time of birth. On a file system that keeps none, the earlier of the times of its last
// reading and last writing: both are set when it is made, and adding to a file moves only the latter, so the answer is
// never too early and right until somebody reads the file. Nothing when the system tells none of them.
std::optional<Date> creationDateOf(const struct statx& status);

}  // namespace telvane
