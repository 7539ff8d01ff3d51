// The least that any agent has to do for an event, in one thread: write it as JSON, compress it in batches of 50, post
// the batches over one kept TLS connection. What the daemon costs more than this is what the daemon costs.
//
//   telvane-ceiling --url URL --ca FILE [--events N]
#include <curl/curl.h>
#include <unistd.h>
#include <zlib.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <stdexcept>
#include <string>
#include <vector>

#include "bench/BenchEvent.h"
#include "bench/InstructionCounter.h"
#include "bench/KeptConnection.h"
#include "bench/Measurement.h"
#include "platform/JSON.h"

namespace {

using namespace telvane;

constexpr uint64_t kBatch = 50;
constexpr uint64_t kMadeAtOnce = 5000;

// The event as the collector receives it: the client's fields with what the daemon sets beside them.
Dictionary annotate(Dictionary event, uint64_t i) {
  const double now = 1795000000.0 + static_cast<double>(i) / 1e4;
  event.reserve(28);
  event.set("_startTS", Value(1795000000));
  event.set("_sender", Value(String::fromStatic("CONFERENCE")));
  event.set("_clientVersion", Value(1));
  event.set("_sessionID", Value(String::fromStatic("c2Vzc2lvbiBpZGVudGlmaQ==")));
  event.set("_eventNumber", Value(i & 0xffff));
  event.set("_method", Value(11));
  event.set("_status", Value(1));
  event.set("_clientTS", Value(now));
  event.set("eventTime", Value(now));
  event.set("_productFamily", Value(String::fromStatic("bench")));
  event.set("_productModel", Value(String::fromStatic("bench1,1")));
  event.set("_osVersion", Value(String::fromStatic("12")));
  event.set("_build", Value(String::fromStatic("12A1")));
  event.set("_internal", Value(0));
  event.set("_reportVers", Value(String::fromStatic("1.0")));
  event.set("_timezoneOffset", Value(0));
  event.set("_clientName", Value(String::fromStatic("bench")));
  event.set("_serviceName", Value(String::fromStatic("road")));
  return event;
}

std::string gzip(const std::string& text) {
  z_stream stream{};
  deflateInit2(&stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, 31, 8, Z_DEFAULT_STRATEGY);
  std::string out(deflateBound(&stream, text.size()), '\0');
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(text.data()));
  stream.avail_in = static_cast<uInt>(text.size());
  stream.next_out = reinterpret_cast<Bytef*>(out.data());
  stream.avail_out = static_cast<uInt>(out.size());
  deflate(&stream, Z_FINISH);
  out.resize(stream.total_out);
  deflateEnd(&stream);
  return out;
}

// The body of one post.
void writeBatch(const std::vector<Value>& events, size_t first, std::string& text) {
  text = R"({"postTime":1795000000.123456,"clientId":"0E0C2D29-61B5-4E58-9C4B-6B41E3B1D7C5","events":[)";
  for (size_t n = first; n < std::min<size_t>(first + kBatch, events.size()); ++n) {
    if (n > first) text += ',';
    if (json::append(events[n], json::Style::Compact, text).has_error()) throw std::runtime_error("no JSON");
  }
  text += "]}";
}

// What has been spent so far by a process of one thread.
struct Spent {
  double microseconds = 0;
  double instructions = 0;

  static Spent now(const bench::InstructionCounter& counter) {
    return {bench::ownCPUMicroseconds(), static_cast<double>(counter.count().value_or(0))};
  }
  void addSince(const Spent& before, const Spent& after) {
    microseconds += after.microseconds - before.microseconds;
    instructions += after.instructions - before.instructions;
  }
};

struct Totals {
  Spent spent;
  uint64_t bytes = 0;
};

// Makes the events (they come from outside in real life, so that is not counted), and sends them.
Totals send(uint64_t events, bench::KeptConnection& connection) {
  const bench::InstructionCounter counter(getpid());
  Totals totals;
  std::vector<Value> made;
  std::string text;
  for (uint64_t sent = 0; sent < events;) {
    made.clear();
    const uint64_t end = std::min(sent + kMadeAtOnce, events);
    for (; sent < end; ++sent) made.push_back(annotate(bench::makePayload(sent), sent));
    const Spent before = Spent::now(counter);
    for (size_t first = 0; first < made.size(); first += kBatch) {
      writeBatch(made, first, text);
      const std::string body = gzip(text);
      totals.bytes += body.size();
      if (!connection.post(body)) throw std::runtime_error("the collector did not take a batch");
    }
    totals.spent.addSince(before, Spent::now(counter));
  }
  return totals;
}

void run(int argc, char** argv) {
  bench::KeptConnection connection(bench::option(argc, argv, "url", ""), bench::option(argc, argv, "ca", ""),
                                   {"Content-Type: application/json", "Content-Encoding: gzip", "Expect:"});
  const double start = bench::monotonicSeconds();
  const Totals totals = send(bench::numberOption(argc, argv, "events", 200000), connection);
  std::printf("{\"seconds\": %.6f, \"cpuMicroseconds\": %.1f, \"instructions\": %.0f, \"bytes\": %llu}\n",
              bench::monotonicSeconds() - start, totals.spent.microseconds, totals.spent.instructions,
              static_cast<unsigned long long>(totals.bytes));
}

}  // namespace

int main(int argc, char** argv) {
  curl_global_init(CURL_GLOBAL_DEFAULT);
  try {
    run(argc, argv);
    return EXIT_SUCCESS;
  } catch (const std::exception& error) {
    std::fprintf(stderr, "telvane-ceiling: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
