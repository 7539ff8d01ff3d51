#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "backends/UploadBackend.h"
#include "tests/backends/BackendFixture.h"

namespace telvane::testing {

// A connectivity helper whose server answers by itself, on a queue of its own as a real one does.
class AnsweringConnectivity final : public ReportingSessionConnectivityInterface {
 public:
  explicit AnsweringConnectivity(Dispatch& dispatch) : _queue(dispatch.newSerialQueue("helper")) {}

  // What the next posts are answered with: these bytes, or this error, or both.
  void setAnswer(std::string body, int statusCode = 200) {
    _body = std::move(body);
    _statusCode = statusCode;
    _error.reset();
  }
  void setError(Error error, std::string receivedBefore = "") {
    _error = std::move(error);
    _body = std::move(receivedBefore);
  }
  void setDelay(std::chrono::nanoseconds delay) { _delay = delay; }
  // From now on completions are let go of without a call, as a helper does that is not active.
  void goInactive() { _isActive = false; }

  void postURLRequestWithCompletionHandler(URLRequest request, RequestCompletion completion) override;

  std::vector<URLRequest> requests;
  // Called before the server answers, while the poster waits.
  std::function<void()> beforeAnswer;

 private:
  const std::shared_ptr<SerialQueue> _queue;
  bool _isActive = true;
  std::chrono::nanoseconds _delay{0};
  std::string _body = R"({"result":"success"})";
  int _statusCode = 200;
  std::optional<Error> _error;
};

// One process with an upload backend and files of clients in memory.
class UploadFixture : public BackendFixture {
 protected:
  static constexpr char kUploadURL[] = "https://uploads.example/upload";
  static constexpr char kPath[] = "/home/user/logs/call.log";
  static constexpr char kOnlyRegular[] = "UploadBackend(uploadFileAtPath): Only upload a regular file.";
  static constexpr char kIsEmpty[] = "UploadBackend(uploadFileAtPath): Input file is empty";

  UploadFixture();

  // Makes the backend of this section and gives it its session.
  std::shared_ptr<TelvaneBackend> makeUploadBackend(const std::string& url = kUploadURL);
  void givenFile(const std::string& content, const std::string& path = kPath) {
    process().files().place(path, content);
  }
  // Uploads what is at the path, with a token for it.
  bool upload(const std::string& path = kPath);
  bool isThere(const std::string& path = kPath) { return process().files().exists(path); }
  AnsweringConnectivity& helper() { return *_helper; }
  void endHelper() { _helper.reset(); }
  MemoryExtensions& extensions() { return process().sandboxExtensions(); }

  std::shared_ptr<TelvaneBackend> _uploader;

 private:
  std::shared_ptr<AnsweringConnectivity> _helper;
};

}  // namespace telvane::testing
