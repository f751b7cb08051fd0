#include "platform/linux/pipewire/MissedCycles.h"

#include <vector>

#include <gtest/gtest.h>

namespace halvox::pipewire {
namespace {

using namespace std::chrono_literals;

constexpr std::uint32_t kSpeakers = 30;
constexpr std::uint32_t kHeadphones = 31;
constexpr std::uint32_t kPlayer = 40;
constexpr MissedCycles::Loss kNothing{};
constexpr MissedCycles::Loss kOneByFollowers{.count = 1, .fault = CycleFault::kFollowers};

// A cycle that all nodes finished.
ProfiledCycle finished(std::chrono::nanoseconds time, std::uint32_t xruns,
                       std::uint32_t driver = kSpeakers) {
  return {.time = time,
          .length = 10ms,
          .driverXruns = xruns,
          .driver = ProfiledNode{.id = driver},
          .followers = {{.id = kPlayer}}};
}

// A cycle that the player did not finish.
ProfiledCycle unfinished(std::chrono::nanoseconds time, std::uint32_t xruns,
                         std::uint32_t driver = kSpeakers) {
  ProfiledCycle cycle = finished(time, xruns, driver);
  cycle.late = {{.id = kPlayer, .name = "player"}};
  return cycle;
}

std::uint32_t sum(MissedCycles& missed, const std::vector<ProfiledCycle>& cycles) {
  std::uint32_t sum = 0;
  for (const auto& cycle : cycles) sum += missed.add(cycle).count;
  return sum;
}

TEST(MissedCyclesTest, AFinishedCycleWithoutAnXrunIsNotMissed) {
  MissedCycles missed;

  EXPECT_EQ(missed.add(finished(1s, 5)), kNothing);
  EXPECT_EQ(missed.add(finished(2s, 5)), kNothing);
}

TEST(MissedCyclesTest, AnUnfinishedCycleIsMissedByItsFollowers) {
  MissedCycles missed;

  EXPECT_EQ(missed.add(unfinished(1s, 0)), kOneByFollowers);
}

TEST(MissedCyclesTest, XrunsOfACycleThatAllFinishedAreTheDriversFault) {
  MissedCycles missed;
  ASSERT_EQ(missed.add(finished(1s, 5)), kNothing);

  EXPECT_EQ(missed.add(finished(2s, 8)),
            (MissedCycles::Loss{.count = 3, .fault = CycleFault::kDriver}));
}

TEST(MissedCyclesTest, TheFaultIsUnknownWithoutFollowers) {
  MissedCycles missed;
  ASSERT_EQ(missed.add(finished(1s, 0)), kNothing);
  ProfiledCycle cycle = finished(2s, 1);
  cycle.followers.clear();

  EXPECT_EQ(missed.add(cycle), (MissedCycles::Loss{.count = 1, .fault = CycleFault::kUnknown}));
}

TEST(MissedCyclesTest, FollowersThatOnlyWaitShowThatTheDriverWasLate) {
  MissedCycles missed;
  ASSERT_EQ(missed.add(finished(1s, 0)), kNothing);
  ProfiledCycle cycle = finished(2s, 1);
  cycle.followers.clear();
  cycle.waiting = {kPlayer};

  EXPECT_EQ(missed.add(cycle).fault, CycleFault::kDriver);
}

TEST(MissedCyclesTest, AnUnfinishedCycleThatIsReportedTwiceCountsOnce) {
  MissedCycles missed;

  EXPECT_EQ(sum(missed, {unfinished(1s, 0), unfinished(1s, 0), unfinished(2s, 0)}), 2U);
}

TEST(MissedCyclesTest, AnXrunOfAnUnfinishedCycleCountsOnceWhereverItIsSeen) {
  const std::vector<std::vector<ProfiledCycle>> cases{
      {finished(1s, 5), unfinished(2s, 6), finished(3s, 6)},  // in the cycle
      {finished(1s, 5), unfinished(2s, 5), unfinished(2s, 6),
       finished(3s, 6)},                                      // in its repetition
      {finished(1s, 5), unfinished(2s, 5), finished(3s, 6)},  // in the next one
  };
  for (const auto& cycles : cases) {
    MissedCycles missed;
    EXPECT_EQ(sum(missed, cycles), 1U) << cycles.size();
  }
}

TEST(MissedCyclesTest, XrunsThatLagBehindALongStallCountOnce) {
  MissedCycles missed;

  EXPECT_EQ(sum(missed, {finished(1s, 0), unfinished(2s, 0), unfinished(3s, 1), unfinished(4s, 1),
                         unfinished(5s, 2), finished(6s, 4), finished(7s, 4)}),
            4U);
}

TEST(MissedCyclesTest, FurtherXrunsOfAnUnfinishedCycleAreItsFollowersFault) {
  MissedCycles missed;
  ASSERT_EQ(missed.add(finished(1s, 0)), kNothing);

  EXPECT_EQ(missed.add(unfinished(2s, 3)),
            (MissedCycles::Loss{.count = 3, .fault = CycleFault::kFollowers}));
  EXPECT_EQ(missed.add(unfinished(2s, 4)), kOneByFollowers);
}

TEST(MissedCyclesTest, AnXrunAfterTheDeviceHasRecoveredIsAnother) {
  MissedCycles missed;
  ASSERT_EQ(sum(missed, {finished(1s, 0), unfinished(2s, 0), finished(3s, 0)}), 1U);

  EXPECT_EQ(missed.add(finished(4s, 1)),
            (MissedCycles::Loss{.count = 1, .fault = CycleFault::kDriver}));
}

TEST(MissedCyclesTest, TheSumIsNeverLowerThanWhatTheDriverCounted) {
  MissedCycles missed;
  std::uint32_t total = 0;
  std::uint32_t xruns = 100;
  std::uint32_t unfinishedCycles = 0;
  ASSERT_EQ(missed.add(finished(0s, xruns)), kNothing);
  // Every mixture of finished and unfinished cycles with none to three xruns.
  std::uint32_t state = 1;
  for (int second = 1; second < 5000; ++second) {
    state = state * 1664525U + 1013904223U;
    xruns += (state >> 24U) % 4;
    const bool isLate = (state >> 16U) % 2 == 0;
    unfinishedCycles += isLate ? 1 : 0;
    const auto time = std::chrono::seconds(second);
    total += missed.add(isLate ? unfinished(time, xruns) : finished(time, xruns)).count;
  }

  EXPECT_GE(total, xruns - 100);
  EXPECT_GE(total, unfinishedCycles);
  EXPECT_LE(total, xruns - 100 + unfinishedCycles);
}

TEST(MissedCyclesTest, DriversAreCountedApart) {
  MissedCycles missed;
  ASSERT_EQ(sum(missed, {finished(1s, 5), finished(1s, 70, kHeadphones)}), 0U);

  EXPECT_EQ(missed.add(finished(2s, 70, kHeadphones)), kNothing);
  EXPECT_EQ(missed.add(finished(2s, 6)).count, 1U);
}

TEST(MissedCyclesTest, ACountThatWentBackAddsNone) {
  MissedCycles missed;

  EXPECT_EQ(sum(missed, {finished(1s, 5), finished(2s, 1)}), 0U);
  EXPECT_EQ(missed.add(finished(3s, 2)).count, 1U);
}

TEST(MissedCyclesTest, XrunsBeforeTheFirstCycleOfADriverDoNotCount) {
  MissedCycles missed;
  ASSERT_EQ(missed.add(finished(1s, 5)), kNothing);

  missed.forget(kSpeakers);
  EXPECT_EQ(missed.add(finished(2s, 50)), kNothing);
  missed.clear();
  EXPECT_EQ(missed.add(finished(3s, 90)), kNothing);
}

TEST(MissedCyclesTest, ACycleWithoutADriverCountsIfItIsUnfinished) {
  MissedCycles missed;
  ProfiledCycle cycle = unfinished(1s, 0);
  cycle.driver.reset();

  EXPECT_EQ(missed.add(cycle), kOneByFollowers);
  EXPECT_EQ(missed.add(cycle), kNothing);
}

}  // namespace
}  // namespace halvox::pipewire
