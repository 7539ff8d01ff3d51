#include "platform/ipc/SocketListener.h"

#include <kj/async.h>
#include <unistd.h>

#include <cerrno>
#include <set>
#include <utility>

#include "platform/Mutex.h"
#include "platform/ipc/ConnectionCore.h"
#include "platform/ipc/EpollPort.h"
#include "platform/ipc/SocketConnection.h"
#include "platform/ipc/UnixSocket.h"

namespace telvane::ipc {

// What the loop and the accepted connections hold of a listener, so that it can go at any time.
class SocketListener::State final : public std::enable_shared_from_this<State>, public LoopResident {
 public:
  State(SocketListener& listener, Parts parts, const std::string& serviceName, Descriptor socket, std::string path)
      : _parts(std::move(parts)),
        _queue(_parts.dispatch.newSerialQueue("listener " + serviceName)),
        _path(std::move(path)),
        _identity(_path.empty() ? std::string() : unixsocket::identityOf(_path)),
        _listener(&listener),
        _socket(std::move(socket)) {}

  ~State() noexcept override = default;

  bool isOwnProcess() const { return _parts.process->isOriginalProcess(); }
  void setDelegate(ListenerDelegate* delegate);
  void resume();
  void stop();
  // Returns when the delegate is in no call and will be in none.
  void forgetListener();

  void windDown() override { close(); }
  void endNow() override { close(); }

 private:
  void open();
  void close();
  void acceptAll();
  void pause(const Error& reason);
  void take(Descriptor socket);
  void asked(const std::shared_ptr<ConnectionCore>& core, unixsocket::Peer peer);
  void decide(const std::shared_ptr<ConnectionCore>& core, const std::shared_ptr<Connection>& connection);
  void letGo(const Connection* connection);

  // Constant after construction.
  const Parts _parts;
  const std::shared_ptr<SerialQueue> _queue;
  const std::string _path;
  const std::string _identity;

  Mutex _mutex;
  SocketListener* _listener GUARDED_BY(_mutex);
  ListenerDelegate* _delegate GUARDED_BY(_mutex) = nullptr;
  bool _isResumed GUARDED_BY(_mutex) = false;
  bool _isStopped GUARDED_BY(_mutex) = false;
  std::set<std::shared_ptr<Connection>> _held GUARDED_BY(_mutex);

