#include "platform/process/LibraryPlatform.h"

#include "platform/dispatch/SystemClock.h"
#include "platform/dispatch/SystemRandom.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/ipc/Entitlements.h"
#include "platform/ipc/SocketService.h"
#include "platform/log/LogFactory.h"
#include "platform/log/NullLog.h"
#include "platform/system/Environment.h"
#include "platform/system/Paths.h"
#include "platform/system/PosixFileSystem.h"
#include "platform/system/PropertyListUserDefaults.h"

namespace telvane {
namespace {

constexpr Key kLogLevel{"clientLogLevel"};

std::unique_ptr<Log> newLibraryLog(const Paths& paths, Key defaultsSuite) {
  NullLog silence;
  const int64_t level = PropertyListUserDefaults(paths, silence).objectForKey(defaultsSuite, kLogLevel).integerValue();
  const LogLevel leastImportant = level >= 2 ? LogLevel::Info : level == 1 ? LogLevel::Default : LogLevel::Error;
  return newLog(LogTarget::JournalOrNothing, leastImportant, "libtelvane");
}

}  // namespace

// In the order in which they need each other.
struct LibraryPlatform::Parts {
  Parts(const Paths& paths, Key defaultsSuite)
      : log(newLibraryLog(paths, defaultsSuite)),
        files(paths),
        userDefaults(paths, *log),
        entitlements(files, *log),
        localService(files, dispatch, *log, entitlements) {}

  const std::unique_ptr<Log> log;
  SystemClock clock;
  ThreadedDispatch dispatch;
  SystemRandom random;
  PosixFileSystem files;
  PropertyListUserDefaults userDefaults;
  ipc::Entitlements entitlements;
  ipc::SocketService localService;
};

LibraryPlatform::LibraryPlatform(Key defaultsSuite)
    : _parts(std::make_unique<Parts>(Paths::fromEnvironment(Environment::read()), defaultsSuite)) {}

LibraryPlatform::~LibraryPlatform() = default;

Clock& LibraryPlatform::clock() noexcept { return _parts->clock; }

Dispatch& LibraryPlatform::dispatch() noexcept { return _parts->dispatch; }
Log& LibraryPlatform::log() noexcept { return *_parts->log; }
Random& LibraryPlatform::random() noexcept { return _parts->random; }
UserDefaults& LibraryPlatform::userDefaults() noexcept { return _parts->userDefaults; }
ipc::Service& LibraryPlatform::localService() noexcept { return _parts->localService; }

void LibraryPlatform::endConnections(std::chrono::milliseconds patience) { _parts->localService.stop(patience); }

}  // namespace telvane
