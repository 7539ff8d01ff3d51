#pragma once

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "foundation/Date.h"
#include "foundation/Value.h"
#include "platform/FileSystem.h"
#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/ipc/UnixSocket.h"

namespace telvane::ipc {

// Who may do what, by the grant files of the administrator: each names executables, users and groups, and what these
// are entitled to. A peer that matches any one of a file's three lists has its entitlements; grants of several files
// add up, and one that says false takes nothing away.
//
// Files are read when they are asked for and read again when they have changed. One that cannot be read, is no property
// list, or holds a wrong type counts as absent and is told once, in one error line, until it changes. Safe from any
// thread.
class Entitlements {
 public:
  static constexpr const char* kFolder = "/etc/telvane/entitlements.d";

  Entitlements(const FileSystem& files, Log& log) : _files(files), _log(log) {}

  // Whether the peer holds the entitlement with a value whose boolean value is true.
  bool isGranted(const std::string& name, const unixsocket::Peer& peer) const;

 private:
  struct Grant {
    std::vector<std::string> executables;
    std::vector<std::string> users;
    std::vector<std::string> groups;
    Dictionary entitlements;
  };
  struct File {
    std::optional<Date> modified;
    std::optional<Grant> grant;
  };

  void refresh() const REQUIRES(_mutex);
  std::optional<Grant> read(const std::string& path) const;
  static std::optional<Grant> grantOf(const Value& content, std::string& fault);
  static bool matches(const Grant& grant, const unixsocket::Peer& peer);

  const FileSystem& _files;
  Log& _log;
  mutable Mutex _mutex;
  mutable std::map<std::string, File> _read GUARDED_BY(_mutex);
};

}  // namespace telvane::ipc
