#include "platform/url/CurlTransfer.h"

#include <strings.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <span>
#include <string>

namespace telvane {

namespace {

bool startsWithoutCase(std::string_view text, std::string_view start) {
  return text.size() >= start.size() && strncasecmp(text.data(), start.data(), start.size()) == 0;
}

bool isNamed(std::string_view name, std::string_view other) {
  return name.size() == other.size() && startsWithoutCase(name, other);
}

bool isToken(std::string_view text) {
  static constexpr std::string_view kOthers = "!#$%&'*+-.^_`|~";
  const auto isTokenCharacter = [](char c) {
    return (c >= '0' && c <= '9') || ((c | 0x20) >= 'a' && (c | 0x20) <= 'z') ||
           kOthers.find(c) != std::string_view::npos;
  };
  return !text.empty() && std::all_of(text.begin(), text.end(), isTokenCharacter);
}

// Text that cannot end its line or hide what follows it.
bool isLine(std::string_view text) {
  return text.find_first_of(std::string_view("\r\n\0", 3)) == std::string_view::npos;
}

bool isBlank(std::string_view text) { return text.find_first_not_of(" \t") == std::string_view::npos; }

std::string_view trimmed(std::string_view text) {
  const size_t first = text.find_first_not_of(" \t\r\n");
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(" \t\r\n") - first + 1);
}

bool hasHeader(const URLRequest& request, std::string_view name) {
  return std::any_of(request.headers.begin(), request.headers.end(),
                     [name](const URLRequest::Header& header) { return isNamed(header.name, name); });
}

bool isUsableURL(const std::string& url) {
  constexpr size_t kLongestURL = 64u << 10;
  if (url.size() > kLongestURL || !isLine(url)) return false;
  if (!startsWithoutCase(url, "https://") && !startsWithoutCase(url, "http://")) return false;
  const std::unique_ptr<CURLU, decltype(&curl_url_cleanup)> parsed(curl_url(), &curl_url_cleanup);
  return parsed && curl_url_set(parsed.get(), CURLUPART_URL, url.c_str(), 0) == CURLUE_OK;
}

Error makeError(URLErrorCode code, std::string_view text) {
  return Error::withDescription(kPlatformErrorDomain, static_cast<int64_t>(code), text);
}

bool isNoRoute(int64_t code) {
  return code == ENETUNREACH || code == EHOSTUNREACH || code == ENETDOWN || code == EADDRNOTAVAIL;
}

const char* textFor(URLErrorCode code) {
  switch (code) {
    case URLErrorCode::TimedOut:
      return "The request timed out";
    case URLErrorCode::CannotFindHost:
      return "The server's name could not be resolved";
    case URLErrorCode::CannotConnectToHost:
      return "The server could not be connected to";
    case URLErrorCode::NetworkConnectionLost:
      return "The connection to the server was lost";
    case URLErrorCode::NotConnectedToNetwork:
      return "There is no network to the server";
    case URLErrorCode::SecureConnectionFailed:
      return "A secure connection to the server could not be made";
    case URLErrorCode::ServerCertificateUntrusted:
      return "The server's certificate is not trusted";
    case URLErrorCode::UnsafeRedirect:
      return "The server redirects to where the request must not go";
    case URLErrorCode::ResponseTooLarge:
      return "The response is larger than allowed";
    case URLErrorCode::BadURL:
      return "The URL cannot be used";
    default:
      return "The request failed";
  }
}

}  // namespace

Result<void> CurlTransfer::check(const URLRequest& request) {
  if (!isUsableURL(request.url)) return makeError(URLErrorCode::BadURL, "The URL cannot be used");
  if (!isToken(request.method)) return makeError(URLErrorCode::BadURL, "The request's method cannot be sent");
  for (const URLRequest::Header& header : request.headers) {
    if (!isToken(header.name) || !isLine(header.value)) {
      return makeError(URLErrorCode::BadURL, "A header of the request cannot be sent");
    }
  }
  return {};
}

