#include "platform/linux/drivers/SourceReader.h"

#include <string>
#include <utility>

#include "platform/linux/drivers/DriverSourceLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(driversCategory, "SourceReader");

std::string pieceOf(const DriverSource& source) {
  return "driver source " + std::string(source.name());
}

}  // namespace

// asked for = given + left out.
SourceReader::SourceReader(std::unique_ptr<DriverSource> source, StatisticsService& statistics,
                           std::chrono::milliseconds longestWait)
    : source_(std::move(source)),
      longestWait_(longestWait),
      received_(statistics.counter(pieceOf(*source_), "readings asked for")),
      given_(statistics.counter(pieceOf(*source_), "readings given")),
      late_(statistics.counter(pieceOf(*source_), "left out: late")) {}

SourceReader::~SourceReader() {
  {
    const MutexLock lock(mutex_);
    isEnding_ = true;
  }
  wanted_.notifyAll();
  if (thread_.joinable()) thread_.join();
}

void SourceReader::startOpening() {
  thread_ = std::thread([this] { run(); });
  const MutexLock lock(mutex_);
  opening_ = want();
}

void SourceReader::waitUntilOpen() {
  const MutexLock lock(mutex_);
  (void)waitFor(opening_, Clock::now() + kLongestOpening);
}

SourceReader::Asked SourceReader::ask() {
  received_.add();
  const MutexLock lock(mutex_);
  if (newest_ != nullptr && Clock::now() - newestTime_ < kMoment) return {.reading = newest_};
  // A source that is late is read all the same, to see whether it has come round.
  if (isLate_) {
    if (!std::exchange(isWanted_, true)) wanted_.notifyAll();
    return {};
  }
  return {.reading = nullptr, .number = want(), .isWaiting = true};
}

std::shared_ptr<const Reading> SourceReader::take(Asked asked, Clock::time_point deadline) {
  ReadingPointer reading = std::move(asked.reading);
  bool isFirstLate = false;
  if (asked.isWaiting) {
    const MutexLock lock(mutex_);
    reading = waitFor(asked.number, deadline);
    isFirstLate = reading == nullptr && !std::exchange(isLate_, true);
  }
  (reading == nullptr ? late_ : given_).add();
  if (isFirstLate) {
    kLog.error("the driver counters of ", source_->name(), " did not come within ",
               longestWait_.count(), " ms and are left out until they do");
  }
  return reading;
}

// Has a reading made, unless one is being made, and promises to wait for it; returns how many there
// were before it.
std::uint64_t SourceReader::want() {
  if (!std::exchange(isWanted_, true)) wanted_.notifyAll();
  ++waiting_;
  return numberMade_;
}

// Null when it is late.
SourceReader::ReadingPointer SourceReader::waitFor(std::uint64_t number,
                                                   Clock::time_point deadline) {
  bool inTime = true;
  while (numberMade_ == number && inTime) inTime = made_.waitUntil(mutex_, deadline);
  ReadingPointer reading = numberMade_ == number ? nullptr : handedOver_;
  if (--waiting_ == 0) handedOver_.reset();
  return reading;
}

// Lets go of the newest reading when its moment is over.
void SourceReader::waitUntilWanted() {
  while (!isWanted_ && !isEnding_) {
    if (newest_ == nullptr) {
      wanted_.wait(mutex_);
    } else if (!wanted_.waitUntil(mutex_, newestTime_ + kMoment)) {
      ReadingPointer old = std::exchange(newest_, nullptr);
      mutex_.unlock();
      // What the source does when nobody holds its reading any more must hold up no asker.
      old.reset();
      mutex_.lock();
    }
  }
}

void SourceReader::run() {
  source_->open();
  mutex_.lock();
  while (true) {
    waitUntilWanted();
    if (isEnding_) break;
    ReadingPointer old = std::exchange(newest_, nullptr);
    mutex_.unlock();
    old.reset();
    const Clock::time_point start = Clock::now();
    ReadingPointer reading = source_->read();
    const Clock::time_point now = Clock::now();
    mutex_.lock();
    if (now - start <= longestWait_) isLate_ = false;
    isWanted_ = false;
    ++numberMade_;
    newestTime_ = now;
    if (waiting_ > 0) handedOver_ = reading;
    newest_ = std::move(reading);
    made_.notifyAll();
  }
  mutex_.unlock();
}

}  // namespace halvox::platform::linux_
