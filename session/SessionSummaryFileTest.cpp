#include <chrono>
#include <map>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "session/SummaryFixture.h"

// The summary files of internal builds. They are in a program of their own, because a process
// queries only once whether this is an internal build.
namespace halvox {
namespace {

using platform::Dictionary;
using platform::LogLevel;
using testing::ElementsAre;

const std::string kDirectory =
    "/private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Reporting";
const std::string kName = "20231114-221320+0000-halvox-Unknown-haptics.json";

class SessionSummaryFileTest : public SummaryFixture {
 protected:
  SessionSummaryFileTest() { platform_.deviceProperties.set("InternalBuild", true); }

  // The name of the only file.
  std::string name() const { return platform_.files.files().at(0).name; }
  // The keys of its objects.
  std::vector<std::string> keys() const {
    const platform::FakeFileService::File file = platform_.files.files().at(0);
    std::vector<std::string> result;
    for (const auto& [key, value] : file.objects) result.push_back(key);
    return result;
  }
};

TEST_F(SessionSummaryFileTest, HoldsTheHistoryInOrder) {
  send({{"foo", 1}});
  send({{"foo", 2}});

  session_->stop();

  const platform::FakeFileService::File expected{
      .directory = kDirectory,
      .name = kName,
      .objects = {{"Playback_Start_1", {{"foo", 1}, {"audiotag", "PlaybackStart"}}},
                  {"Playback_Start_2", {{"foo", 2}, {"audiotag", "PlaybackStart"}}}}};
  EXPECT_THAT(platform_.files.files(), ElementsAre(expected));
}

TEST_F(SessionSummaryFileTest, ItsDirectoryIsMadeForEverybody) {
  send({{"foo", 1}});

  session_->stop();

  EXPECT_THAT(platform_.files.directories(), ElementsAre(testing::Pair(kDirectory, 511U)));
}

TEST_F(SessionSummaryFileTest, IsNamedByLocalTimeApplicationAndService) {
  platform_.clock.setOffsetFromUTC(std::chrono::minutes(-90));
  session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "../../player"}});
  session_->setServiceType(AudioServiceType::kTelephony);
  send({{"foo", 1}});

  session_->stop();

  EXPECT_EQ(name(), "20231114-204320-0130-halvox-___.._player-telephony.json");
}

TEST_F(SessionSummaryFileTest, AnApplicationNameThatIsNotTextIsDescribed) {
  session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", 42}});
  send({{"foo", 1}});

  session_->stop();

  EXPECT_EQ(name(), "20231114-221320+0000-halvox-42-haptics.json");
}

TEST_F(SessionSummaryFileTest, HoldsTheVolumeMessagesAndNotTheSummaryEvent) {
  playTwoVolumes();

  session_->stop();

  EXPECT_THAT(keys(), ElementsAre("Playback_Start_1", "Playback_Start_2", "Playback_Start_3",
                                  "Volume_Summary_1", "Volume_Summary_2"));
}

TEST_F(SessionSummaryFileTest, IsWrittenThoughNothingWasPlayed) {
  silent(10);
  platform_.log.clear();

  session_->stop();

  EXPECT_THAT(keys(), ElementsAre("Playback_Start_1"));
  EXPECT_THAT(platform_.log.texts(LogLevel::kDefault),
              ElementsAre("sending summary event for reporter 7"));
}

TEST_F(SessionSummaryFileTest, ComesBeforeTheSummaryEvent) {
  send({{"foo", 1}});
  platform_.log.clear();

  session_->stop();

  const auto texts = platform_.log.texts();
  ASSERT_EQ(texts.size(), 5U);
  EXPECT_TRUE(texts[2].starts_with("jsonOutput writeToURL: /")) << texts[2];
  EXPECT_TRUE(texts[2].ends_with(kDirectory + "/" + kName)) << texts[2];
  EXPECT_EQ(texts[3], "sending summary event for reporter 7");
}

TEST_F(SessionSummaryFileTest, ItsPathIsLoggedAtInfoLevel) {
  send({{"foo", 1}});
  platform_.log.clear();

  session_->stop();

  const auto lines = platform_.log.lines(LogLevel::kInfo);
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_EQ(lines[0].category, "hvrr");
}

TEST_F(SessionSummaryFileTest, TheCallerOfAStopMayWriteTheFileLater) {
  send({{"foo", 1}});
  platform_.log.clear();

  const auto rest = session_->beginStop();
  ASSERT_NE(rest, nullptr);
  EXPECT_FALSE(session_->started());
  send({{"foo", 2}});  // not of the run any more
  EXPECT_TRUE(rest->writePart());

  EXPECT_THAT(keys(), ElementsAre("Playback_Start_1"));
  EXPECT_FALSE(platform_.log.containsText("sending summary event for reporter 7"));
  rest->finish();
  EXPECT_TRUE(platform_.log.containsText("sending summary event for reporter 7"));
}

TEST_F(SessionSummaryFileTest, AStopThatIsDroppedBeforeItsEndLeavesNoFile) {
  for (int number = 0; number < 15'000; ++number) send({{"foo", number}});

  auto rest = session_->beginStop();
  ASSERT_NE(rest, nullptr);
  EXPECT_FALSE(rest->writePart());
  rest.reset();

  EXPECT_THAT(platform_.files.files(), testing::IsEmpty());
}

TEST_F(SessionSummaryFileTest, AFileOfSeveralPartsHoldsTheWholeHistory) {
  for (int number = 0; number < 25'000; ++number) send({{"foo", number}});

  session_->stop();

  ASSERT_EQ(keys().size(), 25'000U);
  EXPECT_EQ(keys().back(), "Playback_Start_25000");
}

TEST_F(SessionSummaryFileTest, AnEmptyHistoryWritesNoFile) {
  EXPECT_EQ(session_->beginStop(), nullptr);

  EXPECT_FALSE(session_->started());
  EXPECT_THAT(platform_.files.steps(), testing::IsEmpty());
}

TEST_F(SessionSummaryFileTest, AStopWithoutAStartWritesNoFile) {
  send({{"foo", 1}});
  session_->stop();

  send({{"foo", 1}});
  session_->stop();

  EXPECT_EQ(platform_.files.files().size(), 1U);
}

TEST_F(SessionSummaryFileTest, ADirectoryThatCannotBeMadeIsLoggedAndTheFileTried) {
  platform_.files.setDirectoryError(platform::Error{.description = "read-only file system"});
  send({{"foo", 1}});

  session_->stop();

  EXPECT_THAT(
      platform_.log.texts(LogLevel::kError),
      ElementsAre("can't create logging directory at " + kDirectory + ": read-only file system"));
  EXPECT_EQ(platform_.files.steps().back(), "commit");
}

TEST_F(SessionSummaryFileTest, AFileThatCannotBeWrittenIsLoggedAndTheStopContinues) {
  platform_.files.setFileError(platform::Error{.description = "no space left"});
  send({{"foo", 1}});

  session_->stop();

  EXPECT_THAT(platform_.log.texts(LogLevel::kError),
              ElementsAre("jsonOutput writeToURL: no space left"));
  EXPECT_TRUE(platform_.log.containsText("sending summary event for reporter 7"));
  EXPECT_FALSE(session_->started());
}

}  // namespace
}  // namespace halvox
