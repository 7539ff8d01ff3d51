#include "tools/StillDispatch.h"

#include <deque>
#include <utility>

namespace telvane {
namespace {

class StillSerialQueue final : public SerialQueue, public std::enable_shared_from_this<StillSerialQueue> {
 public:
  explicit StillSerialQueue(std::string label) : _label(std::move(label)) {}

  // A job may hold the last thing that held the queue.
  void async(Job job) override {
    const auto self = shared_from_this();
    _waiting.push_back(std::move(job));
    if (!_isBusy) runWaiting();
  }
  void sync(UniqueFunction<void()> job) override {
    const auto self = shared_from_this();
    const bool wasBusy = std::exchange(_isBusy, true);
    job();
    _isBusy = wasBusy;
    if (!_isBusy) runWaiting();
  }
  void asyncAfter(std::chrono::nanoseconds, Job) override {}
  bool isCurrent() const noexcept override { return _isBusy; }
  const std::string& label() const noexcept override { return _label; }

 private:
  void runWaiting() {
    _isBusy = true;
    while (!_waiting.empty()) {
      Job job = std::move(_waiting.front());
      _waiting.pop_front();
      job();
    }
    _isBusy = false;
  }

  const std::string _label;
  std::deque<Job> _waiting;
  bool _isBusy = false;
};

class StillConcurrentQueue final : public ConcurrentQueue {
 public:
  void async(Job job) override { job(); }
};

class StillTimer final : public Timer {
 public:
  StillTimer(std::shared_ptr<SerialQueue> queue, Job onCancel)
      : _queue(std::move(queue)), _onCancel(std::move(onCancel)) {}
  ~StillTimer() override { StillTimer::cancel(); }

  void cancel() override {
    if (_queue == nullptr) return;
    const std::shared_ptr<SerialQueue> queue = std::move(_queue);
    if (_onCancel) queue->async(std::move(_onCancel));
  }

 private:
  std::shared_ptr<SerialQueue> _queue;  // null once cancelled
  Job _onCancel;
};

}  // namespace

std::shared_ptr<SerialQueue> StillDispatch::newSerialQueue(std::string label, QualityOfService) {
  return std::make_shared<StillSerialQueue>(std::move(label));
}

std::shared_ptr<ConcurrentQueue> StillDispatch::newConcurrentQueue(std::string, QualityOfService) {
  return std::make_shared<StillConcurrentQueue>();
}

std::unique_ptr<Timer> StillDispatch::newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds,
                                               std::chrono::nanoseconds, Job, Job onCancel) {
  return std::make_unique<StillTimer>(std::move(queue), std::move(onCancel));
}

}  // namespace telvane
