// What a gate observer hears of a decision. That the decision itself is right is proved where the gates are.
#include "backends/GateObserver.h"

#include <gmock/gmock.h>

#include "interfaces/DefaultsKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/backends/BackendFixture.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;

struct Step {
  std::optional<size_t> entry;
  GateAnswer answer;
};

class Recorder final : public GateObserver {
 public:
  void willLookAtEntry(std::optional<size_t> index) override { _entry = index; }
  void didAnswer(GateAnswer answer) override { steps.push_back({_entry, std::move(answer)}); }

  std::vector<Step> steps;

 private:
  std::optional<size_t> _entry;
};

class GateObserverTest : public BackendFixture {
 protected:
  // Makes a backend, has it decide, and returns its state; the steps are those of this decision.
  uint32_t decide() {
    _recorder.steps.clear();
    makeUndecidedBackend().setGateObserver(&_recorder);
    const uint32_t state = backend().updateState();
    backend().setGateObserver(nullptr);
    return state;
  }
  std::vector<Gate> gates() const {
    std::vector<Gate> gates;
    for (const Step& step : _recorder.steps) gates.push_back(step.answer.gate);
    return gates;
  }
  // The only step of the gate in the last decision.
  Step step(Gate gate) const {
    std::vector<Step> found;
    for (const Step& step : _recorder.steps) {
      if (step.answer.gate == gate) found.push_back(step);
    }
    EXPECT_EQ(found.size(), 1u) << "steps of gate " << static_cast<int>(gate);
    return found.empty() ? Step{{}, {gate, GateOutcome::Kept, {}, {}}} : found.front();
  }
  void expectStep(Gate gate, GateOutcome outcome, const Value& tested, const Value& against) {
    const GateAnswer answer = step(gate).answer;
    EXPECT_EQ(answer.outcome, outcome);
    EXPECT_EQ(answer.tested, tested) << description(answer.tested);
    EXPECT_EQ(answer.against, against) << description(answer.against);
  }

  Recorder _recorder;
};

TEST_F(GateObserverTest, hearsEveryStepInTheOrderInWhichItIsTaken) {
  EXPECT_EQ(decide(), TelvaneBackendStateEnabled);
  EXPECT_THAT(gates(),
              ElementsAre(Gate::ClientList, Gate::Expedite, Gate::UserInfoRequired, Gate::UserInfo, Gate::EntryKind,
                          Gate::ClientName, Gate::ServiceName, Gate::EnabledSince, Gate::MatchingEntry, Gate::Consent,
                          Gate::Country, Gate::DeviceWhitelist, Gate::DeviceBlacklist, Gate::Filters,
                          Gate::SamplingThreshold, Gate::PerCountryThreshold, Gate::Sampling, Gate::EventThreshold,
                          Gate::ExtrasOnInternal, Gate::CustomClientIdentifier, Gate::PostURL, Gate::RealtimePostURL,
                          Gate::EventWhitelist, Gate::EventBlacklist, Gate::IncludeSessionID, Gate::UseWiFiOnly));
}

// One key of an otherwise open entry, and what is heard of the gate that reads it.
struct GateCase {
  Key key;
  Value value;
  Gate gate;
  GateOutcome outcome;
  Value tested;
  uint32_t state;
};

