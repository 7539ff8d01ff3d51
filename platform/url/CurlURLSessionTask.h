#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>

#include "platform/URLSession.h"

namespace telvane {

class CurlURLSession;

// One request of a CurlURLSession, which keeps it from resume until it has completed. The request is let go of when it
// has completed, whoever still holds the task.
//
// The description is to be set before resume. The response belongs to the delegate queue.
class CurlURLSessionTask final : public URLSessionTask, public std::enable_shared_from_this<CurlURLSessionTask> {
 public:
  CurlURLSessionTask(std::shared_ptr<CurlURLSession> session, URLRequest request);

  // Starts the task; a second call does nothing.
  void resume() override;
  void setTaskDescription(std::string description) override { _description = std::move(description); }
  const std::string& taskDescription() const override { return _description; }
  const std::optional<URLResponse>& response() const override { return _response; }

  // For the session alone, from here on.

  const URLRequest& request() const noexcept { return _request; }
  // The file that is sent, or null when the body is in memory.
  const BodyFile* file() const noexcept { return _request.bodyFile.get(); }
  // The size of what is sent, wherever it comes from.
  uint64_t bodySize() const noexcept { return file() != nullptr ? file()->size() : _request.body.size(); }
  // The bytes of URL, headers and body that are held in memory; constant, also when the request has gone. Headers
  // count like the body: clients' names stand in them, at any length.
  uint64_t heldBytes() const noexcept { return _heldBytes; }
  // REQUIRES: the task has completed; on the loop's thread.
  void releaseRequest();

  // REQUIRES: on the delegate queue.
  void setResponse(URLResponse response) { _response = std::move(response); }
  bool isRefused() const noexcept { return _isRefused; }
  void refuse() noexcept { _isRefused = true; }

 private:
  const std::shared_ptr<CurlURLSession> _session;
  const uint64_t _heldBytes;
  std::atomic<bool> _isResumed = false;
  // Changed before resume only.
  std::string _description;
  // Read by the loop's thread after resume.
  URLRequest _request;
  // Confined to the delegate queue.
  std::optional<URLResponse> _response;
  bool _isRefused = false;  // the delegate wants no more of it
};

}  // namespace telvane
