#pragma once

#include <string>

#include "platform/linux/UniqueHandle.h"

namespace halvox::client {

// Tells when something appears under a socket's name, so that a service that comes back is met at
// once and not at the next attempt. Watches only between begin() and end(): a connected client is
// not woken by what happens in the directory. Belongs to one thread.
// Without the directory, or without inotify, it just never tells anything.
class SocketWatch {
 public:
  explicit SocketWatch(const std::string& socketPath);

  // Starts to watch, or tries again to, when the directory was not there before.
  void begin();
  void end() { fd_.reset(); }
  // What to poll for reading; -1 when there is nothing to watch.
  [[nodiscard]] int fd() const { return fd_.get(); }
  // Takes what has happened. True when the name has appeared.
  bool takeAppeared();

 private:
  std::string directory_;
  std::string name_;
  platform::linux_::UniqueFd fd_;
};

}  // namespace halvox::client
