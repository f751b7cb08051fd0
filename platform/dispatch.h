#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>

namespace halvox::platform {

// A job must not throw. If it does, the adapter logs and counts the exception, and the queue
// continues.
using Job = std::function<void()>;

// How urgent the work of a queue is. Clients wait for user-interactive work. They do not wait for
// utility and background work, which therefore runs at a lower scheduling priority.
enum class QualityOfService : std::uint8_t { kUserInteractive, kUtility, kBackground };

// What a serial queue runs on: a thread of its own, or the pool that all shared queues use. A queue
// that blocks, or that must never wait for others, needs a thread of its own.
enum class QueueThreading : std::uint8_t { kOwnThread, kShared };

// Whether a job can block (on a file, a server or another queue). A brief job cannot block. A
// thread that must not block, such as the I/O thread, can therefore run it.
enum class JobWeight : std::uint8_t { kBrief, kMayBlock };

// Counts signals until they are consumed. Any thread may signal, and a signal without a waiter is
// kept. Shared by the code that signals and the code that waits. A queue that waits on a semaphore
// also holds it.
class DispatchSemaphore {
 public:
  virtual ~DispatchSemaphore() = default;
  virtual void signal() = 0;
  // Blocks the calling thread until there is a signal, and consumes it. There is no time limit.
  // Call it only on a thread that may block. A job of a shared queue calls waitOn() instead, which
  // does not block its thread.
  virtual void wait() = 0;
};

enum class WaitOutcome : std::uint8_t { kSignalled, kTimedOut };

// Runs its jobs one at a time, in the order in which they were added. Any thread may add jobs.
//
// Shared by its users; jobs that were added keep it alive until they have run. Jobs that still wait
// when the process ends are not run.
class DispatchQueue {
 public:
  virtual ~DispatchQueue() = default;

  // Adds a job and returns at once. The job never runs inside this call. The caller may therefore
  // hold a lock that the job takes.
  virtual void async(JobWeight weight, Job job) = 0;
  // Makes the queue wait on a semaphore of the same service, without blocking a thread. Only a job
  // of this queue may call it, at most once, as its last action, and only if the queue is a shared
  // one. The queue runs no other job until it has consumed a signal or the time-out has passed.
  // Without a time-out, it waits without limit. It then runs `then` before its pending jobs. `then`
  // is a job like any other and may call waitOn() again.
  virtual void waitOn(std::shared_ptr<DispatchSemaphore> semaphore,
                      std::optional<std::chrono::nanoseconds> timeout,
                      std::function<void(WaitOutcome)> then) = 0;
  // Lets the calling thread do brief work as if it were a job of this queue. Returns true if the
  // queue runs no job, has none pending and does not wait on a semaphore. The caller then does the
  // work, which must not call waitOn(), and calls leave(). If the result is false, the caller adds
  // a job instead. A queue may always return false. Use QueueEntry rather than these two functions.
  [[nodiscard]] virtual bool tryEnter() { return false; }
  virtual void leave() {}
  // True on the thread that is running a job of this queue at the moment. For assertions.
  [[nodiscard]] virtual bool isCurrent() const = 0;
};

// Lets the calling thread do brief work as a job of a queue while this object exists. Frequent work
// then needs neither an allocation nor a change of threads.
class QueueEntry {
 public:
  // `queue` must outlive this object.
  explicit QueueEntry(DispatchQueue& queue) : queue_(queue), isInside_(queue.tryEnter()) {}
  QueueEntry(const QueueEntry&) = delete;
  QueueEntry& operator=(const QueueEntry&) = delete;
  ~QueueEntry() {
    if (isInside_) queue_.leave();
  }
  // False if the queue declined.
  explicit operator bool() const { return isInside_; }

 private:
  DispatchQueue& queue_;
  const bool isInside_;
};

// Queues, delays and the background pool of the platform.
//
// Any thread may call. The composition root owns the service, which must outlive its queues.
class DispatchService {
 public:
  virtual ~DispatchService() = default;

  // A new serial queue. Debuggers, log lines and counters show the label. The caller shares the
  // queue with its pending jobs.
  virtual std::shared_ptr<DispatchQueue> createSerialQueue(std::string_view label,
                                                           QualityOfService quality,
                                                           QueueThreading threading) = 0;
  // A new semaphore that already has `signals` signals.
  virtual std::shared_ptr<DispatchSemaphore> createSemaphore(std::uint64_t signals) = 0;
  // Runs the job once after the delay, on the background pool, in no particular order with other
  // jobs. A waiting job costs memory but no thread.
  virtual void asyncAfterOnBackgroundQueue(std::chrono::nanoseconds delay, Job job) = 0;
};

}  // namespace halvox::platform
