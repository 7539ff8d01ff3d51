#include "tests/backends/BackendFixture.h"

#include <cstring>

#include "interfaces/DefaultsKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/support/PlatformWith.h"

namespace telvane::testing {

void DrawnRandom::fill(std::span<uint8_t> bytes) {
  constexpr uint32_t kAboveBias = 10000;  // the lowest values are drawn again
  const uint32_t value = _draw + kAboveBias;
  if (bytes.size() == sizeof value) {
    std::memcpy(bytes.data(), &value, sizeof value);
  } else {
    _seeded.fill(bytes);
  }
}

BackendFixture::BackendFixture()
    : _client{{kClientEntryLocaleWhitelist, Array{"US", "DE"}},
              {kClientEntryFilters, Array()},
              {kClientEntrySamplingThreshold, 1.0},
              {kClientEntryPostURL, kPostURL},
              {kClientEntryRealtimePostURL, kRealtimeURL}},
      _userInfo(Dictionary{{kTelvaneUserInfoClientName, "player"}, {kTelvaneUserInfoServiceName, "StreamMediaPlayer"}}),
      _process(_world.makeProcess("telvaned")),
      _platform(platformWith(_process.platform(), _random)) {}

BackendFixture::~BackendFixture() { _world.end(); }

const ProcessContext& BackendFixture::context() {
  if (_context == nullptr) _context = std::make_unique<ProcessContext>(_platform);
  return *_context;
}

void BackendFixture::givenDefault(const Key& key, Value value) {
  ASSERT_TRUE(isOk(_process.userDefaults().setObject(kTelvaneDefaultsSuite, key, std::move(value))));
}

Dictionary BackendFixture::profile() const {
  return {{kProfileClients, _clients.has_value() ? *_clients : Value(Array{Value(_client)})},
          {kProfileDisplayURL, "https://collector.example/show"}};
}

std::shared_ptr<TelvaneBackend> BackendFixture::newBackend(const Value& profileValue) {
  return TelvaneBackend::newBackendWithName(context(), kName, profileValue, _productFamily, _clientType);
}

TelvaneBackend& BackendFixture::makeUndecidedBackend() {
  _backend = newBackend(profile());
  if (_backend == nullptr) throw std::runtime_error("the profile of the test makes no backend");
  _backend->setSessionID(4711);
  _backend->setCompType(_clientType);
  _backend->setClientVersion(_clientVersion);
  _backend->setUdid("device-id");
  _backend->setProductVersion(String("12.5"));
  _backend->setBuildVersion(String("6.1.0-13"));
  _backend->setHardwareType(_hardwareType);
  _backend->setIsInternal(_isInternal);
  _backend->setRequireUserInfo(_requiresUserInfo);
  _backend->setBatchEvents(_batchesEvents);
  _backend->setAllowNestedData(_allowsNestedData);
  _backend->setUserInfoDict(_userInfo);
  _backend->setSelfVersion(_selfVersion);
  _backend->setStartTimestamp(_start);
  _backend->setReportingSessionConnectivityDelegate(_connectivity);
  return *_backend;
}

TelvaneBackend& BackendFixture::makeBackend() {
  makeUndecidedBackend().updateState();
  _world.runUntilIdle();
  return *_backend;
}

uint32_t BackendFixture::stateWith(const Key& key, Value value) {
  _client.set(key, std::move(value));
  return makeUndecidedBackend().updateState();
}

std::optional<String> BackendFixture::send(Dictionary payload, uint16_t method, uint16_t respCode, uint32_t flag) {
  return _backend->sendMessage(Dictionary{{kTelvaneMessageBlobClientData, std::move(payload)}}, _world.clock().now(),
                               method, respCode, flag);
}

void BackendFixture::sendMany(int count, uint16_t method) {
  for (int n = 0; n < count; ++n) send(Dictionary{{Key("n"), n}}, method);
}

std::shared_ptr<BackendFixture::Flushed> BackendFixture::flush() {
  auto flushed = std::make_shared<Flushed>();
  flushed->returned =
      _backend->flushMessagesWithCompletion([flushed](std::optional<String> text, std::optional<Error> error) {
        ++flushed->calls;
        flushed->text = std::move(text);
        flushed->error = std::move(error);
      });
  return flushed;
}

Dictionary BackendFixture::lastEvent() {
  if (posts().count() == 0) return {};
  const Array events = posts().events(posts().count() - 1);
  EXPECT_EQ(events.size(), 1u) << "events in the last request";
  const Dictionary* event = events[0].dictionary();
  return event != nullptr ? *event : Dictionary();
}

Value BackendFixture::nestedTooDeep() {
  constexpr int kLevels = 70;
  Value value = 1;
  for (int level = 0; level < kLevels; ++level) value = Array{Value(value)};
  return value;
}

const std::vector<Key>& BackendFixture::clientEntryKeys() {
  static const std::vector<Key> keys = {kClientEntryClient,
                                        kClientEntryService,
                                        kClientEntryExpedite,
                                        kClientEntryEnabledSince,
                                        kClientEntryOverrideDNU,
                                        kClientEntryLocaleWhitelist,
                                        kClientEntryDeviceWhitelist,
                                        kClientEntryDeviceBlacklist,
                                        kClientEntryFilters,
                                        kClientEntrySamplingThreshold,
                                        kClientEntryPerCountrySamplingThresholds,
                                        kClientEntryOverrideSampling,
                                        kClientEntryCustomClientId,
                                        kClientEntryEventThreshold,
                                        kClientEntryExtrasOnInternal,
                                        kClientEntryPostURL,
                                        kClientEntryRealtimePostURL,
                                        kClientEntryEventWhitelist,
                                        kClientEntryEventBlacklist,
                                        kClientEntryIncludeSessionID,
                                        kClientEntryUseWiFiOnly};
  return keys;
}

const std::vector<Value>& BackendFixture::valuesOfAllKinds() {
  static const std::vector<Value> values = {Value(),
                                            true,
                                            -1,
                                            1e300,
                                            "",
                                            "text",
                                            Data(std::string("\x00\xff", 2)),
                                            Date(),
                                            Array{1, 2},
                                            Array{Value(Array{Value(Dictionary())})},
                                            Dictionary(),
                                            Dictionary{{kFilterKey, 1}}};
  return values;
}

Dictionary BackendFixture::posted(Dictionary payload, uint16_t method, uint16_t respCode, uint32_t flag) {
  _backend->setBatchEvents(false);
  send(std::move(payload), method, respCode, flag);
  return lastEvent();
}

}  // namespace telvane::testing
