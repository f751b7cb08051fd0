#pragma once

#include <memory>

#include "platform/linux/tracing/QueueOnDemand.h"
#include "platform/linux/tracing/lttng/LttngControl.h"
#include "platform/log.h"
#include "platform/performance_trace.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Performance traces of everything that user-space programs offer to LTTng: the "halvox" events and
// those of all other programs, with process, thread and process name.
//
// A trace that has ended is packed in CTF to "<traces>/trace-<time>-<number>.tar.zst". Its URL is
// "file://" and that path. The newest 20 archives are kept and older ones deleted, because nothing
// else deletes them.
//
// Threads: all work, and all calls of delegates, are on one thread of the service, in the order of
// the requests. The composition root owns the service.
// Failure: logged, counted, and reported to the delegate. If the session is destroyed while it
// records, the trace is deleted without a call. A delegate that has been destroyed is not called.
class LttngPerformanceTraceService final : public PerformanceTraceService {
 public:
  // All three must outlive the service and the work of its sessions.
  LttngPerformanceTraceService(LttngControl& control, LogService& log,
                               StatisticsService& statistics);

  // Releases the queue. Call it after the queues have ended.
  void close() { queue_.release(); }

  std::shared_ptr<KQTraceConfig> configWithTemplate(std::int32_t number) override;
  std::shared_ptr<KQTraceSession> initWithConfig(
      std::shared_ptr<KQTraceConfig> configuration) override;

  struct Work;

 private:
  const std::shared_ptr<Work> work_;  // shared with the sessions
  // A lower quality of service would be wrong, because a stop on the reporting queue waits for this
  // queue.
  QueueOnDemand queue_{
      {"Performance Trace", QualityOfService::kUserInteractive, QueueThreading::kOwnThread}};
};

}  // namespace halvox::platform::linux_
