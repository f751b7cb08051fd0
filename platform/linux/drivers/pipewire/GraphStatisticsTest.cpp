#include "platform/linux/drivers/pipewire/GraphStatistics.h"

#include <algorithm>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/drivers/testing/MadeReadings.h"

namespace halvox::platform::linux_ {
namespace {

using namespace std::chrono_literals;
using pipewire::ProfiledCycle;
using pipewire::ProfiledNode;
using ::testing::Contains;
using testing::describe;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::IsEmpty;
using ::testing::StartsWith;

class GraphStatisticsTest : public ::testing::Test {
 protected:
  // Returns the channels as lines, but only the lines that begin with `start`.
  std::vector<std::string> read(std::string_view start = "") {
    graph.addTo(maker, now);
    std::vector<std::string> lines = describe(testing::samplesOf(maker.finish()));
    std::erase_if(lines, [start](const std::string& line) { return !line.starts_with(start); });
    return lines;
  }
  // A cycle of driver 30 with its follower 40.
  ProfiledCycle cycle(std::chrono::nanoseconds time) const {
    return {.time = time,
            .length = 10ms,
            .driverXruns = 5,
            .driver = ProfiledNode{.id = 30, .wait = 60us, .busy = 300us},
            .followers = {{.id = 40, .wait = 10us, .busy = 20us}}};
  }

