#include "platform/linux/drivers/pipewire/PipeWireDriverSource.h"

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdlib.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/drivers/DriverSourceLog.h"
#include "platform/linux/drivers/testing/MadeReadings.h"
#include "platform/linux/pipewire/testing/PipeWireFixture.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

using namespace std::chrono_literals;
using pipewire_testing::PipedProcess;
using pipewire_testing::PipeWireFixture;
using ::testing::ElementsAre;
using Clock = std::chrono::steady_clock;

constexpr auto kDeadline = 30s;

std::vector<std::string> linesOf(const std::shared_ptr<const Reading>& reading,
                                 std::string_view start = "") {
  std::vector<std::string> lines = testing::describe(testing::samplesOf(reading));
  std::erase_if(lines, [start](const std::string& line) { return !line.starts_with(start); });
  return lines;
}

// The value of a simple channel; -1 if there is no such channel.
std::int64_t valueOf(const std::shared_ptr<const Reading>& reading, std::string_view start) {
  std::int64_t value = -1;
  testing::samplesOf(reading).iterate([&](const IOReportChannel& channel) {
    if (testing::describe(channel).starts_with(start)) value = channel.integerValue;
    return 0;
  });
  return value;
}

// The hits of the histogram's buckets, and the channel's greatest value.
struct Seen {
  std::uint64_t hits = 0;
  std::int64_t greatest = 0;
};
Seen histogramOf(const std::shared_ptr<const Reading>& reading, std::string_view start) {
  Seen seen;
  testing::samplesOf(reading).iterate([&](const IOReportChannel& channel) {
    if (!testing::describe(channel).starts_with(start)) return 0;
    for (const auto& bucket : channel.buckets) seen.hits += bucket.hits;
    seen.greatest = channel.maxValue;
    return 0;
  });
  return seen;
}

constexpr std::string_view kCycles = "demo-speakers/Speaker/PipeWire/cycles";

// There is no server.
TEST(PipeWireDriverSourceAloneTest, OnlyTheConnectionsAreThereAndOpeningDoesNotWait) {
  FakePlatform platform;
  const ScratchDirectory directory;
  setenv("XDG_RUNTIME_DIR", directory.path().c_str(), 1);
  // If open() waited, the test would take this long.
  PipeWireDriverSource source(driversCategory(platform.log), {.longestOpening = 1h});
  const auto start = Clock::now();

  source.open();
  const auto reading = source.read();

  EXPECT_LT(Clock::now() - start, kDeadline);
  EXPECT_THAT(linesOf(reading), ElementsAre("pipewire/Speaker/PipeWire/connections  = 0",
                                            "pipewire/Rx/PipeWire/connections  = 0"));
  EXPECT_FALSE(source.isProfiling());
}

TEST(PipeWireDriverSourceAloneTest, AReadingMayOutliveTheSource) {
  FakePlatform platform;
  std::shared_ptr<const Reading> reading;
  {
    PipeWireDriverSource source(driversCategory(platform.log));
    source.open();
    reading = source.read();
  }

  EXPECT_GE(reading->values.size(), 2U);
}

class PipeWireDriverSourceTest : public PipeWireFixture {
 protected:
  void SetUp() override {
    PipeWireFixture::SetUp();
    if (audio == nullptr) return;
    source = std::make_unique<PipeWireDriverSource>(driversCategory(platform.log));
    source->open();
  }
  void TearDown() override { source.reset(); }

  [[nodiscard]] PipedProcess play(double seconds) const {
    return PipedProcess({"pw-play", "--volume", "0.5", audio->makeTone(seconds)});
  }

  FakePlatform platform;
  std::unique_ptr<PipeWireDriverSource> source;
};

TEST_F(PipeWireDriverSourceTest, TheFirstReadingHasTheNodesAndTheirStates) {
  const auto reading = source->read();

  EXPECT_EQ(valueOf(reading, "pipewire/Speaker/PipeWire/connections"), 1);
  EXPECT_EQ(valueOf(reading, kCycles), 0);
  EXPECT_EQ(linesOf(reading, "demo-speakers/").size(), 5U);
  // The node is in some state, and has been for some time.
  EXPECT_THAT(linesOf(source->read(), "demo-speakers/Speaker/PipeWire/state us"),
              ElementsAre(::testing::MatchesRegex(".*= (idle|suspended):0:[1-9][0-9]*")));
}

