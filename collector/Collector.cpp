#include "collector/Collector.h"

#include <fmt/format.h>

#include "platform/JSON.h"

namespace telvane {
namespace {

constexpr std::string_view kStorebagsPath = "/storebags/";
constexpr std::string_view kEventsPath = "/events";
constexpr std::string_view kUploadPath = "/upload";
constexpr std::string_view kLogDataPath = "/logdata";
constexpr std::string_view kStatisticsPath = "/statistics";

HTTPServer::Response textResponse(int status, std::string_view text) {
  return {status, {{"Content-Type", "text/plain"}}, Data::copyOf(text)};
}

Error cannotServe(const CollectorOptions& options, const Error& reason) {
  return Error::withDescription(
      kPlatformErrorDomain, reason.code(),
      fmt::format("cannot serve on {}:{} with the certificate {} and the key {}: {}", options.host, options.port,
                  options.certificateFile, options.privateKeyFile, reason.description()));
}

// To a device that has log data to post, at whatever path its bag says, any text is the location where they lie.
// Whoever reads an answer asks with GET.
HTTPServer::Response refusal(const HTTPServer::Request& request, int status, std::string_view text) {
  return request.method == "GET" ? textResponse(status, text) : HTTPServer::Response{.status = status};
}

std::string_view pathOf(std::string_view target) { return target.substr(0, target.find('?')); }

}  // namespace

Result<std::unique_ptr<Collector>> Collector::start(const CollectorOptions& options, FileSystem& files,
                                                    UploadStore::Listener listener) {
  std::unique_ptr<AppendFile> eventFile;
  if (!options.eventFile.empty()) {
    Result<std::unique_ptr<AppendFile>> opened = AppendFile::open(options.eventFile);
    if (opened.has_error()) return opened.error();
    eventFile = std::move(*opened);
  }
  std::unique_ptr<Collector> collector(new Collector(options, files, std::move(eventFile), listener));
  if (const Result<void> receiving = collector->startDashboard(options, std::move(listener)); receiving.has_error()) {
    return receiving.error();
  }
  HTTPServer::Options server;
  server.host = options.host;
  server.port = options.port;
  server.certificateFile = options.certificateFile;
  server.privateKeyFile = options.privateKeyFile;
  Result<std::unique_ptr<HTTPServer>> started = HTTPServer::start(
      std::move(server),
      [collector = collector.get()](HTTPServer::Request request,
                                    const std::shared_ptr<HTTPServer::Responder>& responder) {
        responder->send(collector->answer(request));
      },
      [collector = collector.get()](const HTTPServer::Request& head) { return collector->sinkFor(head); });
  if (started.has_error()) return cannotServe(options, started.error());
  collector->_server = std::move(*started);
  return collector;
}

Collector::Collector(const CollectorOptions& options, FileSystem& files, std::unique_ptr<AppendFile> eventFile,
                     UploadStore::Listener listener)
    : _storebags(files, options.storebagFolder, options.maxAge),
      _events(std::move(eventFile)),
      _uploads(options.uploadFolder, std::move(listener)) {}

Collector::~Collector() = default;

Result<void> Collector::startDashboard(const CollectorOptions& options, DashboardReceiver::Listener listener) {
  if (!options.dashboard.has_value()) return {};
  auto dashboard = DashboardReceiver::start({.address = *options.dashboard,
                                             .lossPercent = options.dashboardLossPercent,
                                             .lossSeed = options.dashboardLossSeed,
                                             .show = std::move(listener)},
                                            _events);
  if (dashboard.has_error()) return dashboard.error();
  _dashboard = std::move(*dashboard);
  return {};
}

std::shared_ptr<HTTPServer::BodySink> Collector::sinkFor(const HTTPServer::Request& head) const {
  const std::string_view path = pathOf(head.target);
  const bool isUpload = head.method == "POST" && (path == kUploadPath || path == kLogDataPath);
  return isUpload ? _uploads.newSink() : nullptr;
}

HTTPServer::Response Collector::answer(const HTTPServer::Request& request) {
  const std::string_view path = pathOf(request.target);
  const bool isGet = request.method == "GET";
  const bool isPost = request.method == "POST";
  if (path.starts_with(kStorebagsPath) && isGet) return _storebags.answer(path.substr(kStorebagsPath.size()), request);
  if (path == kEventsPath && isPost) return _events.take(request);
  if (path == kUploadPath && isPost) return _uploads.take(UploadStore::Kind::File, request);
  if (path == kLogDataPath && isPost) return _uploads.take(UploadStore::Kind::LogData, request);
  if (path == kStatisticsPath && isGet) return statistics();
  const bool isServed = path.starts_with(kStorebagsPath) || path == kEventsPath || path == kUploadPath ||
                        path == kLogDataPath || path == kStatisticsPath;
  if (isServed) return refusal(request, 405, "this method is not served here\n");
  return refusal(request, 404, "nothing is served here\n");
}

HTTPServer::Response Collector::statistics() const {
  Dictionary counts;
  counts.set("events", Value(_events.events()));
  counts.set("posts", Value(_events.posts()));
  counts.set("bytes", Value(_events.bytes()));
  counts.set("uploads", Value(_uploads.files()));
  counts.set("logData", Value(_uploads.logData()));
  counts.set("uploadBytes", Value(_uploads.bytes()));
  if (_dashboard != nullptr) counts.set("dashboard", _dashboard->statistics());
  return {200, {{"Content-Type", "application/json"}}, Data(json::serialize(counts).value())};
}

}  // namespace telvane
