#include "tools/Arguments.h"

#include <cstdlib>
#include <ctime>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

constexpr double kNow = 1'000'000;

template <typename T>
std::optional<T> valueOf(const Parsed<T>& parsed) {
  const T* value = std::get_if<T>(&parsed);
  return value != nullptr ? std::optional(*value) : std::nullopt;
}

template <typename T>
std::string errorOf(const Parsed<T>& parsed) {
  const auto* error = std::get_if<ArgumentError>(&parsed);
  return error != nullptr ? error->message : "";
}

TEST(ArgumentsTest, ReporterIDsAreWholeNumbersOf64Bits) {
  EXPECT_EQ(valueOf(parseReporterID("7")), 7);
  EXPECT_EQ(valueOf(parseReporterID("-9223372036854775808")), INT64_MIN);
  EXPECT_EQ(valueOf(parseReporterID("0x1F")), 31);
  for (const char* wrong : {"", "seven", "7.0", "9223372036854775808", "0x", "0x-1", "7 "}) {
    EXPECT_FALSE(valueOf(parseReporterID(wrong))) << wrong;
  }
}

TEST(ArgumentsTest, CategoriesAreNamesOrNumbers) {
  EXPECT_EQ(valueOf(parseCategory("Session_Playback")), 0x08000004U);
  EXPECT_EQ(valueOf(parseCategory("playback")), 4U);
  EXPECT_EQ(valueOf(parseCategory("0x08000004")), 0x08000004U);
  EXPECT_EQ(valueOf(parseCategory("4294967295")), 0xFFFFFFFFU);
  EXPECT_FALSE(valueOf(parseCategory("4294967296")));
  EXPECT_FALSE(valueOf(parseCategory("-1")));
}

TEST(ArgumentsTest, ErrorsNameTheTextAndAllPossibilities) {
  const std::string error = errorOf(parseCategory("Plybck"));

  EXPECT_NE(error.find("\"Plybck\""), std::string::npos);
  EXPECT_NE(error.find("Playback (4)"), std::string::npos);
  EXPECT_NE(error.find("Session_"), std::string::npos);
  EXPECT_NE(errorOf(parseEventType("x")).find("Histogram (17)"), std::string::npos);
  EXPECT_NE(errorOf(parseServiceType("x")).find("telephony (2)"), std::string::npos);
}

TEST(ArgumentsTest, TypesAndServicesAreNamesOrNumbersOf16Bits) {
  EXPECT_EQ(valueOf(parseEventType("START")), 1);
  EXPECT_EQ(valueOf(parseEventType("65535")), 65535);
  EXPECT_FALSE(valueOf(parseEventType("65536")));
  EXPECT_EQ(valueOf(parseServiceType("Telephony")), 2);
  EXPECT_EQ(valueOf(parseServiceType("2")), 2);
}

TEST(ArgumentsTest, CountsAreWholeNumbersFromZeroOn) {
  EXPECT_EQ(valueOf(parseCount("0")), 0U);
  EXPECT_EQ(valueOf(parseCount("10")), 10U);
  EXPECT_EQ(valueOf(parseCount("18446744073709551615")), 18'446'744'073'709'551'615U);
  for (const char* wrong : {"", "x", "-1", "1.5", "1e3", " 1", "18446744073709551616"}) {
    EXPECT_FALSE(valueOf(parseCount(wrong))) << wrong;
  }
}

TEST(ArgumentsTest, SecondsMayBeFractionsButNotNothing) {
  EXPECT_EQ(valueOf(parseSeconds("0.5")), std::chrono::milliseconds(500));
  EXPECT_EQ(valueOf(parseSeconds("0.0001")), std::chrono::milliseconds(1));
  for (const char* wrong : {"", "0", "-1", "inf", "nan", "1e99", "5s"}) {
    EXPECT_FALSE(valueOf(parseSeconds(wrong))) << wrong;
  }
}

TEST(ArgumentsTest, TimesAreDatesSecondsOrAges) {
  EXPECT_EQ(valueOf(parseTime("1970-01-02T00:00:00Z", kNow)), 86'400.0);
  EXPECT_EQ(valueOf(parseTime("1970-01-02T01:00:00+01:00", kNow)), 86'400.0);
  EXPECT_EQ(valueOf(parseTime("1970-01-02 00:00:00.25Z", kNow)), 86'400.25);
  EXPECT_EQ(valueOf(parseTime("1234.5", kNow)), 1234.5);
  EXPECT_EQ(valueOf(parseTime("90s", kNow)), kNow - 90);
  EXPECT_EQ(valueOf(parseTime("5m", kNow)), kNow - 300);
  EXPECT_EQ(valueOf(parseTime("1.5h", kNow)), kNow - 5400);
  EXPECT_EQ(valueOf(parseTime("2d", kNow)), kNow - 172'800);
}

TEST(ArgumentsTest, DatesWithoutOffsetAreLocal) {
  setenv("TZ", "XXX-02", 1);  // two hours east
  tzset();

  EXPECT_EQ(valueOf(parseTime("1970-01-02T02:00:00", kNow)), 86'400.0);

  unsetenv("TZ");
  tzset();
}

TEST(ArgumentsTest, WhatIsNoTimeIsRefused) {
  for (const char* wrong :
       {"", "yesterday", "5 m", "-5m", "m", "2026-02-30T00:00:00Z", "2026-13-01T00:00:00Z",
        "2026-1-1T00:00:00Z", "2026-01-01", "2026-01-01T00:00:00X", "2026-01-01T00:00:00.Z",
        "2026-01-01T00:00:00Z "}) {
    EXPECT_FALSE(valueOf(parseTime(wrong, kNow))) << wrong;
  }
}

}  // namespace
}  // namespace halvox::tools
