#pragma once

#include <chrono>
#include <cstdint>
#include <functional>

#include "platform/linux/Mutex.h"
#include "platform/linux/runtime/Backpressure.h"

namespace halvox::platform::linux_ {

// How many records may wait. Payloads are built when they are written, so bytes and time are known
// only then: the sizes of the last payloads, and how long writing took, stand for those that wait.
struct QueueLimits {
  std::uint64_t softRecords = 8192;
  std::uint64_t softBytes = 16U << 20U;
  std::chrono::milliseconds softTime{75};
  std::uint64_t hardFactor = 4;  // at so many times the soft limit callers wait

  std::chrono::milliseconds gatherTime{20};
  std::uint64_t gatherRecords = 4096;
};

// The meeting point of the callers and the store's writer: counts what waits, wakes the writer as
// seldom as it may, and makes callers wait when too much waits. The records themselves are with
// their kinds, which move them under this queue's lock.
//
// The writer sleeps without a timer while nothing waits. The first record wakes it. Records that
// come within `gatherTime` of its last round are gathered until that time is over or
// `gatherRecords` wait, so that a busy service commits seldom and wakes nobody for single records.
class WriterQueue {
 public:
  using Time = std::chrono::steady_clock::time_point;

  // Does not own `backpressure`, which must outlive it: raised above the soft limit, relieved below
  // a quarter of it.
  WriterQueue(const QueueLimits& limits, Backpressure& backpressure);

  // Any thread. Runs `append` under the lock, once there is room; false, and nothing was run, when
  // the queue is closed.
  template <typename Append>
  bool add(Append&& append) HALVOX_EXCLUDES(mutex_) {
    bool wake = false;
    {
      const MutexLock lock(mutex_);
      while (waiting_ >= softRecords_ * limits_.hardFactor && !closed_) waitForRoom();
      if (closed_) return false;
      append();
      wake = noteAdded();
    }
    if (wake) work_.notifyOne();
    return true;
  }
  // Any thread. Lets the writer finish what waits and refuses all that comes later.
  void close() HALVOX_EXCLUDES(mutex_);

  // The writer: waits for records, at least until `notBefore` unless many wait, then runs `take`
  // under the lock, which must take all that is queued. False when the queue is closed and empty.
  bool take(Time notBefore, const std::function<void()>& take) HALVOX_EXCLUDES(mutex_);
  // The writer: so many of the taken records are done with; `bytes` were in their payloads. It was
  // at work on them since the last call of this or of take().
  void finish(std::uint64_t records, std::uint64_t bytes) HALVOX_EXCLUDES(mutex_);
  // The writer: the time since then went by in a failure and says nothing about writing.
  void disregardTime() HALVOX_EXCLUDES(mutex_);
  // The writer: whether records came since the last take().
  [[nodiscard]] bool hasQueued() HALVOX_EXCLUDES(mutex_);

  // Records that were added and are not done with.
  [[nodiscard]] std::uint64_t waiting() HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] const QueueLimits& limits() const { return limits_; }

 private:
  enum class Writer : std::uint8_t { kWorking, kIdle, kGathering };

  void waitForRoom() HALVOX_REQUIRES(mutex_);
  bool noteAdded() HALVOX_REQUIRES(mutex_);
  void estimate(std::uint64_t records, std::uint64_t bytes) HALVOX_REQUIRES(mutex_);

  const QueueLimits limits_;
  Backpressure& backpressure_;
  Mutex mutex_;
  Condition work_;
  Condition room_;
  Writer writer_ HALVOX_GUARDED_BY(mutex_) = Writer::kWorking;
  std::uint64_t queued_ HALVOX_GUARDED_BY(mutex_) = 0;   // not taken yet
  std::uint64_t waiting_ HALVOX_GUARDED_BY(mutex_) = 0;  // queued or taken
  std::uint64_t callersWaiting_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t bytesPerRecord_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::chrono::nanoseconds timePerRecord_ HALVOX_GUARDED_BY(mutex_){};
  Time workingSince_ HALVOX_GUARDED_BY(mutex_);
  // The limits as the last payloads make them.
  std::uint64_t softRecords_ HALVOX_GUARDED_BY(mutex_);
  std::uint64_t gatherRecords_ HALVOX_GUARDED_BY(mutex_);
  bool closed_ HALVOX_GUARDED_BY(mutex_) = false;
};

}  // namespace halvox::platform::linux_
