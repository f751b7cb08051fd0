#include "driver/HVReportingDriverUtility.h"

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::FakeIOReportService;
using platform::IOReportFormat;
using platform::JournalKind;
using platform::LogLevel;
using Channel = FakeIOReportService::Channel;
using Texts = std::vector<std::string>;

constexpr const char* kGroups[] = {"TarnoQ7AMP-(null)",
                                   "Speaker-(null)",
                                   "(null)-MCA",
                                   "Haptics-Stats",
                                   "StateTransitionTimes_ms-(null)",
                                   "Rx-(null)",
                                   "Tx-(null)",
                                   "(null)-IOSndFam2"};

Channel simpleChannel(std::string name, std::int64_t value) {
  return {.driverName = "Amp<1>",
          .group = "Speaker",
          .channelName = std::move(name),
          .integerValue = value};
}

class HVReportingDriverUtilityTest : public testing::Test {
 protected:
  HVReportingDriverUtilityTest() {
    session_->setServiceType(AudioServiceType::kHaptics);
    session_->start();
    forgetWhatHappened();
  }

  // A sampler of the groups that there are now, as the service makes it at its start.
  HVReportingDriverUtility makeUtility() {
    HVReportingDriverUtility utility;
    forgetWhatHappened();
    return utility;
  }
  void forgetWhatHappened() {
    platform_.journal.clear();
    platform_.log.clear();
    platform_.analytics.clear();
  }
  // The lines of the driver statistics.
  Texts lines(LogLevel level) const {
    Texts texts;
    for (const auto& line : platform_.log.lines(level)) {
      if (line.category == "hvrd") texts.push_back(line.text);
    }
    return texts;
  }
  // The messages that the session recorded.
  std::vector<Dictionary> recorded() const {
    std::vector<Dictionary> messages;
    const auto history = session_->nestedAggregatedPayloadData();
    for (const auto& entry : **history) messages.push_back(entry.message());
    return messages;
  }

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12});
};

// --- Subscribing --------------------------------------------------------------------------------

TEST_F(HVReportingDriverUtilityTest, AsksForTheEightGroupsInTheirOrder) {
  const HVReportingDriverUtility utility;

  Texts expected;
  for (const char* group : kGroups) expected.push_back(std::string("channels ") + group);
  EXPECT_EQ(platform_.journal.texts(JournalKind::kNote), expected);
}

TEST_F(HVReportingDriverUtilityTest, WithoutAnyGroupNothingIsSubscribedOrSent) {
  const HVReportingDriverUtility utility;
  session_->setDriverSnapShot(utility.getSnapShot());

  utility.sendDriverLogsForSession(session_);

  EXPECT_TRUE(utility.ioChannelSubscriptions().empty());
  EXPECT_TRUE(utility.getSnapShot().empty());
  EXPECT_TRUE(recorded().empty());
  EXPECT_EQ(lines(LogLevel::kInfo), Texts{"creating ioreporting driver utility"});
}

TEST_F(HVReportingDriverUtilityTest, SubscribesToGroupsWithChannelsOnly) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  platform_.ioReport.setGroup("(null)-MCA", {});

  const HVReportingDriverUtility utility;

  ASSERT_EQ(utility.ioChannelSubscriptions().size(), 1U);
  EXPECT_EQ(utility.ioChannelSubscriptions()[0].driver().description(), "Speaker-(null)");
  EXPECT_NE(utility.ioChannelSubscriptions()[0].subscription(), nullptr);
  EXPECT_NE(utility.ioChannelSubscriptions()[0].subscribedChannels(), nullptr);
  EXPECT_EQ(
      lines(LogLevel::kInfo),
      (Texts{"creating ioreporting driver utility", "subscribed to group group Speaker-(null)",
             "couldn't find any channels for driver group (null)-MCA"}));
}

TEST_F(HVReportingDriverUtilityTest, AnErrorOfLookingForChannelsIsLogged) {
  platform_.ioReport.failChannels("Rx-(null)", {-7});

  const HVReportingDriverUtility utility;

  EXPECT_EQ(lines(LogLevel::kError), Texts{"error -7 getting channels for driver Rx-(null)"});
}

TEST_F(HVReportingDriverUtilityTest, AnErrorBesideChannelsIsLoggedAndTheChannelsAreSubscribed) {
  platform_.ioReport.setGroup("Rx-(null)", {simpleChannel("a", 1)});
  platform_.ioReport.addErrorToChannels("Rx-(null)", 3);

  const HVReportingDriverUtility utility;

  EXPECT_EQ(lines(LogLevel::kError), Texts{"error 3 getting channels for driver Rx-(null)"});
  EXPECT_EQ(utility.ioChannelSubscriptions().size(), 1U);
}

