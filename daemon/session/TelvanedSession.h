#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemon/session/TelvanedSessionDelegate.h"
#include "interfaces/ClientSessionInterface.h"
#include "platform/Mutex.h"
#include "platform/ipc/Connection.h"
#include "storebag/BackendCreation.h"
#include "util/MessageLogFile.h"
#include "util/ProcessContext.h"

namespace telvane {

// What all sessions of a process share. Made by the entry point; outlives every session.
struct SessionShared {
  explicit SessionShared(Platform& platform) : messageLog(platform) {}

  // Held while a flush's countdown is taken down: completions of one flush come from several backends' queues.
  Mutex flushLock;
  MessageLogFile messageLog;
};

// The daemon-side half of one client session, the exported object of one connection.
//
// Made by the agent through initWithSessionDelegate as a shared object; its end (dealloc, on whichever thread lets the
// last reference go) sends the stop message and gives the transaction hold back. Its client's calls come one at a time
// on the connection's queue, which its fields are confined to. Under the agent's lock other sessions of its hierarchy
// call what stands under "Hierarchy"; what they touch is guarded by that lock or by the backends' own queues.
//
// Created -> configured (setSessionInfo) -> started (startConfig found a storebag; start message sent) -> reporting ->
// connection invalidated -> destroyed (stop message). A call in the wrong order is refused with a log line or an absent
// reply and changes nothing.
class TelvanedSession : public ClientSessionInterface, public std::enable_shared_from_this<TelvanedSession> {
 public:
  static constexpr uint32_t kDefaultReleaseTimeout = 30;  // seconds
  static constexpr size_t kMaximumDeviceIDLength = 40;

  // onEnd runs when the session has been destroyed completely.
  static std::shared_ptr<TelvanedSession> initWithSessionDelegate(const ProcessContext& context, SessionShared& shared,
                                                                  std::shared_ptr<TelvanedSessionDelegate> delegate,
                                                                  std::shared_ptr<ipc::Connection> connection,
                                                                  Job onEnd);
  ~TelvanedSession() override;

  // ClientSessionInterface
  void setSessionInfo(Dictionary sessionInfo, Value userInfo, Value frameworksToCheck,
                      bool hasAggregationBlock) override;
  void startConfigWithCompletionHandler(StatesReply completionHandler) override;
  void fetchStatesWithUserInfo(Value userInfo, StatesReply completionHandler) override;
  void fetchDisplayURL(UniqueFunction<void(String)> reply) override;
  void sendMessageWithDictionary(Dictionary message, MessageReply reply) override;
  void flushMessagesWithCompletion(FlushReply completion) override;
  void finishSessionGracefully() override;
  void uploadFileAtPath(String fileURL, ExtensionToken extensionToken,
                        UniqueFunction<void(bool)> completionHandler) override;
  void uploadLogData(Array logData,
                     UniqueFunction<void(bool success, std::optional<Error> error)> completionHandler) override;
  void sendMessageWithSessionInfo(Dictionary sessionInfo, Value userInfo, uint16_t category, uint16_t type,
                                  Dictionary payload, UniqueFunction<void(String status)> reply) override;
  void updateSharedDataWithDictionary(Dictionary sharedData) override;
  void updateSharedDataForKey(String key, Value value) override;
  void setDigestKey(Value digestKey, int32_t algorithm) override;

  // Identity. sessionInfo and userInfo are absent until the client has sent them.
  uint32_t sessionID() const noexcept { return _sessionID; }
  const String& sessionIDString() const noexcept { return _sessionIDString; }
  const Value& sessionInfo() const noexcept { return _sessionInfo; }
  const Value& userInfo() const noexcept { return _userInfo; }
  // The hierarchy's token; nothing without a hierarchy, or when the token is no text.
  std::optional<String> hierarchyToken() const;
  int32_t hierarchyLevel() const noexcept;
  bool hasAggregator() const noexcept { return _hasAggregator; }
  // Whether the client is gone already, while the session may still be busy.
  bool hasConnectionEnded() const EXCLUDES(_connectionLock);
  bool isCounted() const noexcept { return _counted; }
  void setCounted(bool counted) noexcept { _counted = counted; }
  // The client type under which the agent counts this session. Guarded by the agent's lock.
  const std::optional<int32_t>& countedClientType() const noexcept { return _countedClientType; }
  void setCountedClientType(std::optional<int32_t> clientType) noexcept { _countedClientType = clientType; }
  bool hasValidUserInfoKeys() const;
  std::string description() const;

  // Ends the connection; its invalidation handler unregisters the session.
  void invalidate();

  // Hierarchy: called by the agent for sessions of one hierarchy. REQUIRES: the agent's monitor() held.
  void updateCombinedSessionID();
  void syncReportingStates();
  void shutdownSessionAggregation();
  // Sends to this session's own client; waits for nothing.
  void sendToAggregator(const Value& sessionInfo, double timestamp, uint16_t category, uint16_t type,
                        const Value& payload);

