// The contract of performance traces, run on the fake.

#include "platform/fake/contracts/PerformanceTraceContract.h"

#include "platform/fake/FakeClockService.h"
#include "platform/fake/FakeDispatchService.h"
#include "platform/fake/FakePerformanceTraceService.h"
#include "platform/fake/Journal.h"

namespace halvox::platform::contract {
namespace {

class FakePerformanceTraceHarness {
 public:
  PerformanceTraceService& service() { return service_; }
  bool letRunUntil(const std::function<bool()>& condition) {
    while (!condition() && dispatch_.runOne()) {
    }
    return condition();
  }
  std::size_t recordings() { return service_.recordings(); }
  void breakTracer() { service_.failStarts("no tracer"); }
  void breakRecorder() { service_.failStops("the recorder has gone"); }
  void breakSaving() { service_.failSaves("disk full"); }

 private:
  Journal journal_;
  FakeClockService clock_;
  FakeDispatchService dispatch_{clock_};
  FakePerformanceTraceService service_{journal_, dispatch_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, PerformanceTraceContract, FakePerformanceTraceHarness);

}  // namespace halvox::platform::contract
