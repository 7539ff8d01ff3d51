#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "client/ClientContext.h"
#include "client/ClientSession.h"
#include "client/OneShotSender.h"
#include "interfaces/DefaultsKeys.h"
#include "platform/process/LibraryPlatform.h"

namespace telvane {

// What the library is in one process: its platform and what all sessions share. Made on first use, because a function
// of a library has no one to hand it anything, and never destroyed, because threads of the library and of the host may
// use it until the very end. A forked child forgets its parent's, whose threads it does not have, and makes its own on
// first use.
//
// When the process ends, what was sent is given two seconds in all to reach the daemon. Safe from any thread.
class ClientRuntime {
 public:
  // At the end of the process: for the answers that tell that sessions have been heard, and for the last bytes of
  // connections that were let go.
  static constexpr std::chrono::milliseconds kAnswerLinger{1500};
  static constexpr std::chrono::milliseconds kDeliveryLinger{500};

  // Returns this process's runtime.
  static ClientRuntime& current();
  // A number that is another one in each forked child: what was made under another number belongs to an ancestor.
  static uint64_t processGeneration() noexcept;

  ClientContext& context() noexcept { return _context; }
  OneShotSender& oneShotSender() noexcept { return _oneShotSender; }
  const ClientPlatform& platform() const noexcept { return _context.platform(); }

  // Remembers a session for the end of the process.
  void add(const std::shared_ptr<ClientSession>& session);

 private:
  ClientRuntime();
  static void didForkInChild();
  static void willExit();
  void finishPendingWork();

  LibraryPlatform _platform{kTelvaneDefaultsSuite};
  ClientContext _context;
  OneShotSender _oneShotSender;

  Mutex _mutex;
  std::vector<std::weak_ptr<ClientSession>> _sessions GUARDED_BY(_mutex);
};

}  // namespace telvane
