#include "reporters/pipewire/MainLoop.h"

#include <array>
#include <csignal>
#include <stdexcept>
#include <utility>
#include <vector>

#include <pipewire/pipewire.h>

namespace halvox::pipewire_reporter {

class MainLoop::Impl {
 public:
  Impl() {
    pw_init(nullptr, nullptr);
    loop_ = pw_main_loop_new(nullptr);
    if (loop_ == nullptr) {
      pw_deinit();
      throw std::runtime_error("cannot create the event loop of PipeWire's library");
    }
    // The library blocks the signals, also for threads that are made later. The signals reach the
    // loop instead.
    for (const int number : {SIGTERM, SIGINT}) {
      pw_loop_add_signal(handle(), number, &Impl::onSignal, this);
    }
  }
  ~Impl() {
    // Destroys the loop's sources as well, before the library is shut down.
    pw_main_loop_destroy(loop_);
    pw_deinit();
  }
  Impl(const Impl&) = delete;
  Impl& operator=(const Impl&) = delete;

  [[nodiscard]] pw_loop* handle() const { return pw_main_loop_get_loop(loop_); }
  void run() { pw_main_loop_run(loop_); }
  void quit() { pw_main_loop_quit(loop_); }

  std::function<void()> makeNotifier(std::function<void()> call) {
    // Each call has its own allocation, because the library keeps the address of the call, which
    // must not change when the vector grows.
    calls_.push_back(std::make_unique<std::function<void()>>(std::move(call)));
    spa_source* source = pw_loop_add_event(handle(), &Impl::onEvent, calls_.back().get());
    if (source == nullptr) {
      throw std::runtime_error("cannot create an event for the event loop");
    }
    // The library counts signals that have not been handled, and runs the call once for all of
    // them.
    return [loop = handle(), source] { pw_loop_signal_event(loop, source); };
  }

 private:
  static void onSignal(void* data, int /*number*/) { static_cast<Impl*>(data)->quit(); }
  static void onEvent(void* data, std::uint64_t /*count*/) {
    (*static_cast<std::function<void()>*>(data))();
  }

  pw_main_loop* loop_ = nullptr;
  std::vector<std::unique_ptr<std::function<void()>>> calls_;
};

MainLoop::MainLoop() : impl_(std::make_unique<Impl>()) {}
MainLoop::~MainLoop() = default;
void MainLoop::run() { impl_->run(); }
void MainLoop::quit() { impl_->quit(); }
pw_loop* MainLoop::handle() const { return impl_->handle(); }

std::function<void()> MainLoop::makeNotifier(std::function<void()> call) {
  return impl_->makeNotifier(std::move(call));
}

}  // namespace halvox::pipewire_reporter
