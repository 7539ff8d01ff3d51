#include "client/UpdateAndReportServices.h"

#include <utility>

namespace telvane {

UpdateAndReportServices::UpdateAndReportServices(bool needToUpdate, bool needToReport, Block service)
    : _update(needToUpdate), _report(needToReport), _block(std::make_shared<const Block>(std::move(service))) {}

std::shared_ptr<const UpdateAndReportServices::Block> UpdateAndReportServices::block() const {
  MutexLock lock(_mutex);
  return _block;
}

void UpdateAndReportServices::setBlock(Block block) {
  auto shared = std::make_shared<const Block>(std::move(block));
  MutexLock lock(_mutex);
  // What was set before goes with the local pointer, after the lock: its end may run code of the host.
  _block.swap(shared);
}

}  // namespace telvane
