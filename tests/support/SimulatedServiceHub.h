#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/ipc/Service.h"
#include "tests/support/SimulatedConnectionEnd.h"

namespace telvane::testing {

// The local services of a simulated machine: who serves which name, and the lines between processes. Each process sees
// it through an ipc::Service of its own.
class SimulatedServiceHub {
 public:
  explicit SimulatedServiceHub(SimulatedScheduler& scheduler) : _scheduler(scheduler) {}

  // How long messages of connections made from here on are under way; no time at all by default.
  void setLatency(SimulatedLatency latency) { _latency = latency; }
  // Started when somebody connects to the name while nobody serves it, once at a time, on a strand of no process; when
  // it returns, the name should be served.
  void setLauncher(const std::string& serviceName, std::function<void()> launcher);
  // Makes the service invisible to processes of that name; errorNumber says why, 0 takes it back.
  void denyLookUp(const std::string& processName, const std::string& serviceName, int errorNumber);
  bool isServed(const std::string& serviceName) const { return _listeners.count(serviceName) != 0; }

  std::unique_ptr<ipc::Service> newService(std::shared_ptr<SimulatedPeer> peer);
  // The two steps of a process's end: its lines break; what its ends hold is let go.
  void cutLines(const std::shared_ptr<SimulatedPeer>& peer);
  void releaseEnds(const std::shared_ptr<SimulatedPeer>& peer);

  // For connections and listeners.
  using End = std::shared_ptr<SimulatedConnectionEnd>;
  struct ListenerState {
    std::string serviceName;
    std::shared_ptr<SimulatedPeer> peer;
    std::shared_ptr<SimulatedSerialQueue> queue;
    ipc::Listener* listener = nullptr;
    ipc::ListenerDelegate* delegate = nullptr;
    bool isResumed = false;
    bool isStopped = false;
    std::vector<End> backlog;
  };
  Result<std::shared_ptr<ListenerState>> openListener(std::shared_ptr<SimulatedPeer> peer,
                                                      const std::string& serviceName);
  void resumeListener(const std::shared_ptr<ListenerState>& state);
  void stopListener(const std::shared_ptr<ListenerState>& state);
  std::shared_ptr<ipc::Connection> newConnection(std::shared_ptr<SimulatedPeer> peer, const std::string& serviceName);
  void connect(End client);
  int checkLookUp(const SimulatedPeer& peer, const std::string& serviceName) const;

 private:
  struct Launcher {
    std::function<void()> start;
    bool isRunning = false;
    std::vector<End> waiting;
  };

  End newEnd(std::shared_ptr<SimulatedPeer> peer, SimulatedConnectionEnd::Side side, const std::string& serviceName);
  std::vector<End> endsOf(const std::shared_ptr<SimulatedPeer>& peer) const;
  void tryToConnect(const End& client);
  void launch(Launcher& launcher, const End& client);
  void arrive(const std::shared_ptr<ListenerState>& state, const End& client);
  void accept(const std::shared_ptr<ListenerState>& state, const End& client);

  SimulatedScheduler& _scheduler;
  SimulatedLatency _latency;
  std::map<std::string, std::shared_ptr<ListenerState>> _listeners;
  std::map<std::string, Launcher> _launchers;
  std::map<std::pair<std::string, std::string>, int> _denials;
  std::vector<std::weak_ptr<SimulatedConnectionEnd>> _ends;
};

}  // namespace telvane::testing
