#pragma once

#include <functional>
#include <memory>

struct pw_loop;

namespace halvox::pipewire_reporter {

// The event loop of the reporter. Handles PipeWire's events, SIGTERM and SIGINT, and calls that
// other threads request; sleeps between them without a timer. Make one in a process, and make it
// before any other thread. The constructor blocks the two signals for its own thread and, by
// inheritance, for later threads. The kernel could deliver a signal to an earlier thread, and the
// process would then end without stopping its sessions.
class MainLoop {
 public:
  // Throws std::runtime_error when the loop cannot be made, for example without free descriptors.
  MainLoop();
  ~MainLoop();
  MainLoop(const MainLoop&) = delete;
  MainLoop& operator=(const MainLoop&) = delete;

  // Runs until SIGTERM, SIGINT or quit().
  void run();
  // Ends run(). Call it on the loop's thread only; other threads use a notifier.
  void quit();

  // Returns a function that makes the loop run `call`. Any thread may call that function; it does
  // not block. Several calls before the loop wakes up run `call` once. Do not use it after the loop
  // is destroyed. Throws std::runtime_error without free descriptors.
  std::function<void()> makeNotifier(std::function<void()> call);

  [[nodiscard]] pw_loop* handle() const;

 private:
  class Impl;
  std::unique_ptr<Impl> impl_;
};

}  // namespace halvox::pipewire_reporter
