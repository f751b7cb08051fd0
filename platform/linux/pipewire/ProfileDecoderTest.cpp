#include "platform/linux/pipewire/ProfileDecoder.h"

#include <array>
#include <vector>

#include <gtest/gtest.h>
#include <spa/param/profiler.h>
#include <spa/pod/builder.h>
#include <spa/pod/parser.h>

namespace halvox::pipewire {
namespace {

using std::chrono::nanoseconds;

// Events of the profiler, built in the same way as the server builds them.
class ProfileDecoderTest : public testing::Test {
 protected:
  struct Follower {
    int id;
    int status;
    std::int64_t awake = 50;
    const char* name = "node";
  };
  struct Cycle {
    std::int64_t time = 0;
    std::int64_t duration = 1024;
    spa_fraction rate{1, 48000};
    std::vector<Follower> followers = {};
    int xruns = 2;
  };

  ProfileDecoderTest() { spa_pod_builder_init(&builder_, buffer_.data(), sizeof buffer_); }

  spa_pod* makeProfile(const std::vector<Cycle>& cycles) {
    spa_pod_frame frame{};
    spa_pod_builder_push_struct(&builder_, &frame);
    for (const Cycle& cycle : cycles) addCycle(cycle);
    return static_cast<spa_pod*>(spa_pod_builder_pop(&builder_, &frame));
  }
  void addCycle(const Cycle& cycle) {
    spa_pod_frame frame{};
    spa_pod_builder_push_object(&builder_, &frame, SPA_TYPE_OBJECT_Profiler, 0);
    spa_pod_builder_prop(&builder_, SPA_PROFILER_info, 0);
    spa_pod_builder_add_struct(&builder_, SPA_POD_Long(std::int64_t{1}), SPA_POD_Float(0.1F),
                               SPA_POD_Float(0.1F), SPA_POD_Float(0.1F), SPA_POD_Int(cycle.xruns));
    spa_pod_builder_prop(&builder_, SPA_PROFILER_clock, 0);
    spa_pod_builder_add_struct(&builder_, SPA_POD_Int(0), SPA_POD_Int(30), SPA_POD_String("clock"),
                               SPA_POD_Long(cycle.time), SPA_POD_Fraction(&cycle.rate),
                               SPA_POD_Long(std::int64_t{4711}), SPA_POD_Long(cycle.duration),
                               SPA_POD_Long(std::int64_t{0}), SPA_POD_Double(1.0),
                               SPA_POD_Long(std::int64_t{0}));
    addNode(SPA_PROFILER_driverBlock, {30, 3, 50, "speakers"});
    for (const Follower& follower : cycle.followers) {
      addNode(SPA_PROFILER_followerBlock, follower);
    }
    spa_pod_builder_pop(&builder_, &frame);
  }
  void addNode(std::uint32_t key, const Follower& node) {
    const spa_fraction latency{1024, 48000};
    spa_pod_builder_prop(&builder_, key, 0);
    spa_pod_builder_add_struct(&builder_, SPA_POD_Int(node.id), SPA_POD_String(node.name),
                               SPA_POD_Long(std::int64_t{10}), SPA_POD_Long(std::int64_t{20}),
                               SPA_POD_Long(node.awake), SPA_POD_Long(std::int64_t{120}),  //
                               SPA_POD_Int(node.status), SPA_POD_Fraction(&latency));
  }

