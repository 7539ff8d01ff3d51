// Reports metrics of its own process, every second: how much it computes, what it holds, how often it was interrupted.
// A program of yours would put its own figures in their place.
//
//   report-metrics [--seconds N] [--report-every TICKS] [--client-type N]
//
// One event per report: {"process": {...}, "samples": [...]}. By default a report is made with every tick, that is each
// second; with --report-every 5 the modules are only called to update themselves four times before each report.
// It reports as client type 28: for all others the daemon leaves dictionaries and arrays out of an event, that is
// everything here.
// Exits with 0 when the daemon has taken everything, with 1 when it could not be reached, with 2 on wrong usage.

#include <telvane/Telvane.h>
#include <telvane/TelvaneConstants.h>

#include <dirent.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdlib>
#include <fstream>
#include <future>
#include <iostream>
#include <memory>
#include <string>
#include <thread>

namespace {

using telvane::Array;
using telvane::Dictionary;
using telvane::Error;
using telvane::Telvane;
using telvane::Value;

constexpr uint16_t kCategory = 20;
constexpr uint16_t kType = 1;
constexpr uint32_t kIntervalInSeconds = 1;
constexpr std::chrono::seconds kPatience{30};
enum Module : uint32_t { kUsageModule = 1, kResourcesModule = 2 };

struct Options {
  int seconds = 10;
  int reportEvery = 1;
  int clientType = 28;  // the one whose dictionaries and arrays are posted
};

// What the kernel tells of this process.
struct Usage {
  double userSeconds = 0;
  double systemSeconds = 0;
  long voluntarySwitches = 0;
  long involuntarySwitches = 0;
};

double seconds(const timeval& time) {
  return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
}

Usage usageOfThisProcess() {
  rusage usage{};
  ::getrusage(RUSAGE_SELF, &usage);
  return {seconds(usage.ru_utime), seconds(usage.ru_stime), usage.ru_nvcsw, usage.ru_nivcsw};
}

long residentKilobytes() {
  std::ifstream statm("/proc/self/statm");
  long size = 0;
  long resident = 0;
  statm >> size >> resident;
  return resident * (::sysconf(_SC_PAGESIZE) / 1024);
}

long entriesOf(const char* folder) {
  DIR* entries = ::opendir(folder);
  if (entries == nullptr) return 0;
  long count = 0;
  while (const dirent* entry = ::readdir(entries)) count += entry->d_name[0] != '.' ? 1 : 0;
  ::closedir(entries);
  return count;
}

// A module keeps what it needs between two calls. It is called on a thread of the library: with null to update its
// state, with an empty dictionary to report. Two modules never share state here; if yours do, they need a lock.
//
// This one reports what was used since the report before. It needs no updates.
class UsageModule {
 public:
  void operator()(Dictionary* metrics) {
    if (metrics == nullptr) return;
    const Usage now = usageOfThisProcess();
    Dictionary process;
    process.set("user", now.userSeconds - _before.userSeconds);
    process.set("system", now.systemSeconds - _before.systemSeconds);
    process.set("voluntarySwitches", now.voluntarySwitches - _before.voluntarySwitches);
    process.set("involuntarySwitches", now.involuntarySwitches - _before.involuntarySwitches);
    metrics->set("process", process);
    _before = now;
  }

 private:
  Usage _before = usageOfThisProcess();
};

// This one looks with every tick, and reports the peak and all it has seen. Both write into "process": what modules
// report under equal keys is merged.
class ResourcesModule {
 public:
  void operator()(Dictionary* metrics) {
    const long resident = residentKilobytes();
    _peak = std::max(_peak, resident);
    _samples.append(resident);
    if (metrics == nullptr) return;
    Dictionary process;
    process.set("residentKilobytes", resident);
    process.set("peakKilobytes", _peak);
    process.set("descriptors", entriesOf("/proc/self/fd") - 1);  // without the one that looks
    process.set("threads", entriesOf("/proc/self/task"));
    metrics->set("process", process);
    metrics->set("samples", _samples);
    _samples = Array();
  }

