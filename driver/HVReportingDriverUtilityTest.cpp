#include "driver/HVReportingDriverUtility.h"

#include <algorithm>

#include <gtest/gtest.h>

#include "driver/DriverUtilityFixture.h"

namespace halvox {
namespace {

using namespace driver_testing;

using platform::IOReportFormat;
using platform::JournalKind;

class HVReportingDriverUtilityTest : public DriverUtilityFixture {};

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

TEST_F(HVReportingDriverUtilityTest, NoChannelsWithoutAnErrorAreNotLogged) {
  platform_.ioReport.failChannels("Rx-(null)", {});

  const HVReportingDriverUtility utility;

  EXPECT_TRUE(lines(LogLevel::kError).empty());
}

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

TEST_F(HVReportingDriverUtilityTest, SamplingIsLoggedAtInfoLevel) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  const auto utility = makeUtility();

  static_cast<void>(utility.getSnapShot());
  utility.sendDriverLogsForSession(session_);

  EXPECT_EQ(lines(LogLevel::kInfo),
            (Texts{"sampling driver Speaker-(null)", "getting latest samples",
                   "done getting latest samples"}));
}

TEST_F(HVReportingDriverUtilityTest, WithoutASnapshotSamplesAreTakenButNothingIsSent) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  const auto utility = makeUtility();

  utility.sendDriverLogsForSession(session_);

  EXPECT_EQ(platform_.journal.texts(), (Texts{"getting latest samples", "samples Speaker-(null)",
                                              "done getting latest samples"}));
  EXPECT_TRUE(recorded().empty());
}

TEST_F(HVReportingDriverUtilityTest, AFailingSampleIsLoggedAfterTheSampling) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  const auto utility = makeUtility();
  platform_.ioReport.failSamples("Speaker-(null)", {-6});

  utility.sendDriverLogsForSession(session_);

  EXPECT_EQ(platform_.journal.texts(),
            (Texts{"getting latest samples", "samples Speaker-(null)",
                   "done getting latest samples", "IOReportCreateSamples error -6"}));
}

TEST_F(HVReportingDriverUtilityTest, TheReportIsTheDifferenceFromTheSnapshotToTheStop) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 5)});

  utility.sendDriverLogsForSession(session_);

  ASSERT_EQ(recorded().size(), 1U);
  EXPECT_EQ(recorded()[0].find("Amp_Speaker_Simple_a")->toInt64(), 4);
}

TEST_F(HVReportingDriverUtilityTest, AChannelThatDidNotGrowOrFellIsNotSent) {
  Channel gauge = simpleChannel("gauge", 100);
  gauge.kind = platform::IOReportKind::kGauge;
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("still", 7), gauge});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  gauge.integerValue = 40;
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("still", 7), gauge});

  utility.sendDriverLogsForSession(session_);

  EXPECT_TRUE(recorded().empty());
}

TEST_F(HVReportingDriverUtilityTest, AChannelThatIsNotInTheSnapshotIsNotSent) {
  const Channel other = simpleChannel("b", 100);
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1), other});
  const auto utility = makeUtility();
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  session_->setDriverSnapShot(utility.getSnapShot());
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 5), other});

  utility.sendDriverLogsForSession(session_);

  ASSERT_EQ(recorded().size(), 1U);
  EXPECT_EQ(recorded()[0],
            (Dictionary{{"Amp_Speaker_Simple_a", 4}, {"audiotag", "IOReportingSimple"}}));
}

TEST_F(HVReportingDriverUtilityTest, ADroppedCounterIsNotSent) {
  platform_.privacy.drop("Amp_Speaker_Simple_b");
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1), simpleChannel("b", 1)});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 5), simpleChannel("b", 5)});

  utility.sendDriverLogsForSession(session_);

  ASSERT_EQ(recorded().size(), 1U);
  EXPECT_EQ(recorded()[0],
            (Dictionary{{"Amp_Speaker_Simple_a", 4}, {"audiotag", "IOReportingSimple"}}));
}

// The groups are sampled one after the other, and a driver may count in between.
TEST_F(HVReportingDriverUtilityTest, AllGroupsOfASnapshotAreOfOneMoment) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  platform_.ioReport.setGroup("Tx-(null)", {simpleChannel("b", 1)});
  const auto utility = makeUtility();
  platform_.ioReport.afterSamples([this](const std::string& group) {
    if (group == "Speaker-(null)")
      platform_.ioReport.setGroup("Tx-(null)", {simpleChannel("b", 5)});
  });

  session_->setDriverSnapShot(utility.getSnapShot());
  platform_.ioReport.afterSamples(nullptr);
  utility.sendDriverLogsForSession(session_);

  ASSERT_EQ(recorded().size(), 1U);
  EXPECT_EQ(recorded()[0].find("Amp_Speaker_Simple_b")->toInt64(), 4);
}

