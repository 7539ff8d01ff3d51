// The pool of connectivity helpers, and the daemon's end.
#include "daemon/TelvanedAgent.h"
#include "util/DataHelpers.h"

namespace telvane {

std::shared_ptr<ReportingSessionConnectivityHelper> TelvanedAgent::copySharedConnectivityHelperForReportingSession(
    TelvanedSession& session, int32_t mode) {
  if (!session.hasValidUserInfoKeys()) return nullptr;
  const std::string userInfoKey = clientServiceKey(session.userInfo()).str();
  std::shared_ptr<ReportingSessionConnectivityHelper> helper;
  _stateQueue->sync([this, &helper, &userInfoKey, mode, &session] {
    _stateQueue->assertOnQueue();
    helper = requestHelper(userInfoKey, mode, *session.userInfo().dictionary());
  });
  return helper;
}

std::shared_ptr<ReportingSessionConnectivityHelper> TelvanedAgent::requestHelper(const std::string& userInfoKey,
                                                                                 int32_t mode,
                                                                                 const Dictionary& userInfo) {
  log().message(
      "requestSharedConnectivityHelperForReportingSession: Requesting shared connectivity helper for userInfoKey {}",
      userInfoKey);
  std::shared_ptr<ReportingSessionConnectivityHelper>& helper = _sharedConnectivityHelpers[userInfoKey];
  if (helper != nullptr) {
    log().message(
        "requestSharedConnectivityHelperForReportingSession: Found existing shared connectivity helper for "
        "userInfoKey {}",
        userInfoKey);
  } else {
    log().message(
        "requestSharedConnectivityHelperForReportingSession: Creating shared connectivity helper for userInfoKey {}",
        userInfoKey);
    helper = ReportingSessionConnectivityHelper::initWithDelegate(_context, _connectivityShared, weak_from_this(), mode,
                                                                  userInfo);
  }
  log().message(
      "requestSharedConnectivityHelperForReportingSession: Incrementing usage of shared connectivity helper for "
      "userInfoKey {}",
      userInfoKey);
  helper->ownerIncrementUsageCount();
  return helper;
}

void TelvanedAgent::releaseSharedConnectivityHelperForReportingSession(TelvanedSession& session) {
  _stateQueue->async([self = shared_from_this(), userInfoKey = clientServiceKey(session.userInfo()).str()] {
    self->_stateQueue->assertOnQueue();
    self->releaseHelper(userInfoKey);
  });
}

void TelvanedAgent::releaseHelper(const std::string& userInfoKey) {
  log().message(
      "releaseSharedConnectivityHelperForReportingSession: Releasing shared connectivity helper for userInfoKey {}",
      userInfoKey);
  const auto found = _sharedConnectivityHelpers.find(userInfoKey);
  if (found == _sharedConnectivityHelpers.end()) return;
  log().message(
      "releaseSharedConnectivityHelperForReportingSession: Decrementing usage count of shared connectivity helper for "
      "userInfoKey {}",
      userInfoKey);
  found->second->ownerDecrementUsageCountWithBlock(
      [self = shared_from_this(), userInfoKey, weakHelper = std::weak_ptr(found->second)](uint32_t usageCount) {
        self->_stateQueue->assertOnQueue();
        if (usageCount != 0) return;
        const auto unused = self->_sharedConnectivityHelpers.find(userInfoKey);
        if (unused == self->_sharedConnectivityHelpers.end()) return;
        // A helper may say more than once that nobody uses it; by then the key may be that of its successor, in use.
        if (unused->second != weakHelper.lock()) return;
        self->log().message(
            "releaseSharedConnectivityHelperForReportingSession: Usage count of shared connectivity helper for "
            "userInfoKey {} reached zero. Invalidating the helper",
            userInfoKey);
        const auto helper = std::move(unused->second);
        self->_sharedConnectivityHelpers.erase(unused);
        helper->invalidate();
      },
      _stateQueue);
}

void TelvanedAgent::shutDown() {
  _isShuttingDown = true;
  // Their sessions still have events to send, which wait behind them.
  _context.runningUploads().cancelAll();
  std::vector<std::shared_ptr<TelvanedSession>> sessions;
  {
    MonitorLock lock(*_monitor);
    sessions = _sessionList;
  }
  for (const auto& session : sessions) session->invalidate();
  sessions.clear();
  if (_undestroyedSessions == 0) invalidateAllHelpers();
}

void TelvanedAgent::reportingSessionEnded() {
  if (--_undestroyedSessions == 0 && _isShuttingDown) invalidateAllHelpers();
}

void TelvanedAgent::invalidateAllHelpers() {
  _stateQueue->async([self = shared_from_this()] {
    self->_stateQueue->assertOnQueue();
    for (const auto& [userInfoKey, helper] : self->_sharedConnectivityHelpers) helper->invalidate();
    self->_sharedConnectivityHelpers.clear();
  });
}

}  // namespace telvane
