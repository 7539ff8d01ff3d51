#pragma once

#include <string>

#include "foundation/Error.h"
#include "platform/ipc/Connection.h"

namespace telvane {

// Issues the right to read the file at an absolute path of this process, to be handed to another process with a call:
// an open descriptor, closed on exec. Never blocks, whatever the path names. Error: kPlatformErrorDomain with errno.
Result<ipc::Descriptor> issueFileExtension(const std::string& path);

// Returns the absolute path under which the daemon is to find the file: without links in its folders, through which the
// daemon does not go, but with its last name as it is, so that a link there remains one and is refused. Returns the
// path as it is when its folder cannot be followed.
std::string canonicalPathOfFile(const std::string& path);

}  // namespace telvane
