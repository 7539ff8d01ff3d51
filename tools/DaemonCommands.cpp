#include "tools/DaemonCommands.h"

#include <algorithm>

#include "client/OneShotSender.h"
#include "client/SessionInfoValidation.h"
#include "interfaces/BackendNames.h"
#include "interfaces/ClientSessionInterface.h"
#include "interfaces/FileURL.h"
#include "interfaces/SessionKeys.h"
#include "platform/JSON.h"
#include "platform/ProcessIdentifier.h"
#include "platform/system/PosixFileSystem.h"
#include "tools/Answer.h"
#include "tools/StatusText.h"

namespace telvane {
namespace {

// Longer than the daemon takes to give up on a storebag server.
constexpr auto kPatience = std::chrono::seconds(60);
// A large file takes its time, and the daemon none of its own.
constexpr auto kUploadPatience = std::chrono::hours(24);
constexpr auto kStatusPatience = std::chrono::seconds(10);

Error fault(const std::string& text) { return Error::withDescription("TelvaneControl", 1, text); }

bool hasName(const Value& userInfo) {
  const Dictionary* info = userInfo.dictionary();
  return info != nullptr && (info->contains(kTelvaneUserInfoClientName) || info->contains(kTelvaneUserInfoServiceName));
}

bool isListed(const Value& names, std::string_view wanted) {
  const Array* array = names.array();
  return array != nullptr &&
         std::any_of(array->begin(), array->end(), [wanted](const Value& name) { return name.text() == wanted; });
}

std::string listOf(const Value& names) {
  const Array* array = names.array();
  if (array == nullptr || array->empty()) return "none";
  std::string list;
  for (const Value& name : *array) list += (list.empty() ? "" : ", ") + std::string(name.text());
  return list;
}

}  // namespace

Result<void> DaemonCommands::status(StatusForm form) {
  const Result<Dictionary> status = fetchStatus();
  if (status.has_error()) return status.error();
  if (form == StatusForm::Readable) {
    _printer.line(statusText(*status));
    return {};
  }
  const Result<std::string> text = json::serialize(*status, json::Style::Pretty);
  if (text.has_error()) return text.error();
  _printer.line(*text);
  return {};
}

Result<Dictionary> DaemonCommands::fetchStatus() {
  Result<std::shared_ptr<ipc::Connection>> made = _context.platform().localService.newConnection(kTelvanedServiceName);
  if (made.has_error()) return made.error();
  const std::shared_ptr<ipc::Connection> connection = std::move(*made);
  connection->resume();
  Answer<Result<Value>> answer(_context.platform().dispatch);
  auto giver = std::make_shared<Answer<Result<Value>>::Giver>(answer.giver());
  connection->sendWithReply(
      {static_cast<uint16_t>(ClientSessionOperation::DaemonStatus), {}, {}},
      [giver](const Array& values) { giver->give(values[0]); }, [giver](const Error& error) { giver->give(error); });
  giver.reset();
  const std::optional<Result<Value>> answered = answer.waitFor(kStatusPatience);
  connection->invalidate();
  if (!answered.has_value()) return fault("the daemon does not answer; look at its log");
  if (answered->has_error()) {
    return fault("no daemon serves this program (" + answered->error().description() +
                 "); start telvaned, and see that a grant in /etc/telvane/entitlements.d lets this program in");
  }
  const Dictionary* status = (*answered)->dictionary();
  if (status == nullptr) return fault("the daemon's answer is no status; do daemon and telvanectl fit together?");
  return *status;
}

Result<void> DaemonCommands::send(const MessageOptions& options) {
  const Result<OpenSession> opened = openSession(options);
  if (opened.has_error()) return opened.error();
  const Result<void> sent = sendMessages(*opened->session, options);
  if (sent.has_error()) return sent.error();
  if (options.isFlushing) {
    const Result<void> flushed = flush(*opened->session);
    if (flushed.has_error()) return flushed.error();
  }
  return settle(opened->session);
}

Result<void> DaemonCommands::oneShot(const MessageOptions& options) {
  const Result<Value> userInfo = options.makeUserInfo();
  if (userInfo.has_error()) return userInfo.error();
  // The daemon drops it without a word to us otherwise.
  if (!hasName(*userInfo)) return fault("a message without a session needs --client-name or --service-name");
  const Result<Dictionary> status = fetchStatus();
  if (status.has_error()) return status.error();
  const Result<Dictionary> sessionInfo = options.makeSessionInfo(currentProcessID());
  if (sessionInfo.has_error()) return sessionInfo.error();
  const Result<Dictionary> message = options.makeMessage();
  if (message.has_error()) return message.error();
  OneShotSender sender(_context);
  for (uint32_t i = 0; i < options.count; ++i) {
    std::optional<Error> error;
    sender.sendOneMessageWithSessionInfo(*sessionInfo, *userInfo, options.category, options.type,
                                         (*message)[kTelvaneMessageParametersPayload], &error);
    if (error.has_value()) return fault("the message was refused: " + error->description());
  }
  Result<void> settled = settle(nullptr);
  if (!settled.has_error()) _printer.line(fmt::format("sent: {}", options.count));
  return settled;
}

Result<void> DaemonCommands::upload(const MessageOptions& options) {
  const Result<OpenSession> opened = openSession(options);
  if (opened.has_error()) return opened.error();
  if (!isListed(opened->backendNames, kTelvaneBackendUploadServer.view()))
    return fault("the storebag of this client type enables no upload server");
  const Result<void> handedOver = handOver(*opened->session, options.uploadFile);
  if (handedOver.has_error()) return handedOver.error();
  const bool isStillThere = PosixFileSystem(Paths{}).modificationDate(pathOfFileURL(options.uploadFile)).has_value();
  _printer.line(isStillThere ? "posted: " + options.uploadFile +
                                   "; it is still there, so the server has not said success, or the daemon may not "
                                   "delete it: its log says which"
                             : "uploaded: " + options.uploadFile);
  return settle(opened->session);
}

Result<void> DaemonCommands::handOver(ClientSession& session, const std::string& file) {
  Answer<bool> answer(_context.platform().dispatch);
  const bool isTaken = session.uploadFileWithURL(
      file, [giver = answer.giver()](bool isSuccess, const std::optional<Error>& error) mutable {
        giver.give(isSuccess && !error.has_value());
      });
  if (!isTaken) return fault("cannot read " + file);
  const std::optional<bool> isPosted = answer.waitFor(kUploadPatience);
  if (!isPosted.has_value()) return fault("the daemon ended the session, or did not answer; its log says why");
  if (*isPosted) return {};
  return fault("the daemon refused " + file +
               ": it uploads a regular file that is not empty and no link, as far as its disk has room for a "
               "compressed copy; its log says what it was, but for a lack of room");
}

Result<DaemonCommands::OpenSession> DaemonCommands::openSession(const MessageOptions& options) {
  const Result<Value> userInfo = options.makeUserInfo();
  if (userInfo.has_error()) return userInfo.error();
  const Result<Dictionary> sessionInfo = options.makeSessionInfo(currentProcessID());
  if (sessionInfo.has_error()) return sessionInfo.error();
  const Result<Value> digestKey = options.makeDigestKey();
  if (digestKey.has_error()) return digestKey.error();
  std::optional<Error> invalid;
  if (!validateSessionInfo(_context.log(), *sessionInfo, &invalid)) return fault(invalid->description());
  const Result<Dictionary> status = fetchStatus();
  if (status.has_error()) return status.error();
  std::shared_ptr<ClientSession> session =
      ClientSession::initWithSessionInfo(_context, *sessionInfo, *userInfo, {}, {});
  if (session == nullptr)
    return fault("no session: it is switched off, or this user may not reach the daemon's socket");
  session->setMessageLoggingBlock([&printer = _printer](const String& text) { printer.line(text.view()); });
  if (digestKey->isPresent()) session->setDigestKey(*digestKey, 0);
  const Result<Value> configured = configure(*session);
  if (configured.has_error()) return configured.error();
  return OpenSession{std::move(session), *configured};
}

Result<Value> DaemonCommands::configure(ClientSession& session) {
  Answer<Value> answer(_context.platform().dispatch);
  session.startConfigurationWithCompletionHandler(
      [giver = answer.giver()](const Value& enabledBackendNames) mutable { giver.give(enabledBackendNames); });
  const std::optional<Value> names = answer.waitFor(kPatience);
  if (!names.has_value()) return fault("the daemon ended the session, or did not answer; its log says why");
  _printer.line("enabled backends: " + listOf(*names));
  return *names;
}

Result<void> DaemonCommands::sendMessages(ClientSession& session, const MessageOptions& options) {
  const Result<Dictionary> message = options.makeMessage();
  if (message.has_error()) return message.error();
  uint32_t sent = 0;
  for (uint32_t i = 0; i < options.count; ++i) {
    std::optional<Error> error;
    if (session.sendMessageWithDictionary(*message, &error)) ++sent;
    if (error.has_value()) return fault("the message was refused: " + error->description());
  }
  _printer.line(fmt::format("sent: {}", sent));
  if (sent < options.count) _printer.line(fmt::format("filtered out by the storebag: {}", options.count - sent));
  return {};
}

Result<void> DaemonCommands::flush(ClientSession& session) {
  Answer<std::optional<Error>> answer(_context.platform().dispatch);
  session.flushMessagesWithCompletion(
      [giver = answer.giver()](const std::optional<Error>& error) mutable { giver.give(error); });
  const std::optional<std::optional<Error>> error = answer.waitFor(kPatience);
  if (!error.has_value()) return fault("the flush was not answered; the daemon's log says why");
  if (error->has_value()) return fault("flush: " + (*error)->description());
  _printer.line("flushed");
  return {};
}

Result<void> DaemonCommands::settle(const std::shared_ptr<ClientSession>& session) {
  if (session != nullptr) session->holdUntilDelivered(PendingWork::Hold(_context.pendingWork()));
  if (_context.pendingWork().waitUntilNone(_context.platform().dispatch, kPatience)) return {};
  return fault("the daemon has not taken everything in time; its log says why");
}

}  // namespace telvane
