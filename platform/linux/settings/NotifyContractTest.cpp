// The contract of notifications, run on the adapter.

#include "platform/fake/contracts/NotifyContract.h"

#include <filesystem>
#include <fstream>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/settings/InotifyNotifyService.h"
#include "platform/linux/settings/PreferenceReader.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::contract {
namespace {

class InotifyHarness {
 public:
  InotifyHarness() { std::filesystem::create_directories(directory()); }
  ~InotifyHarness() { service_.stop(); }

  NotifyService& service() { return service_; }
  std::shared_ptr<DispatchQueue> queue() { return queue_; }
  void post(const std::string& name) { std::ofstream(directory() / name) << name; }
  bool letRunUntil(const std::function<bool()>& condition) {
    return linux_::eventually([&] {
      platform_.dispatch.runUntilIdle();
      return condition();
    });
  }

 private:
  std::filesystem::path directory() const { return scratch_.path() / "notify"; }

  const linux_::ScratchDirectory scratch_;
  FakePlatform platform_;
  std::shared_ptr<DispatchQueue> queue_ = platform_.dispatch.createSerialQueue(
      "test", QualityOfService::kUtility, QueueThreading::kShared);
  linux_::PreferenceReader reader_{scratch_.path() / "preferences", platform_.log};
  linux_::InotifyNotifyService service_{directory(), reader_, platform_.log, platform_.statistics};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Inotify, NotifyContract, InotifyHarness);

}  // namespace halvox::platform::contract
