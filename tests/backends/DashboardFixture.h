#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "backends/DashboardBackend.h"
#include "interfaces/StorebagKeys.h"
#include "tests/support/Matchers.h"
#include "tests/support/RecordingConnectivity.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {

// One process with a dashboard backend, and the dashboard that it sends to. A test changes what it is about before it
// makes the backend.
class DashboardFixture : public ::testing::Test {
 protected:
  using Bytes = SimulatedDatagramNetwork::Bytes;
  static constexpr char kIP[] = "192.0.2.7";
  static constexpr uint16_t kPort = 9000;
  static constexpr char kDeviceIdentifier[] = "0123456789abcdef0123456789abcdef01234567";
  static constexpr std::chrono::milliseconds kPeriod{100};

  DashboardFixture();
  ~DashboardFixture() override;

  RecordingLog& log() { return _process.log(); }
  SimulatedDatagramNetwork& network() { return _world.datagrams(); }
  SimulatedDatagramNetwork::Server& dashboard() { return network().serve(kIP, kPort); }
  const ProcessContext& context() { return _context; }
  void givenReliable() { _profile.set(kProfileReliable, static_cast<int>(kPeriod.count())); }

  // Makes the backend of _profile, with the identity of a session.
  DashboardBackend& make() { return take(DashboardBackend::initWithName(context(), "dashboard", _profile, "Box")); }
  std::shared_ptr<DashboardBackend> tryToMake() {
    return DashboardBackend::initWithName(context(), "dashboard", _profile, "Box");
  }
  DashboardBackend& take(std::shared_ptr<DashboardBackend> backend);
  DashboardBackend& backend() { return *_backend; }
  // Lets go of the backend, as a session does that forgets cleanup.
  void letGo() { _backend.reset(); }
  void cleanupAndLetGo();

  // Sends an event and lets the network queue work; time stands still.
  std::optional<String> send(Dictionary event, uint16_t method = 7, uint16_t respCode = 2);
  void sendMany(int count);
  void tick(int periods = 1) { _world.advance(kPeriod * periods); }

  // What the dashboard has got, as whole periods since the start of the test.
  std::vector<int64_t> arrivalPeriods();
  static std::string textOf(const Bytes& datagram);
  static std::string lastTextAt(SimulatedDatagramNetwork::Server& server);
  static uint16_t eventIDOf(const Bytes& datagram);
  // A datagram that acknowledges this event.
  static Bytes acknowledgementOf(uint16_t eventID, size_t length = 62);
  // Who the backend sends from, as the dashboard has seen it.
  IPv4SocketAddress sender() { return dashboard().arrivals().back().from; }
  void acknowledge(uint16_t eventID) { dashboard().answer(sender(), acknowledgementOf(eventID)); }

  SimulatedWorld _world;
  Dictionary _profile;
  std::shared_ptr<RecordingConnectivity> _connectivity = std::make_shared<RecordingConnectivity>();
  SimulatedPlatform& _process;
  const ProcessContext _context;
  std::shared_ptr<DashboardBackend> _backend;
};

}  // namespace telvane::testing
