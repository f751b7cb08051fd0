#include "reporters/pipewire/StreamTracker.h"

#include <chrono>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "reporters/pipewire/StreamTrackerFixture.h"

namespace halvox::pipewire_reporter {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class StreamTrackerTest : public StreamTrackerFixture {};

TEST(ReporterIDTest, HoldsNamespaceCookieAndSerial) {
  EXPECT_EQ(reporterIDFor(0xABCD1234, 0x55), 0x5057'1234'0000'0055);
  EXPECT_GT(reporterIDFor(0xFFFFFFFF, 0xFFFFFFFFFFFFFFFF), 0);
  EXPECT_NE(reporterIDFor(0, 0), 0);
}

TEST_F(StreamTrackerTest, GivesAStreamASessionWhenItAppears) {
  addStream("Stream/Output/Audio", {{"media.role", "Music"}, {"application.name", "Player"}});

  EXPECT_THAT(client.operations(), ElementsAre("create", "type", "configure"));
  EXPECT_EQ(client.calls()[0].id, reporterIDFor(kCookie, kSerial));
  EXPECT_EQ(client.calls()[1].serviceType, 7);
  EXPECT_EQ(client.last("configure").find(kApplicationKey)->string(), "Player");
}

TEST_F(StreamTrackerTest, IgnoresNodesThatAreNotAudioStreams) {
  for (const char* mediaClass : {"Audio/Source", "Stream/Output/Video", "Stream/Input/Midi", "",
                                 "stream/output/audio", "Stream/Output/Audio/Internal"}) {
    tracker.nodeAdded({.id = 30, .serial = 30, .mediaClass = mediaClass, .properties = {}});
    tracker.streamRunningChanged(30, true);
    tracker.nodeRemoved(30);
  }

  EXPECT_THAT(client.operations(), IsEmpty());
}

TEST_F(StreamTrackerTest, StartsTheSessionWhenTheStreamFirstRunsAndSendsWhatIsKnown) {
  addStream();
  tracker.streamFormatChanged(kStream, {.encoding = "F32LE", .rate = 48000, .channels = 2});
  tracker.linkAdded(1, {.output = kStream, .input = kSpeakers});
  setVolume(0.5F);
  client.forget();

  tracker.streamRunningChanged(kStream, true);

  EXPECT_THAT(client.operations(),
              ElementsAre("start", "format", "route", "playback-start", "volume"));
  EXPECT_EQ(client.last("format").find(kFormatKey)->string(), "F32LE 48000 Hz 2 ch");
  EXPECT_EQ(client.last("route").find(kDevicesKey)->string(), "Speakers");
  EXPECT_EQ(*client.last("route").find(kDeviceNamesKey),
            platform::Value(platform::Array{"speakers"}));
}

TEST_F(StreamTrackerTest, SendsNothingBeforeTheFirstRun) {
  addStream();
  client.forget();

  tracker.streamRunningChanged(kStream, false);
  setVolume(0.5F);
  tracker.streamFormatChanged(kStream, {.encoding = "F32LE"});
  tracker.linkAdded(1, {.output = kStream, .input = kSpeakers});

  EXPECT_THAT(client.operations(), IsEmpty());
}

TEST_F(StreamTrackerTest, SendsRecordMessagesForCapture) {
  addStream("Stream/Input/Audio");
  client.forget();

  tracker.streamRunningChanged(kStream, true);
  tracker.streamRunningChanged(kStream, false);

  EXPECT_THAT(client.operations(), ElementsAre("start", "record-start", "record-stop"));
}

TEST_F(StreamTrackerTest, SendsStopWhenIdleAndStartWhenRunningAgainInOneSession) {
  runStream();

  tracker.streamRunningChanged(kStream, false);
  tracker.streamRunningChanged(kStream, true);

  EXPECT_THAT(client.operations(),
              ElementsAre("volume", "playback-stop", "playback-start", "volume"));
  EXPECT_EQ(client.last("playback-stop").find(kRunKey)->toInt64(), 1);
  EXPECT_EQ(client.last("playback-start").find(kRunKey)->toInt64(), 2);
  EXPECT_TRUE(sentPlaying());
}

TEST_F(StreamTrackerTest, SendsVolumePlayingStateAndProcess) {
  addStream();
  setVolume(0.25F);

  tracker.streamRunningChanged(kStream, true);

  EXPECT_EQ(client.last("volume"), (platform::Dictionary{{kVolumeKey, 0.25},
                                                         {kPlayingKey, 1},
                                                         {kVolumeProcessKey, "player"},
                                                         {kSerialKey, kSerial}}));
}

TEST_F(StreamTrackerTest, SendsVolumeWhenItChanges) {
  runStream();

  setVolume(0.75F);

  EXPECT_THAT(client.operations(), ElementsAre("volume"));
  EXPECT_EQ(sentVolume(), 0.75);
  EXPECT_TRUE(sentPlaying());
}

TEST_F(StreamTrackerTest, SendsVolumeChangeOfAnIdleStreamAsNotPlaying) {
  runStream();
  tracker.streamRunningChanged(kStream, false);

  setVolume(0.75F);

  EXPECT_EQ(sentVolume(), 0.75);
  EXPECT_FALSE(sentPlaying());
}

TEST_F(StreamTrackerTest, SendsMuteAsVolumeZeroWhileStillPlaying) {
  runStream();

  tracker.streamVolumeChanged(kStream, {.volume = {}, .channels = {}, .muted = true});

  EXPECT_EQ(sentVolume(), 0.0);
  EXPECT_TRUE(sentPlaying());
}

TEST_F(StreamTrackerTest, SendsNoVolumeUntilItIsKnown) {
  addStream();
  tracker.streamRunningChanged(kStream, true);
  EXPECT_TRUE(client.last("volume").empty());

  setVolume(0.5F);

  EXPECT_EQ(sentVolume(), 0.5);
}

TEST_F(StreamTrackerTest, SendsNothingForNotificationsWithoutAChange) {
  const Properties properties{{"media.role", "Music"}};
  addStream("Stream/Output/Audio", properties);
  tracker.streamFormatChanged(kStream, {.encoding = "F32LE", .rate = 48000, .channels = 2});
  tracker.linkAdded(1, {.output = kStream, .input = kSpeakers});
  setVolume(0.5F);
  tracker.streamRunningChanged(kStream, true);
  client.forget();

  tracker.streamFormatChanged(kStream, {.encoding = "F32LE", .rate = 48000, .channels = 2});
  tracker.linkAdded(2, {.output = kStream, .input = kSpeakers});
  setVolume(0.5F);
  tracker.streamRunningChanged(kStream, true);
  tracker.streamPropertiesChanged(
      kStream, {{"media.role", "Music"}, {"application.process.binary", "player"}});

  EXPECT_THAT(client.operations(), IsEmpty());
}

TEST_F(StreamTrackerTest, SendsAChangedFormat) {
  runStream();

  tracker.streamFormatChanged(kStream, {.encoding = "S16LE", .rate = 44100, .channels = 1});

  EXPECT_THAT(client.operations(), ElementsAre("format"));
  EXPECT_EQ(client.last("format").find(kFormatKey)->string(), "S16LE 44100 Hz 1 ch");
}

TEST_F(StreamTrackerTest, SendsTheNewRouteOfAMovedStreamOnce) {
  runStream();
  tracker.linkAdded(1, {.output = kStream, .input = kSpeakers});
  client.forget();

  tracker.linkRemoved(1);
  tracker.linkAdded(2, {.output = kStream, .input = kHeadphones});
  tracker.linkAdded(3, {.output = kStream, .input = kHeadphones});

  EXPECT_THAT(client.operations(), ElementsAre("route"));
  EXPECT_EQ(client.last("route").find(kDevicesKey)->string(), "Headphones");
}

TEST_F(StreamTrackerTest, NamesAllDevicesOfARoute) {
  runStream();
  tracker.linkAdded(1, {.output = kStream, .input = kSpeakers});

  tracker.linkAdded(2, {.output = kStream, .input = kHeadphones});

  EXPECT_EQ(client.last("route").find(kDevicesKey)->string(), "Headphones, Speakers");
}

TEST_F(StreamTrackerTest, DoesNotCallARecorderOfTheStreamADevice) {
  runStream();
  tracker.nodeAdded({.id = 40, .serial = 40, .mediaClass = "Stream/Input/Audio", .properties = {}});
  client.forget();

  tracker.linkAdded(1, {.output = kStream, .input = 40});

  EXPECT_THAT(client.operations(), IsEmpty());
}

TEST_F(StreamTrackerTest, NamesADeviceWithoutDescriptionByItsNodeOrSerial) {
  addDevice(kHeadphones, "", "");
  runStream();

  tracker.linkAdded(1, {.output = kStream, .input = kHeadphones});

  EXPECT_EQ(client.last("route").find(kDevicesKey)->string(), "node-11");
}

TEST_F(StreamTrackerTest, EndsRunAndSessionOfARunningStreamThatIsRemoved) {
  runStream();

  tracker.nodeRemoved(kStream);

  EXPECT_THAT(client.operations(), ElementsAre("volume", "playback-stop", "stop", "destroy"));
  EXPECT_FALSE(sentPlaying());
  EXPECT_EQ(tracker.streamCount(), 0U);
}

TEST_F(StreamTrackerTest, OnlyDestroysTheSessionOfAStreamThatNeverRan) {
  addStream();
  client.forget();

  tracker.nodeRemoved(kStream);

  EXPECT_THAT(client.operations(), ElementsAre("destroy"));
}

TEST_F(StreamTrackerTest, ConfiguresWhatChangedOnly) {
  addStream("Stream/Output/Audio", {{"media.name", "one"}, {"node.name", "n"}});
  client.forget();

  tracker.streamPropertiesChanged(
      kStream,
      {{"media.name", "two"}, {"node.name", "n"}, {"application.process.binary", "player"}});

  EXPECT_THAT(client.operations(), ElementsAre("configure"));
  EXPECT_EQ(client.last("configure"), (platform::Dictionary{{"media_name", "two"}}));
}

TEST_F(StreamTrackerTest, ChangesTheServiceTypeWithTheRole) {
  addStream();
  client.forget();

  tracker.streamPropertiesChanged(
      kStream, {{"media.role", "phone"}, {"application.process.binary", "player"}});

  EXPECT_THAT(client.operations(), ElementsAre("type", "configure"));
  EXPECT_EQ(client.calls()[0].serviceType, 2);
}

TEST_F(StreamTrackerTest, EndsAllSessionsWhenTheServerDisconnects) {
  runStream();
  tracker.nodeAdded({.id = 21, .serial = 56, .mediaClass = "Stream/Input/Audio", .properties = {}});
  client.forget();

  tracker.serverLost();

  EXPECT_THAT(client.operations(), testing::UnorderedElementsAre("volume", "playback-stop", "stop",
                                                                 "destroy", "destroy"));
  EXPECT_EQ(tracker.streamCount(), 0U);
}

TEST_F(StreamTrackerTest, ForgetsLinksOfALostServer) {
  runStream();
  tracker.linkAdded(1, {.output = kStream, .input = kSpeakers});
  tracker.serverLost();
  tracker.serverConnected(kCookie + 1);
  client.forget();

  runStream();

  EXPECT_TRUE(client.last("route").empty());
}

TEST_F(StreamTrackerTest, GivesTheSameSerialAnotherIdentifierAfterARestart) {
  addStream();
  const ReporterID before = client.calls().front().id;
  tracker.serverLost();
  client.forget();

  tracker.serverConnected(kCookie + 1);
  addStream();

  EXPECT_NE(client.calls().front().id, before);
}

TEST_F(StreamTrackerTest, EndsAllSessionsOnDestruction) {
  {
    StreamTracker shortLived(client);
    shortLived.nodeAdded(
        {.id = 1, .serial = 1, .mediaClass = "Stream/Output/Audio", .properties = {}});
    shortLived.streamRunningChanged(1, true);
    client.forget();
  }

  EXPECT_THAT(client.operations(), ElementsAre("playback-stop", "stop", "destroy"));
}

TEST_F(StreamTrackerTest, SendsTheCurrentStateToARestartedService) {
  runStream();
  tracker.streamFormatChanged(kStream, {.encoding = "F32LE"});
  tracker.linkAdded(1, {.output = kStream, .input = kSpeakers});
  client.forget();

  tracker.serviceRestarted();

  EXPECT_THAT(client.operations(), ElementsAre("format", "route", "volume"));
  EXPECT_TRUE(sentPlaying());
}

TEST_F(StreamTrackerTest, SendsNothingForUnstartedSessionsAfterARestartOfTheService) {
  addStream();
  setVolume(0.5F);
  client.forget();

  tracker.serviceRestarted();

  EXPECT_THAT(client.operations(), IsEmpty());
}

TEST_F(StreamTrackerTest, IgnoresEventsOfUnknownNodes) {
  tracker.streamRunningChanged(99, true);
  tracker.streamPropertiesChanged(99, {});
  tracker.streamFormatChanged(99, {.encoding = "F32LE"});
  tracker.streamVolumeChanged(99, {});
  tracker.linkRemoved(99);
  tracker.nodeRemoved(99);

  EXPECT_THAT(client.operations(), IsEmpty());
}

TEST_F(StreamTrackerTest, EndsTheOldStreamWhenItsNodeIdIsReused) {
  runStream();

  tracker.nodeAdded(
      {.id = kStream, .serial = 77, .mediaClass = "Stream/Output/Audio", .properties = {}});

  EXPECT_THAT(client.operations(), ElementsAre("volume", "playback-stop", "stop", "destroy",
                                               "create", "type", "configure"));
}

TEST_F(StreamTrackerTest, RefusesAStreamWithASerialThatIsTaken) {
  addStream();
  client.forget();

  tracker.nodeAdded(
      {.id = 21, .serial = kSerial, .mediaClass = "Stream/Output/Audio", .properties = {}});
  tracker.nodeRemoved(21);

  EXPECT_THAT(client.operations(), IsEmpty());
  EXPECT_EQ(tracker.refusedStreams(), 1U);
  EXPECT_EQ(tracker.streamCount(), 1U);
}

TEST_F(StreamTrackerTest, FollowsABoundedNumberOfStreams) {
  for (std::size_t i = 0; i < StreamTracker::kMaxStreams + 5; ++i) {
    tracker.nodeAdded({.id = static_cast<GlobalID>(1000 + i),
                       .serial = 1000 + i,
                       .mediaClass = "Stream/Output/Audio",
                       .properties = {}});
  }

  EXPECT_EQ(tracker.streamCount(), StreamTracker::kMaxStreams);
  EXPECT_EQ(tracker.refusedStreams(), 5U);
}

}  // namespace
}  // namespace halvox::pipewire_reporter
