// The log data that a dashboard backend uploads.
#include "backends/DashboardBackend.h"
#include "interfaces/EventKeys.h"
#include "platform/Clock.h"
#include "platform/KeyedArchive.h"
#include "platform/system/UTF8.h"

namespace telvane {
namespace {

constexpr uint16_t kLogDataMethod = 0;
constexpr uint16_t kLogDataUploaded = 2;
constexpr uint32_t kOrdinary = 0;

}  // namespace

bool DashboardBackend::uploadLogData(const Array& logData) {
  if (!_postURL.has_value()) {
    log().error("DashboardBackend(uploadLogData): Post URL for log data array is nil");
    return false;
  }
  Result<Data> archive = keyedarchive::archive(logData);
  if (archive.has_error()) {
    log().error("DashboardBackend(uploadLogData): Failed to serialize log data array for upload");
    return false;
  }
  URLRequest request;
  request.url = _postURL->str();
  request.method = "POST";
  request.setHeader("Content-Type", "application/octet-stream");
  request.body = *std::move(archive);
  const auto helper = _reportingSessionConnectivityDelegate.lock();
  if (helper == nullptr) return true;
  const PostAnswer answer = postAndWait(*helper, std::move(request));
  if (answer.error.has_value() || answer.data.empty()) {
    log().error("DashboardBackend(uploadLogData): Error uploading log data array ({})",
                answer.error.has_value() ? answer.error->description() : "(null)");
    return false;
  }
  logDataUploaded(answer.data);
  return true;
}

DashboardBackend::PostAnswer DashboardBackend::postAndWait(ReportingSessionConnectivityInterface& helper,
                                                           URLRequest request) {
  const auto answer = std::make_shared<PostAnswer>();
  const std::shared_ptr<Semaphore> answered = _context.platform().dispatch.newSemaphore(0);
  // Signals when it goes: with the answer, or with a completion that is dropped because the helper is through.
  std::shared_ptr<void> signal(nullptr, [answered](void*) { answered->signal(); });
  helper.postURLRequestWithCompletionHandler(
      std::move(request), [answer, signal = std::move(signal)](const Data& data, const URLResponse*,
                                                               const std::optional<Error>& error) mutable {
        *answer = {data, error};
        signal.reset();
      });
  answered->wait();
  return std::move(*answer);
}

void DashboardBackend::logDataUploaded(const Data& answer) {
  const std::string location = utf8::repaired(answer.view());
  log().message("DashboardBackend(uploadLogData): Log data uploaded to {}", location);
  TelvaneBackend::sendMessage(Dictionary{{kEventLogDataUploadLocation, location}}, _context.platform().clock.now(),
                              kLogDataMethod, kLogDataUploaded, kOrdinary);
}

}  // namespace telvane
