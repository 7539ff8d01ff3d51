#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <set>

#include "client/PeriodicTasks.h"
#include "interfaces/SessionKeys.h"
#include "platform/dispatch/SystemClock.h"
#include "platform/dispatch/SystemRandom.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "tests/support/Matchers.h"
#include "tests/support/MemoryUserDefaults.h"

namespace telvane::testing {
namespace {

constexpr Key kNumbers{"numbers"};
constexpr std::chrono::seconds kDeadline{30};

class NoService final : public ipc::Service {
 public:
  Result<std::unique_ptr<ipc::Listener>> newListener(const std::string&) override { return Error("none", EMFILE); }
  Result<std::shared_ptr<ipc::Connection>> newConnection(const std::string&) override { return Error("none", EMFILE); }
  int checkLookUp(const std::string&) const override { return 0; }
};

// Ticks on real threads.
class PeriodicTasksThreadsTest : public ::testing::Test {
 protected:
  static constexpr uint32_t kModules = 20;

  ~PeriodicTasksThreadsTest() override { EXPECT_TRUE(drain()); }

  // Adds modules that each report their number, and counts how many are called at once.
  void addModules() {
    for (uint32_t number = 0; number < kModules; ++number) {
      auto module = std::make_shared<const UpdateAndReportServices>(true, true, [this, number](Dictionary* metrics) {
        const int running = ++_running;
        int most = _most;
        while (running > most && !_most.compare_exchange_weak(most, running)) {
        }
        if (metrics != nullptr) metrics->set(kNumbers, Array{number});
        ++_calls;
        --_running;
      });
      perform([this, number, module] { _tasks->registerPeriodicTaskForModule(number, module); });
    }
  }
  void tick(int32_t multiplier, uint64_t timeout) {
    perform([this, multiplier, timeout] { _tasks->myPeriodicTask(5, 6, multiplier, timeout); });
  }
  void perform(Job step) { _reporting->async(std::move(step)); }
  // Waits until all steps have run.
  bool drain() {
    const std::shared_ptr<Semaphore> isDone = _dispatch.newSemaphore(0);
    perform([isDone] { isDone->signal(); });
    return isDone->waitFor(kDeadline);
  }
  static Array numbersOf(const Dictionary& message) {
    return *(*message[kTelvaneMessageParametersPayload].dictionary())[kNumbers].array();
  }

  RecordingLog _log;
  SystemClock _clock;
  SystemRandom _random;
  MemoryUserDefaults _userDefaults;
  NoService _service;
  std::atomic<int> _running = 0;
  std::atomic<int> _most = 0;
  std::atomic<uint32_t> _calls = 0;
  std::vector<Dictionary> _sent;  // confined to the steps
  // Behind what its jobs use: it ends when they have ended.
  std::unique_ptr<ClientContext> _context;
  ThreadedDispatch _dispatch;
  std::shared_ptr<SerialQueue> _serial = _dispatch.newSerialQueue("main", QualityOfService::Utility);
  std::shared_ptr<ReportingQueue> _reporting = std::make_shared<ReportingQueue>(_serial, _log);
  std::shared_ptr<PeriodicTasks> _tasks = [this] {
    _context =
        std::make_unique<ClientContext>(ClientPlatform(_clock, _dispatch, _log, _random, _userDefaults, _service));
    return std::make_shared<PeriodicTasks>(
        *_context,
        PeriodicTasks::Queues{_reporting, _serial,
                              _dispatch.newConcurrentQueue("periodic", QualityOfService::UserInitiated)},
        [this](const Dictionary& message) { _sent.push_back(message); });
  }();
};

TEST_F(PeriodicTasksThreadsTest, gathersAllReportsOfATickFourAtATime) {
  constexpr uint32_t kTicks = 100;
  addModules();
  for (uint32_t i = 0; i < kTicks; ++i) tick(2, 3600);
  ASSERT_TRUE(drain());
  EXPECT_EQ(_calls, kTicks * kModules);
  EXPECT_LE(_most, 4);
  ASSERT_EQ(_sent.size(), kTicks / 2);
  for (const Dictionary& message : _sent) {
    const Array numbers = numbersOf(message);
    ASSERT_EQ(numbers.size(), kModules);
    std::set<int64_t> different;
    for (const Value& number : numbers) different.insert(number.integerValue());
    EXPECT_EQ(different.size(), kModules);
  }
}

// Ticks do not wait, so nearly all calls end late, at whatever moment.
TEST_F(PeriodicTasksThreadsTest, bearsCallsThatEndLate) {
  _log.allowErrors();
  addModules();
  for (uint32_t i = 0; i < 500; ++i) tick(2, 0);
  ASSERT_TRUE(drain());
  // A tick is shared with its calls; a later one that waits comes behind them.
  tick(0, 3600);
  ASSERT_TRUE(drain());
  EXPECT_GE(_calls, kModules);
  for (const Dictionary& message : _sent) {
    std::vector<int64_t> numbers;
    for (const Value& number : numbersOf(message)) numbers.push_back(number.integerValue());
    std::sort(numbers.begin(), numbers.end());
    EXPECT_EQ(std::adjacent_find(numbers.begin(), numbers.end()), numbers.end()) << "one of them twice in one tick";
  }
}

}  // namespace
}  // namespace telvane::testing
