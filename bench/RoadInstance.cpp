#include "bench/RoadInstance.h"

#include <curl/curl.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <functional>
#include <stdexcept>
#include <thread>

#include "foundation/Base64.h"
#include "interfaces/StorebagKeys.h"
#include "platform/Crypto.h"
#include "platform/JSON.h"
#include "platform/PropertyList.h"

namespace telvane::bench {
namespace {

constexpr auto kPatience = std::chrono::seconds(20);

void waitUntil(const std::string& what, const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) throw std::runtime_error("gave up waiting for " + what);
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
}

std::vector<char*> pointers(const std::vector<std::string>& texts) {
  std::vector<char*> result;
  for (const std::string& text : texts) result.push_back(const_cast<char*>(text.c_str()));
  result.push_back(nullptr);
  return result;
}

size_t collect(char* bytes, size_t size, size_t count, void* text) {
  static_cast<std::string*>(text)->append(bytes, size * count);
  return size * count;
}

std::string plist(const Value& value) {
  return std::string(propertylist::serialize(value, propertylist::Format::XML).value().view());
}

// One HTTPS backend that takes everything. Consent is overridden, as in a bag for a fleet that has agreed by contract;
// with it no event text is kept on the device.
Dictionary makeBag(const std::string& postURL) {
  const Dictionary client{{kClientEntryPostURL, postURL},
                          {kClientEntryOverrideDNU, 1},
                          {kClientEntryLocaleWhitelist, Array{Value("US")}},
                          {kClientEntryFilters, Array{}},
                          {kClientEntrySamplingThreshold, 1.0}};
  Dictionary section;
  section.set("splunk", Dictionary{{kProfileClients, Array{Value(client)}}});
  return {{kEnvironmentRelease, section}, {kStorebagVersion, "bench-1"}, {kStorebagRefreshCycle, 3600}};
}

}  // namespace

Child::Child(const std::vector<std::string>& arguments, const std::vector<std::string>& environment,
             const std::string& outputFile)
    : _pid(fork()) {
  if (_pid != 0) return;
  const int output = open(outputFile.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_APPEND, 0600);
  dup2(output, STDOUT_FILENO);
  execve(arguments[0].c_str(), pointers(arguments).data(), pointers(environment).data());
  _exit(127);
}

Child::~Child() {
  if (_pid <= 0) return;
  terminate();
  wait();
}

int Child::wait() {
  int status = 0;
  waitpid(std::exchange(_pid, -1), &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

void Child::terminate() { kill(_pid, SIGTERM); }

RoadInstance::RoadInstance(std::string programs, const std::string& daemonLogLevel)
    : _programs(std::move(programs)), _certificates(_scratch.path()) {
  startCollector();
  writeConfiguration();
  startDaemon(daemonLogLevel);
}

RoadInstance::~RoadInstance() = default;

std::vector<std::string> RoadInstance::environment() const {
  return {"TELVANE_ROOT=" + _scratch.at("root"),
          "TELVANE_BUNDLE=" + _scratch.at("bundle"),
          "TELVANE_CA_FILE=" + _certificates.authorityFile(),
          "HOME=" + _scratch.at("home"),
          "LANG=en_US.UTF-8",
          "PATH=/usr/bin:/bin"};
}

void RoadInstance::startCollector() {
  const auto server = _certificates.valid();
  std::filesystem::create_directories(_scratch.at("storebags"));
  _collector = std::make_unique<Child>(
      std::vector<std::string>{_programs + "/telvane-collector", "--listen", "127.0.0.1:0", "--certificate",
                               server.certificateFile, "--private-key", server.privateKeyFile, "--storebags",
                               _scratch.at("storebags"), "--discard"},
      environment(), _scratch.at("collector.out"));
  waitUntil("the collector's address", [this] {
    const std::string text = _scratch.read("collector.out");
    const size_t end = text.find('\n');
    if (end == std::string::npos) return false;
    const size_t start = text.substr(0, end).find_last_of(' ');
    _collectorAddress =
        text.substr(start == std::string::npos ? 0 : start + 1, end - (start == std::string::npos ? 0 : start + 1));
    return true;
  });
}

void RoadInstance::writeConfiguration() {
  const auto key = crypto::PrivateKey::generate().value();
  const Data bag =
      propertylist::serialize(Value(makeBag(collectorURL("/events"))), propertylist::Format::Binary).value();
  const Data signature = key.signSHA1({bag.bytes(), bag.size()}).value();
  const Dictionary envelope{{kEnvelopeBag, base64Encode({bag.bytes(), bag.size()})},
                            {kEnvelopeSignature, base64Encode({signature.bytes(), signature.size()})}};
  _scratch.write("storebags/conferencing", plist(Value(envelope)));
  _scratch.write("bundle/publicKey.der", std::string(key.publicKeyDER().view()));
  Dictionary info;
  info.set("CFBundleVersion", Value("1.0.0"));
  _scratch.write("bundle/Info.plist", plist(Value(info)));
  Dictionary granted;
  granted.set("com.corvex.private.telvaned", Value(true));
  Dictionary grant;
  grant.set("executables", Array{Value(std::filesystem::canonical(_programs + "/telvane-road-client").string())});
  grant.set("entitlements", granted);
  _scratch.write("root/etc/telvane/entitlements.d/bench.plist", plist(Value(grant)));
  Dictionary defaults;
  defaults.set("telvane_storebag_url", Value(collectorURL("/storebags")));
  _scratch.write("home/Library/Preferences/com.corvex.telvane.plist", plist(Value(defaults)));
}

void RoadInstance::startDaemon(const std::string& logLevel) {
  _daemon = std::make_unique<Child>(
      std::vector<std::string>{_programs + "/telvaned", "--log-level", logLevel, "--log-target", "stderr"},
      environment(), _scratch.at("daemon.out"));
  waitUntil("the daemon's socket",
            [this] { return std::filesystem::exists(_scratch.at("root/run/telvane/com.corvex.telvaned.socket")); });
}

uint64_t RoadInstance::collected(const std::string& name) const {
  std::string text;
  CURL* curl = curl_easy_init();
  curl_easy_setopt(curl, CURLOPT_URL, collectorURL("/statistics").c_str());
  curl_easy_setopt(curl, CURLOPT_CAINFO, authorityFile().c_str());
  curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, collect);
  curl_easy_setopt(curl, CURLOPT_WRITEDATA, &text);
  const CURLcode code = curl_easy_perform(curl);
  curl_easy_cleanup(curl);
  if (code != CURLE_OK)
    throw std::runtime_error("the collector does not answer: " + std::string(curl_easy_strerror(code)));
  const auto parsed = json::parse(text);
  if (parsed.has_error() || !parsed->isDictionary()) throw std::runtime_error("the collector answers: " + text);
  return (*parsed->dictionary())[name].unsignedValue();
}

std::string RoadInstance::run(const std::string& program, const std::vector<std::string>& arguments) const {
  std::vector<std::string> line{_programs + "/" + program};
  line.insert(line.end(), arguments.begin(), arguments.end());
  Child child(line, environment(), _scratch.at(program + ".out"));
  if (const int status = child.wait(); status != 0) {
    throw std::runtime_error(program + " ended with " + std::to_string(status));
  }
  return _scratch.read(program + ".out");
}

}  // namespace telvane::bench
