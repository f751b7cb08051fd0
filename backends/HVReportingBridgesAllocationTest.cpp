#include <cstddef>
#include <memory>

#include <gtest/gtest.h>

#include "backends/BackEndCounters.h"
#include "backends/HVReportingJoulebookUtility.h"
#include "backends/HVReportingUtilityVEKStateManager.h"
#include "backends/HVReportingZUBBridge.h"
#include "platform/fake/AllocationCounter.h"
#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"

namespace halvox {
namespace {

TEST(HVReportingBridgesAllocationTest, MessagesThatConcernNoBridgeAllocateNothing) {
  platform::FakePlatform fakes;
  const auto session = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(fakes.statistics));
  HVReportingUtilityVEKStateManager manager(fakes.statistics);
  const PowerLogCounters powerLog(fakes.statistics);
  const IssueMetricCounters issueMetrics(fakes.statistics);
  // Has the keys of all bridges, so that only the type makes them ignore it.
  const platform::Message message = platform::Dictionary{
      {"EngineOnTime", 1}, {"Haptic_Active_Hardware_Time_Seconds", 2}, {"issue_type", "a"}};
  constexpr auto kCategory = AudioEventCategory::kPlayback;

  const std::size_t before = platform::allocationsOfThisThread();
  ASSERT_GT(before, 0U);  // the counter works
  for (const auto type : {AudioEventType::kStart, AudioEventType::kError,
                          AudioEventType::kAudioUnitUsage, AudioEventType::kUnknown}) {
    HVReportingJoulebookUtility::handleEvent(message, kCategory, type, session, powerLog);
    HVReportingZUBBridge::handleEvent(message, kCategory, type, session, issueMetrics);
    manager.handleEvent(message, kCategory, type, session, "player");
  }

  EXPECT_EQ(platform::allocationsOfThisThread() - before, 0U);
}

}  // namespace
}  // namespace halvox
