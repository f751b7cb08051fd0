#include "platform/linux/connection/SocketFile.h"

#include <cerrno>
#include <cstring>
#include <string>
#include <utility>

#include <fcntl.h>
#include <grp.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"

namespace halvox::platform::linux_ {
namespace {

using Kind = ConnectionOpenError;

Failure<Kind> failure(Kind kind, const std::filesystem::path& path, const std::string& why) {
  return {.code = kind, .message = "socket " + path.string() + ": " + why};
}

UniqueFd newSocket() {
  return UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
}

std::optional<sockaddr_un> addressOf(const std::filesystem::path& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::string& text = path.native();
  if (text.empty() || text.size() >= sizeof address.sun_path) return std::nullopt;
  std::memcpy(address.sun_path, text.data(), text.size());
  return address;
}

// Removes a socket file on which no process listens. Returns an error if another file, or a socket
// with a listening process, is at the path.
Result<void, Kind> clearTheWay(const std::filesystem::path& path, const sockaddr_un& address) {
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) return {};  // bind() reports other problems
  if (!S_ISSOCK(status.st_mode)) {
    return failure(Kind::kNotASocket, path,
                   "a file that is not a socket exists there; remove it or set listener.socket");
  }
  const UniqueFd probe = newSocket();
  if (!probe) return failure(Kind::kSystem, path, errnoText(errno));
  const int result =
      connect(probe.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
  // EAGAIN means that the backlog is full. A process listens in that case, too.
  if (result == 0 || errno == EAGAIN || errno == EINPROGRESS) {
    return failure(Kind::kAlreadyServed, path,
                   "another process answers on it; stop it or set listener.socket");
  }
  if (errno != ECONNREFUSED) {
    return failure(Kind::kSystem, path,
                   "cannot find out whether another process serves it: " + errnoText(errno));
  }
  // No process listens. The service that made the file was killed before it could remove the file.
  static_cast<void>(unlink(path.c_str()));
  return {};
}

Failure<Kind> bindFailure(const std::filesystem::path& path, int error) {
  switch (error) {
    case ENOENT:
    case ENOTDIR:
      return failure(Kind::kDirectoryMissing, path,
                     "its directory does not exist; create it or set listener.socket");
    case EACCES:
    case EROFS:
    case EPERM:
      return failure(Kind::kDirectoryNotWritable, path,
                     "cannot write to its directory: " + errnoText(error));
    case EADDRINUSE:
      return failure(Kind::kAlreadyServed, path,
                     "another process has created it meanwhile; stop it or set listener.socket");
    default:
      return failure(Kind::kSystem, path, errnoText(error));
  }
}

// Returns the ID of the group; std::nullopt if there is no group of that name.
Result<std::optional<gid_t>> findGroup(const std::string& name) {
  // A group with many members needs a large buffer. Give up at 16 MiB, because a broken look-up
  // could ask for a larger buffer each time.
  constexpr std::size_t kLargestEntry = std::size_t{1} << 24U;
  group entry{};
  group* found = nullptr;
  std::vector<char> buffer(4096);
  int error = 0;
  do {
    error = getgrnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found);
    if (error == ERANGE) buffer.resize(2 * buffer.size());
  } while (error == EINTR || (error == ERANGE && buffer.size() <= kLargestEntry));
  if (found != nullptr) return found->gr_gid;
  if (error == 0 || error == ENOENT || error == ESRCH) return std::nullopt;
  return Failure<>{errnoText(error)};
}

Result<void, Kind> giveToGroup(const std::filesystem::path& path, const std::string& name) {
  const auto id = findGroup(name);
  const std::string quoted = '"' + name + '"';
  if (!id) {
    return failure(
        Kind::kSystem, path,
        "cannot look up the group " + quoted + " of listener.group: " + id.error().message);
  }
  if (!id->has_value()) {
    return Failure<Kind>{
        .code = Kind::kUnknownGroup,
        .message = "listener.group: expected a group of this system, found " + quoted};
  }
  constexpr uid_t kSameUser = static_cast<uid_t>(-1);
  // Use the path and not the descriptor, because fchown() of a socket does not change its file.
  if (fchownat(AT_FDCWD, path.c_str(), kSameUser, **id, AT_SYMLINK_NOFOLLOW) == 0) {
    return {};
  }
  return failure(errno == EPERM ? Kind::kNotPermitted : Kind::kSystem, path,
                 "cannot give it to the group " + quoted + " of listener.group: " +
                     errnoText(errno) + "; only root and members of the group may do that");
}

// bind() gives the file the permissions of the descriptor, minus the umask. At first, give access
// only to the owner. If the file were open to another user now, a connect() that has passed the
// check of the permissions could succeed as soon as the socket listens.
bool closeToOthers(int fd, const SocketAccess& access) {
  constexpr std::uint32_t kOwner = 0700;
  return fchmod(fd, access.mode & kOwner) == 0;
}

// Set the group before the mode, because the members of the old group must never get access.
Result<void, Kind> letIn(const std::filesystem::path& path, const SocketAccess& access) {
  if (!access.group.empty()) {
    if (auto given = giveToGroup(path, access.group); !given) return given;
  }
  if (chmod(path.c_str(), access.mode) != 0) {
    return failure(Kind::kSystem, path, "cannot set its permissions: " + errnoText(errno));
  }
  return {};
}

}  // namespace

