#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "platform/FlowGate.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/ipc/Entitlements.h"
#include "platform/ipc/SocketService.h"
#include "platform/system/PosixFileSystem.h"
#include "tests/platform/ipc/Gathered.h"
#include "tests/platform/ipc/TalkingObject.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {

inline constexpr const char* kServiceName = "com.corvex.test";

// A delegate that accepts, unless it is told not to, and exports one object to all.
class AcceptingDelegate final : public ipc::ListenerDelegate {
 public:
  explicit AcceptingDelegate(Dispatch& dispatch) : object(std::make_shared<TalkingObject>(dispatch)) {}

  bool listener(ipc::Listener& listener, std::shared_ptr<ipc::Connection> shouldAcceptNewConnection) override;

  const std::shared_ptr<TalkingObject> object;
  bool accepts = true;
  std::string entitlement;  // asked for unless empty
  Gathered<std::weak_ptr<ipc::Connection>> connections;
  Gathered<std::string> events;  // "interrupted", "invalidated"
};

// What one call came to: the reply's values, or the error.
struct Outcome {
  std::optional<Array> values;
  Error error;
};

// A daemon and a client in one process, each with its own service, joined by a real socket.
class LocalServiceFixture : public ::testing::Test {
 protected:
  LocalServiceFixture();
  ~LocalServiceFixture() override;

  void serve();
  void stopServing();
  // A connection whose handlers report to clientEvents; not resumed.
  std::shared_ptr<ipc::Connection> newConnection();
  std::shared_ptr<ipc::Connection> connected();

  // Calls with an answer; outcomes takes what it comes to.
  void call(ipc::Connection& connection, uint16_t operation, Array arguments);
  Outcome callAndWait(ipc::Connection& connection, uint16_t operation, Array arguments);
  static void send(ipc::Connection& connection, uint16_t operation, Array arguments);
  // Expects that the daemon answers a new client.
  void expectServing();
  std::string socketPath() const { return files.resolve(std::string("/run/telvane/") + kServiceName + ".socket"); }
  static std::string socketPathBelow(const std::string& root) {
    return root + "/run/telvane/" + kServiceName + ".socket";
  }

  ScratchFolder scratch;
  RecordingLog log;
  std::unique_ptr<ThreadedDispatch> ownDispatch = std::make_unique<ThreadedDispatch>();
  Dispatch& dispatch = *ownDispatch;
  PosixFileSystem files;
  ipc::Entitlements entitlements;
  FlowGate gate{1000};
  ipc::Limits daemonLimits;
  ipc::Limits clientLimits;
  AcceptingDelegate delegate;
  std::unique_ptr<ipc::SocketService> daemon;
  std::unique_ptr<ipc::Listener> listener;
  std::unique_ptr<ipc::SocketService> client;
  Gathered<std::string> clientEvents;
  Gathered<Outcome> outcomes;
};

}  // namespace telvane::testing
