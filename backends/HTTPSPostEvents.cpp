// The road of an event through an HTTPS backend: event dictionary, batch, flush, JSON.
#include <algorithm>
#include <cmath>

#include "backends/HTTPSPostBackend.h"
#include "foundation/ShortDescription.h"
#include "interfaces/EventKeys.h"
#include "interfaces/MessageFlags.h"
#include "interfaces/SessionEvents.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/TelvaneErrors.h"
#include "platform/JSON.h"
#include "util/DataHelpers.h"
#include "util/UserDefaultsEnvironment.h"

namespace telvane {
namespace {

// Room for what an event gets beside its payload and the user info.
constexpr size_t kOwnEntries = 24;
constexpr int64_t kSecondsPerMinute = 60;

Error failure(String text) {
  return makeTelvaneError(std::move(text), static_cast<int64_t>(TelvaneErrorCode::Failure));
}

// Whether this is one of the conferencing types, whose internal sessions are told apart by number.
bool isNumberedByClient(uint32_t clientType) { return clientType == 7 || clientType == 11 || clientType == 13; }

Value orMinusOne(const Value& number) { return number.isPresent() ? number : Value(-1); }

// JSON is written 64 levels deep; the body, its list of events and the event itself stand around a value.
constexpr size_t kDeepestValue = 61;
// The longest description of a value, or of its key, that a line holds: bytes.
constexpr size_t kLongestDescription = 1024;

// Whether JSON has a form for the value and for everything in it, at most this many levels deep.
bool isWritable(const Value& value, size_t levels = kDeepestValue) {
  if (levels == 0) return false;
  switch (value.kind()) {
    case Value::Kind::Boolean:
    case Value::Kind::Integer:
    case Value::Kind::UnsignedInteger:
    case Value::Kind::String:
      return true;
    case Value::Kind::Real:
      return std::isfinite(*value.real());
    case Value::Kind::Array:
      return std::all_of(value.array()->begin(), value.array()->end(),
                         [levels](const Value& element) { return isWritable(element, levels - 1); });
    case Value::Kind::Dictionary:
      return std::all_of(value.dictionary()->begin(), value.dictionary()->end(),
                         [levels](const DictionaryEntry& entry) { return isWritable(entry.value, levels - 1); });
    default:
      return false;
  }
}

bool isSessionStop(uint16_t method, uint16_t respCode) { return method == kSessionMethod && respCode == kSessionStop; }

}  // namespace

std::optional<String> HTTPSPostBackend::sendMessage(Dictionary blob, Date timestamp, uint16_t method, uint16_t respCode,
                                                    uint16_t eventID, uint32_t flag) {
  QueueState before = queueState();
  if (before.state == TelvaneBackendStateDisabled) return std::nullopt;
  const EventNumbers numbers{.method = method, .respCode = respCode, .eventID = eventID};
  const Value sharedData = blob[kTelvaneMessageBlobSharedData];
  Dictionary event = newEventDictFromPayload(std::move(blob), timestamp, numbers, std::move(before.sessionID));
  prepareEvent(event, sharedData);
  if (isPromoting(flag) && before.state == TelvaneBackendStateSampledOut) setState(TelvaneBackendStateEnabled);
  log().message("HTTPSPostBackend(sendMessage): realtime is {}", static_cast<int>(isRealtime(flag)));
  if (flag == kPeriodicReportFlag && _context.isInternalBuild()) {
    event.set(kEventBytesSentSinceLastReport, _bytesSentSinceLastReport.exchange(0));
  }
  const bool isDecided = before.state != TelvaneBackendStateUnknown && before.state != TelvaneBackendStateSampledOut;
  const bool isForNow = isRealtime(flag) || !_batchEvents;
  if (isDecided && isForNow && !lacksUserInfo()) {
    return sendStandaloneEvent(std::move(event), before, numbers, flag);
  }
  log().message("HTTPSPostBackend(sendMessage): Batching {}, {}, {}", before.state, static_cast<int>(_batchEvents),
                static_cast<int>(_requireUserInfo));
  return batchEvent(std::move(event));
}

HTTPSPostBackend::QueueState HTTPSPostBackend::queueState() const {
  QueueState result;
  const bool isNumbered = _isInternal && isNumberedByClient(_compType);
  _stateQueue->sync([this, &result, isNumbered] {
    _stateQueue->assertOnQueue();
    result.state = _state;
    result.hasBatch = _batchedEvents.has_value();
    if (!isNumbered && _combinedSessionIDString.has_value()) result.sessionID = *_combinedSessionIDString;
  });
  if (isNumbered) result.sessionID = _sessionID;
  return result;
}

Dictionary HTTPSPostBackend::newEventDictFromPayload(Dictionary blob, Date timestamp, const EventNumbers& numbers,
                                                     Value sessionID) {
  Value clientData = blob.take(kTelvaneMessageBlobClientData);
  Dictionary* payload = clientData.isPresent() ? clientData.dictionary() : &blob;
  if (payload == nullptr) {
    log().error("HTTPSPostBackend(sendMessage): SESSION_TYPE_STOP message dictionary is nil");
  }
  Dictionary event = payload != nullptr ? std::move(*payload) : Dictionary();
  event.reserve(event.size() + kOwnEntries + (_userInfoDict.has_value() ? _userInfoDict->size() : 0));
  if (isSessionStop(numbers.method, numbers.respCode)) addSessionStopEntries(event);

  const int64_t startTS = minuteRounding(static_cast<int64_t>(_startTimeStamp), _context.isInternalBuild());
  event.set(kEventStartTS, startTS);
  if (const std::string_view sender = senderName(); !sender.empty())
    event.set(kEventSender, String::fromStatic(sender));
  event.set(kEventClientVersion, _clientVersion);
  if (sessionID.isPresent()) event.set(kEventSessionID, std::move(sessionID));
  event.set(kEventEventNumber, numbers.eventID);
  event.set(kEventMethod, numbers.method);
  event.set(kEventStatus, numbers.respCode);
  const double clientTS =
      finiteOrMinusOne((timestamp.secondsSince1970() - _startTimeStamp) + static_cast<double>(startTS));
  event.set(kEventClientTS, clientTS);
  event.set(kEventEventTime, clientTS);
  addDeviceEntries(event);
  event.set(kEventTimezoneOffset, timezoneOffset(timestamp));
  return event;
}

void HTTPSPostBackend::addSessionStopEntries(Dictionary& payload) {
  log().message(
      "HTTPSPostBackend(sendMessage): Adding dnu type and sampling threshold to SESSION_TYPE_STOP message dictionary");
  payload.set(kEventOpt, static_cast<int32_t>(_dnuType));
  payload.set(kEventSamplingThreshold, orMinusOne(samplingThreshold()));
  payload.set(kEventOverrideSampling, orMinusOne(_overrideSampling));
  payload.set(kEventBatch, static_cast<uint8_t>(_batchEvents));
  payload.set(kEventTotalBytesSent, _totalBytesSent.exchange(0));
}

void HTTPSPostBackend::addDeviceEntries(Dictionary& event) const {
  event.set(kEventProductFamily, _productFamily);
  if (_hardwareType.has_value()) event.set(kEventProductModel, *_hardwareType);
  if (_productVersion.has_value()) event.set(kEventOSVersion, *_productVersion);
  if (_buildVersion.has_value()) event.set(kEventBuild, *_buildVersion);
  event.set(kEventInternal, static_cast<uint8_t>(_context.isInternalBuild()));
  event.set(kEventReportVers, selfVersionText());
}

void HTTPSPostBackend::prepareEvent(Dictionary& event, const Value& sharedData) const {
  if (_userInfoDict.has_value()) event.addEntriesFrom(*_userInfoDict);
  if (const Dictionary* entries = sharedData.dictionary()) event.addEntriesFrom(*entries);
}

// Time zones change at whole minutes, so the system is asked once for the events of a minute.
int64_t HTTPSPostBackend::timezoneOffset(Date timestamp) {
  const int64_t minute = timestamp.wholeSeconds() / kSecondsPerMinute;
  if (minute != _timezoneMinute) {
    const Platform& platform = _context.platform();
    _timezoneOffset = platform.locale.secondsFromGMT(platform.clock.now()).count();
    _timezoneMinute = minute;
  }
  return _timezoneOffset;
}

std::optional<String> HTTPSPostBackend::sendStandaloneEvent(Dictionary event, const QueueState& before,
                                                            const EventNumbers& numbers, uint32_t flag) {
  std::optional<String> flushed;
  if (before.state == TelvaneBackendStateEnabled && isRealtime(flag) && before.hasBatch) {
    log().message(
        "HTTPSPostBackend(sendMessage): Got a realtime event and some events have already been batched. Forcing Flush "
        "here to keep events in order.");
    flushed = flushMessagesWithCompletion(nullptr);
  }
  log().message("HTTPSPostBackend(sendMessage): Sending {}, {}, {}", before.state, static_cast<int>(_batchEvents),
                static_cast<int>(_requireUserInfo));
  std::vector<Dictionary> events;
  events.push_back(std::move(event));
  std::optional<PostMessage> message = createMessageForPostAndLogging(std::move(events));
  if (!message.has_value()) return std::nullopt;
  std::optional<String> text = std::move(message->prettyText);
  if (flushed.has_value()) {
    text = fmt::format("Flushed events:\n{}\nStandalone event:\n{}", *flushed, valueOf(text));
  }
  postJSONMessage(std::move(message->json), flag, &numbers, nullptr);
  if (flushed.has_value()) _immutable = true;
  return text;
}

// One visit to the state queue: the event comes in behind the flush that it caused.
std::optional<String> HTTPSPostBackend::batchEvent(Dictionary event) {
  std::optional<String> flushed;
  const uint64_t bytes = objectSizeEstimate(event);
  _stateQueue->sync([this, &event, &flushed, bytes] {
    _stateQueue->assertOnQueue();
    if (!_batchedEvents.has_value()) _batchedEvents.emplace();
    const uint16_t method = event[kEventMethod].low16Bits();
    if (countEvent(method)) {
      log().message(
          "HTTPSPostBackend(batchEvent): Flushing all batched events as we reached event threshold for method {}",
          method);
      flushed = flushForEvent(method);
    } else if (!hasRoomFor(bytes)) {
      flushed = flushForRoom(method);
    }
    if (!hasRoomFor(bytes)) {
      --_eventMethodCounts[method];
      ++_droppedEvents;
      return;
    }
    if (!_batchedEvents.has_value()) _batchedEvents.emplace();
    _batchedBytes += bytes;
    _batchedEvents->push_back(std::move(event));
  });
  return flushed;
}

std::optional<String> HTTPSPostBackend::flushForEvent(uint16_t method) {
  FlushCompletion none;
  std::optional<String> text = flushOnStateQueue(none).text;
  // The event that starts the next batch is the first of its count.
  _eventMethodCounts[method] = 1;
  return text;
}

// Leaves the batch alone when that has to wait for user info.
std::optional<String> HTTPSPostBackend::flushForRoom(uint16_t method) {
  if (_state == TelvaneBackendStateEnabled && lacksUserInfo()) return std::nullopt;
  log().message("HTTPSPostBackend(batchEvent): Flushing all batched events early as they take {} bytes", _batchedBytes);
  return flushForEvent(method);
}

// An event that is too large by itself waits alone.
bool HTTPSPostBackend::hasRoomFor(uint64_t bytes) const {
  return _batchedBytes == 0 || _batchedBytes + bytes <= kMaximumBatchBytes;
}

void HTTPSPostBackend::tellDroppedEvents() {
  if (_droppedEvents == 0) return;
  log().error(
      "HTTPSPostBackend(batchEvent): Dropped {} events, since those that wait took {} of {} bytes and cannot be "
      "flushed "
      "without user info",
      std::exchange(_droppedEvents, 0), _batchedBytes, kMaximumBatchBytes);
}

std::vector<Dictionary> HTTPSPostBackend::takeBatch() {
  tellDroppedEvents();
  _batchedBytes = 0;
  return *std::exchange(_batchedEvents, std::nullopt);
}

// Counts the event; returns whether the events that wait must go before it is one of them.
bool HTTPSPostBackend::countEvent(uint16_t method) {
  int32_t& count = _eventMethodCounts[method];
  if (count > _eventThreshold) return true;
  ++count;
  return false;
}

std::optional<String> HTTPSPostBackend::flushMessagesWithCompletion(FlushCompletion completion) {
  FlushResult result;
  _stateQueue->sync([this, &result, &completion] {
    _stateQueue->assertOnQueue();
    result = flushOnStateQueue(completion);
  });
  if (result.error.has_value() && completion) completion(std::nullopt, std::move(result.error));
  return result.text;
}

// Takes the completion along with a post; leaves it alone when it returns an error.
HTTPSPostBackend::FlushResult HTTPSPostBackend::flushOnStateQueue(FlushCompletion& completion) {
  if (_batchedEvents.has_value() && _state != TelvaneBackendStateEnabled) takeBatch();
  if (!_batchedEvents.has_value()) {
    return {.text = {}, .error = failure("Nothing to flush")};
  }
  if (lacksUserInfo()) {
    return {.text = {}, .error = failure("Can not flush: userInfo is required")};
  }
  log().message("HTTPSPostBackend(flushMessagesWithCompletion): called");
  std::optional<Dictionary> userInfo = _userInfoDict;
  if (userInfo.has_value()) _filters.filterEvent(*userInfo);
  std::vector<Dictionary> events = takeListedEvents(takeBatch(), userInfo);
  leaveRoomForUserInfo(events, userInfo);
  _eventMethodCounts.clear();
  std::optional<PostMessage> message;
  if (!events.empty()) message = createMessageForPostAndLogging(std::move(events));
  if (!message.has_value()) {
    return {.text = {}, .error = failure("Nothing to flush: batched events were completely filtered out")};
  }
  return {.text = postBatch(*std::move(message), completion), .error = {}};
}

std::optional<String> HTTPSPostBackend::postBatch(PostMessage message, FlushCompletion& completion) {
  FlushCompletion finish;
  if (completion) {
    finish = [completion = std::move(completion), text = message.prettyText](const std::optional<String>&,
                                                                             std::optional<Error> error) mutable {
      completion(text, std::move(error));
    };
  }
  postJSONMessage(std::move(message.json), kOrdinaryFlag, nullptr, std::move(finish));
  if (message.prettyText.has_value()) _immutable = true;
  return std::move(message.prettyText);
}

// Events share their user info, the body has it once for each. What was there when an event was made is counted with
// the event, so this is about user info that has grown since.
void HTTPSPostBackend::leaveRoomForUserInfo(std::vector<Dictionary>& events,
                                            const std::optional<Dictionary>& userInfo) const {
  const uint64_t bytes = userInfo.has_value() ? objectSizeEstimate(*userInfo) : 0;
  const uint64_t most = bytes > 0 ? std::max<uint64_t>(kMaximumUserInfoBytes / bytes, 1) : events.size();
  if (events.size() <= most) return;
  log().error(
      "HTTPSPostBackend(flushMessagesWithCompletion): Dropped {} events, since each would take {} bytes of user info "
      "along",
      events.size() - most, bytes);
  events.erase(events.begin() + static_cast<std::ptrdiff_t>(most), events.end());
}

std::vector<Dictionary> HTTPSPostBackend::takeListedEvents(std::vector<Dictionary> events,
                                                           const std::optional<Dictionary>& userInfo) {
  const auto isDropped = [this, &userInfo](Dictionary& event) {
    const uint16_t method = event[kEventMethod].low16Bits();
    const bool isWhitelisted = isWhitelistedEvent(method);
    if (isWhitelisted && !isBlacklistedEvent(method)) {
      if (userInfo.has_value()) event.addEntriesFrom(*userInfo);
      return false;
    }
    log().message("flushMessagesWithCompletion: Dropping event with category {} as it is {} for backend {}", method,
                  isWhitelisted ? "blacklisted" : "not whitelisted", _name);
    return true;
  };
  events.erase(std::remove_if(events.begin(), events.end(), isDropped), events.end());
  return events;
}

std::optional<HTTPSPostBackend::PostMessage> HTTPSPostBackend::createMessageForPostAndLogging(
    std::vector<Dictionary> events) {
  Array list;
  list.reserve(events.size());
  for (Dictionary& event : events) {
    removeWhatJSONCannotHold(event);
    _filters.filterEvent(event);
    list.append(std::move(event));
  }
  Dictionary body;
  body.set(kBodyPostTime, finiteOrMinusOne(_context.platform().clock.now().secondsSince1970()));
  body.set(kBodyClientId, clientIdentifier());
  body.set(kBodyEvents, std::move(list));
  _filters.filterEvent(body);

  PostMessage message;
  message.json.reserve(_lastMessageSize + _lastMessageSize / 8);
  const Value root(std::move(body));
  if (const Result<void> written = json::append(root, json::Style::Compact, message.json); !written) {
    log().error("HTTPSPostBackend(createMessageForPostAndLogging): no JSON made: {}", written.error());
    return std::nullopt;
  }
  _lastMessageSize = message.json.size();
  if (isPrettyTextAllowed()) {
    if (Result<std::string> pretty = json::serialize(root, json::Style::Pretty)) message.prettyText = *pretty;
  }
  return message;
}

void HTTPSPostBackend::removeWhatJSONCannotHold(Dictionary& event) const {
  // A list or dictionary goes as a whole when something in it cannot be written: the rest of the batch must not go with
  // it.
  const auto isHeld = [this](const Value& value) {
    const bool isNested = value.isArray() || value.isDictionary();
    return (_allowNestedData || !isNested) && isWritable(value);
  };
  const auto holdsEntry = [&isHeld](const DictionaryEntry& entry) { return isHeld(entry.value); };
  if (std::all_of(event.begin(), event.end(), holdsEntry)) return;
  const Dictionary before = event;
  for (const DictionaryEntry& entry : before) {
    if (const Date* date = entry.value.date()) event.set(entry.key, finiteOrMinusOne(date->secondsSince1970()));
  }
  event.keepIf([this, &isHeld](const String& key, const Value& value) {
    if (isHeld(value)) return true;
    log().error(
        "HTTPSPostBackend(createMessageForPostAndLogging): NSJSONSerialization unable to handle key: {}, value: {}",
        shortDescription(key, kLongestDescription), shortDescription(value, kLongestDescription));
    return false;
  });
}

bool HTTPSPostBackend::isPrettyTextAllowed() const {
  if (_dnuType == DNUType::Respected && _dnuEnabled) return true;
  if (!_forceEventLogging) return false;
  const uint32_t environment = userDefaultsEnvironment(_context);
  return environment == kEnvironmentTypeDevelopment || environment == kEnvironmentTypeInternal;
}

String HTTPSPostBackend::clientIdentifier() const {
  if (_extrasOnInternal != 0 && _isInternal) return _udid;
  if (_uuidCustom.has_value()) return *_uuidCustom;
  return _dnuType == DNUType::Respected ? _uuidRespectDnu : _uuidOverrideDnu;
}

}  // namespace telvane
