#include "analysis/StreamBuilder.h"

#include "analysis/StreamBuilderFixture.h"
#include <malloc.h>

namespace halvox::analysis {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class StreamBuilderTest : public StreamBuilderFixture {};

TEST_F(StreamBuilderTest, TellsTheStoryOfAStream) {
  at(0).message(stream(), "Session_Setup", "Setup", R"("session_selected_format":"S16LE")");
  at(0).message(stream(), "RouteChange", "State",
                R"("active_devices":"Speakers","device_node_names":["hw0"])");
  start(1, stream());
  volume(1, stream(), 0.8, true);
  volume(3, stream(), 0.3, true);
  xrun(4, stream(), R"("xrun_milliseconds":21.5,"missed_cycles":2,"xrun_role":"culprit")");
  volume(6, stream(), 0.3, false);
  stop(6, stream());
  records.summary(stream());

  const StreamStory& made = story();
  EXPECT_EQ(made.id, 1);
  EXPECT_EQ(made.sessionID, 5044);
  EXPECT_EQ(made.objectSerial, 44);
  EXPECT_EQ(made.application, "player");
  EXPECT_EQ(made.service, "longformaudio");
  EXPECT_EQ(made.direction, StreamDirection::kPlayback);
  EXPECT_EQ(made.started, kBegin);
  EXPECT_EQ(made.ended, kBegin + 6);
  EXPECT_EQ(made.end, StreamEnd::kStopped);
  EXPECT_DOUBLE_EQ(made.ranSeconds, 5);
  ASSERT_THAT(made.volumes, SizeIs(2));
  EXPECT_DOUBLE_EQ(made.volumes[0].seconds, 2);
  EXPECT_DOUBLE_EQ(made.volumes[1].seconds, 3);
  ASSERT_THAT(made.formats, SizeIs(1));
  EXPECT_EQ(made.formats[0].text, "S16LE");
  ASSERT_THAT(made.routes, SizeIs(1));
  EXPECT_EQ(made.routes[0].names, "hw0");
  EXPECT_EQ(made.xruns.reports, 1U);
  EXPECT_EQ(made.xruns.missedCycles, 2U);
  EXPECT_DOUBLE_EQ(made.xruns.milliseconds, 21.5);
  EXPECT_EQ(made.xruns.asCulprit, 1U);
  EXPECT_EQ(made.messages, 8U);
}

TEST_F(StreamBuilderTest, CountsWhatTheServiceReportsAtTheEndToNoStream) {
  start(0, stream());
  stop(1, stream());
  at(1).message(stream(), "Volume", "Summary", R"("RQSessionVolume":0.5,"play_seconds":9)");
  records.event(stream(), "IOReporting", "Simple", "\"cycles\":5");
  records.summary(stream());

  EXPECT_EQ(story().messages, 2U);
  EXPECT_THAT(story().volumes, IsEmpty());
}

TEST_F(StreamBuilderTest, AStreamWithoutAnEndStillRunsUntilNow) {
  start(0, stream());
  volume(0, stream(), 0.5, true);

  build({.now = kBegin + 60});
  ASSERT_THAT(stories, SizeIs(1));
  EXPECT_EQ(stories[0].end, StreamEnd::kStillRunning);
  EXPECT_DOUBLE_EQ(stories[0].ranSeconds, 60);
  EXPECT_DOUBLE_EQ(stories[0].volumes[0].seconds, 60);
}

TEST_F(StreamBuilderTest, AStreamWithoutAnEndRunsUntilTheLastRecordIfNothingElseIsKnown) {
  start(0, stream());
  at(5).message(session(), "Session_Playback", "Start");

  build();
  EXPECT_DOUBLE_EQ(stories[0].ranSeconds, 5);
}

TEST_F(StreamBuilderTest, AStreamThatRunsWhenNoServiceDoesHasLostIt) {
  start(0, stream(1));
  start(1, stream(2));
  stop(2, stream(2));

  build({.serviceIsGone = true});
  ASSERT_THAT(stories, SizeIs(2));
  EXPECT_EQ(stories[0].end, StreamEnd::kServiceGone);
  EXPECT_EQ(stories[1].end, StreamEnd::kStopped);
}

// The service of the series started 100 seconds after the machine and 100 before kBegin.
TEST_F(StreamBuilderTest, AStreamLostItsServiceIfAnotherProcessRunsNow) {
  start(0, stream());
  at(5).message(session(), "Session_Playback", "Start");

  build({.now = kBegin + 60,
         .service = StreamBuilder::ServiceTimes{.stamp = kBegin + 60, .uptime = 40, .start = 220}});
  ASSERT_THAT(stories, SizeIs(2));
  EXPECT_EQ(stories[0].end, StreamEnd::kServiceGone);
  EXPECT_DOUBLE_EQ(stories[0].ranSeconds, 5);
}

TEST_F(StreamBuilderTest, AStreamStillRunsIfTheSameProcessDoes) {
  start(0, stream());

  build(
      {.now = kBegin + 60,
       .service = StreamBuilder::ServiceTimes{.stamp = kBegin + 60, .uptime = 160, .start = 100}});
  EXPECT_EQ(story().end, StreamEnd::kStillRunning);
  EXPECT_DOUBLE_EQ(story().ranSeconds, 60);
}

TEST_F(StreamBuilderTest, ARestartOfTheServiceEndsWhatRanAndBeginsAnotherStory) {
  start(0, stream());
  volume(0, stream(), 0.5, true);
  at(4).message(session(), "Session_Playback", "Start");
  at(10);
  records.restartService();
  volume(10, stream(), 0.5, true);
  volume(13, stream(), 0.5, false);
  stop(13, stream());
  records.summary(stream());

  build();
  ASSERT_THAT(stories, SizeIs(3));
  EXPECT_EQ(stories[0].end, StreamEnd::kServiceGone);
  // The service still ran at its last record, of another session.
  EXPECT_DOUBLE_EQ(stories[0].ranSeconds, 4);
  EXPECT_EQ(stories[2].objectSerial, 44);
  EXPECT_EQ(stories[2].end, StreamEnd::kStopped);
  EXPECT_DOUBLE_EQ(stories[2].ranSeconds, 3);
}

TEST_F(StreamBuilderTest, ARestartIsNoticedEvenIfBothProcessesWereYoung) {
  records.restartService();
  start(0, stream());
  at(1);
  records.restartService();
  volume(1, stream(), 0.5, true);

  build();
  ASSERT_THAT(stories, SizeIs(2));
  EXPECT_EQ(stories[0].end, StreamEnd::kServiceGone);
}

TEST_F(StreamBuilderTest, ARestartWithinAFractionOfASecondIsNoticed) {
  at(0);
  records.restartService();  // half a second before
  start(0, stream());
  at(0.6);
  records.restartService();
  volume(0.61, stream(), 0.5, true);

  build();
  EXPECT_THAT(stories, SizeIs(2));
}

TEST_F(StreamBuilderTest, AMessageDirectlyAfterTheStartOfTheServiceIsNotBeforeARestart) {
  records.restartService(0.01);
  start(0, stream());
  volume(1, stream(), 0.5, true);

  EXPECT_EQ(story().messages, 2U);
}

TEST_F(StreamBuilderTest, AClockThatIsSetIsNotARestart) {
  start(0, stream());
  for (const double step : {-3600.0, -1.0, 5.0, 3600.0}) {
    records.setClock(kBegin + step);
    records.message(stream(), "Volume", "State", "\"RQSessionVolume\":" + std::to_string(step));
    records.setClock(kBegin);
  }

  EXPECT_EQ(story().messages, 5U);
}

TEST_F(StreamBuilderTest, TwoStreamsOfOneProgramAreDistinguished) {
  start(0, stream(44));
  start(1, stream(51));
  volume(1, stream(44), 0.5, true);
  volume(1, stream(51), 0.8, true);
  volume(2, stream(44), 0.5, false);
  volume(4, stream(51), 0.8, false);
  stop(4, stream(44));
  stop(4, stream(51));

  build();
  ASSERT_THAT(stories, SizeIs(2));
  EXPECT_DOUBLE_EQ(stories[0].volumes[0].seconds, 1);
  EXPECT_DOUBLE_EQ(stories[1].volumes[0].seconds, 3);
}

TEST_F(StreamBuilderTest, SessionsOfOneProgramAreDistinguishedByTheLink) {
  start(0, session(7));
  start(1, session(8));
  stop(2, session(7));
  stop(5, session(8));
  records.summary(session(7));
  records.summary(session(8));

  build();
  ASSERT_THAT(stories, SizeIs(2));
  EXPECT_EQ(stories[0].sessionID, 7);
  EXPECT_DOUBLE_EQ(stories[0].ranSeconds, 2);
  EXPECT_DOUBLE_EQ(stories[1].ranSeconds, 4);
  EXPECT_EQ(stories[1].application, "player");
}

TEST_F(StreamBuilderTest, WithoutALinkAStreamIsKnownByItsSerial) {
  auto unlinked = stream();
  unlinked.sessionID.reset();
  start(0, unlinked);
  stop(3, unlinked);
  start(5, unlinked, 2);
  stop(6, unlinked, 2);

  EXPECT_DOUBLE_EQ(story().ranSeconds, 4);
  EXPECT_FALSE(story().sessionID.has_value());
}

TEST_F(StreamBuilderTest, WithoutALinkOtherSessionsAreKnownByTheirProgram) {
  auto unlinked = session();
  unlinked.sessionID.reset();
  start(0, unlinked);
  stop(3, unlinked);
  unlinked.service = "telephony";
  start(4, unlinked);
  unlinked.service = "standalone";  // of no session
  start(5, unlinked);

  build();
  ASSERT_THAT(stories, SizeIs(2));
  EXPECT_EQ(stories[0].service, "longformaudio");
  EXPECT_EQ(stories[1].service, "telephony");
}

TEST_F(StreamBuilderTest, AMessageThatTheLinkSkippedIsCounted) {
  start(0, session());
  xrun(1, session(), "\"xrun_milliseconds\":5");
  at(2).event(session(), "Session_Playback", "IssueDetector",
              R"("issue_type":"xrun","xrun_milliseconds":5)");
  records.summary(session());

  EXPECT_EQ(story().xruns.reports, 2U);
  EXPECT_DOUBLE_EQ(story().xruns.milliseconds, 10);
}

TEST_F(StreamBuilderTest, AMessageWithoutEventsIsTakenFromTheLink) {
  at(0).link(session(), "Session_Playback", "Start");
  at(3).link(session(), "Session_Playback", "Stop");
  records.summary(session());

  EXPECT_DOUBLE_EQ(story().ranSeconds, 3);
  EXPECT_EQ(story().application, "");
  EXPECT_EQ(story().service, "longformaudio");
}

TEST_F(StreamBuilderTest, AMessageOutsideASessionIsOfNoStream) {
  auto single = session();
  single.sessionID = -1;
  start(0, single);

  build();
  EXPECT_THAT(stories, IsEmpty());
}

TEST_F(StreamBuilderTest, ASessionThatIsStartedAgainIsAnotherStory) {
  for (const double begin : {0.0, 10.0}) {
    start(begin, session());
    stop(begin + 1, session());
    records.summary(session());
  }

  build();
  EXPECT_THAT(stories, SizeIs(2));
}

TEST_F(StreamBuilderTest, AMessageOfAClientThatLooksLikeASummaryEndsNoStory) {
  start(0, session());
  // Its events are not wanted, so that only the link recorded it.
  at(1).link(session(), "Undefined", "Unknown", R"("HV_Session_Summary_Event":"7")");
  stop(2, session());
  records.summary(session());

  EXPECT_EQ(story().end, StreamEnd::kStopped);
  EXPECT_DOUBLE_EQ(story().ranSeconds, 2);
}

TEST_F(StreamBuilderTest, ASummaryThatIsRecordedDuringTheNextRunEndsTheRunBeforeIt) {
  start(0, session());
  stop(1, session());
  at(2).event(session(), "Session_Playback", "Start", "\"run\":2");
  records.summary(session());
  records.link(session(), "Session_Playback", "Start", "\"run\":2");
  stop(5, session(), 2);
  records.summary(session());

  build();
  ASSERT_THAT(stories, SizeIs(2));
  EXPECT_DOUBLE_EQ(stories[0].ranSeconds, 1);
  EXPECT_DOUBLE_EQ(stories[1].ranSeconds, 3);
}

TEST_F(StreamBuilderTest, AClientThatDisconnectsWhileItRunsIsGone) {
  start(0, stream());
  volume(0, stream(), 0.5, true);
  at(4);
  records.summary(stream());
  records.clientGone("halvox-pipewire");

  EXPECT_EQ(story().end, StreamEnd::kClientGone);
  EXPECT_DOUBLE_EQ(story().ranSeconds, 4);
  EXPECT_DOUBLE_EQ(story().volumes[0].seconds, 4);
}

TEST_F(StreamBuilderTest, TheEndOfAConnectionMayBeRecordedBeforeItsSessions) {
  start(0, session());
  at(4);
  records.clientGone("player");
  at(4.01);
  records.summary(session());

  EXPECT_EQ(story().end, StreamEnd::kClientGone);
}

TEST_F(StreamBuilderTest, ASessionThatEndsLongBeforeItsClientWasStopped) {
  start(0, session());
  at(4);
  records.summary(session());
  at(8);
  records.clientGone("player");

  EXPECT_EQ(story().end, StreamEnd::kStopped);
  EXPECT_DOUBLE_EQ(story().ended, kBegin + 4);
}

TEST_F(StreamBuilderTest, ASessionThatSaidThatItPausedWasStopped) {
  start(0, session());
  volume(1, session(), 0.5, true);
  volume(2, session(), 0.5, false);
  records.summary(session());
  records.clientGone("player");

  EXPECT_EQ(story().end, StreamEnd::kStopped);
}

TEST_F(StreamBuilderTest, WithoutALinkTheEndOfTheReporterEndsItsStreams) {
  auto unlinked = stream();
  unlinked.sessionID.reset();
  start(0, unlinked);
  at(3);
  records.clientGone("halvoxctl");
  at(5);
  records.clientGone("halvox-pipewire");

  EXPECT_EQ(story().end, StreamEnd::kClientGone);
  EXPECT_DOUBLE_EQ(story().ranSeconds, 5);
}

TEST_F(StreamBuilderTest, ASerialThatRunsForTheFirstTimeAgainIsAnotherStream) {
  auto unlinked = stream();
  unlinked.sessionID.reset();
  start(0, unlinked);
  stop(1, unlinked);
  start(5, unlinked);

  build();
  ASSERT_THAT(stories, SizeIs(2));
  EXPECT_EQ(stories[0].end, StreamEnd::kStopped);
}

TEST_F(StreamBuilderTest, ASessionThatEndedRanUntilThenEvenIfItsSerialIsUsedAgain) {
  start(0, stream());
  at(5);
  records.summary(stream());
  volume(5.5, stream(), 0.5, true);

  build();
  ASSERT_THAT(stories, SizeIs(2));
  EXPECT_EQ(stories[0].end, StreamEnd::kStopped);
  EXPECT_DOUBLE_EQ(stories[0].ended, kBegin + 5);
  EXPECT_DOUBLE_EQ(stories[0].ranSeconds, 5);
}

TEST_F(StreamBuilderTest, AnEqualSerialOfAProgramWithALongerNameIsAnotherStream) {
  // Each user has a PipeWire server of his own, which counts its serials from the beginning.
  auto shorter = stream(44, "mpv");
  auto longer = stream(44, "mpv-nightly");
  shorter.sessionID.reset();
  longer.sessionID.reset();
  start(0, shorter);
  start(1, longer, 2);

  build();
  ASSERT_THAT(stories, SizeIs(2));
  EXPECT_EQ(stories[0].application, "mpv");
}

TEST_F(StreamBuilderTest, TwoReportersMayUseOneSerial) {
  auto first = stream();
  auto second = stream();
  second.sessionID = 99;
  start(0, first);
  start(1, second, 2);
  stop(2, first);

  build();
  EXPECT_THAT(stories, SizeIs(2));
}

TEST_F(StreamBuilderTest, AVolumeThatWasNeverReportedIsUnknown) {
  start(0, stream());
  stop(4, stream());

  EXPECT_THAT(story().volumes, IsEmpty());
  EXPECT_DOUBLE_EQ(unknownVolumeSeconds(story()), 4);
}

TEST_F(StreamBuilderTest, AVolumeChangeWhileNotRunningTakesNoTime) {
  volume(0, stream(), 0.2, false);
  volume(3, stream(), 0.4, false);
  start(5, stream());
  volume(5, stream(), 0.4, true);
  volume(6, stream(), 0.4, false);
  stop(6, stream());

  ASSERT_THAT(story().volumes, SizeIs(1));
  EXPECT_DOUBLE_EQ(story().volumes[0].volume, 0.4);
  EXPECT_DOUBLE_EQ(story().volumes[0].seconds, 1);
  EXPECT_DOUBLE_EQ(story().ranSeconds, 1);
}

TEST_F(StreamBuilderTest, MuteIsTheVolumeZero) {
  start(0, stream());
  volume(0, stream(), 0.5, true);
  volume(2, stream(), 0, true);
  volume(5, stream(), 0.5, true);
  volume(6, stream(), 0.5, false);
  stop(6, stream());

  ASSERT_THAT(story().volumes, SizeIs(2));
  EXPECT_DOUBLE_EQ(story().volumes[0].seconds, 3);  // both times at 0.5
  EXPECT_DOUBLE_EQ(story().volumes[1].volume, 0);
  EXPECT_DOUBLE_EQ(story().volumes[1].seconds, 3);
}

TEST_F(StreamBuilderTest, AVolumeThatIsNoNumberCountsAsZeroAsInTheService) {
  start(0, stream());
  at(0).message(stream(), "Volume", "State",
                R"("RQSessionVolume":"loud","RQSessionVolumePlayingState":1)");
  volume(2, stream(), 0.5, false);

  ASSERT_THAT(story().volumes, SizeIs(1));
  EXPECT_DOUBLE_EQ(story().volumes[0].volume, 0);
}

TEST_F(StreamBuilderTest, KeepsEachRouteAndFormatOnce) {
  start(0, stream());
  for (const char* device : {"A", "A", "B", "A"}) {
    at(0).message(stream(), "RouteChange", "State",
                  std::string("\"active_devices\":\"") + device + "\"");
  }
  for (const char* format : {"F32LE", "S16LE", "S16LE"}) {
    at(0).message(stream(), "Session_Setup", "Setup",
                  std::string("\"session_selected_format\":\"") + format + "\"");
  }

  EXPECT_THAT(story().routes, SizeIs(3));
  EXPECT_THAT(story().formats, SizeIs(2));
  EXPECT_EQ(story().routes[1].text, "B");
}

TEST_F(StreamBuilderTest, ChangesBeyondTheBoundAreCounted) {
  start(0, stream());
  for (std::size_t number = 0; number < kMostStoryChanges + 3; ++number) {
    at(static_cast<double>(number))
        .message(stream(), "Session_Setup", "Setup",
                 "\"session_selected_format\":\"" + std::to_string(number) + "\"");
    volume(static_cast<double>(number), stream(), static_cast<double>(number), true);
  }

  EXPECT_THAT(story().formats, SizeIs(kMostStoryChanges));
  EXPECT_EQ(story().formatsNotKept, 3U);
  EXPECT_THAT(story().volumes, SizeIs(kMostStoryVolumes));
  EXPECT_GT(story().otherVolumeSeconds, 0);
}

TEST_F(StreamBuilderTest, AClockThatIsSetBackDoesNotChangeTheTimeThatAStreamRan) {
  start(0, stream());
  volume(0, stream(), 0.5, true);
  at(10);
  records.setClock(kBegin - 3600);
  records.at(kBegin - 3595)
      .message(stream(), "Volume", "State",
               R"("RQSessionVolume":0.5,"RQSessionVolumePlayingState":0)");
  records.message(stream(), "Session_Playback", "Stop", "\"run\":1");
  records.summary(stream());

  EXPECT_NEAR(story().ranSeconds, 15, 0.01);
  EXPECT_NEAR(story().volumes[0].seconds, 15, 0.01);
}

TEST_F(StreamBuilderTest, AnXrunBeforeTheStartIsCounted) {
  xrun(0, stream(), "\"any_channel_silence_seconds\":0.25");
  start(1, stream());
  stop(2, stream());

  EXPECT_EQ(story().xruns.reports, 1U);
  EXPECT_DOUBLE_EQ(story().xruns.milliseconds, 250);
}

TEST_F(StreamBuilderTest, CountsTheRolesOfXruns) {
  start(0, stream());
  xrun(1, stream(),
       R"("xrun_role":"culprit","xrun_milliseconds":1,"any_channel_silence_seconds":9)");
  xrun(2, stream(), R"("xrun_role":"victim","xrun_milliseconds":2,"missed_cycles":-5)");
  xrun(3, stream(), R"("xrun_role":"device","xrun_milliseconds":4)");
  xrun(4, stream(), R"("xrun_role":7,"xrun_milliseconds":"NaN")");

  const XrunTotals& xruns = story().xruns;
  EXPECT_EQ(xruns.reports, 4U);
  EXPECT_EQ(xruns.asCulprit, 1U);
  EXPECT_EQ(xruns.asVictim, 1U);
  EXPECT_EQ(xruns.byDevice, 1U);
  EXPECT_EQ(xruns.missedCycles, 0U);
  EXPECT_DOUBLE_EQ(xruns.milliseconds, 7);
}

TEST_F(StreamBuilderTest, SaysWhoWasLate) {
  start(0, stream());
  xrun(1, stream(),
       R"("xrun_milliseconds":2,"quantum":1024,"rate":48000,"device_node_name":"hw0",)"
       R"("late_node":"browser","late_process":"firefox","late_object_serial":9)");
  build();

  const StreamMoment::Xrun& xrun = moments[2].moment.xrun;
  EXPECT_EQ(moments[2].moment.kind, StreamMoment::Kind::kXrun);
  EXPECT_EQ(xrun.quantum, 1024);
  EXPECT_EQ(xrun.rate, 48000);
  EXPECT_EQ(xrun.device, "hw0");
  EXPECT_EQ(xrun.lateNode, "browser");
  EXPECT_EQ(xrun.lateProcess, "firefox");
  EXPECT_EQ(xrun.lateObjectSerial, 9);
}

TEST_F(StreamBuilderTest, LongTextsAreCutBetweenCharacters) {
  auto hostile = stream();
  std::string text;
  while (text.size() < 3 * kLongestStoryText) text += "音";
  hostile.application = text;
  start(0, hostile);
  stop(1, hostile);

  EXPECT_EQ(story().application, text.substr(0, kLongestStoryText / 3 * 3));
}

TEST_F(StreamBuilderTest, PayloadsOfAnyKindAreTaken) {
  for (const char* members : {R"("object_serial":"x")", R"("a":{"b":[[[null]]]})", R"("run":1e300)",
                              R"("RQSessionVolume":null)", R"("active_devices":[1,2])",
                              R"("missed_cycles":1e300,"issue_type":"xrun")"}) {
    at(0).message(session(), "Session_Playback", "IssueDetector", members);
  }

  EXPECT_EQ(story().messages, 6U);
}

TEST_F(StreamBuilderTest, TheQuietestStreamGivesWayToAnother) {
  for (std::size_t number = 0; number <= StreamBuilder::kMostOpen; ++number) {
    at(0).event(stream(static_cast<std::int64_t>(number)), "Session_Playback", "Start");
  }

  build();
  ASSERT_THAT(stories, SizeIs(StreamBuilder::kMostOpen + 1));
  EXPECT_EQ(stories.front().objectSerial, 0);
}

TEST_F(StreamBuilderTest, MomentsComeInOrder) {
  start(0, stream());
  volume(0, stream(), 0.5, true);
  volume(1, stream(), 0.5, true);  // says nothing new
  at(1).message(stream(), "Session_Playback", "Error", "\"code\":5");
  stop(2, stream());
  records.summary(stream());
  build();

  std::vector<StreamMoment::Kind> kinds;
  for (const Told& told : moments) kinds.push_back(told.moment.kind);
  using Kind = StreamMoment::Kind;
  EXPECT_THAT(kinds, ElementsAre(Kind::kBegan, Kind::kStart, Kind::kVolume, Kind::kMessage,
                                 Kind::kStop, Kind::kEnded));
  EXPECT_EQ(moments[3].moment.text, "Session_Playback Error");
}

// The bytes that this process holds of the heap.
std::size_t heapBytes() { return ::mallinfo2().uordblks; }

TEST(StreamBuilderMemoryTest, AMillionRecordsTakeNoMoreMemoryThanAThousand) {
  std::size_t stories = 0;
  StreamBuilder builder([&](const StreamStory&) { ++stories; });
  const auto feed = [&](int begin, int end) {
    for (int number = begin; number < end; ++number) {
      // A piece at a time: the series itself keeps its records. A piece is ten streams.
      RecordSeries series;
      series.at(1'000'000 + number * 10);
      for (std::int64_t serial = 0; serial < 10; ++serial) {
        const RecordSeries::Sender sender{.sessionID = 100 + serial, .serial = serial};
        series.message(sender, "Session_Playback", "Start", "\"run\":1");
        for (int message = 0; message < 31; ++message) {
          series.message(sender, "Volume", "State", R"("RQSessionVolume":0.5)");
        }
        series.message(sender, "Session_Playback", "Stop", "\"run\":1");
        series.summary(sender);
      }
      EXPECT_TRUE(series.forEach({}, [&](const Record& record) { builder.add(record); }));
    }
  };

  feed(0, 10);
  const std::size_t before = heapBytes();
  if (before == 0) {
    GTEST_SKIP() << "the heap of this build does not say how much it holds";
  }
  feed(10, 1000);  // 1,000,000 records in all
  const std::size_t after = heapBytes();
  builder.finish({});

  EXPECT_EQ(stories, 10'000U);
  EXPECT_LT(after, before + (8U << 20U));
}

}  // namespace
}  // namespace halvox::analysis
