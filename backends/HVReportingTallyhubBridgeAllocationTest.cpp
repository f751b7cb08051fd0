#include <cstddef>
#include <memory>

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

TEST(HVReportingTallyhubBridgeAllocationTest, AMessageThatNobodyCollectsAllocatesNothing) {
  platform::FakePlatform fakes;
  UnusedAnalyticsService analytics;
  platform::installServices(fakes.servicesWith(analytics));
  const auto session = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(fakes.statistics));
  const platform::Message message = platform::Dictionary{{"a", 1}};

  const std::size_t before = platform::allocationsOfThisThread();
  ASSERT_GT(before, 0U);  // the counter works
  HVReportingTallyhubBridge::handleEvent(
      message, AudioEventCategory::kSession | AudioEventCategory::kPlaybackAndRecord,
      AudioEventType::kHeadphoneAudioExposure, session);

  EXPECT_EQ(platform::allocationsOfThisThread() - before, 0U);
  EXPECT_EQ(analytics.asked, 2);
  EXPECT_EQ(analytics.sent, 0);
}

}  // namespace
}  // namespace halvox
