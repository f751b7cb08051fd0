#pragma once

#include <chrono>
#include <cstdint>
#include <functional>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/dispatch/Backpressure.h"

namespace halvox::platform::linux_ {

// How many records may wait. The queue does not know the size of a waiting record or the time that
// writing it will take, because the writer builds the payload only when it writes the record. The
// queue estimates both from the last written records, and applies the lowest of the three soft
// limits.
//
// At the soft limit the busiest connections are read more slowly. At the hard limit callers wait.
// With these values, the records at the hard limit take 4 x 75 ms to write. With the time for
// gathering, this is less than the half second within which a record must be in the database.
struct QueueLimits {
  std::uint64_t softRecords = 8192;
  std::uint64_t softBytes = 16U << 20U;    // of payload
  std::chrono::milliseconds softTime{75};  // of writing
  std::uint64_t hardFactor = 4;            // the hard limit as a multiple of the soft limit

  std::chrono::milliseconds gatherTime{20};
  std::uint64_t gatherRecords = 4096;  // as many as fit into one transaction
};

// Connects the threads that add records with the store's writer. Counts the waiting records, wakes
// the writer as seldom as possible, and makes callers wait while too many records wait. The records
// themselves are in their RecordKind, which the queue calls under its lock. One lock and one
// wake-up therefore serve all kinds.
//
// The writer sleeps without a timer while nothing waits. The first record wakes it. If its last
// round began less than `gatherTime` ago, the writer then sleeps until that time is over or
// `gatherRecords` wait. A busy service therefore does not commit often and does not wake the writer
// for each record.
//
// Owned by the store. Cannot fail.
class WriterQueue {
 public:
  using Time = std::chrono::steady_clock::time_point;
  using Clock = std::function<Time()>;

  // Raises `backpressure` at the soft limit and relieves it at a quarter of that limit. The
  // distance keeps it from switching back and forth. Does not own `backpressure`, which must
  // outlive the queue. `clock` measures how long writing takes; only the writer calls it, under the
  // lock. The waits of take() use the real clock.
  WriterQueue(const QueueLimits& limits, Backpressure& backpressure,
              Clock clock = std::chrono::steady_clock::now);

  // Any thread. Waits while the hard limit is reached, then runs `append` under the lock and
  // returns true. If the queue is closed, returns false and does not run `append`. `append` must
  // not block or throw.
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
  // Any thread. Refuses new records, and ends the waits in add(). The writer still takes the
  // records that are queued.
  void close() HALVOX_EXCLUDES(mutex_);

  // Any thread. Makes the current or next take() return at once, even if nothing is queued.
  void requestRound() HALVOX_EXCLUDES(mutex_);

  // Writer only. Waits for a record, then until `notBefore` or until `gatherRecords` wait, and runs
  // `take` under the lock. `take` must take everything that is queued. If the queue is closed and
  // empty, returns false and does not run `take`. After requestRound(), returns true at once and
  // runs `take` only if something is queued.
  bool take(Time notBefore, const std::function<void()>& take) HALVOX_EXCLUDES(mutex_);
  // Writer only. Call it when `records` of the taken records were stored or dropped; their payloads
  // had `bytes` in all. The queue counts the time since the last take(), finish() or
  // disregardTime() as the time that these records needed.
  void finish(std::uint64_t records, std::uint64_t bytes) HALVOX_EXCLUDES(mutex_);
  // Writer only. Call it after a failure. finish() then does not count the time before this call as
  // writing.
  void disregardTime() HALVOX_EXCLUDES(mutex_);
  // Writer only. Returns true when records were added after the last take().
  [[nodiscard]] bool hasQueued() HALVOX_EXCLUDES(mutex_);

  // Any thread. Returns the number of records that were added and are not finished.
  [[nodiscard]] std::uint64_t waiting() HALVOX_EXCLUDES(mutex_);
  // Any thread. Returns true from the moment when the soft limit is reached until the backpressure
  // is relieved. While it is false, add() does not wait, unless other threads fill the queue at
  // that moment. Takes no lock.
  [[nodiscard]] bool isBehind() const { return backpressure_.isHigh(); }
  [[nodiscard]] const QueueLimits& limits() const { return limits_; }

 private:
  enum class Writer : std::uint8_t { kWorking, kIdle, kGathering };

  void waitForRoom() HALVOX_REQUIRES(mutex_);
  bool noteAdded() HALVOX_REQUIRES(mutex_);
  void raiseIfBehind() HALVOX_REQUIRES(mutex_);
  void estimate(std::uint64_t records, std::uint64_t bytes) HALVOX_REQUIRES(mutex_);

  const QueueLimits limits_;
  Backpressure& backpressure_;
  const Clock clock_;
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
  // The limits as numbers of records, derived from the estimates.
  std::uint64_t softRecords_ HALVOX_GUARDED_BY(mutex_);
  std::uint64_t gatherRecords_ HALVOX_GUARDED_BY(mutex_);
  bool closed_ HALVOX_GUARDED_BY(mutex_) = false;
  bool roundRequested_ HALVOX_GUARDED_BY(mutex_) = false;
};

}  // namespace halvox::platform::linux_
