#include "connectivity/ReportingSessionConnectivityHelper.h"

#include <regex>

#include "util/DataHelpers.h"

namespace telvane {
namespace {

constexpr auto kReleaseTimerLeeway = std::chrono::milliseconds(100);
constexpr int32_t kBackgroundModeBits = 1 | 2;
constexpr char kSourceApplicationBundleIdentifier[] = "com.corvex.system.diagnostics";
constexpr char kStorageRootFolder[] = "/tmp/tvnstorage";
constexpr char kContainerExtension[] = "tvndiag";

}  // namespace

std::shared_ptr<ReportingSessionConnectivityHelper> ReportingSessionConnectivityHelper::initWithDelegate(
    const ProcessContext& context, ConnectivityShared& shared, std::weak_ptr<ConnectivityHelperDelegate> delegate,
    int32_t mode, Dictionary userInfo) {
  return std::shared_ptr<ReportingSessionConnectivityHelper>(
      new ReportingSessionConnectivityHelper(context, shared, std::move(delegate), mode, std::move(userInfo)));
}

ReportingSessionConnectivityHelper::ReportingSessionConnectivityHelper(
    const ProcessContext& context, ConnectivityShared& shared, std::weak_ptr<ConnectivityHelperDelegate> delegate,
    int32_t mode, Dictionary userInfo)
    : _context(context),
      _shared(shared),
      _telvanedSessionDelegate(std::move(delegate)),
      _userInfo(std::move(userInfo)),
      _mode(mode),
      _stateQueue(context.platform().dispatch.newSerialQueue("com.corvex.ConnectivityHelperStateQueue",
                                                             QualityOfService::Utility)) {
  // The delegate meant here is the URL session's, which does not exist before activation.
  log().message("ReportingSessionConnectivityHelper created with delegate {}", 0);
}

ReportingSessionConnectivityHelper::~ReportingSessionConnectivityHelper() {
  log().message("ReportingSessionConnectivityHelper dealloced with ID <{}>", sessionID());
}

std::string ReportingSessionConnectivityHelper::sessionID() const {
  MutexLock lock(_descriptionLock);
  return _sessionDescription.empty() ? "inactive" : _sessionDescription;
}

void ReportingSessionConnectivityHelper::activate(uint32_t releaseTimeout) {
  log().message("activate: activating connectivity helper for NSURLSession with ID <{}>", sessionID());
  _stateQueue->async([self = shared_from_this(), releaseTimeout] {
    self->_stateQueue->assertOnQueue();
    self->activateOnStateQueue(releaseTimeout);
  });
}

void ReportingSessionConnectivityHelper::activateOnStateQueue(uint32_t releaseTimeout) {
  _releaseTimeout = releaseTimeout;
  if (_isActive) {
    log().message("activate: connectivity helper is already active for NSURLSession with ID <{}>", sessionID());
    return;
  }
  std::optional<URLSessionConfiguration> configuration = privateURLSessionConfigWithMode(_mode);
  if (!configuration.has_value()) return;
  const std::string description = (_mode & kBackgroundModeBits) != 0 ? *configuration->backgroundIdentifier
                                                                     : _context.platform().random.newUUID().string();
  _nsurlDelegateQueue =
      _context.platform().dispatch.newSerialQueue("com.corvex.ConnectivityHelperURLSession", QualityOfService::Utility);
  if (_privateURLSession != nullptr) _retiringURLSessions.push_back(std::move(_privateURLSession));
  _privateURLSession =
      _context.platform().urlSessions.newSession(std::move(*configuration), shared_from_this(), _nsurlDelegateQueue);
  _privateURLSession->setSessionDescription(description);
  {
    MutexLock lock(_descriptionLock);
    _sessionDescription = description;
  }
  _tasks.clear();
  _isActive = true;
  log().message("NSURLSession created and activated with ID <{}>, delegate {}", description, 1);
}

std::optional<URLSessionConfiguration> ReportingSessionConnectivityHelper::privateURLSessionConfigWithMode(
    int32_t mode) const {
  URLSessionConfiguration configuration;
  if (mode == kBackgroundPOSTRequestMode || mode == kBackgroundGETRequestMode) {
    configuration.backgroundIdentifier = _context.platform().random.newUUID().string();
    configuration.isDiscretionary = true;
    configuration.isBackgroundServiceType = mode == kBackgroundPOSTRequestMode;
    configuration.requiresExternalPower = mode == kBackgroundPOSTRequestMode;
  } else if (mode != POSTRequestMode() && mode != GETRequestMode()) {
    return std::nullopt;
  }
  configuration.sourceApplicationBundleIdentifier = kSourceApplicationBundleIdentifier;
  configuration.waitsForConnectivity = true;
  configuration.sourceApplicationSecondaryIdentifier = clientServiceKey(Value(_userInfo)).str();
  return configuration;
}

void ReportingSessionConnectivityHelper::invalidate() {
  _stateQueue->async([self = shared_from_this()] {
    self->_stateQueue->assertOnQueue();
    self->invalidateOnStateQueue();
  });
}

void ReportingSessionConnectivityHelper::invalidateOnStateQueue() {
  if (_isActive) {
    _isActive = false;
    _privateURLSession->finishTasksAndInvalidate();
    log().message("ReportingSessionConnectivityHelper:invalidate: NSURLSession with ID <{}>", sessionID());
    return;
  }
  log().message(
      "ReportingSessionConnectivityHelper:invalidate: release {} XPC transactions for inactive connectivity helper",
      _totalSessionsServedCount.load());
  releaseAllXPCTransactions();
}

void ReportingSessionConnectivityHelper::releaseAllXPCTransactions() {
  const uint32_t count = _totalSessionsServedCount.exchange(0);
  const std::shared_ptr<ConnectivityHelperDelegate> delegate = _telvanedSessionDelegate.lock();
  if (delegate == nullptr) return;
  MonitorLock lock(delegate->monitor());
  delegate->releaseXPCTransactions(count);
}

void ReportingSessionConnectivityHelper::setReleaseTimeout(uint32_t seconds) {
  _stateQueue->async([self = shared_from_this(), seconds] {
    self->_stateQueue->assertOnQueue();
    self->_releaseTimeout = seconds;
  });
}

void ReportingSessionConnectivityHelper::incrementTotalSessionsServedCount() {
  ++_totalSessionsServedCount;
  log().message("Total Sessions Served Count is incremented for NSURLSession with ID <{}>", sessionID());
}

void ReportingSessionConnectivityHelper::ownerIncrementUsageCount() {
  // Counted before this returns: the owner may already be about to hear that nobody is left, and reads the count then.
  ++_usageCount;
  _stateQueue->async([self = shared_from_this()] {
    self->_stateQueue->assertOnQueue();
    self->stopConnectivityHelperReleaseTimer();
    self->log().message(
        "ownerIncrementUsageCount: connectivity helper incremented usage count for NSURLSession with ID <{}>. "
        "_usageCount={}, _totalSessionsServedCount={}",
        self->sessionID(), self->_usageCount.load(), self->_totalSessionsServedCount.load());
  });
}

void ReportingSessionConnectivityHelper::ownerDecrementUsageCountWithBlock(UsageCountBlock block,
                                                                           std::shared_ptr<SerialQueue> queue) {
  _stateQueue->async([self = shared_from_this(), block = std::move(block), queue = std::move(queue)]() mutable {
    self->_stateQueue->assertOnQueue();
    self->decrementOnStateQueue(std::move(block), std::move(queue));
  });
}

void ReportingSessionConnectivityHelper::decrementOnStateQueue(UsageCountBlock block,
                                                               std::shared_ptr<SerialQueue> queue) {
  if (_usageCount > 0) {
    --_usageCount;
    log().message(
        "ownerDecrementUsageCountWithBlock: connectivity helper decremented usage count for NSURLSession with ID <{}>. "
        "_usageCount={}, _totalSessionsServedCount={}",
        sessionID(), _usageCount.load(), _totalSessionsServedCount.load());
  }
  if (_usageCount > 0) {
    log().message(
        "ownerDecrementUsageCountWithBlock: Usage count for NSURLSession with ID <{}> is greater than 0. Notifying "
        "owner that _usageCount={}, _totalSessionsServedCount={}",
        sessionID(), _usageCount.load(), _totalSessionsServedCount.load());
    queue->async([self = shared_from_this(), block = std::move(block)]() mutable { block(self->_usageCount.load()); });
    return;
  }
  log().message(
      "ownerDecrementUsageCountWithBlock: Usage count for NSURLSession with ID <{}> is equal to 0. Starting "
      "connectivity helper release timer",
      sessionID());
  startConnectivityHelperReleaseTimerWithBlock(std::move(block), std::move(queue));
}

void ReportingSessionConnectivityHelper::startConnectivityHelperReleaseTimerWithBlock(
    UsageCountBlock block, std::shared_ptr<SerialQueue> queue) {
  if (_releaseTimeout == 0) {
    releaseEverLasting(std::move(block), queue);
    return;
  }
  auto run = std::make_shared<ReleaseTimer>();
  run->block = std::move(block);
  run->queue = std::move(queue);
  auto self = shared_from_this();
  run->timer = _context.platform().dispatch.newTimer(
      _stateQueue, std::chrono::seconds(_releaseTimeout), kReleaseTimerLeeway,
      [self, run] {
        self->_stateQueue->assertOnQueue();
        self->releaseTimerFired(run);
      },
      [self, run] {
        self->_stateQueue->assertOnQueue();
        self->releaseTimerCancelled(run);
      });
  _connectivityHelperReleaseTimer = std::move(run);
  log().message(
      "startConnectivityHelperReleaseTimerWithBlock: started connectivity helper release timer for NSURLSession with "
      "ID <{}>",
      sessionID());
}

void ReportingSessionConnectivityHelper::releaseEverLasting(UsageCountBlock block,
                                                            const std::shared_ptr<SerialQueue>& queue) {
  constexpr uint32_t kNeverUnused = 1;
  log().message(
      "startConnectivityHelperReleaseTimerWithBlock: Special case of dealing with ever-lasting connectivity helper {}",
      sessionID());
  queue->async([block = std::move(block)]() mutable { block(kNeverUnused); });
  log().message(
      "startConnectivityHelperReleaseTimerWithBlock: release {} XPC transactions for ever-lasting connectivity helper "
      "{}",
      _totalSessionsServedCount.load(), sessionID());
  releaseAllXPCTransactions();
}

void ReportingSessionConnectivityHelper::releaseTimerFired(const std::shared_ptr<ReleaseTimer>& run) {
  log().message(
      "startConnectivityHelperReleaseTimerWithBlock: Connectivity helper release timer fired for NSURLSession with ID "
      "<{}>, timeout {}s",
      sessionID(), _releaseTimeout);
  if (run->timer != nullptr) run->timer->cancel();
  callOwner(*run, true);
}

void ReportingSessionConnectivityHelper::releaseTimerCancelled(const std::shared_ptr<ReleaseTimer>& run) {
  if (_connectivityHelperReleaseTimer == run) _connectivityHelperReleaseTimer.reset();
  run->timer.reset();
  callOwner(*run, false);
  run->queue.reset();
}

void ReportingSessionConnectivityHelper::callOwner(ReleaseTimer& run, bool isTold) {
  if (!run.block) return;
  const std::shared_ptr<SerialQueue>& queue = run.queue != nullptr ? run.queue : _stateQueue;
  queue->async([self = shared_from_this(), block = std::exchange(run.block, nullptr), isTold]() mutable {
    const uint32_t usageCount = self->_usageCount;
    if (isTold) {
      self->log().message(
          "startConnectivityHelperReleaseTimerWithBlock: Calling back owner of Connectivity helper with "
          "_usageCount={}",
          usageCount);
    }
    block(usageCount);
  });
}

void ReportingSessionConnectivityHelper::stopConnectivityHelperReleaseTimer() {
  log().message(
      "stopConnectivityHelperReleaseTimer: stopping connectivity helper release timer for NSURLSession with ID <{}>",
      sessionID());
  if (_connectivityHelperReleaseTimer != nullptr && _connectivityHelperReleaseTimer->timer != nullptr) {
    _connectivityHelperReleaseTimer->timer->cancel();
  }
}

std::string ReportingSessionConnectivityHelper::storageRootFolder() { return kStorageRootFolder; }

std::string ReportingSessionConnectivityHelper::composeUniqueContainerURL() const {
  return fmt::format("{}/{}.{}", storageRootFolder(), _context.platform().random.newUUID().string(),
                     kContainerExtension);
}

void ReportingSessionConnectivityHelper::deleteContainerAtURL(const std::string& url) {
  // A container that is gone already is as good as deleted.
  static_cast<void>(_context.platform().files.remove(url).has_value());
}

void ReportingSessionConnectivityHelper::cleanupStorageRootFolder(Platform& platform) {
  // Holds only when POSTs go out as background uploads from containers; until then there is nothing of ours to clear.
  if constexpr (POSTRequestMode() == kBackgroundPOSTRequestMode) {
    static_cast<void>(platform.files.createDirectory(storageRootFolder()).has_value());
    const std::regex container(fmt::format("^.*\\.{}$", kContainerExtension), std::regex::icase);
    const auto files = platform.files.filesBelow(storageRootFolder());
    if (!files.has_value()) return;
    for (const std::string& file : *files) {
      if (!std::regex_match(file, container)) continue;
      static_cast<void>(platform.files.remove(storageRootFolder() + "/" + file).has_value());
    }
  }
}

}  // namespace telvane
