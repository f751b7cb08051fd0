#include "analysis/ReportBuilder.h"

#include <algorithm>
#include <string>

#include "analysis/testing/RecordSeries.h"
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::analysis {
namespace {

using testing::ElementsAre;
using testing::Field;

const RecordSeries::Sender kPlayer{};
const RecordSeries::Sender kBrowser{
    .application = "browser", .service = "nonlongformaudio", .sessionID = 8};

void start(RecordSeries& series, const RecordSeries::Sender& sender) {
  series.message(sender, "RouteChange", "State",
                 R"("active_devices":"Speakers","device_node_names":["speakers"])");
  series.message(sender, "Session_Playback", "Start", R"("run":1)");
  series.message(sender, "Volume", "State",
                 R"("RQSessionVolume":0.5,"RQSessionVolumePlayingState":1)");
}

void xrun(RecordSeries& series, const RecordSeries::Sender& sender, double milliseconds,
          const std::string& more = "") {
  series.message(sender, "Session_Playback", "IssueDetector",
                 R"("issue_type":"xrun","xrun_milliseconds":)" + std::to_string(milliseconds) +
                     R"(,"missed_cycles":2)" + more);
}

void stop(RecordSeries& series, const RecordSeries::Sender& sender) {
  series.message(sender, "Session_Playback", "Stop", R"("run":1)");
  series.summary(sender);
}

ReportData reportOf(RecordSeries& series, const ReportBounds& bounds = {}) {
  ReportBuilder builder(bounds);
  const auto read = series.forEach({.since = {}, .until = {}, .metrics = true},
                                   [&](const Record& record) { builder.add(record); });
  EXPECT_TRUE(read);
  return builder.finish({});
}

std::uint64_t lossOf(const ReportData& data, const std::string& what) {
  std::uint64_t count = 0;
  for (const ReportLoss& loss : data.losses) count += loss.what == what ? loss.count : 0;
  return count;
}

TEST(ReportBuilderTest, AnXrunKnowsItsStreamDeviceAndLength) {
  RecordSeries series;
  series.at(1'000'000);
  start(series, kPlayer);
  series.at(1'000'005);
  xrun(series, kPlayer, 500, R"(,"quantum":1024,"rate":48000,"xrun_role":"culprit")");
  series.at(1'000'010);
  stop(series, kPlayer);

  const ReportData data = reportOf(series);

  ASSERT_EQ(data.xruns.size(), 1U);
  ASSERT_EQ(data.streams.size(), 1U);
  const ReportXrun& found = data.xruns.front();
  EXPECT_EQ(found.storyID, data.streams.front().story.id);
  EXPECT_EQ(found.time, 1'000'005);
  EXPECT_EQ(found.application, "player");
  EXPECT_EQ(found.device, "Speakers");
  EXPECT_EQ(found.milliseconds, 500);
  EXPECT_EQ(found.missedCycles, 2U);
  EXPECT_EQ(found.quantum, 1024);
  EXPECT_EQ(found.rate, 48'000);
  EXPECT_EQ(found.role, "culprit");
}

TEST(ReportBuilderTest, AReporterWithoutMillisecondsReportsSeconds) {
  RecordSeries series;
  series.at(1'000'000);
  start(series, kPlayer);
  series.message(kPlayer, "Session_Playback", "IssueDetector",
                 R"("issue_type":"xrun","any_channel_silence_seconds":0.25)");

  EXPECT_EQ(reportOf(series).totals.xrunMilliseconds, 250);
}

TEST(ReportBuilderTest, OtherIssuesAreNotXruns) {
  RecordSeries series;
  series.at(1'000'000);
  series.message(kPlayer, "Session_Playback", "IssueDetector", R"("issue_type":"silence")");

  EXPECT_EQ(reportOf(series).totals.xruns, 0U);
}

TEST(ReportBuilderTest, OnlyIssuesAreXrunsInTheStreamsToo) {
  RecordSeries series;
  series.at(1'000'000);
  start(series, kPlayer);
  series.message(kPlayer, "Session_Playback", "State",
                 R"("issue_type":"xrun","xrun_milliseconds":5)");
  stop(series, kPlayer);

  const ReportData data = reportOf(series);

  EXPECT_EQ(data.totals.xruns, 0U);
  ASSERT_EQ(data.streams.size(), 1U);
  EXPECT_EQ(data.streams.front().story.xruns.reports, 0U);
}

TEST(ReportBuilderTest, ImpossibleFiguresAreLimited) {
  constexpr double kDayMilliseconds = 86'400'000;
  RecordSeries series;
  series.at(1'000'000);
  start(series, kPlayer);
  for (const char* figures :
       {R"("xrun_milliseconds":1e308,"missed_cycles":4611686018427387904)",
        R"("any_channel_silence_seconds":1e306,"missed_cycles":4611686018427387904)",
        R"("xrun_milliseconds":-5,"missed_cycles":-7)"}) {
    series.message(kPlayer, "Session_Playback", "IssueDetector",
                   R"("issue_type":"xrun",)" + std::string(figures));
  }
  stop(series, kPlayer);

  const ReportData data = reportOf(series);

  EXPECT_EQ(data.totals.xruns, 3U);
  EXPECT_EQ(data.totals.xrunMilliseconds, 2 * kDayMilliseconds);
  EXPECT_EQ(data.totals.missedCycles, std::uint64_t{2} << 40U);
  ASSERT_EQ(data.streams.size(), 1U);
  EXPECT_EQ(data.streams.front().story.xruns.milliseconds, 2 * kDayMilliseconds);
  EXPECT_EQ(data.streams.front().story.xruns.missedCycles, std::uint64_t{2} << 40U);
}

TEST(ReportBuilderTest, TotalsAreThoseOfAllRecords) {
  RecordSeries series;
  series.at(1'000'000);
  start(series, kPlayer);
  start(series, kBrowser);
  xrun(series, kPlayer, 20);
  xrun(series, kBrowser, 30);
  series.at(1'000'002);
  xrun(series, kPlayer, 40);
  stop(series, kPlayer);

  const ReportData data = reportOf(series);

  EXPECT_EQ(data.totals.messages, 10U);
  EXPECT_EQ(data.totals.events, 20U);
  EXPECT_EQ(data.totals.linkMessages, 11U);  // one more: the summary
  EXPECT_EQ(data.totals.streams, 2U);
  EXPECT_EQ(data.totals.xruns, 3U);
  EXPECT_EQ(data.totals.missedCycles, 6U);
  EXPECT_EQ(data.totals.xrunMilliseconds, 90);
  EXPECT_EQ(data.from, 1'000'000);
  EXPECT_EQ(data.to, 1'000'002);
}

TEST(ReportBuilderTest, XrunsAreSummedByApplicationAndDevice) {
  RecordSeries series;
  series.at(1'000'000);
  start(series, kPlayer);
  start(series, kBrowser);
  xrun(series, kPlayer, 20);
  series.at(1'000'001);
  xrun(series, kPlayer, 60);
  xrun(series, kBrowser, 30);

  const ReportData data = reportOf(series);

  using Row = ReportApplicationDevice;
  EXPECT_THAT(
      data.byApplication,
      ElementsAre(testing::AllOf(Field(&Row::application, "player"),
                                 Field(&Row::device, "Speakers"), Field(&Row::xruns, 2),
                                 Field(&Row::milliseconds, 80), Field(&Row::longest, 60)),
                  testing::AllOf(Field(&Row::application, "browser"), Field(&Row::xruns, 1))));
}

TEST(ReportBuilderTest, XrunsOutsideStreamsAreInTheSums) {
  RecordSeries series;
  series.at(1'000'000);
  xrun(series, {.sessionID = -1}, 20);

  const ReportData data = reportOf(series);

  ASSERT_EQ(data.xruns.size(), 1U);
  EXPECT_FALSE(data.xruns.front().storyID.has_value());
  ASSERT_EQ(data.byApplication.size(), 1U);
  EXPECT_EQ(data.byApplication.front().xruns, 1U);
  EXPECT_EQ(data.byApplication.front().milliseconds, 20);
}

TEST(ReportBuilderTest, AnXrunHasTheMessagesAroundIt) {
  RecordSeries series;
  for (int number = 0; number < 30; ++number) {
    series.at(1'000'000.0 + number);
    if (number == 15) xrun(series, kPlayer, 20);
    series.message(kPlayer, "Generic", "Activate", "\"number\":" + std::to_string(number));
  }

  const ReportData data = reportOf(series, {.around = 3});

  ASSERT_EQ(data.xruns.size(), 1U);
  std::vector<double> times;
  for (const auto& message : data.xruns.front().around) times.push_back(message->time);
  EXPECT_THAT(times, ElementsAre(1'000'012, 1'000'013, 1'000'014, 1'000'015, 1'000'015, 1'000'016,
                                 1'000'017));
  EXPECT_EQ(data.xruns.front().around[3]->id, data.xruns.front().messageID);
}

TEST(ReportBuilderTest, TheWorstXrunsAreKeptAndTheOthersCounted) {
  RecordSeries series;
  start(series, kPlayer);
  for (const double milliseconds : {10, 90, 20, 80, 30}) {
    series.at(1'000'000 + milliseconds);
    xrun(series, kPlayer, milliseconds);
  }

  const ReportData data = reportOf(series, {.xruns = 2, .contexts = 1});

  EXPECT_THAT(data.xruns, ElementsAre(Field(&ReportXrun::milliseconds, 80),
                                      Field(&ReportXrun::milliseconds, 90)));
  EXPECT_TRUE(data.xruns[0].around.empty());
  EXPECT_FALSE(data.xruns[1].around.empty());
  EXPECT_EQ(data.totals.xruns, 5U);
  EXPECT_EQ(lossOf(data, "xruns"), 3U + 1U);
}

TEST(ReportBuilderTest, ContentsOfMessagesAroundXrunsAreBounded) {
  RecordSeries series;
  series.at(1'000'000);
  start(series, kPlayer);
  for (const int milliseconds : {100, 300, 200}) {
    xrun(series, kPlayer, milliseconds, R"(,"filler":")" + std::string(900, 'x') + "\"");
  }

  const ReportData data = reportOf(series, {.around = 0, .aroundBytes = 2500});

  // The contents of two of them fit.
  EXPECT_TRUE(data.xruns[0].around.empty());
  EXPECT_FALSE(data.xruns[1].around.empty());
  EXPECT_FALSE(data.xruns[2].around.empty());
  EXPECT_EQ(lossOf(data, "xruns"), 1U);
}

TEST(ReportBuilderTest, StreamsThatLostMostAreKept) {
  RecordSeries series;
  series.at(1'000'000);
  for (std::int64_t session = 1; session <= 5; ++session) {
    const RecordSeries::Sender sender{.application = "app" + std::to_string(session),
                                      .sessionID = session};
    series.at(1'000'000 + static_cast<double>(session));
    start(series, sender);
    if (session == 2) xrun(series, sender, 50);
    stop(series, sender);
  }

  const ReportData data = reportOf(series, {.streams = 1});

  ASSERT_EQ(data.streams.size(), 1U);
  EXPECT_EQ(data.streams.front().story.application, "app2");
  EXPECT_EQ(data.totals.streams, 5U);
  EXPECT_EQ(lossOf(data, "streams"), 4U);
}

TEST(ReportBuilderTest, AStreamHasItsVolumeOverTime) {
  RecordSeries series;
  series.at(1'000'000);
  start(series, kPlayer);
  series.at(1'000'001);
  series.message(kPlayer, "Volume", "State",
                 R"("RQSessionVolume":0.25,"RQSessionVolumePlayingState":1)");
  series.at(1'000'003);
  stop(series, kPlayer);

  const auto steps = reportOf(series).streams.at(0).volumeSteps;

  ASSERT_EQ(steps.size(), 4U);
  EXPECT_FALSE(steps[0].volume.has_value());  // it ran before its volume came
  EXPECT_EQ(steps[1].volume, 0.5);
  EXPECT_EQ(steps[2].volume, 0.25);
  EXPECT_EQ(steps[2].time, 1'000'001);
  EXPECT_FALSE(steps[3].isPlaying);
}

TEST(ReportBuilderTest, TooManyChangesAreThinnedOutEvenly) {
  RecordSeries series;
  series.at(1'000'000);
  start(series, kPlayer);
  for (int change = 0; change < 100; ++change) {
    series.at(1'000'001.0 + change);
    series.message(
        kPlayer, "Volume", "State",
        "\"RQSessionVolumePlayingState\":1,\"RQSessionVolume\":0." + std::to_string(100 + change));
  }

  const ReportData data = reportOf(series, {.allChanges = 10, .volumes = 3});

  const ReportStream& stream = data.streams.at(0);
  ASSERT_EQ(stream.volumeSteps.size(), 10U);
  EXPECT_EQ(stream.volumeSteps.front().time, 1'000'000);
  EXPECT_EQ(stream.volumeSteps.back().time, 1'000'100);
  EXPECT_EQ(stream.story.volumes.size(), 3U);
  EXPECT_EQ(lossOf(data, "changes of volume, format or device"), 102U - 10U);
}

TEST(ReportBuilderTest, DriverReportsOfAllSessionsAreMerged) {
  RecordSeries series;
  series.at(1'000'000);
  for (const auto& sender : {kPlayer, kBrowser}) {
    series.message(sender, "IOReporting", "Histogram",
                   R"("speakers_Speaker_PipeWire_Histogram_busytime":)"
                   R"("count=2,lower=0,upper=100,min=0,max=100,unit=us::0-50:3;50-100:1")");
    series.message(sender, "IOReporting", "Simple",
                   R"("speakers_Speaker_PipeWire_Simple_cycles":7)");
  }

  const ReportData data = reportOf(series);

  ASSERT_EQ(data.deviceTimes.size(), 1U);
  EXPECT_EQ(data.deviceTimes[0].device, "speakers");
  EXPECT_EQ(data.deviceTimes[0].channel, "busytime");
  EXPECT_EQ(data.deviceTimes[0].unit, "us");
  EXPECT_EQ(data.deviceTimes[0].counts.count(), 8U);
  EXPECT_EQ(data.deviceTimes[0].counts.percentile(0.5), 50);
  ASSERT_EQ(data.deviceCounters.size(), 1U);
  EXPECT_EQ(data.deviceCounters[0].sum, 14);
  EXPECT_EQ(data.deviceCounters[0].reports, 2U);
}

TEST(ReportBuilderTest, DamagedDriverReportsAreCounted) {
  RecordSeries series;
  series.at(1'000'000);
  series.message(kPlayer, "IOReporting", "Histogram", R"("a_Histogram_b":"unit=us::1-2")");

  EXPECT_EQ(lossOf(reportOf(series), "driver histograms"), 1U);
}

TEST(ReportBuilderTest, OnlyChangedSettingsAreMarks) {
  RecordSeries series;
  double time = 1'000'000;
  for (const auto* name : {"Desk", "Desk", "Studio"}) {
    series.at(++time);
    series.message(kPlayer, "Setup", "Setup", "\"device_name\":\"" + std::string(name) + "\"");
  }

  const auto marks = reportOf(series).marks;

  EXPECT_THAT(marks, ElementsAre(Field(&ReportMark::text, R"(device_name: "Desk")"),
                                 Field(&ReportMark::text, R"(device_name: "Studio")")));
}

TEST(ReportBuilderTest, LongNamesAreCutAndCounted) {
  RecordSeries series;
  series.at(1'000'000);
  const RecordSeries::Sender sender{.application = std::string(10'000, 'x')};
  start(series, sender);
  xrun(series, sender, 20);

  const ReportData data = reportOf(series);

  EXPECT_LE(data.xruns.at(0).application.size(), ReportBounds().text + std::string("…").size());
  EXPECT_GT(lossOf(data, "texts"), 0U);
}

TEST(ReportBuilderTest, NothingRecordedIsAnEmptyReport) {
  RecordSeries series;

  const ReportData data = reportOf(series);

  EXPECT_FALSE(data.from.has_value());
  EXPECT_EQ(data.totals.events, 0U);
  EXPECT_TRUE(data.losses.empty());
}

TEST(ReportBuilderTest, WhatTheServiceLostIsSummedByPartAndReason) {
  ReportBuilder builder;
  const Payload none;
  const auto add = [&](double time, const char* piece, const char* reason, std::int64_t count) {
    Record record;
    record.kind = RecordKind::kLoss;
    record.time = time;
    record.name = piece;
    record.reason = reason;
    record.number = count;
    record.payload = &none;
    builder.add(record);
  };
  add(100, "session", "suppressed: redundant", 5);
  add(160, "analytics", "dropped: disk full", 70);
  add(220, "session", "suppressed: redundant", 2);

  const ReportData data = builder.finish({});

  ASSERT_EQ(data.serviceLosses.size(), 2U);
  EXPECT_EQ(data.serviceLosses.at(0).piece, "analytics");
  EXPECT_EQ(data.serviceLosses.at(0).count, 70U);
  EXPECT_EQ(data.serviceLosses.at(1).reason, "suppressed: redundant");
  EXPECT_EQ(data.serviceLosses.at(1).count, 7U);
  EXPECT_EQ(data.serviceLosses.at(1).last, 220);
}

}  // namespace
}  // namespace halvox::analysis
