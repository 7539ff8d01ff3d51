#include "bench/ArrivalServer.h"

#include <stdexcept>

#include "bench/Measurement.h"

namespace telvane::bench {
namespace {

constexpr auto kPatience = std::chrono::seconds(20);

}  // namespace

ArrivalServer::ArrivalServer(const std::string& certificateFile, const std::string& privateKeyFile) {
  HTTPServer::Options options;
  options.certificateFile = certificateFile;
  options.privateKeyFile = privateKeyFile;
  auto started = HTTPServer::start(std::move(options), [this](HTTPServer::Request request, const auto& responder) {
    take(std::move(request), responder);
  });
  if (started.has_error()) throw std::runtime_error(started.error().description());
  _server = std::move(*started);
}

void ArrivalServer::take(HTTPServer::Request request, const std::shared_ptr<HTTPServer::Responder>& responder) {
  const double now = monotonicSeconds();
  responder->send({200, {{"Content-Type", "application/json"}}, Data::copyOf("{}")});
  const std::lock_guard lock(_mutex);
  _arrivals.push_back({now, std::move(request)});
  _hasArrived.notify_one();
}

ArrivalServer::Arrival ArrivalServer::next() {
  std::unique_lock lock(_mutex);
  if (!_hasArrived.wait_for(lock, kPatience, [this] { return !_arrivals.empty(); })) {
    throw std::runtime_error("a request did not arrive");
  }
  Arrival arrival = std::move(_arrivals.front());
  _arrivals.pop_front();
  return arrival;
}

}  // namespace telvane::bench
