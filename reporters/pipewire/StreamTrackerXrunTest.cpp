#include <chrono>
#include <vector>

#include "reporters/pipewire/StreamTrackerFixture.h"

// What the tracker reports about cycles that a stream missed.

namespace halvox::pipewire_reporter {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class StreamTrackerXrunTest : public StreamTrackerFixture {
 protected:
  using Milliseconds = std::chrono::milliseconds;

  StreamTrackerXrunTest() {
    addStream("Stream/Output/Audio", {{"node.name", "music-out"}, {"application.name", "Player"}});
    tracker.streamRunningChanged(kStream, true);
    client.forget();
  }
  // Ends a cycle of a quarter of a second that these nodes missed.
  void cycle(Milliseconds time, const std::vector<GlobalID>& late) {
    tracker.cycleEnded(time, XrunMeter::Seconds(0.25), late);
  }
  [[nodiscard]] double sentSilence() const {
    return client.last("playback-issue").find(kSilenceKey)->toDouble();
  }
};

TEST_F(StreamTrackerXrunTest, AMissedCycleIsReportedWithItsNodeApplicationAndLength) {
  cycle(Milliseconds(1000), {kStream});

  EXPECT_THAT(client.operations(), ElementsAre("playback-issue"));
  EXPECT_EQ(client.last("playback-issue"), (platform::Dictionary{{kIssueTypeKey, "xrun"},
                                                                 {kNodeKey, "music-out"},
                                                                 {kIssueClientKey, "Player"},
                                                                 {kSilenceKey, 0.25},
                                                                 {kSerialKey, kSerial}}));
}

TEST_F(StreamTrackerXrunTest, CyclesThatOtherNodesMissedAreNotReported) {
  cycle(Milliseconds(1000), {kSpeakers, 999});
  cycle(Milliseconds(2000), {});

  EXPECT_THAT(client.operations(), IsEmpty());
}

TEST_F(StreamTrackerXrunTest, FurtherOnesAreAddedUpToOneReportASecond) {
  for (int time = 1000; time < 2000; time += 250) {
    cycle(Milliseconds(time), {kStream});
  }
  EXPECT_THAT(client.operations(), ElementsAre("playback-issue"));

  cycle(Milliseconds(2000), {});  // no node missed this cycle, but earlier losses are now due

  EXPECT_THAT(client.operations(), ElementsAre("playback-issue", "playback-issue"));
  EXPECT_EQ(sentSilence(), 0.75);
}

TEST_F(StreamTrackerXrunTest, WhatWasHeldBackIsReportedBeforeTheRunEnds) {
  cycle(Milliseconds(1000), {kStream});
  cycle(Milliseconds(1250), {kStream});
  client.forget();

  tracker.nodeRemoved(kStream);

  EXPECT_THAT(client.operations(),
              ElementsAre("playback-issue", "playback-stop", "stop", "destroy"));
  EXPECT_EQ(sentSilence(), 0.25);
}

TEST_F(StreamTrackerXrunTest, AStreamThatDoesNotRunMissesNothing) {
  tracker.streamRunningChanged(kStream, false);
  client.forget();

  cycle(Milliseconds(1000), {kStream});
  tracker.nodeRemoved(kStream);

  EXPECT_THAT(client.operations(), ElementsAre("stop", "destroy"));
}

TEST_F(StreamTrackerXrunTest, RecordingStreamsReportUnderTheirCategory) {
  tracker.nodeRemoved(kStream);
  addStream("Stream/Input/Audio", {{"node.name", "in"}});
  tracker.streamRunningChanged(kStream, true);
  client.forget();

  cycle(Milliseconds(1000), {kStream});

  EXPECT_THAT(client.operations(), ElementsAre("record-issue"));
}

}  // namespace
}  // namespace halvox::pipewire_reporter
