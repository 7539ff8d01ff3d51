#include "backends/UploadBackend.h"

#include <algorithm>

#include "backends/CompressedCopy.h"
#include "interfaces/StorebagKeys.h"
#include "platform/Mutex.h"
#include "platform/system/UTF8.h"
#include "util/QueryText.h"

namespace telvane {
namespace {

constexpr std::string_view kDescription = "Vantico AFRC log";
constexpr std::string_view kSuccess = "success";

// Of a server's answer, as much as a log line should hold.
constexpr size_t kMostLoggedBytes = 4096;

// What a server says may be anything: controls would act on the terminal that shows the log, which itself sees to line
// feeds.
std::string loggable(std::string_view text) {
  size_t size = std::min(text.size(), kMostLoggedBytes);
  while (size < text.size() && size > 0 && (static_cast<uint8_t>(text[size]) & 0xC0u) == 0x80u) --size;
  std::string line(text.substr(0, size));
  for (char& c : line) {
    if ((static_cast<uint8_t>(c) < ' ' && c != '\n') || c == '\x7f') c = ' ';
  }
  if (size < text.size()) line += fmt::format("... ({} bytes)", text.size());
  return line;
}

std::string_view lastComponent(std::string_view path) { return path.substr(path.rfind('/') + 1); }

}  // namespace

// What became of a post.
struct UploadBackend::ServerAnswer {
  explicit ServerAnswer(std::shared_ptr<Semaphore> made) : semaphore(std::move(made)) {}

  const std::shared_ptr<Semaphore> semaphore;
  Mutex mutex;
  std::optional<Data> data GUARDED_BY(mutex);
  std::optional<Error> error GUARDED_BY(mutex);
};

namespace {

// What the post's completion holds. It wakes the waiter when it goes, whether or not it was called: a helper that is no
// longer active lets completions go without a word, and the waiter has all the time in the world.
template <class Answer>
class AnswerGiver {
 public:
  explicit AnswerGiver(std::shared_ptr<Answer> answer) : _answer(std::move(answer)) {}
  AnswerGiver(AnswerGiver&&) noexcept = default;
  AnswerGiver& operator=(AnswerGiver&&) = delete;
  ~AnswerGiver() {
    if (_answer != nullptr) _answer->semaphore->signal();
  }
  void give(const Data& data, const URLResponse* response, const std::optional<Error>& error) {
    MutexLock lock(_answer->mutex);
    // A server may well answer nothing; without one there are no data either.
    if (!data.empty() || (response != nullptr && !error.has_value())) _answer->data = data;
    _answer->error = error;
  }

 private:
  std::shared_ptr<Answer> _answer;
};

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
  const auto answer = std::make_shared<ServerAnswer>(_context.platform().dispatch.newSemaphore(0));
  // The file may be on a file system of the client's own, which need not answer even to a look at it. So there is a
  // place before the first look, and one with the file's size, as it is from then on, behind it.
  std::optional<RunningUploads::Place> place = _context.runningUploads().begin(answer->semaphore, 0);
  if (!place.has_value()) return refuseForLackOfRoom();
  const auto extension = _context.platform().sandboxExtensions.consume(path.str(), extensionToken);
  if (extension == nullptr || !extension->isRegularFile()) {
    log().error("UploadBackend(uploadFileAtPath): Only upload a regular file.");
    return false;
  }
  const Result<uint64_t> found = extension->size();
  const uint64_t size = found.has_value() ? *found : 0;
  place.reset();
  const auto placeForAll = _context.runningUploads().begin(answer->semaphore, size);
  if (!placeForAll.has_value()) return refuseForLackOfRoom();
  std::optional<URLRequest> request = newRequest(path, *extension, size, *placeForAll);
  if (!request.has_value()) return false;
  const auto helper = _reportingSessionConnectivityDelegate.lock();
  if (helper == nullptr) return true;
  postAndWait(*helper, *std::move(request), answer);
  // Taken out: an answer that comes after the wait was given up must not wait for what is done with it here.
  std::optional<Data> data;
  std::optional<Error> error;
  {
    MutexLock lock(answer->mutex);
    data = std::move(answer->data);
    error = std::move(answer->error);
  }
  if (data.has_value()) {
    answered(*data, *extension, path);
  } else {
    log().error("UploadBackend(uploadFileAtPath): post {}", error.has_value() ? error->description() : "(null)");
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

void UploadBackend::postAndWait(ReportingSessionConnectivityInterface& helper, URLRequest request,
                                const std::shared_ptr<ServerAnswer>& answer) const {
  helper.postURLRequestWithCompletionHandler(
      std::move(request), [giver = AnswerGiver<ServerAnswer>(answer)](const Data& data, const URLResponse* response,
                                                                      const std::optional<Error>& error) mutable {
        giver.give(data, response, error);
      });
  answer->semaphore->wait();
}

void UploadBackend::answered(const Data& data, SandboxExtension& extension, const String& path) const {
  const std::string_view text = utf8::isValid(data.view()) ? data.view() : "(null)";
  log().message("UploadBackend(uploadFileAtPath): sending to |{}|, Json output: {}", _uploadURL, loggable(text));
  if (text.find(kSuccess) == std::string_view::npos) return;
  const Result<void> removed = extension.removeFile();
  if (removed.has_error()) {
    log().error("UploadBackend(uploadFileAtPath): The uploaded file {} stays: {}", path, removed.error().description());
  }
}

}  // namespace telvane
