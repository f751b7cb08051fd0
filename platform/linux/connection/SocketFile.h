#pragma once

#include <filesystem>
#include <vector>

#include <sys/types.h>

#include "platform/linux/base/Result.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/LinuxConnectionService.h"

namespace halvox::platform::linux_ {

// The file of a socket that the service made. The destructor removes the file unless another
// process has replaced it. Move-only.
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

// A socket that listens, and its file.
struct BoundSocket {
  UniqueFd fd;
  SocketFile file;
};

// Makes the socket at `path`. Users that `access` excludes can never connect, not even while the
// socket is being made. Replaces a socket file on which no process listens any more, and never any
// other file. Blocks for one connect() and one look-up of the group.
Result<BoundSocket, ConnectionOpenError> listenOn(const std::filesystem::path& path,
                                                  const SocketAccess& access = {});

// Makes the directory of `path` unless it exists. The directory is open to all users if `access`
// admits others than the owner. Reports no failure: if the directory is missing, listenOn() fails.
void makeDirectoryOf(const std::filesystem::path& path, const SocketAccess& access);

// Returns the sockets that systemd passed at the start; empty without socket activation. Later
// calls return none. Child processes do not inherit the sockets.
Result<std::vector<UniqueFd>, ConnectionOpenError> passedSockets();

}  // namespace halvox::platform::linux_
