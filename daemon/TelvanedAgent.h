#pragma once

#include <array>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "connectivity/ReportingSessionConnectivityHelper.h"
#include "daemon/HierarchySharedData.h"
#include "daemon/session/ClientSessionDispatcher.h"
#include "daemon/session/TelvanedSession.h"
#include "daemon/session/TelvanedSessionDelegate.h"
#include "platform/ipc/Service.h"
#include "storebag/StorebagRetriever.h"

namespace telvane {

// The daemon's centre: accepts connections, makes one session for each, keeps the registry of live sessions, their
// hierarchies and shared data, the storebags, the pool of connectivity helpers, and holds the process alive while any
// of them has work.
//
// Made by the entry point as a shared object; the sessions hold it too. Safe from any thread. One re-entrant lock (the
// monitor) guards everything but the helper pool, which is confined to _stateQueue. The monitor is held while a
// storebag is fetched, on purpose: one fetch per name at a time. Order: monitor, then the storebag lock; monitor, then
// a backend's queue; never the monitor from a queue that a holder of it waits for.
class TelvanedAgent : public TelvanedSessionDelegate,
                      public DaemonStatusProvider,
                      public ipc::ListenerDelegate,
                      public std::enable_shared_from_this<TelvanedAgent> {
 public:
  static constexpr uint8_t kMaximumActiveSessions = 5;  // per client type

  TelvanedAgent(const ProcessContext& context, ConnectivityShared& connectivityShared, SessionShared& sessionShared,
                std::shared_ptr<StorebagRetriever> storebags);
  ~TelvanedAgent() override;

  // ipc::ListenerDelegate
  bool listener(ipc::Listener& listener, std::shared_ptr<ipc::Connection> shouldAcceptNewConnection) override;

  std::shared_ptr<TelvanedSession> createReportingSessionWithDelegate(std::shared_ptr<TelvanedSessionDelegate> delegate,
                                                                      std::shared_ptr<ipc::Connection> connection);
  void invalidateReportingSession(TelvanedSession& session);
  // One fetch of the client type's storebag and the update of its record. REQUIRES: monitor() held.
  void fetchAndCacheStorebag(int32_t clientType);
  // The first session of that level in the list, or null.
  static TelvanedSession* getFirstSessionWithHierarchy(int64_t level,
                                                       const std::vector<std::weak_ptr<TelvanedSession>>& sessionList);

  // Ends all connections; when the last session has said goodbye, invalidates every connectivity helper without waiting
  // for its release timer, so that the transactions come back when running requests are through. Does not wait.
  void shutDown();

  // ConnectivityHelperDelegate
  void releaseXPCTransactions(uint32_t count) override;
  Monitor& monitor() override { return *_monitor; }

  // TelvanedSessionDelegate
  std::optional<Dictionary> storebagForSession(TelvanedSession& session) override;
  std::optional<String> storebagVersionForSession(TelvanedSession& session) override;
  std::optional<String> parentSessionIDStringForSession(TelvanedSession& session) override;
  void updateCorrelatedSessions(TelvanedSession& session) override;
  TelvanedSession* getAncestorWithAggregatorForSession(TelvanedSession& session) override;
  void updateDownstreamSessions(TelvanedSession& session) override;
  TelvanedSession* parentSessionForChild(TelvanedSession& session) override;
  void updateSharedDataForSession(TelvanedSession& session, const Dictionary& sharedData) override;
  void removeObjectFromSharedDataForSession(TelvanedSession& session, const String& key) override;
  std::optional<Dictionary> sharedDataForSession(TelvanedSession& session) override;
  void copyReportingAgentState(std::vector<std::shared_ptr<TelvanedSession>>& sessionList,
                               Dictionary& cachedStorebags) override;
  std::shared_ptr<ReportingSessionConnectivityHelper> copySharedConnectivityHelperForReportingSession(
      TelvanedSession& session, int32_t mode) override;
  void releaseSharedConnectivityHelperForReportingSession(TelvanedSession& session) override;
  bool isActiveClientLimitReachedForSession(TelvanedSession& session, const Value& sessionInfo) override;
  std::string description() const override;

  // DaemonStatusProvider
  Dictionary daemonStatus() override;

 private:
  // Sessions of one hierarchy in the order in which they were added. Not owning: the session list is.
  using CorrelatedSessions = std::vector<std::weak_ptr<TelvanedSession>>;

  // One counter per client type, those without a storebag included.
  static constexpr size_t kClientTypeCounters = 31;
  // How many hierarchies that sessions have left for another one are kept.
  static constexpr size_t kMaximumEmptyHierarchies = 64;

  Log& log() const noexcept { return _context.log(); }
  void reportingSessionEnded();
  void forgetCorrelation(TelvanedSession& session) REQUIRES(*_monitor);
  // Removes the hierarchies without a session, and their shared data.
  void forgetEmptyHierarchies() REQUIRES(*_monitor);
  void uncount(TelvanedSession& session) REQUIRES(*_monitor);
  void uncountEnded(int32_t clientType) REQUIRES(*_monitor);
  bool isListed(const CorrelatedSessions& list, const TelvanedSession& session) const;
  CorrelatedSessions* correlatedSessions(const String& token) REQUIRES(*_monitor);
  std::optional<Dictionary> storebagOfFreshRecord(std::string_view name, int32_t clientType, bool& isFetchNeeded)
      REQUIRES(*_monitor);
  std::optional<Dictionary> recordedSection(std::string_view name) REQUIRES(*_monitor);
  std::shared_ptr<ReportingSessionConnectivityHelper> requestHelper(const std::string& userInfoKey, int32_t mode,
                                                                    const Dictionary& userInfo) REQUIRES(*_stateQueue);
  void releaseHelper(const std::string& userInfoKey) REQUIRES(*_stateQueue);
  void invalidateAllHelpers();

  // Constant after construction.
  const ProcessContext& _context;
  ConnectivityShared& _connectivityShared;
  SessionShared& _sessionShared;
  const std::shared_ptr<StorebagRetriever> _storebags;
  const Clock::MonotonicTime _startTime;
  const std::unique_ptr<Monitor> _monitor;
  const std::shared_ptr<SerialQueue> _stateQueue;

  // Guarded by the monitor.
  std::vector<std::shared_ptr<TelvanedSession>> _sessionList GUARDED_BY(*_monitor);
  Dictionary _cachedStorebags GUARDED_BY(*_monitor);  // storebag name -> record
  std::map<std::string, CorrelatedSessions, std::less<>> _correlatedSessions GUARDED_BY(*_monitor);
  std::map<std::string, HierarchySharedData, std::less<>> _sharedData GUARDED_BY(*_monitor);
  int32_t _xpcTransactionReference GUARDED_BY(*_monitor) = 0;
  std::array<uint8_t, kClientTypeCounters> _activeClients GUARDED_BY(*_monitor){};

  // Confined to _stateQueue.
  std::map<std::string, std::shared_ptr<ReportingSessionConnectivityHelper>> _sharedConnectivityHelpers
      GUARDED_BY(*_stateQueue);

  // Synchronised by themselves: sessions made and not yet destroyed, and whether the daemon is ending.
  std::atomic<size_t> _undestroyedSessions{0};
  std::atomic<bool> _isShuttingDown{false};
};

}  // namespace telvane
