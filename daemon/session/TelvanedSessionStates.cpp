// What a session tells its client of its backends, and how it follows its parent.
#include <algorithm>
#include <set>

#include "daemon/session/TelvanedSession.h"
#include "interfaces/BackendNames.h"

namespace telvane {
namespace {

// Numbers as the backends read them when they look an event up: equal for them is equal here.
Value distinctCategories(const Array& categories) {
  std::set<int32_t> seen;
  Array distinct;
  for (const Value& category : categories) {
    if (seen.insert(category.int32Value()).second) distinct.append(category);
  }
  return distinct;
}

}  // namespace

void TelvanedSession::fetchStatesWithUserInfo(Value userInfo, StatesReply completionHandler) {
  const bool isOneTooMany = isRefused();
  if (isOneTooMany) completionHandler({}, {}, {});
  endIfRefused();
  if (isOneTooMany) return;
  log().message("fetchStatesWithUserInfo: Fetching states for session {}", _sessionID);
  receivedUserInfo(std::move(userInfo));
  replyStates(completionHandler);
}

void TelvanedSession::replyStates(StatesReply& reply) const {
  reply(fetchReportingStates(), fetchWhitelistedEvents(), fetchBlacklistedEvents());
}

bool TelvanedSession::updateReportingStates() {
  bool isAnyEnabled = false;
  if (!_backends.has_value()) return false;
  for (const auto& [name, backend] : *_backends) {
    if (backend->updateState() == TelvaneBackendStateEnabled) isAnyEnabled = true;
  }
  return isAnyEnabled;
}

Value TelvanedSession::fetchReportingStates() const {
  if (!_backends.has_value() || _backends->empty()) return {};
  Array names;
  for (const auto& [name, backend] : *_backends) {
    if (backend->state() == TelvaneBackendStateEnabled) names.append(Value(name));
  }
  return names;
}

Value TelvanedSession::fetchWhitelistedEvents() const {
  if (!_backends.has_value() || _backends->empty()) return {};
  Array categories;
  for (const auto& [name, backend] : *_backends) {
    const Array* whitelist = backend->eventWhitelist().array();
    if (whitelist == nullptr) {
      // An enabled HTTPS backend without a whitelist takes every category, so the client must not filter.
      if (backend->isHTTPSPostBackend() && backend->state() == TelvaneBackendStateEnabled) return {};
      continue;
    }
    for (const Value& category : *whitelist) categories.append(category);
  }
  return distinctCategories(categories);
}

Value TelvanedSession::fetchBlacklistedEvents() const {
  if (!_backends.has_value()) return {};
  std::optional<Array> common;
  for (const auto& [name, backend] : *_backends) {
    const Array* blacklist = backend->eventBlacklist().array();
    if (!backend->isHTTPSPostBackend() || blacklist == nullptr) continue;
    if (!common.has_value()) {
      common = *blacklist;
      continue;
    }
    std::set<int32_t> barred;
    for (const Value& category : *blacklist) barred.insert(category.int32Value());
    Array both;
    for (const Value& category : *common) {
      if (barred.contains(category.int32Value())) both.append(category);
    }
    common = std::move(both);
  }
  return common.has_value() ? distinctCategories(*common) : Value();
}

void TelvanedSession::syncReportingStates() {
  MonitorLock lock(_sessionDelegate->monitor());
  TelvanedSession* parent = _sessionDelegate->parentSessionForChild(*this);
  if (!_backends.has_value()) return;
  for (const auto& [name, backend] : *_backends) {
    if (parent == nullptr) {
      if (hierarchyLevel() != 0) {
        log().message("syncReportingStates: child session {} (backend {}) with hierarchy {} is missing its parent",
                      _sessionID, name, hierarchyLevel());
      }
      continue;
    }
    const uint32_t state = backend->state();
    if (state == TelvaneBackendStateSampledOut) continue;
    const auto* parentBackend = parent->backendNamed(name);
    if (parentBackend == nullptr) {
      log().message(
          "HTTPSPostBackend(syncReportingStates): Parent session  does not have backend {}. Current state '{}' kept "
          "for child session",
          name, state);
      continue;
    }
    const uint32_t parentState = (*parentBackend)->state();
    backend->setState(parentState);
    if (parentState == TelvaneBackendStateEnabled && state != parentState) _isEnabledByParent = true;
    backend->setSamplingThreshold((*parentBackend)->samplingThreshold());
    log().message("HTTPSPostBackend(syncReportingStates): {}: state and sampling rate updated to {}, {:.2f}%", name,
                  parentState, static_cast<float>(backend->samplingThreshold().realValue()));
  }
}

void TelvanedSession::updateCombinedSessionID() {
  const std::optional<String> ancestors = _sessionDelegate->parentSessionIDStringForSession(*this);
  if (!ancestors.has_value()) return;
  const String combined(fmt::format("{}.{}", *ancestors, _sessionIDString));
  log().message("updateCombinedSessionID: Updating combined session ID '{}' for session {} backends", combined,
                _sessionID);
  MonitorLock lock(_sessionDelegate->monitor());
  if (!_backends.has_value()) return;
  for (const auto& [name, backend] : *_backends) backend->setCorrelatedSessionID(combined);
}

void TelvanedSession::fetchDisplayURL(UniqueFunction<void(String)> reply) {
  log().message("fetchDisplayURL: Fetching display URL for session {}", _sessionID);
  if (_backends.has_value()) {
    const auto splunk = std::find_if(_backends->begin(), _backends->end(), [](const auto& entry) {
      return entry.first.view().find(kTelvaneBackendHTTPPost.view()) != std::string_view::npos &&
             entry.second->displayURL().has_value();
    });
    if (splunk != _backends->end()) {
      reply(*splunk->second->displayURL());
      return;
    }
    for (const Key& name : {kTelvaneBackendHTTPPost2, kTelvaneBackendDashboard}) {
      const auto* backend = backendNamed(name);
      if (backend == nullptr || !(*backend)->displayURL().has_value()) continue;
      reply(*(*backend)->displayURL());
      return;
    }
  }
  reply(kDisplayURLNotAvailable.string());
}

}  // namespace telvane
