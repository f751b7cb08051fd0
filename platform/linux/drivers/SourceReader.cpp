#include "platform/linux/drivers/SourceReader.h"

#include <string>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

std::string pieceOf(const DriverSource& source) {
  return "driver source " + std::string(source.name());
}

}  // namespace

// The counters must balance: readings asked for = given + skipped.
SourceReader::SourceReader(std::unique_ptr<DriverSource> source, LogCategory& log,
                           StatisticsService& statistics, std::chrono::milliseconds longestWait)
    : source_(std::move(source)),
      log_(log, "SourceReader"),
      longestWait_(longestWait),
      received_(statistics.counter(pieceOf(*source_), "readings asked for")),
      given_(statistics.counter(pieceOf(*source_), "readings given")),
      late_(statistics.counter(pieceOf(*source_), "skipped: late")) {}

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
  // Request the first reading before the source is open. The reading is made as soon as the source
  // has opened.
  opening_ = ask(kLongestOpening, Use::kFindChannels);
}

void SourceReader::waitUntilOpen() {
  bool isFirstLate = false;
  if (receive(opening_, isFirstLate) != nullptr) return;
  log_.error("driver source ", source_->name(), " did not open within ", opening_.wait.count(),
             " ms; its counters are not reported until the service restarts");
}

SourceReader::Asked SourceReader::ask(std::chrono::milliseconds wait, Use use) {
  const MutexLock lock(mutex_);
  if (use == Use::kSample) isSampleWanted_ = true;
  const std::uint64_t number = want();
  received_.add();
  // Do not wait for a late source. It is still read, to find out whether it is in time again.
  if (isLate_) return {};
  ++waiting_;
  return {.number = number, .isWaiting = true, .wait = wait, .deadline = Clock::now() + wait};
}

std::shared_ptr<const Reading> SourceReader::take(const Asked& asked) {
  bool isFirstLate = false;
  ReadingPointer reading = receive(asked, isFirstLate);
  if (isFirstLate) {
    log_.error("driver source ", source_->name(), " did not answer within ", asked.wait.count(),
               " ms; its counters are skipped until it answers in time");
  }
  return reading;
}

SourceReader::ReadingPointer SourceReader::receive(const Asked& asked, bool& isFirstLate) {
  ReadingPointer reading;
  if (asked.isWaiting) {
    const MutexLock lock(mutex_);
    reading = waitFor(asked.number, asked.deadline);
    isFirstLate = reading == nullptr && !std::exchange(isLate_, true);
  }
  (reading == nullptr ? late_ : given_).add();
  return reading;
}

// Requests a reading that begins after this call. Returns its number.
std::uint64_t SourceReader::want() {
  // Do not use the reading that is being made, because its values may be older than the request.
  const std::uint64_t number = lastBegun_ + 1;
  if (lastWanted_ < number) {
    lastWanted_ = number;
    wanted_.notifyAll();
  }
  return number;
}

// Returns null if the reading is late.
SourceReader::ReadingPointer SourceReader::waitFor(std::uint64_t number,
                                                   Clock::time_point deadline) {
  bool inTime = true;
  while (lastMade_ < number && inTime) inTime = made_.waitUntil(mutex_, deadline);
  ReadingPointer reading = lastMade_ < number ? nullptr : handedOver_;
  // Release the reading when no other thread will take it, because a source may do work as long as
  // its reading is held.
  if (--waiting_ == 0) handedOver_.reset();
  return reading;
}

void SourceReader::run() {
  // Open the source on this thread, so that all sources open at the same time.
  source_->open();
  const MutexLock lock(mutex_);
  makeReadings();
}

void SourceReader::makeReadings() {
  while (true) {
    while (lastWanted_ == lastBegun_ && !isEnding_) wanted_.wait(mutex_);
    if (isEnding_) return;
    ++lastBegun_;
    const bool isSample = std::exchange(isSampleWanted_, false);
    mutex_.unlock();
    const Clock::time_point start = Clock::now();
    // Read without the lock, so that other threads can request the next reading meanwhile.
    ReadingPointer reading = source_->read();
    const Clock::duration time = Clock::now() - start;
    mutex_.lock();
    // Decide by the time that the reading took. Whether a thread received it in time would say
    // nothing, because no thread waits for a late source.
    if (time <= longestWait_) isLate_ = false;
    lastMade_ = lastBegun_;
    // Store the reading if any thread waits, even if that thread waits for the next one, which will
    // replace this one.
    if (waiting_ > 0) std::swap(handedOver_, reading);
    made_.notifyAll();
    mutex_.unlock();
    // Release the replaced or unused reading without the lock, because its destructor may call the
    // source, which must not delay threads with requests.
    reading.reset();
    if (isSample) source_->sampled();
    mutex_.lock();
  }
}

}  // namespace halvox::platform::linux_
