#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "platform/url/CurlTransfer.h"
#include "platform/url/CurlURLSessionTask.h"

namespace telvane {

// What has happened to the tasks of a session and was not told to its delegate yet, in order. Collected on the loop's
// thread, handed to the delegate queue in one piece.
class CurlEvents final : public CurlTransfer::Receiver {
 public:
  struct Head {
    URLResponse response;
  };
  struct Body {
    std::string bytes;
  };
  struct Sent {
    int64_t total;
    int64_t expected;
  };
  struct Completed {
    std::optional<Error> error;
  };
  struct BecameInvalid {};
  struct Event {
    std::shared_ptr<CurlURLSessionTask> task;  // null when it concerns the session
    std::variant<Head, Body, Sent, Completed, BecameInvalid> what;
  };

  void didReceiveHead(CurlURLSessionTask& task, URLResponse response) override;
  // Puts pieces that follow each other together.
  void didReceiveBytes(CurlURLSessionTask& task, std::string_view bytes) override;
  void didSendBytes(CurlURLSessionTask& task, int64_t total) override;
  void didComplete(CurlURLSessionTask& task, std::optional<Error> error);
  void didBecomeInvalid();

  std::vector<Event> take() { return std::exchange(_events, {}); }

 private:
  template <class T>
  T* lastOf(CurlURLSessionTask& task);

  std::vector<Event> _events;
};

}  // namespace telvane
