// Sessions that belong together: who is whose parent, and what follows from it.
#include <algorithm>
#include <unordered_set>

#include "daemon/TelvanedAgent.h"

namespace telvane {

bool TelvanedAgent::isListed(const CorrelatedSessions& list, const TelvanedSession& session) const {
  return std::any_of(list.begin(), list.end(), [&session](const auto& weak) { return weak.lock().get() == &session; });
}

TelvanedAgent::CorrelatedSessions* TelvanedAgent::correlatedSessions(const String& token) {
  const auto found = _correlatedSessions.find(token.view());
  return found != _correlatedSessions.end() && !found->second.empty() ? &found->second : nullptr;
}

void TelvanedAgent::updateCorrelatedSessions(TelvanedSession& session) {
  const std::optional<String> token = session.hierarchyToken();
  if (!token.has_value()) {
    log().message("updateCorrelatedSessions: Session {} has no correlated sessions as it is a standalone session",
                  session.sessionID());
    return;
  }
  MonitorLock lock(*_monitor);
  for (auto& [anyToken, list] : _correlatedSessions) {
    std::erase_if(list, [&session](const auto& weak) { return weak.lock().get() == &session; });
  }
  log().message("updateCorrelatedSessions: Adding session {} to list for hierarchyToken {} with hierarchyLevel {}",
                session.sessionID(), *token, session.hierarchyLevel());
  _correlatedSessions[token->str()].push_back(session.weak_from_this());
  // A hierarchy that the move left empty stays until its session ends; unless one session makes more and more of them.
  if (_correlatedSessions.size() > _sessionList.size() + kMaximumEmptyHierarchies) forgetEmptyHierarchies();
}

void TelvanedAgent::forgetEmptyHierarchies() {
  for (auto entry = _correlatedSessions.begin(); entry != _correlatedSessions.end();) {
    if (!entry->second.empty()) {
      ++entry;
      continue;
    }
    _sharedData.erase(entry->first);
    entry = _correlatedSessions.erase(entry);
  }
}

TelvanedSession* TelvanedAgent::getFirstSessionWithHierarchy(
    int64_t level, const std::vector<std::weak_ptr<TelvanedSession>>& sessionList) {
  for (const auto& weak : sessionList) {
    // Listed sessions are kept alive by the session list, so the pointer outlives this reference.
    const auto session = weak.lock();
    if (session != nullptr && session->hierarchyLevel() == level) return session.get();
  }
  return nullptr;
}

TelvanedSession* TelvanedAgent::parentSessionForChild(TelvanedSession& session) {
  const std::optional<String> token = session.hierarchyToken();
  const int64_t level = session.hierarchyLevel();
  if (level < 1 || !token.has_value()) return nullptr;
  MonitorLock lock(*_monitor);
  log().message("parentSessionForChild: Checking hierarchyToken '{}' for session {}", *token, session.sessionID());
  const CorrelatedSessions* list = correlatedSessions(*token);
  if (list == nullptr) {
    log().error("parentSessionForChild: ERROR: No sessions found for hierarchyToken {}", *token);
    return nullptr;
  }
  if (!isListed(*list, session)) {
    log().error("parentSessionForChild: ERROR: Session {} not found for hierarchyToken {}", session.sessionID(),
                *token);
    return nullptr;
  }
  TelvanedSession* parent = getFirstSessionWithHierarchy(level - 1, *list);
  if (parent == nullptr) {
    log().message("parentSessionForChild: Unable to find session with hierarchy of {} for hierarchyToken '{}'",
                  level - 1, *token);
  }
  return parent;
}

std::optional<String> TelvanedAgent::parentSessionIDStringForSession(TelvanedSession& session) {
  const std::optional<String> token = session.hierarchyToken();
  const int64_t level = session.hierarchyLevel();
  if (level < 1 || !token.has_value()) return std::nullopt;
  log().message("parentSessionIDStringForSession: Checking hierarchyToken '{}' for session {}", *token,
                session.sessionID());
  MonitorLock lock(*_monitor);
  const CorrelatedSessions* list = correlatedSessions(*token);
  if (list == nullptr) {
    log().error("parentSessionIDStringForSession: ERROR: No sessions found for hierarchyToken {}", *token);
    return std::nullopt;
  }
  if (!isListed(*list, session)) {
    log().message("parentSessionIDStringForSession: Session {} not found for hierarchyToken {}", session.sessionID(),
                  *token);
    return std::nullopt;
  }
  std::optional<String> chain;
  // Ends at the first level without a session, so the work is bounded by the sessions that exist.
  for (int64_t n = level - 1; n >= 0; --n) {
    const TelvanedSession* ancestor = getFirstSessionWithHierarchy(n, *list);
    if (ancestor == nullptr) {
      log().message(
          "parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): incomplete "
          "parentSessionID is '{}'",
          chain.has_value() ? chain->view() : "(null)");
      break;
    }
    chain = chain.has_value() ? String(fmt::format("{}.{}", ancestor->sessionIDString(), *chain))
                              : ancestor->sessionIDString();
  }
  return chain;
}

TelvanedSession* TelvanedAgent::getAncestorWithAggregatorForSession(TelvanedSession& session) {
  const std::optional<String> token = session.hierarchyToken();
  const int64_t level = session.hierarchyLevel();
  if (!token.has_value() || level < 1) return nullptr;
  MonitorLock lock(*_monitor);
  const CorrelatedSessions* list = correlatedSessions(*token);
  if (list == nullptr) return nullptr;
  // Asked for each event, and most hierarchies have no aggregator.
  const auto isAggregating = [level](const auto& weak) {
    const auto candidate = weak.lock();
    return candidate != nullptr && candidate->hasAggregator() && candidate->hierarchyLevel() < level;
  };
  if (std::none_of(list->begin(), list->end(), isAggregating)) return nullptr;
  // The topmost aggregating one among those that stand for their level, found in one walk over the sessions there are.
  std::unordered_set<int64_t> seenLevels;
  TelvanedSession* topmost = nullptr;
  for (const auto& weak : *list) {
    const auto candidate = weak.lock();
    if (candidate == nullptr) continue;
    const int64_t candidateLevel = candidate->hierarchyLevel();
    if (candidateLevel < 0 || candidateLevel >= level || !seenLevels.insert(candidateLevel).second) continue;
    if (!candidate->hasAggregator()) continue;
    if (topmost == nullptr || candidateLevel < topmost->hierarchyLevel()) topmost = candidate.get();
  }
  return topmost;
}

void TelvanedAgent::updateDownstreamSessions(TelvanedSession& session) {
  const std::optional<String> token = session.hierarchyToken();
  if (!token.has_value()) return;
  MonitorLock lock(*_monitor);
  session.updateCombinedSessionID();
  session.syncReportingStates();
  const bool hasAncestor = session.hierarchyLevel() >= 1 && getAncestorWithAggregatorForSession(session) != nullptr;
  if (hasAncestor) session.shutdownSessionAggregation();
  CorrelatedSessions* list = correlatedSessions(*token);
  if (list == nullptr) return;
  // Levels below 0 are nobody's ancestors: what lies above must not fall silent for an aggregator that would hear
  // nothing.
  const bool isAggregated = hasAncestor || (session.hasAggregator() && session.hierarchyLevel() >= 0);
  for (const auto& weak : *list) {
    const auto descendant = weak.lock();
    if (descendant == nullptr || descendant->hierarchyLevel() <= session.hierarchyLevel()) continue;
    log().message("updateDownstreamSessions: Updating combined session ID and syncing reporting states for session {}",
                  descendant->sessionID());
    descendant->updateCombinedSessionID();
    descendant->syncReportingStates();
    if (isAggregated && descendant->hasAggregator()) descendant->shutdownSessionAggregation();
  }
}

}  // namespace telvane
