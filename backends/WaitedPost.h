#pragma once

#include <memory>
#include <optional>

#include "connectivity/ReportingSessionConnectivityInterface.h"
#include "foundation/Data.h"
#include "foundation/Error.h"
#include "platform/Dispatch.h"
#include "platform/URLSession.h"

namespace telvane {

// A post whose poster waits for the server's answer, however long that takes. Made for one post, by the poster, whose
// thread is blocked; the answer comes on the connectivity helper's queue, which must be another one.
class WaitedPost {
 public:
  struct Answer {
    std::optional<Data> data;  // what the server said, which may be nothing at all; absent when it said nothing
    std::optional<Error> error;
  };

  explicit WaitedPost(Dispatch& dispatch);

  // What the poster waits on: whoever signals it ends the wait, and what the server says then counts for nothing.
  const std::shared_ptr<Semaphore>& semaphore() const noexcept;
  // Hands the request to the helper and waits. Without data and error when the wait was ended, or when the helper let
  // the completion go without a call, as one does that is not active. REQUIRES: not called before.
  Answer postAndWait(ReportingSessionConnectivityInterface& helper, URLRequest request);

 private:
  struct State;
  class Giver;
  const std::shared_ptr<State> _state;
};

}  // namespace telvane
