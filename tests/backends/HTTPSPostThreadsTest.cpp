// What other threads may do to a backend while its session sends.
#include <atomic>
#include <chrono>

#include "interfaces/EventKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/dispatch/SystemClock.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "tests/backends/BackendFixture.h"
#include "tests/support/PlatformWith.h"

namespace telvane::testing {
namespace {

// The fixture's platform, on threads.
class HTTPSPostThreadsTest : public BackendFixture {
 protected:
  std::shared_ptr<TelvaneBackend> threadedBackend() {
    auto backend = TelvaneBackend::newBackendWithName(_threadedContext, kName, profile(), _productFamily, _clientType);
    backend->setCompType(_clientType);
    backend->setRequireUserInfo(true);
    backend->setBatchEvents(true);
    backend->setUserInfoDict(_userInfo);
    backend->setReportingSessionConnectivityDelegate(_helper);
    backend->updateState();
    return backend;
  }
  // Runs the job again and again on a thread of its own until stop().
  void keepDoing(std::function<void()> job) {
    ++_running;
    _queue->async([this, job = std::move(job)] {
      while (!_isStopped) job();
      if (--_running == 0) _allStopped->signal();
    });
  }
  void stop() {
    _isStopped = true;
    ASSERT_TRUE(_allStopped->waitFor(std::chrono::seconds(60))) << "the other threads do not end";
  }

  SystemClock _clock;
  RecordingLog _log{nullptr, "test", LogLevel::Error};
  ThreadedDispatch _dispatch;
  Platform _threaded = platformWith(process().platform(), _clock, _log, _dispatch);
  ProcessContext _threadedContext{_threaded};
  std::shared_ptr<RecordingConnectivity> _helper = std::make_shared<RecordingConnectivity>();
  std::shared_ptr<ConcurrentQueue> _queue = _dispatch.newConcurrentQueue("others", QualityOfService::Default);
  std::shared_ptr<Semaphore> _allStopped = _dispatch.newSemaphore(0);
  std::atomic<int> _running{0};
  std::atomic<bool> _isStopped{false};
};

TEST_F(HTTPSPostThreadsTest, losesNoEventWhileOtherSessionsReachIn) {
  constexpr int kEvents = 3000;
  const auto backend = threadedBackend();
  backend->setCombinedSessionIDString("own");
  std::atomic<uint64_t> largest{0};
  keepDoing([backend, &largest] { largest = std::max(largest.load(), backend->batchedEventsSize()); });
  keepDoing([backend] { backend->setCorrelatedSessionID("parent.own"); });
  keepDoing([backend] {
    backend->setSamplingThreshold(backend->samplingThreshold());
    backend->setState(backend->state());
  });
  for (int n = 0; n < kEvents; ++n) backend->sendMessage({{Key("n"), n}}, _clock.now(), 7, 2, 0);
  stop();
  backend->flushMessagesWithCompletion(nullptr);
  std::vector<int64_t> numbers;
  for (size_t index = 0; index < _helper->count(); ++index) {
    for (const Value& event : _helper->events(index)) {
      numbers.push_back((*event.dictionary())["n"].integerValue());
      EXPECT_NE((*event.dictionary())[kEventSessionID].text().find("own"), std::string_view::npos);
    }
  }
  ASSERT_EQ(numbers.size(), static_cast<size_t>(kEvents));
  for (int n = 0; n < kEvents; ++n) ASSERT_EQ(numbers[static_cast<size_t>(n)], n) << "events are out of order";
  EXPECT_GT(largest, 0u);
}

TEST_F(HTTPSPostThreadsTest, anAnswerOfTheServerMayComeAtAnyTime) {
  const auto backend = threadedBackend();
  std::atomic<size_t> answered{0};
  keepDoing([this, &answered] {
    if (answered < _helper->count()) _helper->answer(answered++, 200);
  });
  std::atomic<int> completions{0};
  constexpr int kFlushes = 200;
  for (int n = 0; n < kFlushes; ++n) {
    backend->sendMessage({{Key("n"), n}}, _clock.now(), 7, 2, 0);
    backend->flushMessagesWithCompletion([&completions](std::optional<String> text, std::optional<Error> error) {
      if (text.has_value() && !error.has_value()) ++completions;
    });
  }
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(60);
  while (completions < kFlushes && std::chrono::steady_clock::now() < deadline) {
  }
  stop();
  EXPECT_EQ(completions, kFlushes);
  EXPECT_EQ(backend->state(), TelvaneBackendStateEnabled);
}

// The batch is posted from the state queue, on which the identifier is read.
TEST_F(HTTPSPostThreadsTest, aBatchCarriesTheSessionIdentifier) {
  _client.set(kClientEntryIncludeSessionID, 1);
  const auto backend = threadedBackend();
  backend->setCombinedSessionIDString("own");
  backend->sendMessage({{Key("n"), 1}}, _clock.now(), 7, 2, 0);
  EXPECT_EQ(_helper->count(), 0u) << "the event must wait";
  backend->flushMessagesWithCompletion(nullptr);
  ASSERT_EQ(_helper->count(), 1u);
  EXPECT_EQ(RecordingConnectivity::header(_helper->request(0), "X-TVN-Session-ID"), "own");
}

}  // namespace
}  // namespace telvane::testing
