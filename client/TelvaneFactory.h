#pragma once

#include <memory>

#include "client/ClientContext.h"
#include "client/include/telvane/Telvane.h"

namespace telvane {

// The door behind Telvane::initWithSessionInfo: makes sessions on a given platform.
struct TelvaneFactory {
  static std::shared_ptr<Telvane> initWithSessionInfo(ClientContext& context, const Value& sessionInfo,
                                                      const Value& userInfo = {}, const Value& frameworksToCheck = {},
                                                      Telvane::AggregationBlock aggregationBlock = {});
  // Returns the inside of a session, to be held on its own.
  static std::shared_ptr<ClientSession> session(const Telvane& telvane) { return telvane._session; }
};

}  // namespace telvane
