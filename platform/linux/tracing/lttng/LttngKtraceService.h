#pragma once

#include <memory>

#include "platform/dispatch.h"
#include "platform/ktrace.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/tracing/lttng/LttngControl.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

class LttngKtraceSession;

// Lets a reader be only so far ahead of the queue that it delivers to.
class DeliveryGate {
 public:
  explicit DeliveryGate(unsigned most) : most_(most) {}
  // Waits for room; false when the service stops.
  [[nodiscard]] bool enter();
  void leave();
  void stop();

 private:
  const unsigned most_;
  Mutex mutex_;
  Condition changed_;
  unsigned inside_ HALVOX_GUARDED_BY(mutex_) = 0;
  bool isStopping_ HALVOX_GUARDED_BY(mutex_) = false;
};

// Kernel traces as sessions of LTTng's user-space tracer. The event "halvox:kdebug" is recorded,
// filtered in the tracer to the codes that were asked for, with process, thread and process name.
//
// A start waits for the session daemon, which is started if there is none, and its error is logged
// here in words. An end returns at once; a thread of the service then stops the session, reads
// the trace back in the order of its times, and delivers the events in batches, of which only a few
// wait at a time. Events that the tracer had no room for are counted and logged once a trace.
// A trace without ranges records nothing. Nothing of a trace stays on the disk.
class LttngKtraceService final : public KtraceService {
 public:
  // Both must outlive the service.
  LttngKtraceService(LttngControl& control, StatisticsService& statistics);

  // Nothing waits for queues any more; what is still to be delivered is not.
  void stop();
  // Lets go of the queue; after the queues have ended.
  void close();

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
  void finish(const std::shared_ptr<LttngKtraceSession>& session);
  // Whether the recording could be read to its end.
  bool deliverAll(const std::shared_ptr<LttngKtraceSession>& session);
  std::shared_ptr<DispatchQueue> readingQueue();

  static constexpr unsigned kBatchesAhead = 8;

  LttngControl& control_;
  Counter& started_;
  Counter& failed_;
  Counter& read_;
  Counter& delivered_;
  Counter& dropped_;
  Counter& lost_;
  Counter& lostPackets_;
  DeliveryGate gate_{kBatchesAhead};
  Mutex mutex_;
  std::shared_ptr<DispatchQueue> readingQueue_ HALVOX_GUARDED_BY(mutex_);  // made when needed
};

}  // namespace halvox::platform::linux_
