#include "platform/linux/tracing/lttng/LttngKtraceService.h"

#include <memory>
#include <utility>
#include <vector>

#include "platform/linux/tracing/TracingLog.h"
#include "platform/linux/tracing/lttng/TraceReader.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(tracingCategory, "LttngKtraceService");

constexpr int kNotStarted = 1;
constexpr int kNoRange = 2;
constexpr int kUnsuitable = 3;  // there is no session, or it is not being set up any more
constexpr std::size_t kBatchEvents = 4096;

// Events on their way to the queue. They are counted as dropped when they go undelivered: the queue
// has ended with the service.
class Batch {
 public:
  explicit Batch(Counter& dropped) : dropped_(dropped) {}
  Batch(const Batch&) = delete;
  Batch& operator=(const Batch&) = delete;
  ~Batch() { dropped_.add(points_.size()); }

  void add(const trace_point& point) {
    if (points_.empty()) points_.reserve(kBatchEvents);
    points_.push_back(point);
  }
  [[nodiscard]] std::size_t size() const { return points_.size(); }
  [[nodiscard]] std::vector<trace_point> take() { return std::exchange(points_, {}); }

 private:
  Counter& dropped_;
  std::vector<trace_point> points_;
};

struct Range {
  std::uint32_t low = 0;
  std::uint32_t high = 0;
  KtraceService::EventHandler handler{};
};

}  // namespace

// Belongs to who sets it up until it is started, and then to the queue that it was started with.
// The thread that reads has the recording and the clock between the end and the deliveries.
class LttngKtraceSession final : public KtraceSession {
 public:
  enum class State : std::uint8_t { kMade, kStarted, kEnded, kDestroyed };

  State state = State::kMade;
  std::vector<Range> ranges;
  std::function<void()> completion;
  std::shared_ptr<DispatchQueue> queue;
  std::optional<LttngControl::Recording> recording;  // while it records
  TraceClock clock;
  bool hasWalltimes = false;

  [[nodiscard]] std::string filter() const {
    std::string text;
    for (const Range& range : ranges) {
      text += text.empty() ? "" : " || ";
      text += "(code >= " + std::to_string(range.low) + " && code <= " + std::to_string(range.high);
      text += ")";
    }
    return text;
  }

  void deliver(const std::vector<trace_point>& points) const {
    for (const trace_point& point : points) {
      for (const Range& range : ranges) {
        const bool isWanted = point.debugid >= range.low && point.debugid <= range.high;
        if (isWanted && range.handler) range.handler(point);
      }
    }
  }
};

namespace {

using State = LttngKtraceSession::State;

// The session in that state; null when it is in another or there is none.
std::shared_ptr<LttngKtraceSession> own(const KtraceService::Session& session, State state) {
  auto ours = std::dynamic_pointer_cast<LttngKtraceSession>(session);
  return ours != nullptr && ours->state == state ? ours : nullptr;
}

}  // namespace

bool DeliveryGate::enter() {
  const MutexLock lock(mutex_);
  while (inside_ == most_ && !isStopping_) changed_.wait(mutex_);
  if (isStopping_) return false;
  ++inside_;
  return true;
}

void DeliveryGate::leave() {
  const MutexLock lock(mutex_);
  --inside_;
  changed_.notifyAll();
}

void DeliveryGate::stop() {
  const MutexLock lock(mutex_);
  isStopping_ = true;
  changed_.notifyAll();
}

LttngKtraceService::LttngKtraceService(LttngControl& control, StatisticsService& statistics)
    : control_(control),
      started_(statistics.counter("kernel traces", "traces started")),
      failed_(statistics.counter("kernel traces", "traces that failed")),
      read_(statistics.counter("kernel traces", "events read back")),
      delivered_(statistics.counter("kernel traces", "events delivered")),
      dropped_(statistics.counter("kernel traces", "events dropped: the service ends")),
      lost_(statistics.counter("kernel traces", "events lost by the tracer")),
      lostPackets_(statistics.counter("kernel traces", "packets lost by the tracer")) {}

void LttngKtraceService::stop() { gate_.stop(); }

void LttngKtraceService::close() {
  const MutexLock lock(mutex_);
  readingQueue_.reset();
}

std::shared_ptr<DispatchQueue> LttngKtraceService::readingQueue() {
  const MutexLock lock(mutex_);
  if (readingQueue_ == nullptr) {
    // A stop waits for it on the reporting queue, so it must not run after what gives way.
    readingQueue_ = platform::dispatch().createSerialQueue(
        "Trace Reading", QualityOfService::kUserInteractive, QueueThreading::kOwnThread);
  }
  return readingQueue_;
}

KtraceService::Session LttngKtraceService::ktrace_session_create() {
  return std::make_shared<LttngKtraceSession>();
}

