#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <cstdint>
#include <exception>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "foundation/UniqueFunction.h"
#include "platform/Clock.h"
#include "tests/support/SeededGenerator.h"

namespace telvane::testing {

class SimulatedStrand;

// What fails a run that cannot go on: a deadlock, or jobs that never come to rest. Its text names the seed, the virtual
// time, and who waits for what.
class SimulationFailure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// One wait of one strand of the simulation, on the stack of who waits.
struct SimulatedWait {
  enum class State { NotYet, Waiting, Answered, TimedOut };

  // what: what is waited for, as the report of a deadlock names it.
  // holder: where the strand that has it now is noted, if only that strand can answer; null if anybody can.
  explicit SimulatedWait(std::string what, const SimulatedStrand* const* holder = nullptr)
      : _what(std::move(what)), _holder(holder) {}

 private:
  friend class SimulatedScheduler;
  const std::string _what;
  const SimulatedStrand* const* const _holder;
  SimulatedStrand* _strand = nullptr;
  State _state = State::NotYet;
};

// Runs a whole system, all its processes, in one thread under a virtual clock. Every job runs on a strand, a stack of
// its own, so that a job may wait and others run meanwhile. The test's own body is a strand too ("main") and may wait
// like any job.
//
// What runs next is chosen by the seed among all that could. A strand gives way when it waits, and with
// Interleaving::AtCalls also now and then when it hands work to others, as a thread may be overtaken there. The same
// seed gives the same run.
//
// Time stands still while anything can run. It moves by advance() and runUntil(), and to the next timer when main
// waits and nothing else can run. Nothing is left for a waiting main: SimulationFailure. A circle of strands that each
// wait for what the next one has is a failure at once, wherever main is; it comes out of the verb that main is in.
// An exception out of a job comes out there too.
//
// Not for several threads: whatever reaches it from another thread ends the process with a message.
class SimulatedScheduler {
 public:
  using Duration = std::chrono::nanoseconds;
  using Time = Clock::MonotonicTime;
  using TimerID = uint64_t;
  using ProcessID = uint32_t;
  enum class Interleaving { AtWaits, AtCalls };
  enum class TimerLeeway { None, BySeed };

  // What belongs to no process: the network, the machine.
  static constexpr ProcessID kNoProcess = 0;
  // Not the epoch, so that a time that was never set does not look like the start.
  static constexpr Time kStart{std::chrono::seconds(1000)};
  static constexpr uint64_t kMaximumStepsAtOneTime = 1'000'000;

  explicit SimulatedScheduler(uint64_t seed);
  // Ends all strands that still wait, and drops what has not run.
  ~SimulatedScheduler();
  SimulatedScheduler(const SimulatedScheduler&) = delete;
  SimulatedScheduler& operator=(const SimulatedScheduler&) = delete;

  // Verbs of the test. REQUIRES: called by main.
  //
  // Runs everything that can run; time stands still.
  void runUntilIdle();
  // Runs everything that can run and lets the time pass, timer by timer.
  void advance(Duration duration);
  // Runs until the condition holds, which is asked after every step, and lets time pass as far as the deadline. The
  // failure says what is still waiting.
  ::testing::AssertionResult runUntil(const std::function<bool()>& condition, Duration within);

  // Lets the calling strand, main or any other, go on after the duration.
  void sleep(Duration duration);
  void setInterleaving(Interleaving interleaving) { _interleaving = interleaving; }
  // More steps than this while time stands still count as never coming to rest.
  void setMaximumStepsAtOneTime(uint64_t steps) { _maximumStepsAtOneTime = steps; }
  void setTimerLeeway(TimerLeeway leeway) { _leeway = leeway; }
  uint64_t seed() const noexcept { return _seed; }
  Time now() const noexcept { return _now; }
  // The end of time when the duration reaches beyond it; now when it is negative.
  Time timeAfter(Duration duration) const noexcept;
  // One line per strand that waits: who, and for what. Empty when none does.
  std::string waiting() const;

