// Acceptance, the registry of sessions, and the transaction holds.
#include "daemon/TelvanedAgent.h"

#include <algorithm>
#include <limits>

#include "interfaces/SessionKeys.h"

namespace telvane {

TelvanedAgent::TelvanedAgent(const ProcessContext& context, ConnectivityShared& connectivityShared,
                             SessionShared& sessionShared, std::shared_ptr<StorebagRetriever> storebags)
    : _context(context),
      _connectivityShared(connectivityShared),
      _sessionShared(sessionShared),
      _storebags(std::move(storebags)),
      _startTime(context.platform().clock.monotonicNow()),
      _monitor(context.platform().dispatch.newMonitor()),
      _stateQueue(context.platform().dispatch.newSerialQueue("com.corvex.TelvaneAgentStateQueue")) {}

TelvanedAgent::~TelvanedAgent() = default;

// A process has one, so its name says all; an address would make two runs of a simulation differ.
std::string TelvanedAgent::description() const { return "<TelvanedAgent>"; }

bool TelvanedAgent::listener(ipc::Listener&, std::shared_ptr<ipc::Connection> shouldAcceptNewConnection) {
  const std::shared_ptr<ipc::Connection>& connection = shouldAcceptNewConnection;
  if (_isShuttingDown) return false;
  if (!connection->peerHasEntitlement(kTelvanedEntitlement)) {
    log().message("listener: new XPC connection {} does not have required telvane entitlement. Closing connection...",
                  connection->description());
    return false;
  }
  {
    MonitorLock lock(*_monitor);
    log().message("listener: Accepting new XPC connection {} as it has proper entitlement, {}({}) connections.",
                  connection->description(), _sessionList.size(), _correlatedSessions.size());
  }
  auto session = createReportingSessionWithDelegate(shared_from_this(), connection);
  connection->setExportedObject(
      std::make_shared<ClientSessionDispatcher>(log(), session, shared_from_this(), connection->peerIdentity()));
  connection->setInterruptionHandler([&log = log(), weakSession = std::weak_ptr(session)] {
    const auto interrupted = weakSession.lock();
    if (interrupted == nullptr) return;
    log.message("listener: XPC connection to {} was interrupted", interrupted->description());
  });
  connection->setInvalidationHandler([self = shared_from_this(), session] {
    self->log().message("listener: XPC connection to {} was invalidated", session->description());
    self->invalidateReportingSession(*session);
  });
  connection->resume();
  return true;
}

std::shared_ptr<TelvanedSession> TelvanedAgent::createReportingSessionWithDelegate(
    std::shared_ptr<TelvanedSessionDelegate> delegate, std::shared_ptr<ipc::Connection> connection) {
  ++_undestroyedSessions;
  auto session =
      TelvanedSession::initWithSessionDelegate(_context, _sessionShared, std::move(delegate), std::move(connection),
                                               [self = shared_from_this()] { self->reportingSessionEnded(); });
  MonitorLock lock(*_monitor);
  if (_xpcTransactionReference == 0) {
    _context.platform().transactions.begin();
    log().message("createReportingSessionWithDelegate: XPC transaction started with session {}",
                  session->description());
  }
  _sessionList.push_back(session);
  ++_xpcTransactionReference;
  log().message("createReportingSessionWithDelegate: retained XPC Transaction. Ref count is {}",
                _xpcTransactionReference);
  return session;
}

void TelvanedAgent::invalidateReportingSession(TelvanedSession& session) {
  // What leaves the list here ends, at the earliest, after the lock has been given back.
  std::shared_ptr<TelvanedSession> kept;
  MonitorLock lock(*_monitor);
  forgetCorrelation(session);
  const std::string description = session.description();
  const auto found = std::find_if(_sessionList.begin(), _sessionList.end(),
                                  [&session](const auto& listed) { return listed.get() == &session; });
  if (found != _sessionList.end()) {
    kept = std::move(*found);
    _sessionList.erase(found);
  }
  log().message("invalidateReportingSession: TelvanedSession {} was invalidated", description);
  uncount(session);
}

// It may stand under another token than the one that it has now: a client that gives its hierarchy up is not filed
// anew. Hierarchies that were left empty go, too, or a client could make as many as it likes.
void TelvanedAgent::forgetCorrelation(TelvanedSession& session) {
  for (auto& [anyToken, list] : _correlatedSessions) {
    std::erase_if(list, [&session](const auto& weak) {
      const auto listed = weak.lock();
      return listed == nullptr || listed.get() == &session;
    });
  }
  forgetEmptyHierarchies();
}

void TelvanedAgent::uncount(TelvanedSession& session) {
  // The type that it was counted under, whatever the client has claimed since. One that was never counted, because its
  // client type is missing or is none, takes nothing away from others.
  if (!session.countedClientType().has_value()) return;
  const int32_t clientType = *session.countedClientType();
  uint8_t& counter = _activeClients[static_cast<size_t>(clientType)];
  session.setCountedClientType(std::nullopt);
  if (counter == 0) return;
  --counter;
  log().info("invalidateReportingSession: active session count for clientType {} got decremented to {}", clientType,
             counter);
}

// A session whose client is gone is removed behind what it still does, and an upload may take days where there is no
// network. Its client type must not be locked out for that long.
void TelvanedAgent::uncountEnded(int32_t clientType) {
  for (const auto& session : _sessionList) {
    if (session->countedClientType() == clientType && session->hasConnectionEnded()) uncount(*session);
  }
}

void TelvanedAgent::releaseXPCTransactions(uint32_t count) {
  MonitorLock lock(*_monitor);
  if (_xpcTransactionReference < 1) return;
  _xpcTransactionReference = static_cast<int32_t>(static_cast<uint32_t>(_xpcTransactionReference) - count);
  log().message("releaseXPCTransactions: XPC transaction ref count is {}, decremented by {}", _xpcTransactionReference,
                count);
  if (_xpcTransactionReference > 0) return;
  _context.platform().transactions.end();
  log().message("releaseXPCTransactions: XPC transaction ended");
}

bool TelvanedAgent::isActiveClientLimitReachedForSession(TelvanedSession& session, const Value& sessionInfo) {
  MonitorLock lock(*_monitor);
  if (session.isCounted()) return false;
  session.setCounted(true);
  const Dictionary* dictionary = sessionInfo.dictionary();
  const Value& clientTypeValue = dictionary != nullptr ? (*dictionary)[kTelvaneSessionInfoClientType] : Value::none();
  const int64_t clientType = clientTypeValue.integerValue();
  if (!clientTypeValue.isPresent() || clientType < 0 || static_cast<size_t>(clientType) >= kClientTypeCounters) {
    log().error(
        "isActiveClientLimitReachedForSession: session {} missing clientType in its sessionInfo {}. Session "
        "terminated...",
        session.sessionID(), sessionInfo);
    session.invalidate();
    return true;
  }
  uint8_t& counter = _activeClients[static_cast<size_t>(clientType)];
  if (counter >= kMaximumActiveSessions) uncountEnded(static_cast<int32_t>(clientType));
  const bool isRefused = counter >= kMaximumActiveSessions;
  if (isRefused) {
    log().error(
        "isActiveClientLimitReachedForSession: session {} exceeds number of allowed active connections for clientType "
        "{}. Session terminated...",
        session.sessionID(), clientTypeValue);
  }
  // Refused sessions count until they are gone. A crowd of them must not carry the counter past its largest value to 0.
  if (counter < std::numeric_limits<uint8_t>::max()) {
    ++counter;
    session.setCountedClientType(static_cast<int32_t>(clientType));
  }
  log().info("isActiveClientLimitReachedForSession: active session count for clientType {} got incremented to {}",
             clientType, counter);
  if (isRefused) session.invalidate();
  return isRefused;
}

void TelvanedAgent::updateSharedDataForSession(TelvanedSession& session, const Dictionary& sharedData) {
  const std::optional<String> token = session.hierarchyToken();
  if (!token.has_value()) return;
  MonitorLock lock(*_monitor);
  const auto addition = _sharedData[token->str()].addEntriesFrom(sharedData);
  if (addition == HierarchySharedData::Addition::Refused) {
    log().error("updateSharedDataForSession: session {} would share more than {} bytes with its hierarchy. Not shared",
                session.sessionID(), HierarchySharedData::kMaximumBytes);
  }
}

void TelvanedAgent::removeObjectFromSharedDataForSession(TelvanedSession& session, const String& key) {
  const std::optional<String> token = session.hierarchyToken();
  if (!token.has_value()) return;
  MonitorLock lock(*_monitor);
  const auto found = _sharedData.find(token->view());
  if (found != _sharedData.end()) found->second.remove(key);
}

std::optional<Dictionary> TelvanedAgent::sharedDataForSession(TelvanedSession& session) {
  const std::optional<String> token = session.hierarchyToken();
  if (!token.has_value()) return std::nullopt;
  MonitorLock lock(*_monitor);
  const auto found = _sharedData.find(token->view());
  if (found == _sharedData.end()) return std::nullopt;
  return found->second.entries();
}

void TelvanedAgent::copyReportingAgentState(std::vector<std::shared_ptr<TelvanedSession>>& sessionList,
                                            Dictionary& cachedStorebags) {
  MonitorLock lock(*_monitor);
  sessionList = _sessionList;
  cachedStorebags = _cachedStorebags;
}

}  // namespace telvane