std::vector<GateCase> gateCases() {
  constexpr auto kPassed = GateOutcome::Passed;
  constexpr auto kRefused = GateOutcome::Refused;
  constexpr uint32_t kOff = TelvaneBackendStateDisabled;
  constexpr uint32_t kOn = TelvaneBackendStateEnabled;
  return {
      {kClientEntryClient, "other,PLAYER", Gate::ClientName, kPassed, "player", kOn},
      {kClientEntryClient, "other", Gate::ClientName, kRefused, "player", kOff},
      {kClientEntryService, "media", Gate::ServiceName, kPassed, "StreamMediaPlayer", kOn},
      {kClientEntryService, "mail", Gate::ServiceName, kRefused, "StreamMediaPlayer", kOff},
      {kClientEntryEnabledSince, "8.1", Gate::EnabledSince, kPassed, "8.1", kOn},
      {kClientEntryEnabledSince, "8.2", Gate::EnabledSince, kRefused, "8.1", kOff},
      {kClientEntryOverrideDNU, 1, Gate::Consent, kPassed, true, kOn},
      {kClientEntryLocaleWhitelist, Array{"US"}, Gate::Country, kPassed, "US", kOn},
      {kClientEntryLocaleWhitelist, Array{"FR"}, Gate::Country, kRefused, "US", kOff},
      {kClientEntryDeviceWhitelist, Array{"Box"}, Gate::DeviceWhitelist, kPassed, "TelvaneBox", kOn},
      {kClientEntryDeviceWhitelist, Array{"Phone"}, Gate::DeviceWhitelist, kRefused, "TelvaneBox", kOff},
      {kClientEntryDeviceBlacklist, Array{"Box1"}, Gate::DeviceBlacklist, kPassed, "Box2,1", kOn},
      {kClientEntryDeviceBlacklist, Array{"Box2"}, Gate::DeviceBlacklist, kRefused, "Box2,1", kOff},
      {kClientEntryFilters, Array(), Gate::Filters, kPassed, Array(), kOn},
      {kClientEntryFilters, Array{1}, Gate::Filters, kRefused, Value(), kOff},
      {kClientEntryFilters, Value(), Gate::Filters, kRefused, Value(), kOff},
      {kClientEntrySamplingThreshold, 0.6, Gate::Sampling, kPassed, 0.5, kOn},
      {kClientEntrySamplingThreshold, 0.5, Gate::Sampling, kRefused, 0.5, TelvaneBackendStateSampledOut},
      {kClientEntrySamplingThreshold, Value(), Gate::Sampling, kRefused, 0.5, kOff},
  };
}

TEST_F(GateObserverTest, hearsWhatEachGateTestedAgainstWhat) {
  log().allowErrors();
  givenSamplingFactor(0.5);
  const Dictionary open = _client;
  for (const GateCase& gate : gateCases()) {
    SCOPED_TRACE(std::string(gate.key.view()) + " " + description(gate.value));
    _client = open;
    _client.set(gate.key, gate.value);
    EXPECT_EQ(decide(), gate.state);
    expectStep(gate.gate, gate.outcome, gate.tested, gate.value);
    EXPECT_EQ(step(gate.gate).entry, 0u);
  }
}

TEST_F(GateObserverTest, changesNeitherTheStateNorTheLog) {
  log().allowErrors();
  givenSamplingFactor(0.5);
  const Dictionary open = _client;
  for (const GateCase& gate : gateCases()) {
    SCOPED_TRACE(std::string(gate.key.view()) + " " + description(gate.value));
    _client = open;
    _client.set(gate.key, gate.value);
    log().clear();
    const uint32_t alone = makeUndecidedBackend().updateState();
    const std::string written = log().text();
    log().clear();
    EXPECT_EQ(decide(), alone);
    EXPECT_EQ(log().text(), written);
  }
}

TEST_F(GateObserverTest, hearsOfConsentThatIsMissingAndOverridden) {
  process().consent().set(false);
  EXPECT_EQ(decide(), TelvaneBackendStateDisabled);
  expectStep(Gate::Consent, GateOutcome::Refused, false, Value());
  _client.set(kClientEntryOverrideDNU, 1);
  EXPECT_EQ(decide(), TelvaneBackendStateEnabled);
  expectStep(Gate::Consent, GateOutcome::Passed, false, 1);
}

