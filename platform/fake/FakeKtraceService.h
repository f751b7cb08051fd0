#pragma once

#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/ktrace.h"

namespace halvox::platform {

// Kernel traces whose events a test makes up. Its clock is like that of a machine: it did not begin
// at tick 0, and a tick need not be a whole number of nanoseconds, so that the nanoseconds of a
// difference are not the difference of the nanoseconds. At first a tick is one nanosecond. The
// events of a session are delivered, and its completion called, on its queue when it is ended.
// Notes each operation in the journal. Any thread may call.
class FakeKtraceService final : public KtraceService {
 public:
  // Does not own the journal, which must outlive it.
  explicit FakeKtraceService(Journal& journal) : journal_(journal) {}

  // The events that each session will deliver, as far as its range goes.
  void setEvents(std::vector<trace_point> events);
  void setNanosecondsPerTick(std::uint64_t nanoseconds) { setTimebase(nanoseconds, 1); }
  // So many ticks take so many nanoseconds; what is left of a nanosecond is cut off.
  void setTimebase(std::uint64_t nanoseconds, std::uint64_t ticks);
  void failRange(int error);
  void failStart(int error);

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
  Journal& journal_;
  mutable std::mutex mutex_;
  std::vector<trace_point> events_;
  std::uint64_t timebaseNanoseconds_ = 1;
  std::uint64_t timebaseTicks_ = 1;
  int rangeError_ = 0;
  int startError_ = 0;
};

}  // namespace halvox::platform
