#pragma once

#include <string>

#include "foundation/Error.h"
#include "platform/ipc/Connection.h"

namespace telvane {

// Issues the right to read the file at an absolute path of this process, to be handed to another process with a call:
// an open descriptor, closed on exec. Never blocks, whatever the path names. Error: kPlatformErrorDomain with errno.
Result<ipc::Descriptor> issueFileExtension(const std::string& path);

}  // namespace telvane
