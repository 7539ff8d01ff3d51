#pragma once

#include "platform/ClientBundle.h"
#include "platform/Clock.h"
#include "platform/Consent.h"
#include "platform/DeviceAnswers.h"
#include "platform/Dispatch.h"
#include "platform/FileSystem.h"
#include "platform/Locale.h"
#include "platform/Log.h"
#include "platform/ProcessMemory.h"
#include "platform/Random.h"
#include "platform/SubmittableLogs.h"
#include "platform/Transactions.h"
#include "platform/URLSession.h"
#include "platform/UserDefaults.h"
#include "platform/ipc/Service.h"

namespace telvane {

class DatagramSockets;
class PowerLog;
class SandboxExtensions;
class WirelessDiagnostics;

// Everything that a program needs of the system it runs on, as seams that a test can replace one by one. Made by the
// entry point, handed down by reference, outlives everything that it is handed to. Owns nothing itself.
struct Platform {
  Clock& clock;
  Random& random;
  Dispatch& dispatch;
  Log& log;
  FileSystem& files;
  UserDefaults& userDefaults;
  DeviceAnswers& deviceAnswers;
  Locale& locale;
  Consent& consent;
  ClientBundle& clientBundle;
  URLSessionProvider& urlSessions;
  Transactions& transactions;
  ipc::Service& localService;
  SubmittableLogs& submittableLogs;
  ProcessMemory& processMemory;
  // Each is needed in one place only, which includes its header.
  DatagramSockets& datagramSockets;
  SandboxExtensions& sandboxExtensions;
  WirelessDiagnostics& wirelessDiagnostics;
  PowerLog& powerLog;
};

}  // namespace telvane
