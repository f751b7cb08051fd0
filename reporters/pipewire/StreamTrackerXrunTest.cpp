#include <chrono>
#include <string>
#include <vector>

#include "reporters/pipewire/StreamTrackerFixture.h"

// What the tracker reports about cycles that a stream missed.

namespace halvox::pipewire_reporter {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr GlobalID kOther = 21;
constexpr std::uint64_t kOtherSerial = 56;

class StreamTrackerXrunTest : public StreamTrackerFixture {
 protected:
  using Milliseconds = std::chrono::milliseconds;

  StreamTrackerXrunTest() {
    addStream("Stream/Output/Audio", {{"node.name", "music-out"}, {"application.name", "Player"}});
    tracker.streamRunningChanged(kStream, true);
    client.forget();
  }
  // Adds a second stream, of another program, and forgets the operations that this caused.
  void runOther() {
    tracker.nodeAdded(
        {.id = kOther,
         .serial = kOtherSerial,
         .mediaClass = "Stream/Output/Audio",
         .properties = {{"node.name", "browser-out"}, {"application.process.binary", "browser"}}});
    tracker.streamRunningChanged(kOther, true);
    client.forget();
  }
  // Returns a cycle of a quarter of a second that the speakers drove and that all of `nodes`
  // finished.
  static pipewire::ProfiledCycle finished(Milliseconds time, const std::vector<GlobalID>& nodes,
                                          std::uint32_t xruns = 0) {
    pipewire::ProfiledCycle cycle{.time = time,
                                  .length = XrunMeter::Seconds(0.25),
                                  .quantum = 12000,
                                  .rate = 48000,
                                  .driverXruns = xruns,
                                  .driver = pipewire::ProfiledNode{.id = kSpeakers},
                                  .driverName = "speakers"};
    for (const GlobalID id : nodes) {
      cycle.followers.push_back({.id = id});
    }
    return cycle;
  }
  // The same, but these nodes did not finish it.
  static pipewire::ProfiledCycle unfinished(Milliseconds time, const std::vector<GlobalID>& late,
                                            const std::vector<GlobalID>& others = {}) {
    pipewire::ProfiledCycle cycle = finished(time, others);
    for (const GlobalID id : late) {
      cycle.followers.push_back({.id = id});
      cycle.late.push_back({.id = id});
    }
    return cycle;
  }
  // Ends a cycle that these nodes missed.
  void cycle(Milliseconds time, const std::vector<GlobalID>& late,
             const std::vector<GlobalID>& others = {}) {
    tracker.cycleEnded(unfinished(time, late, others));
  }
  [[nodiscard]] double sentSilence() const {
    return client.last("playback-issue").find(kSilenceKey)->toDouble();
  }
  // Returns the last report of a stream; empty if there was none.
  [[nodiscard]] platform::Dictionary reportOf(std::uint64_t serial) const {
    platform::Dictionary report;
    for (const auto& call : client.calls()) {
      if (call.operation == "playback-issue" &&
          call.dictionary.find(kSerialKey)->toUInt64() == serial) {
        report = call.dictionary;
      }
    }
    return report;
  }
  // Returns the text under a key of the last report of a stream; empty if there is none.
  [[nodiscard]] std::string textOf(std::uint64_t serial, const char* key) const {
    const auto report = reportOf(serial);
    const platform::Value* value = report.find(key);
    return value == nullptr ? "" : std::string(value->string());
  }
  // Returns the sum of the missed cycles in all reports of a stream.
  [[nodiscard]] std::int64_t missedBy(std::uint64_t serial) const {
    std::int64_t sum = 0;
    for (const auto& call : client.calls()) {
      if (call.operation == "playback-issue" &&
          call.dictionary.find(kSerialKey)->toUInt64() == serial) {
        sum += call.dictionary.find(kMissedCyclesKey)->toInt64();
      }
    }
    return sum;
  }
};

TEST_F(StreamTrackerXrunTest, AMissedCycleIsReportedWithItsNodeApplicationAndLength) {
  cycle(Milliseconds(1000), {kStream});

  EXPECT_THAT(client.operations(), ElementsAre("playback-issue"));
  EXPECT_EQ(client.last("playback-issue"), (platform::Dictionary{{kIssueTypeKey, "xrun"},
                                                                 {kNodeKey, "music-out"},
                                                                 {kIssueClientKey, "Player"},
                                                                 {kSilenceKey, 0.25},
                                                                 {"xrun_milliseconds", 250.0},
                                                                 {"missed_cycles", 1},
                                                                 {"quantum", 12000},
                                                                 {"rate", 48000},
                                                                 {"device_node_name", "speakers"},
                                                                 {"late_node", "music-out"},
                                                                 {"late_object_serial", kSerial},
                                                                 {"late_process", "player"},
                                                                 {"xrun_role", "culprit"},
                                                                 {"xrun_report", 1},
                                                                 {kSerialKey, kSerial}}));
}

TEST_F(StreamTrackerXrunTest, AStreamThatSufferedNamesTheOneThatWasLate) {
  runOther();

  cycle(Milliseconds(1000), {kOther}, {kStream});

  EXPECT_EQ(textOf(kOtherSerial, kXrunRoleKey), "culprit");
  EXPECT_EQ(textOf(kSerial, kXrunRoleKey), "victim");
  EXPECT_EQ(textOf(kSerial, kNodeKey), "music-out");
  EXPECT_EQ(textOf(kSerial, kLateNodeKey), "browser-out");
  EXPECT_EQ(textOf(kSerial, kLateProcessKey), "browser");
  EXPECT_EQ(reportOf(kSerial).find(kLateSerialKey)->toUInt64(), kOtherSerial);
  EXPECT_EQ(reportOf(kSerial).find(kXrunMillisecondsKey)->toDouble(), 250);
}

TEST_F(StreamTrackerXrunTest, AStreamThatWaitsForTheLateOneSuffersToo) {
  runOther();
  auto missed = unfinished(Milliseconds(1000), {kOther});
  missed.waiting = {kStream};

  tracker.cycleEnded(missed);

  EXPECT_EQ(textOf(kSerial, kXrunRoleKey), "victim");
}

TEST_F(StreamTrackerXrunTest, AnXrunOfTheDeviceIsSharedByAllThatRanOnIt) {
  runOther();
  tracker.cycleEnded(finished(Milliseconds(1000), {kStream, kOther}, 7));
  EXPECT_THAT(client.operations(), IsEmpty());

  tracker.cycleEnded(finished(Milliseconds(1250), {kStream, kOther}, 9));

  for (const auto serial : {kSerial, kOtherSerial}) {
    EXPECT_EQ(textOf(serial, kXrunRoleKey), "device");
    EXPECT_EQ(textOf(serial, kLateNodeKey), "speakers");
    EXPECT_EQ(reportOf(serial).find(kLateSerialKey)->toUInt64(), kSpeakers);
    EXPECT_FALSE(reportOf(serial).contains(kLateProcessKey));
    EXPECT_EQ(missedBy(serial), 2);
    EXPECT_EQ(reportOf(serial).find(kXrunMillisecondsKey)->toDouble(), 500);
  }
}

TEST_F(StreamTrackerXrunTest, WithoutFollowersTheLinkedStreamsLoseWithoutARole) {
  runOther();
  tracker.linkAdded(1, {.output = kStream, .input = kSpeakers});
  tracker.linkAdded(2, {.output = kOther, .input = kHeadphones});
  client.forget();
  tracker.cycleEnded(finished(Milliseconds(1000), {}, 7));

  tracker.cycleEnded(finished(Milliseconds(1250), {}, 8));

  EXPECT_THAT(client.operations(), ElementsAre("playback-issue"));
  EXPECT_EQ(missedBy(kSerial), 1);
  for (const char* key : {kXrunRoleKey, kLateNodeKey, kLateSerialKey, kLateProcessKey}) {
    EXPECT_FALSE(reportOf(kSerial).contains(key)) << key;
  }
  EXPECT_EQ(textOf(kSerial, kXrunDeviceKey), "speakers");
}

TEST_F(StreamTrackerXrunTest, TheSharesOfOneCulpritAndTwoVictimsAreWhatTheDriverCounted) {
  constexpr GlobalID kThird = 22;
  constexpr std::uint64_t kThirdSerial = 57;
  tracker.nodeAdded({.id = kThird,
                     .serial = kThirdSerial,
                     .mediaClass = "Stream/Output/Audio",
                     .properties = {}});
  tracker.streamRunningChanged(kThird, true);
  runOther();
  std::uint32_t xruns = 40;
  tracker.cycleEnded(finished(Milliseconds(750), {kStream, kOther, kThird}, xruns));

  for (int time = 1000; time < 4000; time += 250) {
    auto missed = unfinished(Milliseconds(time), {kOther}, {kStream, kThird});
    missed.driverXruns = ++xruns;
    tracker.cycleEnded(missed);
  }
  tracker.cycleEnded(finished(Milliseconds(5000), {kStream, kOther, kThird}, xruns));

  EXPECT_EQ(missedBy(kOtherSerial), xruns - 40);
  EXPECT_EQ(missedBy(kSerial), xruns - 40);
  EXPECT_EQ(missedBy(kThirdSerial), xruns - 40);
  EXPECT_EQ(textOf(kOtherSerial, kXrunRoleKey), "culprit");
  EXPECT_EQ(textOf(kSerial, kXrunRoleKey), "victim");
  EXPECT_EQ(textOf(kThirdSerial, kXrunRoleKey), "victim");
}

TEST_F(StreamTrackerXrunTest, ACulpritThatVanishedIsStillNamed) {
  runOther();
  cycle(Milliseconds(1000), {kOther}, {kStream});
  tracker.nodeRemoved(kOther);
  client.forget();
  auto late = unfinished(Milliseconds(2000), {kOther}, {kStream});
  late.late.front().name = "browser-out";

  tracker.cycleEnded(late);

  EXPECT_EQ(textOf(kSerial, kLateNodeKey), "browser-out");
  EXPECT_EQ(textOf(kSerial, kLateProcessKey), "browser");
  EXPECT_EQ(reportOf(kSerial).find(kLateSerialKey)->toUInt64(), kOtherSerial);
}

TEST_F(StreamTrackerXrunTest, OfAnUnknownCulpritTheNameOfTheProfilerIsReported) {
  auto late = unfinished(Milliseconds(1000), {999}, {kStream});
  late.late.front().name = "filter";

  tracker.cycleEnded(late);

  EXPECT_EQ(textOf(kSerial, kXrunRoleKey), "victim");
  EXPECT_EQ(textOf(kSerial, kLateNodeKey), "filter");
  EXPECT_FALSE(reportOf(kSerial).contains(kLateSerialKey));
  EXPECT_FALSE(reportOf(kSerial).contains(kLateProcessKey));
}

TEST_F(StreamTrackerXrunTest, AVictimThatJoinedInTheMiddleHasLostOnlyWhatCameAfter) {
  cycle(Milliseconds(1000), {kStream});
  cycle(Milliseconds(1250), {kStream});
  runOther();

  cycle(Milliseconds(1500), {kStream}, {kOther});
  cycle(Milliseconds(1750), {kStream}, {kOther});
  cycle(Milliseconds(2500), {kStream}, {kOther});

  EXPECT_EQ(missedBy(kOtherSerial), 3);
  EXPECT_EQ(textOf(kOtherSerial, kXrunRoleKey), "victim");
}

TEST_F(StreamTrackerXrunTest, AReportWithSeveralCulpritsNamesTheOneThatWasLateMostOften) {
  runOther();
  cycle(Milliseconds(1000), {kStream}, {kOther});
  client.forget();

  cycle(Milliseconds(1250), {kStream}, {kOther});
  cycle(Milliseconds(1500), {kOther}, {kStream});
  cycle(Milliseconds(1750), {kOther}, {kStream});
  cycle(Milliseconds(2000), {kOther, kStream});

  EXPECT_EQ(textOf(kSerial, kXrunRoleKey), "victim");
  EXPECT_EQ(textOf(kSerial, kLateNodeKey), "browser-out");
  EXPECT_EQ(textOf(kOtherSerial, kXrunRoleKey), "culprit");
  EXPECT_EQ(missedBy(kSerial), 4);
}

TEST_F(StreamTrackerXrunTest, ACycleThatIsReportedTwiceCountsOnce) {
  cycle(Milliseconds(1000), {kStream});
  cycle(Milliseconds(1000), {kStream});
  tracker.nodeRemoved(kStream);

  EXPECT_EQ(missedBy(kSerial), 1);
}

TEST_F(StreamTrackerXrunTest, ANewQuantumIsReportedWithTheNextLoss) {
  cycle(Milliseconds(1000), {kStream});
  auto shorter = unfinished(Milliseconds(2000), {kStream});
  shorter.length = XrunMeter::Seconds(0.0078125);
  shorter.quantum = 750;
  shorter.rate = 96000;

  tracker.cycleEnded(shorter);

  const auto report = reportOf(kSerial);
  EXPECT_EQ(report.find(kQuantumKey)->toInt64(), 750);
  EXPECT_EQ(report.find(kRateKey)->toInt64(), 96000);
  EXPECT_EQ(report.find(kXrunMillisecondsKey)->toDouble(), 7.8125);
}

TEST_F(StreamTrackerXrunTest, EqualReportsAreNumbered) {
  cycle(Milliseconds(1000), {kStream});
  cycle(Milliseconds(2000), {kStream});

  EXPECT_EQ(reportOf(kSerial).find(kXrunReportKey)->toInt64(), 2);
}

TEST_F(StreamTrackerXrunTest, XrunsWhileNothingWasProfiledAreNotLost) {
  tracker.cycleEnded(finished(Milliseconds(1000), {kStream}, 7));

  tracker.profilingBegan();
  tracker.cycleEnded(finished(Milliseconds(9000), {kStream}, 70));

  EXPECT_THAT(client.operations(), IsEmpty());
}

TEST_F(StreamTrackerXrunTest, TheProcessOfALateNodeIsKnownWhenItsClientIs) {
  tracker.nodeAdded({.id = 50,
                     .serial = 150,
                     .mediaClass = "Audio/Filter",
                     .properties = {{"node.name", "filter"}}});
  tracker.nodeAdded(
      {.id = 50,
       .serial = 150,
       .mediaClass = "Audio/Filter",
       .properties = {{"node.name", "filter"}, {"application.process.binary", "filterd"}}});

  cycle(Milliseconds(1000), {50}, {kStream});

  EXPECT_EQ(textOf(kSerial, kLateProcessKey), "filterd");
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