CurlTransfer::CurlTransfer(const CurlEnvironment& environment, CurlMulti& multi, CurlURLSessionTask& task,
                           Receiver& receiver, std::chrono::milliseconds remaining)
    : _environment(environment), _multi(multi), _task(task), _receiver(receiver), _handle(multi.newHandle()) {
  setUp(remaining);
  _multi.add(_handle);
}

CurlTransfer::~CurlTransfer() { _multi.remove(_handle); }

CurlURLSessionTask& CurlTransfer::taskOf(CURL* handle) {
  void* task = nullptr;
  curl_easy_getinfo(handle, CURLINFO_PRIVATE, &task);
  return *static_cast<CurlURLSessionTask*>(task);
}

void CurlTransfer::setUp(std::chrono::milliseconds remaining) {
  set(CURLOPT_PRIVATE, static_cast<void*>(&_task));
  set(CURLOPT_ERRORBUFFER, _message.data());
  set(CURLOPT_URL, _task.request().url.c_str());
  set(CURLOPT_NOSIGNAL, 1L);
  // A time-out must not wait for a name service that hangs.
  set(CURLOPT_QUICK_EXIT, 1L);
  set(CURLOPT_PROTOCOLS_STR, "http,https");
  // Whom to go through is no matter of the process's environment.
  set(CURLOPT_PROXY, "");
  set(CURLOPT_TCP_KEEPALIVE, 1L);
  set(CURLOPT_HEADERFUNCTION, &CurlTransfer::headerLine);
  set(CURLOPT_HEADERDATA, static_cast<void*>(this));
  set(CURLOPT_WRITEFUNCTION, &CurlTransfer::bodyBytes);
  set(CURLOPT_WRITEDATA, static_cast<void*>(this));
  set(CURLOPT_MAXFILESIZE_LARGE, static_cast<curl_off_t>(_environment.options.maximumResponseBytes));
  setSecurity();
  setTimeouts(remaining);
  setBody();
  setHeaders();
}

void CurlTransfer::setSecurity() {
  set(CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_2TLS));
  set(CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
  set(CURLOPT_SSL_VERIFYPEER, 1L);
  set(CURLOPT_SSL_VERIFYHOST, 2L);
  // The shared store takes the place of the files that would be read for each connection.
  set(CURLOPT_CAINFO, static_cast<char*>(nullptr));
  set(CURLOPT_CAPATH, static_cast<char*>(nullptr));
  set(CURLOPT_SSL_CTX_FUNCTION, &CurlTransfer::makeTrust);
  set(CURLOPT_SSL_CTX_DATA, static_cast<void*>(_environment.trustStore.get()));
}

void CurlTransfer::setTimeouts(std::chrono::milliseconds remaining) {
  const CurlURLSessionOptions& options = _environment.options;
  const bool isBoundByItself = _task.request().timeout.has_value();
  set(CURLOPT_TIMEOUT_MS, static_cast<long>(std::max<int64_t>(remaining.count(), 1)));
  const auto toConnect = isBoundByItself ? remaining : std::min(remaining, options.connectTimeout);
  set(CURLOPT_CONNECTTIMEOUT_MS, static_cast<long>(std::max<int64_t>(toConnect.count(), 1)));
  if (isBoundByItself) return;
  set(CURLOPT_LOW_SPEED_LIMIT, 1L);
  set(CURLOPT_LOW_SPEED_TIME, static_cast<long>(options.idleTimeout.count()));
}

