#include <array>
#include <cstddef>
#include <memory>
#include <string_view>
#include <utility>

#include <gtest/gtest.h>

#include "backends/HVReportingTallyhubBridge.h"
#include "platform/analytics.h"
#include "platform/fake/AllocationCounter.h"
#include "platform/fake/FakePlatform.h"
#include "platform/services.h"
#include "session/HVReportingSession.h"

namespace halvox {
namespace {

// Collects no event, and allocates nothing when it is asked.
class UnusedAnalyticsService final : public platform::AnalyticsService {
 public:
  bool isAnalyticsEventUsed(std::string_view /*eventName*/) override {
    ++asked;
    return false;
  }
  void sendAnalyticsEventLazy(std::string_view /*eventName*/,
                              platform::AnalyticsPayloadBuilder /*builder*/) override {
    ++sent;
  }
  int asked = 0;
  int sent = 0;
};

// Collects every event, and keeps the builders in memory that it already has.
class KeepingAnalyticsService final : public platform::AnalyticsService {
 public:
  bool isAnalyticsEventUsed(std::string_view /*eventName*/) override { return true; }
  void sendAnalyticsEventLazy(std::string_view /*eventName*/,
                              platform::AnalyticsPayloadBuilder builder) override {
    builders.at(sent++) = std::move(builder);
  }
  std::array<platform::AnalyticsPayloadBuilder, 2> builders;
  std::size_t sent = 0;
};

class HVReportingTallyhubBridgeAllocationTest : public testing::Test {
 protected:
  // The allocations of one message.
  std::size_t allocationsWith(platform::AnalyticsService& analytics) {
    platform::installServices(fakes_.servicesWith(analytics));
    const std::size_t before = platform::allocationsOfThisThread();
    EXPECT_GT(before, 0U);  // the counter works
    HVReportingTallyhubBridge::handleEvent(
        message_, AudioEventCategory::kSession | AudioEventCategory::kPlaybackAndRecord,
        AudioEventType::kHeadphoneAudioExposure, session_);
    return platform::allocationsOfThisThread() - before;
  }

  platform::FakePlatform fakes_;
  const std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(fakes_.statistics));
  const platform::Message message_ = platform::Dictionary{{"a", 1}};
};

TEST_F(HVReportingTallyhubBridgeAllocationTest, AMessageThatNobodyCollectsAllocatesNothing) {
  UnusedAnalyticsService analytics;

  EXPECT_EQ(allocationsWith(analytics), 0U);

  EXPECT_EQ(analytics.asked, 2);
  EXPECT_EQ(analytics.sent, 0);
}

TEST_F(HVReportingTallyhubBridgeAllocationTest, TheBuildersOfCollectedEventsAllocateNothing) {
  KeepingAnalyticsService analytics;

  EXPECT_EQ(allocationsWith(analytics), 0U);

  ASSERT_EQ(analytics.sent, 2U);
  EXPECT_EQ(*analytics.builders[1]().find("a"), platform::Value(1));
}

}  // namespace
}  // namespace halvox
