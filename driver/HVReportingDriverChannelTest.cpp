#include <gtest/gtest.h>

#include "driver/HVReportingDriverUtility.h"
#include "platform/fake/FakePlatform.h"

// How one channel becomes an entry of a message.
namespace halvox {
namespace {

using platform::Dictionary;
using platform::FakeIOReportService;
using platform::IOReportFormat;
using Channel = FakeIOReportService::Channel;
using Utility = HVReportingDriverUtility;

class HVReportingDriverChannelTest : public testing::Test {
 protected:
  static Channel channel() {
    return {.driverName = "AmpDriver<0x1>",
            .group = "Haptics",
            .subGroup = "Stats",
            .channelName = "Peak Level",
            .unitLabel = "ms"};
  }
  static Dictionary simple(std::int64_t value) {
    Channel one = channel();
    one.integerValue = value;
    Dictionary stats;
    Utility::processSimpleData(one.view(), stats);
    return stats;
  }
  static Dictionary histogram(std::vector<platform::IOReportBucket> buckets) {
    Channel one = channel();
    one.format = IOReportFormat::kHistogram;
    one.buckets = std::move(buckets);
    one.minValue = 1;
    one.maxValue = 27;
    Dictionary stats;
    Utility::processHistogramData(one.view(), stats);
    return stats;
  }
  static Dictionary state(std::vector<platform::IOReportState> states) {
    Channel one = channel();
    one.format = IOReportFormat::kState;
    one.states = std::move(states);
    Dictionary stats;
    Utility::processStateData(one.view(), stats);
    return stats;
  }

