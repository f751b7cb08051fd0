#include "platform/linux/drivers/pipewire/NodeStatistics.h"

#include <limits>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

using namespace std::chrono_literals;
using Time = StateResidency::Time;

constexpr Time kStart{1000h};

TEST(DurationHistogramTest, BucketsFollowOneAnotherWithoutGapAndTheLastIsOpen) {
  const auto bounds = DurationHistogram::bounds();

  ASSERT_EQ(bounds.size(), DurationHistogram::kBuckets);
  EXPECT_EQ(bounds.front().lower, 0);
  for (std::size_t index = 1; index < bounds.size(); ++index) {
    EXPECT_EQ(bounds[index].lower, bounds[index - 1].upper);
    EXPECT_LT(bounds[index].lower, bounds[index].upper);
  }
  EXPECT_EQ(bounds.back().upper, std::numeric_limits<std::int64_t>::max());
}

TEST(DurationHistogramTest, ADurationHitsTheBucketThatItsMicrosecondsAreIn) {
  DurationHistogram histogram;
  for (const auto duration : {0ns, 49'999ns, 50'000ns, 99'999ns, 10'000'000ns}) {
    histogram.add(duration);
  }
  histogram.add(1h);

  const auto values = histogram.values();

  EXPECT_EQ(values, (std::array<std::uint64_t, 11>{2, 2, 0, 0, 0, 0, 0, 0, 1, 0, 1}));
}

TEST(DurationHistogramTest, ANegativeDurationCountsAsNone) {
  DurationHistogram histogram;
  histogram.add(-5ms);

  EXPECT_EQ(histogram.values()[0], 1U);
}

TEST(StateResidencyTest, AStateGathersTimeUpToTheMomentOfReading) {
  StateResidency states;
  states.change(NodeState::kSuspended, kStart);
  states.change(NodeState::kRunning, kStart + 2s);
  states.change(NodeState::kIdle, kStart + 5s);
  states.change(NodeState::kRunning, kStart + 6s);

  EXPECT_EQ(states.values(kStart + 10s),
            (std::array<std::uint64_t, 6>{2, 7'000'000, 1, 1'000'000, 0, 2'000'000}));
}

TEST(StateResidencyTest, TheSameStateAgainIsNoTransition) {
  StateResidency states;
  states.change(NodeState::kIdle, kStart);
  states.change(NodeState::kRunning, kStart + 1s);
  states.change(NodeState::kRunning, kStart + 2s);

  EXPECT_EQ(states.values(kStart + 3s),
            (std::array<std::uint64_t, 6>{1, 2'000'000, 0, 1'000'000, 0, 0}));
}

TEST(StateResidencyTest, TimeInAStateThatDoesNotCountIsNobodys) {
  StateResidency states;
  states.change(NodeState::kRunning, kStart);
  states.change(std::nullopt, kStart + 1s);
  states.change(NodeState::kRunning, kStart + 5s);

  EXPECT_EQ(states.values(kStart + 6s), (std::array<std::uint64_t, 6>{1, 2'000'000, 0, 0, 0, 0}));
}

TEST(StateResidencyTest, NothingIsCountedBeforeAStateIsKnown) {
  const StateResidency states;

  EXPECT_EQ(states.values(kStart), (std::array<std::uint64_t, 6>{}));
}

}  // namespace
}  // namespace halvox::platform::linux_
