#include "backends/UploadBackend.h"

#include "backends/CompressedCopy.h"
#include "interfaces/StorebagKeys.h"
#include "platform/system/UTF8.h"
#include "util/QueryText.h"

namespace telvane {
namespace {

constexpr std::string_view kDescription = "Vantico AFRC log";
constexpr std::string_view kSuccess = "success";

// What became of a post.
struct ServerAnswer {
  explicit ServerAnswer(std::shared_ptr<Semaphore> made) : semaphore(std::move(made)) {}

  const std::shared_ptr<Semaphore> semaphore;
  // Written before the signal, read after it.
  std::optional<Data> data;
  std::optional<Error> error;
};

// What the post's completion holds. It wakes the waiter when it goes, whether or not it was called: a helper that is no
// longer active lets completions go without a word, and the waiter has all the time in the world.
class AnswerGiver {
 public:
  explicit AnswerGiver(std::shared_ptr<ServerAnswer> answer) : _answer(std::move(answer)) {}
  AnswerGiver(AnswerGiver&&) noexcept = default;
  AnswerGiver& operator=(AnswerGiver&&) = delete;
  ~AnswerGiver() {
    if (_answer != nullptr) _answer->semaphore->signal();
  }
  void give(const Data& data, const URLResponse* response, const std::optional<Error>& error) {
    // A server may well answer nothing; without one there are no data either.
    if (!data.empty() || (response != nullptr && !error.has_value())) _answer->data = data;
    _answer->error = error;
  }

 private:
  std::shared_ptr<ServerAnswer> _answer;
};

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
  const auto extension = _context.platform().sandboxExtensions.consume(path.str(), extensionToken);
  if (extension == nullptr || !extension->isRegularFile()) {
    log().error("UploadBackend(uploadFileAtPath): Only upload a regular file.");
    return false;
  }
  std::optional<URLRequest> request = newRequest(path, *extension);
  if (!request.has_value()) return false;
  if (const auto helper = _reportingSessionConnectivityDelegate.lock()) {
    post(*helper, *std::move(request), *extension, path);
  }
  return true;
}

std::optional<URLRequest> UploadBackend::newRequest(const String& path, const SandboxExtension& extension) const {
  CompressedCopy copy = compressedCopyOf(extension, _context.platform().files);
  if (copy.outcome == CompressedCopy::Outcome::NothingToRead) {
    log().error("UploadBackend(uploadFileAtPath): Input file is empty");
  }
  if (copy.outcome != CompressedCopy::Outcome::Made) return std::nullopt;
  URLRequest request;
  request.url = requestURL(path);
  if (!isWebURL(request.url)) {
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

void UploadBackend::post(ReportingSessionConnectivityInterface& helper, URLRequest request, SandboxExtension& extension,
                         const String& path) const {
  const auto answer = std::make_shared<ServerAnswer>(_context.platform().dispatch.newSemaphore(0));
  helper.postURLRequestWithCompletionHandler(
      std::move(request),
      [giver = AnswerGiver(answer)](const Data& data, const URLResponse* response,
                                    const std::optional<Error>& error) mutable { giver.give(data, response, error); });
  answer->semaphore->wait();
  if (!answer->data.has_value()) {
    log().error("UploadBackend(uploadFileAtPath): post {}",
                answer->error.has_value() ? answer->error->description() : "(null)");
    return;
  }
  const std::string_view text = utf8::isValid(answer->data->view()) ? answer->data->view() : "(null)";
  log().message("UploadBackend(uploadFileAtPath): sending to |{}|, Json output: {}", _uploadURL, text);
  if (text.find(kSuccess) == std::string_view::npos) return;
  const Result<void> removed = extension.removeFile();
  if (removed.has_error()) {
    log().error("UploadBackend(uploadFileAtPath): The uploaded file {} stays: {}", path, removed.error().description());
  }
}

}  // namespace telvane
