#include "client/OneShotSender.h"

#include <chrono>
#include <utility>

#include "client/ClientSessionProxy.h"
#include "client/SessionInfoValidation.h"
#include "client/ValueSize.h"
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

// What has been taken and is not answered yet. Shared by the sender and by what it was given. Safe from any thread.
class OneShotSender::Waiting : public std::enable_shared_from_this<Waiting> {
 public:
  // Room for one event, given back when it is gone.
  class Room {
   public:
    Room(std::shared_ptr<Waiting> waiting, uint64_t bytes) : _waiting(std::move(waiting)), _bytes(bytes) {}
    Room(Room&&) noexcept = default;
    Room& operator=(Room&&) = delete;
    ~Room() {
      if (_waiting != nullptr) _waiting->giveBack(_bytes);
    }

   private:
    std::shared_ptr<Waiting> _waiting;
    uint64_t _bytes;
  };
  // The right to one connection, given back when it is gone.
  class Place {
   public:
    explicit Place(std::shared_ptr<Semaphore> places) : _places(std::move(places)) { _places->wait(); }
    Place(Place&&) noexcept = default;
    Place& operator=(Place&&) = delete;
    ~Place() {
      if (_places != nullptr) _places->signal();
    }

   private:
    std::shared_ptr<Semaphore> _places;
  };

  Waiting(Log& log, Dispatch& dispatch) : _log(log), _places(dispatch.newSemaphore(kMaximumConnections)) {}

  // Returns nothing when there is no room.
  std::optional<Room> take(uint64_t bytes) EXCLUDES(_mutex);
  // Waits until there is a place.
  Place takePlace() { return Place(_places); }

 private:
  void giveBack(uint64_t bytes) noexcept EXCLUDES(_mutex);

  // Constant after construction.
  Log& _log;
  const std::shared_ptr<Semaphore> _places;

  Mutex _mutex;
  uint64_t _bytes GUARDED_BY(_mutex) = 0;
  uint64_t _dropped GUARDED_BY(_mutex) = 0;  // since the last burst that is over
};

std::optional<OneShotSender::Waiting::Room> OneShotSender::Waiting::take(uint64_t bytes) {
  {
    MutexLock lock(_mutex);
    if (_bytes + bytes <= kMaximumWaitingBytes) {
      _bytes += bytes;
      return std::make_optional<Room>(shared_from_this(), bytes);
    }
    if (++_dropped > 1) return std::nullopt;
  }
  // At once, since the daemon may never answer.
  _log.error("sendOneMessageWithSessionInfo: Dropping events: more than {} bytes wait for the daemon",
             kMaximumWaitingBytes);
  return std::nullopt;
}

void OneShotSender::Waiting::giveBack(uint64_t bytes) noexcept {
  uint64_t dropped = 0;
  {
    MutexLock lock(_mutex);
    _bytes -= bytes;
    // A burst ends when there is room for more than the next few; else a steady overload would be two lines per answer.
    if (_bytes <= kMaximumWaitingBytes / 2) dropped = std::exchange(_dropped, 0);
  }
  if (dropped == 0) return;
  try {
    _log.error("sendOneMessageWithSessionInfo: Dropped {} events", dropped);
  } catch (...) {
    // Out of memory: the line is lost, the events were before.
  }
}

struct OneShotSender::Message {
  Dictionary sessionInfo;
  Value userInfo;
  uint16_t category;
  uint16_t type;
  Dictionary payload;
  Waiting::Room room;
};

OneShotSender::OneShotSender(ClientContext& context)
    : _context(context),
      _queue(context.platform().dispatch.newSerialQueue("com.corvex.Telvane.sendOneMessageQueue",
                                                        QualityOfService::Utility)),
      _waiting(std::make_shared<Waiting>(context.log(), context.platform().dispatch)) {}

OneShotSender::~OneShotSender() = default;

bool OneShotSender::sendOneMessageWithSessionInfo(const Value& sessionInfo, const Value& userInfo, uint16_t category,
                                                  uint16_t type, const Value& payload, std::optional<Error>* error) {
  if (!validateSessionInfo(_context.log(), sessionInfo, error)) return false;
  if (category == 0) return refuse(error, "The category of a message must not be 0");
  if (payload.isPresent() && !payload.isDictionary()) return refuse(error, "The payload must be a dictionary");
  const uint64_t bytes = estimatedSize(sessionInfo) + estimatedSize(userInfo) + estimatedSize(payload);
  std::optional<Waiting::Room> room = _waiting->take(bytes + sizeof(Message));
  if (!room) return true;
  Message message{
      *sessionInfo.dictionary(), userInfo, category, type, payload.isPresent() ? *payload.dictionary() : Dictionary(),
      std::move(*room)};
  message.sessionInfo.set(kTelvaneSessionInfoBatchEvent, false);
  _queue->async(
      [&context = _context, waiting = _waiting, message = std::move(message),
       hold = PendingWork::Hold(_context.pendingWork())]() mutable { send(context, *waiting, std::move(message)); });
  return true;
}

void OneShotSender::send(ClientContext& context, Waiting& waiting, Message message) {
  Log& log = context.log();
  Waiting::Place place = waiting.takePlace();
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
  auto reply = [connection, &log, isAnswered, place = std::move(place), room = std::move(message.room),
                hold = PendingWork::Hold(context.pendingWork())](const Value& status) {
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
