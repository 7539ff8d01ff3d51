#include "tests/support/NetworkAnswer.h"

#include <fmt/format.h>

#include <utility>

namespace telvane::testing {

NetworkAnswer NetworkAnswer::status(int statusCode, std::string_view body) {
  NetworkAnswer answer;
  answer.response = URLResponse{statusCode, {}, ""};
  if (!body.empty()) answer.pieces.push_back(Data::copyOf(body));
  return answer;
}

NetworkAnswer NetworkAnswer::failure(URLErrorCode code) {
  NetworkAnswer answer;
  answer.error = networkError(code);
  return answer;
}

NetworkAnswer NetworkAnswer::withHeader(std::string name, std::string value) && {
  if (!response) response = URLResponse{200, {}, ""};
  response->headers.push_back({std::move(name), std::move(value)});
  return std::move(*this);
}

NetworkAnswer NetworkAnswer::withPieces(std::vector<std::string> texts) && {
  pieces.clear();
  for (const std::string& text : texts) pieces.push_back(Data::copyOf(text));
  return std::move(*this);
}

NetworkAnswer NetworkAnswer::after(std::chrono::nanoseconds time) && {
  delay = time;
  return std::move(*this);
}

NetworkAnswer NetworkAnswer::withPieceDelay(std::chrono::nanoseconds time) && {
  pieceDelay = time;
  return std::move(*this);
}

NetworkAnswer NetworkAnswer::thenFailing(URLErrorCode code) && {
  error = networkError(code);
  return std::move(*this);
}

Error networkError(URLErrorCode code) {
  return Error::withDescription(kPlatformErrorDomain, static_cast<int64_t>(code),
                                fmt::format("scripted network error {}", static_cast<int64_t>(code)));
}

}  // namespace telvane::testing
