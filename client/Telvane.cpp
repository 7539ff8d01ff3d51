#include "client/include/telvane/Telvane.h"

#include "client/ClientRuntime.h"
#include "client/ClientSession.h"
#include "client/Guarded.h"
#include "client/HierarchyToken.h"
#include "client/TelvaneFactory.h"
#include "interfaces/DefaultsKeys.h"
#include "interfaces/TelvaneErrors.h"
#include "platform/identifiers/PersistentIdentifiers.h"

namespace telvane {
namespace {

Error foreignSessionError() {
  return makeTelvaneError("The session belongs to the process that this one was forked from",
                          static_cast<int64_t>(TelvaneErrorCode::MessageRefused));
}

bool refuseForeign(std::optional<Error>* error) {
  if (error != nullptr) *error = foreignSessionError();
  return false;
}

}  // namespace

TelvaneMessageSentDelegate::~TelvaneMessageSentDelegate() = default;

Telvane::Telvane() : _processGeneration(ClientRuntime::processGeneration()) {}

Telvane::~Telvane() {
  if (session() != nullptr) {
    guarded([this] { _session->endPeriodicTasks(); });
    guarded([this] { _session.reset(); });
    return;
  }
  // In a forked child: the inside belongs to the parent and to threads that are not here, so it is left as it is.
  guarded([this] { static_cast<void>(new std::shared_ptr<ClientSession>(std::move(_session))); });
}

ClientSession* Telvane::session() const noexcept {
  return _processGeneration == ClientRuntime::processGeneration() ? _session.get() : nullptr;
}

std::shared_ptr<Telvane> TelvaneFactory::initWithSessionInfo(ClientContext& context, const Value& sessionInfo,
                                                             const Value& userInfo, const Value& frameworksToCheck,
                                                             Telvane::AggregationBlock aggregationBlock) {
  std::shared_ptr<ClientSession> session = ClientSession::initWithSessionInfo(
      context, sessionInfo, userInfo, frameworksToCheck, std::move(aggregationBlock));
  if (session == nullptr) return nullptr;
  std::shared_ptr<Telvane> telvane(new Telvane());
  session->setClient(telvane);
  telvane->_session = std::move(session);
  return telvane;
}

std::shared_ptr<Telvane> Telvane::initWithSessionInfo(const Value& sessionInfo, const Value& userInfo,
                                                      const Value& frameworksToCheck,
                                                      AggregationBlock aggregationBlock) {
  return guarded(std::shared_ptr<Telvane>(), [&] {
    ClientRuntime& runtime = ClientRuntime::current();
    std::shared_ptr<Telvane> telvane = TelvaneFactory::initWithSessionInfo(
        runtime.context(), sessionInfo, userInfo, frameworksToCheck, std::move(aggregationBlock));
    if (telvane != nullptr) runtime.add(telvane->_session);
    return telvane;
  });
}

void Telvane::startConfigurationWithCompletionHandler(EnabledBackendsBlock completionHandler) {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->startConfigurationWithCompletionHandler(std::move(completionHandler)); });
  }
}

void Telvane::fetchReportingStatesWithUserInfo(const Value& userInfo, EnabledBackendsBlock fetchComplete) {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->fetchReportingStatesWithUserInfo(userInfo, std::move(fetchComplete)); });
  } else if (fetchComplete) {
    guarded([&] { fetchComplete(Value::none()); });
  }
}

bool Telvane::sendMessageWithCategory(uint16_t category, uint16_t type, const Value& payload,
                                      std::optional<Error>* error) {
  ClientSession* session = this->session();
  if (session == nullptr) return refuseForeign(error);
  return guarded(false, [&] { return session->sendMessageWithCategory(category, type, payload, error); });
}

bool Telvane::sendMessageWithDictionary(const Dictionary& message, std::optional<Error>* error) {
  ClientSession* session = this->session();
  if (session == nullptr) return refuseForeign(error);
  return guarded(false, [&] { return session->sendMessageWithDictionary(message, error); });
}

bool Telvane::isWhitelistedEvent(uint16_t category) const {
  return session() != nullptr && session()->isWhitelistedEvent(category);
}

bool Telvane::isBlacklistedEvent(uint16_t category) const {
  return session() != nullptr && session()->isBlacklistedEvent(category);
}

bool Telvane::flushMessages() {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->flushMessages(); });
  }
  return true;
}

void Telvane::flushMessagesWithCompletion(ErrorBlock completion) {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->flushMessagesWithCompletion(std::move(completion)); });
  } else if (completion) {
    guarded([&] { completion(foreignSessionError()); });
  }
}

void Telvane::finishSession() {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->finishSession(); });
  }
}

