#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/ktrace.h"

namespace halvox::platform {

// Kernel traces with events that the test makes.
//
// The clock is like that of a machine: it did not start at tick 0, and a tick need not be a whole
// number of nanoseconds. Converting a difference and subtracting converted times therefore give
// different results, as they do on a machine. At first a tick is one nanosecond.
//
// After the end of a session a job of its queue delivers the events and then calls the completion.
// Operations that have an effect are in the journal. Any thread may call. FakePlatform owns it.
class FakeKtraceService final : public KtraceService {
 public:
  // Does not own the journal, which must outlive it.
  explicit FakeKtraceService(Journal& journal) : journal_(journal) {}

  // Sets events that each session delivers before those that it has recorded, if they are in its
  // ranges.
  void setEvents(std::vector<trace_point> events);
  // Emits an event. The sessions that record now keep it if it is in their ranges.
  void emit(const trace_point& event);
  void setNanosecondsPerTick(std::uint64_t nanoseconds) { setTimebase(nanoseconds, 1); }
  // Sets how many nanoseconds that many ticks take. A conversion discards fractions of a
  // nanosecond.
  void setTimebase(std::uint64_t nanoseconds, std::uint64_t ticks);
  // Makes these calls fail with that error; 0 ends the failures.
  void failRange(int error);
  void failStart(int error);
  // Installs a function that each start calls first, on its thread, to simulate a tracer that
  // starts slowly. Call it before the first start.
  void setTracerDelay(std::function<void()> delay) { delay_ = std::move(delay); }
  // The number of sessions that record now.
  [[nodiscard]] std::size_t recordings() const;

  Session ktrace_session_create() override;
  void ktrace_set_completion_handler(const Session& session,
                                     std::function<void()> handler) override;
  void ktrace_set_walltimes_enabled(const Session& session, bool enabled) override;
  int ktrace_events_range(const Session& session, std::uint32_t low, std::uint32_t high,
                          EventHandler handler) override;
  int ktrace_start(const Session& session, std::shared_ptr<DispatchQueue> queue) override;
  void ktrace_end(const Session& session, int reason) override;
  void ktrace_session_destroy(const Session& session) override;
  [[nodiscard]] std::uint64_t ktrace_convert_timestamp_to_nanoseconds(
      const Session& session, std::uint64_t timestamp) const override;

 private:
  class FakeSession;

  // The session if it has not been started; null otherwise.
  static std::shared_ptr<FakeSession> settingUp(const Session& session);

  Journal& journal_;
  std::function<void()> delay_;
  mutable std::mutex mutex_;
  std::vector<trace_point> events_;
  std::vector<std::weak_ptr<FakeSession>> sessions_;
  std::uint64_t timebaseNanoseconds_ = 1;
  std::uint64_t timebaseTicks_ = 1;
  int rangeError_ = 0;
  int startError_ = 0;
};

}  // namespace halvox::platform
