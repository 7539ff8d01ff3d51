#include "bench/RoadInstance.h"

#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <functional>
#include <stdexcept>
#include <thread>

#include "bench/Measurement.h"
#include "interfaces/ClientTypes.h"
#include "platform/JSON.h"

namespace telvane::bench {
namespace {

constexpr auto kEndPatience = std::chrono::seconds(40);
constexpr auto kRunPatience = std::chrono::minutes(10);
constexpr double kStandstillSeconds = 10;

void waitUntil(const std::string& what, const std::function<bool()>& condition) {
  if (!testing::eventually(condition)) throw std::runtime_error("gave up waiting for " + what);
}

// Whether somebody takes connections on the socket. At its quietest a daemon says nothing of having started.
bool isAccepting(const std::string& socketPath) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (socketPath.size() >= sizeof(address.sun_path)) throw std::runtime_error("too long for a socket: " + socketPath);
  socketPath.copy(address.sun_path, socketPath.size());
  const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const bool isOpen = connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0;
  close(descriptor);
  return isOpen;
}

Dictionary parseFigures(std::string_view text) {
  const auto parsed = json::parse(text);
  if (parsed.has_error() || !parsed->isDictionary()) throw std::runtime_error("no figures in: " + std::string(text));
  return *parsed->dictionary();
}

std::string_view lastLine(std::string_view text) {
  while (text.ends_with('\n')) text.remove_suffix(1);
  return text.substr(text.rfind('\n') + 1);
}

}  // namespace

RoadInstance::RoadInstance() {
  _instance.startCollector({"--discard"});
  _collector.emplace(collectorURL("/statistics"), authorityFile(), std::vector<std::string>{});
  for (const char* program : {"telvane-road-client", "telvane-road-realtime"}) _instance.grant(program);
}

void RoadInstance::givenBag(int type, BagRules rules, const std::optional<std::string>& postURL) {
  const std::string name(clientType(type)->storebagName);
  _instance.givenStorebag(name, roadBag(rules, postURL.value_or(collectorURL("/events"))));
}

void RoadInstance::startDaemon(std::string_view logLevel) {
  // At its usual level a log of many runs would fill a disk.
  _instance.givenFile("daemon.err", "");
  _instance.launchDaemon({"--log-level", std::string(logLevel)});
  waitUntil("the daemon", [this] {
    if (!_instance.daemon().isRunning()) throw std::runtime_error("the daemon ended: " + _instance.daemonLog());
    return isAccepting(_instance.socketPath());
  });
}

void RoadInstance::endDaemon() {
  _instance.daemon().signal(SIGTERM);
  const int status = _instance.daemon().wait(kEndPatience);
  if (status != 0) throw std::runtime_error("the daemon ended with " + std::to_string(status));
  // What it still had has been posted by now; nothing may have come twice.
  waitForEvents(0);
}

RoadInstance::Running RoadInstance::start(const std::string& program, const std::vector<std::string>& arguments,
                                          const std::optional<std::string>& outputName) {
  const std::string name = outputName.value_or(program);
  // What an earlier run printed under the name is gone.
  _instance.givenFile(name + ".out", "");
  _instance.givenFile(name + ".err", "");
  return {_instance.startProgram(program, arguments, name), name};
}

void RoadInstance::waitForLine(const Running& running, const std::string& line) {
  waitUntil("\"" + line + "\" of " + running.outputName, [&] {
    const std::string output = "\n" + _instance.read(running.outputName + ".out");
    if (output.find("\n" + line + "\n") != std::string::npos) return true;
    if (!running.process->isRunning()) throw std::runtime_error(_instance.read(running.outputName + ".err"));
    return false;
  });
}

std::string RoadInstance::firstLine(const Running& running) {
  std::string output;
  waitUntil("the first line of " + running.outputName, [&] {
    output = _instance.read(running.outputName + ".out");
    return output.find('\n') != std::string::npos;
  });
  return output.substr(0, output.find('\n'));
}

Dictionary RoadInstance::finish(Running& running) {
  if (const int status = running.process->wait(kRunPatience); status != 0) {
    throw std::runtime_error(running.outputName + " ended with " + std::to_string(status) + ": " +
                             _instance.read(running.outputName + ".err"));
  }
  return parseFigures(lastLine(_instance.read(running.outputName + ".out")));
}

Dictionary RoadInstance::run(const std::string& program, const std::vector<std::string>& arguments) {
  Running running = start(program, arguments);
  return finish(running);
}

void RoadInstance::waitForEvents(uint64_t count) {
  _expected += count;
  uint64_t last = _arrived;
  double lastChange = monotonicSeconds();
  for (;;) {
    _arrived = statistics()["events"].unsignedValue();
    const std::string counts = std::to_string(_arrived) + " of " + std::to_string(_expected);
    if (_arrived > _expected) throw std::runtime_error("more events came than were sent: " + counts);
    if (_arrived == _expected) return;
    if (_arrived != last) lastChange = monotonicSeconds();
    last = _arrived;
    if (monotonicSeconds() - lastChange > kStandstillSeconds) throw std::runtime_error("events were lost: " + counts);
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
}

Dictionary RoadInstance::statistics() {
  const std::optional<std::string> answer = _collector->get();
  if (!answer.has_value()) throw std::runtime_error("the collector does not answer");
  return parseFigures(*answer);
}

}  // namespace telvane::bench
