#include "tools/top/TopModel.h"

#include <algorithm>
#include <string>
#include <vector>

#include "analysis/testing/RecordSeries.h"
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

using analysis::RecordSeries;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

class TopModelTest : public testing::Test {
 protected:
  static constexpr double kBegin = 1'000'000;

  static RecordSeries::Sender stream(std::int64_t serial, const std::string& application) {
    return {.application = application, .sessionID = 5000 + serial, .serial = serial};
  }
  RecordSeries& at(double seconds) { return records_.at(kBegin + seconds); }
  void start(double seconds, const RecordSeries::Sender& sender) {
    at(seconds).message(sender, "Session_Playback", "Start", "\"run\":1");
  }
  void route(double seconds, const RecordSeries::Sender& sender, const std::string& description,
             const std::string& name) {
    at(seconds).message(
        sender, "RouteChange", "State",
        "\"active_devices\":\"" + description + "\",\"device_node_names\":[\"" + name + "\"]");
  }
  void xrun(double seconds, const RecordSeries::Sender& sender, double milliseconds) {
    at(seconds).message(sender, "Session_Playback", "IssueDetector",
                        R"("issue_type":"xrun","quantum":256,"rate":48000,)"
                        R"("device_node_name":"speaker","xrun_milliseconds":)" +
                            std::to_string(milliseconds));
  }

  // Gives the model the records that were added since the last turn, and a turn at that time.
  TopSnapshot turn(double seconds, TopReadings readings = {}) {
    std::size_t number = 0;
    EXPECT_TRUE(records_.forEach({}, [&](const analysis::Record& record) {
      if (number++ >= taken_) model_.addRecord(record);
    }));
    taken_ = number;
    readings.now = kBegin + seconds;
    readings.steady = 5000 + seconds;
    model_.onTurn(std::move(readings));
    return model_.snapshot();
  }
  static TopReadings counted(CounterValues counters) {
    TopReadings readings;
    readings.isConnected = true;
    readings.counters = std::move(counters);
    return readings;
  }

  RecordSeries records_;
  std::size_t taken_ = 0;
  TopModel model_;
};

TEST_F(TopModelTest, AStreamIsShownWithItsDeviceAndItsVolume) {
  start(0, stream(44, "player"));
  route(0, stream(44, "player"), "Speakers", "speaker");
  at(0).message(stream(44, "player"), "Volume", "State",
                R"("RQSessionVolume":0.5,"RQSessionVolumePlayingState":1)");

  const TopSnapshot snapshot = turn(1);

  ASSERT_THAT(snapshot.streams, SizeIs(1));
  const TopStream& shown = snapshot.streams.front();
  EXPECT_EQ(shown.application, "player");
  EXPECT_EQ(shown.service, "longformaudio");
  EXPECT_EQ(shown.direction, analysis::StreamDirection::kPlayback);
  EXPECT_EQ(shown.device, "Speakers");
  EXPECT_EQ(shown.deviceNames, "speaker");
  EXPECT_EQ(shown.volume, 0.5);
  EXPECT_EQ(shown.state, TopStreamState::kRunning);
  EXPECT_EQ(shown.sessionID, 5044);
  ASSERT_THAT(snapshot.devices, SizeIs(1));
  EXPECT_EQ(snapshot.devices.front().name, "speaker");
  EXPECT_EQ(snapshot.devices.front().description, "Speakers");
  EXPECT_EQ(snapshot.devices.front().streams, 1U);
}

TEST_F(TopModelTest, StreamsPauseAndEnd) {
  const auto player = stream(44, "player");
  at(0).message(player, "Session_Setup", "Setup", R"("session_selected_format":"F32LE")");
  EXPECT_EQ(turn(1).streams.at(0).state, TopStreamState::kOpen);
  start(2, player);
  EXPECT_EQ(turn(3).streams.at(0).state, TopStreamState::kRunning);
  at(4).message(player, "Session_Playback", "Stop", "\"run\":1");
  EXPECT_EQ(turn(5).streams.at(0).state, TopStreamState::kPaused);
  at(6).summary(player);
  EXPECT_THAT(turn(7).streams, IsEmpty());
}

TEST_F(TopModelTest, AMessageThatTheLinkDoesNotRecordIsShownAfterAMoment) {
  auto player = stream(44, "player");
  player.sessionID.reset();
  start(0, player);

  EXPECT_THAT(turn(0.5).streams, IsEmpty());
  EXPECT_THAT(turn(2.5).streams, SizeIs(1));
}

