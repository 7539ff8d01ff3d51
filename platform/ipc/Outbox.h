#pragma once

#include <cstdint>
#include <deque>
#include <optional>
#include <vector>

#include "platform/Mutex.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/Limits.h"

namespace telvane::ipc {

// A call on its way out, with what its caller hears of it.
struct OutgoingCall {
  enum class Outcome : uint8_t { Open, Answered, Dropped };

  Invocation invocation;
  ReplyBlock reply;  // empty when no answer is wanted
  Connection::ErrorHandler onError;
  Outcome outcome = Outcome::Open;
  Array answer;  // when answered
};

// Calls that cross the socket together.
struct OutgoingBatch {
  std::vector<OutgoingCall> calls;
  size_t memoryBytes = 0;  // what the batch is counted with while it waits and while it is under way
  size_t wireBytes = 0;
  size_t textBytes = 0;
  size_t descriptors = 0;
};

// The calls of one connection that wait for the loop, sorted into batches as they are made, so that a sender takes one
// lock and wakes the loop only when that has something to do. Bounded in bytes; what is under way counts until it has
// been executed. Safe from any thread.
class Outbox {
 public:
  enum class Admission {
    Queued,          // the loop will come by
    QueuedMustPump,  // the caller posts the loop's next look
    Full,            // refused: too many bytes wait
    Closed,          // refused: the connection has been invalidated
  };

  explicit Outbox(const Limits& limits) : _limits(limits) {}

  // Takes the call unless it refuses it, in which case the call is left as it was.
  Admission add(OutgoingCall& call, size_t wireBytes, size_t textBytes);
  // Returns the next batch to send, or nothing when there is none or a batch under way is reason to gather more. What
  // the loop is told next depends on it. batchesUnderWay: without the one asked for.
  std::optional<OutgoingBatch> take(size_t batchesUnderWay);
  // Notes that the loop cannot send now and will ask by itself once it can.
  void standStill();
  // Takes all that waits and asks for a pump at the next call.
  std::vector<OutgoingBatch> takeAll();
  // Moves the reply blocks and error handlers of all that waits out into calls without arguments; the calls themselves
  // stay and want no answer any more.
  std::vector<OutgoingCall> takeHandlers();
  // Tells that a batch is not under way any more. Returns how many calls were dropped when that ends a burst of drops,
  // else 0.
  uint64_t settle(size_t memoryBytes);
  // Refuses calls from now on. What waits stays.
  void close();
  bool isEmpty() const;
  // Ends a burst of drops: returns their number, 0 when there is none.
  uint64_t takeDropped();

 private:
  enum class Wake { AtOnce, WhenFull, Never };

  bool isBatchFull() const REQUIRES(_mutex);
  OutgoingBatch& batchFor(const OutgoingCall& call, size_t memoryBytes) REQUIRES(_mutex);
  bool isFull(const OutgoingBatch& batch) const;

  const Limits& _limits;
  mutable Mutex _mutex;
  std::deque<OutgoingBatch> _batches GUARDED_BY(_mutex);
  size_t _bytes GUARDED_BY(_mutex) = 0;
  uint64_t _dropped GUARDED_BY(_mutex) = 0;
  Wake _wake GUARDED_BY(_mutex) = Wake::Never;  // until the loop has looked for the first time
  bool _isClosed GUARDED_BY(_mutex) = false;
};

}  // namespace telvane::ipc
