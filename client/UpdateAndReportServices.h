#pragma once

#include <memory>

#include "client/include/telvane/Telvane.h"
#include "platform/Mutex.h"

namespace telvane {

// One module that a session asks for its metrics: what it wants to be called for, and its block. Made when the module
// is registered; shared by its session and by the calls that are under way. Safe from any thread.
class UpdateAndReportServices {
 public:
  using Block = Telvane::PeriodicTaskBlock;

  // service: what is called; must not be empty.
  UpdateAndReportServices(bool needToUpdate, bool needToReport, Block service);

  // Whether the module is called to update its state.
  bool update() const noexcept { return _update; }
  // Whether the module contributes to the report.
  bool report() const noexcept { return _report; }
  // Returns the block, which stays usable although another one is set.
  std::shared_ptr<const Block> block() const EXCLUDES(_mutex);
  // Sets the block of later calls; must not be empty.
  void setBlock(Block block) EXCLUDES(_mutex);

 private:
  // Constant after construction.
  const bool _update;
  const bool _report;

  mutable Mutex _mutex;
  std::shared_ptr<const Block> _block GUARDED_BY(_mutex);
};

}  // namespace telvane
