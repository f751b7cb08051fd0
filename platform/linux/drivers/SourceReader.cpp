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
SourceReader::SourceReader(std::unique_ptr<DriverSource> source, StatisticsService& statistics)
    : source_(std::move(source)),
      received_(statistics.counter(pieceOf(*source_), "readings asked for")),
      given_(statistics.counter(pieceOf(*source_), "readings given")),
      late_(statistics.counter(pieceOf(*source_), "left out: late")),
      thread_([this] { run(); }) {}

SourceReader::~SourceReader() {
  {
    const MutexLock lock(mutex_);
    isEnding_ = true;
  }
  wanted_.notifyAll();
  thread_.join();
}

void SourceReader::open() {
  const MutexLock lock(mutex_);
  (void)waitForReading(kLongestOpening);
}

std::shared_ptr<const Reading> SourceReader::read() {
  received_.add();
  ReadingPointer reading;
  bool isFirstLate = false;
  {
    const MutexLock lock(mutex_);
    if (Clock::now() - newestTime_ < kMoment) reading = newest_.lock();
    // Nobody waits for a source that was waited for in vain until it has come round.
    if (reading == nullptr && !(isLate_ && isWanted_)) reading = waitForReading(kLongestWait);
    isFirstLate = reading == nullptr && !std::exchange(isLate_, reading == nullptr);
    if (reading != nullptr) isLate_ = false;
  }
  (reading == nullptr ? late_ : given_).add();
  if (isFirstLate) {
    kLog.error("the driver counters of ", source_->name(), " did not come within ",
               kLongestWait.count(), " ms and are left out until they do");
  }
  return reading;
}

SourceReader::ReadingPointer SourceReader::waitForReading(std::chrono::milliseconds longest) {
  const Clock::time_point deadline = Clock::now() + longest;
  const std::uint64_t number = numberMade_;
  if (!std::exchange(isWanted_, true)) wanted_.notifyAll();
  ++waiting_;
  bool inTime = true;
  while (numberMade_ == number && inTime) inTime = made_.waitUntil(mutex_, deadline);
  ReadingPointer reading = numberMade_ == number ? nullptr : handedOver_;
  if (--waiting_ == 0) handedOver_.reset();
  return reading;
}

void SourceReader::run() {
  source_->open();
  mutex_.lock();
  while (true) {
    while (!isWanted_ && !isEnding_) wanted_.wait(mutex_);
    if (isEnding_) break;
    mutex_.unlock();
    ReadingPointer reading = source_->read();
    const Clock::time_point now = Clock::now();
    mutex_.lock();
    isWanted_ = false;
    ++numberMade_;
    newest_ = reading;
    newestTime_ = now;
    if (waiting_ > 0) handedOver_ = std::move(reading);
    made_.notifyAll();
  }
  mutex_.unlock();
}

}  // namespace halvox::platform::linux_
