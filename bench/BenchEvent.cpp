#include "bench/BenchEvent.h"

#include <array>
#include <string>

namespace telvane::bench {
namespace {

constexpr std::array<std::string_view, 5> kCodecs = {"opus", "aac-eld", "amr-wb", "pcm", "evs"};
constexpr std::array<std::string_view, 3> kNetworks = {"wifi", "cellular", "ethernet"};

// A cheap scrambling of the event's number, so that values do not compress like a counter.
uint64_t scramble(uint64_t i) {
  i ^= i >> 33;
  i *= 0xff51afd7ed558ccdULL;
  i ^= i >> 33;
  return i;
}

}  // namespace

Dictionary makePayload(uint64_t i) {
  const uint64_t chance = scramble(i + 1);
  Dictionary payload;
  payload.reserve(10);
  payload.set("callID", Value("call-" + std::to_string(chance % 100000)));
  payload.set("codec", Value(String::fromStatic(kCodecs[chance % kCodecs.size()])));
  payload.set("network", Value(String::fromStatic(kNetworks[(chance >> 8) % kNetworks.size()])));
  payload.set("packetsSent", Value(chance >> 44));
  payload.set("packetsLost", Value((chance >> 20) % 97));
  payload.set("roundTripMilliseconds", Value(static_cast<double>(chance % 25000) / 100.0));
  payload.set("jitterMilliseconds", Value(static_cast<double>((chance >> 16) % 3000) / 100.0));
  payload.set("isEncrypted", Value((chance & 1) != 0));
  payload.set("sequence", Value(i));
  payload.set("reason", Value(String::fromStatic("periodic quality report")));
  return payload;
}

}  // namespace telvane::bench
