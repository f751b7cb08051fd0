#pragma once

#include <utility>

#include "driver/HVReportingDriver.h"
#include "platform/ioreport.h"

namespace halvox {

// One live subscription to a group of driver channels. The sampler that made it owns it. Immutable
// once it is in the sampler's list.
class HVReportingIOChannelSubscription {
 public:
  // Has no subscription and no channels yet.
  explicit HVReportingIOChannelSubscription(HVReportingDriver driver)
      : driver_(std::move(driver)) {}

  [[nodiscard]] const HVReportingDriver& driver() const { return driver_; }
  [[nodiscard]] const platform::IOReportService::Subscription& subscription() const {
    return subscription_;
  }
  void setSubscription(platform::IOReportService::Subscription subscription) {
    subscription_ = std::move(subscription);
  }
  // The channels that were subscribed to, which may be fewer than were asked for.
  [[nodiscard]] const platform::IOReportService::Channels& subscribedChannels() const {
    return subscribedChannels_;
  }
  void setSubscribedChannels(platform::IOReportService::Channels channels) {
    subscribedChannels_ = std::move(channels);
  }

 private:
  // The group that was asked for. Its description is the key of its samples in snapshots.
  HVReportingDriver driver_;
  platform::IOReportService::Subscription subscription_;
  platform::IOReportService::Channels subscribedChannels_;
};

}  // namespace halvox
