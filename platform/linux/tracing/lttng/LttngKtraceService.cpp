#include "platform/linux/tracing/lttng/LttngKtraceService.h"

#include <memory>
#include <utility>
#include <vector>

#include "platform/linux/tracing/TracingLog.h"
#include "platform/linux/tracing/lttng/TraceReader.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {
namespace {

constexpr int kNotStarted = 1;
constexpr int kNoRange = 2;
constexpr int kUnsuitable = 3;  // no session, or a call that is not allowed in its state
// A batch is one job of the queue. Large enough that the job costs little compared with its events,
// and small enough that a few batches take only a few megabytes.
constexpr std::size_t kBatchEvents = 4096;

// Events on their way to the queue. If the queue has ended with the service, the batch is destroyed
// undelivered and counts its events as dropped.
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

// One kernel trace. Belongs to the code that sets it up until it is started, and then to the queue
// that it was started with. Between the end and the deliveries, only the reading thread uses the
// recording and the clock.
class LttngKtraceSession final : public KtraceSession {
 public:
  enum class State : std::uint8_t { kMade, kStarted, kEnded, kDestroyed };

  State state = State::kMade;
  std::vector<Range> ranges;
  std::function<void()> completion;
  std::shared_ptr<DispatchQueue> queue;
  std::optional<LttngControl::Recording> recording;  // set by a start that succeeded
  TraceClock clock;
  bool hasWalltimes = false;

  // The ranges as an expression of LTTng. Filtering in the tracer keeps other codes out of the
  // buffers.
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

// The session if it is in that state; null otherwise.
std::shared_ptr<LttngKtraceSession> own(const KtraceService::Session& session, State state) {
  auto ours = std::dynamic_pointer_cast<LttngKtraceSession>(session);
  return ours != nullptr && ours->state == state ? ours : nullptr;
}

}  // namespace

bool DeliveryGate::enter() {
  const MutexLock lock(mutex_);
  // Without this wait, a trace that is read faster than it is analysed would be in memory as a
  // whole.
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

LttngKtraceService::LttngKtraceService(LttngControl& control, LogService& log,
                                       StatisticsService& statistics)
    : control_(control),
      log_(tracingLog(log, "LttngKtraceService")),
      started_(statistics.counter("kernel traces", "traces started")),
      failed_(statistics.counter("kernel traces", "traces that failed")),
      read_(statistics.counter("kernel traces", "events read back")),
      delivered_(statistics.counter("kernel traces", "events delivered")),
      dropped_(statistics.counter("kernel traces", "events dropped: the service ends")),
      lost_(statistics.counter("kernel traces", "events lost by the tracer")),
      lostPackets_(statistics.counter("kernel traces", "packets lost by the tracer")) {}

void LttngKtraceService::stop() { gate_.stop(); }

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
  // The trace counts as started even if the recording fails, because the caller ends it and waits
  // for its completion.
  ours->state = State::kStarted;
  ours->queue = std::move(queue);
  started_.add();
  // Do not start LTTng for a session without ranges, because with an empty filter, it records every
  // event.
  if (ours->ranges.empty()) return 0;
  auto begun = control_.begin({.event = "halvox:kdebug", .filter = ours->filter()});
  if (!begun) {
    failed_.add();
    log_.error("cannot start a kernel trace: ", begun.error().message, "; nothing is recorded");
    return kNotStarted;
  }
  ours->recording = *std::move(begun);
  return 0;
}

void LttngKtraceService::ktrace_end(const Session& session, int /*reason*/) {
  auto ours = own(session, State::kStarted);
  if (ours == nullptr) return;
  ours->state = State::kEnded;
  // Ending and reading take seconds. The caller must not wait for them.
  readingQueue_.get()->async(JobWeight::kMayBlock,
                             [this, ours = std::move(ours)] { finish(ours); });
}

// Runs on the service's thread.
void LttngKtraceService::finish(const std::shared_ptr<LttngKtraceSession>& session) {
  if (session->recording.has_value()) {
    const auto ended = control_.end(*session->recording);
    if (!ended) {
      log_.error("cannot end a kernel trace: ", ended.error().message,
                 "; delivering what was recorded");
    }
    const bool isRead = deliverAll(session);
    if (!ended || !isRead) failed_.add();
    control_.discard(*session->recording);
  }
  // Add the completion to the same queue after all batches, so that it comes after the last event.
  session->queue->async(JobWeight::kMayBlock, [session] {
    // Move the handler out first, because it may destroy the session, which would destroy the
    // handler.
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
    // The reader sets a wall time in each point. KtraceService promises 0 to sessions that did not
    // enable wall times.
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
  if (reading.failure) {
    log_.error("cannot read a kernel trace back: ", *reading.failure,
               "; its remaining events are lost");
  }
  if (reading.lost + reading.lostPackets > 0) {
    log_.error("the tracer's buffers were full; lost ", reading.lost, " events and ",
               reading.lostPackets, " packets of a kernel trace");
  }
  return !reading.failure.has_value();
}

void LttngKtraceService::ktrace_session_destroy(const Session& session) {
  const auto ours = std::dynamic_pointer_cast<LttngKtraceSession>(session);
  if (ours == nullptr || ours->state == State::kDestroyed) return;
  // After the end the recording belongs to the thread that reads it and deletes it.
  const bool isRecording = ours->state == State::kStarted && ours->recording.has_value();
  ours->state = State::kDestroyed;
  if (isRecording) {
    static_cast<void>(control_.end(*ours->recording));
    control_.discard(*ours->recording);
  }
  // The handlers may refer to the session's owner, which may be destroyed next.
  ours->ranges.clear();
  ours->completion = nullptr;
}

std::uint64_t LttngKtraceService::ktrace_convert_timestamp_to_nanoseconds(
    const Session& session, std::uint64_t timestamp) const {
  const auto ours = std::dynamic_pointer_cast<LttngKtraceSession>(session);
  return ours == nullptr ? timestamp : ours->clock.toNanoseconds(timestamp);
}

}  // namespace halvox::platform::linux_
