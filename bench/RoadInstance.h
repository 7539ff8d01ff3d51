#pragma once

#include <sys/types.h>

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "bench/KeptConnection.h"
#include "bench/RoadBag.h"
#include "foundation/Value.h"
#include "tests/endtoend/Instance.h"

namespace telvane::bench {

// A whole Telvane for measurements, in a scratch root of its own: a collector that counts and drops, a daemon, and the
// programs that send. Whatever does not start, ends badly or loses an event throws std::runtime_error with the reason.
class RoadInstance {
 public:
  // A program that was started, with the name of its output.
  struct Running {
    std::unique_ptr<testing::ChildProcess> process;
    std::string outputName;
  };

  RoadInstance();

  std::string collectorURL(const std::string& path) const { return _instance.collectorURL(path); }
  const std::string& authorityFile() const noexcept { return _instance.authorityFile(); }
  testing::TestCertificates::Server serverCertificate() { return _instance.serverCertificate(); }
  // Publishes a bag for the client type. postURL: the collector's by default.
  void givenBag(int clientType, BagRules rules, const std::optional<std::string>& postURL = std::nullopt);

  // Starts a daemon that knows nothing yet; returns when it accepts.
  void startDaemon(std::string_view logLevel);
  // Ends it in good order.
  void endDaemon();
  pid_t daemonPID() { return _instance.daemon().pid(); }

  // Starts a program of ours.
  Running start(const std::string& program, const std::vector<std::string>& arguments,
                const std::optional<std::string>& outputName = std::nullopt);
  // Waits until its output has this line.
  void waitForLine(const Running& running, const std::string& line);
  // Its first line, waited for.
  std::string firstLine(const Running& running);
  // Waits for its end and returns the figures that stand, as JSON, in its last line.
  Dictionary finish(Running& running);
  Dictionary run(const std::string& program, const std::vector<std::string>& arguments);

  // Waits until the collector has so many events more than were waited for before. Throws when it stands still, and
  // when there are too many.
  void waitForEvents(uint64_t count);
  // The bytes that the collector has been posted so far.
  uint64_t collectedBytes() { return statistics()["bytes"].unsignedValue(); }
  // All events that were waited for, and what the collector had counted when it was last asked.
  uint64_t expectedEvents() const noexcept { return _expected; }
  uint64_t arrivedEvents() const noexcept { return _arrived; }

 private:
  Dictionary statistics();

  testing::Instance _instance;
  std::optional<KeptConnection> _collector;
  uint64_t _expected = 0;
  uint64_t _arrived = 0;
};

}  // namespace telvane::bench
