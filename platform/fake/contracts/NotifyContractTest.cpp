// The contract of notifications, run on the fake.

#include "platform/fake/contracts/NotifyContract.h"

#include "platform/fake/FakePlatform.h"

namespace halvox::platform::contract {
namespace {

class FakeNotifyHarness {
 public:
  NotifyService& service() { return platform_.notify; }
  std::shared_ptr<DispatchQueue> queue() { return queue_; }
  void post(const std::string& name) { platform_.notify.post(name); }
  bool letRunUntil(const std::function<bool()>& condition) {
    platform_.dispatch.runUntilIdle();
    return condition();
  }

 private:
  FakePlatform platform_;
  std::shared_ptr<DispatchQueue> queue_ = platform_.dispatch.createSerialQueue(
      "test", QualityOfService::kUtility, QueueThreading::kShared);
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, NotifyContract, FakeNotifyHarness);

}  // namespace halvox::platform::contract
