#pragma once

#include <memory>
#include <vector>

#include "platform/Dispatch.h"
#include "platform/Mutex.h"

namespace telvane {

// Tells whether a caller is inside a module block. A tick of a session waits for the blocks that it has called, so what
// waits for a tick must not do so inside a block, of whichever session: it could be waiting for itself.
//
// A running block is marked by a serial queue of its own, which it runs on without a change of thread, because queues
// know who works for them. Owned by the context of all sessions. Safe from any thread.
class ModuleBlocks {
 public:
  explicit ModuleBlocks(Dispatch& dispatch) : _dispatch(dispatch) {}

  // Runs the call as the inside of a block. REQUIRES: it does not throw.
  void run(UniqueFunction<void()> call) EXCLUDES(_mutex);
  // Whether the caller runs in a call of run().
  bool isInside() const EXCLUDES(_mutex);

 private:
  Dispatch& _dispatch;
  mutable Mutex _mutex;
  std::vector<std::shared_ptr<SerialQueue>> _running GUARDED_BY(_mutex);
};

}  // namespace telvane
