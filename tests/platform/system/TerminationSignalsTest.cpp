#include "platform/system/TerminationSignals.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>

#include "platform/dispatch/ThreadedDispatch.h"

namespace telvane {
namespace {

using namespace std::chrono_literals;

// Runs the body in a process of its own, whose signals are its own too, and returns its exit status; -1 when it was
// killed.
template <class Body>
int inAnotherProcess(Body body) {
  const pid_t child = ::fork();
  if (child == 0) {
    ::alarm(30);
    ::_exit(body());
  }
  int status = 0;
  ::waitpid(child, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

struct Received {
  std::shared_ptr<Semaphore> semaphore;
  std::shared_ptr<SerialQueue> queue;
  int sum = 0;  // of the ordinals
};

// Starts the signals, does what the test does, and returns the sum of the ordinals that came, or 100 when none came in
// time.
template <class Act>
int received(int expected, Act act) {
  TerminationSignals signals;
  act();  // before start: must not be lost
  ThreadedDispatch dispatch;
  Received got{dispatch.newSemaphore(0), dispatch.newSerialQueue("signals", QualityOfService::Default)};
  const Result<void> started = signals.start(got.queue, [&got](int ordinal) {
    got.sum += got.queue->isCurrent() ? ordinal : 50;
    got.semaphore->signal();
  });
  if (!started) return 101;
  for (int i = 0; i < expected; ++i) {
    if (i > 0) ::kill(::getpid(), SIGTERM);
    if (!got.semaphore->waitFor(20s)) return 100;
  }
  return got.sum;
}

TEST(TerminationSignalsTest, callsTheHandlerOnItsQueueForEachSignalInTurn) {
  EXPECT_EQ(inAnotherProcess([] { return received(1, [] { ::kill(::getpid(), SIGTERM); }); }), 1);
  EXPECT_EQ(inAnotherProcess([] { return received(1, [] { ::kill(::getpid(), SIGINT); }); }), 1);
  EXPECT_EQ(inAnotherProcess([] { return received(3, [] { ::kill(::getpid(), SIGTERM); }); }), 1 + 2 + 3);
}

TEST(TerminationSignalsTest, endsWithoutHavingBeenStarted) {
  EXPECT_EQ(inAnotherProcess([] {
              const TerminationSignals signals;
              return 7;
            }),
            7);
}

}  // namespace
}  // namespace telvane
