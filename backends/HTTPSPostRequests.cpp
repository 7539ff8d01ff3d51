// The requests of an HTTPS backend, and what becomes of them.
#include <algorithm>

#include "backends/HTTPSPostBackend.h"
#include "backends/SecuredURL.h"
#include "interfaces/ClientTypes.h"
#include "interfaces/MessageFlags.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/TelvaneErrors.h"
#include "platform/Crypto.h"
#include "util/DataHelpers.h"

namespace telvane {
namespace {

constexpr size_t kHeaderCount = 13;
constexpr size_t kLongestSessionID = 40;  // characters
constexpr int kFirstServerError = 500;
constexpr int kLastServerError = 599;
constexpr int32_t kHMACSHA1 = 0;

// Names come from clients; a line break in one must not make it two headers.
std::string headerText(std::string_view text) {
  std::string result(text);
  const auto isControl = [](char c) { return static_cast<unsigned char>(c) < ' ' || c == '\x7f'; };
  result.erase(std::remove_if(result.begin(), result.end(), isControl), result.end());
  return result;
}

// The first characters of UTF-8 text.
std::string_view firstCharacters(std::string_view text, size_t count) noexcept {
  const auto isContinuation = [](char c) { return (static_cast<unsigned char>(c) & 0xC0) == 0x80; };
  size_t end = 0;
  for (; end < text.size() && (count > 0 || isContinuation(text[end])); ++end) {
    if (!isContinuation(text[end])) --count;
  }
  return text.substr(0, end);
}

std::string digestText(const Data& key, std::string_view json) {
  const auto digest =
      crypto::hmacSHA1({key.bytes(), key.size()}, {reinterpret_cast<const uint8_t*>(json.data()), json.size()});
  return Data::copyOf(std::span<const uint8_t>(digest)).description();
}

}  // namespace

void HTTPSPostBackend::postJSONMessage(std::string json, uint32_t flag, const EventNumbers* numbers,
                                       FlushCompletion completion) {
  const std::optional<String>& url = isRealtime(flag) ? _realtimePostURL : _postURL;
  if (!url.has_value()) {
    if (completion) {
      completion(std::nullopt, makeTelvaneError("postURL is nil", static_cast<int64_t>(TelvaneErrorCode::Failure)));
    }
    return;
  }
  URLRequest request = newRequest(*url, std::move(json), numbers);
  const auto helper = _reportingSessionConnectivityDelegate.lock();
  if (helper == nullptr) return;
  helper->postURLRequestWithCompletionHandler(
      std::move(request),
      [&context = _context, name = _name, weakSelf = weak_from_this(), completion = std::move(completion)](
          const Data&, const URLResponse* response, const std::optional<Error>& error) mutable {
        finishPost(context, name, weakSelf, response, error, completion);
      });
}

// Runs on the connectivity helper's queue, maybe after the backend is gone.
void HTTPSPostBackend::finishPost(const ProcessContext& context, const String& name,
                                  const std::weak_ptr<TelvaneBackend>& weakSelf, const URLResponse* response,
                                  const std::optional<Error>& error, FlushCompletion& completion) {
  if (error.has_value()) context.log().message("HTTPSPostBackend(postJsonMessage): post error: {}", *error);
  const int statusCode = response != nullptr ? response->statusCode : 0;
  if (statusCode < kFirstServerError || statusCode > kLastServerError) {
    if (completion) completion(std::nullopt, error);
    return;
  }
  const std::string text = fmt::format("backend {} disabled by server {} return code", name, statusCode);
  context.log().message("postJSONMessage: {}", text);
  if (const auto self = weakSelf.lock()) self->setState(TelvaneBackendStateDisabled);
  if (completion) completion(std::nullopt, makeTelvaneError(text, statusCode));
}

URLRequest HTTPSPostBackend::newRequest(const String& url, std::string json, const EventNumbers* numbers) {
  URLRequest request;
  request.url = securedURL(url, _context.isInternalBuild());
  request.method = "POST";
  request.allowsCellularAccess = !_shouldUseWiFiOnly;
  request.headers.reserve(kHeaderCount);
  addIdentityHeaders(request, numbers);
  std::optional<std::string> digest;
  if (const Data* key = _digestKey.data(); key != nullptr && _digestAlgorithm == kHMACSHA1) {
    digest = digestText(*key, json);  // of the JSON, also when the body is compressed
  }
  addBody(request, std::move(json));
  addSessionID(request);
  if (digest.has_value()) request.headers.push_back({"X-TVN-DIGEST", *std::move(digest)});
  const auto size = static_cast<uint32_t>(request.body.size());
  _bytesSentSinceLastReport.fetch_add(size);
  _totalBytesSent.fetch_add(size);
  return request;
}

void HTTPSPostBackend::addIdentityHeaders(URLRequest& request, const EventNumbers* numbers) const {
  auto& headers = request.headers;
  if (_userInfoDict.has_value()) {
    const String* client = (*_userInfoDict)[kTelvaneUserInfoClientName].string();
    const String* service = (*_userInfoDict)[kTelvaneUserInfoServiceName].string();
    if (client != nullptr) headers.push_back({"X-TVN-Client-Name", headerText(*client)});
    if (service != nullptr) headers.push_back({"X-TVN-Service-Name", headerText(*service)});
  }
  if (_isInternal) headers.push_back({"X-TVN-Internal-Build", "1"});
  headers.push_back({"User-Agent", headerText(fmt::format("Telvane/{} ({}; {})", selfVersionText(),
                                                          valueOf(_hardwareType), valueOf(_productVersion)))});
  headers.push_back({"X-TVN-Client-Version", fmt::format("{}", _clientVersion)});
  headers.push_back({"X-TVN-Sender", std::string(senderName())});
  if (numbers != nullptr) {
    headers.push_back({"X-TVN-Event-Map", fmt::format("{} {}", numbers->method, numbers->respCode)});
  }
  headers.push_back({"Accept", "application/json"});
  headers.push_back({"Content-Type", "application/json"});
}

void HTTPSPostBackend::addBody(URLRequest& request, std::string json) const {
  std::optional<Data> compressed = gzipDeflate(log(), json);
  const bool isSmaller = compressed.has_value() && !compressed->empty() && compressed->size() < json.size();
  request.body = isSmaller ? *std::move(compressed) : Data(std::move(json));
  request.headers.push_back({"Content-Length", fmt::format("{}", request.body.size())});
  if (isSmaller) request.headers.push_back({"Content-Encoding", "gzip"});
}

void HTTPSPostBackend::addSessionID(URLRequest& request) const {
  if (!_includeSessionIDInHeader) return;
  const std::optional<String> sessionID = combinedSessionIDString();
  if (!sessionID.has_value()) return;
  request.headers.push_back({"X-TVN-Session-ID", headerText(firstCharacters(*sessionID, kLongestSessionID))});
}

std::string_view HTTPSPostBackend::senderName() const noexcept {
  const ClientType* row = clientType(static_cast<int32_t>(_compType));
  return row != nullptr ? row->senderName : std::string_view();
}

}  // namespace telvane