SocketFile::SocketFile(std::filesystem::path path) : path_(std::move(path)) {
  struct stat status {};
  if (lstat(path_.c_str(), &status) != 0) {
    path_.clear();
    return;
  }
  device_ = status.st_dev;
  inode_ = status.st_ino;
}

SocketFile::SocketFile(SocketFile&& other) noexcept
    : path_(std::exchange(other.path_, {})), device_(other.device_), inode_(other.inode_) {}

SocketFile& SocketFile::operator=(SocketFile&& other) noexcept {
  remove();
  path_ = std::exchange(other.path_, {});
  device_ = other.device_;
  inode_ = other.inode_;
  return *this;
}

void SocketFile::remove() noexcept {
  struct stat status {};
  // Remove the file only if it is still the same one. Another service may have replaced it with its
  // own socket.
  if (!path_.empty() && lstat(path_.c_str(), &status) == 0 && status.st_dev == device_ &&
      status.st_ino == inode_) {
    static_cast<void>(unlink(path_.c_str()));
  }
  path_.clear();
}

Result<BoundSocket, ConnectionOpenError> listenOn(const std::filesystem::path& path,
                                                  const SocketAccess& access) {
  const std::optional<sockaddr_un> address = addressOf(path);
  if (!address.has_value()) {
    return failure(Kind::kPathTooLong, path,
                   "expected a path of 1 to " + std::to_string(sizeof(sockaddr_un::sun_path) - 1) +
                       " bytes, found " + std::to_string(path.native().size()) +
                       "; set listener.socket");
  }
  if (auto cleared = clearTheWay(path, *address); !cleared) return std::move(cleared).error();
  BoundSocket bound{.fd = newSocket(), .file = {}};
  if (!bound.fd) return failure(Kind::kSystem, path, errnoText(errno));
  const auto* generic = reinterpret_cast<const sockaddr*>(&*address);
  if (!closeToOthers(bound.fd.get(), access)) {
    return failure(Kind::kSystem, path, "cannot set its permissions: " + errnoText(errno));
  }
  if (bind(bound.fd.get(), generic, sizeof *address) != 0) return bindFailure(path, errno);
  // From here on, the destructor of `bound` removes the file after any failure.
  bound.file = SocketFile(path);
  if (auto opened = letIn(path, access); !opened) return std::move(opened).error();
  if (listen(bound.fd.get(), SOMAXCONN) != 0) {
    return failure(Kind::kSystem, path, errnoText(errno));
  }
  return bound;
}

void makeDirectoryOf(const std::filesystem::path& path, const SocketAccess& access) {
  constexpr std::uint32_t kOthers = 0077;
  const std::string directory = path.parent_path().native();
  // If the directory exists, leave the permissions that its owner has chosen. If it cannot be made,
  // the bind() that follows fails and the failure is reported there.
  if (mkdir(directory.c_str(), 0700) != 0) return;
  if ((access.mode & kOthers) != 0) static_cast<void>(chmod(directory.c_str(), 0755));
}

Result<std::vector<UniqueFd>, ConnectionOpenError> passedSockets() {
  std::vector<UniqueFd> sockets;
  // The argument 1 removes the environment variables. Programs that the service starts would
  // otherwise take the sockets for their own.
  const int count = sd_listen_fds(1);
  for (int fd = SD_LISTEN_FDS_START; fd < SD_LISTEN_FDS_START + count; ++fd) {
    sockets.emplace_back(fd);
    constexpr int kListening = 1;
    if (sd_is_socket_unix(fd, SOCK_STREAM, kListening, nullptr, 0) <= 0) {
      return Failure<Kind>{.code = Kind::kBadActivation,
                           .message = "the passed descriptor " + std::to_string(fd) +
                                      " is not a listening Unix stream socket"};
    }
    // systemd passes blocking sockets by default. On such a socket, accept() blocks while no client
    // waits.
    static_cast<void>(fcntl(fd, F_SETFL, O_NONBLOCK));
  }
  if (count < 0) {
    return Failure<Kind>{.code = Kind::kBadActivation,
                         .message = "cannot use the passed descriptors: " + errnoText(-count)};
  }
  return sockets;
}

}  // namespace halvox::platform::linux_
