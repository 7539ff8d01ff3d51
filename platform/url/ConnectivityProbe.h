#pragma once

namespace telvane {

// Tells whether it makes sense to try the network again. Asked on the loop's thread after a failed try; must not block.
class ConnectivityProbe {
 public:
  virtual ~ConnectivityProbe() = default;
  virtual bool hasNetwork() = 0;
};

// Counts any interface that is up and has an address as a network, the loopback excepted.
class InterfaceConnectivityProbe final : public ConnectivityProbe {
 public:
  // Returns true also when the interfaces cannot be listed: then only a try can tell.
  bool hasNetwork() override;
};

}  // namespace telvane
