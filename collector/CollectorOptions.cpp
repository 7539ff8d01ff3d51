#include "collector/CollectorOptions.h"

#include <CLI/CLI.hpp>
#include <charconv>
#include <iostream>

#include "platform/dispatch/SystemRandom.h"

namespace telvane {
namespace {

constexpr int kWrongUsage = 2;

// Splits HOST:PORT at the last colon.
bool readAddress(const std::string& text, std::string& host, uint16_t& port) {
  const size_t colon = text.rfind(':');
  if (colon == std::string::npos || colon == 0) return false;
  const char* end = text.data() + text.size();
  const auto parsed = std::from_chars(text.data() + colon + 1, end, port);
  if (parsed.ec != std::errc() || parsed.ptr != end) return false;
  host = text.substr(0, colon);
  return true;
}

std::optional<IPv4SocketAddress> datagramAddress(const std::string& text) {
  std::string host;
  uint16_t port = 0;
  if (!readAddress(text, host, port)) return std::nullopt;
  return ipv4SocketAddress(host, port);
}

uint64_t newSeed() {
  SystemRandom random;
  uint32_t seed = 0;  // short enough to be typed
  random.fill({reinterpret_cast<uint8_t*>(&seed), sizeof seed});
  return seed;
}

}  // namespace

std::variant<CollectorOptions, int> parseCollectorOptions(int argc, const char* const* argv) {
  CLI::App app("Serves storebags and takes the events and files that devices post.", "telvane-collector");
  app.set_version_flag("--version", "telvane-collector " TELVANE_VERSION);
  CollectorOptions options;
  std::string address;
  int64_t maxAge = options.maxAge.count();
  bool isDiscarding = false;
  app.add_option("--listen", address, "HOST:PORT to serve on; port 0 picks one")->required();
  app.add_option("--certificate", options.certificateFile, "PEM file of the server's certificate")->required();
  app.add_option("--private-key", options.privateKeyFile, "PEM file of the certificate's key")->required();
  app.add_option("--storebags", options.storebagFolder, "folder with the signed storebags")->required();
  auto* events = app.add_option("--events", options.eventFile, "file that gets one JSON line per event");
  app.add_option("--uploads", options.uploadFolder, "folder that gets uploaded files and log data");
  app.add_flag("--discard", isDiscarding, "count events and drop them")->excludes(events);
  std::string dashboard;
  auto* dashboardOption =
      app.add_option("--dashboard", dashboard, "IPv4 HOST:PORT to take dashboard datagrams on; port 0 picks one");
  auto* loss = app.add_option("--dashboard-loss", options.dashboardLossPercent,
                              "how many of 100 datagrams, and of acknowledgements, to drop by chance")
                   ->check(CLI::Range(0, 100))
                   ->needs(dashboardOption);
  auto* seed = app.add_option("--dashboard-seed", options.dashboardLossSeed, "what chance begins with")->needs(loss);
  app.add_option("--max-age", maxAge, "seconds that a storebag stays fresh")->check(CLI::NonNegativeNumber);
  try {
    app.parse(argc, argv);
    if (!readAddress(address, options.host, options.port))
      throw CLI::ValidationError("--listen", "give HOST:PORT, for example 127.0.0.1:0");
    if (*dashboardOption) {
      options.dashboard = datagramAddress(dashboard);
      if (!options.dashboard)
        throw CLI::ValidationError("--dashboard", "give an IPv4 address and a port, for example 127.0.0.1:0");
    }
    if (options.eventFile.empty() && !isDiscarding) throw CLI::ValidationError("--events", "name a file, or --discard");
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() == 0) return app.exit(error);
    std::cerr << "telvane-collector: " << error.what() << "; see telvane-collector --help\n";
    return kWrongUsage;
  }
  if (!*seed) options.dashboardLossSeed = newSeed();
  options.maxAge = std::chrono::seconds(maxAge);
  return options;
}

}  // namespace telvane
