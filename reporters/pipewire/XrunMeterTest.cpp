#include "reporters/pipewire/XrunMeter.h"

#include <gtest/gtest.h>

namespace halvox::pipewire_reporter {
namespace {

using namespace std::chrono_literals;
using Seconds = XrunMeter::Seconds;

TEST(XrunMeterTest, NothingIsDueWhenNothingWasLost) {
  XrunMeter meter;

  EXPECT_EQ(meter.takeDue(5s), std::nullopt);
  EXPECT_EQ(meter.takeRest(), std::nullopt);
}

TEST(XrunMeterTest, TheFirstLossIsDueAtOnce) {
  XrunMeter meter;
  meter.add(1s, Seconds(0.02));

  EXPECT_EQ(meter.takeDue(5s), Seconds(0.02));
  EXPECT_EQ(meter.takeDue(9s), std::nullopt);
}

TEST(XrunMeterTest, LossesWithinASecondOfAReportWaitAndAreAddedUp) {
  XrunMeter meter;
  meter.add(2s, Seconds(0.25));
  ASSERT_TRUE(meter.takeDue(5s));

  meter.add(3s, Seconds(0.5));
  EXPECT_EQ(meter.takeDue(5500ms), std::nullopt);
  meter.add(4s, Seconds(0.25));
  EXPECT_EQ(meter.takeDue(5999ms), std::nullopt);
  EXPECT_EQ(meter.takeDue(6s), Seconds(0.75));
}

TEST(XrunMeterTest, AQuietTimeDoesNotMoveTheNextReport) {
  XrunMeter meter;
  meter.add(5s, Seconds(0.25));
  ASSERT_TRUE(meter.takeDue(5s));
  EXPECT_EQ(meter.takeDue(7s), std::nullopt);

  meter.add(6s, Seconds(0.5));
  EXPECT_EQ(meter.takeDue(7100ms), Seconds(0.5));
}

TEST(XrunMeterTest, TheRestIsTakenWithoutWaiting) {
  XrunMeter meter;
  meter.add(7s, Seconds(0.25));
  ASSERT_TRUE(meter.takeDue(5s));
  meter.add(8s, Seconds(0.5));

  EXPECT_EQ(meter.takeRest(), Seconds(0.5));
  EXPECT_EQ(meter.takeRest(), std::nullopt);
}

TEST(XrunMeterTest, ACycleThatIsReportedTwiceCountsOnce) {
  XrunMeter meter;
  meter.add(5s, Seconds(0.25));
  meter.add(5s, Seconds(0.25));
  EXPECT_EQ(meter.takeDue(5s), Seconds(0.25));
  meter.add(5s, Seconds(0.25));
  meter.add(5250ms, Seconds(0.5));

  EXPECT_EQ(meter.takeRest(), Seconds(0.5));
}

TEST(XrunMeterTest, AClockThatWentBackHoldsNothingUp) {
  XrunMeter meter;
  meter.add(9s, Seconds(0.25));
  ASSERT_TRUE(meter.takeDue(500s));
  meter.add(10s, Seconds(0.5));

  EXPECT_EQ(meter.takeDue(3s), Seconds(0.5));
}

}  // namespace
}  // namespace halvox::pipewire_reporter