TEST_F(HVReportingDriverUtilityTest, NoChannelsWithoutAnErrorSayNothing) {
  platform_.ioReport.failChannels("Rx-(null)", {});

  const HVReportingDriverUtility utility;

  EXPECT_TRUE(lines(LogLevel::kError).empty());
}

// --- Failures at each position ------------------------------------------------------------------

class HVReportingDriverPositionTest : public HVReportingDriverUtilityTest,
                                      public testing::WithParamInterface<std::size_t> {
 protected:
  HVReportingDriverPositionTest() {
    for (const char* group : kGroups) {
      platform_.ioReport.setGroup(group, {simpleChannel(group, 1)});
    }
  }
  [[nodiscard]] static std::string failing() { return kGroups[GetParam()]; }
  // The groups that do not fail, each behind these words.
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
    // The tag is the one entry that no channel gave.
    return messages.empty() ? 0 : messages.front().size() - 1;
  }
};

TEST_P(HVReportingDriverPositionTest, AFailingSubscriptionIsLeftOut) {
  platform_.ioReport.failSubscription(failing(), {-5});

  const HVReportingDriverUtility utility;

  Texts subscribed;
  for (const auto& one : utility.ioChannelSubscriptions()) {
    subscribed.push_back(one.driver().description());
  }
  EXPECT_EQ(subscribed, othersAfter(""));
  EXPECT_EQ(lines(LogLevel::kError), Texts{"error -5 creating subscription for " + failing()});
}

TEST_P(HVReportingDriverPositionTest, AFailingSnapshotIsLeftOutAndTheRestIsReported) {
  const auto utility = makeUtility();
  platform_.ioReport.failSamples(failing(), {-6});

  const DriverSnapShot snapShot = utility.getSnapShot();

  EXPECT_EQ(snapShot.size(), 7U);
  EXPECT_FALSE(snapShot.contains(failing()));
  EXPECT_EQ(lines(LogLevel::kError), Texts{"IOReportCreateSamples error -6"});
}

TEST_P(HVReportingDriverPositionTest, AFailingSampleAtTheStopIsLeftOutAndTheRestIsReported) {
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  platform_.ioReport.failSamples(failing(), {-6});

  utility.sendDriverLogsForSession(session_);

  EXPECT_EQ(recordedEntries(), 7U);
  EXPECT_EQ(lines(LogLevel::kError), Texts{"IOReportCreateSamples error -6"});
}

TEST_P(HVReportingDriverPositionTest, AFailingDeltaIsLoggedLikeASampleAndTheRestIsReported) {
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  platform_.ioReport.failDelta(failing(), {-8});

  utility.sendDriverLogsForSession(session_);

  EXPECT_EQ(recordedEntries(), 7U);
  EXPECT_EQ(lines(LogLevel::kError), Texts{"IOReportCreateSamples error -8"});
}

TEST_P(HVReportingDriverPositionTest, FailuresWithoutAnErrorSayNothing) {
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

// --- Snapshot and report ------------------------------------------------------------------------

TEST_F(HVReportingDriverUtilityTest, SnapshotSamplesEachSubscriptionUnderItsDescription) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  platform_.ioReport.setGroup("Haptics-Stats", {simpleChannel("b", 1)});
  const auto utility = makeUtility();

  const DriverSnapShot snapShot = utility.getSnapShot();

  EXPECT_EQ(snapShot.size(), 2U);
  EXPECT_NE(snapShot.at("Speaker-(null)"), nullptr);
  EXPECT_NE(snapShot.at("Haptics-Stats"), nullptr);
  EXPECT_EQ(platform_.journal.texts(),
            (Texts{"sampling driver Speaker-(null)", "samples Speaker-(null)",
                   "sampling driver Haptics-Stats", "samples Haptics-Stats"}));
}

TEST_F(HVReportingDriverUtilityTest, WithoutASnapshotSamplesAreTakenButNothingIsSent) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  const auto utility = makeUtility();

  utility.sendDriverLogsForSession(session_);

  EXPECT_EQ(platform_.journal.texts(), (Texts{"getting latest samples", "samples Speaker-(null)",
                                              "done getting latest samples"}));
  EXPECT_TRUE(recorded().empty());
}

TEST_F(HVReportingDriverUtilityTest, GroupThatIsNotInTheSnapshotIsLeftOutSilently) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(DriverSnapShot{});

  utility.sendDriverLogsForSession(session_);

  EXPECT_TRUE(recorded().empty());
  EXPECT_TRUE(lines(LogLevel::kError).empty());
}

