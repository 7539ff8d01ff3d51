#pragma once

#include <cstdint>
#include <string_view>
#include <vector>

#include "foundation/Value.h"

namespace telvane {

// The field filters of a storebag's client entry: what is taken out of events, or made unreadable, before they leave.
// Prepared once, so that an event without anything to filter costs a look at the ends of its keys. A value.
class EventFilter {
 public:
  EventFilter() = default;
  // entries: dictionaries with "method", "status", "key", "value" and "action", in the order in which they are tried.
  // What is missing or of a wrong type: any method, any status, no key (which matches nothing), no texts, no action. An
  // entry that is no dictionary is left out; a backend that must not report unfiltered looks for those before.
  explicit EventFilter(const Array& entries);

  bool empty() const noexcept { return _records.empty(); }
  // Tells what the records do, in the order in which they are tried: dictionaries with "key" and "action" ("none" for
  // one that does nothing), and "method", "status" and "value" where they narrow it.
  Array description() const;
  // Applies to each key the first record that fits it and the event's "_method" and "_status"; no other record touches
  // that key, also when that one has no action.
  void filterEvent(Dictionary& event) const;

 private:
  enum class Action : uint8_t { None, Remove, SHA256, BlacklistValues, WhitelistValues };

  struct Record {
    int32_t method;  // negative: any
    int32_t status;  // negative: any
    Action action;
    String key;
    std::vector<String> values;
  };

  enum class Outcome : uint8_t { Stays, Goes, Digested };

  static Action actionForText(std::string_view text) noexcept;
  static std::string_view textForAction(Action action) noexcept;
  static uint64_t keyMark(std::string_view key) noexcept;
  static bool containsOneOf(const Value& value, const std::vector<String>& parts) noexcept;
  const Record* firstRecordFor(std::string_view key, int32_t method, int32_t status) const noexcept;
  static Outcome outcomeFor(const Record& record, const Value& value) noexcept;

  std::vector<Record> _records;
  uint64_t _keyMarks = 0;  // one bit for the mark of each record's key
};

}  // namespace telvane