void CurlTransfer::setBody() {
  const URLRequest& request = _task.request();
  if (request.method == "GET" && _task.bodySize() == 0) {
    set(CURLOPT_HTTPGET, 1L);
    set(CURLOPT_FOLLOWLOCATION, 1L);
    set(CURLOPT_MAXREDIRS, kMaximumRedirects);
    set(CURLOPT_REDIR_PROTOCOLS_STR, "https");
    return;
  }
  if (request.method == "HEAD") return set(CURLOPT_NOBODY, 1L);
  set(CURLOPT_POST, 1L);
  set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(_task.bodySize()));
  if (request.method != "POST") set(CURLOPT_CUSTOMREQUEST, request.method.c_str());
  if (_task.file() == nullptr) return set(CURLOPT_POSTFIELDS, reinterpret_cast<const char*>(request.body.bytes()));
  set(CURLOPT_READFUNCTION, &CurlTransfer::readFile);
  set(CURLOPT_READDATA, static_cast<void*>(this));
  set(CURLOPT_SEEKFUNCTION, &CurlTransfer::seekFile);
  set(CURLOPT_SEEKDATA, static_cast<void*>(this));
}

void CurlTransfer::setHeaders() {
  const URLRequest& request = _task.request();
  for (const URLRequest::Header& header : request.headers) {
    if (isNamed(header.name, "Content-Length")) {
      // A length that is not the body's would make the next request of the connection part of this one.
      if (_task.bodySize() > 0) addHeader(("Content-Length: " + std::to_string(_task.bodySize())).c_str());
    } else {
      addHeader((isBlank(header.value) ? header.name + ";" : header.name + ": " + header.value).c_str());
    }
  }
  // A header without a value takes away the one that would be sent unasked.
  for (const char* unasked : {"Accept", "Content-Type", "Expect"}) {
    if (!hasHeader(request, unasked)) addHeader((std::string(unasked) + ":").c_str());
  }
  set(CURLOPT_HTTPHEADER, _headers.get());
}

void CurlTransfer::addHeader(const char* line) {
  curl_slist* list = curl_slist_append(_headers.get(), line);
  if (list == nullptr) throw std::bad_alloc();
  if (!_headers) _headers.reset(list);
}

size_t CurlTransfer::headerLine(char* bytes, size_t size, size_t count, void* self) {
  const size_t total = size * count;
  return static_cast<CurlTransfer*>(self)->takeHeaderLine({bytes, total}) ? total : 0;
}

bool CurlTransfer::takeHeaderLine(std::string_view line) {
  if (_isHeadTold) return true;  // a trailer
  _headerBytes += line.size();
  if (_headerBytes > kMaximumHeaderBytes || _response.headers.size() >= kMaximumHeaders) {
    _isTooLarge = true;
    return false;
  }
  if (startsWithoutCase(line, "HTTP/")) {
    _response = URLResponse{.statusCode = static_cast<int>(info(CURLINFO_RESPONSE_CODE))};
  } else if (const size_t colon = line.find(':'); colon != std::string_view::npos) {
    _response.headers.push_back({std::string(line.substr(0, colon)), std::string(trimmed(line.substr(colon + 1)))});
  } else if (trimmed(line).empty() && info(CURLINFO_RESPONSE_CODE) >= 200) {
    _response.statusCode = static_cast<int>(info(CURLINFO_RESPONSE_CODE));
    if (!isFollowedRedirect()) tellHead();
  }
  return true;
}

bool CurlTransfer::isFollowedRedirect() const {
  return _task.request().method == "GET" && _response.statusCode / 100 == 3 && _response.header("Location") != nullptr;
}

void CurlTransfer::tellHead() {
  const char* url = nullptr;
  curl_easy_getinfo(_handle, CURLINFO_EFFECTIVE_URL, &url);
  _response.url = url != nullptr ? url : _task.request().url;
  _isHeadTold = true;
  tellSent();
  _receiver.didReceiveHead(_task, std::move(_response));
}

void CurlTransfer::tellSent() {
  const int64_t sent = _task.bodySize() == 0 ? 0 : info(CURLINFO_SIZE_UPLOAD_T);
  if (sent <= _toldSentBytes) return;
  _toldSentBytes = sent;
  _receiver.didSendBytes(_task, sent);
}

