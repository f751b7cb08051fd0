#include "tools/ReportComparison.h"

#include <fstream>
#include <string>

#include <gmock/gmock.h>

#include "tools/ReportPage.h"
#include "tools/StoreCommandFixture.h"

namespace halvox::tools {
namespace {

using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::StartsWith;

constexpr double kNow = 1'000'000;

std::string errorOf(std::string_view text) {
  const auto parsed = parseComparedPeriod(text, kNow);
  return parsed ? "" : parsed.error().message;
}

TEST(ComparedPeriodTest, ADayIsAPeriod) {
  const auto period = parseComparedPeriod("yesterday", kNow);

  ASSERT_TRUE(period);
  ASSERT_TRUE(period->since && period->until);
  EXPECT_EQ(*period->until - *period->since, 86'400);
  EXPECT_THAT(period->database, IsEmpty());
}

TEST(ComparedPeriodTest, ARangeHasOneOrTwoTimes) {
  const auto both = parseComparedPeriod("@100..@200", kNow);
  const auto since = parseComparedPeriod("@100..", kNow);
  const auto until = parseComparedPeriod("..2h", kNow);

  ASSERT_TRUE(both && since && until);
  EXPECT_EQ(both->since, 100);
  EXPECT_EQ(both->until, 200);
  EXPECT_EQ(since->until, std::nullopt);
  EXPECT_EQ(until->since, std::nullopt);
  EXPECT_EQ(until->until, kNow - 7200);
}

TEST(ComparedPeriodTest, APathIsAStore) {
  for (const char* path : {"./before", "/var/lib/halvox", "../halvox.db", "before.db"}) {
    const auto period = parseComparedPeriod(path, kNow);
    ASSERT_TRUE(period) << path;
    EXPECT_EQ(period->database, path);
    EXPECT_FALSE(period->since || period->until);
  }
}

TEST(ComparedPeriodTest, APeriodThatEndsBeforeItBeginsIsRefused) {
  EXPECT_THAT(errorOf("@200..@100"), HasSubstr("\"@200..@100\" ends before it begins"));
  EXPECT_THAT(errorOf("@200..@200"), HasSubstr("ends before it begins"));
}

TEST(ComparedPeriodTest, WhatIsNeitherIsRefusedWithWhatIsExpected) {
  EXPECT_THAT(errorOf("tuesday"), HasSubstr("\"tuesday\" is not a period; expected a day"));
  EXPECT_THAT(errorOf("2h"), HasSubstr("is not a period"));
  EXPECT_THAT(errorOf("soon..now"), HasSubstr("\"soon\" is not a time"));
  EXPECT_THAT(errorOf("now..soon"), HasSubstr("\"soon\" is not a time"));
  EXPECT_THAT(errorOf(".."), HasSubstr("give at least one"));
}

// Events are one second apart: three sessions, each with an xrun, from 100 seconds after 1970 on,
// and three more with three xruns each.
class ReportComparisonTest : public StoreCommandFixture {
 protected:
  void SetUp() override {
    for (int session = 0; session < 3; ++session) play(session, 1);
    for (int session = 3; session < 6; ++session) play(session, 3);
  }

  void play(int session, int xruns) {
    const auto send = [&](const char* type, platform::Dictionary payload) {
      payload.set("hvreporting_timestamp", static_cast<double>(time_++));
      payload.set("object_serial", session);
      payload.set("HostApplicationDisplayID", "player\x1b[31m");
      store("com.tarno.halvox.Session_Playback." + std::string(type), payload);
    };
    send("Start", {{"run", 1}});
    for (int xrun = 0; xrun < xruns; ++xrun) {
      send("IssueDetector", {{"issue_type", "xrun"}, {"xrun_milliseconds", 20}, {"number", xrun}});
    }
    send("Stop", {{"run", 1}});
  }

  ExitStatus run(const std::string& before, const std::string& after, const std::string& to = "") {
    return compareReports({.before = *parseComparedPeriod(before, kNow),
                           .after = *parseComparedPeriod(after, kNow),
                           .to = to,
                           .database = directory()},
                          options_, streams());
  }

 private:
  int time_ = 100;
};

TEST_F(ReportComparisonTest, PrintsBothPeriodsAndTheFigures) {
  EXPECT_EQ(run("..@109", "@109.."), ExitStatus::kDone);

  EXPECT_THAT(output(), HasSubstr("Before  1970-01-01"));
  EXPECT_THAT(output(), HasSubstr("3 streams ran 0.002 h, 3 xruns"));
  EXPECT_THAT(output(), HasSubstr("3 streams ran 0.003 h, 9 xruns"));
  EXPECT_THAT(output(), HasSubstr("VERDICT"));
  EXPECT_THAT(output(), HasSubstr("all streams"));
  EXPECT_THAT(output(), Not(HasSubstr("\x1b")));
  EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(ReportComparisonTest, PrintsAnObjectForEachFigure) {
  options_.json = true;

  EXPECT_EQ(run("..@109", "@109.."), ExitStatus::kDone);

  EXPECT_THAT(output(), StartsWith("{\"before\":{\"store\":"));
  EXPECT_THAT(output(), HasSubstr("\"what\":\"time lost\",\"of\":\"all streams\",\"unit\":\"ms/h\","
                                  "\"before\":36000.0,\"after\":54000.0,\"ratio\":1.5"));
  EXPECT_THAT(output(), Not(HasSubstr("\x1b")));
}

TEST_F(ReportComparisonTest, WritesAPageBesideTheTable) {
  if (reportPageBeforeData().empty()) GTEST_SKIP() << "this build has no page (HALVOX_REPORT)";
  const std::string file = scratch_.path("comparison.html");

  EXPECT_EQ(run("..@109", "@109..", file), ExitStatus::kDone);

  EXPECT_THAT(output(), HasSubstr("The page is in " + file));
  std::ifstream stream(file);
  const std::string page{std::istreambuf_iterator<char>(stream), {}};
  EXPECT_THAT(page, StartsWith("<!doctype html>"));
  EXPECT_THAT(page, HasSubstr("\"changes\":[{"));
}

TEST_F(ReportComparisonTest, APeriodWithoutRecordsSaysSo) {
  EXPECT_EQ(run("..@50", "@100.."), ExitStatus::kDone);

  EXPECT_THAT(output(), HasSubstr("Before  no records ("));
}

TEST_F(ReportComparisonTest, AMissingStoreIsNamed) {
  EXPECT_EQ(run("/nonexistent/halvox.db", "@100.."), ExitStatus::kNoService);

  EXPECT_THAT(errors(), HasSubstr("/nonexistent/halvox.db"));
}

TEST_F(ReportComparisonTest, APathThatIsNoStoreIsBlamedOnItsOption) {
  EXPECT_EQ(run("/nonexistent", "@100.."), ExitStatus::kBadArguments);

  EXPECT_THAT(errors(), HasSubstr("--compare: /nonexistent is not a store"));
}

}  // namespace
}  // namespace halvox::tools