  // The estimated bytes that the backends hold in batches.
  uint64_t batchedEventsSize() const;
  // Adds the session to the report's figures of its client type and returns its batchedEventsSize(). The total so far
  // is read as a 32-bit number, so one above 2^31 wraps. REQUIRES: the agent's monitor() held, unless it is this
  // session.
  uint64_t addSessionHealthInfo(const TelvanedSession& session, Dictionary& healthReport) const;
  // Adds the listed sessions, this one (once more, where it is listed), the storebags and the process's memory.
  void addSessionsAccumulatedHealthInfoToPayload(Dictionary& payload,
                                                 const std::vector<std::shared_ptr<TelvanedSession>>& sessionList,
                                                 const Dictionary& storebags) const;

 private:
  TelvanedSession(const ProcessContext& context, SessionShared& shared,
                  std::shared_ptr<TelvanedSessionDelegate> delegate, std::shared_ptr<ipc::Connection> connection);

  // Asks the agent whether this session is one too many of its client type. An end that the agent decides on meanwhile
  // waits for endIfRefused, so that the client hears the answer first.
  bool isRefused();
  void endIfRefused();

  // Destruction, in the order of its steps.
  void dealloc();
  Dictionary stopPayload();
  void returnTransactionHold();

  // Configuration.
  void setSessionID(const Dictionary& sessionInfo);
  void setHierarchyFromSessionInfo();
  void updateUserInfo(Value userInfo);
  void releaseUserInfo();
  void receivedUserInfo(Value userInfo);
  bool isNameChanged(const Value& newUserInfo, const Key& nameKey) const;
  void updateUserInfoForBackends();
  void activateHelperOfEnabledBackends();
  // To be called before anything may be posted: a helper that nobody activated posts nothing.
  void activateHelperIfEnabledByParent();
  void createBackendsWithStorebag(const Dictionary& storebag);
  void updateSessionWithDefaultSessionInfo();
  void sendStartMessage();
  void fillDeviceID();
  const std::shared_ptr<TelvaneBackend>* backendNamed(std::string_view name) const;

  // Messages.
  Value sendMessageToBackends(Dictionary message);
  Dictionary messageBlob(Value payload);
  bool isDropped(const TelvaneBackend& backend, uint16_t category, std::string_view operation) const;
  void internalSendMessage(const Value& payload, uint16_t method, uint16_t respCode);
  void internalFlushMessagesWithCompletion(FlushReply completion);
  void aggregateMessage(double timestamp, uint16_t category, uint16_t type, const Value& payload);
  // What is aggregated of a payload; an absent value of none.
  Value withUserInfo(const Value& payload) const;

  // States and event lists.
  bool updateReportingStates();
  Value fetchReportingStates() const;
  Value fetchWhitelistedEvents() const;
  Value fetchBlacklistedEvents() const;
  void replyStates(StatesReply& reply) const;

  // One-shot messages.
  void sendOneMessageWithSessionInfo(const Dictionary& sessionInfo, const Value& userInfo, const Dictionary& storebag,
                                     uint16_t category, uint16_t type, const Dictionary& payload);
  void sendOneMessageToBackend(TelvaneBackend& backend, Date timestamp, uint16_t category, uint16_t type,
                               const Dictionary& payload);

  Log& log() const noexcept { return _context.log(); }

  // Constant after construction.
  const ProcessContext& _context;
  SessionShared& _shared;
  const String _sessionIDString;

  // Confined to the connection's queue.
  std::shared_ptr<TelvanedSessionDelegate> _sessionDelegate;
  Value _userInfo;
  Value _frameworks;
  std::optional<Value> _storebagVersion;
  String _deviceid;
  bool _hasFinishedGracefully = false;
  Value _digestKey;
  std::shared_ptr<ReportingSessionConnectivityHelper> _connectivityHelper;
  uint32_t _connectivityHelperReleaseTimeout = kDefaultReleaseTimeout;

  // Written on the connection's queue; read by other sessions of the hierarchy under the agent's lock, which is
  // therefore also held to write them once the session is listed.
  uint32_t _sessionID = 0;
  Value _sessionInfo;
  std::optional<Dictionary> _hierarchyDictionary;
  std::optional<BackendTable> _backends;

  // Guarded by the agent's lock.
  std::optional<int32_t> _countedClientType;

  // Synchronised by themselves, or by _connectionLock.
  std::atomic<bool> _hasAggregator{false};
  std::atomic<bool> _counted{false};
  // Set by the parent's thread when it enables a backend that was not; the session's own thread, which alone knows its
  // helper, sees to it.
  std::atomic<bool> _isEnabledByParent{false};
  mutable Mutex _connectionLock;
  std::shared_ptr<ipc::Connection> _connection GUARDED_BY(_connectionLock);
  bool _isAnswering GUARDED_BY(_connectionLock) = false;
  std::shared_ptr<ipc::Connection> _connectionToEnd GUARDED_BY(_connectionLock);
};

}  // namespace telvane