TEST_F(HVReportingDriverUtilityTest, EachFormatGetsItsMessageFromAllGroups) {
  Channel histogram = simpleChannel("h", 0);
  histogram.format = IOReportFormat::kHistogram;
  histogram.buckets = {{0, 10, 1}};
  Channel state = simpleChannel("s", 0);
  state.format = IOReportFormat::kState;
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1), state});
  platform_.ioReport.setGroup("Tx-(null)", {histogram, simpleChannel("b", 2)});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  forgetWhatHappened();

  utility.sendDriverLogsForSession(session_);

  const auto messages = recorded();
  ASSERT_EQ(messages.size(), 3U);
  EXPECT_EQ(messages[0], (Dictionary{{"Amp_Speaker_Simple_a", 1},
                                     {"Amp_Speaker_Simple_b", 2},
                                     {"audiotag", "IOReportingSimple"}}));
  EXPECT_EQ(
      messages[1],
      (Dictionary{{"Amp_Speaker_Histogram_h", "count=1,lower=0,upper=10,min=0,max=0,unit=::0-10:1"},
                  {"audiotag", "IOReportingHistogram"}}));
  EXPECT_EQ(messages[2],
            (Dictionary{{"Amp_Speaker_State_s", ""}, {"audiotag", "IOReportingState"}}));
  EXPECT_EQ(
      platform_.analytics.sentNames(),
      (Texts{"com.tarno.halvox.IOReporting.Simple", "com.tarno.haptics.IOReporting.Simple",
             "com.tarno.halvox.IOReporting.Histogram", "com.tarno.haptics.IOReporting.Histogram",
             "com.tarno.halvox.IOReporting.State", "com.tarno.haptics.IOReporting.State"}));
}

TEST_F(HVReportingDriverUtilityTest, AFormatWithoutEntriesIsNotSent) {
  Channel state = simpleChannel("s", 0);
  state.format = IOReportFormat::kState;
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 0), state});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());

  utility.sendDriverLogsForSession(session_);

  ASSERT_EQ(recorded().size(), 1U);
  EXPECT_TRUE(recorded()[0].contains("Amp_Speaker_State_s"));
}

TEST_F(HVReportingDriverUtilityTest, TheReportLeavesTheSnapshotAlone) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  const auto before = session_->driverSnapShot();

  utility.sendDriverLogsForSession(session_);

  EXPECT_EQ(session_->driverSnapShot(), before);
}

TEST_F(HVReportingDriverUtilityTest, FormatsThatAreNotReportedAreLoggedAndSkipped) {
  Channel invalid = simpleChannel("i", 1);
  invalid.format = IOReportFormat::kInvalid;
  Channel list = simpleChannel("l", 1);
  list.format = IOReportFormat::kSimpleArray;
  Channel unknown = simpleChannel("u", 1);
  unknown.format = IOReportFormat{5};
  platform_.ioReport.setGroup("Speaker-(null)", {invalid, list, unknown, simpleChannel("a", 4)});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());

  utility.sendDriverLogsForSession(session_);

  EXPECT_EQ(lines(LogLevel::kDebug),
            (Texts{"Dropping sample of type : 0 for group : Speaker subgroup : (null)",
                   "Dropping sample of type : 4 for group : Speaker subgroup : (null)"}));
  EXPECT_EQ(lines(LogLevel::kError),
            Texts{"The IOReportingFormat 5 is not supported group : Speaker subgroup : (null)"});
  ASSERT_EQ(recorded().size(), 1U);
  EXPECT_TRUE(recorded()[0].contains("Amp_Speaker_Simple_a"));
}

TEST_F(HVReportingDriverUtilityTest, EachMessageGoesToTheSessionThenToAnalytics) {
  Channel state = simpleChannel("s", 0);
  state.format = IOReportFormat::kState;
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1), state});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  platform_.analytics.wantOnly({"com.tarno.halvox.IOReporting.Simple"});
  forgetWhatHappened();

  utility.sendDriverLogsForSession(session_);

  const Texts all = platform_.journal.texts();
  const std::string sending = "sending message for session owned by 7";
  const auto first = std::ranges::find(all, sending);
  const auto simple = std::find(first, all.end(), "com.tarno.halvox.IOReporting.Simple");
  const auto second = std::find(simple, all.end(), sending);
  EXPECT_NE(std::find(second, all.end(), "com.tarno.halvox.IOReporting.State"), all.end());
  EXPECT_EQ(std::count(first, all.end(), sending), 2);
}

TEST_F(HVReportingDriverUtilityTest, LinesGoUnderTheUtilitysName) {
  const HVReportingDriverUtility utility;

  EXPECT_EQ(platform_.log.lines().at(0).line.substr(0, 26), " HVReportingDriverUtility:");
}

}  // namespace
}  // namespace halvox
