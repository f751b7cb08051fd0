#include "platform/linux/drivers/DriverSamples.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/drivers/testing/MadeReadings.h"

namespace halvox::platform::linux_ {
namespace {

using testing::describe;
using ::testing::ElementsAre;
using testing::gaugeChannel;
using testing::histogramChannel;
using ::testing::IsEmpty;
using testing::makeReading;
using testing::samplesOf;
using testing::simpleChannel;
using testing::stateChannel;

std::vector<std::string> deltaOf(std::shared_ptr<const Reading> previous,
                                 std::shared_ptr<const Reading> current) {
  return describe(*makeDelta(samplesOf(std::move(previous)), samplesOf(std::move(current))));
}

TEST(DriverSamplesTest, SimpleChannelsAreSubtracted) {
  const auto channel = simpleChannel("Tx", "frames");

  EXPECT_THAT(deltaOf(makeReading({channel}, {100}), makeReading({channel}, {142})),
              ElementsAre("-/Tx/-/frames  = 42"));
}

TEST(DriverSamplesTest, AChannelThatAppearedIsNotInTheDifference) {
  const auto old = simpleChannel("Tx", "old");
  const auto appeared = simpleChannel("Tx", "new");

  EXPECT_THAT(deltaOf(makeReading({old}, {1}), makeReading({appeared, old}, {7, 3})),
              ElementsAre("-/Tx/-/old  = 2"));
}

TEST(DriverSamplesTest, AChannelThatVanishedIsNotInTheDifference) {
  const auto gone = simpleChannel("Tx", "gone");

  EXPECT_THAT(deltaOf(makeReading({gone}, {1}), makeReading({}, {})), IsEmpty());
}

TEST(DriverSamplesTest, ACounterThatWentBackwardsCountsFromZero) {
  const auto channel = simpleChannel("Tx", "frames");

  EXPECT_THAT(deltaOf(makeReading({channel}, {100}), makeReading({channel}, {30})),
              ElementsAre("-/Tx/-/frames  = 30"));
}

TEST(DriverSamplesTest, AGaugeThatFellHasANegativeDifference) {
  const auto channel = gaugeChannel("Tx", "level");

  EXPECT_THAT(deltaOf(makeReading({channel}, {100}), makeReading({channel}, {40})),
              ElementsAre("-/Tx/-/level  = -60"));
}

TEST(DriverSamplesTest, NegativeValuesAreSubtractedWithTheirSign) {
  const auto channel = gaugeChannel("Tx", "gain");
  const auto minus = [](std::int64_t value) { return static_cast<std::uint64_t>(value); };

  EXPECT_THAT(deltaOf(makeReading({channel}, {minus(-5)}), makeReading({channel}, {minus(2)})),
              ElementsAre("-/Tx/-/gain  = 7"));
}

// Equal names do not make the same channel: a card that was plugged in again is a new one.
TEST(DriverSamplesTest, IdentityIsTheChannelNotItsName) {
  const auto first = simpleChannel("Tx", "frames");
  const auto second = simpleChannel("Tx", "frames");

  EXPECT_THAT(deltaOf(makeReading({first}, {100}), makeReading({second}, {142})), IsEmpty());
}

TEST(DriverSamplesTest, ChannelsAreFoundWhereverTheyStand) {
  const auto a = simpleChannel("Tx", "a");
  const auto b = simpleChannel("Tx", "b");

  EXPECT_THAT(deltaOf(makeReading({a, b}, {1, 10}), makeReading({b, a}, {15, 3})),
              ElementsAre("-/Tx/-/b  = 5", "-/Tx/-/a  = 2"));
}

TEST(DriverSamplesTest, StatesAreSubtractedAndTheDutyCycleIsThatOfTheTimeBetween) {
  const auto channel = stateChannel({"on", "off"});
  const auto delta = makeDelta(samplesOf(makeReading({channel}, {1, 1000, 1, 50})),
                               samplesOf(makeReading({channel}, {3, 1300, 2, 150})));

  std::vector<double> dutyCycles;
  delta->iterate([&dutyCycles](const IOReportChannel& shown) {
    for (const auto& state : shown.states) dutyCycles.push_back(state.dutyCycle);
    return 0;
  });

  EXPECT_THAT(describe(*delta), ElementsAre("-/-/-/-  = on:2:300 off:1:100"));
  EXPECT_THAT(dutyCycles, ElementsAre(0.75, 0.25));
}

TEST(DriverSamplesTest, AStateChannelWhoseStatesHeldNoTimeIsNotInTheDifference) {
  const auto still = stateChannel({"on", "off"});
  const auto frames = simpleChannel("Tx", "frames");

  EXPECT_THAT(deltaOf(makeReading({still, frames}, {1, 1000, 1, 50, 7}),
                      makeReading({still, frames}, {3, 1000, 2, 50, 9})),
              ElementsAre("-/Tx/-/frames  = 2"));
}

TEST(DriverSamplesTest, AStateChannelThatBeganAnewCountsFromZeroAsAWhole) {
  const auto channel = stateChannel({"on", "off"});

  EXPECT_THAT(
      deltaOf(makeReading({channel}, {5, 900, 4, 800}), makeReading({channel}, {6, 1000, 0, 30})),
      ElementsAre("-/-/-/-  = on:6:1000 off:0:30"));
}

TEST(DriverSamplesTest, HitsAreSubtractedAndTheExtremesAreThoseOfTheBucketsThatGrew) {
  const auto channel = histogramChannel({{0, 10}, {10, 20}});

  EXPECT_THAT(deltaOf(makeReading({channel}, {5, 1}), makeReading({channel}, {9, 1})),
              ElementsAre("-/-/-/-  = 0-10:4 10-20:0 min 0 max 10"));
  EXPECT_THAT(deltaOf(makeReading({channel}, {5, 1}), makeReading({channel}, {5, 3})),
              ElementsAre("-/-/-/-  = 0-10:0 10-20:2 min 10 max 20"));
}

// The numbers of a histogram belong together: if one was reset, all of them were.
TEST(DriverSamplesTest, AHistogramWithOneBucketBackwardsCountsFromZeroAsAWhole) {
  const auto channel = histogramChannel({{0, 10}, {10, 20}});

  EXPECT_THAT(deltaOf(makeReading({channel}, {5, 3}), makeReading({channel}, {6, 1})),
              ElementsAre("-/-/-/-  = 0-10:6 10-20:1 min 0 max 20"));
}

TEST(DriverSamplesTest, IteratingEndsWhenTheVisitorSaysSo) {
  const auto samples =
      samplesOf(makeReading({simpleChannel("Tx", "a"), simpleChannel("Tx", "b")}, {1, 2}));
  int seen = 0;

  samples.iterate([&seen](const IOReportChannel&) { return ++seen; });

  EXPECT_EQ(seen, 1);
}

}  // namespace
}  // namespace halvox::platform::linux_
