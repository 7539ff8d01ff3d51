#include "tests/support/SimulatedSerialQueue.h"

#include <utility>

namespace telvane::testing {

class SimulatedSerialQueue::Hold {
 public:
  explicit Hold(SimulatedSerialQueue& queue) : _queue(queue) { _queue._holder = _queue._scheduler.current(); }
  ~Hold() { _queue.release(); }
  Hold(const Hold&) = delete;
  Hold& operator=(const Hold&) = delete;

 private:
  SimulatedSerialQueue& _queue;
};

SimulatedSerialQueue::SimulatedSerialQueue(SimulatedScheduler& scheduler, SimulatedScheduler::ProcessID process,
                                           std::string label, std::string nameInReports)
    : _scheduler(scheduler), _process(process), _label(std::move(label)), _nameInReports(std::move(nameInReports)) {}

void SimulatedSerialQueue::async(Job job) {
  post(std::move(job));
  _scheduler.callPoint();
}

void SimulatedSerialQueue::sync(UniqueFunction<void()> job) {
  if (isCurrent() || _scheduler.hasEnded(_process)) return job();
  if (_holder != nullptr || !_entries.empty()) waitForTurn();
  Hold hold(*this);
  job();
}

void SimulatedSerialQueue::asyncAfter(std::chrono::nanoseconds delay, Job job) {
  _scheduler.startTimer(_process, delay,
                        [self = shared_from_this(), job = std::move(job)]() mutable { self->post(std::move(job)); });
}

bool SimulatedSerialQueue::isCurrent() const noexcept { return _holder != nullptr && _holder == _scheduler.current(); }

void SimulatedSerialQueue::post(Job job) {
  if (_scheduler.hasEnded(_process)) return;
  _entries.push_back(Entry{std::move(job)});
  startNext();
}

void SimulatedSerialQueue::clear() {
  // Kept until the end, since what the jobs hold may come back here while it goes.
  std::deque<Entry> dropped = std::exchange(_entries, {});
  for (Entry& entry : dropped) {
    if (entry.turn != nullptr) _entries.push_back(std::exchange(entry, Entry()));
  }
  startNext();
}

void SimulatedSerialQueue::waitForTurn() {
  SimulatedWait turn("its turn on queue " + _nameInReports, &_holder);
  _entries.push_back(Entry{Job(), &turn, _scheduler.current()});
  startNext();
  try {
    _scheduler.wait(turn);
  } catch (...) {
    std::erase_if(_entries, [&turn](const Entry& entry) { return entry.turn == &turn; });
    if (isCurrent()) release();
    throw;
  }
}

void SimulatedSerialQueue::release() {
  _holder = nullptr;
  startNext();
}

void SimulatedSerialQueue::startNext() {
  if (_holder != nullptr || _isScheduled || _entries.empty()) return;
  if (Entry& first = _entries.front(); first.turn != nullptr) {
    SimulatedWait& turn = *first.turn;
    _holder = first.strand;
    _entries.pop_front();
    _scheduler.answer(turn);
    return;
  }
  if (_scheduler.hasEnded(_process)) return;
  _isScheduled = true;
  _scheduler.schedule(_process, _nameInReports, [self = shared_from_this()] { self->runNext(); });
}

void SimulatedSerialQueue::runNext() {
  _isScheduled = false;
  if (_holder != nullptr || _entries.empty() || _entries.front().turn != nullptr) return startNext();
  Hold hold(*this);
  // Destroyed before the hold, so that what the job owns goes on this queue too.
  Entry entry = std::move(_entries.front());
  _entries.pop_front();
  entry.job();
}

}  // namespace telvane::testing
