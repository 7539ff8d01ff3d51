#pragma once

#include <atomic>
#include <exception>
#include <utility>

#include "client/ClientPlatform.h"
#include "client/ModuleBlocks.h"
#include "client/PendingWork.h"
#include "client/SessionQueues.h"

namespace telvane {

// What the sessions of one process share: the platform, and the rules for calling the host's own code. Made by the
// client runtime (or a test), outlives all sessions that it is handed to. Safe from any thread.
class ClientContext {
 public:
  explicit ClientContext(const ClientPlatform& platform) : _platform(platform), _moduleBlocks(platform.dispatch) {}

  const ClientPlatform& platform() const noexcept { return _platform; }
  Log& log() const noexcept { return _platform.log; }
  PendingWork& pendingWork() noexcept { return _pendingWork; }
  ModuleBlocks& moduleBlocks() noexcept { return _moduleBlocks; }
  SessionQueues& sessionQueues() noexcept { return _sessionQueues; }
  // Whether a session's step may be waiting for the caller, who must not wait for one then.
  bool maySessionsWaitForCaller() const { return _sessionQueues.isInside() || _moduleBlocks.isInside(); }

  // Calls code of the host: not any more once the process ends, since what that code uses may be gone by then. What it
  // throws goes no further than the log. operation: the name of the operation that calls out.
  template <class CallOut>
  void callOut(const char* operation, CallOut&& call) const {
    if (!mayCallOut()) return;
    try {
      std::forward<CallOut>(call)();
    } catch (const std::exception& exception) {
      log().error("{}: Exception in a block of the client: {}", operation, exception.what());
    } catch (...) {
      log().error("{}: Exception in a block of the client", operation);
    }
  }
  bool mayCallOut() const noexcept { return !_isEnding.load(std::memory_order_acquire); }
  // From now on nothing of the host is called. Released here and acquired where it is read, which is all the order that
  // a flag that never falls needs.
  void stopCallingOut() noexcept { _isEnding.store(true, std::memory_order_release); }

 private:
  const ClientPlatform _platform;
  PendingWork _pendingWork;
  ModuleBlocks _moduleBlocks;
  SessionQueues _sessionQueues;
  std::atomic<bool> _isEnding = false;
};

}  // namespace telvane
