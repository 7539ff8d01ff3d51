#pragma once

#include <string_view>

#include "foundation/Error.h"
#include "platform/BodyFile.h"

namespace telvane {

// A file that is written once and then read: it has no name that anybody could open it by, and goes with this object,
// also when the process is killed. Appended to by one thread; safe from any once that has ended.
class TemporaryFile : public BodyFile {
 public:
  // Adds all of it, or returns an error; the file is of no use then.
  virtual Result<void> append(std::string_view bytes) = 0;
};

}  // namespace telvane
