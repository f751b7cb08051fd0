#include "analysis/StreamRates.h"

#include <string>
#include <vector>

#include "analysis/StreamBuilder.h"
#include "analysis/testing/RecordSeries.h"
#include <gmock/gmock.h>

namespace halvox::analysis {
namespace {

constexpr std::size_t kRows = 100;
constexpr std::size_t kText = 512;
constexpr double kHour = 3600;

const RecordSeries::Sender kPlayer{};

void route(RecordSeries& series, const RecordSeries::Sender& sender, const std::string& device) {
  series.message(sender, "RouteChange", "State", R"("active_devices":")" + device + '"');
}

void xrun(RecordSeries& series, const RecordSeries::Sender& sender, int milliseconds) {
  series.message(sender, "Session_Playback", "IssueDetector",
                 R"("issue_type":"xrun","xrun_milliseconds":)" + std::to_string(milliseconds));
}

std::vector<StreamRate> ratesOf(RecordSeries& series, StreamRates rates = {kRows, kText}) {
  StreamBuilder builder(
      [&](const StreamStory& story) { rates.onStory(story); },
      [&](const StreamStory& story, const StreamMoment& moment) { rates.onMoment(story, moment); });
  EXPECT_TRUE(series.forEach({}, [&](const Record& record) { builder.add(record); }));
  builder.finish({});
  return rates.take();
}

const StreamRate* find(const std::vector<StreamRate>& rates, StreamRate::Of of,
                       const std::string& name) {
  for (const StreamRate& rate : rates) {
    if (rate.of == of && rate.name == name) return &rate;
  }
  return nullptr;
}

TEST(StreamRatesTest, TheHoursAndXrunsOfADeviceAreThoseWhileItWasInUse) {
  RecordSeries series;
  series.at(1'000'000);
  route(series, kPlayer, "Speakers");
  series.message(kPlayer, "Session_Playback", "Start");
  series.at(1'000'000 + kHour);
  xrun(series, kPlayer, 20);
  route(series, kPlayer, "Headphones");
  series.at(1'000'000 + 3 * kHour);
  xrun(series, kPlayer, 50);
  xrun(series, kPlayer, 30);
  series.message(kPlayer, "Session_Playback", "Stop");
  series.summary(kPlayer);

  const auto rates = ratesOf(series);

  const StreamRate* const all = find(rates, StreamRate::Of::kAll, "");
  const StreamRate* const player = find(rates, StreamRate::Of::kApplication, "player");
  const StreamRate* const speakers = find(rates, StreamRate::Of::kDevice, "Speakers");
  const StreamRate* const headphones = find(rates, StreamRate::Of::kDevice, "Headphones");
  ASSERT_TRUE(all && player && speakers && headphones);
  EXPECT_NEAR(all->xruns.hours(), 3, 1e-9);
  EXPECT_EQ(all->xruns.count(), 3);
  EXPECT_EQ(player->milliseconds.count(), 100);
  EXPECT_NEAR(speakers->xruns.hours(), 1, 1e-9);
  EXPECT_EQ(speakers->xruns.count(), 1);
  EXPECT_EQ(speakers->milliseconds.count(), 20);
  EXPECT_NEAR(headphones->xruns.hours(), 2, 1e-9);
  EXPECT_EQ(headphones->xruns.count(), 2);
  EXPECT_EQ(headphones->milliseconds.count(), 80);
}

TEST(StreamRatesTest, EachStreamIsAGroup) {
  RecordSeries series;
  series.at(1'000'000);
  for (std::int64_t session = 1; session <= 4; ++session) {
    const RecordSeries::Sender sender{.sessionID = session};
    series.message(sender, "Session_Playback", "Start");
    series.at(1'000'000 + static_cast<double>(session) * 10);
    series.message(sender, "Session_Playback", "Stop");
    series.summary(sender);
  }

  const auto rates = ratesOf(series);

  const StreamRate* const player = find(rates, StreamRate::Of::kApplication, "player");
  ASSERT_TRUE(player);
  EXPECT_EQ(player->xruns.groups(), 4U);
  EXPECT_EQ(player->xruns.perHour(), 0);
}

TEST(StreamRatesTest, AStreamThatNeverRanIsNoGroup) {
  RecordSeries series;
  series.at(1'000'000);
  route(series, kPlayer, "Speakers");
  series.at(1'000'010);
  series.summary(kPlayer);

  EXPECT_THAT(ratesOf(series), testing::IsEmpty());
}

TEST(StreamRatesTest, WhatIsBeyondTheRowsIsCounted) {
  RecordSeries series;
  series.at(1'000'000);
  series.message(kPlayer, "Session_Playback", "Start");
  series.at(1'000'010);
  series.message(kPlayer, "Session_Playback", "Stop");
  series.summary(kPlayer);
  StreamRates rates(2, kText);
  StreamBuilder builder([&](const StreamStory& story) { rates.onStory(story); });
  EXPECT_TRUE(series.forEach({}, [&](const Record& record) { builder.add(record); }));
  builder.finish({});

  EXPECT_EQ(rates.notKept(), 1U);  // the device
  EXPECT_EQ(rates.take().size(), 2U);
}

}  // namespace
}  // namespace halvox::analysis
