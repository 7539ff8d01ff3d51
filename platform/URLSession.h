#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "foundation/Data.h"
#include "foundation/Error.h"
#include "foundation/UniqueFunction.h"
#include "platform/BodyFile.h"
#include "platform/Dispatch.h"

namespace telvane {

// One HTTP request. Headers go out in the order given, after the request line and Host.
struct URLRequest {
  enum class CachePolicy { UseProtocol, ReloadIgnoringLocalCache };
  struct Header {
    std::string name;
    std::string value;
  };

  std::string url;
  std::string method = "GET";
  std::vector<Header> headers;
  Data body;
  // The body when it is too large for memory; goes instead of the other, and does not count as waiting in memory.
  std::shared_ptr<const BodyFile> bodyFile;
  CachePolicy cachePolicy = CachePolicy::UseProtocol;
  bool allowsCellularAccess = true;
  // The longest time from resume to completion, waiting for connectivity included; without one a task may wait up to
  // 7 days for a network, and a running transfer that is idle for 60 s ends.
  std::optional<std::chrono::milliseconds> timeout;

  void setHeader(std::string name, std::string value);  // appends, or replaces the value of an equal name
};

struct URLResponse {
  int statusCode = 0;
  std::vector<URLRequest::Header> headers;
  std::string url;
  // The first header of that name, compared without regard to case.
  const std::string* header(std::string_view name) const noexcept;
};

struct URLSessionConfiguration {
  // A name makes it a background session, whose tasks may wait for good moments.
  std::optional<std::string> backgroundIdentifier;
  bool isDiscretionary = false;
  bool requiresExternalPower = false;
  bool isBackgroundServiceType = false;
  bool waitsForConnectivity = false;
  std::string sourceApplicationBundleIdentifier;
  std::string sourceApplicationSecondaryIdentifier;
};

// One request of a session. Made suspended; its session keeps it until it has completed.
class URLSessionTask {
 public:
  virtual ~URLSessionTask() = default;
  virtual void resume() = 0;
  virtual void setTaskDescription(std::string description) = 0;
  virtual const std::string& taskDescription() const = 0;
  // The response, once its headers have come. To be read in delegate calls of this task.
  virtual const std::optional<URLResponse>& response() const = 0;
};

class URLSession;

// Receives what happens to a session and its tasks, one call at a time on the session's delegate queue.
class URLSessionDelegate {
 public:
  enum class ResponseDisposition { Cancel = 0, Allow = 1 };
  virtual ~URLSessionDelegate() = default;
  // The last call: all tasks have completed after finishTasksAndInvalidate.
  virtual void didBecomeInvalidWithError(URLSession& session, const std::optional<Error>& error) = 0;
  virtual void didSendBodyData(URLSession& session, URLSessionTask& task, int64_t totalBytesSent,
                               int64_t totalBytesExpectedToSend) = 0;
  // Called exactly once per resumed task.
  virtual void didCompleteWithError(URLSession& session, URLSessionTask& task, const std::optional<Error>& error) = 0;
  virtual ResponseDisposition didReceiveResponse(URLSession& session, URLSessionTask& task) = 0;
  virtual void didBecomeDownloadTask(URLSession& session, URLSessionTask& task) = 0;
  virtual void didReceiveData(URLSession& session, URLSessionTask& task, const Data& data) = 0;
};

// An HTTP client session: kept connections, several tasks at once. Owned by who made it through URLSessionProvider;
// holds its delegate (the provider's shared pointer) until it has become invalid. Letting go of a session that was not
// invalidated cancels its tasks. Safe from any thread.
//
// Transport security: https only verifies against the trusted certificates, never follows a redirect to plain http.
// Errors are of kPlatformErrorDomain; their codes are those of URLErrorCode.
class URLSession {
 public:
  virtual ~URLSession() = default;
  virtual const std::string& sessionDescription() const = 0;
  virtual void setSessionDescription(std::string description) = 0;
  // Returns a new task, or an error when the session has been invalidated or the URL cannot be used.
  virtual Result<std::shared_ptr<URLSessionTask>> newDataTask(URLRequest request) = 0;
  // The body is the file's content, of which the session has its own hold when this returns (the file may be removed).
  // path: a regular file, by the path that the system knows it by (FileSystem::resolve).
  virtual Result<std::shared_ptr<URLSessionTask>> newUploadTask(URLRequest request, const std::string& path) = 0;
  // Refuses new tasks, lets running ones end, then tells the delegate that the session became invalid.
  virtual void finishTasksAndInvalidate() = 0;
};

enum class URLErrorCode : int64_t {
  Unknown = -1,
  Cancelled = -999,
  BadURL = -1000,
  TimedOut = -1001,
  CannotFindHost = -1003,
  CannotConnectToHost = -1004,
  NetworkConnectionLost = -1005,
  NotConnectedToNetwork = -1009,
  SecureConnectionFailed = -1200,
  ServerCertificateUntrusted = -1202,
  UnsafeRedirect = -1007,
  ResponseTooLarge = -1103,
  SessionInvalidated = -2000,
};

// Where URL sessions come from. Made by the entry point, which hands it down and lets go of it after all sessions. Safe
// from any thread.
class URLSessionProvider {
 public:
  virtual ~URLSessionProvider() = default;
  // Returns a new session, never null; nothing goes out before a task of it is resumed. Its delegate is called on the
  // delegate queue only, and both are kept until the session has become invalid. REQUIRES: neither is null.
  virtual std::unique_ptr<URLSession> newSession(URLSessionConfiguration configuration,
                                                 std::shared_ptr<URLSessionDelegate> delegate,
                                                 std::shared_ptr<SerialQueue> delegateQueue) = 0;
};

}  // namespace telvane
