#include "client/SocketWatch.h"

#include <climits>
#include <cstddef>
#include <filesystem>

#include <sys/inotify.h>

namespace halvox::client {

SocketWatch::SocketWatch(const std::vector<std::string>& socketPaths) {
  for (const std::filesystem::path path : socketPaths) {
    Watched watched{.directory = path.parent_path(), .name = path.filename()};
    if (watched.directory.empty()) watched.directory.push_back('.');  // GCC 12 warns about "." here
    watched_.push_back(std::move(watched));
  }
}

void SocketWatch::begin() {
  if (!fd_) fd_.reset(inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
  if (!fd_) return;
  for (Watched& watched : watched_) {
    if (watched.watch >= 0) continue;
    watched.watch = inotify_add_watch(fd_.get(), watched.directory.c_str(),
                                      IN_CREATE | IN_MOVED_TO | IN_ATTRIB | IN_ONLYDIR);
  }
}

void SocketWatch::end() {
  fd_.reset();
  for (Watched& watched : watched_) watched.watch = -1;
}

bool SocketWatch::takeAppeared() {
  bool appeared = false;
  alignas(inotify_event) std::byte buffer[sizeof(inotify_event) + NAME_MAX + 1];
  while (fd_) {
    const ssize_t size = read(fd_.get(), buffer, sizeof buffer);
    if (size <= 0) break;
    for (ssize_t offset = 0; offset < size;) {
      const auto* event = reinterpret_cast<const inotify_event*>(&buffer[offset]);
      for (Watched& watched : watched_) {
        if (watched.watch != event->wd) continue;
        if (event->len > 0 && watched.name == event->name) appeared = true;
        if ((event->mask & IN_IGNORED) != 0) watched.watch = -1;  // the directory itself is gone
      }
      offset += static_cast<ssize_t>(sizeof(inotify_event)) + event->len;
    }
  }
  return appeared;
}

}  // namespace halvox::client
