#include "client/SocketWatch.h"

#include <climits>
#include <cstddef>
#include <filesystem>

#include <sys/inotify.h>

namespace halvox::client {

SocketWatch::SocketWatch(const std::string& socketPath)
    : directory_(std::filesystem::path(socketPath).parent_path()),
      name_(std::filesystem::path(socketPath).filename()) {
  if (directory_.empty()) directory_.push_back('.');  // GCC 12 warns about assigning "." here
}

void SocketWatch::begin() {
  if (fd_) return;
  fd_.reset(inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
  if (!fd_) return;
  if (inotify_add_watch(fd_.get(), directory_.c_str(),
                        IN_CREATE | IN_MOVED_TO | IN_ATTRIB | IN_ONLYDIR) < 0) {
    fd_.reset();
  }
}

bool SocketWatch::takeAppeared() {
  bool appeared = false;
  alignas(inotify_event) std::byte buffer[sizeof(inotify_event) + NAME_MAX + 1];
  while (fd_) {
    const ssize_t size = read(fd_.get(), buffer, sizeof buffer);
    if (size <= 0) break;
    for (ssize_t offset = 0; offset < size;) {
      const auto* event = reinterpret_cast<const inotify_event*>(&buffer[offset]);
      if (event->len > 0 && name_ == event->name) appeared = true;
      if ((event->mask & IN_IGNORED) != 0) fd_.reset();  // the directory itself is gone
      offset += static_cast<ssize_t>(sizeof(inotify_event)) + event->len;
    }
  }
  return appeared;
}

}  // namespace halvox::client
