#include "platform/url/CurlURLSessionProvider.h"

#include <curl/curl.h>

#include <string>
#include <utility>

#include "platform/url/CurlEnvironment.h"
#include "platform/url/CurlLoop.h"
#include "platform/url/CurlURLSession.h"
#include "platform/url/TrustStore.h"

namespace telvane {

namespace {

// What the owner of a session holds: letting go of it cancels, while the session itself lives on for its delegate.
class SessionHandle final : public URLSession {
 public:
  explicit SessionHandle(std::shared_ptr<CurlURLSession> session) : _session(std::move(session)) {}
  ~SessionHandle() override { _session->cancelUnlessFinishing(); }
  SessionHandle(const SessionHandle&) = delete;
  SessionHandle& operator=(const SessionHandle&) = delete;

  const std::string& sessionDescription() const override { return _session->sessionDescription(); }
  void setSessionDescription(std::string description) override {
    _session->setSessionDescription(std::move(description));
  }
  Result<std::shared_ptr<URLSessionTask>> newDataTask(URLRequest request) override {
    return _session->newDataTask(std::move(request));
  }
  Result<std::shared_ptr<URLSessionTask>> newUploadTask(URLRequest request, const std::string& path) override {
    return _session->newUploadTask(std::move(request), path);
  }
  void finishTasksAndInvalidate() override { _session->finishTasksAndInvalidate(); }

 private:
  const std::shared_ptr<CurlURLSession> _session;
};

}  // namespace

CurlURLSessionProvider::CurlURLSessionProvider(Dispatch& dispatch, Log& log, FlowGate* flowGate,
                                               CurlURLSessionOptions options) {
  curl_global_init(CURL_GLOBAL_DEFAULT);  // counted, and safe beside other users of the library in this process
  if (!options.connectivityProbe) options.connectivityProbe = std::make_shared<InterfaceConnectivityProbe>();
  auto trustStore = std::make_shared<TrustStore>(options.caFile, log);
  _environment = std::make_shared<const CurlEnvironment>(CurlEnvironment{
      dispatch, log, flowGate, std::move(options), std::make_shared<CurlLoop>(), std::move(trustStore)});
}

CurlURLSessionProvider::~CurlURLSessionProvider() {
  _environment->loop->stop();
  curl_global_cleanup();
}

std::unique_ptr<URLSession> CurlURLSessionProvider::newSession(URLSessionConfiguration configuration,
                                                               std::shared_ptr<URLSessionDelegate> delegate,
                                                               std::shared_ptr<SerialQueue> delegateQueue) {
  return std::make_unique<SessionHandle>(std::make_shared<CurlURLSession>(
      _environment, std::move(configuration), std::move(delegate), std::move(delegateQueue)));
}

}  // namespace telvane
