// The least that any agent has to do for an event, in one thread: write it as JSON, compress it in batches of 50, post
// the batches over one kept TLS connection. What the daemon costs more than this is what the daemon costs.
#include <curl/curl.h>
#include <zlib.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "bench/BenchEvent.h"
#include "bench/Measurement.h"
#include "platform/JSON.h"

namespace {

using namespace telvane;

constexpr uint64_t kBatch = 50;

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

size_t swallow(char*, size_t size, size_t count, void*) { return size * count; }

class Poster {
 public:
  Poster(const std::string& url, const std::string& ca) : _curl(curl_easy_init()) {
    _headers = curl_slist_append(_headers, "Content-Type: application/json");
    _headers = curl_slist_append(_headers, "Content-Encoding: gzip");
    _headers = curl_slist_append(_headers, "Expect:");
    curl_easy_setopt(_curl, CURLOPT_URL, url.c_str());
    curl_easy_setopt(_curl, CURLOPT_CAINFO, ca.c_str());
    curl_easy_setopt(_curl, CURLOPT_HTTPHEADER, _headers);
    curl_easy_setopt(_curl, CURLOPT_WRITEFUNCTION, swallow);
    curl_easy_setopt(_curl, CURLOPT_NOSIGNAL, 1L);
  }
  ~Poster() {
    curl_slist_free_all(_headers);
    curl_easy_cleanup(_curl);
  }
  bool post(const std::string& body) {
    curl_easy_setopt(_curl, CURLOPT_POSTFIELDSIZE, static_cast<long>(body.size()));
    curl_easy_setopt(_curl, CURLOPT_POSTFIELDS, body.data());
    long status = 0;
    return curl_easy_perform(_curl) == CURLE_OK &&
           curl_easy_getinfo(_curl, CURLINFO_RESPONSE_CODE, &status) == CURLE_OK && status == 200;
  }

 private:
  CURL* _curl;
  curl_slist* _headers = nullptr;
};

}  // namespace

int main(int argc, char** argv) {
  const uint64_t events = std::strtoull(bench::option(argc, argv, "events", "200000").c_str(), nullptr, 10);
  curl_global_init(CURL_GLOBAL_DEFAULT);
  Poster poster(bench::option(argc, argv, "url", ""), bench::option(argc, argv, "ca", ""));
  uint64_t bytes = 0;
  double making = 0;
  const double startCPU = bench::ownCPUMicroseconds();
  const double start = bench::monotonicSeconds();
  std::vector<Value> made;
  std::string json;
  constexpr uint64_t kMadeAtOnce = 5000;
  for (uint64_t i = 0; i < events;) {
    // The events themselves come from outside in real life.
    const double before = bench::threadCPUMicroseconds();
    made.clear();
    for (uint64_t n = 0; n < kMadeAtOnce && i < events; ++n, ++i) made.push_back(annotate(bench::makePayload(i), i));
    making += bench::threadCPUMicroseconds() - before;
    for (size_t first = 0; first < made.size(); first += kBatch) {
      json = R"({"postTime":1795000000.123456,"clientId":"0E0C2D29-61B5-4E58-9C4B-6B41E3B1D7C5","events":[)";
      for (size_t n = first; n < std::min(first + kBatch, made.size()); ++n) {
        if (n > first) json += ',';
        if (!json::append(made[n], json::Style::Compact, json).has_value()) return EXIT_FAILURE;
      }
      json += "]}";
      const std::string body = gzip(json);
      bytes += body.size();
      if (!poster.post(body)) {
        std::fprintf(stderr, "ceiling: the collector did not take a batch\n");
        return EXIT_FAILURE;
      }
    }
  }
  const double cpu = bench::ownCPUMicroseconds() - startCPU - making;
  std::printf("{\"seconds\": %.6f, \"cpuMicroseconds\": %.1f, \"bytes\": %llu}\n", bench::monotonicSeconds() - start,
              cpu, static_cast<unsigned long long>(bytes));
  return EXIT_SUCCESS;
}
