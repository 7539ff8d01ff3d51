#include "tests/support/SimulatedDatagramSockets.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <utility>

namespace telvane::testing {
namespace {

// From TEST-NET-2, so that no test takes it for a server of its own.
constexpr std::array<uint8_t, 4> kOwnAddress{198, 51, 100, 1};
constexpr uint16_t kFirstPort = 40000;

Error failure(int code, const char* what) {
  return Error::withDescription(kPlatformErrorDomain, code, std::string(what) + ": " + std::strerror(code));
}

}  // namespace

// What a socket, its source and the network share: the socket as it stands in the network.
class SimulatedDatagramNetwork::Endpoint {
 public:
  Endpoint(SimulatedScheduler& scheduler, SimulatedScheduler::ProcessID process, const IPv4SocketAddress& local)
      : _scheduler(scheduler), _process(process), _local(local) {}

  const IPv4SocketAddress& local() const noexcept { return _local; }
  const std::optional<IPv4SocketAddress>& peer() const noexcept { return _peer; }
  void setPeer(const IPv4SocketAddress& peer) { _peer = peer; }
  void setSource(std::weak_ptr<Source> source) { _source = std::move(source); }
  bool hasSomething() const noexcept { return _error.has_value() || !_inbox.empty(); }
  std::optional<int> takeError() { return std::exchange(_error, std::nullopt); }
  std::optional<Bytes> takeDatagram() {
    if (_inbox.empty()) return std::nullopt;
    Bytes bytes = std::move(_inbox.front());
    _inbox.pop_front();
    return bytes;
  }
  void arrive(const IPv4SocketAddress& from, const Bytes& bytes) {
    if (_scheduler.hasEnded(_process) || (_peer.has_value() && *_peer != from)) return;
    _inbox.push_back(bytes);
    tellSource();
  }
  void refused() {
    _error = ECONNREFUSED;
    tellSource();
  }

 private:
  void tellSource();

  SimulatedScheduler& _scheduler;
  const SimulatedScheduler::ProcessID _process;
  const IPv4SocketAddress _local;
  std::optional<IPv4SocketAddress> _peer;
  std::deque<Bytes> _inbox;
  std::optional<int> _error;
  std::weak_ptr<Source> _source;
};

class SimulatedDatagramNetwork::Source final : public std::enable_shared_from_this<Source> {
 public:
  Source(const std::shared_ptr<Endpoint>& endpoint, std::shared_ptr<SimulatedSerialQueue> queue,
         UniqueFunction<void()> onReadable, Job onCancel)
      : _endpoint(endpoint),
        _queue(std::move(queue)),
        _onReadable(std::move(onReadable)),
        _onCancel(std::move(onCancel)) {}

  void tell() {
    if (_isCancelled || std::exchange(_isTold, true)) return;
    _queue->post([source = shared_from_this()] { source->fire(); });
  }
  void cancel() {
    if (std::exchange(_isCancelled, true)) return;
    _queue->post([source = shared_from_this()] {
      source->_onReadable = nullptr;
      if (source->_onCancel) std::exchange(source->_onCancel, nullptr)();
    });
  }

 private:
  void fire() {
    if (_isCancelled) return;
    UniqueFunction<void()> handler = std::move(_onReadable);
    handler();
    _isTold = false;
    if (_isCancelled) return;
    _onReadable = std::move(handler);
    const auto endpoint = _endpoint.lock();
    if (endpoint == nullptr) throw SimulationFailure("a datagram socket is gone before its read source was cancelled");
    if (endpoint->hasSomething()) tell();
  }

  const std::weak_ptr<Endpoint> _endpoint;
  const std::shared_ptr<SimulatedSerialQueue> _queue;
  UniqueFunction<void()> _onReadable;
  Job _onCancel;
  bool _isTold = false;
  bool _isCancelled = false;
};

void SimulatedDatagramNetwork::Endpoint::tellSource() {
  if (const auto source = _source.lock()) source->tell();
}

class SimulatedDatagramNetwork::Socket final : public DatagramSocket {
 public:
  Socket(SimulatedDatagramNetwork& network, std::shared_ptr<Endpoint> endpoint)
      : _network(network), _endpoint(std::move(endpoint)) {}

  Result<void> bind() override {
    if (_network._faults.bind.has_value()) return failure(*_network._faults.bind, "bind");
    return {};
  }
  Result<void> connect(const IPv4SocketAddress& address) override {
    if (_network._faults.connect.has_value()) return failure(*_network._faults.connect, "connect");
    _endpoint->setPeer(address);
    return {};
  }
  Result<size_t> send(const uint8_t* bytes, size_t length) override {
    return _network.transmit(*_endpoint, bytes, length);
  }
  Result<size_t> receive(uint8_t* buffer, size_t capacity) override {
    if (const auto error = _endpoint->takeError()) return failure(*error, "receive");
    const auto bytes = _endpoint->takeDatagram();
    if (!bytes.has_value()) return failure(EAGAIN, "receive");
    const size_t length = std::min(bytes->size(), capacity);
    std::copy_n(bytes->begin(), length, buffer);
    return length;
  }
  std::unique_ptr<ReadSource> newReadSource(std::shared_ptr<SerialQueue> queue, UniqueFunction<void()> onReadable,
                                            Job onCancel) override {
    if (_network._faults.hasNoReadSources) return nullptr;
    auto simulated = std::dynamic_pointer_cast<SimulatedSerialQueue>(std::move(queue));
    if (simulated == nullptr) throw SimulationFailure("a simulated socket is given a queue that is not simulated");
    auto source = std::make_shared<Source>(_endpoint, std::move(simulated), std::move(onReadable), std::move(onCancel));
    _endpoint->setSource(source);
    if (_endpoint->hasSomething()) source->tell();
    return std::make_unique<Handle>(std::move(source));
  }

