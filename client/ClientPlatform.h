#pragma once

#include "platform/Platform.h"

namespace telvane {

// The part of a platform that the client library needs. It is small, so that a host process need not load what only
// the daemon uses. Made by the client runtime or a test, outlived by what it refers to.
struct ClientPlatform {
  ClientPlatform(Clock& clock_, Dispatch& dispatch_, Log& log_, Random& random_, UserDefaults& userDefaults_,
                 ipc::Service& localService_)
      : clock(clock_),
        dispatch(dispatch_),
        log(log_),
        random(random_),
        userDefaults(userDefaults_),
        localService(localService_) {}
  // NOLINTNEXTLINE(google-explicit-constructor): a whole platform is one, too.
  ClientPlatform(const Platform& platform)
      : ClientPlatform(platform.clock, platform.dispatch, platform.log, platform.random, platform.userDefaults,
                       platform.localService) {}

  Clock& clock;
  Dispatch& dispatch;
  Log& log;
  Random& random;
  UserDefaults& userDefaults;
  ipc::Service& localService;
};

}  // namespace telvane
