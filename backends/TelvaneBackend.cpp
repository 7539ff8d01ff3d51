#include "backends/TelvaneBackend.h"

#include <algorithm>
#include <array>

#include "backends/DashboardBackend.h"
#include "backends/HTTPSPostBackend.h"
#include "backends/UploadBackend.h"
#include "backends/VDRBackend.h"
#include "backends/WattbookBackend.h"
#include "interfaces/BackendKind.h"
#include "platform/Crypto.h"

namespace telvane {
namespace {

constexpr uint32_t kSamplingSteps = 10000;
constexpr double kMicrosecondsPerSecond = 1e6;

bool isDesktop(const ProcessContext& context) {
  const auto productType = context.platform().deviceAnswers.answer(DeviceAnswers::kProductType);
  return productType.has_value() && *productType == kDesktopProductType;
}

// The wireless-diagnostics service is not there on a desktop.
BackendKind kindForName(const ProcessContext& context, std::string_view name) {
  const BackendKind kind = backendKindForName(name);
  return kind == BackendKind::VDR && isDesktop(context) ? BackendKind::Unknown : kind;
}

// Asked twice for each event, so that the usual kind of entry is read in place.
bool isEntryFor(const Value& entry, uint16_t method) noexcept {
  const std::optional<int64_t> number = entry.integer();
  return (number ? static_cast<int32_t>(*number) : entry.int32Value()) == method;
}

bool hasEntryFor(const Value& list, uint16_t method) noexcept {
  const Array* entries = list.array();
  return entries != nullptr && std::any_of(entries->begin(), entries->end(),
                                           [method](const Value& entry) { return isEntryFor(entry, method); });
}

}  // namespace

std::shared_ptr<TelvaneBackend> TelvaneBackend::newBackendWithName(const ProcessContext& context, const String& name,
                                                                   const Value& profile,
                                                                   const std::optional<String>& productFamily,
                                                                   uint32_t clientType) {
  switch (kindForName(context, name)) {
    case BackendKind::HTTPSPost:
      return HTTPSPostBackend::initWithName(context, name, profile, productFamily);
    case BackendKind::Wattbook:
      return WattbookBackend::initWithName(context, name, profile, productFamily);
    case BackendKind::VDR:
      return VDRBackend::initWithName(context, name, profile, productFamily, clientType);
    case BackendKind::UploadServer:
      return UploadBackend::initWithName(context, name, profile, productFamily);
    case BackendKind::Dashboard:
      return DashboardBackend::initWithName(context, name, profile, productFamily);
    case BackendKind::Unknown:
      break;
  }
  context.log().error("TelvaneBackend(newBackendWithName): {}", name);
  return nullptr;
}

TelvaneBackend::TelvaneBackend(const ProcessContext& context, String name, Dictionary profile, String productFamily)
    : _context(context),
      _profile(std::move(profile)),
      _name(std::move(name)),
      _productFamily(std::move(productFamily)),
      _samplingFactor(context.platform().random.uniform(kSamplingSteps) / static_cast<double>(kSamplingSteps)),
      _stateQueue(context.platform().dispatch.newSerialQueue("com.corvex.TelvaneBackendStateQueue")) {
  setSelfVersion({});
}

TelvaneBackend::~TelvaneBackend() = default;

void TelvaneBackend::cleanup() {}

void TelvaneBackend::setReportingSessionConnectivityDelegate(
    std::weak_ptr<ReportingSessionConnectivityInterface> delegate) {
  _reportingSessionConnectivityDelegate = std::move(delegate);
}

void TelvaneBackend::setSelfVersion(std::string_view version) {
  std::tie(_selfVersionMajor, _selfVersionMiddle, _selfVersionMinor) = versionComponents(version);
  _selfVersionText = _selfVersionMinor == 0
                         ? fmt::format("{}.{}", _selfVersionMajor, _selfVersionMiddle)
                         : fmt::format("{}.{}.{}", _selfVersionMajor, _selfVersionMiddle, _selfVersionMinor);
}

std::tuple<uint8_t, uint8_t, uint8_t> TelvaneBackend::versionComponents(std::string_view version) {
  std::array<uint8_t, 3> components{};
  for (uint8_t& component : components) {
    const size_t point = version.find('.');
    component = static_cast<uint8_t>(Value(version.substr(0, point)).unsignedValue());
    if (point == std::string_view::npos) break;
    version.remove_prefix(point + 1);
  }
  return {components[0], components[1], components[2]};
}

uint32_t TelvaneBackend::state() const {
  uint32_t state = TelvaneBackendStateUnknown;
  _stateQueue->sync([this, &state] {
    _stateQueue->assertOnQueue();
    state = _state;
  });
  return state;
}

void TelvaneBackend::setState(uint32_t state) {
  _stateQueue->async([self = shared_from_this(), state] {
    self->_stateQueue->assertOnQueue();
    self->_state = state;
  });
}

uint32_t TelvaneBackend::updateState() {
  setState(TelvaneBackendStateEnabled);
  return TelvaneBackendStateEnabled;
}

std::optional<String> TelvaneBackend::sendMessage(Dictionary, Date, uint16_t, uint16_t, uint16_t, uint32_t) {
  return std::nullopt;
}

std::optional<String> TelvaneBackend::sendMessage(Dictionary blob, Date timestamp, uint16_t method, uint16_t respCode,
                                                  uint32_t flag) {
  return sendMessage(std::move(blob), timestamp, method, respCode, ++_eventID, flag);
}

void TelvaneBackend::setStartTimestamp(Date timestamp) {
  _startTimeStamp = static_cast<double>(timestamp.wholeSeconds()) + timestamp.microseconds() / kMicrosecondsPerSecond;
}

std::optional<String> TelvaneBackend::flushMessagesWithCompletion(FlushCompletion completion) {
  if (completion) completion(std::nullopt, std::nullopt);
  return std::nullopt;
}

bool TelvaneBackend::uploadFileAtPath(const String&, const ExtensionToken&) { return false; }

bool TelvaneBackend::uploadLogData(const Array&) { return false; }

void TelvaneBackend::setCorrelatedSessionID(const String& combinedSessionID) {
  setCombinedSessionIDString(combinedSessionID);
}

bool TelvaneBackend::isWhitelistedEvent(uint16_t method) const {
  return !_eventWhitelist.isArray() || hasEntryFor(_eventWhitelist, method);
}

bool TelvaneBackend::isBlacklistedEvent(uint16_t method) const { return hasEntryFor(_eventBlacklist, method); }

uint64_t TelvaneBackend::batchedEventsSize() const { return 0; }

String TelvaneBackend::convertIntoSHA256(std::string_view text) {
  return crypto::lowercaseHex(crypto::sha256({reinterpret_cast<const uint8_t*>(text.data()), text.size()}));
}

void TelvaneBackend::setUserInfoDict(const Value& userInfo) {
  const Dictionary* dictionary = userInfo.dictionary();
  _userInfoDict = dictionary != nullptr ? std::optional(*dictionary) : std::nullopt;
}

void TelvaneBackend::setCombinedSessionIDString(String combinedSessionID) {
  _stateQueue->sync([this, &combinedSessionID] {
    _stateQueue->assertOnQueue();
    _combinedSessionIDString = std::move(combinedSessionID);
  });
}

std::optional<String> TelvaneBackend::combinedSessionIDString() const {
  std::optional<String> combinedSessionID;
  _stateQueue->sync([this, &combinedSessionID] {
    _stateQueue->assertOnQueue();
    combinedSessionID = _combinedSessionIDString;
  });
  return combinedSessionID;
}

Value TelvaneBackend::samplingThreshold() const {
  MutexLock lock(_samplingLock);
  return _samplingThreshold;
}

void TelvaneBackend::setSamplingThreshold(Value threshold) {
  MutexLock lock(_samplingLock);
  _samplingThreshold = std::move(threshold);
}

}  // namespace telvane
