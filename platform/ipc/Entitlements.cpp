#include "platform/ipc/Entitlements.h"

#include <fmt/format.h>
#include <grp.h>
#include <pwd.h>

#include <algorithm>
#include <array>
#include <string_view>
#include <utility>

#include "platform/PropertyList.h"

namespace telvane::ipc {

namespace {

// The keys of a grant file.
constexpr Key kExecutables{"executables"};
constexpr Key kUsers{"users"};
constexpr Key kGroups{"groups"};
constexpr Key kEntitlements{"entitlements"};

constexpr uint64_t kLargestFile = 1u << 20;
constexpr size_t kNameBuffer = 16u << 10;

// Reads a list of texts; a missing one is empty. Returns false when it is anything else.
bool readList(const Dictionary& content, const Key& key, std::vector<std::string>& list) {
  const Value& value = content[key];
  if (!value.isPresent()) return true;
  if (!value.isArray()) return false;
  for (const Value& element : *value.array()) {
    if (!element.isString()) return false;
    list.push_back(element.string()->str());
  }
  return true;
}

std::optional<uid_t> userNamed(const std::string& name) {
  std::array<char, kNameBuffer> buffer;
  passwd entry{};
  passwd* found = nullptr;
  if (getpwnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found) != 0 || found == nullptr) return {};
  return found->pw_uid;
}

std::optional<gid_t> groupNamed(const std::string& name) {
  std::array<char, kNameBuffer> buffer;
  group entry{};
  group* found = nullptr;
  if (getgrnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found) != 0 || found == nullptr) return {};
  return found->gr_gid;
}

bool isMember(const unixsocket::Peer& peer, gid_t group) {
  const auto& others = peer.supplementaryGroups;
  return peer.groupID == group || std::find(others.begin(), others.end(), group) != others.end();
}

}  // namespace

bool Entitlements::isGranted(const std::string& name, const unixsocket::Peer& peer) const {
  std::vector<Grant> candidates;
  {
    MutexLock lock(_mutex);
    refresh();
    for (const auto& [path, file] : _read) {
      if (file.grant && file.grant->entitlements[name].booleanValue()) candidates.push_back(*file.grant);
    }
  }
  // Outside the lock, because names may be looked up over the network.
  return std::any_of(candidates.begin(), candidates.end(), [&](const Grant& grant) { return matches(grant, peer); });
}

void Entitlements::refresh() const {
  std::map<std::string, File> now;
  const auto names = _files.filesBelow(kFolder);
  for (const auto& name : names ? *names : std::vector<std::string>()) {
    if (!std::string_view(name).ends_with(".plist") || name.find('/') != std::string::npos) continue;
    const std::string path = fmt::format("{}/{}", kFolder, name);
    const auto modified = _files.modificationDate(path);
    const auto known = _read.find(path);
    if (known != _read.end() && known->second.modified == modified) {
      now.emplace(path, std::move(known->second));
    } else {
      now.emplace(path, File{modified, read(path)});
    }
  }
  _read = std::move(now);
}

std::optional<Entitlements::Grant> Entitlements::read(const std::string& path) const {
  std::string fault;
  const auto data = _files.read(path, kLargestFile);
  if (!data) {
    fault = data.error().description();
  } else if (const auto content = propertylist::parse(*data); !content) {
    fault = content.error().description();
  } else if (auto grant = grantOf(*content, fault)) {
    return grant;
  }
  _log.error("localConnection: grants of {} are ignored: {}", _files.resolve(path), fault);
  return std::nullopt;
}

std::optional<Entitlements::Grant> Entitlements::grantOf(const Value& content, std::string& fault) {
  const Dictionary* dictionary = content.dictionary();
  if (dictionary == nullptr) {
    fault = "it is not a dictionary";
    return std::nullopt;
  }
  Grant grant;
  for (const auto& [key, list] :
       {std::pair(&kExecutables, &grant.executables), {&kUsers, &grant.users}, {&kGroups, &grant.groups}}) {
    if (readList(*dictionary, *key, *list)) continue;
    fault = fmt::format("\"{}\" is not a list of texts", key->view());
    return std::nullopt;
  }
  const Value& entitlements = (*dictionary)[kEntitlements];
  if (!entitlements.isDictionary()) {
    fault = fmt::format("\"{}\" is not a dictionary", kEntitlements.view());
    return std::nullopt;
  }
  grant.entitlements = *entitlements.dictionary();
  return grant;
}

bool Entitlements::matches(const Grant& grant, const unixsocket::Peer& peer) {
  const auto& executables = grant.executables;
  if (!peer.executable.empty() &&
      std::find(executables.begin(), executables.end(), peer.executable) != executables.end())
    return true;
  for (const auto& name : grant.users) {
    if (userNamed(name) == peer.userID) return true;
  }
  for (const auto& name : grant.groups) {
    if (const auto group = groupNamed(name); group && isMember(peer, *group)) return true;
  }
  return false;
}

}  // namespace telvane::ipc
