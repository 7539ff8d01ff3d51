#include "client/ClientSession.h"

#include <algorithm>

#include "client/SessionInfoValidation.h"
#include "client/ValueSize.h"
#include "interfaces/BackendNames.h"
#include "interfaces/FileURL.h"
#include "interfaces/MessageFlags.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/TelvaneErrors.h"
#include "platform/process/FileExtension.h"

namespace telvane {
namespace {

// What a waiting file counts in the reporting queue, so that at most 64 descriptors of the host wait there.
constexpr uint64_t kBytesOfADescriptor = ReportingQueue::kMaximumWaitingBytes / 64;

bool isDisabled(const Dictionary& sessionInfo) {
  return sessionInfo.contains(kTelvaneSessionInfoEnableFlag) &&
         sessionInfo[kTelvaneSessionInfoEnableFlag].integerValue() == 0;
}

std::shared_ptr<ipc::Connection> connectToDaemon(ClientContext& context) {
  Log& log = context.log();
  ipc::Service& localService = context.platform().localService;
  if (const int reason = localService.checkLookUp(kTelvanedServiceName); reason != 0) {
    log.message("initWithSessionInfo: XPC not entitled, {}", reason);
    return nullptr;
  }
  Result<std::shared_ptr<ipc::Connection>> connection = localService.newConnection(kTelvanedServiceName);
  if (!connection) {
    log.error("initWithSessionInfo: Failed to connect to daemon");
    return nullptr;
  }
  return *connection;
}

ClientSessionProxy::ErrorHandler loggingErrorHandler(Log& log, const char* operation) {
  return [&log, operation](const Error& error) {
    log.error("{}: Failed to get remote object proxy: {}", operation, error);
  };
}

// A one-way call may still be under way when its session lets the connection go. It is delivered then, only nobody
// waits to hear of it, and that is no failure to be logged.
ClientSessionProxy::ErrorHandler unlessLetGo(ClientSession::LetGoFlag isLetGo,
                                             ClientSessionProxy::ErrorHandler handler) {
  return [isLetGo = std::move(isLetGo), handler = std::move(handler)](const Error& error) {
    if (!isLetGo->load(std::memory_order_acquire)) handler(error);
  };
}

// The block as the connection may call it: not any more once the process ends.
Telvane::AggregationBlock whileCallingOut(const ClientContext& context, Telvane::AggregationBlock block) {
  if (!block) return {};
  return [&context, block = std::move(block)](const Value& client, double timestamp, uint16_t category, uint16_t type,
                                              const Value& payload) {
    if (context.mayCallOut()) block(client, timestamp, category, type, payload);
  };
}

void setUp(ClientContext& context, ipc::Connection& connection, Telvane::AggregationBlock aggregationBlock) {
  Log& log = context.log();
  connection.setExportedObject(
      std::make_shared<TelvaneAggregationObject>(whileCallingOut(context, std::move(aggregationBlock)), log));
  connection.setInvalidationHandler([&log] { log.message("initWithSessionInfo: XPC connection invalidated"); });
  connection.setInterruptionHandler([&log] { log.message("initWithSessionInfo: XPC connection interrupted"); });
  connection.resume();
}

bool fail(std::optional<Error>* error, Error reason) {
  if (error != nullptr) *error = std::move(reason);
  return false;
}

// The text stands in the place of the domain: callers tell the missing parameter by it.
Error missingParameterError(const Key& text) {
  return Error(text.string(), static_cast<int64_t>(TelvaneErrorCode::MissingParameter));
}

Error refusedError() {
  return makeTelvaneError("The category of a message must not be 0",
                          static_cast<int64_t>(TelvaneErrorCode::MessageRefused));
}

size_t countOf(const Value& list) { return list.array() != nullptr ? list.array()->size() : 0; }

uint32_t low32Bits(const void* address) { return static_cast<uint32_t>(reinterpret_cast<uintptr_t>(address)); }

}  // namespace

std::shared_ptr<ClientSession> ClientSession::initWithSessionInfo(ClientContext& context, const Value& sessionInfo,
                                                                  const Value& userInfo, const Value& frameworksToCheck,
                                                                  Telvane::AggregationBlock aggregationBlock) {
  Log& log = context.log();
  if (!validateSessionInfo(log, sessionInfo, nullptr)) return nullptr;
  log.message("startLogging: Client starts logging...");
  if (isDisabled(*sessionInfo.dictionary())) {
    log.message("initWithSessionInfo: the session is disabled");
    return nullptr;
  }
  std::shared_ptr<ipc::Connection> connection = connectToDaemon(context);
  if (connection == nullptr) return nullptr;
  const bool hasAggregationBlock = static_cast<bool>(aggregationBlock);
  setUp(context, *connection, std::move(aggregationBlock));
  auto isLetGo = std::make_shared<std::atomic<bool>>(false);
  ClientSessionProxy::remoteObjectProxyWithErrorHandler(
      *connection, unlessLetGo(isLetGo, loggingErrorHandler(log, "initWithSessionInfo")))
      .setSessionInfo(*sessionInfo.dictionary(), userInfo, frameworksToCheck, hasAggregationBlock);
  std::shared_ptr<SerialQueue> queue =
      context.platform().dispatch.newSerialQueue("com.corvex.Telvane.main", QualityOfService::Utility);
  if (queue == nullptr) {
    log.error("initWithSessionInfo: Failed to create reporting queue");
    isLetGo->store(true, std::memory_order_release);
    return nullptr;
  }
  context.sessionQueues().add(queue);
  return std::make_shared<ClientSession>(context, std::move(connection), std::move(queue), std::move(isLetGo));
}

ClientSession::ClientSession(ClientContext& context, std::shared_ptr<ipc::Connection> connection,
                             std::shared_ptr<SerialQueue> reportingQueue, LetGoFlag isLetGo)
    : _context(context),
      _connection(std::move(connection)),
      _reportingQueue(std::make_shared<ReportingQueue>(reportingQueue, context.log())),
      _reportingPeriodicTasksQueue(context.platform().dispatch.newConcurrentQueue("com.corvex.Telvane.PeriodicTask",
                                                                                  QualityOfService::UserInitiated)),
      _isLetGo(std::move(isLetGo)),
      _periodicTasks(context, {_reportingQueue, std::move(reportingQueue), _reportingPeriodicTasksQueue},
                     [this](const Dictionary& message) { sendMessageWithDictionary(message, nullptr); }) {}

ClientSession::~ClientSession() {
  try {
    aboutToDealloc();
    _isLetGo->store(true, std::memory_order_release);
    _connection->setExportedObject(nullptr);
    _connection->invalidate();
  } catch (...) {
    // Out of memory: the daemon sees the connection end, and the session with it.
  }
}

void ClientSession::aboutToDealloc() {
  log().message("aboutToDealloc: Telvane client session {} is about to dealloc", fmt::ptr(this));
  finishSession();
}

ClientSessionProxy ClientSession::proxy(const char* operation) const {
  return ClientSessionProxy::remoteObjectProxyWithErrorHandler(*_connection, loggingErrorHandler(log(), operation));
}

ClientSessionProxy ClientSession::oneWayProxy(const char* operation) const {
  return ClientSessionProxy::remoteObjectProxyWithErrorHandler(
      *_connection, unlessLetGo(_isLetGo, loggingErrorHandler(log(), operation)));
}

ClientSessionProxy ClientSession::proxy(const char* operation, UniqueFunction<void(const Error&)> onError) const {
  auto shared = std::make_shared<UniqueFunction<void(const Error&)>>(std::move(onError));
  return ClientSessionProxy::remoteObjectProxyWithErrorHandler(
      *_connection, [logError = loggingErrorHandler(log(), operation), shared](const Error& error) {
        logError(error);
        (*shared)(error);
      });
}

void ClientSession::startConfigurationWithCompletionHandler(Telvane::EnabledBackendsBlock completionHandler) {
  auto completion = std::make_shared<Telvane::EnabledBackendsBlock>(std::move(completionHandler));
  _reportingQueue->perform([self = shared_from_this(), completion = std::move(completion)] {
    constexpr const char* kOperation = "startConfigurationWithCompletionHandler";
    ClientSessionProxy proxy = self->proxy(kOperation);
    proxy.startConfigWithCompletionHandler(self->statesReply(kOperation, completion));
    proxy.fetchDisplayURLValue([self](const Value& url) { self->didReceiveDisplayURL(url); });
  });
}

void ClientSession::fetchReportingStatesWithUserInfo(Value userInfo, Telvane::EnabledBackendsBlock fetchComplete) {
  auto completion = std::make_shared<Telvane::EnabledBackendsBlock>(std::move(fetchComplete));
  _reportingQueue->perform(
      [self = shared_from_this(), userInfo = std::move(userInfo), completion = std::move(completion)] {
        constexpr const char* kOperation = "fetchReportingStatesWithUserInfo";
        auto onError = [self, completion](const Error&) {
          if (*completion) self->_context.callOut(kOperation, [&] { (*completion)(Value::none()); });
        };
        self->proxy(kOperation, std::move(onError))
            .fetchStatesWithUserInfo(userInfo, self->statesReply(kOperation, completion));
      });
}

StatesReply ClientSession::statesReply(const char* operation,
                                       std::shared_ptr<Telvane::EnabledBackendsBlock> completion) {
  return [self = shared_from_this(), operation, completion = std::move(completion)](
             Value enabledBackendNames, Value whitelistedEvents, Value blacklistedEvents) {
    self->_reportingQueue->perform([self, enabledBackendNames, whitelistedEvents, blacklistedEvents] {
      self->cacheStates(enabledBackendNames, whitelistedEvents, blacklistedEvents);
    });
    if (*completion) self->_context.callOut(operation, [&] { (*completion)(enabledBackendNames); });
  };
}

void ClientSession::cacheStates(Value enabledBackendNames, Value whitelistedEvents, Value blacklistedEvents) {
  _states.store(enabledBackendNames, whitelistedEvents, blacklistedEvents);
  log().message("Cached {} enabled backends, ({}, {}) listed events", countOf(enabledBackendNames), whitelistedEvents,
                blacklistedEvents);
}

void ClientSession::didReceiveDisplayURL(const Value& url) {
  constexpr const char* kOperation = "startConfigurationWithCompletionHandler";
  if (!url.isString()) {
    log().message("startConfigurationWithCompletionHandler: display URL is {}", url);
  } else if (url.text() == kDisplayURLNotAvailable.view()) {
    passToLoggingBlock(kOperation, *url.string());
  } else {
    passToLoggingBlock(kOperation, fmt::format("URL for the session is: {}", *url.string()));
  }
}

void ClientSession::passToLoggingBlock(const char* operation, const String& text) {
  const Telvane::LoggingBlock block = _observers.loggingBlock();
  if (block) _context.callOut(operation, [&] { block(text); });
}

bool ClientSession::sendMessageWithCategory(uint16_t category, uint16_t type, const Value& payload,
                                            std::optional<Error>* error) {
  if (category == 0) return fail(error, refusedError());
  if (error != nullptr) error->reset();
  Dictionary message;
  message.reserve(4);
  message.set(kTelvaneMessageParametersCategory, category);
  message.set(kTelvaneMessageParametersType, type);
  message.set(kTelvaneMessageParametersPayload, payload);
  message.set(kTelvaneMessageParametersFlag, kOrdinaryFlag);
  // A filtered message is a success here: the caller of this form does not care what the configuration leaves out.
  sendMessageWithDictionary(message, error);
  return true;
}

bool ClientSession::sendMessageWithDictionary(const Dictionary& message, std::optional<Error>* error) {
  static constexpr Key kMissingCategory{"Missing mandatory parameter 'category'"};
  static constexpr Key kMissingType{"Missing mandatory parameter 'type'"};
  const Value& number = message[kTelvaneMessageParametersCategory];
  if (!number.isPresent()) return fail(error, missingParameterError(kMissingCategory));
  if (!message.contains(kTelvaneMessageParametersType)) return fail(error, missingParameterError(kMissingType));
  const uint16_t category = number.low16Bits();
  if (category == 0) return fail(error, refusedError());
  if (error != nullptr) error->reset();
  Job notice = newNotice(message);
  if (!_states.mayBeSent(category)) {
    log().message("Event {} is filtered by storebag", category);
    if (notice) _reportingQueue->asyncNotice(std::move(notice), estimatedSize(message));
    return false;
  }
  if (notice) {
    auto step = [self = shared_from_this(), notice = std::move(notice), message]() mutable {
      notice();
      self->forwardMessage(message);
    };
    _reportingQueue->asyncMessage(std::move(step), estimatedSize(message));
    return true;
  }
  auto forward = [&] { forwardMessage(message); };
  if (!_reportingQueue->tryPerform(forward)) {
    _reportingQueue->asyncMessage([self = shared_from_this(), message] { self->forwardMessage(message); },
                                  estimatedSize(message));
  }
  return true;
}

Job ClientSession::newNotice(const Dictionary& message) {
  std::shared_ptr<TelvaneMessageSentDelegate> delegate = messageSentDelegate();
  if (delegate == nullptr) return {};
  std::shared_ptr<Telvane> client = _client.lock();
  if (client == nullptr) return {};
  return [delegate = std::move(delegate), client = std::move(client), message, this] {
    log().message("notifyMessageWasSent: called");
    _context.callOut("notifyMessageWasSent", [&] { delegate->didSendMessageForReportingClient(client, message); });
  };
}

void ClientSession::forwardMessage(Dictionary message) {
  proxy("sendMessageWithDictionary")
      .sendMessageForValues(std::move(message), [self = shared_from_this()](const Array& values) {
        self->didReceiveMessageReply(values[0]);
      });
}

void ClientSession::didReceiveMessageReply(const Value& reply) {
  log().message("sendMessageWithDictionary: {}", reply);
  if (reply.isString()) passToLoggingBlock("sendMessageWithDictionary", *reply.string());
}

bool ClientSession::flushMessages() {
  log().message("flushMessages:");
  flushMessagesWithCompletion({});
  return true;
}

void ClientSession::flushMessagesWithCompletion(Telvane::ErrorBlock completion) {
  auto shared = std::make_shared<Telvane::ErrorBlock>(std::move(completion));
  _reportingQueue->perform([self = shared_from_this(), shared = std::move(shared)] {
    constexpr const char* kOperation = "flushMessagesWithCompletion";
    auto onError = [self, shared](const Error& error) {
      if (*shared) self->_context.callOut(kOperation, [&] { (*shared)(error); });
    };
    self->proxy(kOperation, std::move(onError))
        .flushMessagesWithCompletion([self, shared](const Value& result, const std::optional<Error>& error) {
          self->didFlush(result, error, *shared);
        });
  });
}

void ClientSession::didFlush(const Value& result, const std::optional<Error>& error, Telvane::ErrorBlock& completion) {
  constexpr const char* kOperation = "flushMessagesWithCompletion";
  if (error) {
    log().message("flushMessagesWithCompletion: flush failed with error '{}'", *error);
  } else {
    log().message("flushMessagesWithCompletion: flushed session successfully with reply {}", result);
    if (result.isString()) passToLoggingBlock(kOperation, *result.string());
  }
  if (completion) _context.callOut(kOperation, [&] { completion(error); });
}

void ClientSession::finishSession() { oneWayProxy("finishSession").finishSessionGracefully(); }

void ClientSession::updateSharedDataWithDictionary(Dictionary sharedData) {
  const uint64_t bytes = estimatedSize(sharedData);
  auto step = [self = shared_from_this(), sharedData = std::move(sharedData)] {
    self->oneWayProxy("updateSharedDataWithDictionary").updateSharedDataWithDictionary(sharedData);
  };
  _reportingQueue->performCall(std::move(step), bytes);
}

void ClientSession::updateSharedDataForKey(String key, Value value) {
  const uint64_t bytes = key.size() + estimatedSize(value);
  auto step = [self = shared_from_this(), key = std::move(key), value = std::move(value)] {
    self->oneWayProxy("updateSharedDataForKey").updateSharedDataForKey(key, value);
  };
  _reportingQueue->performCall(std::move(step), bytes);
}

bool ClientSession::setDigestKey(Value digestKey, int32_t algorithm) {
  if (!digestKey.isPresent()) {
    log().error("setDigestKey: digestKey should not be nil!!!");
    return false;
  }
  const uint64_t bytes = estimatedSize(digestKey);
  auto step = [self = shared_from_this(), digestKey = std::move(digestKey), algorithm] {
    // The key goes under the name of the upload in the log; readers of logs know it so.
    self->oneWayProxy("uploadDataArray").setDigestKey(digestKey, algorithm);
  };
  _reportingQueue->performCall(std::move(step), bytes);
  return true;
}

bool ClientSession::serverSupportsFileUpload() const {
  const Value names = _states.enabledBackendNames();
  const bool isSupported =
      names.isArray() && std::any_of(names.array()->begin(), names.array()->end(), [](const Value& name) {
        return name.isString() && name.text() == kTelvaneBackendUploadServer.view();
      });
  log().message("serverSupportsFileUpload:{} ({} backends)", isSupported ? "YES" : "NO", countOf(names));
  return isSupported;
}

bool ClientSession::uploadFileWithURL(const String& fileURL, Telvane::UploadBlock completionHandler) {
  if (fileURL.empty()) {
    log().error("uploadFileWithURL: fileURL provided is nil");
    return false;
  }
  const std::string path = pathOfFileURL(fileURL);
  Result<ipc::Descriptor> extension = issueFileExtension(path);
  if (!extension) {
    log().error("uploadFileWithURL: Failed to get sandbox extension for path {}, errno {}", path,
                extension.error().code());
    return false;
  }
  auto step = [self = shared_from_this(), url = String(fileURLOfPath(canonicalPathOfFile(path))),
               extension = std::move(*extension), completion = std::move(completionHandler)]() mutable {
    self->proxy("uploadFileWithURL")
        .uploadFileAtPath(url, {.descriptor = extension.release()},
                          [self, completion = std::move(completion)](bool isSuccess) mutable {
                            if (completion)
                              self->_context.callOut("uploadFileWithURL", [&] { completion(isSuccess, std::nullopt); });
                          });
  };
  _reportingQueue->performCall(std::move(step), kBytesOfADescriptor);
  return true;
}

bool ClientSession::uploadDataArray(Array logData, Telvane::UploadBlock completionHandler) {
  if (logData.empty()) {
    log().error("uploadDataArray: Log data array is empty");
    return false;
  }
  const uint64_t bytes = estimatedSize(logData);
  auto step = [self = shared_from_this(), logData = std::move(logData),
               completion = std::move(completionHandler)]() mutable {
    auto reply = [self, completion = std::move(completion)](bool isSuccess, const std::optional<Error>& error) mutable {
      if (completion) self->_context.callOut("uploadDataArray", [&] { completion(isSuccess, error); });
    };
    self->proxy("uploadDataArray").uploadLogData(std::move(logData), std::move(reply));
  };
  _reportingQueue->performCall(std::move(step), bytes);
  return true;
}

void ClientSession::setMessageSentDelegate(std::weak_ptr<TelvaneMessageSentDelegate> delegate) {
  _reportingQueue->perform([self = shared_from_this(), delegate = std::move(delegate)] {
    self->log().message("Message Sent Delegate is set to {:x}:", low32Bits(delegate.lock().get()));
    self->_observers.setDelegate(delegate);
  });
}

std::shared_ptr<TelvaneMessageSentDelegate> ClientSession::messageSentDelegate() const {
  std::shared_ptr<TelvaneMessageSentDelegate> delegate = _observers.delegate();
  log().message("Message Sent Delegate reads {:x}:", low32Bits(delegate.get()));
  return delegate;
}

void ClientSession::setMessageLoggingBlock(Telvane::LoggingBlock block) {
  _reportingQueue->perform([self = shared_from_this(), block = std::move(block)] {
    self->log().message("setMessageLoggingBlock: called");
    self->_observers.setLoggingBlock(block);
  });
}

void ClientSession::holdUntilDelivered(PendingWork::Hold hold) {
  // An answer to the last call says that all before it have been delivered.
  auto step = [self = shared_from_this(), hold = std::move(hold)]() mutable {
    ClientSessionProxy::remoteObjectProxyWithErrorHandler(*self->_connection, {})
        .fetchDisplayURL([hold = std::move(hold)](const String&) {});
  };
  _reportingQueue->async(std::move(step));
}

}  // namespace telvane
