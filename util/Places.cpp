#include "util/Places.h"

#include <atomic>

namespace telvane {

struct Places::Taken {
  std::atomic<uint32_t> count{0};
};

std::shared_ptr<Places::Taken> Places::newTaken() { return std::make_shared<Taken>(); }

Places::Place Places::take() {
  if (_taken->count.fetch_add(1) >= _most) {
    _taken->count.fetch_sub(1);
    return nullptr;
  }
  return {static_cast<const void*>(this), [taken = _taken](const void*) { taken->count.fetch_sub(1); }};
}

}  // namespace telvane
