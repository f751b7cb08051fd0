// Runs the contract suite of overflow on the adapter.

#include "platform/fake/contracts/OverflowContract.h"

#include "platform/linux/files/FileOverflowService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::contract {
namespace {

class FileOverflowHarness {
 public:
  OverflowService& service() { return service_; }

 private:
  const linux_::ScratchDirectory scratch_;
  linux_::CounterStatisticsService statistics_;
  linux_::FileOverflowService service_{{.directory = scratch_.path()}, statistics_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(File, OverflowContract, FileOverflowHarness);

}  // namespace halvox::platform::contract