TEST_F(GateObserverTest, hearsWhyEachEarlierEntryWasSkippedAndWhichOneDecides) {
  Dictionary other = _client;
  other.set(kClientEntryClient, "other");
  Dictionary later = _client;
  later.set(kClientEntryEnabledSince, "9.0");
  _clients = Array{1, other, later, _client, _client};
  EXPECT_EQ(decide(), TelvaneBackendStateEnabled);
  std::vector<std::pair<size_t, Gate>> refused;
  for (const Step& step : _recorder.steps) {
    if (step.answer.outcome == GateOutcome::Refused) refused.emplace_back(step.entry.value_or(99), step.answer.gate);
  }
  EXPECT_THAT(refused, ElementsAre(std::pair(size_t{0}, Gate::EntryKind), std::pair(size_t{1}, Gate::ClientName),
                                   std::pair(size_t{2}, Gate::EnabledSince)));
  EXPECT_EQ(step(Gate::MatchingEntry).entry, 3u);
  EXPECT_EQ(step(Gate::Country).entry, 3u);
}

TEST_F(GateObserverTest, hearsThatNoEntryIsForTheSession) {
  _client.set(kClientEntryClient, "other");
  EXPECT_EQ(decide(), TelvaneBackendStateDisabled);
  EXPECT_EQ(step(Gate::MatchingEntry).answer.outcome, GateOutcome::Refused);
  EXPECT_EQ(step(Gate::MatchingEntry).entry, std::nullopt);
}

TEST_F(GateObserverTest, hearsWhichEntryIsAskedForBatching) {
  Dictionary later = _client;
  later.set(kClientEntryEnabledSince, "9.0");
  later.set(kClientEntryExpedite, 1);
  _clients = Array{later, _client};
  EXPECT_EQ(decide(), TelvaneBackendStateEnabled);
  expectStep(Gate::Expedite, GateOutcome::Taken, false, 1);
  EXPECT_EQ(step(Gate::Expedite).entry, 0u) << "the first by name, though another one decides";
  EXPECT_EQ(step(Gate::UserInfo).entry, std::nullopt);
}

TEST_F(GateObserverTest, hearsThatUserInfoIsMissing) {
  _userInfo = Value();
  EXPECT_EQ(decide(), TelvaneBackendStateUnknown);
  expectStep(Gate::UserInfo, GateOutcome::Refused, Value(), Value());
  EXPECT_EQ(gates().back(), Gate::UserInfo);
}

TEST_F(GateObserverTest, hearsWhereASessionWithoutUserInfoTakesItsURLFrom) {
  _requiresUserInfo = false;
  Dictionary silent = _client;
  silent.set(kClientEntryPostURL, Value());
  _clients = Array{silent, _client};
  EXPECT_EQ(decide(), TelvaneBackendStateEnabled);
  EXPECT_THAT(gates(), ElementsAre(Gate::ClientList, Gate::Expedite, Gate::UserInfoRequired, Gate::PostURL,
                                   Gate::RealtimePostURL, Gate::PostURL, Gate::RealtimePostURL, Gate::EventThreshold,
                                   Gate::ExtrasOnInternal));
  EXPECT_EQ(_recorder.steps[3].answer.outcome, GateOutcome::NotGiven);
  EXPECT_EQ(_recorder.steps[5].answer.outcome, GateOutcome::Taken);
  EXPECT_EQ(_recorder.steps[5].answer.tested, Value(kPostURL));
  EXPECT_EQ(_recorder.steps[5].entry, 1u);
}

TEST_F(GateObserverTest, hearsThatAUserDefaultKeepsItsURL) {
  givenDefault(kDefaultsHTTPSPostURL, "https://other.example/events");
  decide();
  expectStep(Gate::PostURL, GateOutcome::Kept, "https://other.example/events", kPostURL);
  expectStep(Gate::RealtimePostURL, GateOutcome::Taken, kRealtimeURL, kRealtimeURL);
}

TEST_F(GateObserverTest, hearsTheThresholdOfTheCountry) {
  givenSamplingFactor(0.5);
  const Dictionary item{{kPerCountryCountry, Array{"US"}}, {kPerCountryThreshold, 0.1}};
  _client.set(kClientEntryPerCountrySamplingThresholds, Array{Value(item)});
  EXPECT_EQ(decide(), TelvaneBackendStateSampledOut);
  expectStep(Gate::SamplingThreshold, GateOutcome::Taken, 1.0, 1.0);
  expectStep(Gate::PerCountryThreshold, GateOutcome::Taken, 0.1, item);
  expectStep(Gate::Sampling, GateOutcome::Refused, 0.5, 0.1);
}

