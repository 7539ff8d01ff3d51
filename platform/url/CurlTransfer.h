#pragma once

#include <curl/curl.h>

#include <array>
#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/url/CurlEnvironment.h"
#include "platform/url/CurlMulti.h"
#include "platform/url/CurlURLSessionTask.h"

namespace telvane {

// One try to carry out a task's request. Made and owned by the session, confined to the loop's thread.
//
// Redirects: a GET follows at most 10, to https only, whatever it came from; any other method gets the redirect itself
// as its response. Responses are passed on as they come, never decompressed. Informational responses and followed
// redirects are not told.
class CurlTransfer {
 public:
  static constexpr long kMaximumRedirects = 10;
  static constexpr size_t kMaximumHeaderBytes = 256u << 10;
  static constexpr size_t kMaximumHeaders = 512;

  // Takes what comes, in the order in which it comes. Must not end the transfer in these calls.
  class Receiver {
   public:
    virtual ~Receiver() = default;
    virtual void didReceiveHead(CurlURLSessionTask& task, URLResponse response) = 0;
    virtual void didReceiveBytes(CurlURLSessionTask& task, std::string_view bytes) = 0;
    virtual void didSendBytes(CurlURLSessionTask& task, int64_t total) = 0;
  };

  // Checks what can be checked of a request before it is tried: URL, method, header names and values.
  static Result<void> check(const URLRequest& request);

  // Starts. The task and everything else outlive the transfer. remaining: the time that is left for all of it.
  CurlTransfer(const CurlEnvironment& environment, CurlMulti& multi, CurlURLSessionTask& task, Receiver& receiver,
               std::chrono::milliseconds remaining);
  // Ends it, wherever it stands.
  ~CurlTransfer();
  CurlTransfer(const CurlTransfer&) = delete;
  CurlTransfer& operator=(const CurlTransfer&) = delete;

  // The task of a handle that a CurlMulti gives back.
  static CurlURLSessionTask& taskOf(CURL* handle);

  // Tells what the transfer's result means for the task; none for success. Tells the receiver what has been sent.
  std::optional<Error> finish(CURLcode result);

 private:
  static size_t headerLine(char* bytes, size_t size, size_t count, void* self);
  static size_t bodyBytes(char* bytes, size_t size, size_t count, void* self);
  static size_t readFile(char* buffer, size_t size, size_t count, void* self);
  static int seekFile(void* self, curl_off_t offset, int origin);
  static CURLcode makeTrust(CURL* handle, void* context, void* trustStore);

  template <class T>
  void set(CURLoption option, T value) {
    curl_easy_setopt(_handle, option, value);
  }
  void setUp(std::chrono::milliseconds remaining);
  void setSecurity();
  void setTimeouts(std::chrono::milliseconds remaining);
  void setBody();
  void setHeaders();
  void addHeader(const char* line);
  bool takeHeaderLine(std::string_view line);
  bool isFollowedRedirect() const;
  void tellHead();
  void tellSent();
  int64_t info(CURLINFO what) const;
  Error errorFor(CURLcode result) const;
  URLErrorCode codeFor(CURLcode result) const;

  const CurlEnvironment& _environment;
  CurlMulti& _multi;
  CurlURLSessionTask& _task;
  Receiver& _receiver;
  CURL* const _handle;
  std::unique_ptr<curl_slist, decltype(&curl_slist_free_all)> _headers{nullptr, &curl_slist_free_all};
  std::array<char, CURL_ERROR_SIZE> _message{};
  URLResponse _response;
  bool _isHeadTold = false;
  bool _isTooLarge = false;
  size_t _headerBytes = 0;
  uint64_t _receivedBytes = 0;
  uint64_t _fileOffset = 0;
  int64_t _toldSentBytes = 0;
};

}  // namespace telvane