 private:
  class Handle final : public ReadSource {
   public:
    explicit Handle(std::shared_ptr<Source> source) : _source(std::move(source)) {}
    ~Handle() override { _source->cancel(); }
    Handle(const Handle&) = delete;
    Handle& operator=(const Handle&) = delete;
    void cancel() override { _source->cancel(); }

   private:
    const std::shared_ptr<Source> _source;
  };

  SimulatedDatagramNetwork& _network;
  const std::shared_ptr<Endpoint> _endpoint;
};

void SimulatedDatagramNetwork::Server::arrive(Arrival arrival) {
  if (_losses > 0) {
    --_losses;
    return;
  }
  _arrivals.push_back(arrival);
  if (_handler) _handler(arrival);
}

void SimulatedDatagramNetwork::Server::answer(const IPv4SocketAddress& to, Bytes bytes, Duration after) {
  if (after <= Duration::zero()) {
    _network.send(_address, to, bytes);
    return;
  }
  _network._scheduler.startTimer(SimulatedScheduler::kNoProcess, after,
                                 [this, to, bytes = std::move(bytes)] { _network.send(_address, to, bytes); });
}

IPv4SocketAddress SimulatedDatagramNetwork::addressOf(std::string_view dottedAddress, uint16_t port) {
  const auto address = ipv4SocketAddress(dottedAddress, port);
  if (!address.has_value()) throw std::invalid_argument("no IPv4 address: " + std::string(dottedAddress));
  return *address;
}

SimulatedDatagramNetwork::Server& SimulatedDatagramNetwork::serve(std::string_view dottedAddress, uint16_t port) {
  const IPv4SocketAddress address = addressOf(dottedAddress, port);
  auto& server = _servers[address];
  if (server == nullptr) server = std::make_unique<Server>(*this, address);
  return *server;
}

void SimulatedDatagramNetwork::refuse(std::string_view dottedAddress, uint16_t port) {
  _refusing.push_back(addressOf(dottedAddress, port));
}

void SimulatedDatagramNetwork::send(const IPv4SocketAddress& from, const IPv4SocketAddress& to, const Bytes& bytes) {
  if (const auto server = _servers.find(to); server != _servers.end()) {
    server->second->arrive({_scheduler.now(), from, bytes});
    return;
  }
  const auto found = _endpoints.find(to);
  if (found == _endpoints.end()) return;
  if (const auto endpoint = found->second.lock()) endpoint->arrive(from, bytes);
}

Result<size_t> SimulatedDatagramNetwork::transmit(Endpoint& from, const uint8_t* bytes, size_t length) {
  if (const auto error = from.takeError()) return failure(*error, "send");
  if (!from.peer().has_value()) return failure(EDESTADDRREQ, "send");
  if (!_faults.sends.empty()) {
    const int fault = _faults.sends.front();
    _faults.sends.pop_front();
    if (fault < 0) return failure(-fault, "send");
    if (static_cast<size_t>(fault) < length) return static_cast<size_t>(fault);
  }
  ++_datagramsSent;
  const IPv4SocketAddress to = *from.peer();
  if (std::find(_refusing.begin(), _refusing.end(), to) != _refusing.end()) {
    from.refused();
  } else {
    send(from.local(), to, Bytes(bytes, bytes + length));
  }
  return length;
}

size_t SimulatedDatagramNetwork::openSockets() const {
  return static_cast<size_t>(
      std::count_if(_endpoints.begin(), _endpoints.end(), [](const auto& entry) { return !entry.second.expired(); }));
}

Result<std::unique_ptr<DatagramSocket>> SimulatedDatagramSockets::newSocket() {
  if (_network._faults.newSocket.has_value()) return failure(*_network._faults.newSocket, "socket");
  const auto port = static_cast<uint16_t>(kFirstPort + _network._socketsMade++);
  const IPv4SocketAddress local{kOwnAddress, port};
  auto endpoint = std::make_shared<SimulatedDatagramNetwork::Endpoint>(_network._scheduler, _dispatch.process(), local);
  _network._endpoints[local] = endpoint;
  std::unique_ptr<DatagramSocket> socket =
      std::make_unique<SimulatedDatagramNetwork::Socket>(_network, std::move(endpoint));
  return socket;
}

}  // namespace telvane::testing
