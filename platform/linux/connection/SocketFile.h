#pragma once

#include <filesystem>
#include <optional>
#include <variant>
#include <vector>

#include <sys/types.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/LinuxConnectionService.h"

namespace halvox::platform::linux_ {

// The file of a socket that we made. Removed with this object, unless somebody else's file is there
// by then. Move-only.
class SocketFile {
 public:
  SocketFile() = default;
  // Remembers the file that is at `path` now.
  explicit SocketFile(std::filesystem::path path);
  SocketFile(SocketFile&& other) noexcept;
  SocketFile& operator=(SocketFile&& other) noexcept;
  ~SocketFile() { remove(); }

  void remove() noexcept;

 private:
  std::filesystem::path path_;  // empty when there is nothing to remove
  dev_t device_ = 0;
  ino_t inode_ = 0;
};

// A socket that listens on a file.
struct BoundSocket {
  UniqueFd fd;
  SocketFile file;
};

// Makes the socket at `path`. At no time can anybody connect whom `access` keeps out. A socket file
// that nobody serves any more is replaced; any other file is left alone. Blocks for no longer than
// a connect and a look-up of the group do.
std::variant<BoundSocket, ConnectionOpenError> listenOn(const std::filesystem::path& path,
                                                        const SocketAccess& access = {});

// Makes the directory that `path` is in, unless it is there: open to the same users as the socket
// is. A failure is left to listenOn() to report.
void makeDirectoryOf(const std::filesystem::path& path, const SocketAccess& access);

// The sockets that the service was started through; none when it was started otherwise. Later
// calls give none, and child processes do not inherit them.
std::variant<std::vector<UniqueFd>, ConnectionOpenError> passedSockets();

}  // namespace halvox::platform::linux_
