#include "platform/ipc/Line.h"

#include <fcntl.h>
#include <fmt/format.h>

#include <algorithm>
#include <utility>

namespace telvane::ipc {

namespace {

constexpr unsigned kMostDescriptorsPerMessage = 16;
// Received with calls that wait to be executed. A peer of our make has at most 16 under way; what is held here is taken
// from everybody who needs a descriptor in this process.
constexpr size_t kMostWaitingDescriptors = 64;
// A client needs less than half of them to ask for the line.
constexpr size_t kMessagesBeforeAcceptance = 16;
constexpr size_t kBytesBeforeAcceptance = 16u << 10;
// A list and a struct deeper than a value's own nesting, with room for what the library puts around a call.
constexpr int kNestingOnTheWire = 2 * static_cast<int>(kMaximumNesting) + 32;

capnp::ReaderOptions readerOptions(const Limits& limits) {
  return {.traversalLimitInWords = limits.maximumMessageBytes / sizeof(capnp::word), .nestingLimit = kNestingOnTheWire};
}

capnp::MessageSize wordsFor(size_t wireBytes, size_t structs, size_t capabilities) {
  constexpr size_t kBytesPerStruct = 32;
  constexpr size_t kBytesAround = 64;
  return {(wireBytes + structs * kBytesPerStruct + kBytesAround) / sizeof(capnp::word),
          static_cast<unsigned>(capabilities)};
}

// A descriptor of our own for the one that came beside the message; invalid when none did.
Descriptor descriptorOf(wire::OpenFile::Client file) {
  auto hook = capnp::ClientHook::from(kj::mv(file));
  KJ_IF_MAYBE (fd, hook->getFd()) {
    return Descriptor(::fcntl(*fd, F_DUPFD_CLOEXEC, 0));
  }
  return Descriptor();
}

size_t descriptorsOf(const std::vector<IncomingCall>& calls) {
  return static_cast<size_t>(std::count_if(
      calls.begin(), calls.end(), [](const IncomingCall& call) { return call.invocation.descriptor.isValid(); }));
}

kj::Exception disconnected() {
  return kj::Exception(kj::Exception::Type::DISCONNECTED, "", 0, kj::str("the line has ended"));
}

}  // namespace

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wnon-virtual-dtor"  // the generated bases have none; the library deletes by the class

class Line::OpenFileServer final : public wire::OpenFile::Server {
 public:
  explicit OpenFileServer(Descriptor descriptor) : _descriptor(std::move(descriptor)) {}
  kj::Maybe<int> getFd() override { return _descriptor.get(); }

 private:
  Descriptor _descriptor;
};

class Line::EndpointServer final : public wire::Endpoint::Server {
 public:
  explicit EndpointServer(std::shared_ptr<Line*> line) : _line(std::move(line)) {}

 protected:
  kj::Promise<void> deliver(DeliverContext context) override {
    return *_line == nullptr ? kj::Promise<void>(disconnected()) : (*_line)->received(context);
  }
  kj::Promise<void> answer(AnswerContext context) override {
    return *_line == nullptr ? kj::Promise<void>(disconnected()) : (*_line)->answered(context);
  }

 private:
  const std::shared_ptr<Line*> _line;
};

class Line::AcceptorServer final : public wire::Acceptor::Server {
 public:
  explicit AcceptorServer(std::shared_ptr<Line*> line) : _line(std::move(line)) {}

 protected:
  kj::Promise<void> open(OpenContext context) override {
    return *_line == nullptr ? kj::Promise<void>(disconnected()) : (*_line)->asked(context);
  }

