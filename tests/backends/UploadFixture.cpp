#include "tests/backends/UploadFixture.h"

#include "interfaces/BackendNames.h"
#include "interfaces/StorebagKeys.h"

namespace telvane::testing {

void AnsweringConnectivity::postURLRequestWithCompletionHandler(URLRequest request, RequestCompletion completion) {
  requests.push_back(std::move(request));
  if (!_isActive) return;
  _queue->asyncAfter(_delay, [this, completion = std::move(completion)]() mutable {
    if (beforeAnswer) beforeAnswer();
    URLResponse response;
    response.statusCode = _statusCode;
    completion(Data::copyOf(_body), _error.has_value() ? nullptr : &response, _error);
  });
}

UploadFixture::UploadFixture() : _helper(std::make_shared<AnsweringConnectivity>(process().platform().dispatch)) {}

std::shared_ptr<TelvaneBackend> UploadFixture::makeUploadBackend(const std::string& url) {
  const Dictionary section{{kProfilePostURL, url}, {kProfileDisplayURL, "https://uploads.example/show"}};
  _uploader = TelvaneBackend::newBackendWithName(context(), String(kTelvaneBackendUploadServer.view()), section,
                                                 String("TelvaneBox"), 6);
  if (_uploader == nullptr) throw std::runtime_error("the section of the test makes no backend");
  _uploader->setUdid("device-id");
  _uploader->setSessionID(4711);
  _uploader->setReportingSessionConnectivityDelegate(_helper);
  return _uploader;
}

bool UploadFixture::upload(const std::string& path) {
  if (_uploader == nullptr) makeUploadBackend();
  return _uploader->uploadFileAtPath(path, extensions().newToken(path));
}

}  // namespace telvane::testing
