#include "tests/support/SimulatedDatagramSockets.h"

#include <cerrno>

namespace telvane::testing {

Result<std::unique_ptr<DatagramSocket>> SimulatedDatagramSockets::newSocket() {
  return Error::withDescription(kPlatformErrorDomain.string(), ENOSYS, "there are no UDP sockets here");
}

}  // namespace telvane::testing
