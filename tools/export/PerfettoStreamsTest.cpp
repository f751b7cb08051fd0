#include "tools/export/PerfettoStreams.h"

#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>

#include "tools/export/testing/PerfettoText.h"

namespace halvox::tools {
namespace {

using analysis::StreamEnd;
using analysis::StreamMoment;
using analysis::StreamStory;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using Kind = StreamMoment::Kind;

// The stream 8 of a player, which begins at 1000.
class PerfettoStreamsTest : public testing::Test {
 protected:
  PerfettoStreamsTest() {
    story.id = 8;
    story.application = "org.player";
    story.service = "longformaudio";
    story.direction = analysis::StreamDirection::kPlayback;
    story.started = 1000;
  }

  void select(PerfettoSelection selection) { streams_.emplace(trace_, std::move(selection)); }
  PerfettoStreams& streams() {
    if (!streams_) select({});
    return *streams_;
  }
  static StreamMoment at(double seconds, Kind kind, const std::string& text = "") {
    StreamMoment moment;
    moment.kind = kind;
    moment.time = 1000 + seconds;
    moment.messageID = 8;
    moment.text = text;
    return moment;
  }
  void happen(const StreamMoment& moment) { streams().onMoment(story, moment); }
  void happen(double seconds, Kind kind, const std::string& text = "") {
    happen(at(seconds, kind, text));
  }
  void volume(double seconds, double volume, bool playing) {
    StreamMoment moment = at(seconds, Kind::kVolume);
    moment.volume = volume;
    moment.playing = playing;
    happen(moment);
  }
  void end(double seconds, StreamEnd how = StreamEnd::kStopped) {
    story.end = how;
    story.ended = 1000 + seconds;
    happen(seconds, Kind::kEnded);
    streams().onStory(story);
  }
  // Those since the last call.
  std::vector<std::string> lines() { return packetLines(std::exchange(text_, {})); }

  StreamStory story;

