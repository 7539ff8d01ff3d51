#pragma once

#include <memory>

#include "platform/Dispatch.h"
#include "platform/FlowGate.h"
#include "platform/Log.h"
#include "platform/URLSession.h"
#include "platform/url/CurlURLSessionOptions.h"

namespace telvane {

struct CurlEnvironment;

// Makes sessions over HTTP/1.1 and HTTP/2, whose transfers all run on one thread that starts with the first task.
// Made by the entry point, which hands it down and lets go of it after the sessions; what is still under way then is
// cancelled. Not to be let go of in a delegate call whose queue it would wait for. Safe from any thread.
class CurlURLSessionProvider final : public URLSessionProvider {
 public:
  // flowGate: counts the bodies in memory from resume to completion (those of files are not in memory); may be null.
  CurlURLSessionProvider(Dispatch& dispatch, Log& log, FlowGate* flowGate, CurlURLSessionOptions options);
  ~CurlURLSessionProvider() override;
  CurlURLSessionProvider(const CurlURLSessionProvider&) = delete;
  CurlURLSessionProvider& operator=(const CurlURLSessionProvider&) = delete;

  std::unique_ptr<URLSession> newSession(URLSessionConfiguration configuration,
                                         std::shared_ptr<URLSessionDelegate> delegate,
                                         std::shared_ptr<SerialQueue> delegateQueue) override;

 private:
  std::shared_ptr<const CurlEnvironment> _environment;
};

}  // namespace telvane
