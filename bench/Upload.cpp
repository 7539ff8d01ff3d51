// What it costs to upload a log file through client, daemon and collector, beside what nobody can do without: gzip of
// the same bytes, and a bare libcurl post of what comes of it. All in one run, one after the other.
//
//   telvane-bench-upload [--megabytes N] [--rounds N]
#include <sys/resource.h>

#include <chrono>
#include <cstdio>
#include <filesystem>
#include <iterator>
#include <random>
#include <stdexcept>
#include <string>
#include <string_view>

#include "bench/FigureTable.h"
#include "bench/KeptConnection.h"
#include "bench/Measurement.h"
#include "interfaces/StorebagKeys.h"
#include "tests/endtoend/Instance.h"

namespace {

using namespace telvane;
using namespace telvane::bench;

constexpr int kClientType = 7;
constexpr char kBagName[] = "conferencing";
constexpr double kBytesPerMegabyte = 1 << 20;

// Lines as a program's log has them: they compress to about a sixth.
std::string logText(size_t size) {
  static constexpr const char* kWords[] = {"connected", "retry",  "frame",  "dropped", "jitter",  "codec",
                                           "session",   "packet", "opened", "closed",  "bitrate", "timeout"};
  std::minstd_rand random(1);
  std::string text;
  text.reserve(size + 200);
  for (uint64_t line = 0; text.size() < size; ++line) {
    text += "2026-11-22T00:" + std::to_string(10 + line / 60 % 50) + ":" + std::to_string(10 + line % 50) + "." +
            std::to_string(random() % 1'000'000) + "Z call[" + std::to_string(100 + random() % 900) + "] ";
    for (int word = 0; word < 6; ++word) text += std::string(kWords[random() % std::size(kWords)]) + " ";
    text += "value=" + std::to_string(random() % 100'000) + "\n";
  }
  text.resize(size);
  return text;
}

// CPU time of processes that have ended and were waited for, in seconds.
double childrenSeconds() {
  rusage usage{};
  getrusage(RUSAGE_CHILDREN, &usage);
  const auto seconds = [](const timeval& time) { return static_cast<double>(time.tv_sec) + time.tv_usec / 1e6; };
  return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

struct Cost {
  Samples wall;  // seconds
  Samples cpu;
};

// The instance and the file; each way to send it is a method.
class UploadBench {
 public:
  explicit UploadBench(size_t bytes) : _text(logText(bytes)) {
    _instance.grant("telvanectl");
    _instance.startCollector({"--discard", "--uploads", _instance.path("uploads")});
    Dictionary bag = testing::openBag(_instance.collectorURL("/events"));
    Dictionary section = *bag[kEnvironmentRelease].dictionary();
    section.set("upload_server", Dictionary{{kProfilePostURL, _instance.collectorURL("/upload")}});
    bag.set(kEnvironmentRelease, section);
    _instance.givenStorebag(kBagName, bag);
    _instance.startDaemon({"--log-level", "default"});
    // Everything that is done once has been done then.
    writeFile("small");
    runUpload();
    _peakBefore = peak();
  }

  void measureUpload() {
    writeFile(_text);
    const double cpu = cpuMicrosecondsOf(_instance.daemon().pid());
    const double start = monotonicSeconds();
    runUpload();
    upload.wall.add(monotonicSeconds() - start);
    upload.cpu.add((cpuMicrosecondsOf(_instance.daemon().pid()) - cpu) / 1e6);
    emptyUploads();
  }
  void measureGzip() {
    writeFile(_text);
    const std::string compressed = _instance.path("compressed.gz");
    std::filesystem::remove(compressed);
    const double cpu = childrenSeconds();
    const double start = monotonicSeconds();
    testing::ChildProcess program({"/usr/bin/gzip", "-c", file()}, {"PATH=/usr/bin:/bin"},
                                  {compressed, _instance.path("gzip.err")});
    if (program.wait() != 0) throw std::runtime_error("gzip failed: " + _instance.read("gzip.err"));
    gzip.wall.add(monotonicSeconds() - start);
    gzip.cpu.add(childrenSeconds() - cpu);
    _compressed = _instance.read("compressed.gz");
  }
  void measurePost() {
    postBare(_compressed, post);
    postBare(_text, postPlain);
  }

  double peakGrowth() { return peak() - _peakBefore; }
  double peak() { return static_cast<double>(peakMemoryOf(_instance.daemon().pid())) / kBytesPerMegabyte; }
  size_t compressedSize() const { return _compressed.size(); }

  Cost upload;
  Cost gzip;
  Cost post;
  Cost postPlain;

 private:
  std::string file() const { return _instance.path("call.log"); }
  void writeFile(std::string_view content) { _instance.givenFile("call.log", content); }
  void runUpload() {
    const auto client = _instance.startProgram(
        "telvanectl", {"upload", "--client-type", std::to_string(kClientType), "--client-name", "bench", file()},
        "ctl");
    const bool isUploaded = client->wait(std::chrono::minutes(5)) == 0 && !std::filesystem::exists(file());
    if (!isUploaded) throw std::runtime_error("the upload failed: " + _instance.read("ctl.err"));
  }
  void postBare(const std::string& body, Cost& cost) {
    KeptConnection connection(_instance.collectorURL("/upload?filename=bare.gz&raw=true"), _instance.authorityFile(),
                              {"Content-Type: application/octet-stream", "Expect:"});
    const double cpu = ownCPUMicroseconds();
    const double start = monotonicSeconds();
    if (!connection.post(body)) throw std::runtime_error("the collector does not take the bare post");
    cost.wall.add(monotonicSeconds() - start);
    cost.cpu.add((ownCPUMicroseconds() - cpu) / 1e6);
    emptyUploads();
  }
  // What is stored would fill the disk, round by round.
  void emptyUploads() {
    for (const auto& entry : std::filesystem::directory_iterator(_instance.path("uploads"))) {
      std::filesystem::remove(entry.path());
    }
  }

  testing::Instance _instance;
  const std::string _text;
  std::string _compressed;
  double _peakBefore = 0;
};

void addCost(FigureTable& table, const std::string& what, const Cost& cost) {
  table.add({what + ": time", cost.wall, " s"});
  table.add({what + ": CPU", cost.cpu, " s"});
}

int measure(size_t megabytes, uint64_t rounds) {
  UploadBench bench(megabytes << 20);
  for (uint64_t round = 0; round < rounds; ++round) {
    bench.measureGzip();
    bench.measurePost();
    bench.measureUpload();
  }
  FigureTable table;
  const std::string size = std::to_string(megabytes) + " MiB";
  addCost(table, size + " through telvanectl and daemon (CPU: the daemon's)", bench.upload);
  addCost(table, "gzip of the same", bench.gzip);
  addCost(table, "bare post of what gzip made", bench.post);
  addCost(table, "bare post of the same, not compressed", bench.postPlain);
  Samples ratio;
  ratio.add(bench.upload.wall.median() / (bench.gzip.wall.median() + bench.post.wall.median()));
  table.add({"upload: time against gzip and bare post", ratio, ""});
  Samples peak;
  peak.add(bench.peak());
  table.add({"daemon: peak memory", peak, " MB", 1});
  Samples growth;
  growth.add(bench.peakGrowth());
  table.add({"daemon: of it since a small upload", growth, " MB", 1});
  table.addNote("compressed size: " + std::to_string(bench.compressedSize() >> 10) + " KiB");
  std::fputs(table.text().c_str(), stdout);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  try {
    return measure(numberOption(argc, argv, "megabytes", 100), numberOption(argc, argv, "rounds", 3));
  } catch (const std::exception& failure) {
    std::fprintf(stderr, "telvane-bench-upload: %s\n", failure.what());
    return 1;
  }
}
