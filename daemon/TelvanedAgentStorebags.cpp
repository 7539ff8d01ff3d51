// The storebags in memory: one record per name, so that the many sessions of a client type do not fetch anew.
#include <cmath>

#include "daemon/TelvanedAgent.h"
#include "interfaces/AgentKeys.h"
#include "interfaces/SessionKeys.h"

namespace telvane {
namespace {

constexpr double kSecondsBetweenFailedAttempts = 900;
constexpr std::string_view kFetchSuccessful = "Fetch Successful";
constexpr std::string_view kFetchFailure = "Fetch Failure";

int32_t clientTypeOf(const TelvanedSession& session) {
  const Dictionary* sessionInfo = session.sessionInfo().dictionary();
  return sessionInfo != nullptr ? (*sessionInfo)[kTelvaneSessionInfoClientType].int32Value() : 0;
}

}  // namespace

std::optional<Dictionary> TelvanedAgent::storebagForSession(TelvanedSession& session) {
  const int32_t clientType = clientTypeOf(session);
  const auto name = StorebagRetriever::storebagNameForClientType(clientType);
  if (!name.has_value()) return std::nullopt;
  log().message("storebagForSession: Retrieving storebag for session {} with client type {}", session.sessionID(),
                clientType);
  MonitorLock lock(*_monitor);
  bool isFetchNeeded = true;
  std::optional<Dictionary> section = storebagOfFreshRecord(*name, clientType, isFetchNeeded);
  if (!isFetchNeeded) return section;
  fetchAndCacheStorebag(clientType);
  return recordedSection(*name);
}

std::optional<Dictionary> TelvanedAgent::recordedSection(std::string_view name) {
  const Dictionary* record = _cachedStorebags[name].dictionary();
  const Dictionary* section = record != nullptr ? (*record)[kRecordStorebagData].dictionary() : nullptr;
  return section != nullptr ? std::optional(*section) : std::nullopt;
}

std::optional<Dictionary> TelvanedAgent::storebagOfFreshRecord(std::string_view name, int32_t clientType,
                                                               bool& isFetchNeeded) {
  isFetchNeeded = true;
  const Dictionary* record = _cachedStorebags[name].dictionary();
  if (record == nullptr) return std::nullopt;
  const Date fetchTime = (*record)[kRecordFetchTime].date() != nullptr ? *(*record)[kRecordFetchTime].date() : Date();
  const double age = std::fabs(_context.platform().clock.now().secondsSince1970() - fetchTime.secondsSince1970());
  const bool isSuccessful = (*record)[kRecordFetchState].text() == kFetchSuccessful;
  const int64_t maxAge = (*record)[kRecordMaxAge].integerValue();
  const std::optional<Date> diskDate = _storebags->storebagCacheModificationDate(name);
  if (diskDate.has_value() && *diskDate > fetchTime) {
    log().message(
        "storebagForSession: Override maxAge as disk cache for storebag '{}' was updated: modification time '{}' is "
        "greater than last fetch time '{}",
        name, *diskDate, fetchTime);
    return std::nullopt;
  }
  if (isSuccessful && age < static_cast<double>(maxAge)) {
    log().message("storebagForSession: Cached storebag found for client type {}", clientType);
    isFetchNeeded = false;
  } else if (!isSuccessful && age < kSecondsBetweenFailedAttempts) {
    log().message(
        "storebagForSession: Not fetching storebag for client type {} - must wait {} seconds between attempts",
        clientType, kSecondsBetweenFailedAttempts);
    isFetchNeeded = false;
  }
  return isFetchNeeded ? std::nullopt : recordedSection(name);
}

void TelvanedAgent::fetchAndCacheStorebag(int32_t clientType) {
  log().message("fetchAndCacheStorebag: Fetching storebag for client type {}", clientType);
  const auto name = StorebagRetriever::storebagNameForClientType(clientType);
  if (!name.has_value()) {
    log().error("fetchAndCacheStorebag: clientType {} is invalid", clientType);
    return;
  }
  MonitorLock lock(*_monitor);
  StorebagRetriever::FetchResult fetched = _storebags->fetchStorebagForEnvironmentAndClientType(clientType);
  log().message("fetchAndCacheStorebag: Storebag max age: {} seconds", fetched.maxAge);
  const Dictionary* known = _cachedStorebags[*name].dictionary();
  Dictionary record = known != nullptr ? *known : Dictionary();
  const bool isSuccessful = fetched.section.has_value() || fetched.unchanged;
  if (fetched.section.has_value()) {
    record.set(kRecordStorebagData, *std::move(fetched.section));
    record.set(kRecordStorebagVersion, fetched.version);
  } else if (!fetched.unchanged) {
    log().error("fetchAndCacheStorebag: Unable to fetch storebag for client type {}", clientType);
  }
  record.set(kRecordFetchTime, Value(_context.platform().clock.now()));
  record.set(kRecordFetchState, Value(String::fromStatic(isSuccessful ? kFetchSuccessful : kFetchFailure)));
  record.set(kRecordMaxAge, Value(fetched.maxAge));
  _cachedStorebags.set(String::fromStatic(*name), std::move(record));
}

std::optional<String> TelvanedAgent::storebagVersionForSession(TelvanedSession& session) {
  const auto name = StorebagRetriever::storebagNameForClientType(clientTypeOf(session));
  if (!name.has_value()) return std::nullopt;
  MonitorLock lock(*_monitor);
  const Dictionary* record = _cachedStorebags[*name].dictionary();
  const String* version = record != nullptr ? (*record)[kRecordStorebagVersion].string() : nullptr;
  return version != nullptr ? std::optional(*version) : std::nullopt;
}

}  // namespace telvane
