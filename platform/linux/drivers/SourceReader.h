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

// Reads one source on a thread of its own, which bounds how long a slow source can delay the start
// or stop of a session.
//
//   made --startOpening()--> opening --> in time <--> late
//
// The source is late after a reading that took too long, and in time again after one that did not.
//
// A request never gets a reading that began before it, because such a reading would miss what was
// counted in between. Requests that arrive during a reading share the next one.
//
// Any thread may use it. The service owns the reader, which owns the source. Its destructor waits
// for the reading that is in progress.
class SourceReader {
 public:
  using Clock = std::chrono::steady_clock;

  // The start and the stop of a session wait at most this long for a reading. They wait on the
  // reporting queue, and all other clients wait with them.
  static constexpr std::chrono::milliseconds kLongestWait{50};
  // How long the service waits for a source once, when it starts. A channel that is missed then is
  // missing until the next start.
  static constexpr std::chrono::milliseconds kLongestOpening{1000};

  // `log` and `statistics` must outlive the reader. `longestWait` is the time that a reading may
  // take.
  SourceReader(std::unique_ptr<DriverSource> source, LogCategory& log,
               StatisticsService& statistics, std::chrono::milliseconds longestWait = kLongestWait);
  SourceReader(const SourceReader&) = delete;
  SourceReader& operator=(const SourceReader&) = delete;
  ~SourceReader();

  // startOpening() begins to open the source. waitUntilOpen() waits until the source has opened. If
  // that takes too long, it logs an error, and the source counts as late. Call each once, in this
  // order, before everything else.
  void startOpening();
  void waitUntilOpen();
  // A request for a reading. The requesting thread passes it to take(), once.
  struct Asked {
    std::uint64_t number = 0;  // of the first reading that is new enough
    bool isWaiting = false;
    std::chrono::milliseconds wait{};
    Clock::time_point deadline{};
  };
  // The purpose of a reading: to find channels, or to sample them for a session.
  enum class Use : std::uint8_t { kFindChannels, kSample };
  // Requests a reading, which may take `wait`. Does not block, so that several sources can read at
  // the same time.
  [[nodiscard]] Asked ask(std::chrono::milliseconds wait, Use use);
  // Waits for the requested reading. Returns null if it does not arrive in time, and logs only the
  // first of several late readings in a row. The source is still read afterwards, but no thread
  // waits for it until a reading has been in time again.
  [[nodiscard]] std::shared_ptr<const Reading> take(const Asked& asked);

 private:
  using ReadingPointer = std::shared_ptr<const Reading>;

  // Returns null if the reading is late. Sets `isFirstLate` if it is the first late reading in a
  // row.
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
  // The numbers, counted from 1, of the latest readings that were requested, begun and finished.
  std::uint64_t lastWanted_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t lastBegun_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t lastMade_ HALVOX_GUARDED_BY(mutex_) = 0;
  int waiting_ HALVOX_GUARDED_BY(mutex_) = 0;
  bool isSampleWanted_ HALVOX_GUARDED_BY(mutex_) = false;
  // The latest reading. Kept only while a thread waits, because a source may check whether its
  // readings are still held.
  ReadingPointer handedOver_ HALVOX_GUARDED_BY(mutex_);
  std::thread thread_;
};

}  // namespace halvox::platform::linux_
