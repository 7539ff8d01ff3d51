#include "tests/endtoend/Instance.h"

#include <fmt/format.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <sstream>
#include <stdexcept>
#include <thread>

#include "foundation/Base64.h"
#include "interfaces/ClientSessionInterface.h"
#include "interfaces/DefaultsKeys.h"
#include "interfaces/EventKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "platform/PropertyList.h"

namespace telvane::testing {
namespace {

constexpr auto kPatience = std::chrono::seconds(40);
constexpr auto kStep = std::chrono::milliseconds(5);

std::string program(const std::string& name) { return std::string(TELVANE_PROGRAM_DIR) + "/" + name; }

std::string plist(const Value& value) {
  return std::string(propertylist::serialize(value, propertylist::Format::XML).value().view());
}

std::string base64(const Data& data) { return base64Encode({data.bytes(), data.size()}); }

}  // namespace

bool eventually(const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(kStep);
  }
  return true;
}

Dictionary openBag(const std::string& postURL) {
  const Dictionary client{{kClientEntryPostURL, postURL},
                          {kClientEntryOverrideDNU, 1},
                          {kClientEntryLocaleWhitelist, Array{Value("US")}},
                          {kClientEntryFilters, Array{}},
                          {kClientEntrySamplingThreshold, 1.0}};
  Dictionary section;
  section.set("splunk", Dictionary{{kProfileClients, Array{Value(client)}}});
  return {{kEnvironmentRelease, section}, {kStorebagVersion, "test-1"}, {kStorebagRefreshCycle, 3600}};
}

Instance::Instance() : _certificates(_scratch.path()), _key(crypto::PrivateKey::generate().value()) {
  std::filesystem::create_directories(_scratch.at("storebags"));
  std::filesystem::create_directories(_scratch.at("home"));
  writeBundle();
  grant("telvane-event-sender");
}

Instance::~Instance() {
  _daemon.reset();
  _collector.reset();
  const std::string reports = sanitizerReports();
  if (reports.empty()) return;
  fmt::print(stderr, "{}", reports);
  std::abort();
}

std::string Instance::sanitizerReports() const {
  std::string reports;
  for (const auto& entry : std::filesystem::directory_iterator(_scratch.path())) {
    if (entry.path().extension() != ".err") continue;
    const std::string name = entry.path().filename().string();
    const std::string written = _scratch.read(name);
    const bool hasReport =
        written.find("Sanitizer:") != std::string::npos || written.find(": runtime error: ") != std::string::npos;
    if (hasReport) reports += fmt::format("{} has a sanitizer's report:\n{}\n", name, written);
  }
  return reports;
}

void Instance::writeBundle() {
  Dictionary info;
  info.set("CFBundleIdentifier", Value("com.corvex.Telvane"));
  info.set("CFBundleVersion", Value("8.0"));
  _scratch.write("bundle/Info.plist", plist(Value(info)));
  _scratch.write("bundle/publicKey.der", _key.publicKeyDER().view());
}

void Instance::grant(const std::string& programName) {
  Dictionary granted;
  granted.set(kTelvanedEntitlement, Value(true));
  Dictionary grant;
  grant.set("executables", Array{Value(std::filesystem::weakly_canonical(program(programName)).string())});
  grant.set("entitlements", granted);
  _scratch.write("root/etc/telvane/entitlements.d/" + programName + ".plist", plist(Value(grant)));
}

std::string Instance::signedEnvelope(const Dictionary& bag) const {
  const Data inner = propertylist::serialize(Value(bag), propertylist::Format::Binary).value();
  const Data signature = _key.signSHA1({inner.bytes(), inner.size()}).value();
  return plist(Value(Dictionary{{kEnvelopeBag, base64(inner)}, {kEnvelopeSignature, base64(signature)}}));
}

void Instance::givenStorebag(const std::string& name, const Dictionary& bag) {
  givenStorebagFile(name, signedEnvelope(bag));
}

void Instance::givenStorebagFile(const std::string& name, std::string_view bytes) {
  _scratch.write("storebags/" + name, bytes);
}

void Instance::givenStorebagServer(const std::string& url) {
  _scratch.write("home/Library/Preferences/com.corvex.telvane.plist",
                 plist(Value(Dictionary{{kDefaultsStorebagURL, url}})));
}

void Instance::givenConsent(bool isGiven) {
  Dictionary consent;
  consent.set("AutoSubmit", Value(isGiven));
  _scratch.write("home/Library/Preferences/com.corvex.diagnostics.plist", plist(Value(consent)));
}

