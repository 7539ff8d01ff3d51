#pragma once

#include <capnp/rpc-twoparty.h>

#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "interfaces/Wire.capnp.h"
#include "platform/ipc/CallExecutor.h"
#include "platform/ipc/Limits.h"
#include "platform/ipc/LoopThread.h"
#include "platform/ipc/Outbox.h"
#include "platform/ipc/Reply.h"
#include "platform/ipc/SocketStream.h"
#include "platform/ipc/WireCoding.h"

namespace telvane::ipc {

// What a line tells the connection that owns it, on the loop. The line still exists when the call returns.
class LineOwner {
 public:
  virtual ~LineOwner() = default;
  // Accepting side: the peer asks for the line; answered with Line::decide.
  virtual void lineAsked() = 0;
  // Both sides: calls may be delivered from now on.
  virtual void lineOpened() = 0;
  // Connecting side: the listener does not want us.
  virtual void lineRefused() = 0;
  // A batch has come. Answered with Line::finishBatch.
  virtual void lineReceived(uint64_t batch, std::vector<IncomingCall> calls) = 0;
  // A batch was executed; its calls hold their answers, those that come later excepted. There is room for another one.
  virtual void lineDelivered(OutgoingBatch batch) = 0;
  // Answers of earlier batches came.
  virtual void lineAnswered(std::vector<OutgoingCall> calls) = 0;
  // All that was given to the line before farewell() has arrived.
  virtual void lineDrained() = 0;
  // The line is over. reason: empty when the peer simply closed, else what it did wrong. Called once.
  virtual void lineEnded(const std::string& reason) = 0;
};

// One line between two processes, from the connected socket to its end: turns calls and answers into messages and back.
// A connection that was interrupted makes a new one.
//
// Owned by its connection, confined to the loop, must not be destroyed by its own owner calls.
class Line final : private kj::TaskSet::ErrorHandler {
 public:
  enum class Side { Connecting, Accepting };

  Line(LineOwner& owner, LoopThread& loop, const Limits& limits, Side side, Descriptor socket);
  ~Line();

  bool isOpen() const noexcept { return _isOpen; }
  // Accepting side: answers the peer's asking.
  void decide(bool isAccepted);
  size_t batchesUnderWay() const noexcept { return _underWay.size(); }
  // REQUIRES: isOpen().
  void deliver(OutgoingBatch batch);
  // Answers a received batch with the replies that are there.
  void finishBatch(uint64_t batch, Replies replies);
  // Sends replies of batches that were answered before.
  void answer(Reply reply);
  // Asks for lineDrained().
  void farewell();
  // Moves the calls under way and those whose answer is still to come out of the line, and the bytes that the former
  // were counted with. The calls' arguments are gone.
  std::vector<OutgoingCall> takeUnanswered(size_t& memoryBytes);
  // Moves only their handlers out, so that the calls are delivered but nobody hears of them.
  std::vector<OutgoingCall> takeHandlers();

 private:
  using OpenContext = capnp::CallContext<wire::Acceptor::OpenParams, wire::Acceptor::OpenResults>;
  using DeliverContext = capnp::CallContext<wire::Endpoint::DeliverParams, wire::Endpoint::DeliverResults>;
  using AnswerContext = capnp::CallContext<wire::Endpoint::AnswerParams, wire::Endpoint::AnswerResults>;
  class AcceptorServer;
  class EndpointServer;
  class OpenFileServer;
  struct ReceivedBatch;
  struct UnderWay {
    uint64_t number;
    uint32_t firstID;
    OutgoingBatch batch;
  };

  void askToOpen();
  OutgoingCall* findUnanswered(uint32_t replyID);
  kj::Promise<void> asked(OpenContext context);
  kj::Promise<void> received(DeliverContext context);
  kj::Promise<void> answered(AnswerContext context);
  std::vector<IncomingCall> decodeCalls(wire::Endpoint::DeliverParams::Reader params);
  uint32_t newIDs(size_t count);
  void encodeCalls(UnderWay& sent, capnp::List<wire::Invocation>::Builder list);
  void delivered(uint64_t number, capnp::Response<wire::Endpoint::DeliverResults>& response);
  void deliverFailed(uint64_t number, const kj::Exception& failure);
  OutgoingBatch takeUnderWay(uint64_t number);
  void encodeReplies(const Replies& replies, capnp::List<wire::Reply>::Builder list);
  void sendAnswers();
  void checkUnread();
  void end(std::string reason);
  void guarded(kj::FunctionParam<void()> read);
  void taskFailed(kj::Exception&& exception) override;

  LineOwner& _owner;
  LoopThread& _loop;
  const Limits& _limits;
  // Lets the capabilities that the peer holds find this line for as long as it exists.
  const std::shared_ptr<Line*> _self;
  bool _isOpen = false;
  bool _hasEnded = false;
  uint64_t _openDeadline = 0;

  std::deque<UnderWay> _underWay;
  uint64_t _lastBatch = 0;
  uint32_t _lastID = 0;
  std::unordered_map<uint32_t, OutgoingCall> _late;

  std::map<uint64_t, ReceivedBatch> _received;
  uint64_t _lastReceived = 0;
  size_t _unanswered = 0;  // calls of the peer that want an answer and have none
  std::deque<Reply> _answers;
  size_t _answerBytes = 0;
  bool _isAnswering = false;
  bool _isLeaving = false;

  SocketStream _stream;
  capnp::TwoPartyVatNetwork _network;
  capnp::RpcSystem<capnp::rpc::twoparty::VatId> _rpc;
  kj::Maybe<wire::Endpoint::Client> _peer;
  struct Asking;
  std::unique_ptr<Asking> _asking;
  kj::TaskSet _tasks;
};

}  // namespace telvane::ipc
