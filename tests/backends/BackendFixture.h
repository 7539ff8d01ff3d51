#pragma once

#include <gtest/gtest.h>

#include <cmath>
#include <memory>
#include <string>
#include <vector>

#include "backends/HTTPSPostBackend.h"
#include "platform/Platform.h"
#include "tests/support/Matchers.h"
#include "tests/support/RecordingConnectivity.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {

// Chance whose draws the test gives; everything else of it is as seeded.
class DrawnRandom final : public Random {
 public:
  // draw: what uniform(10000) gives from now on.
  void setDraw(uint32_t draw) { _draw = draw; }
  void fill(std::span<uint8_t> bytes) override;

 private:
  SeededRandom _seeded{1};
  uint32_t _draw = 0;
};

// One process with one HTTPS backend, a recording connectivity helper and a storebag that lets everything through. A
// test changes what it is about before it makes the backend.
class BackendFixture : public ::testing::Test {
 protected:
  static constexpr char kName[] = "splunk";
  static constexpr char kPostURL[] = "https://collector.example/events";
  static constexpr char kRealtimeURL[] = "https://collector.example/now";

  BackendFixture();
  ~BackendFixture() override;

  SimulatedPlatform& process() { return _process; }
  RecordingLog& log() { return _process.log(); }
  // Made on first use, so that the device can be set up before.
  const ProcessContext& context();
  void givenInternalBuild() { _process.deviceAnswers().set("ReleaseType", "Internal"); }
  void givenDefault(const Key& key, Value value);
  // factor: a multiple of 0.0001 below 1.
  void givenSamplingFactor(double factor) { _random.setDraw(static_cast<uint32_t>(std::lround(factor * 10000))); }

  // Makes the backend of profile(), stamps it, lets it decide its state and waits until that is written.
  TelvaneBackend& makeBackend();
  // The same without deciding.
  TelvaneBackend& makeUndecidedBackend();
  std::shared_ptr<TelvaneBackend> newBackend(const Value& profile);
  Dictionary profile() const;
  TelvaneBackend& backend() { return *_backend; }
  // Makes a backend of an otherwise permissive client entry with one key changed, and returns its state.
  uint32_t stateWith(const Key& key, Value value);

  std::optional<String> send(Dictionary payload, uint16_t method = 7, uint16_t respCode = 2, uint32_t flag = 0);
  // Sends that many events {"n": 0...} of one method.
  void sendMany(int count, uint16_t method = 7);
  // What a flush gives to its completion.
  struct Flushed {
    std::optional<String> returned;
    int calls = 0;
    std::optional<String> text;
    std::optional<Error> error;
  };
  std::shared_ptr<Flushed> flush();
  RecordingConnectivity& posts() { return *_connectivity; }
  // The only event of the last request.
  Dictionary lastEvent();
  // Sends one event at once and returns it as posted.
  Dictionary posted(Dictionary payload, uint16_t method = 7, uint16_t respCode = 2, uint32_t flag = 0);
  // A list deeper than JSON is written.
  static Value nestedTooDeep();
  // Everything that a client entry may hold, and values of every kind that a bag can hold under it.
  static const std::vector<Key>& clientEntryKeys();
  static const std::vector<Value>& valuesOfAllKinds();

  SimulatedWorld _world;
  // What the backend is made with.
  Dictionary _client;  // the only client entry, unless clients is set
  std::optional<Value> _clients;
  String _productFamily = "TelvaneBox";
  std::optional<String> _hardwareType = String("Box2,1");
  uint32_t _clientType = 6;
  uint16_t _clientVersion = 3;
  bool _isInternal = false;
  bool _requiresUserInfo = true;
  bool _batchesEvents = true;
  bool _allowsNestedData = false;
  Value _userInfo;
  String _selfVersion = "8.1";
  Date _start = SimulatedClock::kCalendarStart;

 private:
  SimulatedPlatform& _process;
  DrawnRandom _random;
  Platform _platform;
  std::unique_ptr<ProcessContext> _context;
  std::shared_ptr<RecordingConnectivity> _connectivity = std::make_shared<RecordingConnectivity>();
  std::shared_ptr<TelvaneBackend> _backend;
};

}  // namespace telvane::testing
