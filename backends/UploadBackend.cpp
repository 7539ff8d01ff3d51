#include "backends/UploadBackend.h"

#include "backends/CompressedCopy.h"
#include "backends/LoggableAnswer.h"
#include "backends/WaitedPost.h"
#include "interfaces/StorebagKeys.h"
#include "platform/system/UTF8.h"
#include "util/QueryText.h"

namespace telvane {
namespace {

constexpr std::string_view kDescription = "Vantico AFRC log";
constexpr std::string_view kSuccess = "success";

std::string_view lastComponent(std::string_view path) { return path.substr(path.rfind('/') + 1); }

}  // namespace

std::shared_ptr<UploadBackend> UploadBackend::initWithName(const ProcessContext& context, const String& name,
                                                           const Value& profile,
                                                           const std::optional<String>& productFamily) {
  const Dictionary* section = profile.dictionary();
  const String* uploadURL = section != nullptr ? (*section)[kProfilePostURL].string() : nullptr;
  if (uploadURL == nullptr) {
    context.log().error("UploadBackend(initWithName): can't resolve upload post URL.");
    return nullptr;
  }
  return std::shared_ptr<UploadBackend>(
      new UploadBackend(context, name, *section, productFamily.value_or(String()), *uploadURL));
}

UploadBackend::UploadBackend(const ProcessContext& context, String name, Dictionary profile, String productFamily,
                             String uploadURL)
    : TelvaneBackend(context, std::move(name), std::move(profile), std::move(productFamily)),
      _uploadURL(std::move(uploadURL)) {
  if (const String* displayURL = _profile[kProfileDisplayURL].string()) _displayURL = *displayURL;
}

bool UploadBackend::uploadFileAtPath(const String& path, const ExtensionToken& extensionToken) {
  log().message("UploadBackend(uploadFileAtPath): Uploading file {}", path);
  if (_uploadURL.empty()) return false;
  WaitedPost post(_context.platform().dispatch);
  // The file may be on a file system of the client's own, which need not answer even to a look at it. So there is a
  // place before the first look, and one with the file's size, as it is from then on, behind it.
  std::optional<RunningUploads::Place> place =
      _context.runningUploads().begin(RunningUploads::Kind::File, post.semaphore(), 0);
  if (!place.has_value()) return refuseForLackOfRoom();
  const auto extension = _context.platform().sandboxExtensions.consume(path.str(), extensionToken);
  if (extension == nullptr || !extension->isRegularFile()) {
    log().error("UploadBackend(uploadFileAtPath): Only upload a regular file.");
    return false;
  }
  const Result<uint64_t> found = extension->size();
  const uint64_t size = found.has_value() ? *found : 0;
  place.reset();
  const auto placeForAll = _context.runningUploads().begin(RunningUploads::Kind::File, post.semaphore(), size);
  if (!placeForAll.has_value()) return refuseForLackOfRoom();
  std::optional<URLRequest> request = newRequest(path, *extension, size, *placeForAll);
  if (!request.has_value()) return false;
  const auto helper = _reportingSessionConnectivityDelegate.lock();
  if (helper == nullptr) return true;
  const WaitedPost::Answer answer = post.postAndWait(*helper, *std::move(request));
  if (answer.data.has_value()) {
    answered(*answer.data, *extension, path);
  } else {
    log().error("UploadBackend(uploadFileAtPath): post {}",
                answer.error.has_value() ? answer.error->description() : "(null)");
  }
  return true;
}

bool UploadBackend::refuseForLackOfRoom() const {
  log().error("UploadBackend(uploadFileAtPath): Too much is being uploaded already, or the daemon is about to end");
  return false;
}

std::optional<URLRequest> UploadBackend::newRequest(const String& path, const SandboxExtension& extension,
                                                    uint64_t size, const RunningUploads::Place& place) const {
  CompressedCopy copy =
      compressedCopyOf(extension, size, _context.platform().files, [&place] { return place.isCancelled(); });
  if (copy.outcome == CompressedCopy::Outcome::NothingToRead) {
    log().error("UploadBackend(uploadFileAtPath): Input file is empty");
  }
  if (copy.outcome != CompressedCopy::Outcome::Made) return std::nullopt;
  URLRequest request;
  request.url = requestURL(path);
  // What stands behind a fragment never reaches the server.
  if (!isWebURL(request.url) || request.url.find('#') != std::string::npos) {
    log().error("UploadBackend(uploadFileAtPath): Unable to create URL request");
    return std::nullopt;
  }
  request.method = "POST";
  request.headers = {{"Content-Type", "application/octet-stream"}, {"Content-Encoding", "gzip"}};
  request.bodyFile = std::move(copy.file);
  return request;
}

std::string UploadBackend::requestURL(const String& path) const {
  return fmt::format("{}?uuid={}&sequence={}&description={}%20(Uploaded%20by%20ZPH)&filename={}&raw=true",
                     _uploadURL.view(), _udid.view(), _sessionID, percentEncodedForQuery(kDescription),
                     percentEncodedForQuery(std::string(lastComponent(path.view())) + ".gz"));
}

void UploadBackend::answered(const Data& data, SandboxExtension& extension, const String& path) const {
  const std::string_view text = utf8::isValid(data.view()) ? data.view() : "(null)";
  log().message("UploadBackend(uploadFileAtPath): sending to |{}|, Json output: {}", _uploadURL, loggableAnswer(text));
  if (text.find(kSuccess) == std::string_view::npos) return;
  const Result<void> removed = extension.removeFile();
  if (removed.has_error()) {
    log().error("UploadBackend(uploadFileAtPath): The uploaded file {} stays: {}", path, removed.error().description());
  }
}

}  // namespace telvane