  // Confined to the loop, once it has been resumed.
  Descriptor _socket;
  std::unique_ptr<EpollPort::Watch> _watch;
  kj::Maybe<kj::Promise<void>> _readable;
  uint64_t _pause = 0;
  bool _isShort = false;  // of descriptors
};

void SocketListener::State::setDelegate(ListenerDelegate* delegate) {
  MutexLock lock(_mutex);
  _delegate = delegate;
}

void SocketListener::State::resume() {
  {
    MutexLock lock(_mutex);
    if (_isStopped || std::exchange(_isResumed, true)) return;
  }
  _parts.loop->post([self = shared_from_this()] { self->open(); });
}

void SocketListener::State::stop() {
  {
    MutexLock lock(_mutex);
    if (std::exchange(_isStopped, true)) return;
  }
  // A later daemon may have made its own socket at the path.
  if (!_identity.empty() && unixsocket::identityOf(_path) == _identity) ::unlink(_path.c_str());
  _parts.loop->post([self = shared_from_this()] { self->close(); });
}

void SocketListener::State::forgetListener() {
  const auto forget = [this] {
    MutexLock lock(_mutex);
    _listener = nullptr;
  };
  if (_queue->isCurrent()) {
    forget();
  } else {
    _queue->sync(forget);
  }
}

void SocketListener::State::open() {
  if (!_socket.isValid()) return;
  KJ_IF_MAYBE (failure, kj::runCatchingExceptions([this] {
                 _watch = std::make_unique<EpollPort::Watch>(_parts.loop->port(), _socket.get());
               })) {
    _parts.log.error("localConnection: cannot listen: {}", failure->getDescription().cStr());
    return;
  }
  _parts.loop->add(shared_from_this());
  acceptAll();
}

void SocketListener::State::close() {
  _readable = nullptr;
  _watch = nullptr;
  _socket = Descriptor();
  _parts.loop->cancel(std::exchange(_pause, 0));
  _parts.loop->remove(shared_from_this());
}

void SocketListener::State::acceptAll() {
  while (_watch) {
    auto socket = unixsocket::acceptFrom(_socket.get());
    if (socket) {
      _isShort = false;
      take(std::move(*socket));
      continue;
    }
    const int64_t code = socket.error().code();
    if (code == ECONNABORTED || code == EINTR) continue;
    if (code != EAGAIN && code != EWOULDBLOCK) return pause(socket.error());
    // Posted, because a promise must not be replaced by its own continuation.
    _readable = _watch->whenReadable()
                    .then([this] { _parts.loop->post([self = shared_from_this()] { self->acceptAll(); }); })
                    .eagerlyEvaluate(nullptr);
    return;
  }
}

void SocketListener::State::pause(const Error& reason) {
  if (!std::exchange(_isShort, true)) {
    _parts.log.error("localConnection: accepting pauses, connections wait: {}", reason.description());
  }
  _pause = _parts.loop->after(_parts.limits.acceptPause, [self = shared_from_this()] { self->acceptAll(); });
}

void SocketListener::State::take(Descriptor socket) {
  auto peer = unixsocket::peerOf(socket.get());
  const std::string description = peer.description();
  auto core = ConnectionCore::newAccepting({.loop = _parts.loop,
                                            .queue = _parts.dispatch.newSerialQueue("connection of " + description),
                                            .log = _parts.log,
                                            .gate = _parts.gate,
                                            .limits = _parts.limits,
                                            .description = description});
  core->attach(std::move(socket), [self = shared_from_this(), weak = std::weak_ptr(core), peer = std::move(peer)] {
    if (const auto asking = weak.lock()) self->asked(asking, peer);
  });
}

void SocketListener::State::asked(const std::shared_ptr<ConnectionCore>& core, unixsocket::Peer peer) {
  auto connection = std::make_shared<SocketConnection>(core, _parts.process, std::move(peer), &_parts.entitlements);
  _queue->async(
      [self = shared_from_this(), core, connection = std::move(connection)] { self->decide(core, connection); });
}

void SocketListener::State::decide(const std::shared_ptr<ConnectionCore>& core,
                                   const std::shared_ptr<Connection>& connection) {
  SocketListener* listener = nullptr;
  ListenerDelegate* delegate = nullptr;
  {
    MutexLock lock(_mutex);
    if (!_isStopped) listener = _listener;
    delegate = _delegate;
    _held.insert(connection);
  }
  core->setOnInvalidated([self = shared_from_this(), held = connection.get()] { self->letGo(held); });
  const bool isAccepted = listener != nullptr && delegate != nullptr && delegate->listener(*listener, connection);
  core->decide(isAccepted);
  if (!isAccepted) connection->invalidate();
}

void SocketListener::State::letGo(const Connection* connection) {
  std::shared_ptr<Connection> last;
  MutexLock lock(_mutex);
  for (auto held = _held.begin(); held != _held.end(); ++held) {
    if (held->get() != connection) continue;
    last = *held;
    _held.erase(held);
    return;
  }
}

SocketListener::SocketListener(Parts parts, const std::string& serviceName, Descriptor socket, std::string path)
    : _state(std::make_shared<State>(*this, std::move(parts), serviceName, std::move(socket), std::move(path))) {}

SocketListener::~SocketListener() {
  if (!_state->isOwnProcess()) {
    new std::shared_ptr<State>(std::move(_state));  // leaked: its locks and its thread are the parent's
    return;
  }
  _state->stop();
  _state->forgetListener();
}

void SocketListener::setDelegate(ListenerDelegate* delegate) { _state->setDelegate(delegate); }

void SocketListener::resume() {
  if (_state->isOwnProcess()) _state->resume();
}

void SocketListener::stop() {
  if (_state->isOwnProcess()) _state->stop();
}

}  // namespace telvane::ipc
