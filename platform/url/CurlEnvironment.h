#pragma once

#include <memory>

#include "platform/Dispatch.h"
#include "platform/FlowGate.h"
#include "platform/Log.h"
#include "platform/url/CurlLoop.h"
#include "platform/url/CurlURLSessionOptions.h"
#include "platform/url/TrustStore.h"

namespace telvane {

// What all sessions of one provider share. Constant after construction; the references outlive the sessions.
struct CurlEnvironment {
  Dispatch& dispatch;
  Log& log;
  FlowGate* flowGate;  // may be null
  CurlURLSessionOptions options;
  std::shared_ptr<CurlLoop> loop;
  std::shared_ptr<TrustStore> trustStore;
};

}  // namespace telvane
