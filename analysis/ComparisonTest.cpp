#include "analysis/Comparison.h"

#include <algorithm>
#include <string>

#include "analysis/ReportBuilder.h"
#include "analysis/testing/RecordSeries.h"
#include <gmock/gmock.h>

namespace halvox::analysis {
namespace {

constexpr double kHour = 3600;

// A day on which streams of an hour each had so many xruns.
ReportData day(const std::vector<int>& xruns, const std::string& application = "player") {
  RecordSeries series;
  double time = 1'000'000;
  std::int64_t session = 0;
  for (const int each : xruns) {
    const RecordSeries::Sender sender{.application = application, .sessionID = ++session};
    series.at(time);
    series.message(sender, "RouteChange", "State", R"("active_devices":"Speakers")");
    series.message(sender, "Session_Playback", "Start");
    for (int xrun = 0; xrun < each; ++xrun) {
      series.message(
          sender, "Session_Playback", "IssueDetector",
          R"("issue_type":"xrun","xrun_milliseconds":10,"number":)" + std::to_string(xrun));
    }
    series.at(time += kHour);
    series.message(sender, "Session_Playback", "Stop");
    series.summary(sender);
  }
  ReportBuilder builder;
  EXPECT_TRUE(series.forEach({}, [&](const Record& record) { builder.add(record); }));
  return builder.finish({});
}

Change find(const std::vector<Change>& changes, Change::Kind kind, const std::string& of,
            const std::string& what = "") {
  const auto found = std::ranges::find_if(changes, [&](const Change& change) {
    return change.kind == kind && change.of == of && (what.empty() || change.what == what);
  });
  EXPECT_NE(found, changes.end()) << of << ' ' << what;
  return found == changes.end() ? Change{} : *found;
}

TEST(ComparisonTest, MoreXrunsAnHourAreWorse) {
  const auto changes = compare(day({2, 3, 2, 3}), day({20, 30, 20, 30}));

  const Change change = find(changes, Change::Kind::kXruns, "all streams");
  EXPECT_EQ(change.before, 2.5);
  EXPECT_EQ(change.after, 25);
  ASSERT_TRUE(change.ratio && change.low && change.high);
  EXPECT_NEAR(*change.ratio, 10, 1e-9);
  EXPECT_GT(*change.low, 4);
  EXPECT_LT(*change.high, 25);
  EXPECT_EQ(change.verdict, Verdict::kWorse);
  EXPECT_EQ(find(changes, Change::Kind::kXruns, "application player").verdict, Verdict::kWorse);
  EXPECT_EQ(find(changes, Change::Kind::kXruns, "device Speakers").verdict, Verdict::kWorse);
  EXPECT_EQ(find(changes, Change::Kind::kMilliseconds, "all streams").after, 250);
}

TEST(ComparisonTest, FewerAreBetter) {
  const auto changes = compare(day({20, 30, 20, 30}), day({2, 3, 2, 3}));

  EXPECT_EQ(find(changes, Change::Kind::kXruns, "all streams").verdict, Verdict::kBetter);
}

// 40 xruns beside 10, but all of them in one stream of four.
TEST(ComparisonTest, OneBadStreamProvesNothing) {
  const auto changes = compare(day({2, 3, 2, 3}), day({0, 0, 40, 0}));

  const Change change = find(changes, Change::Kind::kXruns, "all streams");
  EXPECT_NEAR(change.ratio.value_or(0), 4, 1e-9);
  ASSERT_TRUE(change.low && change.high);
  EXPECT_LT(*change.low, 1);
  EXPECT_GT(*change.high, 4);
  EXPECT_EQ(change.verdict, Verdict::kUnclear);
}

TEST(ComparisonTest, TwoStreamsAreTooFewForAnInterval) {
  const auto changes = compare(day({2, 3}), day({20, 30}));

  const Change change = find(changes, Change::Kind::kXruns, "all streams");
  EXPECT_NEAR(change.ratio.value_or(0), 10, 1e-9);
  EXPECT_FALSE(change.low);
  EXPECT_EQ(change.verdict, Verdict::kUnclear);
}

TEST(ComparisonTest, XrunsAfterNoneAreWorseWithAFiniteRatio) {
  const auto changes = compare(day({0, 0, 0, 0}), day({20, 30, 20, 30}));

  const Change change = find(changes, Change::Kind::kXruns, "all streams");
  EXPECT_EQ(change.before, 0);
  EXPECT_EQ(change.after, 25);
  EXPECT_NEAR(change.ratio.value_or(0), 100.5 / 0.5, 1e-9);
  EXPECT_EQ(change.verdict, Verdict::kWorse);
  // Half a millisecond would be no better than any other number.
  EXPECT_FALSE(find(changes, Change::Kind::kMilliseconds, "all streams").ratio);
}

// The 10 ms of each xrun are equal in all streams, but how often they happen is chance.
TEST(ComparisonTest, ATimeThatIsLostInAFewXrunsIsAsUncertainAsTheirNumber) {
  const auto changes = compare(day({1, 1, 1}), day({2, 2, 2}));

  const Change lost = find(changes, Change::Kind::kMilliseconds, "all streams");
  const Change xruns = find(changes, Change::Kind::kXruns, "all streams");
  EXPECT_EQ(lost.verdict, Verdict::kUnclear);
  ASSERT_TRUE(lost.low && xruns.low);
  EXPECT_NEAR(*lost.low, *xruns.low, 1e-9);
}

TEST(ComparisonTest, NothingLostTwiceIsNoChange) {
  const auto changes = compare(day({0, 0, 0}), day({0, 0, 0}));

  const Change change = find(changes, Change::Kind::kXruns, "all streams");
  EXPECT_EQ(change.before, 0);
  EXPECT_EQ(change.after, 0);
  EXPECT_FALSE(change.ratio);
  EXPECT_EQ(change.verdict, Verdict::kUnclear);
}

TEST(ComparisonTest, AnApplicationThatDidNotPlayBeforeHasNoRatio) {
  const auto changes = compare(day({1, 1, 1}), day({1, 1, 1}, "browser"));

  const Change browser = find(changes, Change::Kind::kXruns, "application browser");
  EXPECT_FALSE(browser.before);
  EXPECT_EQ(browser.after, 1);
  EXPECT_FALSE(browser.ratio);
}

TEST(ComparisonTest, MoreEventsOfANameAreNeitherGoodNorBad) {
  const auto changes = compare(day({20, 20, 20, 20, 20, 20}), day({2, 2, 2, 2, 2, 2}));

  const Change change = find(changes, Change::Kind::kEvents, "", "Session_Playback.IssueDetector");
  EXPECT_THAT(change.verdict, testing::AnyOf(Verdict::kLower, Verdict::kUnclear));
  EXPECT_NEAR(change.before.value_or(0), 20, 0.5);
  EXPECT_NEAR(change.after.value_or(0), 2, 0.1);
}

TEST(ComparisonTest, WhatGotWorseMostComesFirst) {
  const auto changes = compare(day({2, 3, 2, 3}), day({20, 30, 20, 30}));

  ASSERT_FALSE(changes.empty());
  EXPECT_EQ(changes.front().verdict, Verdict::kWorse);
  EXPECT_TRUE(std::ranges::is_sorted(changes, {}, &Change::verdict));
}

ReportData withCycles(int reports, const char* histogram) {
  RecordSeries series;
  series.at(1'000'000);
  for (int report = 0; report < reports; ++report) {
    series.at(1'000'000 + report);
    series.message({}, "IOReporting", "Histogram",
                   R"("speakers_Speaker_PipeWire_Histogram_busytime":")" + std::string(histogram) +
                       R"(","number":)" + std::to_string(report));
  }
  ReportBuilder builder;
  EXPECT_TRUE(series.forEach({}, [&](const Record& record) { builder.add(record); }));
  return builder.finish({});
}

constexpr const char* kQuick = "count=100,unit=us::0-50:90;50-100:9;100-200:1";
constexpr const char* kSlow = "count=100,unit=us::0-50:1;50-100:9;100-200:40;200-400:50";

TEST(ComparisonTest, LongerCyclesAreWorse) {
  const auto changes = compare(withCycles(400, kQuick), withCycles(400, kSlow));

  const Change change = find(changes, Change::Kind::kDeviceTime, "device speakers", "busytime p50");
  EXPECT_EQ(change.unit, "us");
  EXPECT_EQ(change.before, 50);
  EXPECT_EQ(change.after, 200);
  EXPECT_EQ(change.ratio, 4);
  EXPECT_EQ(change.verdict, Verdict::kWorse);
}

TEST(ComparisonTest, AFewReportsOfCyclesAreUncertain) {
  const auto changes = compare(withCycles(2, kQuick), withCycles(2, kSlow));

  const Change change = find(changes, Change::Kind::kDeviceTime, "device speakers", "busytime p50");
  EXPECT_EQ(change.ratio, 4);
  EXPECT_FALSE(change.low);
  EXPECT_EQ(change.verdict, Verdict::kUnclear);
}

TEST(ComparisonTest, EmptyPeriodsHaveNoChanges) {
  EXPECT_THAT(compare(ReportData{}, ReportData{}), testing::IsEmpty());
}

}  // namespace
}  // namespace halvox::analysis
