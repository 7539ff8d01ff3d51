#include "backends/WaitedPost.h"

#include <utility>

#include "platform/Mutex.h"

namespace telvane {

struct WaitedPost::State {
  explicit State(std::shared_ptr<Semaphore> made) : semaphore(std::move(made)) {}

  const std::shared_ptr<Semaphore> semaphore;
  Mutex mutex;
  Answer answer GUARDED_BY(mutex);
};

// What the post's completion holds. It wakes the waiter when it goes, whether or not it was called: a helper that is no
// longer active lets completions go without a word, and the waiter has all the time in the world.
class WaitedPost::Giver {
 public:
  explicit Giver(std::shared_ptr<State> state) : _state(std::move(state)) {}
  Giver(Giver&&) noexcept = default;
  Giver& operator=(Giver&&) = delete;
  ~Giver() {
    if (_state != nullptr) _state->semaphore->signal();
  }
  void give(const Data& data, const URLResponse* response, const std::optional<Error>& error) {
    MutexLock lock(_state->mutex);
    // A server may well answer nothing; without one there are no data either.
    if (!data.empty() || (response != nullptr && !error.has_value())) _state->answer.data = data;
    _state->answer.error = error;
  }

 private:
  std::shared_ptr<State> _state;
};

WaitedPost::WaitedPost(Dispatch& dispatch) : _state(std::make_shared<State>(dispatch.newSemaphore(0))) {}

const std::shared_ptr<Semaphore>& WaitedPost::semaphore() const noexcept { return _state->semaphore; }

WaitedPost::Answer WaitedPost::postAndWait(ReportingSessionConnectivityInterface& helper, URLRequest request) {
  helper.postURLRequestWithCompletionHandler(
      std::move(request),
      [giver = Giver(_state)](const Data& data, const URLResponse* response,
                              const std::optional<Error>& error) mutable { giver.give(data, response, error); });
  _state->semaphore->wait();
  // Taken out: an answer that comes after the wait was given up must not wait for what is done with it here.
  MutexLock lock(_state->mutex);
  return std::exchange(_state->answer, {});
}

}  // namespace telvane
