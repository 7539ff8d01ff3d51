#include "collector/UploadStore.h"

#include <fmt/format.h>

#include "collector/UploadName.h"
#include "platform/JSON.h"
#include "platform/system/ReceivedFile.h"

namespace telvane {
namespace {

constexpr int kInternalError = 500;
constexpr int kForbidden = 403;
constexpr char kLogDataName[] = "logdata.plist";
constexpr std::string_view kLocation = "/uploads/";

HTTPServer::Response textResponse(int status, std::string text) {
  return {status, {{"Content-Type", "text/plain"}}, Data(std::move(text))};
}

// A device takes whatever text answers log data for their location, whatever the status: only silence refuses them.
HTTPServer::Response refusal(UploadStore::Kind kind, int status, std::string text) {
  return kind == UploadStore::Kind::LogData ? HTTPServer::Response{.status = status}
                                            : textResponse(status, std::move(text));
}

// What a device says of itself may be anything.
std::string onlyPrintable(std::string text) {
  for (char& c : text) c = c > ' ' && c <= '~' ? c : '_';
  return text;
}

}  // namespace

// Writes the pieces down. The first failure refuses the request, so nothing of it is kept.
class UploadStore::Sink final : public HTTPServer::BodySink {
 public:
  explicit Sink(Result<std::unique_ptr<ReceivedFile>> file) : _file(std::move(file)) {}
  int take(std::string_view piece) override {
    return _file.has_value() && (*_file)->append(piece).has_value() ? 0 : kInternalError;
  }
  const Result<std::unique_ptr<ReceivedFile>>& file() const noexcept { return _file; }

 private:
  Result<std::unique_ptr<ReceivedFile>> _file;
};

// Drops what comes. To refuse it at once would be cheaper, but a device that is still sending when its connection ends
// may never read the answer.
class UploadStore::DroppingSink final : public HTTPServer::BodySink {
 public:
  int take(std::string_view) override { return 0; }
};

std::shared_ptr<HTTPServer::BodySink> UploadStore::newSink() const {
  if (_folder.empty()) return std::make_shared<DroppingSink>();
  return std::make_shared<Sink>(ReceivedFile::begin(_folder));
}

HTTPServer::Response UploadStore::take(Kind kind, const HTTPServer::Request& request) {
  if (_folder.empty()) return refusal(kind, kForbidden, "uploads are not taken; start with --uploads FOLDER\n");
  const auto sink = std::dynamic_pointer_cast<Sink>(request.sink);
  if (sink == nullptr) return refusal(kind, 400, "the upload has no body\n");
  if (sink->file().has_error()) return cannotKeep(kind, sink->file().error());
  ReceivedFile& file = **sink->file();
  const Result<std::string> name = file.keepAs(kind == Kind::File ? uploadName(request.target) : kLogDataName);
  if (name.has_error()) return cannotKeep(kind, name.error());
  return kept(kind, request, *name, file.size());
}

// Devices look for one word in the answer, whatever its status: a name or folder of the text must not bring it in.
HTTPServer::Response UploadStore::cannotKeep(Kind kind, const Error& error) {
  if (_listener) _listener("an upload was lost: " + error.description());
  return refusal(kind, kInternalError, "the upload cannot be kept\n");
}

HTTPServer::Response UploadStore::kept(Kind kind, const HTTPServer::Request& request, const std::string& name,
                                       uint64_t size) {
  ++(kind == Kind::File ? _files : _logData);
  _bytes += size;
  if (kind == Kind::LogData) {
    if (_listener) _listener(fmt::format("logdata {} {} bytes", name, size));
    return textResponse(200, std::string(kLocation) + name);
  }
  if (_listener) {
    _listener(fmt::format("upload {} {} bytes from {}", name, size, onlyPrintable(queryValue(request.target, "uuid"))));
  }
  Dictionary answer;
  answer.set("result", "success");
  answer.set("file", name);
  answer.set("bytes", Value(size));
  return {200, {{"Content-Type", "application/json"}}, Data(json::serialize(answer).value())};
}

}  // namespace telvane
