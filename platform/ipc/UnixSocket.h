#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

#include "foundation/Error.h"
#include "platform/ipc/Connection.h"

// Unix stream sockets by path. Paths may be longer than a socket address holds. Every descriptor is closed on exec and
// does not block.
namespace telvane::ipc::unixsocket {

// Who connected, as the kernel noted it when the connection was made. The executable is read afterwards and empty when
// the process has gone or hides it.
struct Peer {
  pid_t processID = 0;
  uid_t userID = 0;
  gid_t groupID = 0;
  std::vector<gid_t> supplementaryGroups;
  std::string executable;

  // "pid 123 (/usr/bin/app)"
  std::string description() const;
};

// Begins to listen at the path, where everybody may connect. Makes the folder; replaces a socket that nobody listens
// on. Fails with EADDRINUSE when somebody does.
Result<Descriptor> listenAt(const std::string& path);
// Connects without waiting: EAGAIN when the listener has too many waiting.
Result<Descriptor> connectTo(const std::string& path);
// Takes the next connection that waits: EAGAIN when there is none.
Result<Descriptor> acceptFrom(int listening);
// Returns the listening socket that the service manager passed for this name, or the only one without a name.
std::optional<Descriptor> passedSocket(const std::string& name);
Peer peerOf(int socket);
// Returns 0 when this process may connect to the socket, or nothing is there; else EACCES or EPERM.
int checkAccess(const std::string& path);
// What tells one socket file from a later one at the same path: device and inode; empty when there is none.
std::string identityOf(const std::string& path);

}  // namespace telvane::ipc::unixsocket
