#include <gtest/gtest.h>

#include "driver/DriverUtilityFixture.h"
#include "driver/HVReportingDriverUtility.h"

namespace halvox {
namespace {

using namespace driver_testing;

// Each of the groups fails in turn.
class HVReportingDriverPositionTest : public DriverUtilityFixture,
                                      public testing::WithParamInterface<std::size_t> {
 protected:
  HVReportingDriverPositionTest() { setAll(1); }
  // What the channel of each group has counted.
  void setAll(std::int64_t count) {
    for (const char* group : kGroups) {
      platform_.ioReport.setGroup(group, {simpleChannel(group, count)});
    }
  }
  [[nodiscard]] static std::string failing() { return kGroups[GetParam()]; }
  static Texts subscribedBy(const HVReportingDriverUtility& utility) {
    Texts subscribed;
    for (const auto& one : utility.ioChannelSubscriptions()) {
      subscribed.push_back(one.driver().description());
    }
    return subscribed;
  }
  // The names of the groups that do not fail, each with these words in front.
  static Texts othersAfter(std::string_view words) {
    Texts texts;
    for (const char* group : kGroups) {
      if (group != failing()) texts.push_back(std::string(words) + group);
    }
    return texts;
  }
  // The simple values that were recorded, without their keys.
  std::size_t recordedEntries() const {
    const auto messages = recorded();
    // The tag is the only entry that does not come from a channel.
    return messages.empty() ? 0 : messages.front().size() - 1;
  }
};

TEST_P(HVReportingDriverPositionTest, AGroupWhoseChannelsCannotBeFoundIsSkipped) {
  platform_.ioReport.failChannels(failing(), {-4});

  const HVReportingDriverUtility utility;

  EXPECT_EQ(subscribedBy(utility), othersAfter(""));
  EXPECT_EQ(lines(LogLevel::kError), Texts{"error -4 getting channels for driver " + failing()});
}

TEST_P(HVReportingDriverPositionTest, AFailingSubscriptionIsSkipped) {
  platform_.ioReport.failSubscription(failing(), {-5});

  const HVReportingDriverUtility utility;

  EXPECT_EQ(subscribedBy(utility), othersAfter(""));
  EXPECT_EQ(lines(LogLevel::kError), Texts{"error -5 creating subscription for " + failing()});
}

TEST_P(HVReportingDriverPositionTest, AFailingSnapshotIsSkippedAndTheRestIsReported) {
  const auto utility = makeUtility();
  platform_.ioReport.failSamples(failing(), {-6});

  const DriverSnapShot snapShot = utility.getSnapShot();

  EXPECT_EQ(snapShot.size(), 7U);
  EXPECT_FALSE(snapShot.contains(failing()));
  EXPECT_EQ(lines(LogLevel::kError), Texts{"IOReportCreateSamples error -6"});
}

TEST_P(HVReportingDriverPositionTest, AFailingSampleAtTheStopIsSkippedAndTheRestIsReported) {
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  setAll(2);
  platform_.ioReport.failSamples(failing(), {-6});

  utility.sendDriverLogsForSession(session_);

  EXPECT_EQ(recordedEntries(), 7U);
  EXPECT_EQ(lines(LogLevel::kError), Texts{"IOReportCreateSamples error -6"});
}

TEST_P(HVReportingDriverPositionTest, AFailingDeltaIsLoggedLikeASampleAndTheRestIsReported) {
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  setAll(2);
  platform_.ioReport.failDelta(failing(), {-8});

  utility.sendDriverLogsForSession(session_);

  EXPECT_EQ(recordedEntries(), 7U);
  EXPECT_EQ(lines(LogLevel::kError), Texts{"IOReportCreateSamples error -8"});
}

TEST_P(HVReportingDriverPositionTest, ASubscriptionThatFailsWithoutAnErrorIsSkippedSilently) {
  platform_.ioReport.failSubscription(failing(), {});

  const HVReportingDriverUtility utility;

  EXPECT_EQ(subscribedBy(utility), othersAfter(""));
  EXPECT_TRUE(lines(LogLevel::kError).empty());
}

TEST_P(HVReportingDriverPositionTest, FailuresWithoutAnErrorAreNotLogged) {
  platform_.ioReport.failDelta(failing(), {});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());

  utility.sendDriverLogsForSession(session_);
  platform_.ioReport.failSamples(failing(), {});
  utility.sendDriverLogsForSession(session_);

  EXPECT_TRUE(lines(LogLevel::kError).empty());
}

INSTANTIATE_TEST_SUITE_P(EachGroup, HVReportingDriverPositionTest,
                         testing::Range<std::size_t>(0, std::size(kGroups)));

}  // namespace
}  // namespace halvox