size_t CurlTransfer::bodyBytes(char* bytes, size_t size, size_t count, void* self) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  const size_t total = size * count;
  transfer._receivedBytes += total;
  if (transfer._receivedBytes > transfer._environment.options.maximumResponseBytes) {
    transfer._isTooLarge = true;
    return 0;
  }
  transfer._receiver.didReceiveBytes(transfer._task, {bytes, total});
  return total;
}

size_t CurlTransfer::readFile(char* buffer, size_t size, size_t count, void* self) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  const int64_t read = transfer._task.file()->read(transfer._fileOffset, std::span(buffer, size * count));
  if (read < 0) return CURL_READFUNC_ABORT;
  transfer._fileOffset += static_cast<uint64_t>(read);
  transfer.tellSent();
  return static_cast<size_t>(read);
}

int CurlTransfer::seekFile(void* self, curl_off_t offset, int origin) {
  if (origin != SEEK_SET || offset < 0) return CURL_SEEKFUNC_FAIL;
  static_cast<CurlTransfer*>(self)->_fileOffset = static_cast<uint64_t>(offset);
  return CURL_SEEKFUNC_OK;
}

CURLcode CurlTransfer::makeTrust(CURL*, void* context, void* trustStore) {
  static_cast<TrustStore*>(trustStore)->useIn(static_cast<SSL_CTX*>(context));
  return CURLE_OK;
}

int64_t CurlTransfer::info(CURLINFO what) const {
  if ((what & CURLINFO_TYPEMASK) == CURLINFO_OFF_T) {
    curl_off_t value = 0;
    return curl_easy_getinfo(_handle, what, &value) == CURLE_OK ? value : 0;
  }
  long value = 0;
  return curl_easy_getinfo(_handle, what, &value) == CURLE_OK ? value : 0;
}

std::optional<Error> CurlTransfer::finish(CURLcode result) {
  tellSent();
  if (result == CURLE_OK) return std::nullopt;
  return errorFor(result);
}

Error CurlTransfer::errorFor(CURLcode result) const {
  const URLErrorCode code = codeFor(result);
  const std::string reason = _message[0] != '\0' ? _message.data() : curl_easy_strerror(result);
  return makeError(code, std::string(textFor(code)) + ": " + reason);
}

URLErrorCode CurlTransfer::codeFor(CURLcode result) const {
  if (_isTooLarge) return URLErrorCode::ResponseTooLarge;
  switch (result) {
    case CURLE_OPERATION_TIMEDOUT:
      return URLErrorCode::TimedOut;
    case CURLE_COULDNT_RESOLVE_HOST:
      return URLErrorCode::CannotFindHost;
    case CURLE_COULDNT_CONNECT:
      return isNoRoute(info(CURLINFO_OS_ERRNO)) ? URLErrorCode::NotConnectedToNetwork
                                                : URLErrorCode::CannotConnectToHost;
    case CURLE_SEND_ERROR:
    case CURLE_RECV_ERROR:
    case CURLE_GOT_NOTHING:
    case CURLE_PARTIAL_FILE:
    case CURLE_HTTP2:
    case CURLE_HTTP2_STREAM:
      return URLErrorCode::NetworkConnectionLost;
    case CURLE_PEER_FAILED_VERIFICATION:
    case CURLE_SSL_CACERT_BADFILE:
    case CURLE_SSL_ISSUER_ERROR:
      return URLErrorCode::ServerCertificateUntrusted;
    case CURLE_SSL_CONNECT_ERROR:
    case CURLE_SSL_CIPHER:
    case CURLE_USE_SSL_FAILED:
      return URLErrorCode::SecureConnectionFailed;
    // The request's own protocol was checked before it was tried.
    case CURLE_UNSUPPORTED_PROTOCOL:
    case CURLE_TOO_MANY_REDIRECTS:
      return URLErrorCode::UnsafeRedirect;
    case CURLE_FILESIZE_EXCEEDED:
      return URLErrorCode::ResponseTooLarge;
    case CURLE_URL_MALFORMAT:
      return URLErrorCode::BadURL;
    default:
      return URLErrorCode::Unknown;
  }
}

}  // namespace telvane
