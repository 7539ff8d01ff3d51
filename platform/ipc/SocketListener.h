#pragma once

#include <memory>
#include <string>

#include "platform/Dispatch.h"
#include "platform/FlowGate.h"
#include "platform/Log.h"
#include "platform/ipc/Entitlements.h"
#include "platform/ipc/ForkMarker.h"
#include "platform/ipc/Limits.h"
#include "platform/ipc/LoopThread.h"
#include "platform/ipc/Service.h"

namespace telvane::ipc {

// Accepts connections on a listening Unix stream socket.
//
// A peer that has connected is put before the delegate once it asks for the line; until then, and after a refusal, it
// holds nothing but a descriptor, and not for long. While the process has no descriptor left, accepting pauses and
// peers wait in the socket's backlog; one error line tells of each such time.
class SocketListener final : public Listener {
 public:
  struct Parts {
    std::shared_ptr<LoopThread> loop;
    std::shared_ptr<const ForkMarker> process;
    Dispatch& dispatch;
    Log& log;
    const Entitlements& entitlements;
    FlowGate* gate;  // may be null
    Limits limits;
  };

  // path: of the socket that this process made, which stop() removes; empty when it was passed to us.
  SocketListener(Parts parts, const std::string& serviceName, Descriptor socket, std::string path);
  ~SocketListener() override;
  SocketListener(const SocketListener&) = delete;
  SocketListener& operator=(const SocketListener&) = delete;

  void setDelegate(ListenerDelegate* delegate) override;
  void resume() override;
  void stop() override;

 private:
  class State;

  std::shared_ptr<State> _state;
};

}  // namespace telvane::ipc
