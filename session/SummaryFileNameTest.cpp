#include "session/SummaryFileName.h"

#include <string>
#include <string_view>

#include <gtest/gtest.h>

namespace halvox {
namespace {

using namespace std::string_literals;

const platform::LocalTime kTime{.year = 2023,
                                .month = 11,
                                .day = 14,
                                .hour = 2,
                                .minute = 3,
                                .second = 4,
                                .offsetFromUTC = std::chrono::minutes(330)};

std::string nameOf(std::string_view appName) {
  return makeSummaryFileName({.time = kTime, .appName = appName, .serviceName = "haptics"});
}
// The part of the file name that comes from the application's name.
std::string appPart(std::string_view appName) {
  const std::string beginning = "20231114-020304+0530-halvox-";
  const std::string end = "-haptics.json";
  const std::string name = nameOf(appName);
  EXPECT_TRUE(name.starts_with(beginning) && name.ends_with(end)) << name;
  return name.substr(beginning.size(), name.size() - beginning.size() - end.size());
}

TEST(SummaryFileNameTest, NamesTimeApplicationAndService) {
  EXPECT_EQ(nameOf("com.example.player"),
            "20231114-020304+0530-halvox-com.example.player-haptics.json");
}

TEST(SummaryFileNameTest, ZonesWestOfGreenwichAreNegative) {
  platform::LocalTime time = kTime;
  time.offsetFromUTC = std::chrono::minutes(-210);

  const std::string name =
      makeSummaryFileName({.time = time, .appName = "a", .serviceName = "test"});

  EXPECT_EQ(name, "20231114-020304-0330-halvox-a-test.json");
}

TEST(SummaryFileNameTest, GreenwichIsPlusZero) {
  platform::LocalTime time = kTime;
  time.offsetFromUTC = std::chrono::minutes(0);

  EXPECT_EQ(makeSummaryFileName({.time = time, .appName = "a", .serviceName = "test"}),
            "20231114-020304+0000-halvox-a-test.json");
}

TEST(SummaryFileNameTest, SlashesCannotLeaveTheDirectory) {
  EXPECT_EQ(appPart("../../etc/passwd"), "___.._etc_passwd");
  EXPECT_EQ(appPart("/"), "_");
}

TEST(SummaryFileNameTest, LeadingDotsAreReplacedAndOthersKept) {
  EXPECT_EQ(appPart(".."), "__");
  EXPECT_EQ(appPart("...a.b."), "___a.b.");
}

TEST(SummaryFileNameTest, ControlCharactersAreReplaced) {
  EXPECT_EQ(appPart("a\0b\nc\x1f\x7f"s), "a_b_c__");
  EXPECT_EQ(appPart("a\xC2\x80\xC2\x9F\xC2\xA0"), "a__\xC2\xA0");
}

TEST(SummaryFileNameTest, OtherCharactersAreKept) {
  EXPECT_EQ(appPart("Ünser Player \\ 日本"), "Ünser Player \\ 日本");
  EXPECT_EQ(appPart(""), "");
}

TEST(SummaryFileNameTest, ALongNameIsCutToWhatAFileNameHolds) {
  EXPECT_EQ(nameOf(std::string(5000, 'x')).size(), 255U);
  appPart(std::string(5000, 'x'));
}

TEST(SummaryFileNameTest, ANameThatJustFitsIsNotCut) {
  const std::size_t room = 255 - nameOf("").size();

  EXPECT_EQ(appPart(std::string(room, 'x')), std::string(room, 'x'));
  EXPECT_EQ(appPart(std::string(room - 1, 'x')), std::string(room - 1, 'x'));
  EXPECT_EQ(appPart(std::string(room + 1, 'x')), std::string(room, 'x'));
  const std::string whole = "first" + std::string(room - 9, 'x') + "last";
  EXPECT_EQ(appPart(whole + "y"), whole);
}

TEST(SummaryFileNameTest, ALongNameWithoutTheBeginningOfACharacterIsCutToNothing) {
  EXPECT_EQ(appPart(std::string(5000, '\x80')), "");
}

TEST(SummaryFileNameTest, NoCharacterIsCutApartWhereverTheCutFalls) {
  std::string characters;
  for (int count = 0; count < 2000; ++count) characters += "日";

  for (const std::string beginning : {"", "x", "xx"}) {
    EXPECT_EQ(appPart(beginning + characters).size() % 3, beginning.size());
  }
}

TEST(SummaryFileNameTest, NoCharacterIsCutApart) {
  std::string longName = "x";
  for (int count = 0; count < 2000; ++count) longName += "日";

  const std::string part = appPart(longName);

  EXPECT_EQ(part.size() % 3, 1U);
  EXPECT_GE(nameOf(longName).size(), 253U);
  EXPECT_LE(nameOf(longName).size(), 255U);
}

}  // namespace
}  // namespace halvox
