#pragma once

#include <memory>

#include "platform/dispatch/SystemClock.h"
#include "platform/dispatch/SystemRandom.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/ipc/Entitlements.h"
#include "platform/ipc/SocketService.h"
#include "platform/system/Paths.h"
#include "platform/system/PosixFileSystem.h"
#include "tests/client/ScriptedDaemon.h"
#include "tests/support/RecordingLog.h"

namespace telvane::testing {

// A scripted daemon behind a real socket, with threads of its own, below a scratch root. What it has been called with
// may be looked at once an answer to a later call has come.
class RealDaemon {
 public:
  explicit RealDaemon(const std::string& root);
  ~RealDaemon();

  ScriptedDaemon& script() { return *_script; }

 private:
  RecordingLog _log;
  // Before what calls it.
  std::unique_ptr<ScriptedDaemon> _script;
  ThreadedDispatch _dispatch;
  PosixFileSystem _files;
  ipc::Entitlements _entitlements;
  ipc::SocketService _service;
};

}  // namespace telvane::testing