  GraphStatistics graph;
  ReadingMaker maker;
  GraphStatistics::Time now{1000h};
};

TEST_F(GraphStatisticsTest, OnlyTheConnectionsAreThereWithoutAServer) {
  EXPECT_THAT(read(), ElementsAre("pipewire/Speaker/PipeWire/connections  = 0",
                                  "pipewire/Rx/PipeWire/connections  = 0"));

  graph.serverReached();
  graph.serverLost(now);
  graph.serverReached();

  EXPECT_THAT(read(), ElementsAre("pipewire/Speaker/PipeWire/connections  = 2",
                                  "pipewire/Rx/PipeWire/connections  = 2"));
}

TEST_F(GraphStatisticsTest, SinksAndSourcesHaveChannelsAndOtherNodesHaveNone) {
  EXPECT_TRUE(graph.nodeAdded(30, "Audio/Sink", "speakers"));
  EXPECT_TRUE(graph.nodeAdded(31, "Audio/Source", "microphone"));
  EXPECT_FALSE(graph.nodeAdded(32, "Stream/Output/Audio", "player"));
  EXPECT_FALSE(graph.nodeAdded(33, "Video/Source", "camera"));

  EXPECT_THAT(read("speakers"), ElementsAre("speakers/Speaker/PipeWire/cycles  = 0",
                                            "speakers/Speaker/PipeWire/xruns  = 0",
                                            StartsWith("speakers/Speaker/PipeWire/busy time us ="),
                                            StartsWith("speakers/Speaker/PipeWire/wait time us ="),
                                            "speakers/Speaker/PipeWire/state us ="));
  EXPECT_THAT(read("microphone"), Contains("microphone/Rx/PipeWire/cycles  = 0"));
  EXPECT_EQ(read().size(), 12U);
}

TEST_F(GraphStatisticsTest, ACycleCountsForItsDriverAndForEachFollower) {
  graph.nodeAdded(30, "Audio/Sink", "speakers");
  graph.nodeAdded(40, "Audio/Source", "microphone");

  graph.cycleEnded(cycle(1s));
  graph.cycleEnded(cycle(2s));

  EXPECT_THAT(read("speakers"), Contains(EndsWith("/cycles  = 2")));
  EXPECT_THAT(read("speakers/Speaker/PipeWire/busy"),
              ElementsAre(::testing::HasSubstr(" 200-500:2 ")));
  EXPECT_THAT(read("speakers/Speaker/PipeWire/busy"), ElementsAre(EndsWith("min 200 max 500")));
  EXPECT_THAT(read("speakers/Speaker/PipeWire/wait"), ElementsAre(EndsWith("min 50 max 100")));
  EXPECT_THAT(read("microphone"), Contains(EndsWith("/cycles  = 2")));
  EXPECT_THAT(read("microphone/Rx/PipeWire/wait"), ElementsAre(EndsWith("min 0 max 50")));
}

TEST_F(GraphStatisticsTest, TheClockIsThatOfTheLastCycleAndInAGroupOfItsOwn) {
  graph.nodeAdded(30, "Audio/Sink", "speakers");
  graph.nodeAdded(40, "Audio/Source", "microphone");
  ProfiledCycle known = cycle(1s);
  known.quantum = 1024;
  known.rate = 44'100;
  graph.cycleEnded(known);
  known.time = 2s;
  known.quantum = 256;
  known.rate = 48'000;
  graph.cycleEnded(known);
  graph.cycleEnded(cycle(3s));

  for (const std::string node : {"speakers/Clock/Speaker", "microphone/Clock/Rx"}) {
    EXPECT_THAT(read(node), ElementsAre(node + "/quantum frames = 256", node + "/rate Hz = 48000"));
  }
}

TEST_F(GraphStatisticsTest, ACycleThatIsReportedTwiceCountsOnceWithItsXruns) {
  graph.nodeAdded(30, "Audio/Sink", "speakers");
  graph.nodeAdded(40, "Audio/Sink", "more");
  ProfiledCycle missed = cycle(2s);
  missed.late = {{.id = 40}};

  graph.cycleEnded(cycle(1s));
  graph.cycleEnded(missed);
  missed.driverXruns = 6;
  graph.cycleEnded(missed);

  EXPECT_THAT(read("speakers"), Contains(EndsWith("/cycles  = 2")));
  EXPECT_THAT(read("speakers"), Contains(EndsWith("/xruns  = 1")));
  EXPECT_THAT(read("more"), Contains(EndsWith("/cycles  = 2")));
  EXPECT_THAT(read("more"), Contains(EndsWith("/xruns  = 1")));
}

TEST_F(GraphStatisticsTest, XrunsFromBeforeTheMeasurementDoNotCount) {
  graph.nodeAdded(30, "Audio/Sink", "speakers");
  graph.cycleEnded(cycle(1s));
  ProfiledCycle later = cycle(9s);
  later.driverXruns = 50;

  graph.profilingBegan();
  graph.cycleEnded(later);

  EXPECT_THAT(read("speakers"), Contains(EndsWith("/xruns  = 0")));
  EXPECT_THAT(read("speakers"), Contains(EndsWith("/cycles  = 2")));
}

TEST_F(GraphStatisticsTest, ACountOfXrunsThatWentBackCountsNone) {
  graph.nodeAdded(30, "Audio/Sink", "speakers");
  graph.cycleEnded(cycle(1s));
  ProfiledCycle restarted = cycle(2s);
  restarted.driverXruns = 1;

  graph.cycleEnded(restarted);

  EXPECT_THAT(read("speakers"), Contains(EndsWith("/xruns  = 0")));
}

TEST_F(GraphStatisticsTest, CyclesOfNodesThatAreNeitherSinkNorSourceAreIgnored) {
  graph.nodeAdded(40, "Audio/Sink", "speakers");

  graph.cycleEnded(cycle(1s));
  graph.cycleEnded({.time = 2s, .length = 10ms, .followers = {{.id = 40}}});

  EXPECT_THAT(read("speakers"), Contains(EndsWith("/cycles  = 1")));
}

TEST_F(GraphStatisticsTest, StatesGatherTimeUntilTheReading) {
  graph.nodeAdded(30, "Audio/Sink", "speakers");
  graph.nodeStateChanged(30, NodeState::kIdle, now);
  graph.nodeStateChanged(30, NodeState::kRunning, now + 1s);
  now += 4s;

  EXPECT_THAT(read("speakers/Speaker/PipeWire/state"),
              ElementsAre("speakers/Speaker/PipeWire/state us = running:1:3000000 idle:0:1000000"));
}

TEST_F(GraphStatisticsTest, TheSecondNodeOfANameHasItsNumberAppended) {
  graph.nodeAdded(30, "Audio/Sink", "twin");
  graph.nodeAdded(31, "Audio/Sink", "twin");
  graph.nodeAdded(32, "Audio/Source", "twin");

  EXPECT_THAT(read("twin/Speaker"), Contains("twin/Speaker/PipeWire/cycles  = 0"));
  EXPECT_THAT(read("twin#31"), Contains("twin#31/Speaker/PipeWire/cycles  = 0"));
  EXPECT_THAT(read("twin/Rx"), Contains("twin/Rx/PipeWire/cycles  = 0"));
}

// The keys of a report contain no blanks and no underscores, and only the part of a driver's name
// before its first "<".
TEST_F(GraphStatisticsTest, NamesThatAReportCannotDistinguishHaveTheirNumbersToo) {
  graph.nodeAdded(30, "Audio/Sink", "usb_out");
  graph.nodeAdded(31, "Audio/Sink", "usb out");
  graph.nodeAdded(32, "Audio/Sink", "amp<1>");
  graph.nodeAdded(33, "Audio/Sink", "amp<2>");

  EXPECT_THAT(read("usb out#31/"), Contains(EndsWith("/cycles  = 0")));
  EXPECT_THAT(read("amp#33<2>/"), Contains(EndsWith("/cycles  = 0")));
}

TEST_F(GraphStatisticsTest, AnAppendedNumberDoesNotMakeAnotherNodesName) {
  graph.nodeAdded(30, "Audio/Sink", "twin#32");
  graph.nodeAdded(31, "Audio/Sink", "twin");
  graph.nodeAdded(32, "Audio/Sink", "twin");

  EXPECT_THAT(read("twin#32#32/"), Contains(EndsWith("/cycles  = 0")));
}

TEST_F(GraphStatisticsTest, TwoNodesOfOneNameCountApart) {
  graph.nodeAdded(30, "Audio/Sink", "twin");
  graph.nodeAdded(40, "Audio/Sink", "twin");
  graph.cycleEnded({.time = 1s, .length = 10ms, .driver = ProfiledNode{.id = 30}});

  EXPECT_THAT(read("twin/"), Contains(EndsWith("/cycles  = 1")));
  EXPECT_THAT(read("twin#40/"), Contains(EndsWith("/cycles  = 0")));
}

TEST_F(GraphStatisticsTest, ANodeThatGoesTakesItsChannelsAndItsSuccessorCountsOnWithThem) {
  graph.nodeAdded(30, "Audio/Sink", "speakers");
  graph.cycleEnded(cycle(1s));
  graph.addTo(maker, now);
  const auto before = maker.finish();
  graph.nodeRemoved(30, now);
  EXPECT_THAT(read("speakers"), IsEmpty());

  graph.nodeAdded(31, "Audio/Sink", "speakers");
  EXPECT_THAT(read("speakers"), Contains(EndsWith("/cycles  = 1")));

  graph.addTo(maker, now);
  const auto after = maker.finish();
  ASSERT_EQ(after->channels->size(), before->channels->size());
  for (std::size_t channel = 0; channel < before->channels->size(); ++channel) {
    EXPECT_EQ((*after->channels)[channel], (*before->channels)[channel]);
  }
}

TEST_F(GraphStatisticsTest, ANodeOfAnotherGroupIsNoSuccessor) {
  graph.nodeAdded(30, "Audio/Sink", "both");
  graph.cycleEnded(cycle(1s));
  graph.nodeRemoved(30, now);

  graph.nodeAdded(31, "Audio/Source", "both");

  EXPECT_THAT(read("both"), Contains(EndsWith("/cycles  = 0")));
}

TEST_F(GraphStatisticsTest, ANodeThatVanishedIsInNoState) {
  graph.nodeAdded(30, "Audio/Sink", "speakers");
  graph.nodeStateChanged(30, NodeState::kIdle, now);
  now += 2s;
  graph.serverLost(now);
  now += 7s;

  graph.nodeAdded(31, "Audio/Sink", "speakers");
  graph.nodeStateChanged(31, NodeState::kIdle, now);
  now += 3s;

  EXPECT_THAT(read("speakers/Speaker/PipeWire/state"),
              ElementsAre("speakers/Speaker/PipeWire/state us = idle:0:5000000"));
}

TEST_F(GraphStatisticsTest, VanishedNodesAreKeptUpToTheLimit) {
  for (std::uint32_t id = 0; id <= GraphStatistics::kMostNodes; ++id) {
    ASSERT_TRUE(graph.nodeAdded(id, "Audio/Sink", "node" + std::to_string(id)));
    graph.cycleEnded({.time = 1s, .length = 10ms, .driver = ProfiledNode{.id = id}});
    graph.nodeRemoved(id, now);
  }

  graph.nodeAdded(1000, "Audio/Sink", "node0");
  graph.nodeAdded(1001, "Audio/Sink", "node1");

  EXPECT_THAT(read("node0"), Contains(EndsWith("/cycles  = 0")));
  EXPECT_THAT(read("node1/"), Contains(EndsWith("/cycles  = 1")));
}

TEST_F(GraphStatisticsTest, AllNodesGoWithTheServer) {
  graph.nodeAdded(30, "Audio/Sink", "speakers");

  graph.serverLost(now);

  EXPECT_THAT(read("speakers"), IsEmpty());
}

TEST_F(GraphStatisticsTest, ReadingsShareTheirChannelsAsLongAsTheNodesStay) {
  graph.nodeAdded(30, "Audio/Sink", "speakers");
  graph.addTo(maker, now);
  const auto first = maker.finish();
  graph.cycleEnded(cycle(1s));
  graph.addTo(maker, now);

  EXPECT_EQ(maker.finish()->channels, first->channels);
}

TEST_F(GraphStatisticsTest, NamesAreCutAndCleaned) {
  graph.nodeAdded(30, "Audio/Sink", std::string(127, 'n') + "\xc3\xa9");
  graph.nodeAdded(31, "Audio/Sink", "\xff!");

  EXPECT_THAT(read("nnn"), Contains(std::string(127, 'n') + "/Speaker/PipeWire/cycles  = 0"));
  EXPECT_THAT(read("\xef\xbf\xbd!"), Contains(EndsWith("cycles  = 0")));
}

TEST_F(GraphStatisticsTest, NodesBeyondTheLimitAreIgnored) {
  for (std::uint32_t id = 0; id < GraphStatistics::kMostNodes; ++id) {
    ASSERT_TRUE(graph.nodeAdded(id, "Audio/Sink", std::to_string(id)));
  }

  EXPECT_FALSE(graph.nodeAdded(5000, "Audio/Sink", "one too many"));
}

}  // namespace
}  // namespace halvox::platform::linux_
