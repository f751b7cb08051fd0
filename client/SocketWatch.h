#pragma once

#include <string>
#include <vector>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::client {

// Reports when a file appears under the name of one of several sockets. The client then connects to
// a new service at once and does not wait for its next attempt. Watches only between begin() and
// end(), because changes in the directories must not wake a connected client. Belongs to one
// thread. Reports nothing for a directory that does not exist, or if inotify is not available. The
// client then connects at its next attempt.
class SocketWatch {
 public:
  explicit SocketWatch(const std::vector<std::string>& socketPaths);

  // Starts to watch, including directories that did not exist at an earlier call.
  void begin();
  void end();
  // Returns the descriptor to poll for reading; -1 while nothing is watched.
  [[nodiscard]] int fd() const { return fd_.get(); }
  // Reads the pending events. Returns true if a file has appeared under one of the names.
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