TEST_F(PipeWireDriverSourceTest, CyclesOfAPlaybackAreCountedWhileAReadingIsHeld) {
  const auto first = source->read();
  ASSERT_TRUE(eventually([&] { return source->isProfiling(); }));
  PipedProcess player = play(2);

  ASSERT_EQ(player.wait(), 0);
  // Two seconds of cycles of at most 2,048 frames.
  ASSERT_TRUE(eventually([&] { return valueOf(source->read(), kCycles) >= 46; }));

  const auto last = source->read();
  const auto cycles = static_cast<std::uint64_t>(valueOf(last, kCycles));
  const Seen busy = histogramOf(last, "demo-speakers/Speaker/PipeWire/busy time us");
  const Seen wait = histogramOf(last, "demo-speakers/Speaker/PipeWire/wait time us");
  EXPECT_GE(busy.hits, cycles * 9 / 10);
  EXPECT_LE(busy.hits, cycles);
  EXPECT_GE(wait.hits, cycles * 9 / 10);
  EXPECT_LT(busy.greatest, 10'000'000);
  EXPECT_THAT(linesOf(last, "demo-speakers/Speaker/PipeWire/state us"),
              ElementsAre(::testing::HasSubstr(" running:1:")));
}

TEST_F(PipeWireDriverSourceTest, TheProfilerIsBoundOnlyWhileReadingsAreHeld) {
  EXPECT_FALSE(source->isProfiling());
  auto first = source->read();
  auto second = source->read();
  ASSERT_TRUE(eventually([&] { return source->isProfiling(); }));

  first.reset();
  const PipedProcess player = play(20);
  ASSERT_TRUE(eventually([&] { return valueOf(source->read(), kCycles) > 0; }));
  EXPECT_TRUE(source->isProfiling());
  second.reset();

  EXPECT_TRUE(eventually([&] { return !source->isProfiling(); }));
}

TEST_F(PipeWireDriverSourceTest, ASourceHasItsChannelsInItsGroupAndLosesThemWhenItGoes) {
  constexpr std::string_view kSource = "demo-microphone/Rx/PipeWire/cycles";
  ASSERT_EQ(valueOf(source->read(), kSource), -1);

  {
    PipedProcess creator({"pw-cli"});
    creator.writeLine(
        "create-node adapter { factory.name=support.null-audio-sink node.name=demo-microphone "
        "media.class=Audio/Source/Virtual audio.position=[ MONO ] }");
    ASSERT_TRUE(eventually([&] { return valueOf(source->read(), kSource) == 0; }));
  }

  EXPECT_TRUE(eventually([&] { return valueOf(source->read(), kSource) == -1; }));
}

TEST_F(PipeWireDriverSourceTest, AServerThatAppearsWhileAReadingIsHeldIsFound) {
  constexpr std::string_view kConnections = "pipewire/Speaker/PipeWire/connections";
  const auto socket = audio->directory() / "run" / "pipewire-0";
  const auto elsewhere = audio->directory() / "socket";
  std::filesystem::rename(socket, elsewhere);
  PipeWireDriverSource early(driversCategory(platform.log));
  early.open();
  const auto held = early.read();
  ASSERT_EQ(valueOf(held, kConnections), 0);

  std::filesystem::rename(elsewhere, socket);

  EXPECT_TRUE(eventually([&] { return valueOf(early.read(), kConnections) == 1; }));
  EXPECT_TRUE(eventually([&] { return early.isProfiling(); }));
}

TEST_F(PipeWireDriverSourceTest, ARestartedServerIsFoundAgainAndItsNodesCountOn) {
  const auto held = source->read();
  {
    PipedProcess player = play(0.5);
    ASSERT_EQ(player.wait(), 0);
  }
  ASSERT_TRUE(eventually([&] { return valueOf(source->read(), kCycles) > 0; }));
  const auto before = valueOf(source->read(), kCycles);

  ASSERT_TRUE(audio->restart());

  const auto isBack = [&] {
    return valueOf(source->read(), "pipewire/Speaker/PipeWire/connections") == 2 &&
           valueOf(source->read(), kCycles) >= before;
  };
  EXPECT_TRUE(eventually(isBack));
  EXPECT_TRUE(eventually([&] { return source->isProfiling(); }));
}

}  // namespace
}  // namespace halvox::platform::linux_