std::vector<std::string> Instance::environment() const {
  return {"TELVANE_ROOT=" + path("root"),
          "TELVANE_BUNDLE=" + path("bundle"),
          "TELVANE_CA_FILE=" + _certificates.authorityFile(),
          "HOME=" + path("home"),
          "LANG=en_US.UTF-8",
          "TZ=UTC"};
}

void Instance::startCollector(const std::vector<std::string>& record) {
  const auto server = _certificates.valid();
  std::vector<std::string> arguments{"--listen",      "127.0.0.1:0",         "--certificate", server.certificateFile,
                                     "--private-key", server.privateKeyFile, "--storebags",   path("storebags")};
  arguments.insert(arguments.end(), record.begin(), record.end());
  _collector = startProgram("telvane-collector", arguments, "collector");
  const bool isOpen = eventually([this] { return _scratch.read("collector.out").find('\n') != std::string::npos; });
  if (!isOpen) throw std::runtime_error("the collector does not start: " + _scratch.read("collector.err"));
  const std::string text = _scratch.read("collector.out");
  _collectorAddress = text.substr(0, text.find('\n'));
  givenStorebagServer(collectorURL("/storebags"));
}

void Instance::launchDaemon(const std::vector<std::string>& options) {
  _daemon.reset();
  _daemon = startProgram("telvaned", options, "daemon");
}

void Instance::startDaemon(const std::vector<std::string>& options) {
  const size_t before = daemonLog().size();
  launchDaemon(options);
  waitForDaemon(before);
}

void Instance::startDaemonAs(uid_t user, const std::vector<std::string>& options) {
  for (const char* folder : {"root", "home"}) {
    std::filesystem::create_directories(path(folder));
    for (const auto& entry : std::filesystem::recursive_directory_iterator(path(folder))) {
      if (::chown(entry.path().c_str(), user, user) != 0) throw std::runtime_error("chown needs root");
    }
    if (::chown(path(folder).c_str(), user, user) != 0) throw std::runtime_error("chown needs root");
  }
  const size_t before = daemonLog().size();
  _daemon.reset();
  _daemon = startProgramAs(user, "telvaned", options, "daemon");
  waitForDaemon(before);
}

void Instance::waitForDaemon(size_t logSizeBefore) {
  eventually([this, logSizeBefore] {
    return !_daemon->isRunning() || daemonLog().find("Listener resumes", logSizeBefore) != std::string::npos;
  });
}

std::unique_ptr<ChildProcess> Instance::startSecondDaemon() { return startProgram("telvaned", {}, "second"); }

std::unique_ptr<ChildProcess> Instance::startSender(const std::vector<std::string>& arguments) {
  std::filesystem::remove(path("sender.out"));
  return startProgram("telvane-event-sender", arguments, "sender");
}

std::unique_ptr<ChildProcess> Instance::startProgram(const std::string& programName,
                                                     const std::vector<std::string>& arguments,
                                                     const std::string& outputName) {
  std::vector<std::string> all{program(programName)};
  all.insert(all.end(), arguments.begin(), arguments.end());
  return std::make_unique<ChildProcess>(all, environment(),
                                        ChildProcess::Files{path(outputName + ".out"), path(outputName + ".err")});
}

std::unique_ptr<ChildProcess> Instance::startProgramAs(uid_t user, const std::string& programName,
                                                       const std::vector<std::string>& arguments,
                                                       const std::string& outputName) {
  ::chmod(_scratch.path().c_str(), 0755);
  const std::string name = std::to_string(user);
  std::vector<std::string> all{"/usr/bin/setpriv", "--reuid=" + name, "--regid=" + name, "--clear-groups",
                               program(programName)};
  all.insert(all.end(), arguments.begin(), arguments.end());
  return std::make_unique<ChildProcess>(all, environment(),
                                        ChildProcess::Files{path(outputName + ".out"), path(outputName + ".err")});
}

std::string Instance::sendEvents(const std::vector<std::string>& arguments) {
  startSender(arguments)->wait();
  return _scratch.read("sender.out");
}

std::vector<Dictionary> Instance::arrived() const {
  std::vector<Dictionary> events;
  std::istringstream lines(_scratch.read("events.jsonl"));
  for (std::string line; std::getline(lines, line);) {
    const auto parsed = json::parse(line);
    if (parsed.has_value() && parsed->isDictionary()) events.push_back(*parsed->dictionary());
  }
  return events;
}

std::vector<Dictionary> Instance::arrivedWithCategory(int64_t category) const {
  std::vector<Dictionary> events;
  for (const Dictionary& line : arrived()) {
    const Dictionary* event = line["event"].dictionary();
    if (event != nullptr && (*event)[kEventMethod].integerValue() == category) events.push_back(line);
  }
  return events;
}

}  // namespace telvane::testing