TEST_F(TopModelTest, XrunsOfTheLastMinuteAreCounted) {
  for (const auto& sender : {stream(44, "player"), stream(45, "game")}) {
    start(0, sender);
    route(0, sender, "Speakers", "speaker");
    xrun(10, sender, 5);
    xrun(50, sender, 2.5);
  }

  const TopSnapshot snapshot = turn(51);
  EXPECT_EQ(snapshot.streams.at(0).xruns, 2U);
  EXPECT_EQ(snapshot.streams.at(0).lostMilliseconds, 7.5);
  // Both streams report what their device missed.
  EXPECT_EQ(snapshot.devices.at(0).xruns, 2U);
  EXPECT_EQ(snapshot.devices.at(0).quantum, 256);
  EXPECT_EQ(snapshot.devices.at(0).rate, 48'000);

  const TopSnapshot later = turn(80);
  EXPECT_EQ(later.streams.at(0).xruns, 1U);
  EXPECT_EQ(later.streams.at(0).xrunsInAll, 2U);
}

TEST_F(TopModelTest, WhatTheDriverCountsComesBeforeWhatClientsReport) {
  start(0, stream(44, "player"));
  route(0, stream(44, "player"), "Speakers", "speaker");
  xrun(1, stream(44, "player"), 5);
  TopReadings readings;
  readings.devices = {{.name = "speaker", .xruns = 7, .busySeconds = 0.5, .quantum = 1024}};
  static_cast<void>(turn(0.5));

  const TopSnapshot snapshot = turn(2.5, std::move(readings));

  const TopDevice& shown = snapshot.devices.at(0);
  EXPECT_EQ(shown.xruns, 7U);
  EXPECT_EQ(shown.busy, 0.25);
  EXPECT_EQ(shown.quantum, 1024);
  EXPECT_EQ(shown.rate, 48'000);
}

TEST_F(TopModelTest, ACardWithoutAClockIsShownWithTheRateOfItsFrames) {
  static_cast<void>(turn(0));
  TopReadings readings;
  readings.devices = {{.name = "card (playback)", .frames = 96'000}};

  EXPECT_EQ(turn(2, std::move(readings)).devices.at(0).rate, 48'000);
}

TEST_F(TopModelTest, ADeviceThatIsGoneAndUnusedIsNotShown) {
  TopReadings readings;
  readings.devices = {{.name = "card"}};
  EXPECT_THAT(turn(0, std::move(readings)).devices, SizeIs(1));

  EXPECT_THAT(turn(2).devices, IsEmpty());
}

TEST_F(TopModelTest, TheNumberOfDevicesIsBounded) {
  TopReadings readings;
  for (std::size_t number = 0; number < 2 * TopModel::kMostDevices; ++number) {
    readings.devices.push_back({.name = std::to_string(number)});
  }

  EXPECT_THAT(turn(0, std::move(readings)).devices, SizeIs(TopModel::kMostDevices));
}

TEST_F(TopModelTest, RatesNeedTwoReadings) {
  const TopSnapshot first = turn(0, counted({{"messages, received", 1000}}));
  EXPECT_FALSE(first.service.messagesPerSecond);

  const TopSnapshot second = turn(2, counted({{"messages, received", 1050}}));
  EXPECT_EQ(second.service.messagesPerSecond, 25);
  EXPECT_EQ(second.seconds, 2);
}

TEST_F(TopModelTest, WaitingIsWhatWasAddedAndIsNotDone) {
  const TopSnapshot snapshot = turn(0, counted({{"queues, a: jobs added", 10},
                                                {"queues, a: jobs run", 7},
                                                {"queues, b, c: jobs added", 5},
                                                {"queues, b, c: jobs run", 4},
                                                {"link local, received", 100},
                                                {"link local, stored", 80},
                                                {"link local, dropped: disk full", 5},
                                                {"connection, connections accepted", 9},
                                                {"connection, connections ended", 5}}));

  EXPECT_EQ(snapshot.service.waitingJobs, 4U);
  EXPECT_EQ(snapshot.service.waitingRecords, 15U);
  EXPECT_EQ(snapshot.service.clients, 3U);
}

TEST_F(TopModelTest, LossesAreShownWithTheirReasonThoseThatGrowFirst) {
  static_cast<void>(turn(0, counted({{"session, suppressed: redundant", 100},
                                     {"link local, dropped: disk full", 1}})));

  const TopSnapshot snapshot = turn(2, counted({{"session, suppressed: redundant", 100},
                                                {"link local, dropped: disk full", 5},
                                                {"link local, dropped: too large", 0},
                                                {"messages, received", 7}}));

  ASSERT_THAT(snapshot.losses, SizeIs(2));
  EXPECT_EQ(snapshot.losses[0].piece, "link local");
  EXPECT_EQ(snapshot.losses[0].reason, "dropped: disk full");
  EXPECT_EQ(snapshot.losses[0].total, 5U);
  EXPECT_EQ(snapshot.losses[0].perSecond, 2);
  EXPECT_EQ(snapshot.losses[1].piece, "session");
}

TEST_F(TopModelTest, AServiceThatWasStartedAnewHasNoRatesAtFirst) {
  static_cast<void>(
      turn(0, counted({{"connection, connections accepted", 9}, {"messages, received", 1000}})));

  const auto restarted =
      counted({{"connection, connections accepted", 1}, {"messages, received", 3}});
  EXPECT_FALSE(turn(2, restarted).service.messagesPerSecond);
  EXPECT_EQ(turn(4, restarted).service.messagesPerSecond, 0);
}

TEST_F(TopModelTest, ForgettingEndsAllStreams) {
  start(0, stream(44, "player"));
  static_cast<void>(turn(2));

  model_.forget();

  EXPECT_THAT(model_.snapshot().streams, IsEmpty());
}

}  // namespace
}  // namespace halvox::tools
