#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <thread>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/drivers/DriverSource.h"
#include "platform/object_log.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Reads one source on a thread of its own, so that a slow source holds up a session's start or stop
// for a bounded time only.
//
//   made --startOpening()--> opening --> in time <--> late
//
// It is late after a reading that took too long, and in time after one that did not.
//
// Nobody receives a reading that began before the request: it would miss what was counted in
// between. Requests that come during a reading share the next one.
//
// Any thread may ask. The service owns it; it owns the source. Its destructor waits for the reading
// that is in progress.
class SourceReader {
 public:
  using Clock = std::chrono::steady_clock;

  // Both ends of a session wait for it on the reporting queue, and with them all other clients.
  static constexpr std::chrono::milliseconds kLongestWait{50};
  // Once, when the service starts. What is missed then is missing until the next start.
  static constexpr std::chrono::milliseconds kLongestOpening{1000};

  // `log` and `statistics` must outlive the reader. `longestWait` is the time that a reading may
  // take.
  SourceReader(std::unique_ptr<DriverSource> source, LogCategory& log,
               StatisticsService& statistics, std::chrono::milliseconds longestWait = kLongestWait);
  SourceReader(const SourceReader&) = delete;
  SourceReader& operator=(const SourceReader&) = delete;
  ~SourceReader();

  // The first call begins to open the source. The second waits until it has opened; if it takes too
  // long, that is logged and the source counts as late. Call each once, in this order, before
  // everything else.
  void startOpening();
  void waitUntilOpen();
  // A request for a reading. The thread that asked passes it to take(), once.
  struct Asked {
    std::uint64_t number = 0;  // of the first reading that is new enough
    bool isWaiting = false;
    std::chrono::milliseconds wait{};
    Clock::time_point deadline{};
  };
  // What a reading is for: which channels there are, or a sample of a session.
  enum class Use : std::uint8_t { kFindChannels, kSample };
  // Asks for a reading, which may take that long. Does not block, so several sources can read at
  // the same time.
  [[nodiscard]] Asked ask(std::chrono::milliseconds wait, Use use);
  // Waits for the reading that was asked for; null if it does not come in time. The first time in a
  // row is logged. After that the source is still read, but nobody waits for it until a reading has
  // been in time again.
  [[nodiscard]] std::shared_ptr<const Reading> take(const Asked& asked);

 private:
  using ReadingPointer = std::shared_ptr<const Reading>;

  // Null if the reading is late. Sets whether the source was in time before.
  [[nodiscard]] ReadingPointer receive(const Asked& asked, bool& isFirstLate);
  void run();
  void makeReadings() HALVOX_REQUIRES(mutex_);
  std::uint64_t want() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] ReadingPointer waitFor(std::uint64_t number, Clock::time_point deadline)
      HALVOX_REQUIRES(mutex_);

  const std::unique_ptr<DriverSource> source_;
  const ObjectLog log_;
  const std::chrono::milliseconds longestWait_;
  Counter& received_;
  Counter& given_;
  Counter& late_;
  Asked opening_{};  // used by the thread that opens the source
  Mutex mutex_;
  Condition wanted_;
  Condition made_;
  bool isEnding_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isLate_ HALVOX_GUARDED_BY(mutex_) = false;  // logged, and not in time again yet
  // Numbers of readings, from 1: of the latest that was asked for, that has begun, and that is
  // finished.
  std::uint64_t lastWanted_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t lastBegun_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t lastMade_ HALVOX_GUARDED_BY(mutex_) = 0;
  int waiting_ HALVOX_GUARDED_BY(mutex_) = 0;
  bool isSampleWanted_ HALVOX_GUARDED_BY(mutex_) = false;
  // The latest reading. Kept only while someone waits, because a source may look at whether its
  // readings are still held.
  ReadingPointer handedOver_ HALVOX_GUARDED_BY(mutex_);
  std::thread thread_;
};

}  // namespace halvox::platform::linux_
