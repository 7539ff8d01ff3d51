#include "backends/EventFilter.h"

#include <algorithm>
#include <utility>

#include "backends/ListMatching.h"
#include "backends/TelvaneBackend.h"
#include "interfaces/EventKeys.h"
#include "interfaces/StorebagKeys.h"

namespace telvane {
namespace {

constexpr int32_t kAny = -1;
constexpr std::string_view kNone = "none";
constexpr std::string_view kRemove = "remove";
constexpr std::string_view kSHA256 = "sha256";
constexpr std::string_view kBlacklistValues = "blacklistValues";
constexpr std::string_view kWhitelistValues = "whitelistValues";

int32_t numberOrAny(const Value& value) noexcept { return value.isPresent() ? value.int32Value() : kAny; }

// Digests are of text; any other value is digested as the text that describes it.
String digestOf(const Value& value) {
  return TelvaneBackend::convertIntoSHA256(value.isString() ? value.text() : std::string_view(description(value)));
}

}  // namespace

EventFilter::EventFilter(const Array& entries) {
  _records.reserve(entries.size());
  for (const Value& entry : entries) {
    const Dictionary* fields = entry.dictionary();
    if (fields == nullptr || !(*fields)[kFilterKey].isString()) continue;
    Record record{.method = numberOrAny((*fields)[kFilterMethod]),
                  .status = numberOrAny((*fields)[kFilterStatus]),
                  .action = actionForText((*fields)[kFilterAction].text()),
                  .key = *(*fields)[kFilterKey].string(),
                  .values = {}};
    if (const Array* values = (*fields)[kFilterValue].array()) {
      for (const Value& value : *values) {
        if (value.isString()) record.values.push_back(*value.string());
      }
    }
    _keyMarks |= keyMark(record.key);
    _records.push_back(std::move(record));
  }
}

EventFilter::Action EventFilter::actionForText(std::string_view text) noexcept {
  if (text == kRemove) return Action::Remove;
  if (text == kSHA256) return Action::SHA256;
  if (text == kBlacklistValues) return Action::BlacklistValues;
  if (text == kWhitelistValues) return Action::WhitelistValues;
  return Action::None;
}

std::string_view EventFilter::textForAction(Action action) noexcept {
  switch (action) {
    case Action::None:
      return kNone;
    case Action::Remove:
      return kRemove;
    case Action::SHA256:
      return kSHA256;
    case Action::BlacklistValues:
      return kBlacklistValues;
    case Action::WhitelistValues:
      return kWhitelistValues;
  }
  return kNone;
}

// Keys that are equal but for case share a mark; of others few do.
uint64_t EventFilter::keyMark(std::string_view key) noexcept {
  constexpr unsigned kCaseBit = 0x20;
  constexpr size_t kFactor = 7;  // odd, so that each part counts
  constexpr size_t kMarks = 64;
  if (key.empty()) return 1;
  const size_t first = static_cast<uint8_t>(key.front()) | kCaseBit;
  const size_t last = static_cast<uint8_t>(key.back()) | kCaseBit;
  return uint64_t{1} << (((key.size() * kFactor + first) * kFactor + last) % kMarks);
}

Array EventFilter::description() const {
  Array descriptions;
  descriptions.reserve(_records.size());
  for (const Record& record : _records) {
    Dictionary fields{{kFilterKey, record.key}, {kFilterAction, textForAction(record.action)}};
    if (record.method >= 0) fields.set(kFilterMethod, record.method);
    if (record.status >= 0) fields.set(kFilterStatus, record.status);
    Array values;
    for (const String& value : record.values) values.append(value);
    if (!values.empty()) fields.set(kFilterValue, std::move(values));
    descriptions.append(std::move(fields));
  }
  return descriptions;
}

void EventFilter::filterEvent(Dictionary& event) const {
  if (_records.empty()) return;
  const int32_t method = event[kEventMethod].int32Value();
  const int32_t status = event[kEventStatus].int32Value();
  std::vector<std::pair<String, Value>> digests;
  // One pass, however many spellings of a filtered key a client has sent.
  event.keepIf([this, method, status, &digests](const String& key, const Value& value) {
    if ((_keyMarks & keyMark(key)) == 0) return true;
    const Record* record = firstRecordFor(key, method, status);
    const Outcome outcome = record != nullptr ? outcomeFor(*record, value) : Outcome::Stays;
    if (outcome == Outcome::Digested) digests.emplace_back(key, digestOf(value));
    return outcome != Outcome::Goes;
  });
  for (auto& [key, digest] : digests) event.set(key, std::move(digest));
}

const EventFilter::Record* EventFilter::firstRecordFor(std::string_view key, int32_t method,
                                                       int32_t status) const noexcept {
  const auto found = std::find_if(_records.begin(), _records.end(), [=](const Record& record) {
    return (record.method < 0 || record.method == method) && (record.status < 0 || record.status == status) &&
           equalsIgnoringCase(record.key, key);
  });
  return found != _records.end() ? &*found : nullptr;
}

EventFilter::Outcome EventFilter::outcomeFor(const Record& record, const Value& value) noexcept {
  switch (record.action) {
    case Action::None:
      return Outcome::Stays;
    case Action::Remove:
      return Outcome::Goes;
    case Action::SHA256:
      return Outcome::Digested;
    case Action::BlacklistValues:
      return value.isString() && containsOneOf(value, record.values) ? Outcome::Goes : Outcome::Stays;
    case Action::WhitelistValues:
      return value.isString() && !containsOneOf(value, record.values) ? Outcome::Goes : Outcome::Stays;
  }
  return Outcome::Stays;
}

bool EventFilter::containsOneOf(const Value& value, const std::vector<String>& parts) noexcept {
  return std::any_of(parts.begin(), parts.end(),
                     [text = value.text()](const String& part) { return containsIgnoringCase(text, part); });
}

}  // namespace telvane