 private:
  std::string text_;
  PerfettoTrace trace_{text_};
  std::optional<PerfettoStreams> streams_;
};

TEST_F(PerfettoStreamsTest, AStreamIsASliceInATrackOfItsApplication) {
  story.sessionID = 5;
  story.objectSerial = 44;
  happen(0, Kind::kBegan);
  EXPECT_THAT(lines(),
              ElementsAre("process 2 org.player", "track 8 of 2: stream 8, object 44, session 5",
                          "8 begin 1000 longformaudio {stream=8 application=org.player "
                          "started=1000}"));
  story.ranSeconds = 2.5;
  story.messages = 3;
  end(4, StreamEnd::kClientGone);
  EXPECT_THAT(lines(),
              ElementsAre("8 end 1004 {service=longformaudio direction=playback "
                          "session_id=5 object_serial=44 end=client gone ran_seconds=2.5 xruns=0 "
                          "xrun_milliseconds=0 messages=3}"));
  EXPECT_EQ(streams().streams(), 1U);
}

TEST_F(PerfettoStreamsTest, ItRunsBetweenItsStartAndStopAndWhileItPlays) {
  happen(0, Kind::kBegan);
  lines();
  happen(1, Kind::kStart);
  EXPECT_THAT(lines(), ElementsAre("8 begin 1001 runs"));
  volume(2, 0.5, true);
  lines();
  happen(3, Kind::kStop);
  EXPECT_THAT(lines(), ElementsAre("8 end 1003"));
  volume(4, 0.5, true);
  EXPECT_THAT(lines(), ElementsAre("8 begin 1004 runs", "8 count 1004 0.5"));
  end(5);
  EXPECT_THAT(lines(), ElementsAre("8 end 1005", "8 count 1005 0", EndsWith("messages=0}")));
}

TEST_F(PerfettoStreamsTest, ItsVolumeIsACounter) {
  happen(0, Kind::kBegan);
  lines();
  volume(1, 0.5, false);
  volume(2, 0.25, false);
  EXPECT_THAT(lines(), ElementsAre("counter 8 of 8: volume of stream 8", "8 count 1001 0.5",
                                   "8 count 1002 0.25"));
}

TEST_F(PerfettoStreamsTest, XrunsSayWhoHowLongAndWhichDevice) {
  happen(0, Kind::kBegan);
  lines();
  StreamMoment moment = at(1, Kind::kXrun);
  moment.messageID = 20;
  moment.xrun = {.milliseconds = 21.25,
                 .missedCycles = 3,
                 .quantum = 1024,
                 .rate = 48000,
                 .role = "victim",
                 .device = "speakers",
                 .lateNode = "n",
                 .lateProcess = "browser",
                 .lateObjectSerial = 51};
  happen(moment);
  EXPECT_THAT(lines(), ElementsAre("8 instant 1001 xrun {milliseconds=21.25 missed_cycles=3 "
                                   "quantum=1024 rate=48000 role=victim device=speakers "
                                   "late_process=browser late_node=n late_object_serial=51 "
                                   "message=20}"));
  EXPECT_EQ(streams().xruns(), 1U);
}

TEST_F(PerfettoStreamsTest, DevicesFormatsAndOtherMessagesAreInstants) {
  happen(0, Kind::kBegan);
  lines();
  StreamMoment route = at(1, Kind::kRoute, "Speakers");
  route.names = "alsa.0";
  happen(route);
  happen(2, Kind::kFormat, "F32LE 48000 Hz");
  happen(3, Kind::kMessage, "HAL_Error Error");
  EXPECT_THAT(lines(), ElementsAre("8 instant 1001 device: Speakers {devices=Speakers "
                                   "device_node_names=alsa.0}",
                                   "8 instant 1002 format: F32LE 48000 Hz",
                                   "8 instant 1003 HAL_Error Error {message=8}"));
}

TEST_F(PerfettoStreamsTest, AStreamThatBeganEarlierHasTheStateThatItHadThen) {
  select({.since = 1010});
  happen(0, Kind::kBegan);
  happen(1, Kind::kStart);
  happen(2, Kind::kFormat, "F32LE");
  happen(3, Kind::kRoute, "Speakers");
  volume(4, 0.5, true);
  happen(5, Kind::kXrun);
  EXPECT_THAT(lines(), IsEmpty());
  happen(12, Kind::kMessage, "Error Error");
  const auto shown = lines();
  EXPECT_THAT(shown, Contains(HasSubstr("8 begin 1010 longformaudio {")));
  EXPECT_THAT(shown, Contains(HasSubstr("started=1000}")));
  for (const char* line : {"8 instant 1010 format: F32LE", "8 count 1010 0.5", "8 begin 1010 runs",
                           "8 instant 1010 device: Speakers {devices=Speakers}",
                           "8 instant 1012 Error Error {message=8}"}) {
    EXPECT_THAT(shown, Contains(line));
  }
  EXPECT_EQ(streams().xruns(), 0U);
}

TEST_F(PerfettoStreamsTest, AStreamThatEndedEarlierIsNotShown) {
  select({.since = 1010});
  happen(0, Kind::kBegan);
  end(5);
  EXPECT_THAT(lines(), IsEmpty());
  EXPECT_EQ(streams().streams(), 0U);
}

TEST_F(PerfettoStreamsTest, AStreamWaitsForItsApplication) {
  story.application.clear();
  happen(0, Kind::kBegan);
  happen(1, Kind::kStart);
  EXPECT_THAT(lines(), IsEmpty());
  story.application = "org.player";
  happen(2, Kind::kMessage, "m");
  const auto shown = lines();
  EXPECT_THAT(shown, Contains("process 2 org.player"));
  EXPECT_THAT(shown, Contains("8 begin 1001 runs"));
}

TEST_F(PerfettoStreamsTest, AnXrunDoesNotWaitForTheApplication) {
  story.application.clear();
  happen(0, Kind::kBegan);
  happen(1, Kind::kXrun);
  EXPECT_THAT(lines(), Contains("process 2 an unknown application"));
  EXPECT_EQ(streams().xruns(), 1U);
}

TEST_F(PerfettoStreamsTest, OnlyApplicationsThatWereAskedForAreShown) {
  select({.applications = {"com.*", "*.player"}});
  happen(0, Kind::kBegan);
  EXPECT_EQ(streams().streams(), 1U);
  story.id = 9;
  story.application = "org.browser";
  happen(0, Kind::kBegan);
  end(1);
  EXPECT_EQ(streams().streams(), 1U);
}

TEST_F(PerfettoStreamsTest, SlicesNestAlthoughTheClockWasSetBack) {
  happen(0, Kind::kBegan);
  happen(10, Kind::kStart);
  lines();
  happen(5, Kind::kStop);
  EXPECT_THAT(lines(), ElementsAre("8 end 1010"));
  end(6);
  EXPECT_THAT(lines(), ElementsAre(HasSubstr("8 end 1010 ")));
}

TEST_F(PerfettoStreamsTest, ApplicationsBeyondTheBoundShareAProcess) {
  for (std::size_t number = 0; number <= PerfettoStreams::kMostApplications; ++number) {
    lines();
    story.id = static_cast<std::int64_t>(number);
    story.application = "app" + std::to_string(number);
    happen(0, Kind::kBegan);
    streams().onStory(story);
  }
  EXPECT_THAT(lines(), Contains("process 1 other applications"));
  story.application = "app7";
  happen(0, Kind::kBegan);
  EXPECT_THAT(lines(), Contains("process 9 app7"));
}

}  // namespace
}  // namespace halvox::tools
