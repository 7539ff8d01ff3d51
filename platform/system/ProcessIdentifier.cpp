#include "platform/ProcessIdentifier.h"

#include <unistd.h>

namespace telvane {

int64_t currentProcessID() { return ::getpid(); }

}  // namespace telvane
