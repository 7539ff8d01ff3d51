#include "platform/ipc/CallExecutor.h"

#include <utility>

namespace telvane::ipc {

void CallExecutor::setObject(std::shared_ptr<ExportedObject> object) {
  MutexLock lock(_mutex);
  _object.swap(object);
}

void CallExecutor::releaseObject() { setObject(nullptr); }

void CallExecutor::resume() {
  MutexLock lock(_mutex);
  _isResumed = true;
  if (!_items.empty()) schedule();
}

void CallExecutor::add(std::vector<IncomingCall> calls, Executed onExecuted, ReplyCollector::LateReply onLate) {
  MutexLock lock(_mutex);
  if (_isClosed) return;
  _items.push_back({std::move(calls), std::move(onExecuted), std::move(onLate), {}});
  schedule();
}

void CallExecutor::addBarrier(Job job) {
  MutexLock lock(_mutex);
  _items.push_back({{}, {}, {}, std::move(job)});
  // A connection that was never resumed can still be invalidated.
  if (_isClosed) _isResumed = true;
  schedule();
}

void CallExecutor::close() {
  std::deque<Item> dropped;
  MutexLock lock(_mutex);
  _isClosed = true;
  for (auto& item : std::exchange(_items, {})) (item.barrier ? _items : dropped).push_back(std::move(item));
  _isResumed = true;
  // A batch that was waiting for the gate has gone, and nothing that is left needs to.
  _isScheduled = false;
  if (!_items.empty()) schedule();
}

bool CallExecutor::isExecuting() const {
  MutexLock lock(_mutex);
  return _isExecuting;
}

// The gate may run the job at once or much later, on whatever thread; it only hands over to the queue.
void CallExecutor::schedule() {
  if (_isScheduled || !_isResumed) return;
  _isScheduled = true;
  Job run = [self = shared_from_this()] { self->_queue->async([self] { self->runNext(); }); };
  if (_gate != nullptr && !_items.front().barrier) {
    _gate->whenOpen(std::move(run));
  } else {
    run();
  }
}

void CallExecutor::runNext() {
  Item item;
  {
    MutexLock lock(_mutex);
    _isScheduled = false;
    if (_items.empty()) return;
    item = std::move(_items.front());
    _items.pop_front();
    _isExecuting = !item.barrier;
  }
  if (item.barrier) {
    item.barrier();
  } else {
    execute(item);
  }
  {
    MutexLock lock(_mutex);
    _isExecuting = false;
    if (!_items.empty()) schedule();
  }
  if (_isClosed && !item.barrier) _onQuiet();
}

void CallExecutor::execute(Item& item) {
  const auto object = [this] {
    MutexLock lock(_mutex);
    return _object;
  }();
  const auto collector = std::make_shared<ReplyCollector>(std::move(item.onLate));
  for (auto& call : item.calls) {
    ReplyBlock reply;
    if (call.replyID != 0) reply = collector->newBlock(call.replyID);
    if (object && !_isClosed) object->invoke(std::move(call.invocation), std::move(reply));
  }
  item.onExecuted(collector->close());
}

}  // namespace telvane::ipc
