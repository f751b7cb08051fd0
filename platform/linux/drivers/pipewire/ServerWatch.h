#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include <pipewire/pipewire.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// Tells on the loop's thread when something appears under the name of the PipeWire server's socket.
// Where that is, the environment says at construction, by the library's own rules. Watches only
// between begin() and end(), and costs nothing while nothing is created beside the socket.
// Belongs to the loop's thread, or to whoever knows that it does not run. Without the directory, or
// without inotify, it just never tells anything.
class ServerWatch {
 public:
  // `onAppeared` may end the watch.
  ServerWatch(pw_loop* loop, std::function<void()> onAppeared);
  ~ServerWatch() { end(); }
  ServerWatch(const ServerWatch&) = delete;
  ServerWatch& operator=(const ServerWatch&) = delete;

  // Starts to watch, or tries again to; does nothing when it watches already.
  void begin();
  void end();

 private:
  // What has happened since the last time.
  struct News {
    bool hasAppeared = false;
    bool isDirectoryGone = false;
  };

  [[nodiscard]] bool watchDirectories() const;
  [[nodiscard]] News takeNews() const;
  static void onReadable(void* data, int descriptor, std::uint32_t mask);

  pw_loop* const loop_;
  const std::function<void()> onAppeared_;
  std::vector<std::string> directories_;
  std::string name_;
  UniqueFd inotify_;
  spa_source* source_ = nullptr;
};

}  // namespace halvox::platform::linux_