  // For the simulated parts.
  //
  // Starts the job on a strand of its own once it is chosen. Dropped when the process has ended.
  void schedule(ProcessID process, std::string label, Job job);
  // Runs the job when the delay has passed, between two steps, not on a strand: it must not wait. Equal times go in the
  // order in which they were started.
  TimerID startTimer(ProcessID process, Duration delay, Job job);
  // Forgets the timer; one that has fired or never was is fine.
  void cancelTimer(TimerID timer);
  // Puts the calling strand aside until answer(); false when the deadline came first.
  bool wait(SimulatedWait& wait, std::optional<Time> deadline = std::nullopt);
  // Lets the strand of that wait go on; does nothing when it was answered or has timed out.
  void answer(SimulatedWait& wait);
  // A place where another thread could overtake: gives way by chance with Interleaving::AtCalls.
  void callPoint();
  // A number below the count, by the seed.
  size_t choose(size_t count) { return static_cast<size_t>(_generator.below(count)); }
  // How much later than asked for a timer fires.
  Duration chooseLeeway(Duration leeway);
  const SimulatedStrand* current() const noexcept { return _current; }
  bool isMain() const noexcept { return _current == _main.get(); }

  ProcessID newProcess() noexcept { return ++_lastProcess; }
  bool hasEnded(ProcessID process) const { return _endedProcesses.count(process) != 0; }
  // Ends a process at once: its timers and jobs are dropped, its strands unwound where they wait (by an exception that
  // is none of the code's business), and whatever it schedules later is dropped.
  void end(ProcessID process);

 private:
  struct Runnable {
    ProcessID process;
    std::string label;
    Job job;                            // to be started, or
    SimulatedStrand* strand = nullptr;  // to go on
  };
  struct TimerEntry {
    Time time;
    ProcessID process;
    Job job;
  };
  enum class Step { Ran, MainIsNext, Nothing };

  Step step();
  void start(Runnable runnable);
  void enter(SimulatedStrand& strand);
  void runStrand(SimulatedStrand& strand);
  void retire(SimulatedStrand& strand);
  void pause(SimulatedStrand& strand);
  void runMainUntilResumed();
  void throwIfEnding(SimulatedStrand& strand);
  void unwindEndedStrands();
  void makeRunnable(SimulatedStrand& strand);
  void forgetRunnable(SimulatedStrand& strand);
  void jumpTo(Time time);
  void countStep();
  void checkForCircle(SimulatedStrand& strand);
  static const SimulatedStrand* holderOfWhatIsAwaitedBy(const SimulatedStrand& strand);
  void rethrowFailure();
  void requireMain(const char* verb) const;
  void requireOwnThread() const;
  bool isUnwinding(const SimulatedStrand& strand) const;
  std::string report(const std::string& headline) const;

  const uint64_t _seed;
  const std::thread::id _thread = std::this_thread::get_id();
  SeededGenerator _generator;
  Interleaving _interleaving = Interleaving::AtWaits;
  TimerLeeway _leeway = TimerLeeway::None;
  Time _now = kStart;
  uint64_t _maximumStepsAtOneTime = kMaximumStepsAtOneTime;
  uint64_t _stepsAtThisTime = 0;
  std::vector<Runnable> _runnables;
  std::map<std::pair<Time, TimerID>, TimerEntry> _timers;
  std::map<TimerID, Time> _timerTimes;
  TimerID _lastTimer = 0;
  ProcessID _lastProcess = kNoProcess;
  std::set<ProcessID> _endedProcesses;
  std::unique_ptr<SimulatedStrand> _main;
  SimulatedStrand* _current;
  std::vector<std::unique_ptr<SimulatedStrand>> _strands;  // in use, in the order in which they were started
  std::vector<std::unique_ptr<SimulatedStrand>> _idleStrands;
  std::exception_ptr _failure;
};

}  // namespace telvane::testing
