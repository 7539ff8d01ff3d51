#include "tests/support/SimulatedServiceHub.h"

#include <cerrno>

#include "tests/support/SimulatedLocalService.h"

namespace telvane::testing {

void SimulatedServiceHub::setLauncher(const std::string& serviceName, std::function<void()> launcher) {
  _launchers[serviceName].start = std::move(launcher);
}

void SimulatedServiceHub::denyLookUp(const std::string& processName, const std::string& serviceName, int errorNumber) {
  _denials[{processName, serviceName}] = errorNumber;
}

std::unique_ptr<ipc::Service> SimulatedServiceHub::newService(std::shared_ptr<SimulatedPeer> peer) {
  return std::make_unique<SimulatedLocalService>(*this, std::move(peer));
}

void SimulatedServiceHub::cutLines(const std::shared_ptr<SimulatedPeer>& peer) {
  std::vector<End> orphans;
  for (auto entry = _listeners.begin(); entry != _listeners.end();) {
    const auto state = entry->second;
    if (state->peer != peer) {
      ++entry;
      continue;
    }
    state->isStopped = true;
    for (End& client : std::exchange(state->backlog, {})) orphans.push_back(std::move(client));
    entry = _listeners.erase(entry);
  }
  for (const End& end : endsOf(peer)) end->cutLine();
  for (const End& client : orphans) client->lineLost();
}

void SimulatedServiceHub::releaseEnds(const std::shared_ptr<SimulatedPeer>& peer) {
  for (const End& end : endsOf(peer)) end->vanish();
}

Result<std::shared_ptr<SimulatedServiceHub::ListenerState>> SimulatedServiceHub::openListener(
    std::shared_ptr<SimulatedPeer> peer, const std::string& serviceName) {
  if (isServed(serviceName)) {
    return Error::withDescription(kPlatformErrorDomain, EADDRINUSE, serviceName + " is served by another process");
  }
  auto state = std::make_shared<ListenerState>();
  state->serviceName = serviceName;
  state->queue = peer->dispatch->newSimulatedQueue("listener " + serviceName);
  state->peer = std::move(peer);
  _listeners.emplace(serviceName, state);
  return state;
}

void SimulatedServiceHub::resumeListener(const std::shared_ptr<ListenerState>& state) {
  if (std::exchange(state->isResumed, true)) return;
  for (const End& client : std::exchange(state->backlog, {})) arrive(state, client);
}

void SimulatedServiceHub::stopListener(const std::shared_ptr<ListenerState>& state) {
  if (std::exchange(state->isStopped, true)) return;
  _listeners.erase(state->serviceName);
  for (const End& client : std::exchange(state->backlog, {})) client->becomeInvalid(ECONNREFUSED);
}

std::shared_ptr<ipc::Connection> SimulatedServiceHub::newConnection(std::shared_ptr<SimulatedPeer> peer,
                                                                    const std::string& serviceName) {
  return std::make_shared<SimulatedConnection>(
      newEnd(std::move(peer), SimulatedConnectionEnd::Side::Connecting, serviceName));
}

void SimulatedServiceHub::connect(End client) {
  std::string label = "connecting to " + client->serviceName();
  _scheduler.schedule(SimulatedScheduler::kNoProcess, std::move(label),
                      [this, client = std::move(client)] { tryToConnect(client); });
}

int SimulatedServiceHub::checkLookUp(const SimulatedPeer& peer, const std::string& serviceName) const {
  const auto denial = _denials.find({peer.name, serviceName});
  return denial == _denials.end() ? 0 : denial->second;
}

SimulatedServiceHub::End SimulatedServiceHub::newEnd(std::shared_ptr<SimulatedPeer> peer,
                                                     SimulatedConnectionEnd::Side side,
                                                     const std::string& serviceName) {
  auto end = std::make_shared<SimulatedConnectionEnd>(*this, std::move(peer), side, serviceName);
  std::erase_if(_ends, [](const auto& known) { return known.expired(); });
  _ends.push_back(end);
  return end;
}

std::vector<SimulatedServiceHub::End> SimulatedServiceHub::endsOf(const std::shared_ptr<SimulatedPeer>& peer) const {
  std::vector<End> ends;
  for (const auto& known : _ends) {
    const End end = known.lock();
    if (end != nullptr && end->sharedPeer() == peer) ends.push_back(end);
  }
  return ends;
}

void SimulatedServiceHub::tryToConnect(const End& client) {
  if (!client->peer().isAlive) return;
  if (const int denial = checkLookUp(client->peer(), client->serviceName())) return client->becomeInvalid(denial);
  if (const auto found = _listeners.find(client->serviceName()); found != _listeners.end()) {
    return arrive(found->second, client);
  }
  const auto launcher = _launchers.find(client->serviceName());
  if (launcher == _launchers.end()) return client->becomeInvalid(ENOENT);
  launch(launcher->second, client);
}

void SimulatedServiceHub::launch(Launcher& launcher, const End& client) {
  launcher.waiting.push_back(client);
  if (std::exchange(launcher.isRunning, true)) return;
  launcher.start();
  launcher.isRunning = false;
  for (const End& waiting : std::exchange(launcher.waiting, {})) {
    const auto found = _listeners.find(waiting->serviceName());
    if (found == _listeners.end()) {
      waiting->becomeInvalid(ENOENT);
    } else {
      arrive(found->second, waiting);
    }
  }
}

void SimulatedServiceHub::arrive(const std::shared_ptr<ListenerState>& state, const End& client) {
  // Until its turn on the queue it counts as one that nobody has taken up.
  state->backlog.push_back(client);
  if (!state->isResumed) return;
  state->queue->post([this, state, client] {
    if (std::erase(state->backlog, client) != 0) accept(state, client);
  });
}

void SimulatedServiceHub::accept(const std::shared_ptr<ListenerState>& state, const End& client) {
  if (!client->peer().isAlive || state->delegate == nullptr) return client->becomeInvalid(ECONNREFUSED);
  const End server = newEnd(state->peer, SimulatedConnectionEnd::Side::Accepting, state->serviceName);
  auto toClient = std::make_shared<SimulatedChannel>(_scheduler, _latency, state->peer, client);
  auto toServer = std::make_shared<SimulatedChannel>(_scheduler, _latency, client->sharedPeer(), server);
  toClient->hold();
  client->attach(toClient, toServer, state->peer);
  server->attach(toServer, toClient, client->sharedPeer());
  auto handle = std::make_shared<SimulatedConnection>(server);
  if (state->delegate->listener(*state->listener, handle)) {
    server->keepHandle(std::move(handle));
    return toClient->open(SimulatedMessage{SimulatedMessage::Kind::Accepted});
  }
  server->becomeInvalid(ECONNREFUSED);
  toClient->open(SimulatedMessage{SimulatedMessage::Kind::Refused});
}

}  // namespace telvane::testing
