#pragma once

#include "platform/DatagramSocket.h"
#include "tests/support/SimulatedDatagramNetwork.h"
#include "tests/support/SimulatedDispatch.h"

namespace telvane::testing {

// UDP sockets of one simulated process. Part of its SimulatedPlatform.
class SimulatedDatagramSockets final : public DatagramSockets {
 public:
  // REQUIRES: both outlive this object.
  SimulatedDatagramSockets(SimulatedDatagramNetwork& network, SimulatedDispatch& dispatch)
      : _network(network), _dispatch(dispatch) {}
  Result<std::unique_ptr<DatagramSocket>> newSocket() override;

 private:
  [[maybe_unused]] SimulatedDatagramNetwork& _network;
  [[maybe_unused]] SimulatedDispatch& _dispatch;
};

}  // namespace telvane::testing
