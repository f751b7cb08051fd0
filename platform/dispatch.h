#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>

namespace halvox::platform {

using Job = std::function<void()>;

enum class QualityOfService : std::uint8_t { kUserInteractive, kUtility, kBackground };

// What a serial queue runs on: a thread of its own, or the pool that all shared queues use.
enum class QueueThreading : std::uint8_t { kOwnThread, kShared };

// Whether a job can wait for anything (a file, a server, another queue). A brief one cannot, so a
// thread that must not stand still may carry it out too.
enum class JobWeight : std::uint8_t { kBrief, kMayBlock };

// Counts signals that wait to be consumed. Any thread may signal; a signal that nobody waits for
// stays. Whoever holds it keeps it, and queues that wait on it keep it too.
class DispatchSemaphore {
 public:
  virtual ~DispatchSemaphore() = default;
  virtual void signal() = 0;
  // Blocks the calling thread until there is a signal, which is consumed; without a time limit.
  // Only for what the system means to stand still; a queue's job waits with waitOn().
  virtual void wait() = 0;
};

enum class WaitOutcome : std::uint8_t { kSignalled, kTimedOut };

// Runs its jobs one at a time, in the order in which they came. Any thread may add jobs.
// Jobs that are waiting when the process ends are not run.
class DispatchQueue {
 public:
  virtual ~DispatchQueue() = default;

  // Adds a job and returns at once; the job never runs before this returns.
  virtual void async(JobWeight weight, Job job) = 0;
  // Waits on a semaphore of the same service without holding a thread. Called by a job of this
  // queue, at most once and as the last thing it does: the queue runs no other job until there was
  // a signal, which is consumed, or the time-out has passed (none: never). Then it runs `then`,
  // before the jobs that wait; `then` is a job like any other and may wait again. For shared
  // queues only.
  virtual void waitOn(std::shared_ptr<DispatchSemaphore> semaphore,
                      std::optional<std::chrono::nanoseconds> timeout,
                      std::function<void(WaitOutcome)> then) = 0;
  // True on the thread that is running a job of this queue right now.
  [[nodiscard]] virtual bool isCurrent() const = 0;
};

// Queues, delays and the background pool of the platform.
class DispatchService {
 public:
  virtual ~DispatchService() = default;

  // A new serial queue; the label names its thread or its jobs for debuggers. Whoever holds it
  // keeps it; jobs that were added keep it alive until they have run.
  virtual std::shared_ptr<DispatchQueue> createSerialQueue(std::string_view label,
                                                           QualityOfService quality,
                                                           QueueThreading threading) = 0;
  // A new semaphore with that many signals in it.
  virtual std::shared_ptr<DispatchSemaphore> createSemaphore(std::uint64_t signals) = 0;
  // Runs the job on the background-priority global queue after that delay, in no order with
  // others. Costs no thread while it waits.
  virtual void asyncAfterOnBackgroundQueue(std::chrono::nanoseconds delay, Job job) = 0;
};

}  // namespace halvox::platform
