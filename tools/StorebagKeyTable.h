#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "foundation/Key.h"

// What a storebag may hold: every key with its type, its default, what it means and what it does. docs/storebag.md
// shows these tables to a bag's author, and telvane-storebag lint holds bags against them; a test holds the two
// together.
namespace telvane {

// The kinds of dictionary in a storebag.
enum class StorebagLevel : uint8_t {
  Envelope,
  Bag,
  HTTPSProfile,
  ClientEntry,
  CountryThreshold,
  Filter,
  UploadProfile,
  DashboardProfile,
  PlainProfile,  // of a backend that reads nothing in it
};
inline constexpr StorebagLevel kStorebagLevels[] = {
    StorebagLevel::Envelope,         StorebagLevel::Bag,           StorebagLevel::HTTPSProfile,
    StorebagLevel::ClientEntry,      StorebagLevel::Filter,        StorebagLevel::CountryThreshold,
    StorebagLevel::DashboardProfile, StorebagLevel::UploadProfile, StorebagLevel::PlainProfile,
};

// What a key's value must look like.
enum class StorebagShape : uint8_t {
  Any,
  Text,
  Base64,
  Names,              // separated by commas
  Version,            // major.middle.minor
  PostURL,            // https, or devices make it so
  UploadURL,          // http or https; taken as it is
  DisplayURL,         // http or https
  Switch,             // 0 or 1
  Consent,            // 0 or 1, of which only exactly 1 counts
  RefreshSeconds,     // 0 to 86400
  TimeoutSeconds,     // 32 bits, unsigned
  EventThreshold,     // 32 bits, signed
  EventNumber,        // 16 bits, unsigned; negative for any
  IPv4Address,        // dotted
  Port,               // 1 to 65535
  Period,             // milliseconds, 10 to 60000
  Share,              // 0 to 1
  FilterAction,       // one of kFilterActions
  Texts,              // array
  Countries,          // array of codes
  Categories,         // array of 16-bit unsigned numbers
  ClientEntries,      // array of dictionaries
  Filters,            // array of dictionaries
  CountryThresholds,  // array of dictionaries
  Macros,             // dictionary of any values
  Section,            // dictionary of profiles
};

enum class StorebagPresence : uint8_t { Optional, Required };

struct StorebagKey {
  Key key;
  StorebagShape shape;
  StorebagPresence presence;
  std::string_view absent;  // the default, or what comes of it when a required key is missing
  std::string_view meaning;
  std::string_view effect;
};

inline constexpr std::string_view kFilterActions[] = {"remove", "sha256", "blacklistValues", "whitelistValues"};

// The keys of a kind of dictionary, in the order of the page.
std::span<const StorebagKey> storebagKeys(StorebagLevel level) noexcept;
// What the dictionary is called: "a client entry".
std::string_view storebagLevelName(StorebagLevel level) noexcept;
// What the value must be, without an article: "array of country codes".
std::string_view storebagShapeName(StorebagShape shape) noexcept;
// Returns the row; null when a dictionary of this kind has no such key.
const StorebagKey* findStorebagKey(StorebagLevel level, std::string_view key) noexcept;
// Returns another kind of dictionary that has the key.
std::optional<StorebagLevel> storebagLevelWithKey(std::string_view key) noexcept;

// Returns the candidate that the text was probably meant to be: the one that differs in the fewest letters, if that is
// no more than a third of them. Case does not count.
std::optional<std::string_view> nearestName(std::string_view text, std::span<const std::string_view> candidates);
// The same among the keys of a kind of dictionary.
std::optional<std::string_view> nearestStorebagKey(StorebagLevel level, std::string_view text);

}  // namespace telvane
