#include "client/include/telvane/TelvaneAPI.h"

#include <memory>
#include <stdexcept>
#include <string>

#include "client/Guarded.h"
#include "client/include/telvane/Telvane.h"
#include "client/include/telvane/TelvaneSession.h"
#include "interfaces/TelvaneErrors.h"
#include "platform/PropertyList.h"

using telvane::Array;
using telvane::Dictionary;
using telvane::Error;
using telvane::guarded;
using telvane::String;
using telvane::Telvane;
using telvane::Value;

struct TelvaneOpaque {
  std::shared_ptr<Telvane> session;
};

struct TelvaneErrorOpaque {
  explicit TelvaneErrorOpaque(Error error_)
      : error(std::move(error_)), domain(error.domain().str()), description(error.description()) {}

  const Error error;
  const std::string domain;
  const std::string description;
};

namespace {

struct FreePlist {
  void operator()(void* node) const noexcept { plist_free(node); }
};
using OwnedPlist = std::unique_ptr<void, FreePlist>;

OwnedPlist ownedPlist(const Value& value) { return OwnedPlist(telvane::propertylist::newNode(value)); }

// Copies a node; null gives an absent value. An error for what cannot be copied (too deep, of a kind that no property
// list has): the call fails then, for to go on as if null had been given would do something that nobody asked for.
telvane::Result<Value> valueOf(plist_t node) {
  if (node == nullptr) return Value();
  return telvane::propertylist::fromNode(node);
}

Telvane::EnabledBackendsBlock blockOf(TelvaneBackendsCallback callback, void* context) {
  if (callback == nullptr) return {};
  return [callback, context](const Value& names) { callback(ownedPlist(names).get(), context); };
}

Telvane::AggregationBlock blockOf(TelvaneAggregationCallback callback, void* context) {
  if (callback == nullptr) return {};
  return [callback, context](const Value& client, double timestamp, uint16_t category, uint16_t type,
                             const Value& payload) {
    callback(ownedPlist(client).get(), timestamp, category, type, ownedPlist(payload).get(), context);
  };
}

// What is thrown here goes to the log, and the report goes without it.
Dictionary metricsOf(plist_t node) {
  const telvane::Result<Value> metrics = valueOf(node);
  if (!metrics) throw std::runtime_error(metrics.error().description());
  return metrics->isDictionary() ? *metrics->dictionary() : Dictionary();
}

// Not of the same name as the others: a callback for backend names has the same type.
Telvane::PeriodicTaskBlock periodicTaskBlockOf(TelvanePeriodicTaskCallback callback, void* context) {
  if (callback == nullptr) return {};
  return [callback, context](Dictionary* metrics) {
    if (metrics == nullptr) return callback(nullptr, context);
    const OwnedPlist node = ownedPlist(*metrics);
    // Null would tell the callback that this is no report.
    if (node.get() == nullptr) throw std::bad_alloc();
    callback(node.get(), context);
    *metrics = metricsOf(node.get());
  };
}

// The domain a C caller sees is always the same one; a code tells enough.
Error publicError(const Error& error) {
  return Error(telvane::kTelvaneErrorDomain.string(), error.code(), error.userInfo());
}

Error uncarriablePayloadError(const Error& reason) {
  return telvane::makeTelvaneError(reason.description(),
                                   static_cast<int64_t>(telvane::TelvaneErrorCode::MessageRefused));
}

// Sends by calling send(session, value of the node, error), and puts the error where the caller asked for it.
template <class Send>
bool send(TelvaneRef session, plist_t node, TelvaneErrorRef* error, Send&& send) noexcept {
  if (session == nullptr) return false;
  if (error != nullptr) *error = nullptr;
  return guarded(false, [&] {
    std::optional<Error> reason;
    bool isSent = false;
    telvane::Result<Value> value = valueOf(node);
    if (value) {
      isSent = send(*session->session, *value, &reason);
    } else {
      reason = uncarriablePayloadError(value.error());
    }
    if (error != nullptr && reason) *error = new TelvaneErrorOpaque(publicError(*reason));
    return isSent;
  });
}

}  // namespace

TelvaneRef TelvaneCreateSession(plist_t sessionInfo, plist_t userInfo, plist_t frameworksToCheck) {
  return TelvaneCreateSessionWithAggregationBlock(sessionInfo, userInfo, frameworksToCheck, nullptr, nullptr);
}

TelvaneRef TelvaneCreateSessionWithAggregationBlock(plist_t sessionInfo, plist_t userInfo, plist_t frameworksToCheck,
                                                    TelvaneAggregationCallback callback, void* context) {
  return guarded(TelvaneRef(), [&]() -> TelvaneRef {
    const telvane::Result<Value> info = valueOf(sessionInfo);
    const telvane::Result<Value> user = valueOf(userInfo);
    const telvane::Result<Value> frameworks = valueOf(frameworksToCheck);
    if (!info || !user || !frameworks) return nullptr;
    std::shared_ptr<Telvane> session =
        Telvane::initWithSessionInfo(*info, *user, *frameworks, blockOf(callback, context));
    return session != nullptr ? new TelvaneOpaque{std::move(session)} : nullptr;
  });
}

void TelvaneRelease(TelvaneRef session) { delete session; }

void TelvaneStartConfiguration(TelvaneRef session, TelvaneBackendsCallback callback, void* context) {
  if (session == nullptr) return;
  guarded([&] { session->session->startConfigurationWithCompletionHandler(blockOf(callback, context)); });
}

