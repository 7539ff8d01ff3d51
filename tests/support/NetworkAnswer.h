#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "foundation/Data.h"
#include "foundation/Error.h"
#include "platform/URLSession.h"

namespace telvane::testing {

// What the scripted network does with one request. Times pass in the order of the fields.
struct NetworkAnswer {
  // From the request's leaving to the response's head, or to the error when there is no head.
  std::chrono::nanoseconds delay{0};
  // The head; without one nothing but the error comes, and without an error nothing at all, ever.
  std::optional<URLResponse> response;
  // The body as it comes, each piece after another pieceDelay.
  std::vector<Data> pieces;
  std::chrono::nanoseconds pieceDelay{0};
  // How the task completes after all that.
  std::optional<Error> error;

  static NetworkAnswer status(int statusCode, std::string_view body = "");
  static NetworkAnswer ok(std::string_view body = "") { return status(200, body); }
  static NetworkAnswer failure(URLErrorCode code);
  static NetworkAnswer silence() { return {}; }

  // The same answer with something changed, for scripts in one line.
  NetworkAnswer withHeader(std::string name, std::string value) &&;
  NetworkAnswer withPieces(std::vector<std::string> texts) &&;
  NetworkAnswer after(std::chrono::nanoseconds time) &&;
  NetworkAnswer withPieceDelay(std::chrono::nanoseconds time) &&;
  // What came so far came, then the connection broke.
  NetworkAnswer thenFailing(URLErrorCode code) &&;
};

// An error as the URL session reports it.
Error networkError(URLErrorCode code);

}  // namespace telvane::testing
