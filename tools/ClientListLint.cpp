#include "tools/ClientListLint.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>

#include "interfaces/StorebagKeys.h"
#include "tools/LintText.h"

namespace telvane {
namespace {

using linttext::pathTo;
using linttext::quoted;

std::vector<std::string> lowerCasedNames(const Value& value) {
  std::vector<std::string> names;
  if (!value.isString()) return names;
  std::string_view rest = value.text();
  for (size_t comma = 0; comma != std::string_view::npos;) {
    comma = rest.find(',');
    std::string& name = names.emplace_back(rest.substr(0, comma));
    for (char& c : name) c = c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
    if (comma != std::string_view::npos) rest.remove_prefix(comma + 1);
  }
  return names;
}

// As devices read it: up to three parts, of which each is cut to 8 bits.
std::tuple<uint8_t, uint8_t, uint8_t> versionOf(const Value& value) {
  std::array<uint8_t, 3> parts{};
  std::string_view rest = value.text();
  for (uint8_t& part : parts) {
    const size_t point = rest.find('.');
    part = static_cast<uint8_t>(Value(rest.substr(0, point)).unsignedValue());
    if (point == std::string_view::npos) break;
    rest.remove_prefix(point + 1);
  }
  return {parts[0], parts[1], parts[2]};
}

}  // namespace

void ClientListLint::lint(const std::string& path, const Array& clients) {
  for (size_t i = 0; i < clients.size() && _report.mayGoOn(); ++i) {
    const Dictionary* entry = clients[i].dictionary();
    if (entry == nullptr) continue;
    Reach reach = reachOf(*entry, i);
    lintEntry(pathTo(path, i), *entry, reach);
    keep(std::move(reach));
  }
}

ClientListLint::Reach ClientListLint::reachOf(const Dictionary& entry, size_t index) {
  return {.index = index,
          .clients = lowerCasedNames(entry[kClientEntryClient]),
          .services = lowerCasedNames(entry[kClientEntryService]),
          .enabledSince = versionOf(entry[kClientEntryEnabledSince])};
}

void ClientListLint::keep(Reach reach) {
  const size_t position = _earlier.size();
  if (reach.clients.empty()) _forEverybody.push_back(position);
  for (const std::string& client : reach.clients) _forClient[client].push_back(position);
  _earlier.push_back(std::move(reach));
}

void ClientListLint::lintEntry(const std::string& path, const Dictionary& entry, const Reach& reach) {
  const Taken taken = takenFrom(reach, By::NamesAndVersion);
  if (taken.isAll) {
    _report.error(path,
                  fmt::format("is never reached: whoever it is for, clients[{}] is for, too, and comes first; put "
                              "this entry before that one, or remove it",
                              taken.by));
    return;
  }
  if (taken.count > 0) {
    _report.warning(pathTo(path, kClientEntryClient),
                    fmt::format("names {}, whose sessions clients[{}] takes all; take the name out here or there",
                                quoted(taken.name), taken.by));
  }
  if (!entry.contains(kClientEntryExpedite)) return;
  const Taken first = takenFrom(reach, By::Names);
  if (!first.isAll) return;
  _report.warning(
      pathTo(path, kClientEntryExpedite),
      fmt::format("is never looked at: only the first entry that fits the names is asked, which is clients[{}] "
                  "whatever its enabledSince says; write it there",
                  first.by));
}

ClientListLint::Taken ClientListLint::takenFrom(const Reach& later, By by) {
  Taken taken;
  if (later.clients.empty()) {
    if (const auto taker = takerOfClient(std::nullopt, later, by)) taken = {.by = *taker, .isAll = true};
    return taken;
  }
  for (const std::string& client : later.clients) {
    const std::optional<size_t> taker = takerOfClient(client, later, by);
    if (!taker.has_value()) continue;
    ++taken.count;
    taken.name = client;
    taken.by = *taker;
  }
  taken.isAll = taken.count == later.clients.size();
  return taken;
}

// Each service part may be taken by another entry; one of them is named.
std::optional<size_t> ClientListLint::takerOfClient(const std::optional<std::string_view>& client, const Reach& later,
                                                    By by) {
  if (later.services.empty()) {
    const Reach* taker = takerOf(client, std::nullopt, later, by);
    return taker != nullptr ? std::optional(taker->index) : std::nullopt;
  }
  std::optional<size_t> index;
  for (const std::string& service : later.services) {
    const Reach* taker = takerOf(client, service, later, by);
    if (taker == nullptr) return std::nullopt;
    index = taker->index;
  }
  return index;
}

const ClientListLint::Reach* ClientListLint::takerOf(const std::optional<std::string_view>& client,
                                                     const std::optional<std::string_view>& service, const Reach& later,
                                                     By by) {
  const auto takes = [this, &service, &later, by](size_t position) {
    const Reach& earlier = _earlier[position];
    if (!_report.mayGoOn(1 + earlier.services.size())) return false;
    return (by == By::Names || earlier.enabledSince <= later.enabledSince) && takesService(earlier, service);
  };
  const auto firstOf = [this, &takes](const std::vector<size_t>& positions) -> const Reach* {
    const auto found = std::find_if(positions.begin(), positions.end(), takes);
    return found != positions.end() ? &_earlier[*found] : nullptr;
  };
  if (const Reach* taker = firstOf(_forEverybody)) return taker;
  if (!client.has_value()) return nullptr;
  const auto sameName = _forClient.find(std::string(*client));
  return sameName != _forClient.end() ? firstOf(sameName->second) : nullptr;
}

// Whatever contains the later part contains each part of that. An empty part is in no name.
bool ClientListLint::takesService(const Reach& earlier, const std::optional<std::string_view>& service) {
  if (earlier.services.empty()) return true;
  if (!service.has_value()) return false;
  return std::any_of(earlier.services.begin(), earlier.services.end(), [&service](const std::string& part) {
    return !part.empty() && service->find(part) != std::string_view::npos;
  });
}

}  // namespace telvane
