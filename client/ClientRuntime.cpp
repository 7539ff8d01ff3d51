#include "client/ClientRuntime.h"

#include <atomic>

#include "platform/process/ProcessLifetime.h"

namespace telvane {
namespace {

// The only state of the library that is not handed down. Plain atomics, so that they need neither construction nor
// destruction and can be changed in a forked child.
std::atomic<ClientRuntime*> currentRuntime = nullptr;
std::atomic<uint64_t> generation = 1;
std::atomic<bool> isWatchingProcess = false;

}  // namespace

ClientRuntime& ClientRuntime::current() {
  if (ClientRuntime* runtime = currentRuntime.load(std::memory_order_acquire)) return *runtime;
  if (!isWatchingProcess.exchange(true)) {
    callInForkedChild(&ClientRuntime::didForkInChild);
    callAtExit(&ClientRuntime::willExit);
  }
  // Two threads may come here at once. No lock settles it, since a child would inherit it held; the second one's
  // runtime, which has started nothing yet, goes again.
  std::unique_ptr<ClientRuntime> made(new ClientRuntime());
  ClientRuntime* first = nullptr;
  if (currentRuntime.compare_exchange_strong(first, made.get(), std::memory_order_acq_rel)) return *made.release();
  return *first;
}

uint64_t ClientRuntime::processGeneration() noexcept { return generation.load(std::memory_order_relaxed); }

ClientRuntime::ClientRuntime()
    : _context(ClientPlatform(_platform.clock(), _platform.dispatch(), _platform.log(), _platform.random(),
                              _platform.userDefaults(), _platform.localService())),
      _oneShotSender(_context) {}

void ClientRuntime::add(const std::shared_ptr<ClientSession>& session) {
  MutexLock lock(_mutex);
  std::erase_if(_sessions, [](const std::weak_ptr<ClientSession>& other) { return other.expired(); });
  _sessions.push_back(session);
}

void ClientRuntime::didForkInChild() {
  currentRuntime.store(nullptr, std::memory_order_relaxed);
  generation.fetch_add(1, std::memory_order_relaxed);
}

void ClientRuntime::willExit() {
  ClientRuntime* runtime = currentRuntime.load(std::memory_order_acquire);
  if (runtime == nullptr) return;
  try {
    runtime->finishPendingWork();
  } catch (...) {
    // Out of memory at the end of the process: what has not been handed over is lost.
  }
}

void ClientRuntime::finishPendingWork() {
  _context.stopCallingOut();
  std::vector<std::weak_ptr<ClientSession>> sessions;
  {
    MutexLock lock(_mutex);
    sessions.swap(_sessions);
  }
  for (const std::weak_ptr<ClientSession>& weak : sessions) {
    if (const std::shared_ptr<ClientSession> session = weak.lock()) {
      session->holdUntilDelivered(PendingWork::Hold(_context.pendingWork()));
    }
  }
  _context.pendingWork().waitUntilNone(platform().dispatch, kAnswerLinger);
  _platform.endConnections(kDeliveryLinger);
}

}  // namespace telvane
