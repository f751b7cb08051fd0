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
// Readings are shared: whoever asks within the same moment gets the same one. Any thread may ask.
// Owns the source. Its end waits for a reading that is being made.
class SourceReader {
 public:
  using Clock = std::chrono::steady_clock;

  // Readings that are asked for within this time are the same.
  static constexpr std::chrono::milliseconds kMoment{5};
  static constexpr std::chrono::milliseconds kLongestWait{50};
  static constexpr std::chrono::milliseconds kLongestOpening{1000};

  SourceReader(std::unique_ptr<DriverSource> source, StatisticsService& statistics);
  SourceReader(const SourceReader&) = delete;
  SourceReader& operator=(const SourceReader&) = delete;
  ~SourceReader();

  // Opens the source and waits until it has, or has taken too long.
  void open();
  // The source's reading of this moment; null, with a line in the log once in a row, when it does
  // not come in time. While the source is late nobody waits for it.
  [[nodiscard]] std::shared_ptr<const Reading> read();

 private:
  using ReadingPointer = std::shared_ptr<const Reading>;

  void run();
  // Asks for a reading, if none is being made, and waits for it; null when it is late.
  [[nodiscard]] ReadingPointer waitForReading(std::chrono::milliseconds longest)
      HALVOX_REQUIRES(mutex_);

  const std::unique_ptr<DriverSource> source_;
  Counter& received_;
  Counter& given_;
  Counter& late_;
  Mutex mutex_;
  Condition wanted_;
  Condition made_;
  bool isWanted_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isEnding_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isLate_ HALVOX_GUARDED_BY(mutex_) = false;  // told already
  std::uint64_t numberMade_ HALVOX_GUARDED_BY(mutex_) = 0;
  int waiting_ HALVOX_GUARDED_BY(mutex_) = 0;
  // Held only while somebody waits for it: a source looks at who holds its readings.
  ReadingPointer handedOver_ HALVOX_GUARDED_BY(mutex_);
  std::weak_ptr<const Reading> newest_ HALVOX_GUARDED_BY(mutex_);
  Clock::time_point newestTime_ HALVOX_GUARDED_BY(mutex_){};
  std::thread thread_;
};

}  // namespace halvox::platform::linux_
