#include "platform/linux/store/WriterQueue.h"

#include <algorithm>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

// A batch must have this many records to show the time per record. In smaller batches the fixed
// cost of a commit dominates, and their time per record says nothing about a flood.
constexpr std::uint64_t kTellingRecords = 256;

}  // namespace

WriterQueue::WriterQueue(const QueueLimits& limits, Backpressure& backpressure, Clock clock)
    : limits_(limits),
      backpressure_(backpressure),
      clock_(std::move(clock)),
      softRecords_(limits.softRecords),
      gatherRecords_(limits.gatherRecords) {}

void WriterQueue::close() {
  {
    const MutexLock lock(mutex_);
    closed_ = true;
  }
  work_.notifyAll();
  room_.notifyAll();
}

void WriterQueue::requestRound() {
  {
    const MutexLock lock(mutex_);
    roundRequested_ = true;
  }
  work_.notifyOne();
}

bool WriterQueue::take(Time notBefore, const std::function<void()>& take) {
  const MutexLock lock(mutex_);
  // Sleep without a time limit, because an idle service must cause no wake-ups.
  while (queued_ == 0 && !closed_ && !roundRequested_) {
    writer_ = Writer::kIdle;
    work_.wait(mutex_);
  }
  while (queued_ < gatherRecords_ && !closed_ && !roundRequested_ &&
         std::chrono::steady_clock::now() < notBefore) {
    writer_ = Writer::kGathering;
    work_.waitUntil(mutex_, notBefore);
  }
  // From here on, adding a record does not notify the writer. The writer looks for records before
  // it sleeps again.
  writer_ = Writer::kWorking;
  workingSince_ = clock_();
  const bool wasRequested = std::exchange(roundRequested_, false);
  if (queued_ == 0) return wasRequested;
  take();
  queued_ = 0;
  return true;
}

void WriterQueue::finish(std::uint64_t records, std::uint64_t bytes) {
  bool wakeCallers = false;
  bool relieve = false;
  {
    const MutexLock lock(mutex_);
    waiting_ -= records;
    estimate(records, bytes);
    // The estimate may have lowered the soft limit below the number of records that wait already.
    raiseIfBehind();
    wakeCallers = callersWaiting_ > 0;
    // Relieve only well below the soft limit. Connections would otherwise stop and start again and
    // again.
    relieve = backpressure_.isHigh() && waiting_ <= softRecords_ / 4;
  }
  if (wakeCallers) room_.notifyAll();
  // Call relieve() without the lock. Its handler wakes the I/O thread, which may add records at
  // once.
  if (relieve) backpressure_.relieve();
}

void WriterQueue::disregardTime() {
  const MutexLock lock(mutex_);
  workingSince_ = clock_();
}

bool WriterQueue::hasQueued() {
  const MutexLock lock(mutex_);
  return queued_ > 0;
}

std::uint64_t WriterQueue::waiting() {
  const MutexLock lock(mutex_);
  return waiting_;
}

void WriterQueue::waitForRoom() {
  ++callersWaiting_;
  room_.wait(mutex_);
  --callersWaiting_;
}

bool WriterQueue::noteAdded() {
  ++queued_;
  ++waiting_;
  raiseIfBehind();
  const bool wake =
      writer_ == Writer::kIdle || (writer_ == Writer::kGathering && queued_ >= gatherRecords_);
  // One wake-up is enough, however many records are added before the writer runs.
  if (wake) writer_ = Writer::kWorking;
  return wake;
}

void WriterQueue::raiseIfBehind() {
  if (waiting_ >= softRecords_ && !backpressure_.isHigh()) backpressure_.raise();
}

void WriterQueue::estimate(std::uint64_t records, std::uint64_t bytes) {
  if (records == 0) return;
  const Time now = clock_();
  const std::chrono::nanoseconds elapsed = now - std::exchange(workingSince_, now);
  // The estimates rise at once, but fall by at most a quarter with each batch. If an estimate is
  // too low, the limits are too high, and records are not in the database within the promised half
  // second. If an estimate is too high, the limits are too low, which only slows callers for a
  // moment.
  bytesPerRecord_ = std::max(bytes / records, bytesPerRecord_ - bytesPerRecord_ / 4);
  // Use the time of a small batch only if it was as long as a full queue may take.
  if (records >= kTellingRecords || elapsed >= limits_.softTime) {
    timePerRecord_ =
        std::max(elapsed / static_cast<std::int64_t>(records), timePerRecord_ - timePerRecord_ / 4);
  }
  const std::uint64_t bySize = limits_.softBytes / std::max<std::uint64_t>(bytesPerRecord_, 1);
  const auto byTime = static_cast<std::uint64_t>(
      limits_.softTime / std::max(timePerRecord_, std::chrono::nanoseconds(1)));
  softRecords_ = std::clamp<std::uint64_t>(std::min(bySize, byTime), 1, limits_.softRecords);
  // The writer stops gathering at half the soft limit, before backpressure slows the connections.
  gatherRecords_ = std::clamp<std::uint64_t>(softRecords_ / 2, 1, limits_.gatherRecords);
}

}  // namespace halvox::platform::linux_
