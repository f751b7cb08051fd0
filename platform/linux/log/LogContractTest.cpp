#include "platform/fake/contracts/LogContract.h"

#include <memory>
#include <string>
#include <vector>

#include "platform/linux/log/QueuedLogService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/MemoryLogSink.h"

namespace halvox::platform::contract {

namespace adapters {

class QueuedHarness {
 public:
  explicit QueuedHarness(LogLevel threshold) {
    auto sink = std::make_unique<linux_::MemoryLogSink>();
    sink_ = sink.get();
    service_ = std::make_unique<linux_::QueuedLogService>(threshold, std::move(sink), statistics_);
  }
  LogService& service() { return *service_; }
  std::vector<std::string> lines() {
    service_->stop();
    return sink_->lines();
  }

 private:
  linux_::CounterStatisticsService statistics_;
  linux_::MemoryLogSink* sink_ = nullptr;
  std::unique_ptr<linux_::QueuedLogService> service_;
};

}  // namespace adapters

INSTANTIATE_TYPED_TEST_SUITE_P(Queued, LogContract, adapters::QueuedHarness);

}  // namespace halvox::platform::contract