void TelvaneFetchStatesWithUserInfo(TelvaneRef session, plist_t userInfo, TelvaneBackendsCallback callback,
                                    void* context) {
  if (session == nullptr) return;
  guarded([&] {
    const telvane::Result<Value> user = valueOf(userInfo);
    if (user) return session->session->fetchReportingStatesWithUserInfo(*user, blockOf(callback, context));
    if (callback != nullptr) callback(nullptr, context);
  });
}

void TelvaneSetMessageBlock(TelvaneRef session, TelvaneStringCallback callback, void* context) {
  if (session == nullptr) return;
  guarded([&] {
    session->session->setMessageLoggingBlock([callback, context](const String& text) {
      if (callback != nullptr) callback(text.str().c_str(), context);
    });
  });
}

plist_t TelvaneNewHierarchyTokenFromParentToken(plist_t parentToken) {
  return guarded(plist_t(), [&]() -> plist_t {
    const telvane::Result<Value> parent = valueOf(parentToken);
    if (!parent) return nullptr;
    const std::optional<Dictionary> token = Telvane::newHierarchyTokenFromParentToken(*parent);
    return token ? telvane::propertylist::newNode(*token) : nullptr;
  });
}

plist_t TelvaneCreateHierarchyTokenFromParentToken(plist_t parentToken) {
  return TelvaneNewHierarchyTokenFromParentToken(parentToken);
}

void TelvaneUpdateSharedDataWithDictionary(TelvaneRef session, plist_t sharedData) {
  if (session == nullptr) return;
  guarded([&] {
    const telvane::Result<Value> data = valueOf(sharedData);
    if (data && data->isDictionary()) session->session->updateSharedDataWithDictionary(*data->dictionary());
  });
}

void TelvaneUpdateSharedDataForKey(TelvaneRef session, const char* key, plist_t value) {
  if (session == nullptr || key == nullptr) return;
  guarded([&] {
    const telvane::Result<Value> copy = valueOf(value);
    if (copy) session->session->updateSharedDataForKey(key, *copy);
  });
}

bool TelvaneSendMessageWithError(TelvaneRef session, uint16_t category, uint16_t type, plist_t payload,
                                 TelvaneErrorRef* error) {
  return send(session, payload, error, [&](Telvane& telvane, const Value& value, std::optional<Error>* reason) {
    return telvane.sendMessageWithCategory(category, type, value, reason);
  });
}

bool TelvaneSendMessageWithDictionary(TelvaneRef session, plist_t message, TelvaneErrorRef* error) {
  return send(session, message, error, [](Telvane& telvane, const Value& value, std::optional<Error>* reason) {
    return telvane.sendMessageWithDictionary(value.isDictionary() ? *value.dictionary() : Dictionary(), reason);
  });
}

void TelvaneFlushMessages(TelvaneRef session) {
  if (session == nullptr) return;
  guarded([&] { session->session->flushMessages(); });
}

void TelvaneFlushMessagesWithCompletion(TelvaneRef session, TelvaneErrorCallback callback, void* context) {
  if (session == nullptr) return;
  guarded([&] {
    session->session->flushMessagesWithCompletion([callback, context](const std::optional<Error>& error) {
      if (callback == nullptr) return;
      std::unique_ptr<TelvaneErrorOpaque> given = error ? std::make_unique<TelvaneErrorOpaque>(*error) : nullptr;
      callback(given.get(), context);
    });
  });
}

bool TelvaneUploadLogWithArray(TelvaneRef session, plist_t logData) {
  if (session == nullptr) return false;
  return guarded(false, [&] {
    const telvane::Result<Value> data = valueOf(logData);
    return session->session->uploadDataArray(data && data->isArray() ? *data->array() : Array());
  });
}

bool TelvaneRegisterPeriodicTaskForModule(TelvaneRef session, uint32_t module, bool needToUpdate, bool needToReport,
                                          TelvanePeriodicTaskCallback callback, void* context) {
  if (session == nullptr) return false;
  return guarded(false, [&] {
    return session->session->registerPeriodicTaskForModule(module, needToUpdate, needToReport,
                                                           periodicTaskBlockOf(callback, context));
  });
}

bool TelvaneUnregisterPeriodTaskForModule(TelvaneRef session, uint32_t module) {
  return session != nullptr && session->session->unregisterPeriodTaskForModule(module);
}

void TelvaneStartLogTimerWithInterval(TelvaneRef session, uint32_t interval, uint32_t reportingMultiplier,
                                      uint16_t category, uint16_t type) {
  if (session == nullptr) return;
  session->session->startLogTimerWithInterval(interval, reportingMultiplier, category, type);
}

void TelvaneStopLogTimer(TelvaneRef session) {
  if (session != nullptr) session->session->stopLogTimer();
}

void TelvaneErrorRelease(TelvaneErrorRef error) { delete error; }

const char* TelvaneErrorGetDomain(TelvaneErrorRef error) { return error != nullptr ? error->domain.c_str() : nullptr; }

const char* TelvaneErrorGetDescription(TelvaneErrorRef error) {
  return error != nullptr ? error->description.c_str() : nullptr;
}

int64_t TelvaneErrorGetCode(TelvaneErrorRef error) { return error != nullptr ? error->error.code() : 0; }

plist_t TelvaneErrorCopyUserInfo(TelvaneErrorRef error) {
  if (error == nullptr) return nullptr;
  return guarded(plist_t(), [&] { return telvane::propertylist::newNode(error->error.userInfo()); });
}
