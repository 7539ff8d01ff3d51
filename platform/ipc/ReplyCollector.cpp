#include "platform/ipc/ReplyCollector.h"

#include <utility>

#include "platform/ipc/WireCoding.h"

namespace telvane::ipc {

// The callable inside a reply block. Whoever destroys it unanswered has dropped the call.
class ReplyCollector::Responder {
 public:
  Responder(std::shared_ptr<ReplyCollector> collector, uint32_t replyID) noexcept
      : _collector(std::move(collector)), _replyID(replyID) {}
  Responder(Responder&& other) noexcept = default;
  Responder& operator=(Responder&&) = delete;
  ~Responder() {
    if (_collector) _collector->add({.replyID = _replyID, .isDropped = true});
  }

  void operator()(Array values) {
    const auto collector = std::exchange(_collector, nullptr);
    if (!collector) return;
    const auto measure = wirecoding::measure(values);
    // The caller's error handler is better than no answer at all.
    if (measure.isTooDeep) return collector->add({.replyID = _replyID, .isDropped = true, .isTooDeep = true});
    collector->add({.replyID = _replyID,
                    .values = std::move(values),
                    .wireBytes = measure.wireBytes,
                    .textBytes = measure.textBytes});
  }

 private:
  std::shared_ptr<ReplyCollector> _collector;
  uint32_t _replyID;
};

ReplyBlock ReplyCollector::newBlock(uint32_t replyID) { return Responder(shared_from_this(), replyID); }

void ReplyCollector::add(Reply reply) {
  {
    MutexLock lock(_mutex);
    if (!_isClosed) {
      _replies.push_back(std::move(reply));
      return;
    }
  }
  _onLate(std::move(reply));
}

Replies ReplyCollector::close() {
  MutexLock lock(_mutex);
  _isClosed = true;
  return std::move(_replies);
}

}  // namespace telvane::ipc
