#include "platform/system/SystemPlatform.h"

#include "platform/PowerLog.h"
#include "platform/datagram/SystemDatagramSockets.h"
#include "platform/dispatch/SystemClock.h"
#include "platform/dispatch/SystemRandom.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/ipc/Entitlements.h"
#include "platform/ipc/SocketService.h"
#include "platform/system/DefaultsConsent.h"
#include "platform/system/DescriptorExtensions.h"
#include "platform/system/Environment.h"
#include "platform/system/FolderClientBundle.h"
#include "platform/system/FolderSubmittableLogs.h"
#include "platform/system/LoadedWirelessDiagnostics.h"
#include "platform/system/Paths.h"
#include "platform/system/PosixFileSystem.h"
#include "platform/system/PropertyListUserDefaults.h"
#include "platform/system/SystemDeviceAnswers.h"
#include "platform/system/SystemLocale.h"
#include "platform/system/SystemProcessMemory.h"
#include "platform/url/CurlURLSessionProvider.h"

namespace telvane {

// In the order in which they need each other; queues go last, because the others may still have jobs in them.
struct SystemPlatform::Parts {
  Parts(Log& log, const Environment& environment) : Parts(log, environment, Paths::fromEnvironment(environment)) {}
  Parts(Log& log, const Environment& environment, const Paths& paths)
      : transactions(clock),
        files(paths),
        userDefaults(paths, log),
        deviceAnswers(paths, log),
        locale(environment, userDefaults, log),
        consent(userDefaults, log),
        clientBundle(FolderClientBundle::folderFor(environment, paths), log),
        urlSessions(dispatch, log, &flowGate, {.caFile = environment.certificates.value_or("")}),
        submittableLogs(paths),
        wirelessDiagnostics(paths, log),
        entitlements(files, log),
        localService(files, dispatch, log, entitlements, &flowGate),
        platform{clock,
                 random,
                 dispatch,
                 log,
                 files,
                 userDefaults,
                 deviceAnswers,
                 locale,
                 consent,
                 clientBundle,
                 urlSessions,
                 transactions,
                 localService,
                 submittableLogs,
                 processMemory,
                 datagramSockets,
                 sandboxExtensions,
                 wirelessDiagnostics,
                 powerLog} {}

  SystemClock clock;
  SystemRandom random;
  FlowGate flowGate;
  ThreadedDispatch dispatch;
  ProcessTransactions transactions;
  PosixFileSystem files;
  PropertyListUserDefaults userDefaults;
  SystemDeviceAnswers deviceAnswers;
  SystemLocale locale;
  DefaultsConsent consent;
  FolderClientBundle clientBundle;
  CurlURLSessionProvider urlSessions;
  FolderSubmittableLogs submittableLogs;
  SystemProcessMemory processMemory;
  SystemDatagramSockets datagramSockets;
  DescriptorExtensions sandboxExtensions;
  LoadedWirelessDiagnostics wirelessDiagnostics;
  NullPowerLog powerLog;
  ipc::Entitlements entitlements;
  ipc::SocketService localService;
  const Platform platform;
};

SystemPlatform::SystemPlatform(Log& log) : _parts(std::make_unique<Parts>(log, Environment::read())) {}

SystemPlatform::~SystemPlatform() = default;

const Platform& SystemPlatform::platform() const noexcept { return _parts->platform; }

ProcessTransactions& SystemPlatform::transactions() noexcept { return _parts->transactions; }

FlowGate& SystemPlatform::flowGate() noexcept { return _parts->flowGate; }

}  // namespace telvane
