#include "platform/ipc/UnixSocket.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <system_error>

namespace telvane::ipc::unixsocket {

namespace {

constexpr int kBacklog = 1024;

Error failure(int code, const std::string& what, const std::string& path) {
  return Error::withDescription(kPlatformErrorDomain, code,
                                fmt::format("{} {}: {}", what, path, std::generic_category().message(code)));
}

// An address of the path. One that is too long is reached through its folder's descriptor, which the address needs
// open.
class Address {
 public:
  explicit Address(const std::string& path) {
    _address.sun_family = AF_UNIX;
    std::string name = path;
    if (name.size() >= sizeof _address.sun_path) {
      const std::filesystem::path whole(path);
      _folder = Descriptor(::open(whole.parent_path().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
      _error = _folder.isValid() ? 0 : errno;
      name = fmt::format("/proc/self/fd/{}/{}", _folder.get(), whole.filename().native());
    }
    if (_error == 0 && name.size() >= sizeof _address.sun_path) _error = ENAMETOOLONG;
    if (_error == 0) std::memcpy(_address.sun_path, name.c_str(), name.size() + 1);
  }

  int error() const noexcept { return _error; }
  const sockaddr* get() const noexcept { return reinterpret_cast<const sockaddr*>(&_address); }
  static socklen_t size() noexcept { return sizeof(sockaddr_un); }

 private:
  sockaddr_un _address{};
  Descriptor _folder;
  int _error = 0;
};

Result<Descriptor> newSocket(const std::string& path) {
  Descriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!socket.isValid()) return failure(errno, "Cannot make a socket for", path);
  return socket;
}

// Returns 0 or an errno value.
int tryConnect(int socket, const std::string& path) {
  const Address address(path);
  if (address.error() != 0) return address.error();
  return ::connect(socket, address.get(), Address::size()) == 0 ? 0 : errno;
}

int tryBind(int socket, const std::string& path) {
  const Address address(path);
  if (address.error() != 0) return address.error();
  return ::bind(socket, address.get(), Address::size()) == 0 ? 0 : errno;
}

// Binds; when a socket is in the way that refuses connections, its process has gone, and it is replaced.
int bindReplacingStale(int socket, const std::string& path) {
  const int code = tryBind(socket, path);
  if (code != EADDRINUSE) return code;
  auto probe = newSocket(path);
  if (!probe) return static_cast<int>(probe.error().code());
  if (tryConnect(probe->get(), path) != ECONNREFUSED) return EADDRINUSE;
  struct stat status {};
  if (::lstat(path.c_str(), &status) == 0 && !S_ISSOCK(status.st_mode)) return EADDRINUSE;
  if (::unlink(path.c_str()) != 0 && errno != ENOENT) return errno;
  return tryBind(socket, path);
}

std::string linkTarget(const std::string& path) {
  char target[PATH_MAX];
  const ssize_t size = ::readlink(path.c_str(), target, sizeof target);
  return size > 0 ? std::string(target, static_cast<size_t>(size)) : std::string();
}

}  // namespace

std::string Peer::description() const {
  return fmt::format("pid {} ({})", processID, executable.empty() ? "unknown" : executable);
}

Result<Descriptor> listenAt(const std::string& path) {
  std::error_code ignored;  // bind tells better what is wrong
  const auto folder = std::filesystem::path(path).parent_path();
  if (std::filesystem::create_directories(folder, ignored)) ::chmod(folder.c_str(), 0755);
  auto socket = newSocket(path);
  if (!socket) return socket;
  const int code = bindReplacingStale(socket->get(), path);
  if (code == EADDRINUSE) return failure(code, "Another process serves", path);
  if (code != 0) return failure(code, "Cannot listen at", path);
  // The grants decide who is served, not the file's mode.
  if (::chmod(path.c_str(), 0666) != 0) return failure(errno, "Cannot open to everybody", path);
  if (::listen(socket->get(), kBacklog) != 0) return failure(errno, "Cannot listen at", path);
  return socket;
}

Result<Descriptor> connectTo(const std::string& path) {
  auto socket = newSocket(path);
  if (!socket) return socket;
  if (const int code = tryConnect(socket->get(), path); code != 0) return failure(code, "Cannot connect to", path);
  return socket;
}

Result<Descriptor> acceptFrom(int listening) {
  Descriptor socket(::accept4(listening, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
  if (!socket.isValid()) return failure(errno, "Cannot accept", "a connection");
  return socket;
}

std::optional<Descriptor> passedSocket(const std::string& name) {
  char** names = nullptr;
  const int count = sd_listen_fds_with_names(0, &names);
  if (count <= 0) return std::nullopt;
  int found = -1;
  for (int i = 0; i < count; ++i) {
    const int fd = SD_LISTEN_FDS_START + i;
    const bool isNamed = name == names[i] || name + ".socket" == names[i];
    if (sd_is_socket_unix(fd, SOCK_STREAM, 1, nullptr, 0) > 0 && (isNamed || (count == 1 && found < 0))) found = fd;
    ::free(names[i]);
  }
  ::free(names);
  if (found < 0) return std::nullopt;
  // A descriptor of our own: the passed one may be asked for again.
  Descriptor socket(::fcntl(found, F_DUPFD_CLOEXEC, 0));
  if (!socket.isValid()) return std::nullopt;
  ::fcntl(socket.get(), F_SETFL, ::fcntl(socket.get(), F_GETFL) | O_NONBLOCK);
  return socket;
}

Peer peerOf(int socket) {
  Peer peer;
  ucred credentials{};
  socklen_t size = sizeof credentials;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) {
    peer.userID = static_cast<uid_t>(-1);
    peer.groupID = static_cast<gid_t>(-1);
    return peer;
  }
  peer.processID = credentials.pid;
  peer.userID = credentials.uid;
  peer.groupID = credentials.gid;
  peer.executable = linkTarget(fmt::format("/proc/{}/exe", credentials.pid));
  peer.supplementaryGroups.resize(64);
  for (int attempt = 0; attempt < 2; ++attempt) {
    socklen_t bytes = static_cast<socklen_t>(peer.supplementaryGroups.size() * sizeof(gid_t));
    const bool done = ::getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, peer.supplementaryGroups.data(), &bytes) == 0;
    const bool isTooSmall = !done && errno == ERANGE;
    peer.supplementaryGroups.resize(done || isTooSmall ? bytes / sizeof(gid_t) : 0);
    if (!isTooSmall) break;
  }
  return peer;
}

int checkAccess(const std::string& path) {
  if (::faccessat(AT_FDCWD, path.c_str(), W_OK, AT_EACCESS) == 0) return 0;
  return errno == EACCES || errno == EPERM ? errno : 0;
}

std::string identityOf(const std::string& path) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return {};
  return fmt::format("{}:{}", status.st_dev, status.st_ino);
}

}  // namespace telvane::ipc::unixsocket
