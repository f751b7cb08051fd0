#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <thread>

#include "platform/linux/Mutex.h"
#include "platform/linux/drivers/DriverSource.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Reads one source on a thread of its own, so that whoever asks waits no longer than a bound.
// Readings are shared: whoever asks within the same moment gets the same one, so the groups of a
// snapshot or report are of one moment. Any thread may ask. Owns the source. Its end waits for a
// reading that is being made.
class SourceReader {
 public:
  using Clock = std::chrono::steady_clock;

  // Readings that are asked for within this time are the same.
  static constexpr std::chrono::milliseconds kMoment{5};
  static constexpr std::chrono::milliseconds kLongestWait{50};
  static constexpr std::chrono::milliseconds kLongestOpening{1000};

  // `longestWait` is the time that a reading may take.
  SourceReader(std::unique_ptr<DriverSource> source, StatisticsService& statistics,
               std::chrono::milliseconds longestWait = kLongestWait);
  SourceReader(const SourceReader&) = delete;
  SourceReader& operator=(const SourceReader&) = delete;
  ~SourceReader();

  // Begins to open the source; then waits until it has, or has taken too long. Once each, in this
  // order. Before it, every reading is late.
  void startOpening();
  void waitUntilOpen();
  // What somebody asked for; to be taken by him, once.
  struct Asked {
    std::shared_ptr<const Reading> reading{};  // there already
    std::uint64_t number = 0;
    bool isWaiting = false;
  };
  // Has the source begin with the reading of this moment, so that several can be at it at once.
  [[nodiscard]] Asked ask();
  // The reading that was asked for; null, with a line in the log once in a row, when it does not
  // come before the deadline. A source that was late once is read, but nobody waits for it before a
  // reading of it took no longer than allowed.
  [[nodiscard]] std::shared_ptr<const Reading> take(Asked asked, Clock::time_point deadline);

 private:
  using ReadingPointer = std::shared_ptr<const Reading>;

  void run();
  void waitUntilWanted() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] std::uint64_t want() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] ReadingPointer waitFor(std::uint64_t number, Clock::time_point deadline)
      HALVOX_REQUIRES(mutex_);

  const std::unique_ptr<DriverSource> source_;
  const std::chrono::milliseconds longestWait_;
  Counter& received_;
  Counter& given_;
  Counter& late_;
  std::uint64_t opening_ = 0;  // of the thread that opens
  Mutex mutex_;
  Condition wanted_;
  Condition made_;
  bool isWanted_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isEnding_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isLate_ HALVOX_GUARDED_BY(mutex_) = false;  // told, and not come round yet
  std::uint64_t numberMade_ HALVOX_GUARDED_BY(mutex_) = 0;
  int waiting_ HALVOX_GUARDED_BY(mutex_) = 0;
  // Each held only as long as it is of use: a source looks at who holds its readings.
  ReadingPointer handedOver_ HALVOX_GUARDED_BY(mutex_);  // while somebody waits for it
  ReadingPointer newest_ HALVOX_GUARDED_BY(mutex_);      // for its moment
  Clock::time_point newestTime_ HALVOX_GUARDED_BY(mutex_){};
  std::thread thread_;
};

}  // namespace halvox::platform::linux_