  alignas(8) std::array<std::uint8_t, 16384> buffer_{};
  spa_pod_builder builder_{};
};

TEST_F(ProfileDecoderTest, ACycleHasTheTimeAndLengthOfItsClock) {
  const auto cycles =
      decodeProfile(makeProfile({{.time = 5'000'000'000, .duration = 2048, .rate = {1, 48000}},
                                 {.time = 5'042'666'666, .duration = 441, .rate = {1, 44100}}}));

  ASSERT_EQ(cycles.size(), 2U);
  EXPECT_EQ(cycles[0].time, nanoseconds(5'000'000'000));
  EXPECT_DOUBLE_EQ(cycles[0].length.count(), 2048.0 / 48000);
  EXPECT_EQ(cycles[1].time, nanoseconds(5'042'666'666));
  EXPECT_DOUBLE_EQ(cycles[1].length.count(), 0.01);
}

TEST_F(ProfileDecoderTest, ACycleHasTheQuantumAndRateOfItsClock) {
  const auto cycles = decodeProfile(makeProfile({{.duration = 2048, .rate = {1, 48000}},
                                                 {.duration = 441, .rate = {1, 44100}},
                                                 {.duration = 10, .rate = {1001, 48000}}}));

  ASSERT_EQ(cycles.size(), 3U);
  EXPECT_EQ(cycles[0].quantum, 2048);
  EXPECT_EQ(cycles[0].rate, 48000);
  EXPECT_EQ(cycles[1].quantum, 441);
  EXPECT_EQ(cycles[1].rate, 44100);
  EXPECT_EQ(cycles[2].rate, 48);
}

TEST_F(ProfileDecoderTest, NodesThatWereCalledAndDidNotFinishAreLate) {
  const auto cycles =
      decodeProfile(makeProfile({{.followers = {{40, 0}, {41, 1}, {42, 2}, {43, 3}, {44, 9}}}}));

  ASSERT_EQ(cycles.size(), 1U);
  EXPECT_EQ(cycles[0].late, (std::vector<ProfiledLateNode>{{.id = 41, .name = "node"},
                                                           {.id = 42, .name = "node"}}));
}

TEST_F(ProfileDecoderTest, LateNodesAndTheDriverHaveTheirNames) {
  const auto cycles = decodeProfile(
      makeProfile({{.followers = {{40, 1, 50, "player"}, {41, 1, 50, ""}, {42, 1, 50, nullptr}}}}));

  ASSERT_EQ(cycles.size(), 1U);
  EXPECT_EQ(cycles[0].driverName, "speakers");
  EXPECT_EQ(cycles[0].late,
            (std::vector<ProfiledLateNode>{{.id = 40, .name = "player"}, {.id = 41}, {.id = 42}}));
}

TEST_F(ProfileDecoderTest, FollowersThatWereNotCalledAreWaiting) {
  const auto cycles =
      decodeProfile(makeProfile({{.followers = {{40, 0}, {41, 2}, {42, 3}, {43, 0}, {44, -1}}}}));

  ASSERT_EQ(cycles.size(), 1U);
  EXPECT_EQ(cycles[0].waiting, (std::vector<std::uint32_t>{40, 43}));
}

TEST_F(ProfileDecoderTest, ANodeHasTheTimesOfTheStagesThatItReached) {
  const auto cycles = decodeProfile(makeProfile({{.followers = {{40, 3}, {41, 2}, {42, 1}}}}));

  ASSERT_EQ(cycles.size(), 1U);
  const ProfiledNode driver{.id = 30, .wait = nanoseconds(30), .busy = nanoseconds(70)};
  const ProfiledNode finished{.id = 40, .wait = nanoseconds(30), .busy = nanoseconds(70)};
  const ProfiledNode awake{.id = 41, .wait = nanoseconds(30)};
  const ProfiledNode called{.id = 42};
  EXPECT_EQ(cycles[0].driver, driver);
  EXPECT_EQ(cycles[0].followers, (std::vector<ProfiledNode>{finished, awake, called}));
}

TEST_F(ProfileDecoderTest, ANodeThatWasNeverWokenHasNoTimes) {
  const auto cycles = decodeProfile(makeProfile({{.followers = {{40, 3, 0}}}}));

  ASSERT_EQ(cycles.size(), 1U);
  EXPECT_EQ(cycles[0].followers, std::vector<ProfiledNode>{{.id = 40}});
}

TEST_F(ProfileDecoderTest, FollowersWhoseTurnItWasNotAreSkipped) {
  const auto cycles = decodeProfile(makeProfile({{.followers = {{40, 0}, {41, 4}, {42, -1}}}}));

  ASSERT_EQ(cycles.size(), 1U);
  EXPECT_TRUE(cycles[0].followers.empty());
  EXPECT_TRUE(cycles[0].late.empty());
}

TEST_F(ProfileDecoderTest, ACycleHasTheCountOfXrunsOfItsDriver) {
  const auto cycles = decodeProfile(makeProfile({{.xruns = 7}, {.xruns = 8}}));

  ASSERT_EQ(cycles.size(), 2U);
  EXPECT_EQ(cycles[0].driverXruns, 7U);
  EXPECT_EQ(cycles[1].driverXruns, 8U);
}

TEST_F(ProfileDecoderTest, CyclesOfAnImplausibleLengthAreSkipped) {
  const auto cycles = decodeProfile(makeProfile({{.duration = 0},
                                                 {.duration = -5},
                                                 {.rate = {1, 0}},
                                                 {.rate = {0, 48000}},
                                                 {.duration = 48000 * 11},
                                                 {.duration = 48000}}));

  ASSERT_EQ(cycles.size(), 1U);
  EXPECT_EQ(cycles[0].length.count(), 1.0);
}

TEST_F(ProfileDecoderTest, WhatIsNoProfileHasNoCycles) {
  EXPECT_TRUE(decodeProfile(nullptr).empty());
  spa_pod_builder_int(&builder_, 5);
  EXPECT_TRUE(decodeProfile(reinterpret_cast<const spa_pod*>(buffer_.data())).empty());
}

TEST_F(ProfileDecoderTest, BlocksOfOtherShapesAreSkipped) {
  spa_pod_frame outer{};
  spa_pod_frame inner{};
  spa_pod_builder_push_struct(&builder_, &outer);
  spa_pod_builder_int(&builder_, 1);
  spa_pod_builder_push_object(&builder_, &inner, SPA_TYPE_OBJECT_Profiler, 0);
  spa_pod_builder_prop(&builder_, SPA_PROFILER_clock, 0);
  spa_pod_builder_add_struct(&builder_, SPA_POD_Int(0), SPA_POD_Long(std::int64_t{1}));
  spa_pod_builder_prop(&builder_, SPA_PROFILER_followerBlock, 0);
  spa_pod_builder_int(&builder_, 41);
  spa_pod_builder_pop(&builder_, &inner);
  auto* profile = static_cast<spa_pod*>(spa_pod_builder_pop(&builder_, &outer));

  EXPECT_TRUE(decodeProfile(profile).empty());
}

}  // namespace
}  // namespace halvox::pipewire
