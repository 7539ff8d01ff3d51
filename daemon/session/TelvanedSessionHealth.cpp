// The health report of the stop message.
#include "daemon/session/TelvanedSession.h"
#include "interfaces/ClientTypes.h"
#include "interfaces/HealthKeys.h"
#include "interfaces/SessionEvents.h"
#include "interfaces/SessionKeys.h"
#include "util/DataHelpers.h"

namespace telvane {
namespace {

std::string_view shortNameOf(const Value& sessionInfo) {
  const Dictionary* dictionary = sessionInfo.dictionary();
  const ClientType* row =
      dictionary != nullptr ? clientType((*dictionary)[kTelvaneSessionInfoClientType].int32Value()) : nullptr;
  return row != nullptr ? row->senderName : kUnknown;
}

String perTypeKey(const Key& prefix, std::string_view shortName) {
  return fmt::format("{}_{}", prefix.view(), shortName);
}

}  // namespace

uint64_t TelvanedSession::batchedEventsSize() const {
  uint64_t size = 0;
  if (!_backends.has_value()) return size;
  for (const auto& [name, backend] : *_backends) size += backend->batchedEventsSize();
  return size;
}

uint64_t TelvanedSession::addSessionHealthInfo(const TelvanedSession& session, Dictionary& healthReport) const {
  const std::string_view shortName = shortNameOf(session._sessionInfo);
  const String sessionsKey = perTypeKey(kHealthSessionsCount, shortName);
  healthReport.set(sessionsKey, Value(healthReport[sessionsKey.view()].integerValue() + 1));
  const uint64_t size = session.batchedEventsSize();
  const String batchKey = perTypeKey(kHealthBatchSize, shortName);
  const int64_t current = healthReport[batchKey.view()].int32Value();
  healthReport.set(batchKey, Value(static_cast<int64_t>(size) + current));
  return size;
}

void TelvanedSession::addSessionsAccumulatedHealthInfoToPayload(
    Dictionary& payload, const std::vector<std::shared_ptr<TelvanedSession>>& sessionList,
    const Dictionary& storebags) const {
  uint64_t memory = 0;
  {
    // Other sessions' infos and backends are written under this lock.
    MonitorLock lock(_sessionDelegate->monitor());
    for (const auto& session : sessionList) memory += addSessionHealthInfo(*session, payload);
  }
  memory += addSessionHealthInfo(*this, payload);
  const uint32_t storebagsSize = objectSizeEstimate(Value(storebags));
  payload.set(kHealthStorebagsCount, Value(storebags.size()));
  payload.set(kHealthStorebagsSize, Value(storebagsSize));
  payload.set(kHealthCalculatedMemoryUsage, Value(memory + storebagsSize));
  payload.set(kHealthProcessMemoryUsage, Value(_context.platform().processMemory.taskMemory()));
}

}  // namespace telvane