void Telvane::updateSharedDataWithDictionary(const Dictionary& sharedData) {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->updateSharedDataWithDictionary(sharedData); });
  }
}

void Telvane::updateSharedDataForKey(const String& key, const Value& value) {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->updateSharedDataForKey(key, value); });
  }
}

bool Telvane::setDigestKey(const Value& digestKey, int32_t algorithm) {
  ClientSession* session = this->session();
  return session != nullptr && guarded(false, [&] { return session->setDigestKey(digestKey, algorithm); });
}

bool Telvane::serverSupportsFileUpload() const {
  const ClientSession* session = this->session();
  return session != nullptr && guarded(false, [&] { return session->serverSupportsFileUpload(); });
}

bool Telvane::uploadFileWithURL(const String& fileURL, UploadBlock completionHandler) {
  ClientSession* session = this->session();
  return session != nullptr &&
         guarded(false, [&] { return session->uploadFileWithURL(fileURL, std::move(completionHandler)); });
}

bool Telvane::uploadDataArray(const Array& logData, UploadBlock completionHandler) {
  ClientSession* session = this->session();
  return session != nullptr &&
         guarded(false, [&] { return session->uploadDataArray(logData, std::move(completionHandler)); });
}

void Telvane::setMessageSentDelegate(std::weak_ptr<TelvaneMessageSentDelegate> delegate) {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->setMessageSentDelegate(std::move(delegate)); });
  }
}

std::shared_ptr<TelvaneMessageSentDelegate> Telvane::messageSentDelegate() const {
  const ClientSession* session = this->session();
  if (session == nullptr) return nullptr;
  return guarded(std::shared_ptr<TelvaneMessageSentDelegate>(), [&] { return session->messageSentDelegate(); });
}

void Telvane::setMessageLoggingBlock(LoggingBlock block) {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->setMessageLoggingBlock(std::move(block)); });
  }
}

Telvane::LoggingBlock Telvane::messageLoggingBlock() const {
  const ClientSession* session = this->session();
  if (session == nullptr) return {};
  return guarded(LoggingBlock(), [&] { return session->messageLoggingBlock(); });
}

bool Telvane::registerPeriodicTaskForModule(uint32_t module, bool needToUpdate, bool needToReport,
                                            PeriodicTaskBlock serviceBlock) {
  ClientSession* session = this->session();
  return session != nullptr && guarded(false, [&] {
           return session->registerPeriodicTaskForModule(module, needToUpdate, needToReport, std::move(serviceBlock));
         });
}

bool Telvane::unregisterPeriodTaskForModule(uint32_t module) {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->unregisterPeriodTaskForModule(module); });
  }
  return true;
}

void Telvane::startLogTimerWithInterval(uint32_t interval, uint32_t reportingMultiplier, uint16_t category,
                                        uint16_t type) {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->startLogTimerWithInterval(interval, reportingMultiplier, category, type); });
  }
}

void Telvane::stopLogTimer() {
  if (ClientSession* session = this->session()) {
    guarded([&] { session->stopLogTimer(); });
  }
}

Value Telvane::getPersistentIdentifierForDNU(bool respectsDNU) {
  return guarded(Value(), [&] {
    const ClientPlatform& platform = ClientRuntime::current().platform();
    return telvane::getPersistentIdentifierForDNU(platform.userDefaults, platform.random, platform.log,
                                                  {kTelvaneDefaultsSuite, defaultsKeyOfIdentifierForDNU(respectsDNU)});
  });
}

void Telvane::regeneratePersistentIdentifierForDNU(bool respectsDNU) {
  guarded([&] {
    const ClientPlatform& platform = ClientRuntime::current().platform();
    telvane::regeneratePersistentIdentifierForDNU(platform.userDefaults, platform.random, platform.log,
                                                  {kTelvaneDefaultsSuite, defaultsKeyOfIdentifierForDNU(respectsDNU)});
  });
}

std::optional<Dictionary> Telvane::newHierarchyTokenFromParentToken(const Value& parentToken) {
  return guarded(std::optional<Dictionary>(), [&] {
    return telvane::newHierarchyTokenFromParentToken(ClientRuntime::current().platform().random, parentToken);
  });
}

bool Telvane::sendOneMessageWithSessionInfo(const Value& sessionInfo, const Value& userInfo, uint16_t category,
                                            uint16_t type, const Value& payload, std::optional<Error>* error) {
  return guarded(false, [&] {
    return ClientRuntime::current().oneShotSender().sendOneMessageWithSessionInfo(sessionInfo, userInfo, category, type,
                                                                                  payload, error);
  });
}

}  // namespace telvane
