#include "tools/StorebagExplainPlatform.h"

#include <algorithm>
#include <cmath>
#include <cstring>

#include "interfaces/DefaultsKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/DatagramSocket.h"
#include "platform/PowerLog.h"
#include "platform/WirelessDiagnostics.h"
#include "platform/system/SystemPlatform.h"
#include "tools/StillDispatch.h"

namespace telvane {
namespace {

constexpr uint32_t kSamplingSteps = 10000;
// Stands for the identifiers that a device makes once and keeps.
constexpr std::string_view kDevicesOwn = "(the device's own)";

std::optional<String> textOrNone(const std::string& text) {
  return text.empty() ? std::nullopt : std::optional(String(text));
}

// Draws what makes a backend's sampling factor the one that was asked for.
class ChosenRandom final : public Random {
 public:
  explicit ChosenRandom(double samplingFactor)
      : _draw(static_cast<uint32_t>(std::lround(samplingFactor * kSamplingSteps))) {}

  // A number of 32 bits is cut down to its remainder; those below the number of steps may be drawn anew, so none is.
  void fill(std::span<uint8_t> bytes) override {
    std::fill(bytes.begin(), bytes.end(), uint8_t{0});
    const uint32_t number = _draw + kSamplingSteps;
    if (bytes.size() == sizeof number) std::memcpy(bytes.data(), &number, sizeof number);
  }

 private:
  const uint32_t _draw;
};

class ChosenDefaults final : public UserDefaults {
 public:
  explicit ChosenDefaults(Dictionary settings) : _settings(std::move(settings)) {}

  Value objectForKey(std::string_view suite, std::string_view key) const override {
    return suite == kTelvaneDefaultsSuite.view() ? _settings[key] : Value();
  }
  Dictionary dictionaryRepresentation(std::string_view suite) const override {
    return suite == kTelvaneDefaultsSuite.view() ? _settings : Dictionary();
  }
  Result<void> setObject(std::string_view, std::string_view, Value) override { return {}; }
  Value objectForKeyOrStore(std::string_view suite, std::string_view key, UniqueFunction<Value()>) override {
    Value stored = objectForKey(suite, key);
    return stored.isPresent() ? stored : Value(kDevicesOwn);
  }

 private:
  const Dictionary _settings;
};

class ChosenDevice final : public DeviceAnswers {
 public:
  explicit ChosenDevice(const StorebagExplainCase& situation) : _situation(situation) {}

  std::optional<String> answer(const Key& key) const override {
    if (key == kProductType.view()) return textOrNone(_situation.hardware);
    if (key == kDeviceName.view()) return textOrNone(_situation.productFamily);
    if (key == kReleaseType.view() && _situation.isInternal) return String("Internal");
    return std::nullopt;
  }

 private:
  const StorebagExplainCase& _situation;
};

class ChosenLocale final : public Locale {
 public:
  explicit ChosenLocale(const std::string& country) : _country(textOrNone(country)) {}

  std::optional<String> countryCode() const override { return _country; }
  std::chrono::seconds secondsFromGMT(Date) const override { return std::chrono::seconds(0); }

 private:
  const std::optional<String> _country;
};

class ChosenConsent final : public Consent {
 public:
  explicit ChosenConsent(bool isGiven) : _isGiven(isGiven) {}

  bool isSubmissionAllowed() const override { return _isGiven; }

 private:
  const bool _isGiven;
};

class ChosenBundle final : public ClientBundle {
 public:
  explicit ChosenBundle(const std::string& version) : _version(textOrNone(version)) {}

  std::optional<String> version() const override { return _version; }
  std::optional<Data> publicKey() const override { return std::nullopt; }

