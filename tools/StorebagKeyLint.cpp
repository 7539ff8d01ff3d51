#include "tools/StorebagKeyLint.h"

#include <fmt/format.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>

#include "interfaces/StorebagKeys.h"
#include "platform/IPv4SocketAddress.h"
#include "tools/LintText.h"
#include "tools/URLText.h"

namespace telvane {
namespace {

using linttext::pathTo;
using linttext::quoted;
using linttext::shortForm;
using Shape = StorebagShape;

constexpr std::string_view kMacroPrefix = "==";
constexpr std::string_view kMaxAge = "max-age";
constexpr std::string_view kReadAsAbsent = "devices go on as if it were not there";
constexpr std::string_view kReadAsZero = "devices read it as 0";
constexpr double kSamplingSteps = 10000;
constexpr double kRounding = 1e-6;  // what a decimal fraction may lack of its step
constexpr int64_t kMostRefreshSeconds = 86400;
constexpr int64_t kLastCategory = std::numeric_limits<uint16_t>::max();
constexpr int64_t kShortestPeriod = 10;
constexpr int64_t kLongestPeriod = 60000;
constexpr size_t kVersionParts = 3;
constexpr int kLastVersionPart = 255;

struct Range {
  int64_t least;
  int64_t most;
};

// Outside it, the number does not do what it says.
Range rangeOf(Shape shape) noexcept {
  switch (shape) {
    case Shape::RefreshSeconds:
      return {0, std::numeric_limits<int32_t>::max()};
    case Shape::TimeoutSeconds:
      return {0, std::numeric_limits<uint32_t>::max()};
    case Shape::EventNumber:
      return {std::numeric_limits<int32_t>::min(), kLastCategory};
    case Shape::Port:
      return {1, kLastCategory};
    case Shape::Period:
      return {kShortestPeriod, kLongestPeriod};
    case Shape::Consent:
      return {0, 1};
    default:
      return {std::numeric_limits<int32_t>::min(), std::numeric_limits<int32_t>::max()};
  }
}

std::optional<double> numberInText(std::string_view text) {
  double number = 0;
  const auto [end, fault] = std::from_chars(text.data(), text.data() + text.size(), number);
  const bool isWhole = fault == std::errc() && end == text.data() + text.size();
  return isWhole ? std::optional(number) : std::nullopt;
}

bool hasBlankAtAnEnd(std::string_view text) {
  const auto isBlank = [](char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; };
  return !text.empty() && (isBlank(text.front()) || isBlank(text.back()));
}

// A reference to a macro that is not defined has its finding already.
bool isMacroReference(const Value& value) { return value.isString() && value.text().starts_with(kMacroPrefix); }

bool isBetween(char c, char first, char last) noexcept { return c >= first && c <= last; }

bool areAll(std::string_view text, char first, char last) {
  return std::all_of(text.begin(), text.end(), [first, last](char c) { return isBetween(c, first, last); });
}

std::string upperCased(std::string_view text) {
  std::string result(text);
  for (char& c : result) c = isBetween(c, 'a', 'z') ? static_cast<char>(c - 'a' + 'A') : c;
  return result;
}

}  // namespace

void StorebagKeyLint::lint(const std::string& path, StorebagLevel level, const Dictionary& dictionary) {
  for (const DictionaryEntry& entry : dictionary) {
    if (!_report.mayGoOn()) return;
    const std::string place = pathTo(path, entry.key);
    const StorebagKey* row = findStorebagKey(level, entry.key);
    if (row != nullptr) {
      lintValue(place, *row, entry.value);
    } else {
      lintUnknownKey(place, level, entry.key);
    }
  }
  for (const StorebagKey& row : storebagKeys(level)) {
    if (row.presence != StorebagPresence::Required || dictionary.contains(row.key)) continue;
    _report.error(pathTo(path, row.key),
                  fmt::format("is missing: {}; add it ({})", row.absent, storebagShapeName(row.shape)));
  }
}

void StorebagKeyLint::reportKind(const std::string& path, std::string_view wanted, const Value& value,
                                 std::string_view consequence) {
  if (isMacroReference(value)) return;
  _report.error(path, fmt::format("is {}, and {}; make it: {}", linttext::kindName(value), consequence, wanted));
}

void StorebagKeyLint::lintUnknownKey(const std::string& path, StorebagLevel level, std::string_view key) {
  const std::string_view where = storebagLevelName(level);
  if (level == StorebagLevel::Envelope) {
    _report.warning(path, fmt::format("is no key of {} and is ignored; remove it", where));
  } else if (key.starts_with(kMacroPrefix)) {
    _report.error(path, "is a macro where a key stands; macros stand for values only, so write the key itself");
  } else if (key == kMaxAge) {
    _report.error(path, "is a header of the server's answer, not a key, and is ignored; write \"refresh_cycle\"");
  } else if (const auto nearest = nearestStorebagKey(level, key)) {
    _report.error(path, fmt::format("is no key of {} and is ignored; did you mean \"{}\"?", where, *nearest));
  } else if (const auto other = storebagLevelWithKey(key)) {
    _report.error(path, fmt::format("is a key of {}, not of {}, and is ignored; move it there or remove it",
                                    storebagLevelName(*other), where));
  } else {
    _report.error(path, fmt::format("is no key of {} and is ignored; remove it", where));
  }
}

void StorebagKeyLint::lintValue(const std::string& path, const Row& row, const Value& value) {
  switch (row.shape) {
    case Shape::Any:
      return lintPresence(path, value);
    case Shape::Text:
    case Shape::Base64:
      return lintText(path, row, value);
    case Shape::Names:
      return lintNames(path, row, value);
    case Shape::Version:
      return lintVersion(path, row, value);
    case Shape::PostURL:
    case Shape::UploadURL:
    case Shape::DisplayURL:
      return lintURL(path, row, value);
    case Shape::IPv4Address:
      return lintIPv4Address(path, row, value);
    case Shape::FilterAction:
      return lintAction(path, row, value);
    case Shape::Switch:
    case Shape::Consent:
    case Shape::RefreshSeconds:
    case Shape::TimeoutSeconds:
    case Shape::EventThreshold:
    case Shape::EventNumber:
    case Shape::Port:
    case Shape::Period:
      return lintWholeNumber(path, row, value);
    case Shape::Share:
      return lintShare(path, row, value);
    case Shape::Texts:
      return lintTexts(path, row, value);
    case Shape::Countries:
      return lintCountries(path, row, value);
    case Shape::Categories:
      return lintCategories(path, row, value);
    case Shape::ClientEntries:
    case Shape::Filters:
    case Shape::CountryThresholds:
      return lintEntries(path, row, value);
    case Shape::Macros:
    case Shape::Section:
      return lintDictionary(path, row, value);
  }
}

// Texts.

void StorebagKeyLint::lintText(const std::string& path, const Row& row, const Value& value) {
  if (!value.isString()) return reportKind(path, storebagShapeName(row.shape), value, kReadAsAbsent);
  if (value.text().empty()) _report.error(path, "is empty; write what it is for, or take the whole away");
}

// A name that cannot be met is an error where names are compared whole; a part of a service's name may well hold a
// blank.
void StorebagKeyLint::lintNames(const std::string& path, const Row& row, const Value& value) {
  const bool isWhole = row.key == kClientEntryClient;
  const std::string all = isWhole ? "all clients" : "all services";
  if (!value.isString()) return reportKind(path, storebagShapeName(row.shape), value, "the entry is for " + all);
  std::string_view rest = value.text();
  if (rest.empty()) {
    _report.error(path, fmt::format("is empty and fits no name; take it out to mean {}", all));
    return;
  }
  for (size_t comma = 0; comma != std::string_view::npos && _report.mayGoOn();) {
    comma = rest.find(',');
    const std::string_view name = rest.substr(0, comma);
    if (name.empty()) {
      _report.warning(path, "has a comma with no name beside it; take the comma out");
    } else if (hasBlankAtAnEnd(name)) {
      const std::string text =
          fmt::format("has the name {}, of which the blank is a part; take the blank out", quoted(name));
      isWhole ? _report.error(path, text) : _report.warning(path, text);
    }
    if (comma != std::string_view::npos) rest.remove_prefix(comma + 1);
  }
}

void StorebagKeyLint::lintVersion(const std::string& path, const Row& row, const Value& value) {
  if (!value.isString()) return reportKind(path, storebagShapeName(row.shape), value, "the entry is for all versions");
  constexpr std::string_view kForm = "write major.middle.minor, each 0 to 255";
  std::string_view rest = value.text();
  size_t parts = 0;
  for (size_t point = 0; point != std::string_view::npos; ++parts) {
    point = rest.find('.');
    const std::string_view part = rest.substr(0, point);
    if (point != std::string_view::npos) rest.remove_prefix(point + 1);
    if (parts >= kVersionParts) continue;
    const bool isNumber = !part.empty() && part.size() <= 9 && areAll(part, '0', '9');
    if (!isNumber) return _report.error(path, fmt::format("{} is no version; {}", quoted(value.text()), kForm));
    if (Value(part).integerValue() > kLastVersionPart) {
      return _report.error(path, fmt::format("{} has a part above 255, of which devices see the low 8 bits; {}",
                                             quoted(value.text()), kForm));
    }
  }
  if (parts == kVersionParts) return;
  const char* what = parts < kVersionParts ? "lacks parts, which count as 0"
                                           : "has more than three parts, of which the rest is ignored";
  _report.warning(path, fmt::format("{} {}; {}", quoted(value.text()), what, kForm));
}

void StorebagKeyLint::lintURL(const std::string& path, const Row& row, const Value& value) {
  if (!value.isString()) return reportKind(path, storebagShapeName(row.shape), value, kReadAsAbsent);
  if (isMacroReference(value)) return;
  const URLText::Parsed parsed = URLText::parse(value.text());
  if (!parsed.url.has_value()) {
    _report.error(path,
                  fmt::format("{} is no URL: it {}; write https://HOST/PATH", quoted(value.text()), parsed.fault));
    return;
  }
  const URLText& url = *parsed.url;
  if (row.shape == Shape::UploadURL && row.presence == StorebagPresence::Required &&
      value.text().find_first_of("?#") != std::string_view::npos) {
    _report.error(path,
                  fmt::format("{} has a query or fragment of its own, behind which devices add theirs; take it out",
                              quoted(value.text())));
  }
  if (url.isPlaceholder) {
    _report.warning(path, fmt::format("still has the mark {}; put HOST or HOST:PORT there before you sign", url.host));
  }
  if (url.hasScheme("https")) return;
  if (!url.hasScheme("http")) {
    const bool isRewritten = row.shape == Shape::PostURL && _audience != Audience::InternalBuilds;
    if (isRewritten) {
      _report.error(
          path, fmt::format("has the scheme {}, in whose place devices take https; write https", quoted(url.scheme)));
      return;
    }
    _report.error(path, fmt::format("has the scheme {}, which nobody speaks here; write https", quoted(url.scheme)));
    return;
  }
  lintPlainHTTP(path, row);
}

void StorebagKeyLint::lintPlainHTTP(const std::string& path, const Row& row) {
  if (row.shape == Shape::DisplayURL) {
    _report.warning(path, "is plain http, where anybody on the way can read and alter the page; use https");
  } else if (row.shape == Shape::UploadURL) {
    _report.warning(path, "is plain http: devices post unencrypted, for anybody on the way to read; use https");
  } else if (_audience == Audience::InternalBuilds) {
    _report.warning(path, "is plain http: internal builds send events unencrypted, all others to https; write https");
  } else {
    _report.error(path, "is plain http, and devices post to https on the same host and port; write https");
  }
}

// By the rule of the devices themselves.
void StorebagKeyLint::lintIPv4Address(const std::string& path, const Row& row, const Value& value) {
  if (!value.isString()) return reportKind(path, storebagShapeName(row.shape), value, row.absent);
  if (isMacroReference(value) || ipv4SocketAddress(value.text(), 0).has_value()) return;
  _report.error(path, fmt::format("{} is no dotted IPv4 address, and {}; write four numbers from 0 to 255 with points "
                                  "between them, such as 192.0.2.1",
                                  quoted(value.text()), row.absent));
}

void StorebagKeyLint::lintAction(const std::string& path, const Row& row, const Value& value) {
  if (!value.isString()) return reportKind(path, storebagShapeName(row.shape), value, "the filter does nothing");
  const std::string_view text = value.text();
  if (std::find(std::begin(kFilterActions), std::end(kFilterActions), text) != std::end(kFilterActions)) return;
  if (isMacroReference(value)) return;
  const auto nearest = nearestName(text, kFilterActions);
  const std::string advice = nearest ? fmt::format("did you mean \"{}\"?", *nearest)
                                     : fmt::format("write one of {}", fmt::join(kFilterActions, ", "));
  _report.error(path, fmt::format("{} is no action, so the field stays as it is; {}", quoted(text), advice));
}

// It is enough that the key is there, so a value that says no says it in vain.
void StorebagKeyLint::lintPresence(const std::string& path, const Value& value) {
  const std::string_view text = value.text();
  const bool isNo =
      value.isString() ? text == "0" || text == "no" || text == "false" : value.isNumber() && !value.booleanValue();
  if (!isNo) return;
  _report.error(path, fmt::format("is {} and yet counts, because the key is there; take the key out to switch it off",
                                  shortForm(value)));
}

// Numbers.

std::optional<double> StorebagKeyLint::numberOf(const std::string& path, const Row& row, const Value& value,
                                                std::string_view consequence) {
  const std::string_view wanted = storebagShapeName(row.shape);
  if (value.isString()) {
    const std::optional<double> number = numberInText(value.text());
    if (!number.has_value()) {
      if (isMacroReference(value)) return std::nullopt;
      _report.error(path, fmt::format("{} is no number; make it: {}", quoted(value.text()), wanted));
      return std::nullopt;
    }
    _report.warning(
        path, fmt::format("is the text {}, in which devices look for a number; write a number", quoted(value.text())));
    return number;
  }
  if (!value.isNumber()) {
    reportKind(path, wanted, value, consequence);
    return std::nullopt;
  }
  const double number = value.realValue();
  if (std::isfinite(number)) return number;
  _report.error(path, fmt::format("is {}, which is no finite number; make it: {}", shortForm(value), wanted));
  return std::nullopt;
}

void StorebagKeyLint::lintWholeNumber(const std::string& path, const Row& row, const Value& value) {
  const bool isSwitch = row.shape == Shape::Switch || row.shape == Shape::Consent;
  const std::optional<double> number = numberOf(path, row, value, kReadAsZero);
  if (!number.has_value()) return;
  if (value.kind() == Value::Kind::Boolean && !isSwitch) {
    _report.warning(path, fmt::format("is {}, which devices read as {:g}; write a number", shortForm(value), *number));
  }
  if (std::trunc(*number) != *number) {
    _report.warning(
        path, fmt::format("is {}, of which devices cut the fraction off; write a whole number", shortForm(value)));
  }
  const Range range = rangeOf(row.shape);
  const bool isInRange =
      *number > static_cast<double>(range.least) - 1 && *number < static_cast<double>(range.most) + 1;
  if (isInRange) return lintRange(path, row, static_cast<int64_t>(*number));
  reportOutOfRange(path, row, value);
}

void StorebagKeyLint::reportOutOfRange(const std::string& path, const Row& row, const Value& value) {
  const Range range = rangeOf(row.shape);
  std::string consequence = fmt::format("is out of range ({} to {})", range.least, range.most);
  if (row.shape == Shape::EventNumber) consequence = "fits no event";
  if (row.shape == Shape::Consent) consequence = "means nothing and counts as 0";
  if (row.shape == Shape::Port) {
    consequence = fmt::format("has more than 16 bits, of which devices take the low ones: {}", value.low16Bits());
    if (value.low16Bits() == 0) consequence = "is the port 0 for devices, which nobody listens on";
  }
  if (row.shape == Shape::Period) {
    const int64_t period = value.integerValue();
    consequence = period <= 0 ? "counts as 500" : fmt::format("counts as {}", period < kShortestPeriod ? 10 : 60000);
  }
  _report.error(
      path, fmt::format("is {}, which {}; make it: {}", shortForm(value), consequence, storebagShapeName(row.shape)));
}

// Numbers that do what they say, which may not be what was meant.
void StorebagKeyLint::lintRange(const std::string& path, const Row& row, int64_t number) {
  if (row.shape == Shape::RefreshSeconds && number > kMostRefreshSeconds) {
    _report.warning(path, fmt::format("is {}, which counts as 86400; write 86400 or less", number));
  } else if (row.shape == Shape::RefreshSeconds && number == 0) {
    _report.warning(path, "is 0: every session has the bag read and verified anew; write the seconds it may be kept");
  } else if (row.shape == Shape::Switch && number != 0 && number != 1) {
    _report.warning(path, fmt::format("is {}, which counts as 1; write 0 or 1", number));
  } else if (row.shape == Shape::EventThreshold && number < 0) {
    _report.warning(
        path, fmt::format("is {}: every event posts what waits; to post events one by one, set expedite to 1", number));
  }
}

void StorebagKeyLint::lintShare(const std::string& path, const Row& row, const Value& value) {
  const std::optional<double> number = numberOf(path, row, value, kReadAsAbsent);
  if (!number.has_value()) return;
  if (value.kind() == Value::Kind::Boolean) {
    _report.warning(path, fmt::format("is {}, which devices read as {:g}; write a number", shortForm(value), *number));
  }
  if (*number < 0) {
    _report.error(path, fmt::format("is {}, and no share is below 0; make it: {}", shortForm(value),
                                    storebagShapeName(row.shape)));
  } else if (*number > 1) {
    _report.error(path, fmt::format("is {}, and 1 is all devices already; make it: {} (10 percent is 0.1)",
                                    shortForm(value), storebagShapeName(row.shape)));
  } else if (const double steps = *number * kSamplingSteps; std::abs(steps - std::round(steps)) > kRounding) {
    _report.warning(path, fmt::format("is {}, finer than devices draw: a share goes in steps of 0.0001; write {:g}",
                                      shortForm(value), std::ceil(steps) / kSamplingSteps));
  }
}

// Arrays and dictionaries.

const Array* StorebagKeyLint::elementsOf(const std::string& path, const Row& row, const Value& value,
                                         std::string_view consequence) {
  if (value.isArray()) return value.array();
  reportKind(path, storebagShapeName(row.shape), value, consequence);
  return nullptr;
}

void StorebagKeyLint::lintTexts(const std::string& path, const Row& row, const Value& value) {
  const Array* elements = elementsOf(path, row, value, "devices read it as an empty array");
  if (elements == nullptr) return;
  for (size_t i = 0; i < elements->size() && _report.mayGoOn(); ++i) {
    const Value& element = (*elements)[i];
    const std::string place = pathTo(path, i);
    if (!element.isString()) {
      reportKind(place, "text", element, "it fits nothing");
    } else if (element.text().empty()) {
      _report.error(place, "is empty and fits nothing; take it out");
    } else if (hasBlankAtAnEnd(element.text())) {
      _report.warning(place,
                      fmt::format("is {}, of which the blank is a part; take the blank out", quoted(element.text())));
    }
  }
}

void StorebagKeyLint::lintCountries(const std::string& path, const Row& row, const Value& value) {
  const Array* elements = elementsOf(path, row, value, "devices read it as an empty array");
  if (elements == nullptr) return;
  if (elements->empty()) _report.error(path, fmt::format("is empty: {}; name the countries", row.absent));
  for (size_t i = 0; i < elements->size() && _report.mayGoOn(); ++i) {
    const Value& element = (*elements)[i];
    if (element.isString()) {
      lintCountry(pathTo(path, i), row, element.text());
    } else {
      reportKind(pathTo(path, i), "text, a country code", element, "it fits no device");
    }
  }
}

// A wider region has three digits (419 is Latin America); a device can be set to one.
void StorebagKeyLint::lintCountry(const std::string& path, const Row& row, std::string_view code) {
  const bool isRegion = code.size() == 3 && areAll(code, '0', '9');
  if (isRegion || (code.size() == 2 && areAll(code, 'A', 'Z')) || code.starts_with(kMacroPrefix)) return;
  const std::string upper = upperCased(code);
  const bool isCaseOnly = code.size() == 2 && areAll(upper, 'A', 'Z');
  const bool isContainedIn = row.key == kClientEntryLocaleWhitelist;
  if (isCaseOnly && isContainedIn) {
    _report.warning(path, fmt::format("{} is in lower case; write \"{}\", as everywhere else", quoted(code), upper));
  } else if (isCaseOnly) {
    _report.error(path, fmt::format("{} equals no device's country code; write \"{}\"", quoted(code), upper));
  } else if (code.size() == 1 && isContainedIn) {
    _report.error(path, fmt::format("{} fits every country whose code has that letter; write two upper-case letters",
                                    quoted(code)));
  } else if (hasBlankAtAnEnd(code)) {
    _report.error(
        path, fmt::format("{} has a blank that is part of it, and fits no device; take the blank out", quoted(code)));
  } else {
    _report.error(path,
                  fmt::format("{} is no country code and fits no device; write two upper-case letters", quoted(code)));
  }
}

void StorebagKeyLint::lintCategories(const std::string& path, const Row& row, const Value& value) {
  const bool isWhitelist = row.key == kClientEntryEventWhitelist;
  const Array* elements = elementsOf(path, row, value,
                                     isWhitelist ? "devices read it as an empty array, which admits nothing"
                                                 : "devices read it as an empty array, which bars nothing");
  if (elements == nullptr) return;
  if (elements->empty() && isWhitelist) {
    _report.warning(path, "is empty and admits no category: nothing is reported; take it out to admit all");
  }
  for (size_t i = 0; i < elements->size() && _report.mayGoOn(); ++i) lintCategory(pathTo(path, i), row, (*elements)[i]);
}

void StorebagKeyLint::lintCategory(const std::string& path, const Row& row, const Value& value) {
  const std::optional<double> number = numberOf(path, row, value, "devices read it as the category 0");
  if (!number.has_value()) return;
  if (*number < 0 || *number > static_cast<double>(kLastCategory)) {
    _report.error(path, fmt::format("is {}, which is no category; write 0 to 65535", shortForm(value)));
  } else if (std::trunc(*number) != *number || value.kind() == Value::Kind::Boolean) {
    _report.warning(path, fmt::format("is {}, which devices read as {:g}; write a whole number", shortForm(value),
                                      std::trunc(*number)));
  }
}

void StorebagKeyLint::lintEntries(const std::string& path, const Row& row, const Value& value) {
  const bool isRequired = row.presence == StorebagPresence::Required;
  const Array* elements = elementsOf(path, row, value, isRequired ? row.absent : kReadAsAbsent);
  if (elements != nullptr && elements->empty() && row.shape == Shape::ClientEntries) {
    _report.error(path, fmt::format("is empty: {}; add an entry, or take the backend out", row.absent));
  }
}

void StorebagKeyLint::lintDictionary(const std::string& path, const Row& row, const Value& value) {
  const Dictionary* dictionary = value.dictionary();
  if (dictionary == nullptr) {
    reportKind(path, storebagShapeName(row.shape), value,
               row.shape == Shape::Macros ? std::string_view("there are no macros") : row.absent);
  } else if (dictionary->empty() && row.shape == Shape::Section) {
    _report.warning(path, "names no backend: devices of this environment report nothing; name one");
  }
}

}  // namespace telvane