 private:
  long _peak = 0;
  Array _samples;
};

std::shared_ptr<Telvane> openSession(int clientType) {
  Dictionary sessionInfo;
  sessionInfo.set(kTelvaneSessionInfoClientType, clientType);
  sessionInfo.set(kTelvaneSessionInfoSessionID, 3);
  sessionInfo.set(kTelvaneSessionInfoBatchEvent, true);
  Dictionary userInfo;
  userInfo.set(kTelvaneUserInfoClientName, "example-metrics");
  userInfo.set(kTelvaneUserInfoServiceName, "demo");
  return Telvane::initWithSessionInfo(sessionInfo, userInfo);
}

// Completions run on threads of the library; a promise brings their answer here.
bool configure(Telvane& session) {
  auto promise = std::make_shared<std::promise<void>>();
  std::future<void> isConfigured = promise->get_future();
  session.startConfigurationWithCompletionHandler([promise](const Value&) { promise->set_value(); });
  return isConfigured.wait_for(kPatience) == std::future_status::ready;
}

// Reports do not wait in the daemon, so there may be nothing left for it to send, which is no failure.
bool flush(Telvane& session) {
  auto promise = std::make_shared<std::promise<bool>>();
  std::future<bool> isFlushed = promise->get_future();
  session.flushMessagesWithCompletion([promise](const std::optional<Error>& error) {
    promise->set_value(!error.has_value() || error->description() == "Nothing to flush");
  });
  return isFlushed.wait_for(kPatience) == std::future_status::ready && isFlushed.get();
}

// Hears of every message that is sent, and says what is in it.
class Printer final : public telvane::TelvaneMessageSentDelegate {
 public:
  void didSendMessageForReportingClient(const std::shared_ptr<Telvane>&, const Dictionary& event) override {
    const Value& payload = event[kTelvaneMessageParametersPayload];
    const Value& process = payload.isDictionary() ? (*payload.dictionary())["process"] : Value::none();
    if (!process.isDictionary()) return;
    const Dictionary& figures = *process.dictionary();
    std::cout << "report " << ++_count << ": " << figures["user"].realValue() + figures["system"].realValue()
              << " s of CPU, " << figures["residentKilobytes"].integerValue() << " KiB resident, "
              << figures["voluntarySwitches"].integerValue() << " switches, " << figures["descriptors"].integerValue()
              << " descriptors\n"
              << std::flush;
  }
  int count() const { return _count; }

 private:
  std::atomic<int> _count = 0;
};

void reportFor(Telvane& session, const Options& options) {
  session.registerPeriodicTaskForModule(kUsageModule, false, true, UsageModule());
  session.registerPeriodicTaskForModule(kResourcesModule, true, true, ResourcesModule());
  session.startLogTimerWithInterval(kIntervalInSeconds, static_cast<uint32_t>(options.reportEvery), kCategory, kType);

  // What this program is there for would happen here. The first tick comes at once, so the time ends between two.
  std::this_thread::sleep_for(std::chrono::seconds(options.seconds) - std::chrono::milliseconds(500));

  session.stopLogTimer();
  // These wait: when they return, no module runs or is called any more.
  session.unregisterPeriodTaskForModule(kUsageModule);
  session.unregisterPeriodTaskForModule(kResourcesModule);
}

bool readNumber(const char* text, int least, int most, int& number) {
  char* end = nullptr;
  const long value = std::strtol(text, &end, 10);
  if (end == text || *end != '\0' || value < least || value > most) return false;
  number = static_cast<int>(value);
  return true;
}

bool readOptions(int argc, char** argv, Options& options) {
  for (int i = 1; i + 1 < argc; i += 2) {
    const std::string name = argv[i];
    bool isRead = false;
    if (name == "--seconds") isRead = readNumber(argv[i + 1], 1, 1'000'000, options.seconds);
    if (name == "--report-every") isRead = readNumber(argv[i + 1], 1, 1'000'000, options.reportEvery);
    if (name == "--client-type") isRead = readNumber(argv[i + 1], 0, 100, options.clientType);
    if (!isRead) return false;
  }
  return argc % 2 == 1;
}

}  // namespace

int main(int argc, char** argv) {
  Options options;
  if (!readOptions(argc, argv, options)) {
    std::cerr << "usage: " << argv[0] << " [--seconds N] [--report-every TICKS] [--client-type N]\n";
    return 2;
  }
  std::shared_ptr<Telvane> session = openSession(options.clientType);
  if (session == nullptr) {
    std::cerr << "no session: the client type must be 5 to 30, and the daemon within reach\n";
    return 1;
  }
  if (!configure(*session)) {
    std::cerr << "no configuration: is telvaned running?\n";
    return 1;
  }
  std::cout << "configured, reports metrics for " << options.seconds << " s\n" << std::flush;

  const auto printer = std::make_shared<Printer>();
  session->setMessageSentDelegate(printer);
  reportFor(*session, options);

  const bool isFlushed = flush(*session);
  session.reset();
  std::cout << "made " << printer->count() << " reports" << (isFlushed ? ", flushed" : ", and the flush failed")
            << "\n";
  return isFlushed ? 0 : 1;
}
