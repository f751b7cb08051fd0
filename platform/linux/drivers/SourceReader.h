#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <thread>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/drivers/DriverSource.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Reads one source on a thread of its own, so that whoever asks waits no longer than a bound.
// Nobody is given a reading that was begun before he asked; those who ask while a reading is made
// share the next one. Any thread may ask. Owns the source. Its end waits for a reading that is
// being made.
class SourceReader {
 public:
  using Clock = std::chrono::steady_clock;

  static constexpr std::chrono::milliseconds kLongestWait{50};
  static constexpr std::chrono::milliseconds kLongestOpening{1000};

  // `longestWait` is the time that a reading may take.
  SourceReader(std::unique_ptr<DriverSource> source, StatisticsService& statistics,
               std::chrono::milliseconds longestWait = kLongestWait);
  SourceReader(const SourceReader&) = delete;
  SourceReader& operator=(const SourceReader&) = delete;
  ~SourceReader();

  // Begins to open the source; then waits until it has, or has taken too long, which is logged and
  // makes it late. Once each, in this order, before all else.
  void startOpening();
  void waitUntilOpen();
  // What somebody asked for. Taken once, by the one who asked.
  struct Asked {
    std::uint64_t number = 0;  // of the first reading that is new enough
    bool isWaiting = false;
    std::chrono::milliseconds wait{};
    Clock::time_point deadline{};
  };
  // Has the source begin with a reading, which may take so long; several sources can be at it at
  // once.
  [[nodiscard]] Asked ask(std::chrono::milliseconds wait);
  // The reading that was asked for; null, with a line in the log once in a row, when it does not
  // come in time. A source that was late once is read, but nobody waits for it before a reading of
  // it took no longer than allowed.
  [[nodiscard]] std::shared_ptr<const Reading> take(const Asked& asked);

 private:
  using ReadingPointer = std::shared_ptr<const Reading>;

  // Null when it is late; sets whether it was not late before.
  [[nodiscard]] ReadingPointer receive(const Asked& asked, bool& isFirstLate);
  void run();
  void makeReadings() HALVOX_REQUIRES(mutex_);
  std::uint64_t want() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] ReadingPointer waitFor(std::uint64_t number, Clock::time_point deadline)
      HALVOX_REQUIRES(mutex_);

  const std::unique_ptr<DriverSource> source_;
  const std::chrono::milliseconds longestWait_;
  Counter& received_;
  Counter& given_;
  Counter& late_;
  Asked opening_{};  // of the thread that opens
  Mutex mutex_;
  Condition wanted_;
  Condition made_;
  bool isEnding_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isLate_ HALVOX_GUARDED_BY(mutex_) = false;  // logged, and not come round yet
  // Readings are numbered from 1 on: the last that somebody wants, that was begun, that was made.
  std::uint64_t lastWanted_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t lastBegun_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t lastMade_ HALVOX_GUARDED_BY(mutex_) = 0;
  int waiting_ HALVOX_GUARDED_BY(mutex_) = 0;
  // The last made, held only while somebody waits: a source looks at who holds its readings.
  ReadingPointer handedOver_ HALVOX_GUARDED_BY(mutex_);
  std::thread thread_;
};

}  // namespace halvox::platform::linux_