TEST_F(GateObserverTest, hearsWhetherASampledOutDeviceIsHeldOrDisabled) {
  givenSamplingFactor(0.5);
  _client.set(kClientEntrySamplingThreshold, 0.1);
  EXPECT_EQ(decide(), TelvaneBackendStateSampledOut);
  expectStep(Gate::OverrideSampling, GateOutcome::Passed, 0.5, Value());
  _client.set(kClientEntryOverrideSampling, 0.7);
  EXPECT_EQ(decide(), TelvaneBackendStateSampledOut);
  expectStep(Gate::OverrideSampling, GateOutcome::Passed, 0.5, 0.7);
  _client.set(kClientEntryOverrideSampling, 0.4);
  EXPECT_EQ(decide(), TelvaneBackendStateDisabled);
  expectStep(Gate::OverrideSampling, GateOutcome::Refused, 0.5, 0.4);
}

TEST_F(GateObserverTest, hearsTheFiltersThatAreInForce) {
  const Array filters{
      Value(Dictionary{{kFilterKey, "account"}, {kFilterAction, "sha256"}, {kFilterMethod, 7}}),
      Value(Dictionary{{kFilterAction, "remove"}}),
      Value(Dictionary{{kFilterKey, "place"}, {kFilterAction, "blacklistValues"}, {kFilterValue, Array{"home", 1}}}),
      Value(Dictionary{{kFilterKey, "name"}, {kFilterAction, "shred"}})};
  _client.set(kClientEntryFilters, filters);
  decide();
  const Array inForce{
      Value(Dictionary{{kFilterKey, "account"}, {kFilterAction, "sha256"}, {kFilterMethod, 7}}),
      Value(
          Dictionary{{kFilterKey, "place"}, {kFilterAction, "blacklistValues"}, {kFilterValue, Array{Value("home")}}}),
      Value(Dictionary{{kFilterKey, "name"}, {kFilterAction, "none"}})};
  expectStep(Gate::Filters, GateOutcome::Passed, inForce, filters);
}

TEST_F(GateObserverTest, hearsEachSettingGivenAndNotGiven) {
  const std::vector<std::tuple<Key, Value, Gate, Value, Value>> settings = {
      {kClientEntryEventThreshold, 5, Gate::EventThreshold, 5, 49},
      {kClientEntryExtrasOnInternal, 1, Gate::ExtrasOnInternal, 1, 0},
      {kClientEntryCustomClientId, 1, Gate::CustomClientIdentifier, true, false},
      {kClientEntryPostURL, "https://a.example", Gate::PostURL, "https://a.example", Value()},
      {kClientEntryRealtimePostURL, "https://b.example", Gate::RealtimePostURL, "https://b.example", kPostURL},
      {kClientEntryEventWhitelist, Array{1, 2}, Gate::EventWhitelist, Array{1, 2}, Value()},
      {kClientEntryEventBlacklist, Array{3}, Gate::EventBlacklist, Array{Value(3)}, Value()},
      {kClientEntryIncludeSessionID, 1, Gate::IncludeSessionID, true, false},
      {kClientEntryUseWiFiOnly, 1, Gate::UseWiFiOnly, true, false},
  };
  const Dictionary open = _client;
  for (const auto& [key, value, gate, whenGiven, whenNot] : settings) {
    SCOPED_TRACE(std::string(key.view()));
    _client = open;
    _client.set(key, value);
    decide();
    expectStep(gate, GateOutcome::Taken, whenGiven, value);
    _client.set(key, Value());
    decide();
    expectStep(gate, GateOutcome::NotGiven, whenNot, Value());
  }
}

TEST_F(GateObserverTest, hearsNothingOnceItIsTakenAway) {
  makeUndecidedBackend().setGateObserver(&_recorder);
  backend().setGateObserver(nullptr);
  backend().updateState();
  EXPECT_TRUE(_recorder.steps.empty());
}

}  // namespace
}  // namespace telvane::testing
