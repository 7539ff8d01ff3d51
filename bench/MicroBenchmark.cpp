// The stations of an event, one by one.
#include <benchmark/benchmark.h>

#include "bench/BenchEvent.h"
#include "platform/Compression.h"
#include "platform/JSON.h"
#include "platform/dispatch/ThreadedDispatch.h"

namespace telvane::bench {
namespace {

void copyValue(benchmark::State& state) {
  const Value payload(makePayload(1));
  for (auto _ : state) {
    Value copy = payload;
    benchmark::DoNotOptimize(copy);
  }
}
BENCHMARK(copyValue);

void copyAndChangeDictionary(benchmark::State& state) {
  const Dictionary payload = makePayload(1);
  for (auto _ : state) {
    Dictionary copy = payload;
    copy.set("sequence", Value(2));
    benchmark::DoNotOptimize(copy);
  }
}
BENCHMARK(copyAndChangeDictionary);

void eventToJSON(benchmark::State& state) {
  const Value payload(makePayload(1));
  std::string buffer;
  for (auto _ : state) {
    buffer.clear();
    benchmark::DoNotOptimize(json::append(payload, json::Style::Compact, buffer).has_value());
  }
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * static_cast<int64_t>(buffer.size())));
}
BENCHMARK(eventToJSON);

void gzipBatchOf50(benchmark::State& state) {
  std::string text;
  for (uint64_t i = 0; i < 50; ++i) {
    if (json::append(Value(makePayload(i)), json::Style::Compact, text).has_error()) state.SkipWithError("no JSON");
  }
  for (auto _ : state) benchmark::DoNotOptimize(compression::deflate(compression::Framing::Gzip, text).has_value());
  state.SetItemsProcessed(state.iterations() * 50);
}
BENCHMARK(gzipBatchOf50);

void serialQueueSyncWhenIdle(benchmark::State& state) {
  ThreadedDispatch dispatch;
  const auto queue = dispatch.newSerialQueue("bench", QualityOfService::Default);
  int64_t count = 0;
  for (auto _ : state) queue->sync([&count] { ++count; });
  benchmark::DoNotOptimize(count);
}
BENCHMARK(serialQueueSyncWhenIdle);

void serialQueueAsync(benchmark::State& state) {
  ThreadedDispatch dispatch;
  const auto queue = dispatch.newSerialQueue("bench", QualityOfService::Default);
  std::atomic<int64_t> count{0};
  for (auto _ : state) queue->async([&count] { count.fetch_add(1, std::memory_order_relaxed); });
  queue->sync([] {});
  benchmark::DoNotOptimize(count.load());
}
BENCHMARK(serialQueueAsync);

}  // namespace
}  // namespace telvane::bench
