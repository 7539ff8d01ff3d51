#include "platform/system/FileRemoval.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <grp.h>
#include <linux/capability.h>
#include <sys/fsuid.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <string_view>
#include <vector>

#include "platform/system/FileDescriptor.h"
#include "platform/system/PlatformError.h"

namespace telvane {
namespace {

constexpr uint32_t kRoot = 0;
constexpr mode_t kSearch = 1;
constexpr mode_t kWrite = 2;
constexpr mode_t kReadWriteSearch = 7;
constexpr int kShiftOwner = 6;
constexpr int kShiftGroup = 3;

bool isInGroup(const PeerIdentity& who, uint32_t group) {
  const auto& others = who.supplementaryGroups;
  return who.groupID == group || std::find(others.begin(), others.end(), group) != others.end();
}

// The first class of bits that fits decides alone, as in the kernel: an owner without a right does not get it from the
// bits of all others.
mode_t rightsOf(const PeerIdentity& who, const struct stat& folder) {
  if (who.userID == kRoot) return kReadWriteSearch;
  if (who.userID == folder.st_uid) return (folder.st_mode >> kShiftOwner) & kReadWriteSearch;
  if (isInGroup(who, folder.st_gid)) return (folder.st_mode >> kShiftGroup) & kReadWriteSearch;
  return folder.st_mode & kReadWriteSearch;
}

Error stays(int code, std::string why) { return platformError(code, std::move(why)); }

// With an access list the mode bits say something else than they seem to.
bool mayHaveAccessList(int folder) {
  const std::string path = fmt::format("/proc/self/fd/{}", folder);
  if (::getxattr(path.c_str(), "system.posix_acl_access", nullptr, 0) >= 0) return true;
  return errno != ENODATA && errno != ENOTSUP;
}

// Names of a path from the root down; empty when it is not one that can be walked plainly.
std::vector<std::string> namesOf(std::string_view path) {
  std::vector<std::string> names;
  if (!path.starts_with('/') || path.ends_with('/')) return {};
  while (!path.empty()) {
    path.remove_prefix(1);
    const std::string_view name = path.substr(0, path.find('/'));
    path.remove_prefix(name.size());
    if (name == "..") return {};
    if (!name.empty() && name != ".") names.emplace_back(name);
  }
  return names;
}

// A folder on the way, as it was when it was opened.
struct Folder {
  FileDescriptor descriptor;
  struct stat status {};
};

Result<Folder> openFolder(int parent, const char* name) {
  Folder folder;
  folder.descriptor = FileDescriptor(::openat(parent, name, O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!folder.descriptor.isOpen() || ::fstat(folder.descriptor.get(), &folder.status) != 0) {
    return errnoError(errno, fmt::format("its folder {} cannot be walked through", name));
  }
  if (mayHaveAccessList(folder.descriptor.get())) {
    return stays(EPERM, fmt::format("its folder {} has an access list", name));
  }
  return folder;
}

// Opens the folder that the last name is in.
Result<Folder> walk(const PeerIdentity& who, const std::vector<std::string>& names) {
  Result<Folder> folder = openFolder(AT_FDCWD, "/");
  for (size_t i = 0; folder.has_value() && i + 1 < names.size(); ++i) {
    if (!maySearch(who, folder->status)) return stays(EACCES, "the client may not search a folder above it");
    folder = openFolder(folder->descriptor.get(), names[i].c_str());
  }
  return folder;
}

// Whether the calling thread may do with files what their modes do not say. A thread that lays user 0 down loses that,
// unless somebody has set the process up to keep it; and a user of any number may have been given it.
bool mayOverrideModes() {
  __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
  std::array<__user_cap_data_struct, _LINUX_CAPABILITY_U32S_3> sets{};
  constexpr uint32_t kOverriding = 1u << CAP_DAC_OVERRIDE | 1u << CAP_DAC_READ_SEARCH | 1u << CAP_FOWNER;
  return ::syscall(SYS_capget, &header, sets.data()) != 0 || (sets[0].effective & kOverriding) != 0;
}

// While it lives, the calling thread meets the file system as somebody else; the process's other threads do not notice.
class ActingAs {
 public:
  explicit ActingAs(const PeerIdentity& who) {
    if (who.userID == kRoot) return;
    if (::geteuid() == kRoot) _isRefused = !takeOn(who);
    _isRefused = _isRefused || mayOverrideModes();
  }
  ~ActingAs() {
    if (!_isChanged) return;
    ::setfsuid(::geteuid());
    ::setfsgid(::getegid());
    // A worker that kept a client's groups would do the next client's work with them.
    if (::syscall(SYS_setgroups, _groups.size(), _groups.data()) != 0) std::abort();
  }
  ActingAs(const ActingAs&) = delete;
  ActingAs& operator=(const ActingAs&) = delete;

  bool isRefused() const noexcept { return _isRefused; }

 private:
  bool takeOn(const PeerIdentity& who) {
    const int count = ::getgroups(0, nullptr);
    _groups.resize(static_cast<size_t>(std::max(count, 0)));
    if (count < 0 || ::getgroups(count, _groups.data()) != count) return false;
    const std::vector<gid_t> groups(who.supplementaryGroups.begin(), who.supplementaryGroups.end());
    // The library's setgroups would change all threads.
    if (::syscall(SYS_setgroups, groups.size(), groups.data()) != 0) return false;
    _isChanged = true;
    ::setfsgid(who.groupID);
    ::setfsuid(who.userID);
    constexpr auto kNobody = static_cast<uid_t>(-1);  // changes nothing, and tells who is set
    return ::setfsuid(kNobody) == static_cast<int>(who.userID) && ::setfsgid(kNobody) == static_cast<int>(who.groupID);
  }

  std::vector<gid_t> _groups;
  bool _isChanged = false;
  bool _isRefused = false;
};

Result<void> unlinkAs(const PeerIdentity& who, int folder, const char* name) {
  const ActingAs client(who);
  if (client.isRefused()) return stays(EPERM, "the client's rights cannot be taken on");
  if (::unlinkat(folder, name, 0) != 0) return errnoError(errno, "it cannot be deleted");
  return {};
}

}  // namespace

bool maySearch(const PeerIdentity& who, const struct stat& folder) { return (rightsOf(who, folder) & kSearch) != 0; }

bool mayRemoveFrom(const PeerIdentity& who, const struct stat& folder, const struct stat& file) {
  constexpr mode_t kNeeded = kWrite | kSearch;
  if ((rightsOf(who, folder) & kNeeded) != kNeeded) return false;
  const bool isSticky = (folder.st_mode & S_ISVTX) != 0;
  return !isSticky || who.userID == kRoot || who.userID == file.st_uid || who.userID == folder.st_uid;
}

bool isSameFile(const struct stat& one, const struct stat& other) {
  return one.st_dev == other.st_dev && one.st_ino == other.st_ino && S_ISREG(one.st_mode) && S_ISREG(other.st_mode);
}

Result<void> removeFileFor(const PeerIdentity& who, const std::string& path, int descriptor) {
  const std::vector<std::string> names = namesOf(path);
  if (names.empty()) return stays(EINVAL, "its path cannot be walked from the root");
  const Result<Folder> folder = walk(who, names);
  if (!folder) return folder.error();
  const char* name = names.back().c_str();
  struct stat ours {};
  struct stat named {};
  struct statvfs mount {};
  // The descriptor knows the mount that the client opened it through, which may be read-only for the client alone.
  if (::fstatvfs(descriptor, &mount) != 0 || (mount.f_flag & ST_RDONLY) != 0) {
    return stays(EROFS, "the client may only read there");
  }
  if (::fstat(descriptor, &ours) != 0) return errnoError(errno, "its descriptor cannot be looked at");
  if (::fstatat(folder->descriptor.get(), name, &named, AT_SYMLINK_NOFOLLOW) != 0) {
    return errnoError(errno, "it cannot be looked up");
  }
  if (!isSameFile(ours, named)) return stays(ESTALE, "its path names another file now");
  if (!mayRemoveFrom(who, folder->status, ours)) return stays(EACCES, "the client may not delete it");
  return unlinkAs(who, folder->descriptor.get(), name);
}

}  // namespace telvane
