#pragma once

#include <optional>
#include <string>
#include <vector>

#include "connectivity/ReportingSessionConnectivityInterface.h"
#include "foundation/Value.h"
#include "platform/Mutex.h"

namespace telvane::testing {

// A connectivity helper that keeps what it is to post; the test answers when it likes. Safe from any thread.
class RecordingConnectivity final : public ReportingSessionConnectivityInterface {
 public:
  void postURLRequestWithCompletionHandler(URLRequest request, RequestCompletion completion) override;

  size_t count() const;
  // The request posted as that many'th; an empty one when there were not so many.
  URLRequest request(size_t index) const;
  URLRequest lastRequest() const;
  // The body as it was before compression; empty when it cannot be inflated.
  static std::string bodyText(const URLRequest& request);
  // The same as a value; absent when it is no JSON.
  static Value bodyValue(const URLRequest& request);
  // The events of the request posted as that many'th.
  Array events(size_t index) const;
  // The header's value, byte for byte; nothing when there is none.
  static std::optional<std::string> header(const URLRequest& request, std::string_view name);
  static std::vector<std::string> headerNames(const URLRequest& request);

  // Answer the request posted as that many'th, once.
  void answer(size_t index, int statusCode);
  void fail(size_t index, Error error);

 private:
  struct Post {
    URLRequest request;
    RequestCompletion completion;
  };
  RequestCompletion takeCompletion(size_t index);

  mutable Mutex _mutex;
  std::vector<Post> _posts GUARDED_BY(_mutex);
};

}  // namespace telvane::testing
