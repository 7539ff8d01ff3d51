#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "connectivity/ConnectivityHelperTask.h"
#include "connectivity/ReportingSessionConnectivityInterface.h"
#include "foundation/Value.h"
#include "platform/Mutex.h"
#include "util/ProcessContext.h"

namespace telvane {

// The owner's side of a helper: takes back the daemon's transaction holds.
class ConnectivityHelperDelegate {
 public:
  virtual ~ConnectivityHelperDelegate() = default;
  virtual void releaseXPCTransactions(uint32_t count) = 0;
  // The delegate's own re-entrant lock, held around releaseXPCTransactions.
  virtual Monitor& monitor() = 0;
};

// What all helpers of a process share: the counter that names tasks and the lock of GET admission. Made by the entry
// point; outlives every helper.
struct ConnectivityShared {
  std::atomic<uint32_t> taskCounter{0};
  Mutex admissionLock;
};

// Owns one URL session and everything around its lifetime: the mode that configures it, its owner's usage count, the
// release timer, and the number of sessions served, which it gives back as released transactions.
//
// Made by initWithDelegate, shared by its owner and the backends that post through it; its URL session holds it until
// that has become invalid. Safe from any thread: all state is confined to _stateQueue, completions are called there.
// Created (inactive) -> activate -> active -> invalidate -> inactive. A POST on an inactive helper is dropped silently,
// a GET completes with the error "ConnectivityHelper is not ative" (so spelled).
class ReportingSessionConnectivityHelper : public ReportingSessionConnectivityInterface,
                                           public URLSessionDelegate,
                                           public std::enable_shared_from_this<ReportingSessionConnectivityHelper> {
 public:
  // Runs with the number of owners that still use the helper.
  using UsageCountBlock = UniqueFunction<void(uint32_t usageCount)>;

  static constexpr int32_t kBackgroundPOSTRequestMode = 1;
  static constexpr int32_t kBackgroundGETRequestMode = 2;
  static constexpr int32_t GETRequestMode() noexcept { return 8; }
  static constexpr int32_t POSTRequestMode() noexcept { return 4; }
  static constexpr uint32_t kDefaultReleaseTimeout = 30;  // seconds

  // delegate: may be null; not kept alive. userInfo: the owner's user info.
  static std::shared_ptr<ReportingSessionConnectivityHelper> initWithDelegate(
      const ProcessContext& context, ConnectivityShared& shared, std::weak_ptr<ConnectivityHelperDelegate> delegate,
      int32_t mode, Dictionary userInfo);
  ~ReportingSessionConnectivityHelper() override;

  // Makes the URL session unless there is one; takes the release time-out (seconds, 0 = ever-lasting) in any case.
  void activate(uint32_t releaseTimeout);
  // Lets running requests finish and gives back the transaction holds when the session has become invalid, at once
  // when there is none.
  void invalidate();
  void setReleaseTimeout(uint32_t seconds);
  // The count has changed when this returns, on the caller's thread; the release timer is stopped later.
  void ownerIncrementUsageCount();
  // Tells the block, on the queue, how many owners are left: at once when some are, after the release time-out when
  // none is.
  void ownerDecrementUsageCountWithBlock(UsageCountBlock block, std::shared_ptr<SerialQueue> queue);
  // Counts one finished session whose transaction hold this helper now owes. Runs on the caller's thread.
  void incrementTotalSessionsServedCount();

  // Gets the URL. A URL that was ever asked for through this helper is dropped as a duplicate: its completion is never
  // called. Urgent starts now, otherwise within the next two hours.
  void getURLRequestWithCompletionHandler(URLRequest request, bool isUrgent, RequestCompletion completion);
  void postURLRequestWithCompletionHandler(URLRequest request, RequestCompletion completion) override;

  static std::string storageRootFolder();
  // Clears upload containers that an earlier run left, when POSTs go out as background uploads (they do not today).
  static void cleanupStorageRootFolder(Platform& platform);

  // URLSessionDelegate
  void didBecomeInvalidWithError(URLSession& session, const std::optional<Error>& error) override;
  void didSendBodyData(URLSession& session, URLSessionTask& task, int64_t totalBytesSent,
                       int64_t totalBytesExpectedToSend) override;
  void didCompleteWithError(URLSession& session, URLSessionTask& task, const std::optional<Error>& error) override;
  ResponseDisposition didReceiveResponse(URLSession& session, URLSessionTask& task) override;
  void didBecomeDownloadTask(URLSession& session, URLSessionTask& task) override;
  void didReceiveData(URLSession& session, URLSessionTask& task, const Data& data) override;

 private:
  // One run of the release timer: the timer with the block that its owner waits for. Shared by the timer's handlers, so
  // that a timer started before the last one's cancellation was handled does not lose its block to it.
  struct ReleaseTimer {
    std::unique_ptr<Timer> timer;
    UsageCountBlock block;
    std::shared_ptr<SerialQueue> queue;
  };

  ReportingSessionConnectivityHelper(const ProcessContext& context, ConnectivityShared& shared,
                                     std::weak_ptr<ConnectivityHelperDelegate> delegate, int32_t mode,
                                     Dictionary userInfo);

  // The URL session's description, "inactive" when there is no session. From any thread.
  std::string sessionID() const EXCLUDES(_descriptionLock);
  Log& log() const noexcept { return _context.log(); }

  void activateOnStateQueue(uint32_t releaseTimeout) REQUIRES(*_stateQueue);
  void invalidateOnStateQueue() REQUIRES(*_stateQueue);
  std::optional<URLSessionConfiguration> privateURLSessionConfigWithMode(int32_t mode) const;
  void releaseAllXPCTransactions() REQUIRES(*_stateQueue);
  void decrementOnStateQueue(UsageCountBlock block, std::shared_ptr<SerialQueue> queue) REQUIRES(*_stateQueue);
  void startConnectivityHelperReleaseTimerWithBlock(UsageCountBlock block, std::shared_ptr<SerialQueue> queue)
      REQUIRES(*_stateQueue);
  void releaseEverLasting(UsageCountBlock block, const std::shared_ptr<SerialQueue>& queue) REQUIRES(*_stateQueue);
  void releaseTimerFired(const std::shared_ptr<ReleaseTimer>& run) REQUIRES(*_stateQueue);
  void releaseTimerCancelled(const std::shared_ptr<ReleaseTimer>& run) REQUIRES(*_stateQueue);
  void stopConnectivityHelperReleaseTimer() REQUIRES(*_stateQueue);
  void callOwner(ReleaseTimer& run, bool isTold);

  std::string composeUniqueContainerURL() const;
  void deleteContainerAtURL(const std::string& url);
  // Admits a GET unless its URL was ever asked for; false for a duplicate.
  bool admitGET(const std::string& url) EXCLUDES(_shared.admissionLock);
  void finishGET(const std::string& url) EXCLUDES(_shared.admissionLock);
  void pull(URLRequest request, RequestCompletion completion) REQUIRES(*_stateQueue);
  void postOnStateQueue(URLRequest request, RequestCompletion completion) REQUIRES(*_stateQueue);
  std::optional<Result<std::shared_ptr<URLSessionTask>>> newBackgroundUpload(URLRequest request) REQUIRES(*_stateQueue);
  void createHelperForTask(URLSessionTask& task, RequestCompletion completion) REQUIRES(*_stateQueue);
  void completeTask(const std::string& description, const std::optional<URLResponse>& response,
                    const std::optional<Error>& error) REQUIRES(*_stateQueue);

  // Constant after construction.
  const ProcessContext& _context;
  ConnectivityShared& _shared;
  const std::weak_ptr<ConnectivityHelperDelegate> _telvanedSessionDelegate;
  const Dictionary _userInfo;
  const int32_t _mode;
  const std::shared_ptr<SerialQueue> _stateQueue;

  // Confined to _stateQueue.
  std::unique_ptr<URLSession> _privateURLSession GUARDED_BY(*_stateQueue);
  // Sessions replaced by a new activation while their last requests were still running.
  std::vector<std::unique_ptr<URLSession>> _retiringURLSessions GUARDED_BY(*_stateQueue);
  std::shared_ptr<SerialQueue> _nsurlDelegateQueue GUARDED_BY(*_stateQueue);
  std::unordered_map<std::string, std::unique_ptr<ConnectivityHelperTask>> _tasks GUARDED_BY(*_stateQueue);
  bool _isActive GUARDED_BY(*_stateQueue) = false;
  uint32_t _releaseTimeout GUARDED_BY(*_stateQueue) = kDefaultReleaseTimeout;
  std::shared_ptr<ReleaseTimer> _connectivityHelperReleaseTimer GUARDED_BY(*_stateQueue);

  // Every URL ever asked for, true while its pull runs.
  std::map<std::string, bool> _requestInProgress GUARDED_BY(_shared.admissionLock);

  // Changed on _stateQueue only, read by owners' blocks on their queues.
  std::atomic<uint32_t> _usageCount{0};
  // Added to by the threads of finished sessions, taken on _stateQueue.
  std::atomic<uint32_t> _totalSessionsServedCount{0};

  mutable Mutex _descriptionLock;
  std::string _sessionDescription GUARDED_BY(_descriptionLock);
};

}  // namespace telvane
