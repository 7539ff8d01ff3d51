#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

#include "connectivity/ReportingSessionConnectivityHelper.h"
#include "foundation/Value.h"

namespace telvane {

class TelvanedSession;

// What a session asks of the agent that made it. Safe from any thread unless an operation says that the caller holds
// the agent's lock (monitor()).
class TelvanedSessionDelegate : public ConnectivityHelperDelegate {
 public:
  // The storebag section of the session's client type, or nothing. May block for a download.
  virtual std::optional<Dictionary> storebagForSession(TelvanedSession& session) = 0;
  virtual std::optional<String> storebagVersionForSession(TelvanedSession& session) = 0;
  // The session ID strings of the session's ancestors joined by full stops, or nothing.
  virtual std::optional<String> parentSessionIDStringForSession(TelvanedSession& session) = 0;
  // Files the session under its hierarchy token.
  virtual void updateCorrelatedSessions(TelvanedSession& session) = 0;
  // The topmost ancestor whose client aggregates, or null. REQUIRES: monitor() held.
  virtual TelvanedSession* getAncestorWithAggregatorForSession(TelvanedSession& session) = 0;
  // Pushes changed states to the session's descendants.
  virtual void updateDownstreamSessions(TelvanedSession& session) = 0;
  // REQUIRES: monitor() held.
  virtual TelvanedSession* parentSessionForChild(TelvanedSession& session) = 0;
  // Shared data of the session's hierarchy. REQUIRES: monitor() held.
  virtual void updateSharedDataForSession(TelvanedSession& session, const Dictionary& sharedData) = 0;
  virtual void removeObjectFromSharedDataForSession(TelvanedSession& session, const String& key) = 0;
  virtual std::optional<Dictionary> sharedDataForSession(TelvanedSession& session) = 0;
  // Copies of the live sessions and of the storebag records.
  virtual void copyReportingAgentState(std::vector<std::shared_ptr<TelvanedSession>>& sessionList,
                                       Dictionary& cachedStorebags) = 0;
  // The helper shared by all sessions of the session's client and service name; null when its user info is not valid.
  virtual std::shared_ptr<ReportingSessionConnectivityHelper> copySharedConnectivityHelperForReportingSession(
      TelvanedSession& session, int32_t mode) = 0;
  virtual void releaseSharedConnectivityHelperForReportingSession(TelvanedSession& session) = 0;
  // Counts the session against its client type; true when it must not live, it has then been invalidated.
  virtual bool isActiveClientLimitReachedForSession(TelvanedSession& session, const Value& sessionInfo) = 0;
  // Describes the agent in log lines.
  virtual std::string description() const = 0;
};

}  // namespace telvane
