#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "daemon/TelvanedService.h"
#include "interfaces/BackendNames.h"
#include "interfaces/DefaultsKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/daemon/DaemonClient.h"
#include "tests/support/Matchers.h"
#include "tests/support/StorebagBuilder.h"

namespace telvane::testing {

// A whole daemon on a simulated machine, with clients that have its entitlement, a collector that takes everything, and
// storebags in its cache.
class DaemonFixture : public ::testing::Test {
 protected:
  // The client type of sessions unless a test says otherwise, and the name of its bag.
  static constexpr int kClientType = 6;
  static constexpr char kBagName[] = "media";

  DaemonFixture();
  ~DaemonFixture() override;

  // Starts the daemon; does nothing when it runs.
  void startDaemon();
  TelvanedAgent& agent();
  // A fresh, verified bag in the cache of the daemon.
  void givenStorebag(const StorebagBuilder& bag = {}, const std::string& name = kBagName);
  // The same with one section for this device.
  void givenSection(Dictionary section);
  // A section with HTTPS backends of these names and client entries.
  static Dictionary sectionOf(std::initializer_list<std::pair<const char*, Dictionary>> backends);
  // A permissive client entry with one key changed.
  static Dictionary clientWith(const Key& key, Value value);
  void givenInternalBuild() { process.deviceAnswers().set("ReleaseType", "Internal"); }
  void givenDefault(const Key& suite, const Key& key, Value value);

  // Session infos and user infos as a well-behaved client sends them.
  static Dictionary sessionInfo(int clientType = kClientType, uint32_t sessionID = 42);
  static Dictionary sessionInfoIn(const char* token, int level, uint32_t sessionID = 42);
  static Dictionary userInfo(const char* client = "player", const char* service = "movies");

  // A connection that has told nothing yet.
  std::unique_ptr<DaemonClient> connect();
  // A configured one.
  std::unique_ptr<DaemonClient> openSession(Dictionary info = sessionInfo(), Value user = userInfo(),
                                            bool hasAggregationBlock = false);
  // A configured and started one.
  std::unique_ptr<DaemonClient> startSession(Dictionary info = sessionInfo(), Value user = userInfo(),
                                             bool hasAggregationBlock = false);

  // The sessions that the daemon has, in the order in which they came.
  std::vector<std::shared_ptr<TelvanedSession>> sessions();
  Dictionary cachedStorebags();
  // All events posted so far, and those of a method and status.
  std::vector<Dictionary> postedEvents();
  std::vector<Dictionary> postedEvents(int method, int status);
  RecordingLog& log() { return process.log(); }

  SimulatedWorld world;
  SimulatedPlatform& process = world.makeProcess("telvaned");
  std::unique_ptr<TelvanedService> service;

 private:
  SimulatedPlatform& _clientProcess = world.makeProcess("client", {.entitlements = {kTelvanedEntitlement}});
};

}  // namespace telvane::testing
