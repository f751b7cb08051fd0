#include "platform/fake/contracts/DispatchContract.h"

#include <functional>
#include <memory>

#include "platform/fake/contracts/DispatchWaitContract.h"
#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/log/QueuedLogService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/MemoryLogSink.h"

namespace halvox::platform::contract {

namespace adapters {

class AsioHarness {
 public:
  DispatchService& service() { return service_; }
  bool letRunUntil(const std::function<bool()>& condition) { return linux_::eventually(condition); }

 private:
  linux_::CounterStatisticsService statistics_;
  linux_::QueuedLogService log_{LogLevel::kError, std::make_unique<linux_::MemoryLogSink>(),
                                statistics_};
  linux_::AsioDispatchService service_{log_, statistics_};
};

}  // namespace adapters

INSTANTIATE_TYPED_TEST_SUITE_P(Asio, DispatchContract, adapters::AsioHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Asio, DispatchWaitContract, adapters::AsioHarness);

}  // namespace halvox::platform::contract
