#pragma once

#include <string>
#include <vector>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::client {

// Reports when a file appears under the name of one of several sockets, so that the client connects
// to a new service at once, not only at the next attempt. Watches only between begin() and end(),
// so that changes in the directories do not wake a connected client. Belongs to one thread. Reports
// nothing for a directory that does not exist, or without inotify; the client's attempts go on.
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
    int watch = -1;  // of inotify; negative: none, because the directory does not exist
  };

  std::vector<Watched> watched_;
  platform::linux_::UniqueFd fd_;
};

}  // namespace halvox::client
