#pragma once

#include <gtest/gtest.h>

#include <initializer_list>
#include <memory>
#include <optional>
#include <vector>

#include "client/ClientContext.h"
#include "client/TelvaneFactory.h"
#include "client/include/telvane/Telvane.h"
#include "interfaces/SessionKeys.h"
#include "tests/client/ScriptedDaemon.h"
#include "tests/support/Matchers.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {

// A client process and a scripted daemon on one simulated machine.
class ClientFixture : public ::testing::Test {
 protected:
  using Operation = ClientSessionOperation;
  using Operations = std::vector<Operation>;

  ~ClientFixture() override { _world.end(); }

  static Dictionary sessionInfo(int clientType = 7) { return {{kTelvaneSessionInfoClientType, clientType}}; }
  static Dictionary message(int category, int type = 1) {
    return {{kTelvaneMessageParametersCategory, category}, {kTelvaneMessageParametersType, type}};
  }
  std::shared_ptr<Telvane> open(const Value& info = sessionInfo(), const Value& userInfo = {},
                                const Value& frameworks = {}, Telvane::AggregationBlock aggregationBlock = {}) {
    return TelvaneFactory::initWithSessionInfo(_context, info, userInfo, frameworks, std::move(aggregationBlock));
  }
  // Opens a session, has the daemon answer its configuration with these lists, and waits for the answer.
  std::shared_ptr<Telvane> openConfigured(Value enabledBackends, Value whitelist = {}, Value blacklist = {}) {
    daemon().answer(Operation::StartConfig, Array{enabledBackends, whitelist, blacklist});
    daemon().answer(Operation::FetchDisplayURL, Array{"URL not available"});
    std::shared_ptr<Telvane> session = open();
    session->startConfigurationWithCompletionHandler({});
    run();
    return session;
  }
  void run() { _world.runUntilIdle(); }

  ScriptedDaemon& daemon() { return *_daemon; }
  RecordingLog& log() { return _client.log(); }
  SimulatedPlatform& client() { return _client; }

  SimulatedWorld _world;
  SimulatedPlatform& _daemonProcess = _world.makeProcess("telvaned");
  SimulatedPlatform& _client = _world.makeProcess("client");
  std::unique_ptr<ScriptedDaemon> _daemon = std::make_unique<ScriptedDaemon>(_daemonProcess.platform().localService);
  ClientContext _context{_client.platform()};
};

}  // namespace telvane::testing
