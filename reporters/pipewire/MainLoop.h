#pragma once

#include <functional>
#include <memory>

struct pw_loop;

namespace halvox::pipewire_reporter {

// The loop of the reporter: PipeWire's events, the end asked for by a signal, and calls that other
// threads ask for. It sleeps until one of them comes.
// Make one a process, before any other thread: it takes SIGTERM and SIGINT over from all of them.
class MainLoop {
 public:
  // Throws std::runtime_error when the process has no descriptors left.
  MainLoop();
  ~MainLoop();
  MainLoop(const MainLoop&) = delete;
  MainLoop& operator=(const MainLoop&) = delete;

  // Runs until SIGTERM, SIGINT or quit().
  void run();
  // Ends run(). On the loop's thread only; from another one, by way of a notifier.
  void quit();

  // A function that any thread may call, without blocking, to have `call` run on the loop; calls
  // that come close together may be run as one. It must not outlive the loop.
  std::function<void()> makeNotifier(std::function<void()> call);

  [[nodiscard]] pw_loop* handle() const;

 private:
  class Impl;
  std::unique_ptr<Impl> impl_;
};

}  // namespace halvox::pipewire_reporter
