#include "platform/linux/drivers/pipewire/PipeWireDriverSource.h"

#include <utility>

#include <pipewire/pipewire.h>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/drivers/ReadingMaker.h"
#include "platform/linux/drivers/pipewire/GraphFollower.h"
#include "platform/linux/drivers/pipewire/SharedGraph.h"
#include "platform/object_log.h"

namespace halvox::platform::linux_ {
namespace {

// Wakes the loop from any thread. Does nothing after remove(), which must come before the
// destruction of the loop. Shared by the source and the leases, because a session may hold its
// snapshot longer than the source exists.
class Bell {
 public:
  void install(pw_loop* loop, spa_source* event) {
    const MutexLock lock(mutex_);
    loop_ = loop;
    event_ = event;
  }
  void remove() { install(nullptr, nullptr); }
  void ring() {
    const MutexLock lock(mutex_);
    if (loop_ != nullptr) pw_loop_signal_event(loop_, event_);
  }

 private:
  Mutex mutex_;
  pw_loop* loop_ HALVOX_GUARDED_BY(mutex_) = nullptr;
  spa_source* event_ HALVOX_GUARDED_BY(mutex_) = nullptr;
};

// All held readings share one lease. When the last of them is destroyed, the lease rings the bell,
// and the woken loop releases the profiler.
class Lease {
 public:
  explicit Lease(std::shared_ptr<Bell> bell) : bell_(std::move(bell)) {}
  ~Lease() { bell_->ring(); }
  Lease(const Lease&) = delete;
  Lease& operator=(const Lease&) = delete;

 private:
  std::shared_ptr<Bell> bell_;
};

}  // namespace

class PipeWireDriverSource::Impl {
 public:
  Impl(LogCategory& log, Options options)
      : category_(log), log_(log, "PipeWireDriverSource"), options_(options) {
    pw_init(nullptr, nullptr);
  }
  ~Impl() {
    // Do this first, because leases may outlive this object and must not wake a loop that ends.
    bell_->remove();
    if (loop_ != nullptr) pw_thread_loop_stop(loop_);
    // Destroy the follower after the thread has stopped, because the connection's objects belong to
    // the thread.
    connection_.reset();
    if (event_ != nullptr) pw_loop_destroy_source(pw_thread_loop_get_loop(loop_), event_);
    if (loop_ != nullptr) pw_thread_loop_destroy(loop_);
    pw_deinit();
  }
  Impl(const Impl&) = delete;
  Impl& operator=(const Impl&) = delete;

  void open() {
    if (!start()) {
      log_.error(
          "cannot start the PipeWire thread; PipeWire counters are disabled until the service "
          "restarts");
      return;
    }
    bell_->ring();
    const auto deadline = std::chrono::steady_clock::now() + options_.longestOpening;
    const MutexLock lock(graph_.mutex);
    while (!graph_.isSettled && graph_.settled.waitUntil(graph_.mutex, deadline)) {
    }
  }

  std::shared_ptr<const Reading> read() {
    bool isNew = false;
    std::shared_ptr<void> lease;
    {
      const MutexLock lock(graph_.mutex);
      // All readings share one lease, because the profiler is bound while any reading is held.
      lease = graph_.lease.lock();
      if (lease == nullptr) {
        lease = std::make_shared<Lease>(bell_);
        graph_.lease = lease;
        isNew = true;
      }
      graph_.statistics.addTo(maker_, std::chrono::steady_clock::now());
    }
    // Ring only for the first lease, because others change nothing. Ringing wakes the loop's
    // thread.
    if (isNew) bell_->ring();
    return maker_.finish(std::move(lease));
  }

  [[nodiscard]] bool isProfiling() {
    const MutexLock lock(graph_.mutex);
    return graph_.isProfiling;
  }

 private:
  bool start() {
    // The kernel allows 15 characters for a thread's name.
    loop_ = pw_thread_loop_new("halvox-pipewire", nullptr);
    if (loop_ == nullptr) return false;
    pw_loop* const loop = pw_thread_loop_get_loop(loop_);
    connection_ = std::make_unique<GraphFollower>(loop, graph_, category_);
    if (!connection_->isUsable()) return false;
    event_ = pw_loop_add_event(loop, &Impl::onRing, this);
    if (event_ == nullptr || pw_thread_loop_start(loop_) != 0) return false;
    // Install the loop last, because only a loop that runs can be woken.
    bell_->install(loop, event_);
    return true;
  }
  static void onRing(void* data, std::uint64_t /*count*/) {
    static_cast<Impl*>(data)->connection_->update();
  }

  LogCategory& category_;
  const ObjectLog log_;
  const Options options_;
  const std::shared_ptr<Bell> bell_ = std::make_shared<Bell>();
  SharedGraph graph_;
  ReadingMaker maker_;  // used by the thread of readings
  pw_thread_loop* loop_ = nullptr;
  spa_source* event_ = nullptr;
  std::unique_ptr<GraphFollower> connection_;
};

PipeWireDriverSource::PipeWireDriverSource(LogCategory& log, Options options)
    : impl_(std::make_unique<Impl>(log, options)) {}
PipeWireDriverSource::~PipeWireDriverSource() = default;
void PipeWireDriverSource::open() { impl_->open(); }
std::shared_ptr<const Reading> PipeWireDriverSource::read() { return impl_->read(); }
bool PipeWireDriverSource::isProfiling() const { return impl_->isProfiling(); }

}  // namespace halvox::platform::linux_
