// The log data that a dashboard backend uploads.
#include "backends/DashboardBackend.h"
#include "backends/LoggableAnswer.h"
#include "backends/WaitedPost.h"
#include "interfaces/EventKeys.h"
#include "platform/Clock.h"
#include "platform/KeyedArchive.h"
#include "platform/system/UTF8.h"

namespace telvane {
namespace {

constexpr uint16_t kLogDataMethod = 0;
constexpr uint16_t kLogDataUploaded = 2;
constexpr uint32_t kOrdinary = 0;

// Why there is no location in the answer; nothing when there is one. A server that says more than a location takes is
// showing a page to somebody, and no part of that leads to the data.
std::optional<std::string> failureIn(const WaitedPost::Answer& answer) {
  if (answer.error.has_value()) return answer.error->description();
  if (!answer.data.has_value() || answer.data->empty()) return "(null)";
  if (answer.data->size() <= DashboardBackend::kLongestLocation) return std::nullopt;
  return fmt::format("an answer of {} bytes is no location", answer.data->size());
}

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
  WaitedPost post(_context.platform().dispatch);
  const auto place =
      _context.runningUploads().begin(RunningUploads::Kind::LogData, post.semaphore(), request.body.size());
  if (!place.has_value()) {
    log().error("DashboardBackend(uploadLogData): Too much is being uploaded already, or the daemon is about to end");
    return false;
  }
  const WaitedPost::Answer answer = post.postAndWait(*helper, std::move(request));
  if (const std::optional<std::string> failure = failureIn(answer); failure.has_value()) {
    log().error("DashboardBackend(uploadLogData): Error uploading log data array ({})", *failure);
    return false;
  }
  logDataUploaded(*answer.data);
  return true;
}

void DashboardBackend::logDataUploaded(const Data& answer) {
  const std::string location = utf8::repaired(answer.view());
  log().message("DashboardBackend(uploadLogData): Log data uploaded to {}", loggableAnswer(location));
  TelvaneBackend::sendMessage(Dictionary{{kEventLogDataUploadLocation, location}}, _context.platform().clock.now(),
                              kLogDataMethod, kLogDataUploaded, kOrdinary);
}

}  // namespace telvane
