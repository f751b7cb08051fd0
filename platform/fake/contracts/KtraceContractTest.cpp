// The contract of kernel traces, run on the fake.

#include "platform/fake/contracts/KtraceContract.h"

#include "platform/fake/FakeClockService.h"
#include "platform/fake/FakeDispatchService.h"
#include "platform/fake/FakeKtraceService.h"
#include "platform/fake/Journal.h"

namespace halvox::platform::contract {
namespace {

class FakeKtraceHarness {
 public:
  KtraceService& service() { return service_; }
  std::shared_ptr<DispatchQueue> createQueue() {
    return dispatch_.createSerialQueue("Tracing", QualityOfService::kUtility,
                                       QueueThreading::kOwnThread);
  }
  bool letRunUntil(const std::function<bool()>& condition) {
    while (!condition() && dispatch_.runOne()) {
    }
    return condition();
  }
  void emit(const std::vector<std::uint32_t>& codes) {
    for (const std::uint32_t code : codes) {
      service_.emit({.timestamp = ++tick_, .debugid = code, .walltime = kNow});
    }
  }
  std::size_t recordings() { return service_.recordings(); }
  void breakTracer() { service_.failStart(5); }

 private:
  static constexpr double kNow = 1'795'243'800;  // seconds since 1970
  std::uint64_t tick_ = 0;
  Journal journal_;
  FakeClockService clock_;
  FakeDispatchService dispatch_{clock_};
  FakeKtraceService service_{journal_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, KtraceContract, FakeKtraceHarness);

}  // namespace halvox::platform::contract
