// A process that links the shared library as any client would, and does to it what a host may do. Each mode is a
// function; the tests look at what the daemon received, at the exit status (0 when all was as the mode expects) and at
// what was printed (nothing).

#include <dlfcn.h>
#include <signal.h>
#include <sys/wait.h>
#include <telvane/Telvane.h>
#include <telvane/TelvaneAPI.h>
#include <telvane/TelvaneConstants.h>
#include <telvane/TelvaneSession.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <future>
#include <map>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>

namespace {

using telvane::Dictionary;
using telvane::Error;
using telvane::Telvane;
using telvane::Value;

constexpr int kMany = 5000;

Dictionary sessionInfo() {
  Dictionary info;
  info.set(kTelvaneSessionInfoClientType, 7);
  return info;
}

Dictionary payload(int number) {
  Dictionary payload;
  payload.set("number", number);
  return payload;
}

std::shared_ptr<Telvane> open() { return Telvane::initWithSessionInfo(sessionInfo()); }

// Returns whether the daemon has answered the flush within the time.
bool flush(Telvane& session, std::chrono::seconds patience = std::chrono::seconds(30)) {
  auto promise = std::make_shared<std::promise<bool>>();
  std::future<bool> isFlushed = promise->get_future();
  session.flushMessagesWithCompletion([promise](const std::optional<Error>& error) { promise->set_value(!error); });
  return isFlushed.wait_for(patience) == std::future_status::ready && isFlushed.get();
}

int waitForChild(pid_t child) {
  int status = 0;
  if (::waitpid(child, &status, 0) != child) return -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

size_t threadCount() {
  size_t count = 0;
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/task")) ++count;
  return count;
}

// Leaves main with a session that is alive and has just sent.
int sendAndReturn() {
  static std::shared_ptr<Telvane> session = open();
  for (int i = 1; i <= kMany; ++i) session->sendMessageWithCategory(1, 1, payload(i));
  return 0;
}

int sendAndExit() {
  const std::shared_ptr<Telvane> session = open();
  for (int i = 1; i <= kMany; ++i) session->sendMessageWithCategory(1, 1, payload(i));
  std::exit(0);
}

int releaseAndReturn() {
  std::shared_ptr<Telvane> session = open();
  for (int i = 1; i <= kMany; ++i) session->sendMessageWithCategory(1, 1, payload(i));
  session.reset();
  return 0;
}

int oneShotAndReturn() { return Telvane::sendOneMessageWithSessionInfo(sessionInfo(), {}, 3, 4, payload(1)) ? 0 : 1; }

// The child has a session of its own; that of its parent is dead there, and goes on in the parent.
int forkWithSession() {
  std::shared_ptr<Telvane> session = open();
  session->sendMessageWithCategory(1, 1);
  if (!flush(*session)) return 1;
  const pid_t child = ::fork();
  if (child == 0) {
    std::optional<Error> error;
    if (session->sendMessageWithCategory(66, 1, {}, &error) || !error) std::_Exit(10);
    if (flush(*session, std::chrono::seconds(0))) std::_Exit(11);
    session.reset();
    std::shared_ptr<Telvane> own = open();
    if (own == nullptr || !own->sendMessageWithCategory(2, 1) || !flush(*own)) std::_Exit(12);
    own.reset();
    std::exit(0);
  }
  if (const int status = waitForChild(child); status != 0) return status;
  session->sendMessageWithCategory(3, 1);
  return flush(*session) ? 0 : 2;
}

// Forks while other threads send all the time, so that locks of the library are likely held.
int forkWhileSending() {
  std::shared_ptr<Telvane> session = open();
  std::atomic<bool> isDone = false;
  std::thread sender([&] {
    while (!isDone) session->sendMessageWithCategory(1, 1, payload(1));
  });
  int result = 0;
  for (int i = 0; i < 20 && result == 0; ++i) {
    const pid_t child = ::fork();
    if (child == 0) {
      std::shared_ptr<Telvane> own = open();
      own->sendMessageWithCategory(2, 1);
      std::_Exit(flush(*own) ? 0 : 1);
    }
    result = waitForChild(child);
  }
  isDone = true;
  sender.join();
  return result;
}

bool isDefault(int signal) {
  struct sigaction action {};
  ::sigaction(signal, nullptr, &action);
  return action.sa_handler == SIG_DFL;
}

// The daemon goes away under a process whose SIGPIPE kills.
int keepSignals() {
  for (int signal : {SIGPIPE, SIGTERM, SIGCHLD}) {
    if (!isDefault(signal)) return 1;
  }
  std::shared_ptr<Telvane> session = open();
  session->sendMessageWithCategory(1, 1);
  if (!flush(*session)) return 2;
  for (int signal : {SIGPIPE, SIGTERM, SIGCHLD}) {
    if (!isDefault(signal)) return 3;
  }
  sigset_t blocked;
  ::pthread_sigmask(SIG_BLOCK, nullptr, &blocked);
  return ::sigismember(&blocked, SIGPIPE) == 0 ? 0 : 4;
}

// The daemon ends each connection with the first flush; SIGPIPE would end this process.
int surviveADaemonThatEndsConnections() {
  std::shared_ptr<Telvane> session = open();
  for (int round = 0; round < 20; ++round) {
    for (int i = 0; i < 100; ++i) session->sendMessageWithCategory(1, 1, payload(i));
    flush(*session);
  }
  return 0;
}

int throwInBlocks() {
  std::shared_ptr<Telvane> session = open();
  session->setMessageLoggingBlock([](const telvane::String&) { throw std::runtime_error("logging block"); });
  session->startConfigurationWithCompletionHandler([](const Value&) { throw 1; });
  session->sendMessageWithCategory(1, 1);
  session->flushMessagesWithCompletion([](const std::optional<Error>&) { throw std::runtime_error("completion"); });
  return flush(*session) ? 0 : 1;
}

// No thread before there is something to send, and none for what needs no daemon.
int startNoThreadUnasked() {
  const size_t before = threadCount();
  if (!Telvane::newHierarchyTokenFromParentToken()) return 1;
  if (Telvane::initWithSessionInfo({}) != nullptr) return 2;
  const Value identifier = Telvane::getPersistentIdentifierForDNU(true);
  if (identifier.text().size() != 36) return 3;
  if (Telvane::getPersistentIdentifierForDNU(true) != identifier) return 4;
  Telvane::regeneratePersistentIdentifierForDNU(true);
  if (Telvane::getPersistentIdentifierForDNU(true) == identifier) return 5;
  return threadCount() == before ? 0 : 6;
}

int leaveWithoutADaemon() {
  std::shared_ptr<Telvane> session = open();
  if (session == nullptr) return 1;
  session->sendMessageWithCategory(1, 1);
  return session->flushMessages() ? 0 : 2;
}

// Exits inside a block of the library.
int exitInACompletion() {
  static std::shared_ptr<Telvane> session = open();
  session->flushMessagesWithCompletion([](const std::optional<Error>&) { std::exit(0); });
  ::sleep(60);
  return 1;
}

// A plug-in may be unloaded whose library has threads.
int unloadTheLibrary() {
  void* library = ::dlopen("libtelvane.so.1", RTLD_NOW | RTLD_NOLOAD);
  if (library == nullptr) return 1;
  std::shared_ptr<Telvane> session = open();
  session->sendMessageWithCategory(1, 1);
  for (int i = 0; i < 10; ++i) ::dlclose(library);
  return flush(*session) ? 0 : 2;
}

void countingMetrics(Telvane& session, std::atomic<int>& reports) {
  session.registerPeriodicTaskForModule(1, true, true, [&reports](Dictionary* metrics) {
    if (metrics != nullptr) metrics->set("number", ++reports);
  });
}

// Leaves main with a timer that runs, which nobody stops.
int leaveWithARunningTimer() {
  static std::atomic<int> reports = 0;
  static std::shared_ptr<Telvane> session = open();
  countingMetrics(*session, reports);
  session->startLogTimerWithInterval(1, 1, 5, 6);
  while (reports < 2) std::this_thread::yield();
  return 0;
}

// Lets the session go without stopping its timer, and stays until it would have fired again.
int releaseWithARunningTimer() {
  std::atomic<int> reports = 0;
  std::atomic<int> otherTicks = 0;
  std::shared_ptr<Telvane> session = open();
  countingMetrics(*session, reports);
  session->startLogTimerWithInterval(1, 1, 5, 6);
  while (reports == 0) std::this_thread::yield();
  session.reset();
  const std::shared_ptr<Telvane> other = open();
  other->registerPeriodicTaskForModule(1, true, false, [&otherTicks](Dictionary*) { ++otherTicks; });
  other->startLogTimerWithInterval(1, 0, 5, 6);
  while (otherTicks < 3) std::this_thread::yield();
  other->stopLogTimer();
  other->unregisterPeriodTaskForModule(1);
  return reports == 1 ? 0 : 1;
}

// Ends while a block is called that never returns.
int leaveWithAStuckBlock() {
  static std::atomic<bool> isStuck = false;
  static std::shared_ptr<Telvane> session = open();
  session->registerPeriodicTaskForModule(1, true, true, [](Dictionary*) {
    isStuck = true;
    for (;;) ::pause();
  });
  session->startLogTimerWithInterval(1, 1, 5, 6);
  while (!isStuck) std::this_thread::yield();
  return 0;
}

int throwInModules() {
  std::atomic<int> reports = 0;
  std::shared_ptr<Telvane> session = open();
  session->registerPeriodicTaskForModule(2, true, true, [](Dictionary*) { throw std::runtime_error("module"); });
  session->registerPeriodicTaskForModule(3, true, true, [](Dictionary*) { throw 1; });
  countingMetrics(*session, reports);
  session->startLogTimerWithInterval(1, 1, 5, 6);
  while (reports == 0) std::this_thread::yield();
  session->stopLogTimer();
  session->unregisterPeriodTaskForModule(1);
  return flush(*session) ? 0 : 1;
}

// The child refuses its parent's periodic tasks and has its own; the parent's go on.
int forkWithATimer() {
  std::atomic<int> reports = 0;
  std::shared_ptr<Telvane> session = open();
  countingMetrics(*session, reports);
  session->startLogTimerWithInterval(1, 1, 5, 6);
  while (reports == 0) std::this_thread::yield();
  const pid_t child = ::fork();
  if (child == 0) {
    if (session->registerPeriodicTaskForModule(2, true, true, [](Dictionary*) {})) std::_Exit(10);
    if (!session->unregisterPeriodTaskForModule(1)) std::_Exit(11);
    session->stopLogTimer();
    session->startLogTimerWithInterval(1, 1, 5, 6);
    session.reset();
    std::atomic<int> ownReports = 0;
    std::shared_ptr<Telvane> own = open();
    countingMetrics(*own, ownReports);
    own->startLogTimerWithInterval(1, 1, 5, 7);
    while (ownReports == 0) std::this_thread::yield();
    own->stopLogTimer();
    own->unregisterPeriodTaskForModule(1);
    std::_Exit(flush(*own) ? 0 : 12);
  }
  if (const int status = waitForChild(child); status != 0) return status;
  const int reportsBefore = reports;
  while (reports == reportsBefore) std::this_thread::yield();
  session->stopLogTimer();
  session->unregisterPeriodTaskForModule(1);
  return flush(*session) ? 0 : 2;
}

const std::map<std::string, std::function<int()>> kModes = {
    {"sendAndReturn", sendAndReturn},
    {"sendAndExit", sendAndExit},
    {"releaseAndReturn", releaseAndReturn},
    {"oneShotAndReturn", oneShotAndReturn},
    {"forkWithSession", forkWithSession},
    {"forkWhileSending", forkWhileSending},
    {"keepSignals", keepSignals},
    {"surviveADaemonThatEndsConnections", surviveADaemonThatEndsConnections},
    {"throwInBlocks", throwInBlocks},
    {"startNoThreadUnasked", startNoThreadUnasked},
    {"leaveWithoutADaemon", leaveWithoutADaemon},
    {"exitInACompletion", exitInACompletion},
    {"unloadTheLibrary", unloadTheLibrary},
    {"leaveWithARunningTimer", leaveWithARunningTimer},
    {"releaseWithARunningTimer", releaseWithARunningTimer},
    {"leaveWithAStuckBlock", leaveWithAStuckBlock},
    {"throwInModules", throwInModules},
    {"forkWithATimer", forkWithATimer},
};

}  // namespace

int main(int argc, char** argv) {
  const auto mode = argc == 2 ? kModes.find(argv[1]) : kModes.end();
  return mode != kModes.end() ? mode->second() : 99;
}
