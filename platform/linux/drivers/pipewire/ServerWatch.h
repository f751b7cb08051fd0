#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include <pipewire/pipewire.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// Calls back on the loop's thread when a file appears under the name of the PipeWire server's
// socket.
//
// The environment at construction decides where the socket is, by the library's own rules. This
// class watches only between begin() and end(). It uses inotify instead of a timer. Waiting for a
// server then costs nothing. Belongs to the loop's thread, or to a caller that knows that this
// thread does not run. GraphFollower owns it. Without the directory, or without inotify, it never
// calls back.
class ServerWatch {
 public:
  // `onAppeared` may call end().
  ServerWatch(pw_loop* loop, std::function<void()> onAppeared);
  ~ServerWatch() { end(); }
  ServerWatch(const ServerWatch&) = delete;
  ServerWatch& operator=(const ServerWatch&) = delete;

  // Starts to watch, or tries again if that failed. Does nothing if it is already watching.
  void begin();
  void end();

 private:
  // The events since the last call.
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
