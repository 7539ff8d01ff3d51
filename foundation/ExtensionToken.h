#pragma once

#include <cstdint>
#include <optional>
#include <vector>

namespace telvane {

// The user and groups as whom a process acts, as the kernel tells them of the other end of a local connection.
struct PeerIdentity {
  uint32_t userID = 0;
  uint32_t groupID = 0;
  std::vector<uint32_t> supplementaryGroups;
};

// The right to read one file, as a client hands it over with a call: the descriptor of the file that it opened, and who
// it is. Worth something to SandboxExtensions only, which consumes it.
struct ExtensionToken {
  // Borrowed from the call that brought it; -1 when none came.
  int descriptor = -1;
  // Absent when nobody knows, who may then do nothing that its descriptor does not allow by itself.
  std::optional<PeerIdentity> holder;
};

}  // namespace telvane
