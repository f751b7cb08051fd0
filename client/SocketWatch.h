#pragma once

#include <string>
#include <vector>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::client {

// Tells when something appears under the name of one of some sockets, so that a service that comes
// back is met at once and not at the next attempt. Watches only between begin() and end(): a
// connected client is not woken by what happens in the directories. Belongs to one thread.
// Without a directory, or without inotify, it just never tells anything of it.
class SocketWatch {
 public:
  explicit SocketWatch(const std::vector<std::string>& socketPaths);

  // Starts to watch, and tries again to where a directory was not there before.
  void begin();
  void end();
  // What to poll for reading; -1 when there is nothing to watch.
  [[nodiscard]] int fd() const { return fd_.get(); }
  // Takes what has happened. True when one of the names has appeared.
  bool takeAppeared();

 private:
  struct Watched {
    std::string directory;
    std::string name;
    int watch = -1;  // of inotify; negative: none, the directory is not there
  };

  std::vector<Watched> watched_;
  platform::linux_::UniqueFd fd_;
};

}  // namespace halvox::client
