#pragma once

#include <optional>

#include "foundation/Data.h"
#include "foundation/Error.h"
#include "platform/URLSession.h"

namespace telvane {

// Receives what became of a request: the body received (empty when none), the response (null when none came), and the
// error or nothing.
using RequestCompletion =
    UniqueFunction<void(const Data& data, const URLResponse* response, const std::optional<Error>& error)>;

// What a backend sees of a connectivity helper. Safe from any thread.
class ReportingSessionConnectivityInterface {
 public:
  virtual ~ReportingSessionConnectivityInterface() = default;
  // Posts the request; the completion is called at most once, on the helper's state queue. It is not called when the
  // helper is not active.
  virtual void postURLRequestWithCompletionHandler(URLRequest request, RequestCompletion completion) = 0;
};

}  // namespace telvane
