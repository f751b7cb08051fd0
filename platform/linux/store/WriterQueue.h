#pragma once

#include <chrono>
#include <cstdint>
#include <functional>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/dispatch/Backpressure.h"

namespace halvox::platform::linux_ {

// How many records may wait. The size of a waiting record and the time that it will take are not
// known yet, because the writer builds payloads when it writes them. The queue estimates both from
// the records written last, and applies whichever of the three soft limits is reached first.
//
// At the soft limit connections are read more slowly; at the hard limit callers wait. With these
// values the hard limit is 4 x 75 ms of writing. Together with gathering this leaves room within
// the half second in which a record must be in the database.
struct QueueLimits {
  std::uint64_t softRecords = 8192;
  std::uint64_t softBytes = 16U << 20U;    // of payload
  std::chrono::milliseconds softTime{75};  // of writing
  std::uint64_t hardFactor = 4;            // the hard limit as a multiple of the soft limit

  std::chrono::milliseconds gatherTime{20};
  std::uint64_t gatherRecords = 4096;  // as many as fit into one transaction
};

// Connects the threads that add records with the store's writer: counts waiting records, wakes the
// writer as seldom as possible, and makes callers wait when too many wait. The records themselves
// are in their RecordKind, which the queue calls under its lock: one lock and one wake-up serve all
// kinds.
//
// The writer sleeps without a timer while nothing waits. The first record wakes it. If its last
// round was less than `gatherTime` ago, it then sleeps until that time is over or `gatherRecords`
// wait. This keeps a busy service from committing often and from waking the writer for each record.
//
// Owned by the store. Cannot fail.
class WriterQueue {
 public:
  using Time = std::chrono::steady_clock::time_point;
  using Clock = std::function<Time()>;

  // Raises `backpressure` at the soft limit and relieves it at a quarter of that limit, so that it
  // does not switch back and forth. Does not own `backpressure`, which must outlive the queue.
  // `clock` measures how long writing takes; the writer calls it, under the lock. The waits of
  // take() are in real time.
  WriterQueue(const QueueLimits& limits, Backpressure& backpressure,
              Clock clock = std::chrono::steady_clock::now);

  // Any thread. Waits for room, then runs `append` under the lock and returns true. Returns false
  // without running it when the queue is closed. `append` must not block or throw.
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
  // Any thread. Refuses new records and frees callers that wait for room. The writer still takes
  // the records that are queued.
  void close() HALVOX_EXCLUDES(mutex_);

  // Any thread. Makes the current or next take() return at once, even if nothing is queued.
  void requestRound() HALVOX_EXCLUDES(mutex_);

  // Writer only. Waits for a record, then until `notBefore` or until `gatherRecords` wait, and runs
  // `take` under the lock. `take` must take everything that is queued. Returns false, without
  // running it, when the queue is closed and empty. After requestRound() it returns true at once,
  // and runs `take` only if something is queued.
  bool take(Time notBefore, const std::function<void()>& take) HALVOX_EXCLUDES(mutex_);
  // Writer only. `records` of the taken records were stored or dropped; their payloads had `bytes`.
  // The queue counts the time since the last take(), finish() or disregardTime() as the time that
  // they needed.
  void finish(std::uint64_t records, std::uint64_t bytes) HALVOX_EXCLUDES(mutex_);
  // Writer only. The time so far was spent on a failure: finish() must not count it as writing.
  void disregardTime() HALVOX_EXCLUDES(mutex_);
  // Writer only. Returns true when records were added after the last take().
  [[nodiscard]] bool hasQueued() HALVOX_EXCLUDES(mutex_);

  // Any thread. The number of records that were added and are not finished.
  [[nodiscard]] std::uint64_t waiting() HALVOX_EXCLUDES(mutex_);
  // Any thread. True from the soft limit on, until the backpressure is relieved. While it is false,
  // add() finds room unless other threads fill the queue at that moment. Takes no lock.
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
  // The limits in records, derived from the estimates.
  std::uint64_t softRecords_ HALVOX_GUARDED_BY(mutex_);
  std::uint64_t gatherRecords_ HALVOX_GUARDED_BY(mutex_);
  bool closed_ HALVOX_GUARDED_BY(mutex_) = false;
  bool roundRequested_ HALVOX_GUARDED_BY(mutex_) = false;
};

}  // namespace halvox::platform::linux_
