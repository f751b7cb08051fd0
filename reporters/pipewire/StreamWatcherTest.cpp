#include "reporters/pipewire/StreamWatcher.h"

#include <chrono>
#include <csignal>
#include <functional>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <pipewire/pipewire.h>

#include "platform/linux/pipewire/testing/PipeWireFixture.h"
#include "platform/linux/testing/Eventually.h"
#include "reporters/pipewire/MainLoop.h"
#include "reporters/pipewire/RecordingReportingClient.h"

namespace halvox::pipewire_reporter {
namespace {

using pipewire_testing::PipedProcess;
using pipewire_testing::PipeWireFixture;
using std::chrono::steady_clock;

// What the reporter sends for real streams of a private PipeWire.
class StreamWatcherTest : public PipeWireFixture {
 protected:
  void SetUp() override {
    PipeWireFixture::SetUp();
    if (audio == nullptr) return;
    loop = std::make_unique<MainLoop>();
    pw_loop_enter(loop->handle());
    follow({.remote = {}, .log = {}});
  }
  void TearDown() override {
    watcher.reset();
    if (loop != nullptr) {
      pw_loop_leave(loop->handle());
    }
  }

  // Makes a new watcher that logs to `log`.
  void follow(StreamWatcher::Options options) {
    options.log = [this](std::string_view line) { log.emplace_back(line); };
    watcher.reset();
    watcher = std::make_unique<StreamWatcher>(loop->handle(), tracker, std::move(options));
  }
  // Runs the loop until something happens, at most this long. Returns how many events it handled.
  // A function, because clang warns of the library's macro inside of the macros of the tests.
  int iterate(std::chrono::milliseconds time) const {
    return pw_loop_iterate(loop->handle(), static_cast<int>(time.count()));
  }
  void iterateFor(std::chrono::seconds time) const {
    const auto end = steady_clock::now() + time;
    while (steady_clock::now() < end) {
      iterate(std::chrono::milliseconds(100));
    }
  }
  // Runs the loop until the operation was recorded `count` times, at most until the deadline.
  [[nodiscard]] bool waitFor(const std::string& operation, long count = 1) const {
    return waitUntil([&] { return std::ranges::count(client.operations(), operation) >= count; });
  }
  [[nodiscard]] bool waitUntil(const std::function<bool()>& condition) const {
    return platform::linux_::eventually(condition,
                                        [this] { iterate(std::chrono::milliseconds(100)); });
  }
  [[nodiscard]] PipedProcess play(double seconds, const std::string& role = "Music") const {
    return PipedProcess(
        {"pw-play", "--volume", "0.5", "--media-role", role, audio->makeTone(seconds)});
  }

