#include "tests/support/SimulatedScheduler.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <utility>

#include "tests/support/Fiber.h"

namespace telvane::testing {

namespace {

// Thrown where a strand of an ended process waits, so that its stack is cleared like that of a function that returns.
struct StrandEnds {};

double inSeconds(SimulatedScheduler::Time time) {
  return std::chrono::duration<double>(time - SimulatedScheduler::kStart).count();
}

}  // namespace

// A stack with the job that runs on it; main is the one without a stack of its own.
class SimulatedStrand {
 public:
  SimulatedScheduler::ProcessID process = SimulatedScheduler::kNoProcess;
  std::string label;
  Job job;
  SimulatedWait* wait = nullptr;
  bool isEnding = false;
  bool isRunnable = false;
  bool isClearing = false;  // its job is over and being destroyed
  bool isDone = false;      // and is gone
  bool isReleased = false;  // the fiber is to return instead of waiting for another job
  std::unique_ptr<Fiber> fiber;
};

SimulatedScheduler::SimulatedScheduler(uint64_t seed)
    : _seed(seed), _generator(seed), _main(std::make_unique<SimulatedStrand>()), _current(_main.get()) {
  _main->label = "main";
}

SimulatedScheduler::~SimulatedScheduler() {
  for (ProcessID process = kNoProcess; process <= _lastProcess; ++process) end(process);
  for (auto& strand : _idleStrands) {
    strand->isReleased = true;
    strand->fiber->enter();
  }
}

void SimulatedScheduler::runUntilIdle() {
  requireMain("runUntilIdle");
  while (step() == Step::Ran) {
  }
}

void SimulatedScheduler::advance(Duration duration) {
  requireMain("advance");
  const Time target = timeAfter(duration);
  runUntilIdle();
  while (!_timers.empty() && _timers.begin()->first.first <= target) {
    jumpTo(_timers.begin()->first.first);
    runUntilIdle();
  }
  jumpTo(std::max(target, _now));
}

::testing::AssertionResult SimulatedScheduler::runUntil(const std::function<bool()>& condition, Duration within) {
  requireMain("runUntil");
  const Time deadline = timeAfter(within);
  while (!condition()) {
    if (step() == Step::Ran) continue;
    if (_timers.empty() || _timers.begin()->first.first > deadline) {
      jumpTo(std::max(deadline, _now));
      if (condition()) break;
      return ::testing::AssertionFailure() << report("the condition does not hold at the deadline");
    }
    jumpTo(_timers.begin()->first.first);
  }
  return ::testing::AssertionSuccess();
}

void SimulatedScheduler::sleep(Duration duration) {
  SimulatedWait nothing("the end of its sleep");
  wait(nothing, timeAfter(duration));
}

SimulatedScheduler::Time SimulatedScheduler::timeAfter(Duration duration) const noexcept {
  const Duration longest = Time::max() - _now;
  return _now + std::clamp(duration, Duration::zero(), longest);
}

std::string SimulatedScheduler::waiting() const {
  std::string lines;
  auto describe = [&lines](const SimulatedStrand& strand) {
    if (strand.wait == nullptr) return;
    lines += fmt::format("  {} waits for {}", strand.label, strand.wait->_what);
    const auto* holder = strand.wait->_holder;
    if (holder != nullptr && *holder != nullptr) lines += fmt::format(", which {} has", (*holder)->label);
    lines += "\n";
  };
  describe(*_main);
  for (const auto& strand : _strands) describe(*strand);
  return lines;
}

void SimulatedScheduler::schedule(ProcessID process, std::string label, Job job) {
  requireOwnThread();
  if (hasEnded(process)) return;
  _runnables.push_back(Runnable{process, std::move(label), std::move(job)});
}

SimulatedScheduler::TimerID SimulatedScheduler::startTimer(ProcessID process, Duration delay, Job job) {
  requireOwnThread();
  if (hasEnded(process)) return 0;
  const Time time = timeAfter(delay);
  const TimerID timer = ++_lastTimer;
  _timers.emplace(std::pair(time, timer), TimerEntry{time, process, std::move(job)});
  _timerTimes.emplace(timer, time);
  return timer;
}

void SimulatedScheduler::cancelTimer(TimerID timer) {
  const auto found = _timerTimes.find(timer);
  if (found == _timerTimes.end()) return;
  // The job goes last: what it holds may start and cancel timers itself.
  auto entry = _timers.extract(std::pair(found->second, timer));
  _timerTimes.erase(found);
}

bool SimulatedScheduler::wait(SimulatedWait& wait, std::optional<Time> deadline) {
  requireOwnThread();
  SimulatedStrand& strand = *_current;
  if (isUnwinding(strand)) return false;
  throwIfEnding(strand);
  wait._strand = &strand;
  wait._state = SimulatedWait::State::Waiting;
  TimerID timer = 0;
  if (deadline) {
    timer = startTimer(strand.process, *deadline - _now, [this, &wait] {
      wait._state = SimulatedWait::State::TimedOut;
      makeRunnable(*wait._strand);
    });
  }
  strand.wait = &wait;
  struct Cleanup {
    SimulatedScheduler& scheduler;
    SimulatedStrand& strand;
    TimerID timer;
    ~Cleanup() {
      strand.wait = nullptr;
      scheduler.cancelTimer(timer);
      scheduler.forgetRunnable(strand);
    }
  } cleanup{*this, strand, timer};
  checkForCircle(strand);
  pause(strand);
  return wait._state == SimulatedWait::State::Answered;
}

void SimulatedScheduler::answer(SimulatedWait& wait) {
  requireOwnThread();
  if (wait._state != SimulatedWait::State::Waiting) return;
  wait._state = SimulatedWait::State::Answered;
  makeRunnable(*wait._strand);
}

void SimulatedScheduler::callPoint() {
  if (_interleaving == Interleaving::AtWaits || _current == _main.get() || isUnwinding(*_current)) return;
  if (choose(2) == 0) return;
  SimulatedStrand& strand = *_current;
  makeRunnable(strand);
  pause(strand);
}

SimulatedScheduler::Duration SimulatedScheduler::chooseLeeway(Duration leeway) {
  if (_leeway == TimerLeeway::None || leeway <= Duration::zero()) return Duration::zero();
  return Duration(static_cast<Duration::rep>(_generator.below(static_cast<uint64_t>(leeway.count()) + 1)));
}

void SimulatedScheduler::end(ProcessID process) {
  requireOwnThread();
  _endedProcesses.insert(process);
  std::vector<Job> dropped;
  for (auto timer = _timers.begin(); timer != _timers.end();) {
    if (timer->second.process != process) {
      ++timer;
      continue;
    }
    dropped.push_back(std::move(timer->second.job));
    _timerTimes.erase(timer->first.second);
    timer = _timers.erase(timer);
  }
  for (Runnable& runnable : _runnables) {
    if (runnable.process == process && runnable.strand == nullptr) dropped.push_back(std::move(runnable.job));
  }
  std::erase_if(_runnables, [process](const Runnable& runnable) {
    return runnable.process == process && runnable.strand == nullptr;
  });
  for (auto& strand : _strands) strand->isEnding = strand->isEnding || strand->process == process;
  if (_current == _main.get()) unwindEndedStrands();
}

SimulatedScheduler::Step SimulatedScheduler::step() {
  unwindEndedStrands();
  if (_runnables.empty()) return Step::Nothing;
  countStep();
  const size_t chosen = choose(_runnables.size());
  Runnable runnable = std::move(_runnables[chosen]);
  _runnables.erase(_runnables.begin() + static_cast<std::ptrdiff_t>(chosen));
  if (runnable.strand == _main.get()) return Step::MainIsNext;
  if (runnable.strand != nullptr) {
    enter(*runnable.strand);
  } else {
    start(std::move(runnable));
  }
  rethrowFailure();
  return Step::Ran;
}

void SimulatedScheduler::start(Runnable runnable) {
  if (_idleStrands.empty()) {
    auto fresh = std::make_unique<SimulatedStrand>();
    SimulatedStrand* strand = fresh.get();
    strand->fiber = std::make_unique<Fiber>([this, strand](Fiber&) { runStrand(*strand); });
    _idleStrands.push_back(std::move(fresh));
  }
  _strands.push_back(std::move(_idleStrands.back()));
  _idleStrands.pop_back();
  SimulatedStrand& strand = *_strands.back();
  strand.process = runnable.process;
  strand.label = std::move(runnable.label);
  strand.job = std::move(runnable.job);
  enter(strand);
}

void SimulatedScheduler::enter(SimulatedStrand& strand) {
  strand.isRunnable = false;
  SimulatedStrand* before = std::exchange(_current, &strand);
  strand.fiber->enter();
  _current = before;
  if (strand.isDone) retire(strand);
}

void SimulatedScheduler::runStrand(SimulatedStrand& strand) {
  while (!strand.isReleased) {
    try {
      strand.job();
    } catch (const StrandEnds&) {
    } catch (...) {
      if (!_failure) _failure = std::current_exception();
    }
    strand.isClearing = true;
    strand.job = nullptr;  // may give way, too
    strand.isDone = true;
    strand.fiber->leave();
  }
}

void SimulatedScheduler::retire(SimulatedStrand& strand) {
  strand.isEnding = false;
  strand.isClearing = false;
  strand.isDone = false;
  const auto found =
      std::find_if(_strands.begin(), _strands.end(), [&strand](const auto& other) { return other.get() == &strand; });
  _idleStrands.push_back(std::move(*found));
  _strands.erase(found);
}

void SimulatedScheduler::pause(SimulatedStrand& strand) {
  if (&strand == _main.get()) return runMainUntilResumed();
  strand.fiber->leave();
  throwIfEnding(strand);
}

void SimulatedScheduler::runMainUntilResumed() {
  for (;;) {
    switch (step()) {
      case Step::Ran:
        break;
      case Step::MainIsNext:
        _main->isRunnable = false;
        return;
      case Step::Nothing:
        if (_timers.empty()) throw SimulationFailure(report("deadlock: nothing can run and no timer is set"));
        jumpTo(_timers.begin()->first.first);
    }
  }
}

void SimulatedScheduler::throwIfEnding(SimulatedStrand& strand) {
  if (strand.isEnding) throw StrandEnds();
}

void SimulatedScheduler::unwindEndedStrands() {
  for (;;) {
    const auto ending =
        std::find_if(_strands.begin(), _strands.end(), [](const auto& strand) { return strand->isEnding; });
    if (ending == _strands.end()) return;
    SimulatedStrand& strand = **ending;
    forgetRunnable(strand);
    enter(strand);
  }
}

void SimulatedScheduler::makeRunnable(SimulatedStrand& strand) {
  if (std::exchange(strand.isRunnable, true)) return;
  _runnables.push_back(Runnable{strand.process, strand.label, Job(), &strand});
}

void SimulatedScheduler::forgetRunnable(SimulatedStrand& strand) {
  if (!std::exchange(strand.isRunnable, false)) return;
  std::erase_if(_runnables, [&strand](const Runnable& runnable) { return runnable.strand == &strand; });
}

void SimulatedScheduler::jumpTo(Time time) {
  if (time > _now) _stepsAtThisTime = 0;
  _now = time;
  while (!_timers.empty() && _timers.begin()->first.first <= _now) {
    auto entry = _timers.extract(_timers.begin());
    _timerTimes.erase(entry.key().second);
    entry.mapped().job();
  }
}

void SimulatedScheduler::countStep() {
  if (++_stepsAtThisTime <= _maximumStepsAtOneTime) return;
  _stepsAtThisTime = 0;
  std::string headline = "the system does not come to rest; next in turn:";
  for (size_t i = 0; i < std::min<size_t>(_runnables.size(), 5); ++i) headline += " \"" + _runnables[i].label + "\"";
  throw SimulationFailure(report(headline));
}

void SimulatedScheduler::checkForCircle(SimulatedStrand& strand) {
  const SimulatedStrand* next = holderOfWhatIsAwaitedBy(strand);
  // A circle that this strand only leads into was reported when it closed; it must not be walked for ever.
  for (size_t i = 0; i < _strands.size() && next != nullptr && next != &strand; ++i) {
    next = holderOfWhatIsAwaitedBy(*next);
  }
  if (next != &strand) return;
  SimulationFailure failure(report("deadlock: each of these waits for what another one has"));
  if (&strand == _main.get()) throw failure;
  if (!_failure) _failure = std::make_exception_ptr(failure);
}

const SimulatedStrand* SimulatedScheduler::holderOfWhatIsAwaitedBy(const SimulatedStrand& strand) {
  const SimulatedWait* wait = strand.wait;
  if (wait == nullptr || wait->_state != SimulatedWait::State::Waiting || wait->_holder == nullptr) return nullptr;
  return *wait->_holder;
}

void SimulatedScheduler::rethrowFailure() {
  if (_failure) std::rethrow_exception(std::exchange(_failure, nullptr));
}

void SimulatedScheduler::requireMain(const char* verb) const {
  requireOwnThread();
  if (_current == _main.get()) return;
  throw SimulationFailure(fmt::format("{} is a verb of the test's body, but \"{}\" called it", verb, _current->label));
}

void SimulatedScheduler::requireOwnThread() const {
  if (std::this_thread::get_id() == _thread) return;
  std::fprintf(stderr, "SimulatedScheduler: reached from another thread; simulated code must not make threads\n");
  std::abort();
}

bool SimulatedScheduler::isUnwinding(const SimulatedStrand& strand) const {
  return strand.isEnding && (strand.isClearing || std::uncaught_exceptions() > 0);
}

std::string SimulatedScheduler::report(const std::string& headline) const {
  return fmt::format("seed {}, {:.6f} s after the start: {}\n{}", _seed, inSeconds(_now), headline, waiting());
}

}  // namespace telvane::testing
