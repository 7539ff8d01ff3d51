#include "tests/support/RecordingConnectivity.h"

#include <algorithm>

#include "interfaces/EventKeys.h"
#include "platform/Compression.h"
#include "platform/JSON.h"
#include "tests/support/BodyBytes.h"

namespace telvane::testing {
namespace {

constexpr uint64_t kLargestBody = 64u << 20;

}  // namespace

void RecordingConnectivity::postURLRequestWithCompletionHandler(URLRequest request, RequestCompletion completion) {
  MutexLock lock(_mutex);
  _posts.push_back({std::move(request), std::move(completion)});
}

size_t RecordingConnectivity::count() const {
  MutexLock lock(_mutex);
  return _posts.size();
}

URLRequest RecordingConnectivity::request(size_t index) const {
  MutexLock lock(_mutex);
  return index < _posts.size() ? _posts[index].request : URLRequest();
}

URLRequest RecordingConnectivity::lastRequest() const { return request(count() - 1); }

std::string RecordingConnectivity::bodyText(const URLRequest& request) {
  const Data body = bodyBytes(request);
  if (header(request, "Content-Encoding") != "gzip") return std::string(body.view());
  const Result<Data> plain = compression::inflate(body.view(), kLargestBody);
  return plain.has_value() ? std::string(plain->view()) : std::string();
}

Value RecordingConnectivity::bodyValue(const URLRequest& request) {
  const Result<Value> value = json::parse(bodyText(request), {.maximumBytes = kLargestBody});
  return value.has_value() ? *value : Value();
}

Array RecordingConnectivity::events(size_t index) const {
  const Value body = bodyValue(request(index));
  const Array* events = body.isDictionary() ? (*body.dictionary())[kBodyEvents].array() : nullptr;
  return events != nullptr ? *events : Array();
}

std::optional<std::string> RecordingConnectivity::header(const URLRequest& request, std::string_view name) {
  const auto found = std::find_if(request.headers.begin(), request.headers.end(),
                                  [name](const URLRequest::Header& header) { return header.name == name; });
  return found != request.headers.end() ? std::optional(found->value) : std::nullopt;
}

std::vector<std::string> RecordingConnectivity::headerNames(const URLRequest& request) {
  std::vector<std::string> names;
  for (const URLRequest::Header& header : request.headers) names.push_back(header.name);
  return names;
}

void RecordingConnectivity::answer(size_t index, int statusCode) {
  URLResponse response;
  response.statusCode = statusCode;
  if (auto completion = takeCompletion(index)) completion({}, &response, std::nullopt);
}

void RecordingConnectivity::fail(size_t index, Error error) {
  if (auto completion = takeCompletion(index)) completion({}, nullptr, std::move(error));
}

RequestCompletion RecordingConnectivity::takeCompletion(size_t index) {
  MutexLock lock(_mutex);
  if (index >= _posts.size()) return nullptr;
  return std::move(_posts[index].completion);
}

}  // namespace telvane::testing
