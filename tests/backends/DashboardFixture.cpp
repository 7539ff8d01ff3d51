#include "tests/backends/DashboardFixture.h"

#include <stdexcept>

#include "backends/DashboardDatagram.h"
#include "interfaces/SessionKeys.h"

namespace telvane::testing {

DashboardFixture::DashboardFixture()
    : _profile{{kProfileIP, kIP}, {kProfilePort, kPort}},
      _process(_world.makeProcess("telvaned")),
      _context(_process.platform()) {
  dashboard();
}

DashboardFixture::~DashboardFixture() {
  _backend.reset();
  _world.end();
}

DashboardBackend& DashboardFixture::take(std::shared_ptr<DashboardBackend> backend) {
  if (backend == nullptr) throw std::runtime_error("the profile of the test makes no backend");
  _backend = std::move(backend);
  _backend->setSelfVersion("8.1");
  _backend->setCompType(6);
  _backend->setSessionID(4711);
  _backend->setClientVersion(3);
  _backend->setUdid(kDeviceIdentifier);
  _backend->setReportingSessionConnectivityDelegate(_connectivity);
  return *_backend;
}

void DashboardFixture::cleanupAndLetGo() {
  _backend->cleanup();
  _backend.reset();
  _world.runUntilIdle();
}

std::optional<String> DashboardFixture::send(Dictionary event, uint16_t method, uint16_t respCode) {
  TelvaneBackend& base = *_backend;
  auto line = base.sendMessage(Dictionary{{kTelvaneMessageBlobClientData, std::move(event)}}, _world.clock().now(),
                               method, respCode, 0);
  _world.runUntilIdle();
  return line;
}

void DashboardFixture::sendMany(int count) {
  for (int n = 0; n < count; ++n) send(Dictionary{{Key("n"), n}});
}

std::vector<int64_t> DashboardFixture::arrivalPeriods() {
  std::vector<int64_t> periods;
  for (const auto& arrival : dashboard().arrivals()) {
    periods.push_back((arrival.at - SimulatedScheduler::kStart) / kPeriod);
  }
  return periods;
}

std::string DashboardFixture::textOf(const Bytes& datagram) {
  if (datagram.size() < dashboard::kHeaderLength) return "<no header>";
  return {datagram.begin() + dashboard::kHeaderLength, datagram.end()};
}

std::string DashboardFixture::lastTextAt(SimulatedDatagramNetwork::Server& server) {
  return server.arrivals().empty() ? "<nothing>" : textOf(server.arrivals().back().bytes);
}

uint16_t DashboardFixture::eventIDOf(const Bytes& datagram) {
  return static_cast<uint16_t>(datagram.at(60) << 8 | datagram.at(61));
}

DashboardFixture::Bytes DashboardFixture::acknowledgementOf(uint16_t eventID, size_t length) {
  Bytes bytes(std::max<size_t>(length, 62), uint8_t{0});
  bytes[60] = static_cast<uint8_t>(eventID >> 8);
  bytes[61] = static_cast<uint8_t>(eventID);
  bytes.resize(length);
  return bytes;
}

}  // namespace telvane::testing
