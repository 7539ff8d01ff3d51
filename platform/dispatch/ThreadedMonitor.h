#pragma once

#include <mutex>

#include "platform/Dispatch.h"

namespace telvane {

// A re-entrant lock for which workers wait with the pool's knowledge.
class ThreadedMonitor final : public Monitor {
 public:
  void lock() override;
  void unlock() override;

 private:
  std::recursive_mutex _mutex;
};

}  // namespace telvane
