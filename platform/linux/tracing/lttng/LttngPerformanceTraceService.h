#pragma once

#include <memory>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/tracing/lttng/LttngControl.h"
#include "platform/performance_trace.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Performance traces of all that user-space programs offer to LTTng: every "halvox" event and those
// of other programs, with process, thread and process name. A trace that has ended is packed to
// "<traces>/trace-<time>-<number>.tar.zst", in CTF, and its URL is "file://" and that path; of
// these the newest 20 stay. All work is done, and delegates are called, on one thread of the
// service. A delegate that has gone is not called; the trace is then dropped, and likewise one
// whose session nobody holds any more.
class LttngPerformanceTraceService final : public PerformanceTraceService {
 public:
  // Both must outlive the service, the service its sessions' work.
  LttngPerformanceTraceService(LttngControl& control, StatisticsService& statistics);

  // Lets go of the queue; after the queues have ended.
  void close();

  std::shared_ptr<KQTraceConfig> configWithTemplate(std::int32_t number) override;
  std::shared_ptr<KQTraceSession> initWithConfig(
      std::shared_ptr<KQTraceConfig> configuration) override;

  struct Work;

 private:
  std::shared_ptr<DispatchQueue> queue();

  const std::shared_ptr<Work> work_;  // shared with the sessions
  Mutex mutex_;
  std::shared_ptr<DispatchQueue> queue_ HALVOX_GUARDED_BY(mutex_);  // made when needed
};

}  // namespace halvox::platform::linux_
