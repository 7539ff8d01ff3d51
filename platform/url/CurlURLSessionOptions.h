#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <string>

#include "platform/url/ConnectivityProbe.h"

namespace telvane {

// What an URL session is bound by.
struct CurlURLSessionOptions {
  // PEM file of the only certificates to trust; empty: the system's store.
  std::string caFile;
  // A longer response body ends its task with ResponseTooLarge; what came before has been delivered.
  uint64_t maximumResponseBytes = 16ull << 20;
  // For requests without a time-out of their own: to connect (each try), without any byte moving, and in all.
  std::chrono::milliseconds connectTimeout = std::chrono::seconds(60);
  std::chrono::seconds idleTimeout{60};
  std::chrono::milliseconds resourceTimeout = std::chrono::hours(7 * 24);
  // How long a task without a network waits before it tries again: doubled after each try, up to the longest.
  std::chrono::milliseconds firstRetryDelay = std::chrono::seconds(1);
  std::chrono::milliseconds longestRetryDelay = std::chrono::seconds(60);
  // Asked before a try is made again; none: InterfaceConnectivityProbe.
  std::shared_ptr<ConnectivityProbe> connectivityProbe;
};

}  // namespace telvane
