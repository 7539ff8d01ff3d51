#include "collector/EventStore.h"

#include "platform/Compression.h"
#include "platform/JSON.h"

namespace telvane {
namespace {

constexpr uint64_t kMaximumBodyBytes = 64u << 20;
constexpr Key kEvents{"events"};
constexpr Key kEvent{"event"};
constexpr Key kClientId{"clientId"};
constexpr Key kPostTime{"postTime"};
constexpr Key kHeaders{"headers"};
// Stands once in every event, and in no payload of its own accord.
constexpr std::string_view kEventMark = "\"_eventNumber\":";
constexpr char kDomain[] = "TelvaneCollector";

Error badRequest(const std::string& text) { return Error::withDescription(kDomain, 400, text); }

HTTPServer::Response textResponse(int status, std::string text) {
  return {status, {{"Content-Type", "text/plain"}}, Data(std::move(text) + "\n")};
}

Result<Data> decodedBody(const HTTPServer::Request& request) {
  const std::string* encoding = request.header("Content-Encoding");
  if (encoding == nullptr) return request.body;
  if (*encoding != "gzip") return badRequest("Content-Encoding " + *encoding + " is not served; send gzip or none");
  return compression::inflate(request.body.view(), kMaximumBodyBytes);
}

uint64_t countMarks(std::string_view json) {
  uint64_t count = 0;
  for (size_t at = json.find(kEventMark); at != std::string_view::npos;
       at = json.find(kEventMark, at + kEventMark.size())) {
    ++count;
  }
  return count;
}

Dictionary headersOf(const HTTPServer::Request& request) {
  Dictionary headers;
  for (const auto& header : request.headers) headers.set(String(header.name), Value(header.value));
  return headers;
}

}  // namespace

HTTPServer::Response EventStore::take(const HTTPServer::Request& request) {
  const Result<Data> json = decodedBody(request);
  if (json.has_error()) return textResponse(400, json.error().description());
  const Result<uint64_t> stored = store(request, json->view());
  if (stored.has_error()) return textResponse(stored.error().code() == 400 ? 400 : 500, stored.error().description());
  _events += *stored;
  _bytes += request.body.size();
  ++_posts;
  return {200, {{"Content-Type", "application/json"}}, Data::copyOf("{}")};
}

Result<void> EventStore::add(const Dictionary& line) {
  if (_file == nullptr) return {};
  std::string text;
  if (Result<void> written = json::append(line, json::Style::Compact, text); written.has_error()) return written;
  return _file->append(text + '\n');
}

Result<uint64_t> EventStore::store(const HTTPServer::Request& request, std::string_view json) {
  if (_file == nullptr) return countMarks(json);
  const Result<Value> body = json::parse(json, {.maximumBytes = kMaximumBodyBytes});
  if (body.has_error()) return badRequest(body.error().description());
  const Dictionary* dictionary = body->dictionary();
  const Array* events = dictionary != nullptr ? (*dictionary)[kEvents].array() : nullptr;
  if (events == nullptr) return badRequest("the body is no object with an array \"events\"");
  const Dictionary headers = headersOf(request);
  std::string lines;
  for (const Value& event : *events) {
    Dictionary line;
    line.set(kEvent, event);
    line.set(kClientId, (*dictionary)[kClientId]);
    line.set(kPostTime, (*dictionary)[kPostTime]);
    line.set(kHeaders, headers);
    const Result<void> written = json::append(line, json::Style::Compact, lines);
    if (written.has_error()) return badRequest(written.error().description());
    lines += '\n';
  }
  const Result<void> appended = _file->append(lines);
  if (appended.has_error()) return appended.error();
  return events->size();
}

}  // namespace telvane
