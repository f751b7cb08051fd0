// Tests the contract of driver counters on the adapter, with a source made by the test.

#include <chrono>
#include <memory>
#include <mutex>
#include <utility>
#include <vector>

#include "platform/fake/FakePlatform.h"
#include "platform/fake/contracts/IOReportContract.h"
#include "platform/linux/drivers/DriverSourceLog.h"
#include "platform/linux/drivers/LinuxIOReportService.h"
#include "platform/linux/drivers/ReadingMaker.h"
#include "platform/linux/drivers/testing/MadeReadings.h"

namespace halvox::platform::linux_ {
namespace {

using contract::ChannelOfDriver;

ChannelDescription descriptionOf(const ChannelOfDriver& channel) {
  ChannelDescription description{.format = channel.format,
                                 .kind = channel.kind,
                                 .driverName = channel.driverName,
                                 .group = channel.group,
                                 .subGroup = channel.subGroup,
                                 .channelName = channel.channelName,
                                 .unitLabel = channel.unitLabel};
  for (const auto& state : channel.states) description.states.emplace_back(state.name);
  for (const auto& bucket : channel.buckets) {
    description.buckets.push_back({.lower = bucket.lower, .upper = bucket.upper});
  }
  return description;
}

std::vector<std::uint64_t> valuesOf(const ChannelOfDriver& channel) {
  if (channel.format == IOReportFormat::kSimple) {
    return {static_cast<std::uint64_t>(channel.integerValue)};
  }
  std::vector<std::uint64_t> values;
  for (const auto& state : channel.states) {
    values.insert(values.end(), {state.inTransitions, state.residency});
  }
  for (const auto& bucket : channel.buckets) values.push_back(bucket.hits);
  return values;
}

class LinuxIOReportHarness {
 public:
  LinuxIOReportHarness() {
    std::vector<std::unique_ptr<DriverSource>> sources;
    sources.push_back(std::make_unique<testing::MadeSource>([this] { return read(); }));
    // Long enough that no reading is late on a busy machine.
    service_ =
        std::make_unique<LinuxIOReportService>(std::move(sources), driversCategory(platform_.log),
                                               platform_.statistics, std::chrono::seconds(10));
    service_->open();
  }

  IOReportService& service() { return *service_; }
  void set(FakeIOReportService::ChannelList channels) {
    const std::lock_guard lock(mutex_);
    channels_ = std::move(channels);
  }

 private:
  std::shared_ptr<const Reading> read() {
    const std::lock_guard lock(mutex_);
    for (const ChannelOfDriver& channel : channels_) {
      const ChannelDescription description = descriptionOf(channel);
      readings_.add(description.fullName(), description, valuesOf(channel));
    }
    return readings_.finish();
  }

  FakePlatform platform_;
  std::mutex mutex_;
  FakeIOReportService::ChannelList channels_;
  ReadingMaker readings_;  // used by the source's thread
  std::unique_ptr<LinuxIOReportService> service_;
};

}  // namespace
}  // namespace halvox::platform::linux_

namespace halvox::platform::contract {

INSTANTIATE_TYPED_TEST_SUITE_P(Linux, IOReportContract, linux_::LinuxIOReportHarness);

}  // namespace halvox::platform::contract
