#include "tools/Drivers.h"

#include <array>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include <gtest/gtest.h>
#include <unistd.h>

#include "client/testing/TestService.h"

namespace halvox::tools {
namespace {

using platform::IOReportBucket;
using platform::IOReportChannel;
using platform::IOReportFormat;
using platform::IOReportState;

IOReportChannel frames() {
  IOReportChannel channel;
  channel.format = IOReportFormat::kSimple;
  channel.driverName = "HDA\x1b";
  channel.group = "Tx";
  channel.channelName = "frames";
  channel.unitLabel = "frames";
  channel.integerValue = 96'000;
  return channel;
}

TEST(DriversTest, AChannelIsALineOfItsNamesItsValueAndItsUnit) {
  EXPECT_EQ(formatChannel(frames(), std::nullopt, OutputForm::kText),
            "HDA\\u001b  Tx  -  frames  96000 frames");
}

TEST(DriversTest, AWatchedChannelIsShownPerSecond) {
  EXPECT_EQ(formatChannel(frames(), 2.0, OutputForm::kText),
            "HDA\\u001b  Tx  -  frames  48000 frames/s");
}

TEST(DriversTest, JsonHasAllNames) {
  auto channel = frames();
  channel.driverName = "HDA";

  EXPECT_EQ(formatChannel(channel, std::nullopt, OutputForm::kJson),
            R"({"driver":"HDA","group":"Tx","subgroup":null,"channel":"frames","unit":"frames",)"
            R"("format":"simple","value":96000})");
}

TEST(DriversTest, StatesAndBucketsAreShownWithWhatTheyCounted) {
  const std::array states{IOReportState{.name = "on", .inTransitions = 3, .residency = 900},
                          IOReportState{.name = "off"}};
  const std::array buckets{IOReportBucket{.lower = 0, .upper = 10, .hits = 5},
                           IOReportBucket{.lower = 10, .upper = 20}};
  IOReportChannel state;
  state.format = IOReportFormat::kState;
  state.states = states;
  IOReportChannel histogram;
  histogram.format = IOReportFormat::kHistogram;
  histogram.buckets = buckets;

  EXPECT_EQ(formatChannel(state, std::nullopt, OutputForm::kText), "-  -  -  -  on=900(3x)");
  EXPECT_EQ(formatChannel(histogram, std::nullopt, OutputForm::kText), "-  -  -  -  0-10:5");
}

TEST(DriversTest, ABucketWithoutAnUpperBoundEndsAtInfinity) {
  const std::array buckets{
      IOReportBucket{.lower = 20, .upper = platform::kIOReportNoUpperBound, .hits = 3}};
  IOReportChannel histogram;
  histogram.format = IOReportFormat::kHistogram;
  histogram.buckets = buckets;

  EXPECT_EQ(formatChannel(histogram, std::nullopt, OutputForm::kText), "-  -  -  -  20-+Inf:3");
}

TEST(DriversTest, RatesHaveNoMoreDigitsThanAPersonReads) {
  const std::array states{
      IOReportState{.name = "suspended", .inTransitions = 0, .residency = 2'000'593},
      IOReportState{.name = "on", .inTransitions = 1, .residency = 7}};
  IOReportChannel state;
  state.format = IOReportFormat::kState;
  state.states = states;

  EXPECT_EQ(formatChannel(state, 2.0000123, OutputForm::kText),
            "-  -  -  -  suspended=1000290(0x) on=3.5(0.5x)/s");
}

class ShowDriversTest : public testing::Test {
 protected:
  ShowDriversTest() {
    std::ofstream(scratch_.path("halvox.toml"))
        << "[drivers]\nalsa = false\npipewire = false\ntextfiles = \"" << scratch_.path("")
        << "\"\n";
    std::ofstream(scratch_.path("a.prom")) << "# TYPE a counter\na_total{group=\"Tx\"} 3\n"
                                              "# TYPE b counter\nb_total{group=\"Rx\"} 4\n";
    setenv("HALVOX_CONFIG", scratch_.path("halvox.toml").c_str(), 1);
  }
  ~ShowDriversTest() override { unsetenv("HALVOX_CONFIG"); }

  client::ScratchDirectory scratch_;
  std::ostringstream out_;
  std::ostringstream errors_;
};

TEST_F(ShowDriversTest, TheChannelsOfAGroupAreReadFromTheConfiguredSources) {
  const auto status = showDrivers({.group = "Tx"}, OutputForm::kText, out_, -1, errors_);

  EXPECT_EQ(status, ExitStatus::kDone);
  EXPECT_EQ(out_.str(), "-  Tx  -  a  3\n");
}

TEST_F(ShowDriversTest, AnUnknownGroupIsReportedWithTheExistingOnes) {
  for (const auto watch : {std::optional<std::chrono::milliseconds>(), {std::chrono::hours(1)}}) {
    errors_.str("");
    EXPECT_EQ(showDrivers({.group = "Nope", .watch = watch}, OutputForm::kText, out_, -1, errors_),
              ExitStatus::kRefused);
    EXPECT_EQ(errors_.str(),
              "halvoxctl drivers: nothing to show: there is no group \"Nope\"; the groups are Rx, "
              "Tx\n");
  }
  EXPECT_EQ(out_.str(), "");
}

TEST_F(ShowDriversTest, WatchingEndsWhenTheOutputIsClosed) {
  int ends[2];
  ASSERT_EQ(pipe(ends), 0);
  close(ends[0]);

  const auto status = showDrivers({.group = {}, .watch = std::chrono::hours(1)}, OutputForm::kText,
                                  out_, ends[1], errors_);
  close(ends[1]);

  EXPECT_EQ(status, ExitStatus::kDone);
  EXPECT_EQ(out_.str(), "");
}

TEST_F(ShowDriversTest, AWrongConfigurationIsReported) {
  std::ofstream(scratch_.path("halvox.toml")) << "[drivers]\nalsa = 1\n";

  EXPECT_EQ(showDrivers({}, OutputForm::kText, out_, -1, errors_), ExitStatus::kBadConfiguration);
  EXPECT_NE(errors_.str().find("drivers.alsa"), std::string::npos);
}

}  // namespace
}  // namespace halvox::tools
