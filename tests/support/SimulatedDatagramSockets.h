#pragma once

#include "platform/DatagramSocket.h"
#include "tests/support/SimulatedDatagramNetwork.h"
#include "tests/support/SimulatedDispatch.h"

namespace telvane::testing {

// UDP sockets of one simulated process. Part of its SimulatedPlatform. A process that has ended hears of nothing.
class SimulatedDatagramSockets final : public DatagramSockets {
 public:
  // REQUIRES: both outlive this object and its sockets.
  SimulatedDatagramSockets(SimulatedDatagramNetwork& network, SimulatedDispatch& dispatch)
      : _network(network), _dispatch(dispatch) {}
  Result<std::unique_ptr<DatagramSocket>> newSocket() override;

 private:
  SimulatedDatagramNetwork& _network;
  SimulatedDispatch& _dispatch;
};

}  // namespace telvane::testing
