#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

namespace halvox::platform {

using Job = std::function<void()>;

enum class QualityOfService : std::uint8_t { kUserInteractive, kUtility, kBackground };

// What a serial queue runs on: a thread of its own, or the pool that all shared queues use.
enum class QueueThreading : std::uint8_t { kOwnThread, kShared };

// Whether a job can wait for anything (a file, a server, another queue). A brief one cannot, so a
// thread that must not stand still may carry it out too.
enum class JobWeight : std::uint8_t { kBrief, kMayBlock };

// Runs its jobs one at a time, in the order in which they came. Any thread may add jobs.
// Jobs that are waiting when the process ends are not run.
class DispatchQueue {
 public:
  virtual ~DispatchQueue() = default;

  // Adds a job and returns at once; the job never runs before this returns.
  virtual void async(JobWeight weight, Job job) = 0;
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
  // Runs the job on the background-priority global queue after that delay, in no order with
  // others. Costs no thread while it waits.
  virtual void asyncAfterOnBackgroundQueue(std::chrono::nanoseconds delay, Job job) = 0;
};

}  // namespace halvox::platform
