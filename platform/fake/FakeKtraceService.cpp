#include "platform/fake/FakeKtraceService.h"

#include <array>
#include <cstdio>
#include <utility>

namespace halvox::platform {
namespace {

constexpr std::uint64_t kNanosecondsAtTickZero = 1'000'003;

class FakeSession final : public KtraceSession {
 public:
  std::function<void()> completion;
  std::uint32_t low = 1;  // nothing is subscribed
  std::uint32_t high = 0;
  KtraceService::EventHandler handler;
  std::shared_ptr<DispatchQueue> queue;
};

FakeSession& fake(const KtraceService::Session& session) {
  return dynamic_cast<FakeSession&>(*session);
}

std::string hexadecimal(std::uint32_t number) {
  std::array<char, 16> text;
  std::snprintf(text.data(), text.size(), "0x%08X", number);
  return text.data();
}

}  // namespace

void FakeKtraceService::setEvents(std::vector<trace_point> events) {
  const std::lock_guard lock(mutex_);
  events_ = std::move(events);
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

KtraceService::Session FakeKtraceService::ktrace_session_create() {
  journal_.note("ktrace create");
  return std::make_shared<FakeSession>();
}

void FakeKtraceService::ktrace_set_completion_handler(const Session& session,
                                                      std::function<void()> handler) {
  journal_.note("ktrace completion handler");
  fake(session).completion = std::move(handler);
}

void FakeKtraceService::ktrace_set_walltimes_enabled(const Session& /*session*/, bool enabled) {
  journal_.note(enabled ? "ktrace wall times on" : "ktrace wall times off");
}

int FakeKtraceService::ktrace_events_range(const Session& session, std::uint32_t low,
                                           std::uint32_t high, EventHandler handler) {
  journal_.note("ktrace range " + hexadecimal(low) + " to " + hexadecimal(high));
  const std::lock_guard lock(mutex_);
  if (rangeError_ != 0) return rangeError_;
  FakeSession& one = fake(session);
  one.low = low;
  one.high = high;
  one.handler = std::move(handler);
  return 0;
}

int FakeKtraceService::ktrace_start(const Session& session, std::shared_ptr<DispatchQueue> queue) {
  journal_.note("ktrace start");
  const std::lock_guard lock(mutex_);
  fake(session).queue = std::move(queue);
  return startError_;
}

void FakeKtraceService::ktrace_end(const Session& session, int reason) {
  journal_.note("ktrace end " + std::to_string(reason));
  std::vector<trace_point> events;
  {
    const std::lock_guard lock(mutex_);
    if (startError_ == 0) events = events_;
  }
  fake(session).queue->async(JobWeight::kMayBlock, [session, events = std::move(events)] {
    const FakeSession& one = fake(session);
    for (const trace_point& event : events) {
      if (event.debugid >= one.low && event.debugid <= one.high) one.handler(event);
    }
    one.completion();
  });
}

void FakeKtraceService::ktrace_session_destroy(const Session& /*session*/) {
  journal_.note("ktrace destroy");
}

std::uint64_t FakeKtraceService::ktrace_convert_timestamp_to_nanoseconds(
    const Session& /*session*/, std::uint64_t timestamp) const {
  const std::lock_guard lock(mutex_);
  return kNanosecondsAtTickZero + timestamp * timebaseNanoseconds_ / timebaseTicks_;
}

}  // namespace halvox::platform
