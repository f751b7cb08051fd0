#include "platform/fake/FakePlatform.h"

#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/services.h"

namespace halvox::platform {
namespace {

using namespace std::chrono_literals;

class FakePlatformTest : public testing::Test {
 protected:
  FakePlatform platform_;
};

TEST_F(FakePlatformTest, AllServicesAreInstalled) {
  EXPECT_EQ(&analytics(), &platform_.analytics);
  EXPECT_EQ(&platform::clock(), &platform_.clock);
  EXPECT_EQ(&connections(), &platform_.connections);
  EXPECT_EQ(&deviceProperties(), &platform_.deviceProperties);
  EXPECT_EQ(&dispatch(), &platform_.dispatch);
  EXPECT_EQ(&featureFlags(), &platform_.featureFlags);
  EXPECT_EQ(&kdebug(), &platform_.kdebug);
  EXPECT_EQ(&platform::log(), &platform_.log);
  EXPECT_EQ(&process(), &platform_.process);
  EXPECT_EQ(&statistics(), &platform_.statistics);
}

TEST_F(FakePlatformTest, TheJournalKeepsTheOrderOverAllServices) {
  kdebug().kdebug_trace(0x21044814, 0, 0, 0, 0);
  platform_.journal.note("between");
  if (analytics().isAnalyticsEventUsed("name")) {
    analytics().sendAnalyticsEventLazy("name", [] { return Dictionary(); });
  }
  EXPECT_THROW(process().terminate(2), FakeTermination);

  EXPECT_EQ(platform_.journal.entries(),
            (std::vector<JournalEntry>{{JournalKind::kTracePoint, "0x21044814"},
                                       {JournalKind::kNote, "between"},
                                       {JournalKind::kAnalyticsTest, "name"},
                                       {JournalKind::kAnalyticsEvent, "name"},
                                       {JournalKind::kTermination, "2"}}));
  EXPECT_EQ(platform_.journal.texts(JournalKind::kNote), std::vector<std::string>{"between"});
  platform_.journal.clear();
  EXPECT_TRUE(platform_.journal.entries().empty());
}

// --- Analytics ----------------------------------------------------------------------------------

TEST_F(FakePlatformTest, AnalyticsWantsWhatItIsTold) {
  EXPECT_TRUE(analytics().isAnalyticsEventUsed("any"));
  platform_.analytics.wantOnly({"some"});
  EXPECT_TRUE(analytics().isAnalyticsEventUsed("some"));
  EXPECT_FALSE(analytics().isAnalyticsEventUsed("any"));
  platform_.analytics.wantEverything();
  EXPECT_TRUE(analytics().isAnalyticsEventUsed("any"));
  EXPECT_EQ(platform_.analytics.testedNames(),
            (std::vector<std::string>{"any", "some", "any", "any"}));
}

TEST_F(FakePlatformTest, AnalyticsBuildsPayloadsWhenTheyAreRead) {
  int built = 0;
  analytics().sendAnalyticsEventLazy("event", [&built] { return Dictionary{{"built", ++built}}; });
  EXPECT_EQ(built, 0);
  EXPECT_EQ(platform_.analytics.sentNames(), (std::vector<std::string>{"event"}));
  EXPECT_EQ(built, 0);

  EXPECT_EQ(platform_.analytics.events()[0].payload, (Dictionary{{"built", 1}}));
  EXPECT_EQ(platform_.analytics.events()[0].payload, (Dictionary{{"built", 1}}));
}

TEST_F(FakePlatformTest, AnalyticsBuildsPayloadsAtOnceOrWhenTold) {
  int built = 0;
  const auto builder = [&built] { return Dictionary{{"built", ++built}}; };
  platform_.analytics.setBuilding(FakeAnalyticsService::Building::kWhenSent);
  analytics().sendAnalyticsEventLazy("first", builder);
  platform_.analytics.setBuilding(FakeAnalyticsService::Building::kWhenTold);
  analytics().sendAnalyticsEventLazy("second", builder);
  EXPECT_EQ(built, 1);
  EXPECT_EQ(platform_.analytics.events("second").front().payload, std::nullopt);

  platform_.analytics.buildPayloads();
  platform_.analytics.buildPayloads();

  EXPECT_EQ(built, 2);
  EXPECT_EQ(platform_.analytics.events()[0].payload, (Dictionary{{"built", 1}}));
  EXPECT_EQ(platform_.analytics.events()[1].payload, (Dictionary{{"built", 2}}));
  EXPECT_EQ(platform_.analytics.sentNames(), (std::vector<std::string>{"first", "second"}));
}

// --- The others ---------------------------------------------------------------------------------

TEST_F(FakePlatformTest, ClocksStandStillUntilMoved) {
  platform_.clock.setCurrentDate({100});
  platform_.clock.setSystemUptime(50s);
  platform_.clock.setProcessUptime(20ms);
  platform_.clock.advance(1500us);
  EXPECT_DOUBLE_EQ(platform::clock().currentDate().secondsSince1970, 100.0015);
  EXPECT_DOUBLE_EQ(platform::clock().systemUptime().count(), 50.0015);
  EXPECT_EQ(platform::clock().processUptime(), 21ms);
  platform_.clock.advance(500us);
  EXPECT_EQ(platform::clock().processUptime(), 22ms);
}

TEST_F(FakePlatformTest, TracePointsAreKeptWithTheirArguments) {
  kdebug().kdebug_trace(7, 1, 2, 3, 4);
  EXPECT_EQ(platform_.kdebug.points(), (std::vector<FakeKdebugService::Point>{{7, {1, 2, 3, 4}}}));
  platform_.kdebug.clear();
  EXPECT_TRUE(platform_.kdebug.codes().empty());
}

TEST_F(FakePlatformTest, DevicePropertiesAndFeaturesAreThoseThatWereSet) {
  EXPECT_EQ(deviceProperties().copyDeviceProperty("a"), std::nullopt);
  platform_.deviceProperties.set("a", 1);
  EXPECT_EQ(deviceProperties().copyDeviceProperty("a"), Value(1));
  platform_.deviceProperties.remove("a");
  EXPECT_EQ(deviceProperties().copyDeviceProperty("a"), std::nullopt);
  EXPECT_EQ(platform_.deviceProperties.queries(), 3U);

  EXPECT_FALSE(featureFlags()._os_feature_enabled_impl("domain", "feature"));
  platform_.featureFlags.set("domain", "feature", FakeFeatureFlagService::State::kOn);
  EXPECT_TRUE(featureFlags()._os_feature_enabled_impl("domain", "feature"));
  EXPECT_FALSE(featureFlags()._os_feature_enabled_impl("other", "feature"));
  platform_.featureFlags.set("domain", "feature", FakeFeatureFlagService::State::kOff);
  EXPECT_FALSE(featureFlags()._os_feature_enabled_impl("domain", "feature"));
}

TEST_F(FakePlatformTest, ProcessesComeAndGo) {
  EXPECT_EQ(process().processRecord(5), std::nullopt);
  platform_.process.addProcess(5, "five");
  EXPECT_EQ(process().processRecord(5)->commandName, "five");
  EXPECT_EQ(process().processRecord(5)->pid, 5);
  platform_.process.removeProcess(5);
  EXPECT_EQ(process().processRecord(5), std::nullopt);
  platform_.process.setOwnName("me");
  EXPECT_EQ(process().ownProcessName(), "me");
}

TEST_F(FakePlatformTest, TerminationCallsTheHandlerAndThrows) {
  std::vector<int> handled;
  platform_.process.setTerminationHandler([&](int status) { handled.push_back(status); });

  EXPECT_THROW(process().terminate(2), FakeTermination);

  EXPECT_EQ(handled, std::vector<int>{2});
  EXPECT_EQ(platform_.process.terminations(), std::vector<int>{2});
}

TEST_F(FakePlatformTest, CountersAreKeptAndCountFromZeroAfterAClear) {
  Counter& counter = statistics().counter("piece", "name");
  counter.add(3);
  EXPECT_EQ(platform_.statistics.value("piece", "name"), 3U);
  EXPECT_EQ(&statistics().counter("piece", "name"), &counter);

  platform_.statistics.clear();
  counter.add(2);

  EXPECT_EQ(&statistics().counter("piece", "name"), &counter);
  EXPECT_EQ(platform_.statistics.value("piece", "name"), 2U);
  EXPECT_EQ(platform_.statistics.values("piece"),
            (std::map<std::string, std::uint64_t>{{"name", 2}}));
  EXPECT_EQ(platform_.statistics.value("piece", "unknown"), 0U);
  EXPECT_EQ(FakeStatisticsService().value("piece", "name"), 0U);
}

TEST(FakePlatformLifeTest, WhatItDropsMayStillUseAllServices) {
  bool used = false;
  auto useServices = [&used](void*) {
    kdebug().kdebug_trace(1, 0, 0, 0, 0);
    used = analytics().isAnalyticsEventUsed("name");
  };
  {
    const FakePlatform platform;
    std::shared_ptr<void> atEnd(nullptr, useServices);
    dispatch()
        .createSerialQueue("queue", QualityOfService::kUtility, QueueThreading::kShared)
        ->async(JobWeight::kBrief, [atEnd = std::move(atEnd)] {});
    EXPECT_FALSE(used);
  }
  EXPECT_TRUE(used);
}

}  // namespace
}  // namespace halvox::platform