TEST_F(HVReportingDriverUtilityTest, AllGroupsOfAReportAreOfOneMoment) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  platform_.ioReport.setGroup("Tx-(null)", {simpleChannel("b", 1)});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  platform_.ioReport.afterSamples([this](const std::string& group) {
    if (group == "Speaker-(null)")
      platform_.ioReport.setGroup("Tx-(null)", {simpleChannel("b", 5)});
  });

  utility.sendDriverLogsForSession(session_);

  EXPECT_TRUE(recorded().empty());
}

TEST_F(HVReportingDriverUtilityTest, SessionsAtOnceEachHaveTheirOwnSnapshot) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  const auto utility = makeUtility();
  const auto other = std::make_shared<HVReportingSession>(
      ReporterID{8}, HVReportingSession::ProcessIdentifiers{12},
      SessionCounters::make(platform_.statistics));
  other->start();
  session_->setDriverSnapShot(utility.getSnapShot());
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 3)});

  utility.sendDriverLogsForSession(other);
  EXPECT_TRUE((*other->nestedAggregatedPayloadData())->empty());
  utility.sendDriverLogsForSession(session_);

  ASSERT_EQ(recorded().size(), 1U);
  EXPECT_EQ(recorded()[0].find("Amp_Speaker_Simple_a")->toInt64(), 2);
}

TEST_F(HVReportingDriverUtilityTest, GroupThatIsNotInTheSnapshotIsSkippedSilently) {
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
  histogram.buckets = {{0, 10, 3}};
  Channel state = simpleChannel("s", 0);
  state.format = IOReportFormat::kState;
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1), state});
  platform_.ioReport.setGroup("Tx-(null)", {histogram, simpleChannel("b", 2)});
  const auto utility = makeUtility();
  session_->setDriverSnapShot(utility.getSnapShot());
  histogram.buckets[0].hits = 4;
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 2), state});
  platform_.ioReport.setGroup("Tx-(null)", {histogram, simpleChannel("b", 4)});
  forgetWhatHappened();

  utility.sendDriverLogsForSession(session_);

  const auto messages = recorded();
  ASSERT_EQ(messages.size(), 3U);
  EXPECT_EQ(messages[0], (Dictionary{{"Amp_Speaker_Simple_a", 1},
                                     {"Amp_Speaker_Simple_b", 2},
                                     {"audiotag", "IOReportingSimple"}}));
  EXPECT_EQ(messages[1], (Dictionary{{"Amp_Speaker_Histogram_h",
                                      "count=1,lower=0,upper=10,min=0,max=10,unit=::0-10:1"},
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
  platform_.ioReport.setGroup("Speaker-(null)", {invalid, list, unknown, simpleChannel("a", 5)});

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
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 2), state});
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

TEST_F(HVReportingDriverUtilityTest, TheMessagesOfAStreamHaveItsSerial) {
  Channel state = simpleChannel("s", 0);
  state.format = IOReportFormat::kState;
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1), state});
  const auto utility = makeUtility();
  session_->updateConfigurationWithContentsOfConfiguration({{"object_serial", 55}});
  session_->setDriverSnapShot(utility.getSnapShot());
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 2), state});

  utility.sendDriverLogsForSession(session_);

  ASSERT_EQ(recorded().size(), 2U);
  for (const Dictionary& message : recorded()) {
    ASSERT_TRUE(message.contains("object_serial"));
    EXPECT_EQ(message.find("object_serial")->toInt64(), 55);
  }
}

TEST_F(HVReportingDriverUtilityTest, ASerialAloneIsNotSent) {
  platform_.ioReport.setGroup("Speaker-(null)", {simpleChannel("a", 1)});
  const auto utility = makeUtility();
  session_->updateConfigurationWithContentsOfConfiguration({{"object_serial", 55}});
  session_->setDriverSnapShot(utility.getSnapShot());

  utility.sendDriverLogsForSession(session_);

  EXPECT_TRUE(recorded().empty());
}

TEST_F(HVReportingDriverUtilityTest, LinesGoUnderTheUtilitysName) {
  const HVReportingDriverUtility utility;

  EXPECT_EQ(platform_.log.lines().at(0).line.substr(0, 26), " HVReportingDriverUtility:");
}

}  // namespace
}  // namespace halvox
