#pragma once

#include <atomic>
#include <deque>
#include <memory>
#include <vector>

#include "platform/Dispatch.h"
#include "platform/FlowGate.h"
#include "platform/Mutex.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/Reply.h"
#include "platform/ipc/ReplyCollector.h"

namespace telvane::ipc {

// A call as it came, 0 when it wants no answer.
struct IncomingCall {
  Invocation invocation;
  uint32_t replyID = 0;
};

// Executes received batches on the connection's serial queue, one after the other, each only while the gate is open. So
// a slow collector, a busy session and a connection that has not been resumed all show as batches that are not answered
// yet, and the peer stops sending.
//
// Owned by its connection, kept alive by its jobs. Safe from any thread.
class CallExecutor : public std::enable_shared_from_this<CallExecutor> {
 public:
  // Takes the answers that are there when a batch has been executed. Called on the queue.
  using Executed = UniqueFunction<void(Replies replies)>;

  // gate may be null. onQuiet is called, on the queue, when a batch has been executed on a closed connection: the
  // moment from which on nothing more will be answered.
  CallExecutor(std::shared_ptr<SerialQueue> queue, FlowGate* gate, Job onQuiet)
      : _queue(std::move(queue)), _gate(gate), _onQuiet(std::move(onQuiet)) {}

  void setObject(std::shared_ptr<ExportedObject> object);
  // Lets go of the exported object. REQUIRES: on the queue, so that it is not in a call.
  void releaseObject();
  // Begins to execute what has come and what will.
  void resume();
  // Queues a batch; onLate takes the answers that come after onExecuted has been called.
  void add(std::vector<IncomingCall> calls, Executed onExecuted, ReplyCollector::LateReply onLate);
  // Runs the job on the queue behind all batches that were added before.
  void addBarrier(Job job);
  // Lets go of the batches that have not begun, and of the rest of the one that has; barriers still run.
  void close();
  // Whether a batch is being executed, or executed but not handed back yet.
  bool isExecuting() const;

 private:
  struct Item {
    std::vector<IncomingCall> calls;
    Executed onExecuted;
    ReplyCollector::LateReply onLate;
    Job barrier;
  };

  void schedule() REQUIRES(_mutex);
  void runNext();
  void execute(Item& item);

  const std::shared_ptr<SerialQueue> _queue;
  FlowGate* const _gate;
  Job _onQuiet;  // called on the queue only
  std::atomic<bool> _isClosed{
      false};  // set once; read between calls, so that a closed connection hears no more of them

  mutable Mutex _mutex;
  std::deque<Item> _items GUARDED_BY(_mutex);
  std::shared_ptr<ExportedObject> _object GUARDED_BY(_mutex);
  bool _isResumed GUARDED_BY(_mutex) = false;
  bool _isScheduled GUARDED_BY(_mutex) = false;
  bool _isExecuting GUARDED_BY(_mutex) = false;
};

}  // namespace telvane::ipc
