#include "tools/StorebagLint.h"

#include <fmt/format.h>

#include <array>
#include <vector>

#include "foundation/Base64.h"
#include "interfaces/BackendNames.h"
#include "interfaces/ClientTypes.h"
#include "interfaces/StorebagKeys.h"
#include "platform/PropertyList.h"
#include "platform/log/NullLog.h"
#include "storebag/StorebagMacros.h"
#include "tools/ClientEntryLint.h"
#include "tools/ClientListLint.h"
#include "tools/LintText.h"
#include "tools/MacroLint.h"
#include "tools/RepeatedKeys.h"
#include "tools/StorebagEnvelope.h"

namespace telvane {
namespace {

using linttext::pathTo;
using linttext::quoted;
using Audience = StorebagKeyLint::Audience;

struct Environment {
  Key key;
  Audience audience;
};

constexpr Environment kEnvironments[] = {
    {kEnvironmentDevelopment, Audience::InternalBuilds},
    {kEnvironmentInternal, Audience::InternalBuilds},
    {kEnvironmentSeed, Audience::Everybody},
    {kEnvironmentRelease, Audience::Everybody},
};

constexpr std::array<std::string_view, 7> kBackendNames = {
    kTelvaneBackendHTTPPost,     kTelvaneBackendHTTPPost2, kTelvaneBackendQRS, kTelvaneBackendDashboard,
    kTelvaneBackendUploadServer, kTelvaneBackendWattbook,  kTelvaneBackendVDR};

StorebagLevel levelOf(BackendKind kind) noexcept {
  switch (kind) {
    case BackendKind::HTTPSPost:
      return StorebagLevel::HTTPSProfile;
    case BackendKind::Dashboard:
      return StorebagLevel::DashboardProfile;
    case BackendKind::UploadServer:
      return StorebagLevel::UploadProfile;
    case BackendKind::Wattbook:
    case BackendKind::VDR:
    case BackendKind::Unknown:
      break;
  }
  return StorebagLevel::PlainProfile;
}

std::optional<Data> decoded(const Value& text) {
  return text.isString() ? base64DecodeIgnoringUnknownCharacters(text.text()) : std::nullopt;
}

}  // namespace

Result<LintReport> StorebagLint::lintFile(const Data& bytes, std::string_view bagName) {
  const Result<Dictionary> written = storebagenvelope::parseBag(bytes);
  if (written.has_error()) return written.error();
  LintReport report;
  RepeatedKeys(report, bytes.view()).lint();
  StorebagLint lint(report, bagName);
  if (written->contains(kEnvelopeBag) || written->contains(kEnvelopeSignature)) {
    lint.lintEnvelope(*written, propertylist::parse(bytes).has_value());
  } else {
    lint.lintInner(*written);
  }
  return report;
}

LintReport StorebagLint::lintBag(const Dictionary& bag, std::string_view bagName) {
  LintReport report;
  StorebagLint(report, bagName).lintInner(bag);
  return report;
}

void StorebagLint::lintEnvelope(const Dictionary& envelope, bool isPropertyList) {
  if (!isPropertyList)
    _report.error({}, "is an envelope in JSON, which no device reads; make it with telvane-storebag sign");
  StorebagKeyLint(_report, Audience::Everybody).lint({}, StorebagLevel::Envelope, envelope);
  const Value& signature = envelope[kEnvelopeSignature];
  if (const auto bytes = decoded(signature); signature.isString() && (!bytes.has_value() || bytes->empty())) {
    _report.error(kEnvelopeSignature, "is no base64; make the envelope with telvane-storebag sign");
  }
  if (!envelope[kEnvelopeBag].isString()) return;
  const std::optional<Data> bytes = decoded(envelope[kEnvelopeBag]);
  if (!bytes.has_value()) {
    _report.error(kEnvelopeBag, "is no base64; make the envelope with telvane-storebag sign");
    return;
  }
  const Result<Value> bag = propertylist::parse(*bytes);
  if (bag.has_error()) {
    _report.error(kEnvelopeBag, fmt::format("holds no property list ({}); make the envelope with telvane-storebag sign",
                                            bag.error().description()));
  } else if (!bag->isDictionary()) {
    _report.error(kEnvelopeBag, fmt::format("holds {}, not a bag; sign a dictionary", linttext::kindName(*bag)));
  } else {
    lintInner(*bag->dictionary());
  }
}

void StorebagLint::lintInner(const Dictionary& bag) {
  constexpr size_t kMostLevels = propertylist::Limits().maximumDepth;
  if (Value(bag).depth(kMostLevels + 1) > kMostLevels) {
    _report.error({},
                  fmt::format("is nested deeper than {} levels, and no device reads it; make it flatter", kMostLevels));
    return;
  }
  lintForm(bag);
  StorebagKeyLint(_report, Audience::Everybody).lint({}, StorebagLevel::Bag, bag);
  lintMissingSections(bag);
  MacroLint macros(_report, bag);
  macros.lint();
  _report.setNotes(macros.notes());
  NullLog log;
  const Dictionary expanded = expandStorebag(log, bag);
  for (const Environment& environment : kEnvironments) {
    const std::string place = pathTo({}, environment.key);
    const Value& section = expanded[environment.key];
    if (section.isDictionary()) {
      lintSection(place, *section.dictionary(), environment.audience);
    } else if (!(section == bag[environment.key])) {
      StorebagKeyLint(_report, environment.audience)
          .reportKind(place, storebagShapeName(StorebagShape::Section), section,
                      "devices of this environment get no bag");
    }
  }
}

// What JSON holds and a property list does not, and what is too much for a device.
void StorebagLint::lintForm(const Dictionary& bag) {
  const Result<Data> bytes = propertylist::serialize(bag, propertylist::Format::Binary);
  if (bytes.has_error()) {
    _report.error({},
                  fmt::format("cannot be made a property list ({}), so it cannot be signed; take out what it cannot "
                              "hold, such as null",
                              bytes.error().description()));
  } else if (const Result<Value> read = propertylist::parse(*bytes); read.has_error()) {
    _report.error({}, fmt::format("is refused by devices ({}); make it smaller", read.error().description()));
  }
}

// The section for customers is a required key.
void StorebagLint::lintMissingSections(const Dictionary& bag) {
  for (const Environment& environment : kEnvironments) {
    if (environment.key == kEnvironmentRelease || bag.contains(environment.key)) continue;
    const StorebagKey* row = findStorebagKey(StorebagLevel::Bag, environment.key);
    const bool isSeed = environment.key == kEnvironmentSeed;
    _report.warning(pathTo({}, environment.key),
                    fmt::format("is missing: {}; add it if you have such devices",
                                isSeed ? "seed devices take release and log an error each time" : row->absent));
  }
}

void StorebagLint::lintSection(const std::string& path, const Dictionary& section, Audience audience) {
  StorebagKeyLint keys(_report, audience);
  for (const DictionaryEntry& backend : section) {
    if (!_report.mayGoOn()) return;
    lintBackend(pathTo(path, backend.key), backend.key, backend.value, keys);
  }
}

void StorebagLint::lintBackend(const std::string& path, std::string_view name, const Value& profile,
                               StorebagKeyLint& keys) {
  const BackendKind kind = backendKindForName(name);
  if (kind == BackendKind::Unknown) return lintName(path, name);
  lintKind(path, kind);
  if (profile.isDictionary()) return lintProfile(path, *profile.dictionary(), levelOf(kind), keys);
  const bool isRead = levelOf(kind) != StorebagLevel::PlainProfile;
  keys.reportKind(path, "a dictionary, a profile", profile,
                  isRead ? "no backend is made" : "the backend is made all the same");
}

void StorebagLint::lintKind(const std::string& path, BackendKind kind) {
  if (kind == BackendKind::Dashboard) {
    _report.warning(path,
                    "gets every event, unfiltered and in clear, also of users who do not agree to diagnostics; take it "
                    "out unless that is meant");
  } else if (kind == BackendKind::Wattbook) {
    _report.warning(path, "gets no event: what sessions send does not reach the power log; take it out");
  } else if (kind == BackendKind::VDR) {
    lintClientTypes(path);
  }
}

// A bag does not hold its own name; where that is not known there is nothing to say.
void StorebagLint::lintClientTypes(const std::string& path) {
  std::vector<int32_t> types;
  bool isOfUse = false;
  for (const ClientType& type : allClientTypes()) {
    if (type.storebagName != _bagName) continue;
    types.push_back(type.number);
    isOfUse = isOfUse || hasWirelessDiagnostics(type.number);
  }
  if (types.empty() || isOfUse) return;
  _report.warning(path,
                  fmt::format("is made for the client types 7, 11 and 13 only, and the bag {} is read by {}: their "
                              "sessions log an error and go without it; take it out",
                              quoted(_bagName), fmt::join(types, ", ")));
}

void StorebagLint::lintName(const std::string& path, std::string_view name) {
  if (const StorebagKey* row = findStorebagKey(StorebagLevel::Bag, name)) {
    _report.error(path, fmt::format("is a key of {}, not a backend; move \"{}\" to the top of the bag",
                                    storebagLevelName(StorebagLevel::Bag), row->key.view()));
    return;
  }
  const auto nearest = nearestName(name, kBackendNames);
  _report.error(path,
                fmt::format("is the name of no backend, so none is made; {}",
                            nearest ? fmt::format("did you mean \"{}\"?", *nearest)
                                    : fmt::format("write one of {}, or a name with \"{}\" in it",
                                                  fmt::join(kBackendNames, ", "), kTelvaneBackendHTTPPost.view())));
}

void StorebagLint::lintProfile(const std::string& path, const Dictionary& profile, StorebagLevel level,
                               StorebagKeyLint& keys) {
  keys.lint(path, level, profile);
  const Array* clients = level == StorebagLevel::HTTPSProfile ? profile[kProfileClients].array() : nullptr;
  if (clients == nullptr) return;
  const std::string place = pathTo(path, kProfileClients);
  ClientEntryLint entries(_report, keys);
  for (size_t i = 0; i < clients->size() && _report.mayGoOn(); ++i) {
    const Value& entry = (*clients)[i];
    if (entry.isDictionary()) {
      entries.lint(pathTo(place, i), *entry.dictionary());
    } else {
      keys.reportKind(pathTo(place, i), "a dictionary, a client entry", entry, "it is passed over");
    }
  }
  ClientListLint(_report).lint(place, *clients);
}

}  // namespace telvane
