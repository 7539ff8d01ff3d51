#include "backends/DashboardBackend.h"

#include <algorithm>
#include <array>
#include <new>

#include "backends/ClientMessage.h"
#include "backends/DashboardDatagram.h"
#include "interfaces/ClientTypes.h"
#include "interfaces/StorebagKeys.h"
#include "platform/Transactions.h"

namespace telvane {
namespace {

constexpr std::chrono::milliseconds kTimerLeeway{100};
// After how many ticks since the last transmission a packet is sent again, by how often it was already.
constexpr std::array<uint32_t, 4> kCheckThresholds = {2, 3, 5, 9};

struct EndTransaction {
  void operator()(Transactions* transactions) const { transactions->end(); }
};
using TransactionHold = std::unique_ptr<Transactions, EndTransaction>;

TransactionHold holdTransaction(Transactions& transactions) {
  transactions.begin();
  return TransactionHold(&transactions);
}

std::chrono::milliseconds boundedPeriod(int64_t milliseconds) {
  if (milliseconds <= 0) return DashboardBackend::kDefaultPeriod;
  constexpr int64_t kLongest = DashboardBackend::kLongestPeriod.count();
  return std::max(DashboardBackend::kShortestPeriod, std::chrono::milliseconds(std::min(milliseconds, kLongest)));
}

std::string_view shortNameOf(uint8_t componentType) noexcept {
  const ClientType* row = clientType(componentType);
  return row != nullptr ? row->senderName : std::string_view("unknown");
}

}  // namespace

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(const ProcessContext& context, const String& name,
                                                                 const Value& profile,
                                                                 const std::optional<String>& productFamily) {
  std::optional<String> serverIP;
  uint16_t serverPort = 0;
  if (const Dictionary* section = profile.dictionary()) {
    if (const String* text = (*section)[kProfileIP].string()) serverIP = *text;
    serverPort = (*section)[kProfilePort].low16Bits();
  }
  return initWithName(context, name, profile, serverIP, serverPort, productFamily);
}

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(const ProcessContext& context, const String& name,
                                                                 const std::optional<String>& serverIP,
                                                                 uint16_t serverPort,
                                                                 const std::optional<String>& productFamily) {
  if (!serverIP.has_value()) return nullptr;
  return initWithName(context, name, Value(), serverIP, serverPort, productFamily);
}

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(const ProcessContext& context, const String& name,
                                                                 const Value& profile,
                                                                 const std::optional<String>& serverIP,
                                                                 uint16_t serverPort,
                                                                 const std::optional<String>& productFamily) {
  Log& log = context.log();
  const Dictionary* section = profile.dictionary();
  if (section != nullptr && !hasServer(log, *section)) return nullptr;
  Result<std::unique_ptr<DatagramSocket>> socket = context.platform().datagramSockets.newSocket();
  if (socket.has_error()) {
    log.error("DashboardBackend(initWithName): socket() failed ({})", socket.error().code());
    return nullptr;
  }
  const std::shared_ptr<DashboardBackend> backend(
      new DashboardBackend(context, name, section != nullptr ? *section : Dictionary(),
                           productFamily.value_or(String()), section != nullptr, std::move(*socket)));
  if (section == nullptr && !serverIP.has_value()) {
    log.error("DashboardBackend(initWithName): initWitName with all null params.");
    return nullptr;
  }
  const Server server = section != nullptr
                            ? serverOfProfile(*section)
                            : Server{.address = ipv4SocketAddress(*serverIP, serverPort), .isReliable = true};
  return backend->start(server) ? backend : nullptr;
}

bool DashboardBackend::hasServer(Log& log, const Dictionary& profile) {
  if (!profile[kProfileIP].isString()) {
    log.error("DashboardBackend(initWithName): can't resolve server IP");
    return false;
  }
  if (!profile.contains(kProfilePort)) {
    log.error("DashboardBackend(initWithName): can't resolve server port");
    return false;
  }
  return true;
}

DashboardBackend::Server DashboardBackend::serverOfProfile(const Dictionary& profile) {
  const Value& reliable = profile[kProfileReliable];
  Server server{.address = ipv4SocketAddress(profile[kProfileIP].text(), profile[kProfilePort].low16Bits())};
  if (!reliable.isPresent()) return server;
  server.isReliable = true;
  server.period = boundedPeriod(reliable.integerValue());
  return server;
}

DashboardBackend::DashboardBackend(const ProcessContext& context, const String& name, Dictionary profile,
                                   const String& productFamily, bool usingProfile,
                                   std::unique_ptr<DatagramSocket> socket)
    : TelvaneBackend(context, name, std::move(profile), productFamily),
      _usingProfile(usingProfile),
      _networkProcQueue(context.platform().dispatch.newSerialQueue("com.corvex.Telvane.networkProc")),
      _socket(std::move(socket)) {
  if (const String* displayURL = _profile[kProfileDisplayURL].string()) _displayURL = *displayURL;
  if (const String* postURL = _profile[kProfilePostURL].string()) _postURL = *postURL;
}

// The sources cancel themselves; they do not hold this object.
DashboardBackend::~DashboardBackend() = default;

std::shared_ptr<DashboardBackend> DashboardBackend::shared() {
  return std::static_pointer_cast<DashboardBackend>(shared_from_this());
}

bool DashboardBackend::start(const Server& server) {
  bool isStarted = false;
  _networkProcQueue->sync([this, &server, &isStarted] {
    _networkProcQueue->assertOnQueue();
    if (server.isReliable) useReliableUDP();
    _period = server.period;
    isStarted = connect(server) && startTimer();
    if (isStarted) return;
    cleanupSources();
    _socket.reset();  // the read source's cancel handler closes it then, if there is one
  });
  return isStarted;
}

void DashboardBackend::useReliableUDP() {
  if (const Result<void> bound = _socket->bind(); bound.has_error()) {
    log().error("DashboardBackend(useReliableUDP): can't bind socket, {}", bound.error().code());
    return;
  }
  _reliableUDP = true;
  _readSource = _socket->newReadSource(
      _networkProcQueue,
      [weakSelf = weak()] {
        const auto self = weakSelf.lock();
        if (self == nullptr) return;
        self->_networkProcQueue->assertOnQueue();
        self->processSocketRead();
      },
      // The socket must not be closed before this runs, whoever else lets go of it.
      [weakSelf = weak(), socket = _socket] {
        const auto self = weakSelf.lock();
        if (self == nullptr) return;
        self->_networkProcQueue->assertOnQueue();
        self->_socket.reset();
      });
  if (_readSource == nullptr) log().error("DashboardBackend(useReliableUDP): can't create read source");
}

bool DashboardBackend::connect(const Server& server) {
  if (server.address.has_value() && _socket->connect(*server.address).has_value()) return true;
  log().error("DashboardBackend(initWithName): socket connect() failed.");
  return false;
}

bool DashboardBackend::startTimer() {
  Platform& platform = _context.platform();
  RepeatingTimer::Handlers handlers;
  handlers.onFire = [weakSelf = weak()] {
    const auto self = weakSelf.lock();
    if (self == nullptr) return;
    self->_networkProcQueue->assertOnQueue();
    self->myPeriodicTask();
  };
  handlers.onCancel = [weakSelf = weak()] {
    const auto self = weakSelf.lock();
    if (self == nullptr) return;
    self->_networkProcQueue->assertOnQueue();
    if (!self->_reliableUDP) self->_socket.reset();
  };
  // Events go on to be sent, each once; a cleanup does not need the timer.
  handlers.onLost = [weakSelf = weak()] {
    if (const auto self = weakSelf.lock()) {
      self->log().error("DashboardBackend(myPeriodicTask): no timer for the next tick. Nothing is sent again any more");
    }
  };
  _timer = RepeatingTimer::start(platform.dispatch, platform.clock, _networkProcQueue,
                                 {.delay = _period, .interval = _period, .leeway = kTimerLeeway}, std::move(handlers));
  if (_timer != nullptr) return true;
  log().error("DashboardBackend(initWithName): can't create timer source.");
  return false;
}

std::optional<String> DashboardBackend::sendMessage(Dictionary blob, Date timestamp, uint16_t method, uint16_t respCode,
                                                    uint16_t eventID, uint32_t /*flag*/) {
  return sendMessage(sentByClient(std::move(blob)), timestamp, method, respCode, eventID);
}

std::optional<String> DashboardBackend::sendMessage(const Dictionary& event, Date timestamp, uint16_t method,
                                                    uint16_t respCode, uint16_t eventID) {
  std::unique_ptr<uint8_t[]> buffer(new (std::nothrow) uint8_t[dashboard::kBufferLength]);
  if (buffer == nullptr) {
    log().error("DashboardBackend(sendMessage): can't malloc.");
    return std::nullopt;
  }
  auto* const text = reinterpret_cast<char*>(buffer.get() + dashboard::kHeaderLength);
  const size_t textLength = dashboard::writeText(event, {text, dashboard::kLongestText});
  dashboard::writeHeader({.majorVersion = _selfVersionMajor,
                          .componentType = static_cast<uint8_t>(_compType),
                          .timestamp = timestamp,
                          .sessionID = _sessionID,
                          .clientVersion = _clientVersion,
                          .method = method,
                          .responseCode = respCode,
                          .deviceIdentifier = _udid,
                          .eventID = eventID,
                          .isReliable = _reliableUDP,
                          .isWithoutProfile = !_usingProfile},
                         textLength, {buffer.get(), dashboard::kHeaderLength});
  const auto length = static_cast<uint32_t>(dashboard::kHeaderLength + textLength);
  String line = writeLocalLog({buffer.get(), length});
  _networkProcQueue->async([self = shared(), buffer = std::move(buffer), length, eventID,
                            hold = holdTransaction(_context.platform().transactions)] {
    self->_networkProcQueue->assertOnQueue();
    self->tryToSendMsg(buffer.get(), length, eventID);
  });
  return line;
}

String DashboardBackend::writeLocalLog(std::span<const uint8_t> datagram) {
  constexpr int kMicrosecondsPerMillisecond = 1000;
  const dashboard::Header header = dashboard::readHeader(datagram);
  const std::span<const uint8_t> text = datagram.subspan(dashboard::kHeaderLength);
  std::string line = fmt::format(
      "{}.{:03} {} 127.0.0.1 {} {:5} {:5} {:5} {:5} {:5} {}", header.timestamp.wholeSeconds(),
      header.timestamp.microseconds() / kMicrosecondsPerMillisecond, header.deviceIdentifier,
      shortNameOf(header.componentType), header.clientVersion, header.sessionID, header.eventID, header.method,
      header.responseCode, std::string_view(reinterpret_cast<const char*>(text.data()), text.size()));
  if (line.size() > kLongestLogLine) line.resize(kLongestLogLine);
  return String(line);
}

void DashboardBackend::tryToSendMsg(const uint8_t* bytes, size_t length, uint16_t eventNumber) {
  if (_socket == nullptr || _timer == nullptr) return;  // over: nobody would try it again
  const bool isSent = sendCompletely(bytes, length);
  if (isSent && !_reliableUDP) return;
  UDPPacketToSend packet = UDPPacketToSend::initWithBytes(bytes, length, eventNumber);
  packet.setState(isSent ? UDPPacketToSend::kWaitingForAcknowledgement : UDPPacketToSend::kNotYetSent);
  _messageQueue.push_back(std::move(packet));
  if (_messageQueue.size() > kMostPackets) _messageQueue.erase(_messageQueue.begin());
}

bool DashboardBackend::sendCompletely(const uint8_t* bytes, size_t length) {
  const Result<size_t> sent = _socket->send(bytes, length);
  return sent.has_value() && *sent == length;
}

void DashboardBackend::processSocketRead() {
  if (_socket == nullptr) return;
  std::array<uint8_t, dashboard::kBufferLength> buffer{};
  const Result<size_t> received = _socket->receive(buffer.data(), buffer.size());
  // Bytes that have not come name no event.
  if (received.has_error() || *received < dashboard::kEventIDOffset + sizeof(uint16_t)) return;
  const uint16_t eventID = dashboard::eventIDOf(buffer);
  const auto found = std::find_if(_messageQueue.begin(), _messageQueue.end(),
                                  [eventID](const UDPPacketToSend& packet) { return packet.eventNumber() == eventID; });
  if (found != _messageQueue.end()) _messageQueue.erase(found);
}

void DashboardBackend::myPeriodicTask() {
  for (size_t index = 0; index < _messageQueue.size();) {
    if (checkPacket(_messageQueue[index])) {
      ++index;
    } else {
      _messageQueue.erase(_messageQueue.begin() + static_cast<std::ptrdiff_t>(index));
    }
  }
  if (_cleanupState != CleanupState::Running) continueCleanup();
}

bool DashboardBackend::checkPacket(UDPPacketToSend& packet) {
  switch (packet.state()) {
    case UDPPacketToSend::kWaitingForAcknowledgement:
      return checkUnacknowledged(packet);
    case UDPPacketToSend::kNotYetSent:
      return checkUnsent(packet);
    default:
      return true;
  }
}

bool DashboardBackend::checkUnacknowledged(UDPPacketToSend& packet) {
  const uint32_t retransmits = packet.numberOfRetransmits();
  if (retransmits >= kCheckThresholds.size()) return false;
  const uint32_t checks = packet.numberOfChecks() + 1;
  if (checks < kCheckThresholds[retransmits]) {
    packet.setNumberOfChecks(checks);
  } else if (sendCompletely(packet.data().bytes(), packet.data().size())) {
    packet.setNumberOfChecks(0);
    packet.setNumberOfRetransmits(retransmits + 1);
  }
  return true;
}

bool DashboardBackend::checkUnsent(UDPPacketToSend& packet) {
  if (!sendCompletely(packet.data().bytes(), packet.data().size())) return true;
  if (!_reliableUDP) return false;
  packet.setState(UDPPacketToSend::kWaitingForAcknowledgement);
  return true;
}

void DashboardBackend::cleanup() {
  _networkProcQueue->async([self = shared()] {
    self->_networkProcQueue->assertOnQueue();
    if (self->_timer == nullptr) return;  // through already
    if (self->_messageQueue.empty()) {
      self->cleanupSources();
    } else if (self->_cleanupState == CleanupState::Running) {
      self->_lingering = self->_context.lingeringDashboards().take();
      // Each one-shot message makes a dashboard; a crowd of them must not take all descriptors of the process.
      self->_lingering != nullptr ? self->requestCleanup() : self->cleanupSources();
    }
  });
}

// The timer does not hold this object; a job does until the next tick. Should that be late, the job does its work.
void DashboardBackend::requestCleanup() {
  _cleanupState = CleanupState::Requested;
  _networkProcQueue->asyncAfter(_period + kTimerLeeway, [self = shared()] {
    self->_networkProcQueue->assertOnQueue();
    if (self->_cleanupState == CleanupState::Requested) self->continueCleanup();
  });
}

void DashboardBackend::continueCleanup() {
  if (_timer == nullptr) return;  // cleaned up already
  if (_messageQueue.empty()) {
    log().message("DashboardBackend(myPeriodicTask): clean up at myPeriodicTask.");
    cleanupSources();
  } else if (_cleanupState == CleanupState::Requested) {
    _cleanupState = CleanupState::LastResortScheduled;
    scheduleLastResort();
  }
}

void DashboardBackend::scheduleLastResort() {
  log().message("DashboardBackend(myPeriodicTask): scheduled last resort clean-up in {} ms.", kLastResort.count());
  _networkProcQueue->asyncAfter(kLastResort, [self = shared()] {
    self->_networkProcQueue->assertOnQueue();
    self->cleanupSources();
  });
}

void DashboardBackend::cleanupSources() {
  if (_timer != nullptr) _timer->cancel();
  _timer.reset();
  if (_readSource != nullptr) _readSource->cancel();
  _readSource.reset();
  _lingering.reset();
}

}  // namespace telvane
