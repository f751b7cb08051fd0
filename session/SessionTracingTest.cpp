#include <algorithm>
#include <cstdint>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "session/TracingFixture.h"

namespace halvox::tracing_test {
namespace {

class SessionTracingTest : public TracingFixture {};

const Texts kFrameworkStart{"trace configuration", "trace session", "trace delegate",
                            "trace start"};

// --- Choosing -----------------------------------------------------------------------------------

TEST_F(SessionTracingTest, WithoutTheFeatureNothingIsTraced) {
  platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOff);
  chooseRunner();

  session_->start();
  session_->stop();

  EXPECT_TRUE(operations().empty());
  EXPECT_FALSE(session_->tracing().startedTracing());
}

TEST_F(SessionTracingTest, OnlyTestSessionsTrace) {
  for (const auto type : {AudioServiceType::kHaptics, AudioServiceType::kUnknown}) {
    session_->setServiceType(type);
    chooseRunner();

    session_->start();
    session_->stop();
  }
  EXPECT_TRUE(operations().empty());
}

TEST_F(SessionTracingTest, WithoutATraceTypeTheFrameworkIsChosen) {
  session_->start();

  EXPECT_EQ(operations(), kFrameworkStart);
  EXPECT_EQ(platform_.performanceTraces.templates(), std::vector<std::int32_t>{1});
  EXPECT_TRUE(session_->tracing().startedTracing());
}

TEST_F(SessionTracingTest, AnyOtherTraceTypeChoosesTheFramework) {
  session_->setConfiguration(Dictionary{{HVReportingTraceType, HVReportingTraceTypeArtrace},
                                        {HVReportingMeridelPlistFilePath, kFile}});

  session_->start();

  EXPECT_EQ(operations(), kFrameworkStart);
  EXPECT_EQ(session_->tracing().traceRunner(), nullptr);
}

TEST_F(SessionTracingTest, ATypeInsideAnArrayChoosesTheFramework) {
  session_->setConfiguration(Dictionary{{HVReportingTraceType, Array{HVReportingTraceTypeKtrace}}});

  session_->start();

  EXPECT_EQ(operations(), kFrameworkStart);
}

// --- Hooks --------------------------------------------------------------------------------------

TEST_F(SessionTracingTest, FeatureSwitchedOffMeanwhileLeavesTheTraceAlone) {
  session_->start();
  platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOff);
  forgetWhatHappened();

  session_->stop();

  EXPECT_TRUE(operations().empty());
  EXPECT_TRUE(session_->tracing().startedTracing());
}

TEST_F(SessionTracingTest, SessionThatIsNoLongerATestDoesNotStopTheTrace) {
  session_->start();
  session_->setServiceType(AudioServiceType::kHaptics);
  forgetWhatHappened();

  session_->stop();

  EXPECT_TRUE(operations().empty());
  EXPECT_TRUE(session_->tracing().startedTracing());
}

TEST_F(SessionTracingTest, NextRunDoesNotTraceAgainWhatIsStillTraced) {
  session_->start();
  session_->setServiceType(AudioServiceType::kHaptics);
  session_->stop();
  session_->setServiceType(AudioServiceType::kTest);
  forgetWhatHappened();

  session_->start();

  EXPECT_TRUE(operations().empty());
}

TEST_F(SessionTracingTest, StopWaitsForTheTraceAfterTheLinkBeforeTheRunEnds) {
  session_->setTlmReportingEnabled(true);
  session_->start();
  session_->sendMessage(Dictionary{{"a", 1}}, AudioEventCategory::kPlayback, AudioEventType::kStart,
                        nullptr);
  forgetWhatHappened();

  platform_.performanceTraces.hang();

  EXPECT_THROW(session_->stop(), std::logic_error);  // waits for ever

  const Texts all = platform_.journal.texts();
  const auto summary = std::ranges::find(all, "sending summary event for reporter 7");
  EXPECT_NE(std::find(summary, all.end(), "trace stop"), all.end());
  // The link's last job was added before the wait, during which the fake runs it.
  EXPECT_NE(std::ranges::find(all, "entering tlmreporting -[HVReportingSession stop]_block_invoke"),
            all.end());
  EXPECT_TRUE(session_->started());
  EXPECT_TRUE(session_->nestedAggregatedPayloadData()->has_value());
}

}  // namespace
}  // namespace halvox::tracing_test
