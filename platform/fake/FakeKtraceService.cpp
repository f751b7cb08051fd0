#include "platform/fake/FakeKtraceService.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <string>
#include <utility>

namespace halvox::platform {
namespace {

constexpr std::uint64_t kNanosecondsAtTickZero = 1'000'003;
constexpr int kUnsuitable = 1;  // a call that is not allowed in the session's state

std::string hexadecimal(std::uint32_t number) {
  std::array<char, 16> text;
  std::snprintf(text.data(), text.size(), "0x%08X", number);
  return text.data();
}

}  // namespace

// A session. It belongs to the code that sets it up, and after its start to its queue. The
// service's lock guards the recorded events and the flag whether the session records.
class FakeKtraceService::FakeSession final : public KtraceSession {
 public:
  enum class State : std::uint8_t { kMade, kStarted, kEnded, kDestroyed };
  struct Range {
    std::uint32_t low = 0;
    std::uint32_t high = 0;
    EventHandler handler{};
  };

  [[nodiscard]] bool wants(const trace_point& event) const {
    return std::ranges::any_of(ranges, [&](const Range& range) {
      return event.debugid >= range.low && event.debugid <= range.high;
    });
  }
  void deliver(const trace_point& event) const {
    for (const auto& [low, high, handler] : ranges) {
      if (event.debugid >= low && event.debugid <= high && handler) handler(event);
    }
  }

  State state = State::kMade;
  std::vector<Range> ranges;
  std::function<void()> completion;
  bool hasWalltimes = false;
  std::shared_ptr<DispatchQueue> queue;
  bool isRecording = false;
  std::vector<trace_point> recorded;
};

std::shared_ptr<FakeKtraceService::FakeSession> FakeKtraceService::settingUp(
    const Session& session) {
  auto own = std::dynamic_pointer_cast<FakeSession>(session);
  return own != nullptr && own->state == FakeSession::State::kMade ? own : nullptr;
}

void FakeKtraceService::setEvents(std::vector<trace_point> events) {
  const std::lock_guard lock(mutex_);
  events_ = std::move(events);
}

void FakeKtraceService::emit(const trace_point& event) {
  const std::lock_guard lock(mutex_);
  for (const auto& weakSession : sessions_) {
    const auto session = weakSession.lock();
    if (session != nullptr && session->isRecording && session->wants(event)) {
      session->recorded.push_back(event);
    }
  }
}

void FakeKtraceService::setTimebase(std::uint64_t nanoseconds, std::uint64_t ticks) {
  const std::lock_guard lock(mutex_);
  timebaseNanoseconds_ = nanoseconds;
  timebaseTicks_ = ticks;
}

void FakeKtraceService::failRange(int error) {
  const std::lock_guard lock(mutex_);
  rangeError_ = error;
}

void FakeKtraceService::failStart(int error) {
  const std::lock_guard lock(mutex_);
  startError_ = error;
}

std::size_t FakeKtraceService::recordings() const {
  const std::lock_guard lock(mutex_);
  return static_cast<std::size_t>(std::ranges::count_if(sessions_, [](const auto& weakSession) {
    const auto session = weakSession.lock();
    return session != nullptr && session->isRecording;
  }));
}

KtraceService::Session FakeKtraceService::ktrace_session_create() {
  journal_.note("ktrace create");
  auto session = std::make_shared<FakeSession>();
  const std::lock_guard lock(mutex_);
  std::erase_if(sessions_, [](const auto& other) { return other.expired(); });
  sessions_.push_back(session);
  return session;
}

void FakeKtraceService::ktrace_set_completion_handler(const Session& session,
                                                      std::function<void()> handler) {
  const auto own = settingUp(session);
  if (own == nullptr) return;
  journal_.note("ktrace completion handler");
  own->completion = std::move(handler);
}

void FakeKtraceService::ktrace_set_walltimes_enabled(const Session& session, bool enabled) {
  const auto own = settingUp(session);
  if (own == nullptr) return;
  journal_.note(enabled ? "ktrace wall times on" : "ktrace wall times off");
  own->hasWalltimes = enabled;
}

int FakeKtraceService::ktrace_events_range(const Session& session, std::uint32_t low,
                                           std::uint32_t high, EventHandler handler) {
  const auto own = settingUp(session);
  if (own == nullptr) return kUnsuitable;
  journal_.note("ktrace range " + hexadecimal(low) + " to " + hexadecimal(high));
  if (low > high) return kUnsuitable;
  const std::lock_guard lock(mutex_);
  if (rangeError_ == 0) own->ranges.push_back({low, high, std::move(handler)});
  return rangeError_;
}

int FakeKtraceService::ktrace_start(const Session& session, std::shared_ptr<DispatchQueue> queue) {
  const auto own = settingUp(session);
  if (own == nullptr || queue == nullptr) return kUnsuitable;
  journal_.note("ktrace start");
  if (delay_) delay_();
  const std::lock_guard lock(mutex_);
  own->state = FakeSession::State::kStarted;
  own->queue = std::move(queue);
  own->isRecording = startError_ == 0;
  if (own->isRecording) {
    std::ranges::copy_if(events_, std::back_inserter(own->recorded),
                         [&](const trace_point& event) { return own->wants(event); });
  }
  return startError_;
}

void FakeKtraceService::ktrace_end(const Session& session, int reason) {
  const auto own = std::dynamic_pointer_cast<FakeSession>(session);
  if (own == nullptr || own->state != FakeSession::State::kStarted) return;
  journal_.note("ktrace end " + std::to_string(reason));
  std::vector<trace_point> events;
  {
    const std::lock_guard lock(mutex_);
    own->state = FakeSession::State::kEnded;
    own->isRecording = false;
    events.swap(own->recorded);
  }
  own->queue->async(JobWeight::kMayBlock, [own, events = std::move(events)] {
    for (trace_point event : events) {
      if (!own->hasWalltimes) event.walltime = 0;
      own->deliver(event);
    }
    // Move the handler out first, because it may destroy the session, which would destroy the
    // handler.
    if (const auto completion = std::exchange(own->completion, nullptr)) completion();
  });
}

void FakeKtraceService::ktrace_session_destroy(const Session& session) {
  const auto own = std::dynamic_pointer_cast<FakeSession>(session);
  if (own == nullptr || own->state == FakeSession::State::kDestroyed) return;
  journal_.note("ktrace destroy");
  {
    const std::lock_guard lock(mutex_);
    own->state = FakeSession::State::kDestroyed;
    own->isRecording = false;
    own->recorded.clear();
  }
  own->ranges.clear();
  own->completion = nullptr;
  own->queue = nullptr;
}

std::uint64_t FakeKtraceService::ktrace_convert_timestamp_to_nanoseconds(
    const Session& session, std::uint64_t timestamp) const {
  if (session == nullptr) return timestamp;
  const std::lock_guard lock(mutex_);
  return kNanosecondsAtTickZero + timestamp * timebaseNanoseconds_ / timebaseTicks_;
}

}  // namespace halvox::platform
