#include "collector/CollectorOptions.h"

#include <CLI/CLI.hpp>
#include <charconv>
#include <iostream>

namespace telvane {
namespace {

constexpr int kWrongUsage = 2;

// Splits HOST:PORT at the last colon.
bool readAddress(const std::string& text, CollectorOptions& options) {
  const size_t colon = text.rfind(':');
  if (colon == std::string::npos || colon == 0) return false;
  const char* end = text.data() + text.size();
  const auto parsed = std::from_chars(text.data() + colon + 1, end, options.port);
  if (parsed.ec != std::errc() || parsed.ptr != end) return false;
  options.host = text.substr(0, colon);
  return true;
}

}  // namespace

std::variant<CollectorOptions, int> parseCollectorOptions(int argc, const char* const* argv) {
  CLI::App app("Serves storebags and takes the events that devices post.", "telvane-collector");
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
  app.add_flag("--discard", isDiscarding, "count events and drop them")->excludes(events);
  app.add_option("--max-age", maxAge, "seconds that a storebag stays fresh")->check(CLI::NonNegativeNumber);
  try {
    app.parse(argc, argv);
    if (!readAddress(address, options))
      throw CLI::ValidationError("--listen", "give HOST:PORT, for example 127.0.0.1:0");
    if (options.eventFile.empty() && !isDiscarding) throw CLI::ValidationError("--events", "name a file, or --discard");
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() == 0) return app.exit(error);
    std::cerr << "telvane-collector: " << error.what() << "; see telvane-collector --help\n";
    return kWrongUsage;
  }
  options.maxAge = std::chrono::seconds(maxAge);
  return options;
}

}  // namespace telvane