  std::unique_ptr<MainLoop> loop;
  RecordingReportingClient client;
  StreamTracker tracker{client};
  std::unique_ptr<StreamWatcher> watcher;
  std::vector<std::string> log;
};

TEST_F(StreamWatcherTest, ReportsPlaybackFromItsStartToItsEnd) {
  PipedProcess player = play(0.5);

  ASSERT_TRUE(waitFor("destroy"));

  EXPECT_EQ(player.wait(), 0);
  EXPECT_THAT(client.operations(),
              testing::IsSupersetOf({"create", "type", "configure", "start", "format", "route",
                                     "playback-start", "volume", "playback-stop", "stop"}));
  EXPECT_EQ(client.calls()[1].serviceType, kServiceLongFormAudio);
  EXPECT_EQ(client.calls()[2].dictionary.find(kApplicationKey)->string(), "pw-play");
  EXPECT_TRUE(client.calls()[2].dictionary.contains("process_id"));
  EXPECT_THAT(std::string(client.last("format").find(kFormatKey)->string()),
              testing::MatchesRegex("[A-Z0-9]+ 48000 Hz 1 ch"));
  EXPECT_EQ(client.last("route").find(kDevicesKey)->string(), "Demo speakers");
  EXPECT_EQ(client.last("volume").find(kVolumeKey)->toDouble(), 0.5);
  EXPECT_FALSE(client.last("volume").find(kPlayingKey)->toBool());
  EXPECT_EQ(client.last("volume").find(kVolumeProcessKey)->string(), "pw-cat");
}

TEST_F(StreamWatcherTest, ReportsAVolumeThatIsChangedWhilePlaying) {
  const PipedProcess player = play(20);
  ASSERT_TRUE(waitFor("volume"));

  PipedProcess control({"pw-cli", "s", "pw-play", "Props", "{ channelVolumes: [ 0.5 ] }"});
  ASSERT_TRUE(waitFor("volume", 2));
  EXPECT_EQ(control.wait(), 0);

  EXPECT_EQ(client.last("volume").find(kVolumeKey)->toDouble(), 0.25);
  EXPECT_TRUE(client.last("volume").find(kPlayingKey)->toBool());
}

TEST_F(StreamWatcherTest, ReportsCapture) {
  const PipedProcess recorder(
      {"pw-record", "-P", "{ stream.capture.sink=true }", audio->directory() / "out.wav"});

  ASSERT_TRUE(waitFor("route"));

  EXPECT_EQ(client.last("route").find(kDevicesKey)->string(), "Demo speakers");
  EXPECT_TRUE(waitFor("record-start"));
}

TEST_F(StreamWatcherTest, ReportsTheSerialOfTheStreamInItsIdentifier) {
  const PipedProcess player = play(20);
  ASSERT_TRUE(waitFor("configure"));

  const auto serial = client.last("configure").find("object_serial")->toUInt64();

  EXPECT_GT(serial, 0U);
  EXPECT_EQ(static_cast<std::uint64_t>(client.calls().front().id) & 0xFFFFFFFFU, serial);
}

TEST_F(StreamWatcherTest, AStreamCannotClaimToBeInASandbox) {
  const PipedProcess player({"pw-play", "-P",
                             "{ application.desktop=\"player.desktop\" "
                             "pipewire.access.portal.app_id=\"org.example.Claimed\" }",
                             audio->makeTone(20)});

  ASSERT_TRUE(waitFor("playback-start"));

  const auto configuration = client.last("configure");
  EXPECT_EQ(configuration.find("desktop_entry")->string(), "player.desktop");
  EXPECT_FALSE(configuration.contains("portal_app_id"));
  EXPECT_EQ(configuration.find(kApplicationKey)->string(), "pw-play");
}

TEST_F(StreamWatcherTest, EndsSessionsWhenPipeWireEndsAndFollowsItAfterItsRestart) {
  {
    const PipedProcess player = play(20);
    ASSERT_TRUE(waitFor("playback-start"));
    ASSERT_TRUE(audio->restart());
    ASSERT_TRUE(waitFor("destroy"));
    EXPECT_EQ(client.calls().back().operation, "destroy");
  }
  ASSERT_TRUE(waitUntil([&] {
    return std::ranges::count_if(
               log, [](const auto& line) { return line.starts_with("following"); }) == 2;
  }));

  const PipedProcess player = play(20, "phone");

  EXPECT_TRUE(waitFor("playback-start", 2));
}

TEST_F(StreamWatcherTest, ReportsWhatAStoppedPlayerMissesWithItsLength) {
  // The sum of the losses in all reports so far, in seconds.
  const auto silence = [this] {
    double sum = 0;
    for (const auto& call : client.calls()) {
      if (call.operation == "playback-issue") {
        sum += call.dictionary.find(kSilenceKey)->toDouble();
      }
    }
    return sum;
  };
  const PipedProcess player = play(20);
  ASSERT_TRUE(waitFor("volume"));
  // A busy machine misses cycles by itself. Wait for a second without a report.
  double before = -1;
  for (int second = 0; second < 10 && before != silence(); ++second) {
    before = silence();
    iterateFor(std::chrono::seconds(1));
  }
  ASSERT_EQ(silence(), before);
  const auto reportsBefore = std::ranges::count(client.operations(), "playback-issue");

  player.signal(SIGSTOP);
  const auto stopped = steady_clock::now();
  iterateFor(std::chrono::seconds(2));
  player.signal(SIGCONT);
  const std::chrono::duration<double> pause = steady_clock::now() - stopped;
  iterateFor(std::chrono::seconds(2));

  EXPECT_EQ(client.last("playback-issue").find(kIssueTypeKey)->string(), "xrun");
  EXPECT_EQ(client.last("playback-issue").find(kNodeKey)->string(), "pw-play");
  EXPECT_EQ(client.last("playback-issue").find(kIssueClientKey)->string(), "pw-play");
  EXPECT_NEAR(silence() - before, pause.count(), 0.5);
  EXPECT_LE(std::ranges::count(client.operations(), "playback-issue") - reportsBefore, 4);
  EXPECT_EQ(client.last("playback-issue").find(kXrunRoleKey)->string(), "culprit");
  EXPECT_EQ(client.last("playback-issue").find(kXrunDeviceKey)->string(), "demo-speakers");
  EXPECT_EQ(client.last("playback-issue").find(kLateNodeKey)->string(), "pw-play");
  EXPECT_EQ(client.last("playback-issue").find(kLateProcessKey)->string(), "pw-cat");
  EXPECT_EQ(client.last("playback-issue").find(kRateKey)->toInt64(), 48000);
}

TEST_F(StreamWatcherTest, SleepsWithoutStreamsEvenWithAProfiler) {
  {
    const PipedProcess player = play(20);
    ASSERT_TRUE(waitFor("volume"));
  }
  ASSERT_TRUE(waitFor("destroy"));
  while (iterate(std::chrono::milliseconds(500)) > 0) {
  }

  EXPECT_EQ(iterate(std::chrono::seconds(2)), 0);
}

TEST_F(StreamWatcherTest, SleepsWhileNothingChangesWithoutXruns) {
  follow({.remote = {}, .log = {}, .xruns = false});

  const PipedProcess player = play(20);
  ASSERT_TRUE(waitFor("volume"));
  // Let the last events of the start arrive.
  while (iterate(std::chrono::milliseconds(500)) > 0) {
  }

  EXPECT_EQ(iterate(std::chrono::seconds(2)), 0);
}

TEST_F(StreamWatcherTest, WaitsForAMissingPipeWire) {
  watcher.reset();
  log.clear();

  follow({.remote = "nobody-home", .log = {}});
  for (int i = 0; i < 3; ++i) {
    iterate(std::chrono::milliseconds(500));
  }

  EXPECT_THAT(log, testing::ElementsAre(testing::StartsWith("waiting for PipeWire")));
}

}  // namespace
}  // namespace halvox::pipewire_reporter
