// What the daemon tells of itself to whoever may connect.
#include "daemon/TelvanedAgent.h"
#include "interfaces/AgentKeys.h"
#include "interfaces/ClientTypes.h"
#include "platform/ProcessIdentifier.h"

namespace telvane {
namespace {

Dictionary describeRecord(const Dictionary& record, Date now) {
  Dictionary described;
  described.set(kStatusStorebagState, record[kRecordFetchState]);
  described.set(kStatusStorebagVersion, record[kRecordStorebagVersion]);
  described.set(kStatusStorebagMaxAgeSeconds, record[kRecordMaxAge]);
  if (const Date* fetched = record[kRecordFetchTime].date()) {
    described.set(kStatusStorebagAgeSeconds, Value(now.wholeSeconds() - fetched->wholeSeconds()));
  }
  return described;
}

}  // namespace

Dictionary TelvanedAgent::daemonStatus() {
  Platform& platform = _context.platform();
  const auto uptime = std::chrono::duration_cast<std::chrono::seconds>(platform.clock.monotonicNow() - _startTime);
  Dictionary status;
  status.set(kStatusVersion, _context.clientFrameworkVersion());
  status.set(kStatusProcessID, Value(currentProcessID()));
  status.set(kStatusUptimeSeconds, Value(uptime.count()));
  status.set(kStatusMemoryBytes, Value(platform.processMemory.taskMemory()));
  size_t helpers = 0;
  _stateQueue->sync([this, &helpers] {
    _stateQueue->assertOnQueue();
    helpers = _sharedConnectivityHelpers.size();
  });
  status.set(kStatusConnectivityHelpers, Value(helpers));
  MonitorLock lock(*_monitor);
  status.set(kStatusSessions, Value(_sessionList.size()));
  status.set(kStatusHierarchies, Value(_correlatedSessions.size()));
  status.set(kStatusSharedData, Value(_sharedData.size()));
  status.set(kStatusTransactions, Value(_xpcTransactionReference));
  Dictionary clientTypes;
  for (const ClientType& row : allClientTypes()) {
    const uint8_t count = _activeClients[static_cast<size_t>(row.number)];
    if (count > 0) clientTypes.set(String(fmt::format("{} {}", row.number, row.senderName)), Value(count));
  }
  status.set(kStatusClientTypes, std::move(clientTypes));
  Dictionary storebags;
  const Date now = platform.clock.now();
  for (const DictionaryEntry& entry : _cachedStorebags) {
    if (const Dictionary* record = entry.value.dictionary()) storebags.set(entry.key, describeRecord(*record, now));
  }
  status.set(kStatusStorebags, std::move(storebags));
  return status;
}

}  // namespace telvane
