#include "tools/TimeText.h"

#include <cstdlib>
#include <ctime>
#include <limits>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

constexpr double kNow = 1'000'000;  // 1970-01-12 13:46:40 UTC

template <typename T>
std::optional<T> valueOf(const platform::linux_::Result<T>& parsed) {
  return parsed ? std::optional(*parsed) : std::nullopt;
}

class TimeTextTest : public testing::Test {
 protected:
  TimeTextTest() { setZone("UTC"); }
  ~TimeTextTest() override {
    unsetenv("TZ");
    tzset();
  }
  static void setZone(const char* zone) {
    setenv("TZ", zone, 1);
    tzset();
  }
};

TEST_F(TimeTextTest, TimesAreDatesSecondsOrAges) {
  EXPECT_EQ(valueOf(parseTime("1970-01-02T00:00:00Z", kNow)), 86'400.0);
  EXPECT_EQ(valueOf(parseTime("1970-01-02T01:00:00+01:00", kNow)), 86'400.0);
  EXPECT_EQ(valueOf(parseTime("1970-01-02 00:00:00.25Z", kNow)), 86'400.25);
  EXPECT_EQ(valueOf(parseTime("1234.5", kNow)), 1234.5);
  EXPECT_EQ(valueOf(parseTime("90s", kNow)), kNow - 90);
  EXPECT_EQ(valueOf(parseTime("5m", kNow)), kNow - 300);
  EXPECT_EQ(valueOf(parseTime("1.5h", kNow)), kNow - 5400);
  EXPECT_EQ(valueOf(parseTime("2d", kNow)), kNow - 172'800);
}

TEST_F(TimeTextTest, DatesWithoutOffsetAreLocal) {
  setZone("XXX-02");  // two hours east

  EXPECT_EQ(valueOf(parseTime("1970-01-02T02:00:00", kNow)), 86'400.0);
}

TEST_F(TimeTextTest, ATimeThatIsTooFarOffIsPrintedAsANumber) {
  EXPECT_EQ(utcClockTime(1e19), "10000000000000000000.000000");
  EXPECT_EQ(utcClockTime(-1e19), "-10000000000000000000.000000");
  EXPECT_EQ(utcClockTime(std::numeric_limits<double>::infinity()), "inf");
  EXPECT_EQ(utcClockTime(253'402'300'799), "9999-12-31 23:59:59.000Z");
}

TEST_F(TimeTextTest, WrongTimesAreRefused) {
  for (const char* wrong :
       {"", "5 m", "m", "min", "5y", "--5m", "@", "2026-11-21 22", "2026-11-21 22:4",
        "2026-11-21 24:00", "2026-02-30T00:00:00Z", "2026-13-01T00:00:00Z", "2026-1-1T00:00:00Z",
        "2026-02-30", "2026-01-01 ", "2026-01-01T00:00:00X", "2026-01-01T00:00:00.Z",
        "2026-01-01T00:00:00Z "}) {
    EXPECT_FALSE(valueOf(parseTime(wrong, kNow))) << wrong;
  }
}

TEST_F(TimeTextTest, TimesThatPeopleTypeAreTaken) {
  EXPECT_EQ(valueOf(parseTime("1970-01-02 00:00", kNow)), 86'400.0);
  EXPECT_EQ(valueOf(parseTime("1970-01-02T00:00+01:00", kNow)), 82'800.0);
  EXPECT_EQ(valueOf(parseTime("1970-01-02", kNow)), 86'400.0);
  EXPECT_EQ(valueOf(parseTime("now", kNow)), kNow);
  EXPECT_EQ(valueOf(parseTime("today", kNow)), 11 * 86'400.0);
  EXPECT_EQ(valueOf(parseTime("yesterday", kNow)), 10 * 86'400.0);
  EXPECT_EQ(valueOf(parseTime("-5m", kNow)), kNow - 300);
  EXPECT_EQ(valueOf(parseTime("5min", kNow)), kNow - 300);
  EXPECT_EQ(valueOf(parseTime("-90sec", kNow)), kNow - 90);
  EXPECT_EQ(valueOf(parseTime("1w", kNow)), kNow - 7 * 86'400.0);
  EXPECT_EQ(valueOf(parseTime("@1234.5", kNow)), 1234.5);
}

TEST_F(TimeTextTest, ADayEndsWhereTheNextOneBegins) {
  EXPECT_EQ(parseDay("today", kNow), std::pair(11 * 86'400.0, 12 * 86'400.0));
  EXPECT_EQ(parseDay("yesterday", kNow), std::pair(10 * 86'400.0, 11 * 86'400.0));
  EXPECT_EQ(parseDay("1970-01-31", kNow), std::pair(30 * 86'400.0, 31 * 86'400.0));
  EXPECT_EQ(parseDay("1970-01-31 12:00", kNow), std::nullopt);
  EXPECT_EQ(parseDay("5min", kNow), std::nullopt);
}

TEST_F(TimeTextTest, ADayOnWhichTheClockGoesBackHas25Hours) {
  setZone("CET-1CEST,M3.5.0,M10.5.0/3");

  const auto day = parseDay("2026-10-25", kNow);

  ASSERT_TRUE(day);
  EXPECT_EQ(day->second - day->first, 25 * 3600);
}

TEST_F(TimeTextTest, DaysBeginAtMidnightOfTheZoneAlsoWhenTheClockChanges) {
  setZone("CET-1CEST,M3.5.0,M10.5.0/3");
  const double noonAfterTheChange = 1'774'782'000;  // 2026-03-29 13:00 CEST, 12:00 CET

  EXPECT_EQ(valueOf(parseTime("today", noonAfterTheChange)), noonAfterTheChange - 12 * 3600.0);
  EXPECT_EQ(valueOf(parseTime("yesterday", noonAfterTheChange)), noonAfterTheChange - 36 * 3600.0);
}

TEST_F(TimeTextTest, TimesThatCommandsPrintAreTaken) {
  setZone("XXX-02");
  EXPECT_EQ(localTime(86'400.25), "1970-01-02 02:00:00.250");
  EXPECT_EQ(valueOf(parseTime(localTime(86'400.25), kNow)), 86'400.25);
  EXPECT_EQ(utcClockTime(86'400.25), "1970-01-02 00:00:00.250Z");
  EXPECT_EQ(valueOf(parseTime(utcClockTime(86'400.25), kNow)), 86'400.25);
  EXPECT_EQ(valueOf(parseTime("1970-01-02 01:00:00 +0100", kNow)), 86'400.0);  // summary
  EXPECT_EQ(valueOf(parseTime("1970-01-02T00:00:00Z", kNow)), 86'400.0);       // snapshots
  EXPECT_EQ(valueOf(parseTime("19700102T000000Z", kNow)), 86'400.0);           // names of files
  EXPECT_EQ(valueOf(parseTime("19700102-010000+0100", kNow)), 86'400.0);
}

TEST_F(TimeTextTest, WrongTimesAreReportedWithExamples) {
  const auto error = parseTime("tea", kNow).error().message;

  for (const char* part :
       {"\"tea\" is not a time", "\"2026-11-21 22:44\"", "yesterday", "5min", "@"}) {
    EXPECT_NE(error.find(part), std::string::npos) << part;
  }
}

}  // namespace
}  // namespace halvox::tools
