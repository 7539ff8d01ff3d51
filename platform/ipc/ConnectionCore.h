#pragma once

#include <atomic>
#include <memory>
#include <string>
#include <vector>

#include "platform/Dispatch.h"
#include "platform/FlowGate.h"
#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/ipc/CallExecutor.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/Limits.h"
#include "platform/ipc/Line.h"
#include "platform/ipc/LoopThread.h"
#include "platform/ipc/Outbox.h"

namespace telvane::ipc {

// What a connection is made of: the calls on their way out, those that came, and the line that carries both. It
// outlives the connection object that its owner holds for as long as there is something to deliver.
//
// Three threads meet here: callers put calls into the outbox, the loop moves them over the line, and the connection's
// queue runs handlers, answers and exported calls. Everything about the line is confined to the loop.
class ConnectionCore final : public std::enable_shared_from_this<ConnectionCore>,
                             public LoopResident,
                             public LineOwner {
 public:
  struct Parts {
    std::shared_ptr<LoopThread> loop;
    std::shared_ptr<SerialQueue> queue;
    Log& log;
    FlowGate* gate;  // may be null
    Limits limits;
    std::string description;
  };

  // Makes the connecting side; path: of the service's socket.
  static std::shared_ptr<ConnectionCore> newConnecting(Parts parts, std::string path);
  // Makes the accepting side.
  static std::shared_ptr<ConnectionCore> newAccepting(Parts parts);
  ~ConnectionCore() override = default;

  // Takes over the socket of a peer that has connected; onAsked runs on the loop when that asks for the line, and is
  // answered with decide(). REQUIRES: accepting side, on the loop.
  void attach(Descriptor socket, Job onAsked);
  // Safe from any thread.
  void decide(bool isAccepted);
  // Runs on the connection's queue, behind the invalidation handler. Set before resume().
  void setOnInvalidated(Job job);

  // The operations of Connection.
  void setExportedObject(std::shared_ptr<ExportedObject> object) { _executor->setObject(std::move(object)); }
  void setInterruptionHandler(Job handler);
  void setInvalidationHandler(Job handler);
  void resume();
  void send(OutgoingCall call);
  void invalidate();
  // Like invalidate(), but runs no handlers any more except those of calls that want an answer.
  void letGo();
  const std::string& description() const noexcept { return _parts.description; }
  bool hasEnded() const noexcept { return _hasEnded.load(std::memory_order_acquire); }

  // LoopResident
  void windDown() override { invalidate(); }
  void endNow() override;

 private:
  enum class Life { New, Resumed, Invalid };
  enum class Deliver { Yes, No };

  ConnectionCore(Parts parts, std::string path);

  // From any thread.
  void fail(Connection::ErrorHandler onError, Error error);
  bool hasBeenResumed();
  bool becomeInvalid(Life& before);
  void finish(std::vector<OutgoingCall> unanswered, Error error);
  void tellInterruption(std::vector<OutgoingCall> unanswered, bool isOver);
  void checkReply(Reply& reply);
  void runInterruptionHandler();
  void runInvalidationHandler();
  void postPump();
  std::vector<OutgoingCall> takeWaiting();
  void logDropped(uint64_t count);

  // On the loop.
  void pump();
  void connect();
  void tryConnect(unsigned attempts);
  void cannotConnect(const Error& error);
  std::shared_ptr<Line> newLine(Line::Side side, Descriptor socket);
  void closeOnLoop(Deliver deliver);
  void refuseToGoOn(const Error& error);
  void tryFarewell();
  void leave();
  std::vector<OutgoingCall> takeEverything();
  void interrupted(std::vector<OutgoingCall> unanswered);

  // LineOwner
  void lineAsked() override;
  void lineOpened() override;
  void lineRefused() override;
  void lineReceived(uint64_t batch, std::vector<IncomingCall> calls) override;
  void lineDelivered(OutgoingBatch batch) override;
  void lineAnswered(std::vector<OutgoingCall> calls) override;
  void lineDrained() override;
  void lineEnded(const std::string& reason) override;

  // Constant after construction.
  const Parts _parts;
  const std::string _path;  // empty on the accepting side
  std::shared_ptr<CallExecutor> _executor;

  Outbox _outbox;
  // Set by whoever notices first, read by any thread.
  std::atomic<bool> _hasEnded{false};

  Mutex _mutex;
  Life _life GUARDED_BY(_mutex) = Life::New;
  std::shared_ptr<Job> _interruptionHandler GUARDED_BY(_mutex);
  Job _invalidationHandler GUARDED_BY(_mutex);
  Job _onInvalidated GUARDED_BY(_mutex);

  // Confined to the loop.
  std::shared_ptr<Line> _line;
  uint64_t _lineNumber = 0;  // tells answers for an earlier line
  bool _isConnecting = false;
  bool _isClosing = false;
  bool _hasSaidFarewell = false;
  uint64_t _linger = 0;
  uint64_t _retry = 0;
  Job _onAsked;
};

}  // namespace telvane::ipc
