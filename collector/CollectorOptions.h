#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>

#include "platform/IPv4SocketAddress.h"

namespace telvane {

// What telvane-collector was asked for on its command line.
struct CollectorOptions {
  std::string host;
  uint16_t port = 0;  // 0 picks a free one
  std::string certificateFile;
  std::string privateKeyFile;
  std::string storebagFolder;
  // One JSON line per event; empty: events are counted and dropped.
  std::string eventFile;
  // Gets what is uploaded; empty: uploads are refused.
  std::string uploadFolder;
  // Where dashboard datagrams are taken, if at all; port 0 picks one.
  std::optional<IPv4SocketAddress> dashboard;
  // How many of a hundred of them, and of their acknowledgements, are dropped by chance from the seed.
  unsigned dashboardLossPercent = 0;
  uint64_t dashboardLossSeed = 0;
  // How long clients may keep a storebag.
  std::chrono::seconds maxAge{3600};
};

// Reads the command line. Returns the options, or the exit status when there is nothing more to do: 0 after --help and
// --version, 2 on wrong usage (one line on standard error).
std::variant<CollectorOptions, int> parseCollectorOptions(int argc, const char* const* argv);

}  // namespace telvane
