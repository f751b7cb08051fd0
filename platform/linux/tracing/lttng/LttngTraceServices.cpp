#include "platform/linux/tracing/lttng/LttngTraceServices.h"

#include "platform/linux/tracing/lttng/LttngControl.h"
#include "platform/linux/tracing/lttng/LttngKtraceService.h"
#include "platform/linux/tracing/lttng/LttngPerformanceTraceService.h"

namespace halvox::platform::linux_ {
namespace {

class LttngTraceServices final : public TraceServices {
 public:
  LttngTraceServices(const std::filesystem::path& tracesDirectory, LogService& log,
                     StatisticsService& statistics)
      : control_(tracesDirectory),
        ktrace_(control_, log, statistics),
        performanceTraces_(control_, log, statistics) {}

  KtraceService& ktrace() override { return ktrace_; }
  PerformanceTraceService& performanceTraces() override { return performanceTraces_; }
  void open() override { control_.removeLeftovers(); }
  void stop() override { ktrace_.stop(); }
  // End sessions and daemon first. Nothing can use them any more, because the queues have ended.
  void close() override {
    control_.close();
    ktrace_.close();
    performanceTraces_.close();
  }
  void abandon() override { control_.close(); }
  [[nodiscard]] std::string description() const override { return "LTTng"; }

 private:
  LttngControl control_;
  LttngKtraceService ktrace_;
  LttngPerformanceTraceService performanceTraces_;
};

}  // namespace

std::unique_ptr<TraceServices> makeLttngTraceServices(const std::filesystem::path& tracesDirectory,
                                                      LogService& log,
                                                      StatisticsService& statistics) {
  return std::make_unique<LttngTraceServices>(tracesDirectory, log, statistics);
}

}  // namespace halvox::platform::linux_
