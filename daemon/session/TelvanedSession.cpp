// A session's beginning and end.
#include "daemon/session/TelvanedSession.h"

#include <array>

#include "foundation/Base64.h"
#include "interfaces/EventKeys.h"
#include "interfaces/SessionEvents.h"
#include "interfaces/SessionKeys.h"
#include "util/DataHelpers.h"

namespace telvane {

std::shared_ptr<TelvanedSession> TelvanedSession::initWithSessionDelegate(
    const ProcessContext& context, SessionShared& shared, std::shared_ptr<TelvanedSessionDelegate> delegate,
    std::shared_ptr<ipc::Connection> connection, Job onEnd) {
  // The last reference's end is where a session says goodbye, on whichever thread that is; what it does there needs the
  // whole object, so it happens before destruction and not in a destructor.
  const auto end = std::make_shared<Job>(std::move(onEnd));
  return std::shared_ptr<TelvanedSession>(
      new TelvanedSession(context, shared, std::move(delegate), std::move(connection)),
      [end](TelvanedSession* session) {
        std::unique_ptr<TelvanedSession> owned(session);
        owned->dealloc();
        owned.reset();
        if (*end) (*end)();
      });
}

TelvanedSession::TelvanedSession(const ProcessContext& context, SessionShared& shared,
                                 std::shared_ptr<TelvanedSessionDelegate> delegate,
                                 std::shared_ptr<ipc::Connection> connection)
    : _context(context),
      _shared(shared),
      _sessionIDString(base64Encode(context.platform().random.newUUID().bytes())),
      _sessionDelegate(std::move(delegate)),
      _connection(std::move(connection)) {
  log().message("initWithSessionDelegate: TelvanedSession initWithSessionDelegate:{}", _sessionDelegate->description());
  fillDeviceID();
  log().message("initWithSessionDelegate: Initialized session with UUID {}", _sessionIDString);
}

TelvanedSession::~TelvanedSession() = default;

void TelvanedSession::fillDeviceID() {
  std::array<char, kMaximumDeviceIDLength + 1> buffer{};
  copyUniqueDeviceID(_context.platform().deviceAnswers, buffer);
  _deviceid = String(std::string_view(buffer.data()));
}

std::string TelvanedSession::description() const {
  return fmt::format("<TelvanedSession {} {}>", _sessionID, _sessionIDString);
}

std::optional<String> TelvanedSession::hierarchyToken() const {
  if (!_hierarchyDictionary.has_value()) return std::nullopt;
  const String* token = (*_hierarchyDictionary)[kTelvaneHierarchyTokenTokenID].string();
  if (token == nullptr) return std::nullopt;
  return *token;
}

int32_t TelvanedSession::hierarchyLevel() const noexcept {
  return _hierarchyDictionary.has_value() ? (*_hierarchyDictionary)[kTelvaneHierarchyTokenLevel].int32Value() : 0;
}

void TelvanedSession::invalidate() {
  std::shared_ptr<ipc::Connection> connection;
  {
    MutexLock lock(_connectionLock);
    connection = std::move(_connection);
    if (_isAnswering && connection != nullptr) _connectionToEnd = std::move(connection);
  }
  if (connection != nullptr) connection->invalidate();
}

bool TelvanedSession::isRefused() {
  {
    MutexLock lock(_connectionLock);
    _isAnswering = true;
  }
  return _sessionDelegate->isActiveClientLimitReachedForSession(*this, _sessionInfo);
}

void TelvanedSession::endIfRefused() {
  std::shared_ptr<ipc::Connection> connection;
  {
    MutexLock lock(_connectionLock);
    _isAnswering = false;
    connection = std::move(_connectionToEnd);
  }
  if (connection != nullptr) connection->invalidate();
}

void TelvanedSession::finishSessionGracefully() {
  _hasFinishedGracefully = true;
  log().message("finishSessionGracefully: Session {} has been finished gracefully", _sessionID);
}

Dictionary TelvanedSession::stopPayload() {
  Dictionary payload;
  if (_storebagVersion.has_value()) {
    payload.set(kEventStorebagVersion, *_storebagVersion);
    payload.set(kEventGracefulTermination, Value(_hasFinishedGracefully));
  }
  std::vector<std::shared_ptr<TelvanedSession>> sessionList;
  Dictionary cachedStorebags;
  _sessionDelegate->copyReportingAgentState(sessionList, cachedStorebags);
  addSessionsAccumulatedHealthInfoToPayload(payload, sessionList, cachedStorebags);
  return payload;
}

void TelvanedSession::dealloc() {
  log().message("dealloc: TelvanedSession dealloc: {}", _sessionID);
  const Dictionary payload = stopPayload();
  if (_backends.has_value() && _sessionInfo.isPresent()) {
    internalSendMessage(payload, kSessionMethod, kSessionStop);
    flushMessagesWithCompletion(nullptr);
  }
  shutdownSessionAggregation();
  returnTransactionHold();
  releaseUserInfo();
  if (_backends.has_value()) {
    for (const auto& [name, backend] : *_backends) backend->cleanup();
  }
}

bool TelvanedSession::hasConnectionEnded() const {
  MutexLock lock(_connectionLock);
  return _connection != nullptr && _connection->hasEnded();
}

void TelvanedSession::returnTransactionHold() {
  if (_connectivityHelper != nullptr) {
    // The helper gives the hold back when the last posts of its sessions are through.
    log().message("TelvanedSession dealloc: incrementing total sessions count for session {}", _sessionID);
    _connectivityHelper->incrementTotalSessionsServedCount();
    return;
  }
  log().message(
      "TelvanedSession dealloc: release XPC transaction for session without connectivity helper for session {}",
      _sessionID);
  MonitorLock lock(_sessionDelegate->monitor());
  _sessionDelegate->releaseXPCTransactions(1);
}

}  // namespace telvane