 private:
  const std::shared_ptr<Line*> _line;
};

#pragma GCC diagnostic pop

struct Line::ReceivedBatch {
  DeliverContext context;
  kj::Own<kj::PromiseFulfiller<void>> fulfiller;
  size_t descriptors = 0;  // that came with its calls
};

struct Line::Asking {
  OpenContext context;
  kj::Own<kj::PromiseFulfiller<void>> fulfiller;
};

Line::Line(LineOwner& owner, LoopThread& loop, const Limits& limits, Side side, Descriptor socket)
    : _owner(owner),
      _loop(loop),
      _limits(limits),
      _self(std::make_shared<Line*>(this)),
      _stream(loop.port(), std::move(socket)),
      _network(_stream, kMostDescriptorsPerMessage,
               side == Side::Accepting ? capnp::rpc::twoparty::Side::SERVER : capnp::rpc::twoparty::Side::CLIENT,
               readerOptions(limits)),
      _rpc(side == Side::Accepting ? capnp::makeRpcServer(_network, kj::heap<AcceptorServer>(_self))
                                   : capnp::makeRpcClient(_network)),
      _tasks(*this) {
  _rpc.setFlowLimit(limits.maximumUnexecutedBytes / sizeof(capnp::word));
  _tasks.add(_network.onDisconnect().then([this] {
    end(_stream.failure().empty() && !_stream.hasEnded() ? "what came breaks the protocol" : _stream.failure());
  }));
  if (side == Side::Connecting) {
    askToOpen();
  } else {
    _stream.restrictTo(kMessagesBeforeAcceptance, kBytesBeforeAcceptance);
    _openDeadline = _loop.after(limits.openTime, [this] { end("did not ask for the line in time"); });
  }
}

Line::~Line() {
  *_self = nullptr;
  _received.clear();
  _loop.cancel(_openDeadline);
}

void Line::askToOpen() {
  capnp::MallocMessageBuilder message(8);
  auto vat = message.initRoot<capnp::rpc::twoparty::VatId>();
  vat.setSide(capnp::rpc::twoparty::Side::SERVER);
  auto request = _rpc.bootstrap(vat).castAs<wire::Acceptor>().openRequest();
  request.setClient(kj::heap<EndpointServer>(_self));
  _tasks.add(request.send().then([this](auto&& response) {
    if (_hasEnded) return;
    if (!response.getAccepted()) return _owner.lineRefused();
    _peer = response.getEndpoint();
    _isOpen = true;
    _owner.lineOpened();
  }));
}

kj::Promise<void> Line::asked(OpenContext context) {
  if (_hasEnded || _asking || _peer != nullptr || !context.getParams().hasClient()) return disconnected();
  _loop.cancel(std::exchange(_openDeadline, 0));
  _peer = context.getParams().getClient();
  context.releaseParams();
  auto pair = kj::newPromiseAndFulfiller<void>();
  _asking = std::make_unique<Asking>(Asking{context, kj::mv(pair.fulfiller)});
  _owner.lineAsked();
  return kj::mv(pair.promise);
}

void Line::decide(bool isAccepted) {
  if (!_asking || _hasEnded) return;
  auto results = _asking->context.getResults();
  results.setAccepted(isAccepted);
  if (isAccepted) {
    results.setEndpoint(kj::heap<EndpointServer>(_self));
    _stream.liftRestriction();
  }
  _asking->fulfiller->fulfill();
  _asking = nullptr;
  _isOpen = isAccepted;
  if (isAccepted) _owner.lineOpened();
}

uint32_t Line::newIDs(size_t count) {
  if (_lastID > UINT32_MAX - count) _lastID = 0;
  const uint32_t first = _lastID + 1;
  _lastID += static_cast<uint32_t>(count);
  return first;
}

void Line::deliver(OutgoingBatch batch) {
  const size_t count = batch.calls.size();
  auto& sent = _underWay.emplace_back(UnderWay{++_lastBatch, newIDs(count), std::move(batch)});
  KJ_IF_MAYBE (peer, _peer) {
    auto request = peer->deliverRequest(wordsFor(sent.batch.wireBytes, count, sent.batch.descriptors));
    request.setTextBytes(static_cast<uint32_t>(sent.batch.textBytes));
    encodeCalls(sent, request.initInvocations(static_cast<unsigned>(count)));
    _tasks.add(request.send().then(
        [this, number = sent.number](capnp::Response<wire::Endpoint::DeliverResults>&& response) {
          delivered(number, response);
        },
        [this, number = sent.number](kj::Exception&& failure) { deliverFailed(number, failure); }));
  }
}

void Line::encodeCalls(UnderWay& sent, capnp::List<wire::Invocation>::Builder list) {
  for (uint32_t i = 0; i < list.size(); ++i) {
    OutgoingCall& call = sent.batch.calls[i];
    auto to = list[i];
    to.setOperation(call.invocation.operation);
    wirecoding::encode(call.invocation.arguments,
                       to.initArguments(static_cast<unsigned>(call.invocation.arguments.size())));
    if (call.reply) to.setReplyID(sent.firstID + i);
    if (call.invocation.descriptor.isValid()) {
      to.setDescriptor(kj::heap<OpenFileServer>(std::move(call.invocation.descriptor)));
    }
    call.invocation = {};
  }
}

OutgoingBatch Line::takeUnderWay(uint64_t number) {
  const auto found = std::find_if(_underWay.begin(), _underWay.end(),
                                  [number](const UnderWay& sent) { return sent.number == number; });
  if (found == _underWay.end()) return {};
  OutgoingBatch batch = std::move(found->batch);
  _underWay.erase(found);
  return batch;
}

void Line::delivered(uint64_t number, capnp::Response<wire::Endpoint::DeliverResults>& response) {
  if (_hasEnded) return;
  if (_underWay.empty() || _underWay.front().number != number) return end("answered batches out of order");
  const uint32_t firstID = _underWay.front().firstID;
  auto& calls = _underWay.front().batch.calls;
  guarded([&] {
    wirecoding::Decoder decoder(response.getTextBytes(), _limits.maximumValuesPerMessage);
    for (auto reply : response.getReplies()) {
      const uint32_t index = reply.getReplyID() - firstID;
      if (index >= calls.size() || !calls[index].reply) continue;
      calls[index].answer = decoder.decode(reply.getValues());
      calls[index].outcome = reply.getDropped() ? OutgoingCall::Outcome::Dropped : OutgoingCall::Outcome::Answered;
    }
  });
  if (_hasEnded) return;
  for (uint32_t i = 0; i < calls.size(); ++i) {
    const bool isLate = calls[i].reply && calls[i].outcome == OutgoingCall::Outcome::Open;
    if (isLate) _late.insert_or_assign(firstID + i, std::move(calls[i]));
  }
  _owner.lineDelivered(takeUnderWay(number));
}

// When the line has ended its end tells of the failure, in order. Otherwise the peer did not take this one batch.
void Line::deliverFailed(uint64_t number, const kj::Exception& failure) {
  if (_hasEnded || failure.getType() == kj::Exception::Type::DISCONNECTED) return;
  OutgoingBatch batch = takeUnderWay(number);
  for (auto& call : batch.calls) call.outcome = OutgoingCall::Outcome::Dropped;
  _owner.lineDelivered(std::move(batch));
}

kj::Promise<void> Line::received(DeliverContext context) {
  if (_hasEnded) return disconnected();
  if (_received.size() >= _limits.maximumIncomingBatches) {
    end("sent too many batches without waiting for an answer");
    return disconnected();
  }
  std::vector<IncomingCall> calls;
  guarded([&] { calls = decodeCalls(context.getParams()); });
  const size_t descriptors = descriptorsOf(calls);
  size_t waitingDescriptors = descriptors;
  for (const auto& [earlier, batch] : _received) waitingDescriptors += batch.descriptors;
  if (waitingDescriptors > kMostWaitingDescriptors) end("hands over too many files at once");
  if (_unanswered > _limits.maximumUnansweredCalls) end("wants too many answers at once");
  if (_hasEnded) return disconnected();
  context.releaseParams();
  checkUnread();
  if (_hasEnded) return disconnected();
  auto pair = kj::newPromiseAndFulfiller<void>();
  const uint64_t number = ++_lastReceived;
  _received.emplace(number, ReceivedBatch{context, kj::mv(pair.fulfiller), descriptors});
  _owner.lineReceived(number, std::move(calls));
  return kj::mv(pair.promise);
}

std::vector<IncomingCall> Line::decodeCalls(wire::Endpoint::DeliverParams::Reader params) {
  wirecoding::Decoder decoder(params.getTextBytes(), _limits.maximumValuesPerMessage);
  const auto list = params.getInvocations();
  if (list.size() > _limits.maximumValuesPerMessage) wirecoding::refuse("a message holds too many calls");
  std::vector<IncomingCall> calls;
  calls.reserve(list.size());
  for (auto invocation : list) {
    auto& call = calls.emplace_back();
    call.invocation.operation = invocation.getOperation();
    call.invocation.arguments = decoder.decode(invocation.getArguments());
    call.replyID = invocation.getReplyID();
    if (invocation.hasDescriptor()) call.invocation.descriptor = descriptorOf(invocation.getDescriptor());
    if (call.replyID != 0) ++_unanswered;
  }
  return calls;
}

void Line::encodeReplies(const Replies& replies, capnp::List<wire::Reply>::Builder list) {
  uint32_t index = 0;
  for (const Reply& reply : replies) {
    auto to = list[index++];
    to.setReplyID(reply.replyID);
    to.setDropped(reply.isDropped);
    wirecoding::encode(reply.values, to.initValues(static_cast<unsigned>(reply.values.size())));
  }
  _unanswered -= std::min<size_t>(_unanswered, replies.size());
}

void Line::finishBatch(uint64_t batch, Replies replies) {
  const auto found = _received.find(batch);
  if (found == _received.end() || _hasEnded) return;
  ReceivedBatch received = kj::mv(found->second);
  _received.erase(found);
  size_t count = 0;
  size_t wireBytes = 0;
  size_t textBytes = 0;
  for (; count < replies.size() && wireBytes <= _limits.maximumBatchBytes; ++count) {
    wireBytes += replies[count].wireBytes;
    textBytes += replies[count].textBytes;
  }
  // What would make the message too large follows on its own.
  for (size_t i = count; i < replies.size(); ++i) answer(std::move(replies[i]));
  if (_hasEnded) return;
  replies.resize(count);
  if (count > 0) {
    auto results = received.context.getResults(wordsFor(wireBytes, count, 0));
    results.setTextBytes(static_cast<uint32_t>(textBytes));
    encodeReplies(replies, results.initReplies(static_cast<unsigned>(count)));
  }
  received.fulfiller->fulfill();
  checkUnread();
}

void Line::answer(Reply reply) {
  if (_hasEnded || !_isOpen) return;
  _answerBytes += reply.wireBytes + sizeof(Reply);
  _answers.push_back(std::move(reply));
  if (_answerBytes > _limits.maximumUnreadBytes) return end("leaves its answers unread");
  sendAnswers();
}

// One answer call is under way at a time; what comes meanwhile crosses together. The last one, when the line is to
// close, may be empty: its return says that all before it has been read.
void Line::sendAnswers() {
  if (_isAnswering || _hasEnded || !_isOpen || (_answers.empty() && !_isLeaving)) return;
  Replies replies;
  size_t wireBytes = 0;
  size_t textBytes = 0;
  while (!_answers.empty() && wireBytes < _limits.maximumBatchBytes && replies.size() < _limits.maximumBatchCalls) {
    Reply reply = std::move(_answers.front());
    _answers.pop_front();
    _answerBytes -= reply.wireBytes + sizeof(Reply);
    wireBytes += reply.wireBytes;
    textBytes += reply.textBytes;
    replies.push_back(std::move(reply));
  }
  const bool isLast = replies.empty();
  _isAnswering = true;
  KJ_IF_MAYBE (peer, _peer) {
    auto request = peer->answerRequest(wordsFor(wireBytes, replies.size(), 0));
    request.setTextBytes(static_cast<uint32_t>(textBytes));
    encodeReplies(replies, request.initReplies(static_cast<unsigned>(replies.size())));
    _tasks.add(request.send().then([this, isLast](auto&&) {
      _isAnswering = false;
      if (_hasEnded) return;
      if (isLast) return _owner.lineDrained();
      sendAnswers();
    }));
  }
}

void Line::farewell() {
  _isLeaving = true;
  if (!_isOpen) return _owner.lineDrained();
  // Behind the returns that are on their way already.
  _tasks.add(kj::evalLater([this] { sendAnswers(); }));
}

// A reply may overtake the answer of its batch.
OutgoingCall* Line::findUnanswered(uint32_t replyID) {
  if (const auto late = _late.find(replyID); late != _late.end()) return &late->second;
  for (auto& sent : _underWay) {
    const uint32_t index = replyID - sent.firstID;
    if (index < sent.batch.calls.size()) return &sent.batch.calls[index];
  }
  return nullptr;
}

kj::Promise<void> Line::answered(AnswerContext context) {
  if (_hasEnded) return disconnected();
  std::vector<OutgoingCall> calls;
  guarded([&] {
    const auto params = context.getParams();
    wirecoding::Decoder decoder(params.getTextBytes(), _limits.maximumValuesPerMessage);
    for (auto reply : params.getReplies()) {
      OutgoingCall* call = findUnanswered(reply.getReplyID());
      if (call == nullptr || !call->reply) continue;
      Array values = decoder.decode(reply.getValues());
      auto& answer = calls.emplace_back(std::move(*call));
      answer.answer = std::move(values);
      answer.outcome = reply.getDropped() ? OutgoingCall::Outcome::Dropped : OutgoingCall::Outcome::Answered;
      _late.erase(reply.getReplyID());
    }
  });
  if (!calls.empty()) _owner.lineAnswered(std::move(calls));
  if (_hasEnded) return disconnected();
  return kj::READY_NOW;
}

std::vector<OutgoingCall> Line::takeUnanswered(size_t& memoryBytes) {
  std::vector<OutgoingCall> calls;
  for (auto& late : _late) calls.push_back(std::move(late.second));
  _late.clear();
  for (auto& sent : _underWay) {
    memoryBytes += sent.batch.memoryBytes;
    for (auto& call : sent.batch.calls) calls.push_back(std::move(call));
  }
  _underWay.clear();
  return calls;
}

std::vector<OutgoingCall> Line::takeHandlers() {
  std::vector<OutgoingCall> calls;
  for (auto& late : _late) calls.push_back(std::move(late.second));
  _late.clear();
  for (auto& sent : _underWay) {
    for (auto& call : sent.batch.calls) calls.push_back(std::move(call));
  }
  return calls;
}

void Line::checkUnread() {
  if (_network.getCurrentQueueSize() > _limits.maximumUnreadBytes) end("leaves what we send unread");
}

// Runs what reads a peer's message; what it holds may be anything.
void Line::guarded(kj::FunctionParam<void()> read) {
  KJ_IF_MAYBE (failure, kj::runCatchingExceptions([&] { read(); })) {
    end(failure->getDescription().cStr());
  }
}

void Line::taskFailed(kj::Exception&& exception) {
  // The end of the socket is told by the network, with its reason.
  if (exception.getType() == kj::Exception::Type::DISCONNECTED) return;
  end(exception.getDescription().cStr());
}

void Line::end(std::string reason) {
  if (std::exchange(_hasEnded, true)) return;
  _owner.lineEnded(reason);
}

}  // namespace telvane::ipc