void LttngKtraceService::ktrace_set_completion_handler(const Session& session,
                                                       std::function<void()> handler) {
  if (const auto ours = own(session, State::kMade)) ours->completion = std::move(handler);
}

void LttngKtraceService::ktrace_set_walltimes_enabled(const Session& session, bool enabled) {
  if (const auto ours = own(session, State::kMade)) ours->hasWalltimes = enabled;
}

int LttngKtraceService::ktrace_events_range(const Session& session, std::uint32_t low,
                                            std::uint32_t high, EventHandler handler) {
  const auto ours = own(session, State::kMade);
  if (ours == nullptr) return kUnsuitable;
  if (low > high) return kNoRange;
  ours->ranges.push_back({low, high, std::move(handler)});
  return 0;
}

int LttngKtraceService::ktrace_start(const Session& session, std::shared_ptr<DispatchQueue> queue) {
  const auto ours = own(session, State::kMade);
  if (ours == nullptr || queue == nullptr) return kUnsuitable;
  ours->state = State::kStarted;
  ours->queue = std::move(queue);
  started_.add();
  if (ours->ranges.empty()) return 0;
  LttngControl::Recording recording;
  const RecordingPlan plan{.event = "halvox:kdebug", .filter = ours->filter()};
  if (const auto failure = control_.begin(plan, recording)) {
    failed_.add();
    control_.discard(recording);
    kLog.error("no kernel trace: ", *failure);
    return kNotStarted;
  }
  ours->recording = std::move(recording);
  return 0;
}

void LttngKtraceService::ktrace_end(const Session& session, int /*reason*/) {
  auto ours = own(session, State::kStarted);
  if (ours == nullptr) return;
  ours->state = State::kEnded;
  readingQueue()->async(JobWeight::kMayBlock, [this, ours = std::move(ours)] { finish(ours); });
}

// On the service's thread.
void LttngKtraceService::finish(const std::shared_ptr<LttngKtraceSession>& session) {
  if (session->recording.has_value()) {
    const auto failure = control_.end(*session->recording);
    if (failure) kLog.error("kernel trace incomplete: ", *failure);
    const bool isRead = deliverAll(session);
    if (failure || !isRead) failed_.add();
    control_.discard(*session->recording);
  }
  session->queue->async(JobWeight::kMayBlock, [session] {
    // Taken out: the handler may destroy the session, which lets go of its handlers.
    if (const auto completion = std::exchange(session->completion, nullptr)) completion();
  });
}

bool LttngKtraceService::deliverAll(const std::shared_ptr<LttngKtraceSession>& session) {
  auto batch = std::make_shared<Batch>(dropped_);
  const auto deliver = [&] {
    auto full = std::exchange(batch, std::make_shared<Batch>(dropped_));
    if (full->size() == 0) return true;
    if (!gate_.enter()) return false;
    session->queue->async(JobWeight::kMayBlock, [this, session, full = std::move(full)] {
      const std::vector<trace_point> points = full->take();
      delivered_.add(points.size());
      session->deliver(points);
      gate_.leave();
    });
    return true;
  };
  const auto take = [&](trace_point point) {
    if (!session->hasWalltimes) point.walltime = 0;
    batch->add(point);
    return batch->size() < kBatchEvents || deliver();
  };
  const TraceReading reading = readTraces(
      session->recording->directory,
      {.onClock = [&](const TraceClock& clock) { session->clock = clock; }, .onEvent = take});
  read_.add(reading.events);
  deliver();
  lost_.add(reading.lost);
  lostPackets_.add(reading.lostPackets);
  if (reading.failure) kLog.error("kernel trace cannot be read back: ", *reading.failure);
  if (reading.lost + reading.lostPackets > 0) {
    kLog.error("kernel trace lost ", reading.lost, " events and ", reading.lostPackets, " packets");
  }
  return !reading.failure.has_value();
}

void LttngKtraceService::ktrace_session_destroy(const Session& session) {
  const auto ours = std::dynamic_pointer_cast<LttngKtraceSession>(session);
  if (ours == nullptr || ours->state == State::kDestroyed) return;
  // After the end the recording is with the thread that reads, which removes it.
  const bool isRecording = ours->state == State::kStarted && ours->recording.has_value();
  ours->state = State::kDestroyed;
  if (isRecording) {
    static_cast<void>(control_.end(*ours->recording));
    control_.discard(*ours->recording);
  }
  // The handlers may refer to who made the session.
  ours->ranges.clear();
  ours->completion = nullptr;
}

std::uint64_t LttngKtraceService::ktrace_convert_timestamp_to_nanoseconds(
    const Session& session, std::uint64_t timestamp) const {
  const auto ours = std::dynamic_pointer_cast<LttngKtraceSession>(session);
  return ours == nullptr ? timestamp : ours->clock.toNanoseconds(timestamp);
}

}  // namespace halvox::platform::linux_