 private:
  const std::optional<String> _version;
};

// Sends nothing and hears nothing, as if all went well.
class StillSocket final : public DatagramSocket {
 public:
  Result<void> bind() override { return {}; }
  Result<void> connect(const IPv4SocketAddress&) override { return {}; }
  Result<size_t> send(const uint8_t*, size_t length) override { return length; }
  Result<size_t> receive(uint8_t*, size_t) override { return size_t{0}; }
  std::unique_ptr<ReadSource> newReadSource(std::shared_ptr<SerialQueue> queue, UniqueFunction<void()>,
                                            Job onCancel) override {
    return std::make_unique<StillReadSource>(std::move(queue), std::move(onCancel));
  }

 private:
  class StillReadSource final : public ReadSource {
   public:
    StillReadSource(std::shared_ptr<SerialQueue> queue, Job onCancel)
        : _queue(std::move(queue)), _onCancel(std::move(onCancel)) {}
    ~StillReadSource() override { StillReadSource::cancel(); }
    void cancel() override {
      const std::shared_ptr<SerialQueue> queue = std::move(_queue);
      if (queue != nullptr && _onCancel) queue->async(std::move(_onCancel));
    }

   private:
    std::shared_ptr<SerialQueue> _queue;  // null once cancelled
    Job _onCancel;
  };
};

class StillSockets final : public DatagramSockets {
 public:
  Result<std::unique_ptr<DatagramSocket>> newSocket() override { return {std::make_unique<StillSocket>()}; }
};

// What a device has there is not known, and is not loaded to be looked at.
class UnopenedDiagnostics final : public WirelessDiagnostics {
 public:
  std::unique_ptr<WirelessDiagnosticsBundle> openBundleAtPath(const std::string&) override { return nullptr; }
};

// The section keys stand in the order of their numbers, from 1.
Dictionary settingsOf(const StorebagExplainCase& situation) {
  constexpr std::string_view kEnvironments[] = {kEnvironmentDevelopment.view(), kEnvironmentInternal.view(),
                                                kEnvironmentSeed.view(), kEnvironmentRelease.view()};
  Dictionary settings = situation.defaults;
  const auto* const found = std::find(std::begin(kEnvironments), std::end(kEnvironments), situation.environment);
  if (found != std::end(kEnvironments)) settings.set(kDefaultsEnvironmentType, found - kEnvironments + 1);
  return settings;
}

}  // namespace

struct StorebagExplainPlatform::Parts {
  explicit Parts(const StorebagExplainCase& chosen)
      : situation(chosen),
        system(log),
        random(situation.samplingFactor),
        defaults(settingsOf(situation)),
        device(situation),
        locale(situation.country),
        consent(situation.hasConsent),
        bundle(situation.frameworkVersion),
        dispatch(system.platform().dispatch),
        platform(withChosen(system.platform())) {}

  Platform withChosen(const Platform& real) {
    return {real.clock,
            random,
            dispatch,
            log,
            real.files,
            defaults,
            device,
            locale,
            consent,
            bundle,
            real.urlSessions,
            real.transactions,
            real.localService,
            real.submittableLogs,
            real.processMemory,
            datagramSockets,
            real.sandboxExtensions,
            wirelessDiagnostics,
            powerLog};
  }

  const StorebagExplainCase situation;
  KeptLog log;
  SystemPlatform system;
  ChosenRandom random;
  ChosenDefaults defaults;
  ChosenDevice device;
  ChosenLocale locale;
  ChosenConsent consent;
  ChosenBundle bundle;
  StillDispatch dispatch;
  StillSockets datagramSockets;
  UnopenedDiagnostics wirelessDiagnostics;
  NullPowerLog powerLog;
  Platform platform;
};

StorebagExplainPlatform::StorebagExplainPlatform(const StorebagExplainCase& situation)
    : _parts(std::make_unique<Parts>(situation)) {}

StorebagExplainPlatform::~StorebagExplainPlatform() = default;

Platform& StorebagExplainPlatform::platform() noexcept { return _parts->platform; }

KeptLog& StorebagExplainPlatform::log() noexcept { return _parts->log; }

}  // namespace telvane
