#include "client/OneShotSender.h"

#include <chrono>

#include "client/ClientSessionProxy.h"
#include "client/SessionInfoValidation.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/TelvaneErrors.h"

namespace telvane {
namespace {

// After that the next event is sent all the same: one that waits for the daemon's first storebag holds up no others.
constexpr std::chrono::seconds kAnswerPatience{10};

bool refuse(std::optional<Error>* error, const char* reason) {
  if (error != nullptr) *error = makeTelvaneError(reason, static_cast<int64_t>(TelvaneErrorCode::MessageRefused));
  return false;
}

}  // namespace

OneShotSender::OneShotSender(ClientContext& context)
    : _context(context),
      _queue(context.platform().dispatch.newSerialQueue("com.corvex.Telvane.sendOneMessageQueue",
                                                        QualityOfService::Utility)) {}

bool OneShotSender::sendOneMessageWithSessionInfo(const Value& sessionInfo, const Value& userInfo, uint16_t category,
                                                  uint16_t type, const Value& payload, std::optional<Error>* error) {
  if (!validateSessionInfo(_context.log(), sessionInfo, error)) return false;
  if (category == 0) return refuse(error, "The category of a message must not be 0");
  if (payload.isPresent() && !payload.isDictionary()) return refuse(error, "The payload must be a dictionary");
  Message message{*sessionInfo.dictionary(), userInfo, category, type,
                  payload.isPresent() ? *payload.dictionary() : Dictionary()};
  message.sessionInfo.set(kTelvaneSessionInfoBatchEvent, false);
  _queue->async([&context = _context, message = std::move(message), hold = PendingWork::Hold(_context.pendingWork())] {
    send(context, message);
  });
  return true;
}

void OneShotSender::send(ClientContext& context, Message message) {
  Log& log = context.log();
  log.message("startLogging: Client starts logging...");
  Result<std::shared_ptr<ipc::Connection>> made = context.platform().localService.newConnection(kTelvanedServiceName);
  if (!made) {
    log.error("sendOneMessageWithSessionInfo: Failed to connect to daemon");
    return;
  }
  const std::shared_ptr<ipc::Connection> connection = *made;
  connection->setInvalidationHandler(
      [&log] { log.message("sendOneMessageWithSessionInfo: XPC connection invalidated"); });
  connection->setInterruptionHandler(
      [&log] { log.message("sendOneMessageWithSessionInfo: XPC connection interrupted"); });
  connection->resume();
  const std::shared_ptr<Semaphore> isAnswered = context.platform().dispatch.newSemaphore(0);
  // The answer holds the connection, which is kept by nothing else, until it comes or can no longer come.
  auto reply = [connection, &log, isAnswered, hold = PendingWork::Hold(context.pendingWork())](const Value& status) {
    log.message("{}", status);
    connection->invalidate();
    isAnswered->signal();
  };
  auto onError = [&log, isAnswered](const Error&) {
    log.error("sendOneMessageWithSessionInfo: Failed to get remote object proxy");
    isAnswered->signal();
  };
  ClientSessionProxy::remoteObjectProxyWithErrorHandler(*connection, std::move(onError))
      .sendMessageForStatusValue(std::move(message.sessionInfo), std::move(message.userInfo), message.category,
                                 message.type, std::move(message.payload), std::move(reply));
  // Each connection is a session to the daemon, which cuts off a sixth of one client type.
  isAnswered->waitFor(kAnswerPatience);
}

}  // namespace telvane
