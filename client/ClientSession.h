#pragma once

#include <atomic>
#include <memory>
#include <optional>

#include "client/CachedStates.h"
#include "client/ClientContext.h"
#include "client/ClientSessionProxy.h"
#include "client/PeriodicTasks.h"
#include "client/ReportingQueue.h"
#include "client/SessionObservers.h"
#include "client/TelvaneAggregationObject.h"
#include "client/include/telvane/Telvane.h"

namespace telvane {

// One reporting session of this process: what a Telvane does. It holds the connection to the daemon and gives it every
// call, in the order in which the calls were made, through its reporting queue.
//
// Made by initWithSessionInfo, held by its Telvane and by everything that is still under way: a step that waits, an
// answer that is to come. So it ends after the last of them: it then finishes the session in the daemon and ends the
// connection. Safe from any thread.
class ClientSession : public std::enable_shared_from_this<ClientSession> {
 public:
  // As Telvane::initWithSessionInfo. The context outlives the session.
  static std::shared_ptr<ClientSession> initWithSessionInfo(ClientContext& context, const Value& sessionInfo,
                                                            const Value& userInfo, const Value& frameworksToCheck,
                                                            Telvane::AggregationBlock aggregationBlock);
  // Whether the session has let its connection go; shared with the error handlers of its one-way calls.
  using LetGoFlag = std::shared_ptr<std::atomic<bool>>;
  // Use initWithSessionInfo.
  ClientSession(ClientContext& context, std::shared_ptr<ipc::Connection> connection,
                std::shared_ptr<SerialQueue> reportingQueue, LetGoFlag isLetGo);
  ~ClientSession();

  // Names the object that the delegate is told of. Called once, before anything else.
  void setClient(std::weak_ptr<Telvane> client) { _client = std::move(client); }

  // These are as in Telvane.
  void startConfigurationWithCompletionHandler(Telvane::EnabledBackendsBlock completionHandler);
  void fetchReportingStatesWithUserInfo(Value userInfo, Telvane::EnabledBackendsBlock fetchComplete);
  bool sendMessageWithCategory(uint16_t category, uint16_t type, const Value& payload, std::optional<Error>* error);
  bool sendMessageWithDictionary(const Dictionary& message, std::optional<Error>* error);
  bool isWhitelistedEvent(uint16_t category) const { return _states.isWhitelistedEvent(category); }
  bool isBlacklistedEvent(uint16_t category) const { return _states.isBlacklistedEvent(category); }
  bool flushMessages();
  void flushMessagesWithCompletion(Telvane::ErrorBlock completion);
  void finishSession();
  void updateSharedDataWithDictionary(Dictionary sharedData);
  void updateSharedDataForKey(String key, Value value);
  bool setDigestKey(Value digestKey, int32_t algorithm);
  bool serverSupportsFileUpload() const;
  bool uploadFileWithURL(const String& fileURL, Telvane::UploadBlock completionHandler);
  bool uploadDataArray(Array logData, Telvane::UploadBlock completionHandler);
  void setMessageSentDelegate(std::weak_ptr<TelvaneMessageSentDelegate> delegate);
  std::shared_ptr<TelvaneMessageSentDelegate> messageSentDelegate() const;
  void setMessageLoggingBlock(Telvane::LoggingBlock block);
  Telvane::LoggingBlock messageLoggingBlock() const { return _observers.loggingBlock(); }

  bool registerPeriodicTaskForModule(uint32_t module, bool needToUpdate, bool needToReport,
                                     Telvane::PeriodicTaskBlock serviceBlock);
  bool unregisterPeriodTaskForModule(uint32_t module);
  void startLogTimerWithInterval(uint32_t interval, uint32_t reportingMultiplier, uint16_t category, uint16_t type);
  void stopLogTimer();
  // Ends the periodic tasks, behind what was called before, because the client has let its session go: they would go
  // on for as long as answers to their own reports keep the session.
  void endPeriodicTasks();

  // Lets the hold go when all that was sent before has been delivered, or can no longer be.
  void holdUntilDelivered(PendingWork::Hold hold);

 private:
  Log& log() const noexcept { return _context.log(); }
  // Return a proxy whose errors are logged under the operation's name, which has static storage: for calls whose
  // answer holds this session, for calls without an answer, and for calls of whose errors somebody else is told, too.
  ClientSessionProxy proxy(const char* operation) const;
  ClientSessionProxy oneWayProxy(const char* operation) const;
  ClientSessionProxy proxy(const char* operation, UniqueFunction<void(const Error&)> onError) const;

  void cacheStates(Value enabledBackendNames, Value whitelistedEvents, Value blacklistedEvents);
  StatesReply statesReply(const char* operation, std::shared_ptr<Telvane::EnabledBackendsBlock> completion);
  void didReceiveDisplayURL(const Value& url);
  // Returns the step that tells the delegate of the message; empty when there is no delegate.
  Job newNotice(const Dictionary& message);
  void forwardMessage(Dictionary message);
  void didReceiveMessageReply(const Value& reply);
  void didFlush(const Value& result, const std::optional<Error>& error, Telvane::ErrorBlock& completion);
  void passToLoggingBlock(const char* operation, const String& text);
  void aboutToDealloc();

  // Constant after construction.
  ClientContext& _context;
  const std::shared_ptr<ipc::Connection> _connection;
  const std::shared_ptr<ReportingQueue> _reportingQueue;
  const std::shared_ptr<ConcurrentQueue> _reportingPeriodicTasksQueue;
  const LetGoFlag _isLetGo;
  std::weak_ptr<Telvane> _client;

  // Confined to the steps of _reportingQueue.
  PeriodicTasks _periodicTasks;

  // Synchronised by themselves.
  CachedStates _states;
  SessionObservers _observers;
  std::atomic<bool> _hasPeriodicTasks = false;
};

}  // namespace telvane
