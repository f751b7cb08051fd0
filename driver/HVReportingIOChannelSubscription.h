#pragma once

#include <utility>

#include "driver/HVReportingDriver.h"
#include "platform/ioreport.h"

namespace halvox {

// One live subscription to a channel group of the drivers. Belongs to the sampler that made it.
class HVReportingIOChannelSubscription {
 public:
  // Without a subscription and channels yet.
  explicit HVReportingIOChannelSubscription(HVReportingDriver driver)
      : driver_(std::move(driver)) {}

  [[nodiscard]] const HVReportingDriver& driver() const { return driver_; }
  [[nodiscard]] const platform::IOReportService::Subscription& subscription() const {
    return subscription_;
  }
  void setSubscription(platform::IOReportService::Subscription subscription) {
    subscription_ = std::move(subscription);
  }
  // The channels that were really subscribed.
  [[nodiscard]] const platform::IOReportService::Channels& subscribedChannels() const {
    return subscribedChannels_;
  }
  void setSubscribedChannels(platform::IOReportService::Channels channels) {
    subscribedChannels_ = std::move(channels);
  }

 private:
  HVReportingDriver driver_;
  platform::IOReportService::Subscription subscription_;
  platform::IOReportService::Channels subscribedChannels_;
};

}  // namespace halvox
