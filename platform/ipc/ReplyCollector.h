#pragma once

#include <functional>
#include <memory>

#include "platform/Mutex.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/Reply.h"

namespace telvane::ipc {

// Takes the answers of one received batch: those given while it is executed go back with it, later ones on their own,
// so that none holds back another. Shared by the batch's reply blocks. Safe from any thread.
class ReplyCollector : public std::enable_shared_from_this<ReplyCollector> {
 public:
  using LateReply = std::function<void(Reply reply)>;

  // onLate takes each answer that comes after close(), on the thread that gives it.
  explicit ReplyCollector(LateReply onLate) : _onLate(std::move(onLate)) {}

  // Makes the block of one call; it gives one answer, or tells of its dropping.
  ReplyBlock newBlock(uint32_t replyID);
  // Returns what was answered so far, in the order of the answers.
  Replies close();

 private:
  class Responder;

  void add(Reply reply);

  const LateReply _onLate;
  Mutex _mutex;
  Replies _replies GUARDED_BY(_mutex);
  bool _isClosed GUARDED_BY(_mutex) = false;
};

}  // namespace telvane::ipc
