#pragma once

#include <string>
#include <vector>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::client {

// Reports when a file appears under the name of one of several sockets. The client then connects to
// a new service at once instead of waiting for its next attempt. Watches only between begin() and
// end(): changes in the directories must not wake a connected client. Belongs to one thread.
// Reports nothing for a directory that does not exist, or if inotify is not available; the client
// then relies on its attempts.
class SocketWatch {
 public:
  explicit SocketWatch(const std::vector<std::string>& socketPaths);

  // Starts to watch. Tries again for directories that did not exist before.
  void begin();
  void end();
  // The descriptor to poll for reading; -1 if there is nothing to watch.
  [[nodiscard]] int fd() const { return fd_.get(); }
  // Reads the pending events. Returns true if one of the names has appeared.
  bool takeAppeared();

 private:
  struct Watched {
    std::string directory;
    std::string name;
    int watch = -1;  // of inotify; negative if the directory is not watched
  };

  std::vector<Watched> watched_;
  platform::linux_::UniqueFd fd_;
};

}  // namespace halvox::client
