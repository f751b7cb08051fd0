#pragma once

#include <memory>

#include "platform/dispatch.h"
#include "platform/ktrace.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/tracing/QueueOnDemand.h"
#include "platform/linux/tracing/lttng/LttngControl.h"
#include "platform/object_log.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

class LttngKtraceSession;

// Limits how many batches a reader may be ahead of the queue to which it delivers. Without the
// limit, a trace that is read faster than its handlers work would be in memory as a whole. Any
// thread may call; the service owns it.
class DeliveryGate {
 public:
  explicit DeliveryGate(unsigned most) : most_(most) {}
  // Waits until another batch may be delivered. Returns false if the service stops.
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

// Kernel traces as recordings of LTTng's user-space tracer.
//
//   made --ktrace_start--> started --ktrace_end--> ended   (read back on the service's thread)
//        --ktrace_session_destroy from any state--> destroyed
//
// It records the event "halvox:kdebug" with process, thread and process name. LTTng itself filters
// by the codes that were subscribed to, so that other programs' events cost no space. A trace
// without ranges records nothing.
//
// Threads: a start waits for the session daemon on the caller's thread, and starts one if there is
// none. An end returns at once; a thread of the service then stops the recording, reads it back in
// the order of time, and delivers the events in batches. The composition root owns the service.
// Failure: logged once and counted, and the session still completes. Events that were lost because
// the tracer's buffers were full are counted, and logged once a trace. No file of a trace remains.
class LttngKtraceService final : public KtraceService {
 public:
  // All three must outlive the service.
  LttngKtraceService(LttngControl& control, LogService& log, StatisticsService& statistics);

  // After this call, nothing waits for queues. Events that have not been delivered are dropped and
  // counted.
  void stop();
  // Releases the queue. Call it after the queues have ended.
  void close() { readingQueue_.release(); }

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
  // Returns whether the recording could be read to its end.
  bool deliverAll(const std::shared_ptr<LttngKtraceSession>& session);

  static constexpr unsigned kBatchesAhead = 8;  // of 4,096 events each

  LttngControl& control_;
  const ObjectLog log_;
  Counter& started_;
  Counter& failed_;
  Counter& read_;
  Counter& delivered_;
  Counter& dropped_;
  Counter& lost_;
  Counter& lostPackets_;
  DeliveryGate gate_{kBatchesAhead};
  // A lower quality of service would be wrong, because a stop on the reporting queue waits for this
  // queue.
  QueueOnDemand readingQueue_{
      {"Trace Reading", QualityOfService::kUserInteractive, QueueThreading::kOwnThread}};
};

}  // namespace halvox::platform::linux_
