#pragma once

#include <string_view>

#include "foundation/Error.h"

namespace telvane {

// A file that is open for adding at its end. Closed by letting it go. Safe from any thread: what one call adds stands
// together.
class AppendableFile {
 public:
  virtual ~AppendableFile() = default;
  // Adds all of it, or returns an error. What a failed call had added is taken back, unless somebody else has added
  // something since.
  virtual Result<void> append(std::string_view text) = 0;
};

}  // namespace telvane
