#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/Dispatch.h"
#include "platform/ipc/Connection.h"
#include "tests/platform/ipc/Gathered.h"

namespace telvane::testing {

// An exported object that does with a call what its operation says, and remembers the calls in their order.
class TalkingObject final : public ipc::ExportedObject {
 public:
  enum Operation : uint16_t {
    kRemember = 1,  // nothing else
    kEcho,          // answers with the arguments
    kKeep,          // keeps the reply block for answerKept()
    kDrop,          // lets the reply block go
    kReadFile,      // answers with what the descriptor reads
    kBlock,         // waits for release(), then answers like kEcho
  };

  explicit TalkingObject(Dispatch& dispatch) : _blocked(dispatch.newSemaphore(0)) {}

  void invoke(ipc::Invocation invocation, ipc::ReplyBlock reply) override;

  Gathered<Array>& calls() noexcept { return _calls; }
  size_t keptReplies() const;
  // Answers the kept calls with their numbers, from this thread.
  void answerKept();
  void answerKept(const Array& values);
  void dropKept();
  void release(unsigned count = 1);

 private:
  void keep(ipc::ReplyBlock reply);
  std::vector<ipc::ReplyBlock> takeKept();

  Gathered<Array> _calls;
  const std::shared_ptr<Semaphore> _blocked;
  mutable std::mutex _mutex;
  std::vector<ipc::ReplyBlock> _kept;
};

}  // namespace telvane::testing