  platform::FakePlatform platform_;
};

// --- Keys ---------------------------------------------------------------------------------------

TEST_F(HVReportingDriverChannelTest, KeyJoinsTheCleanedPartsOfTheChannel) {
  EXPECT_EQ(Utility::getDriverStatsKey(channel().view(), "Simple"),
            "AmpDriver_Haptics_Stats_Simple_PeakLevel");
}

TEST_F(HVReportingDriverChannelTest, KeyTakesADriverNameWithoutInstanceWhole) {
  Channel one = channel();
  one.driverName = "Amp_Dri ver";

  EXPECT_EQ(Utility::getDriverStatsKey(one.view(), "State"),
            "AmpDriver_Haptics_Stats_State_PeakLevel");
}

TEST_F(HVReportingDriverChannelTest, KeyCutsADriverNameBeforeTheFirstBracket) {
  Channel one = channel();
  one.driverName = "X<0x2><3>";

  EXPECT_EQ(Utility::getDriverStatsKey(one.view(), "Simple"), "X_Haptics_Stats_Simple_PeakLevel");
}

TEST_F(HVReportingDriverChannelTest, KeyOfADriverNameThatBeginsWithABracketHasAnEmptyPart) {
  Channel one = channel();
  one.driverName = "<0x2>";

  EXPECT_EQ(Utility::getDriverStatsKey(one.view(), "Simple"), "_Haptics_Stats_Simple_PeakLevel");
}

TEST_F(HVReportingDriverChannelTest, KeyLeavesOutAbsentParts) {
  const Channel one{.group = "Rx_Port 1"};

  EXPECT_EQ(Utility::getDriverStatsKey(one.view(), "Histogram"), "RxPort1_Histogram_");
  EXPECT_EQ(Utility::getDriverStatsKey(Channel{}.view(), "Simple"), "Simple_");
}

TEST_F(HVReportingDriverChannelTest, KeyOfAnEmptyPartKeepsItsUnderscore) {
  Channel one = channel();
  one.subGroup = "";

  EXPECT_EQ(Utility::getDriverStatsKey(one.view(), "Simple"),
            "AmpDriver_Haptics__Simple_PeakLevel");
}

// --- Simple -------------------------------------------------------------------------------------

TEST_F(HVReportingDriverChannelTest, SimpleChannelGivesItsValueAsASignedNumber) {
  const Dictionary stats = simple(5);

  EXPECT_EQ(stats, (Dictionary{{"AmpDriver_Haptics_Stats_Simple_PeakLevel", 5}}));
  EXPECT_EQ(stats.begin()->value.numberKind(), platform::NumberKind::kInt64);
}

TEST_F(HVReportingDriverChannelTest, SimpleChannelThatDidNotGrowIsDropped) {
  EXPECT_TRUE(simple(0).empty());
  EXPECT_TRUE(simple(-1).empty());
  EXPECT_FALSE(simple(1).empty());
}

// --- Histogram ----------------------------------------------------------------------------------

TEST_F(HVReportingDriverChannelTest, HistogramReportsItsHitBucketsAndItsBounds) {
  EXPECT_EQ(histogram({{0, 10, 5}, {10, 20, 0}, {20, 30, 2}}),
            (Dictionary{{"AmpDriver_Haptics_Stats_Histogram_PeakLevel",
                         "count=3,lower=0,upper=30,min=1,max=27,unit=ms::0-10:5;20-30:2"}}));
}

TEST_F(HVReportingDriverChannelTest, HistogramWithOneHitBucketHasNoTrailingSeparator) {
  EXPECT_EQ(histogram({{0, 10, 0}, {10, 20, 7}}).begin()->value.string(),
            "count=2,lower=0,upper=20,min=1,max=27,unit=ms::10-20:7");
}

TEST_F(HVReportingDriverChannelTest, HistogramBoundsAlwaysReachZero) {
  EXPECT_EQ(histogram({{100, 200, 1}}).begin()->value.string(),
            "count=1,lower=0,upper=200,min=1,max=27,unit=ms::100-200:1");
  EXPECT_EQ(histogram({{-20, -10, 1}}).begin()->value.string(),
            "count=1,lower=-20,upper=0,min=1,max=27,unit=ms::-20--10:1");
}

TEST_F(HVReportingDriverChannelTest, HistogramWithoutHitsIsDropped) {
  EXPECT_TRUE(histogram({{0, 10, 0}, {10, 20, 0}}).empty());
  EXPECT_TRUE(histogram({}).empty());
}

TEST_F(HVReportingDriverChannelTest, BucketWithoutBoundsIsLoggedAndCountsWithThoseBeforeIt) {
  const Dictionary stats = histogram({{0, 10, 5}, {10, 20, 2, 77}, {20, 30, 1}});

  EXPECT_EQ(stats.begin()->value.string(),
            "count=3,lower=0,upper=30,min=1,max=27,unit=ms::0-10:5;0-10:2;20-30:1");
  EXPECT_EQ(platform_.log.texts(platform::LogLevel::kInfo),
            (std::vector<std::string>{"Error in getting the bucket bounds : 77"}));
}

TEST_F(HVReportingDriverChannelTest, FirstBucketWithoutBoundsHasZeroes) {
  EXPECT_EQ(histogram({{5, 10, 3, 1}}).begin()->value.string(),
            "count=1,lower=0,upper=0,min=1,max=27,unit=ms::0-0:3");
}

TEST_F(HVReportingDriverChannelTest, HistogramNumbersAreSigned) {
  EXPECT_EQ(histogram({{-20, -10, UINT64_MAX}}).begin()->value.string(),
            "count=1,lower=-20,upper=0,min=1,max=27,unit=ms::-20--10:-1");
}

// --- State --------------------------------------------------------------------------------------

TEST_F(HVReportingDriverChannelTest, StateChannelReportsTheStatesWithResidency) {
  const std::string text =
      "name:running,transition:2,residency:300,duty_cycle:0.750000;"
      "name:idle,transition:1,residency:100,duty_cycle:0.250000;";

  EXPECT_EQ(state({{"running", 2, 300, 0.75}, {"off", 9, 0, 0.5}, {"idle", 1, 100, 0.25}}),
            (Dictionary{{"AmpDriver_Haptics_Stats_State_PeakLevel", text}}));
  EXPECT_EQ(platform_.log.texts(platform::LogLevel::kDebug),
            (std::vector<std::string>{"the current reported data is : " + text}));
}

TEST_F(HVReportingDriverChannelTest, ADroppedStateChannelIsNeitherReportedNorLogged) {
  platform_.privacy.drop("AmpDriver_Haptics_Stats_State_PeakLevel");

  EXPECT_TRUE(state({{"running", 2, 300, 0.75}}).empty());
  EXPECT_TRUE(platform_.log.texts(platform::LogLevel::kDebug).empty());
}

TEST_F(HVReportingDriverChannelTest, StateChannelWithoutResidencyIsReportedEmpty) {
  EXPECT_EQ(state({{"running", 2, 0, 0}}).begin()->value.string(), "");
  EXPECT_EQ(state({}).size(), 1U);
}

TEST_F(HVReportingDriverChannelTest, StateNumbersAreUnsigned) {
  EXPECT_EQ(state({{"a", UINT64_MAX, UINT64_MAX, 1}}).begin()->value.string(),
            "name:a,transition:18446744073709551615,residency:18446744073709551615,"
            "duty_cycle:1.000000;");
}

}  // namespace
}  // namespace halvox
