#include "tools/Arguments.h"

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

template <typename T>
std::optional<T> valueOf(const platform::linux_::Result<T>& parsed) {
  return parsed ? std::optional(*parsed) : std::nullopt;
}

template <typename T>
std::string errorOf(const platform::linux_::Result<T>& parsed) {
  return parsed ? "" : parsed.error().message;
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

}  // namespace
}  // namespace halvox::tools
