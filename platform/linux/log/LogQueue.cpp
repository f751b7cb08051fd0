#include "platform/linux/log/LogQueue.h"

#include <utility>

namespace halvox::platform::linux_ {
namespace {

// Bytes of texts and entries: about 5,000 lines of 100 bytes. Errors may use another kRoomForErrors
// bytes.
constexpr std::size_t kRoom = 1U << 20U;
constexpr std::size_t kRoomForErrors = 256U << 10U;
// The number of entries whose memory is kept between two batches. The memory of a larger burst is
// freed.
constexpr std::size_t kKeptCapacity = 256;

}  // namespace

bool LogQueue::add(LogEntry entry) {
  const std::size_t cost = sizeof(LogEntry) + entry.text.size();
  const std::size_t room = entry.level == LogLevel::kError ? kRoom + kRoomForErrors : kRoom;
  bool isFirst = false;
  {
    const MutexLock lock(mutex_);
    // Drop the new line, because threads that log never wait for a slow reader.
    if (hasEnded_ || bytes_ + cost > room) return false;
    isFirst = entries_.empty();
    entries_.push_back(std::move(entry));
    bytes_ += cost;
  }
  // Only the first entry wakes the log's thread, which takes all entries before it sleeps.
  if (isFirst) wakeUp_.notifyOne();
  return true;
}

bool LogQueue::take(std::vector<LogEntry>& entries) {
  entries.clear();
  if (entries.capacity() > kKeptCapacity) entries.shrink_to_fit();
  const MutexLock lock(mutex_);
  while (entries_.empty()) {
    if (hasEnded_) return false;
    wakeUp_.wait(mutex_);
  }
  // Take all lines at once. The lock is then held only for a moment, however long it takes to write
  // them.
  entries.swap(entries_);
  bytes_ = 0;
  return true;
}

void LogQueue::end() {
  const MutexLock lock(mutex_);
  hasEnded_ = true;
  wakeUp_.notifyOne();
}

}  // namespace halvox::platform::linux_
