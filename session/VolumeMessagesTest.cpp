#include "session/VolumeMessages.h"

#include <cmath>
#include <limits>
#include <string>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Value;
using platform::ValueKind;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

class VolumeMessagesTest : public testing::Test {
 protected:
  // Adds a message in which a client plays, or is silent, at this volume and time.
  void playing(const Value& volume, double stamp) { volumeMessage(volume, 1, stamp); }
  void silent(const Value& volume, double stamp) { volumeMessage(volume, 0, stamp); }
  void volumeMessage(const Value& volume, const Value& state, const Value& stamp) {
    add({{"RQSessionVolume", volume},
         {"RQSessionVolumePlayingState", state},
         {"hvreporting_timestamp", stamp}});
  }
  void add(const Dictionary& message) {
    history_.append(history_.base(AudioEventCategory::kVolume, AudioEventType::kState), message);
  }
  std::vector<Dictionary> messages(double minimum) const {
    return HVReportingSession::createVolumeMessages(history_, minimum);
  }
  // The values under a key in all messages.
  std::vector<std::string> texts(std::string_view key, double minimum = 1) const {
    std::vector<std::string> result;
    for (const Dictionary& message : messages(minimum)) {
      result.push_back(describe(*message.find(key)));
    }
    return result;
  }
  // "volume: seconds" for each message.
  std::vector<std::string> intervals(double minimum = 1) const {
    std::vector<std::string> result;
    for (const Dictionary& message : messages(minimum)) {
      result.push_back(describe(*message.find("RQSessionVolume")) + ": " +
                       describe(*message.find("play_seconds")));
    }
    return result;
  }

  platform::FakePlatform platform_;
  MessageHistory history_;
};

TEST_F(VolumeMessagesTest, AMessageHasSevenEntries) {
  playing(0.5, 10);
  playing(0.5, 20);
  silent(0.5, 40);

  EXPECT_THAT(messages(5), ElementsAre(Dictionary{{"session_selected_format", "Unknown"},
                                                  {"active_devices", "Unknown"},
                                                  {"RQSessionVolumeOperationProcess", "Unknown"},
                                                  {"RQSessionVolume", 0.5},
                                                  {"RQSessionVolumeBucketed", "0.5"},
                                                  {"play_seconds", 30},
                                                  {"play_secondsBucketed", "30"}}));
}

TEST_F(VolumeMessagesTest, DroppedKeysAreNotInTheMessageThatIsMade) {
  for (const auto* key : {"session_selected_format", "RQSessionVolumeBucketed", "play_seconds"}) {
    platform_.privacy.drop(key);
  }
  playing(0.5, 10);
  silent(0.5, 40);

  EXPECT_THAT(messages(5), ElementsAre(Dictionary{{"active_devices", "Unknown"},
                                                  {"RQSessionVolumeOperationProcess", "Unknown"},
                                                  {"RQSessionVolume", 0.5},
                                                  {"play_secondsBucketed", "30"}}));
}

TEST_F(VolumeMessagesTest, SecondsHaveSinglePrecision) {
  playing(0.5, 0.125);
  silent(0.5, 10.225);

  const Value seconds = *messages(1).at(0).find("play_seconds");

  EXPECT_EQ(seconds.numberKind(), platform::NumberKind::kFloat);
  EXPECT_EQ(seconds.toDouble(), static_cast<double>(static_cast<float>(10.225 - 0.125)));
}

TEST_F(VolumeMessagesTest, AnIntervalBelowTheMinimumIsDropped) {
  playing(0.5, 10);
  silent(0.5, 14);

  EXPECT_THAT(messages(5), IsEmpty());
}

TEST_F(VolumeMessagesTest, AnIntervalOfTheMinimumIsDroppedToo) {
  playing(0.5, 10);
  silent(0.5, 15);

  EXPECT_THAT(messages(5), IsEmpty());
  EXPECT_THAT(messages(4.999), SizeIs(1));
}

TEST_F(VolumeMessagesTest, AChangeOfVolumeEndsAnIntervalAndBeginsAnother) {
  playing(0.5, 10);
  playing(0.75, 20);
  silent(0.75, 25);

  EXPECT_THAT(intervals(), ElementsAre("0.5: 10", "0.75: 5"));
}

TEST_F(VolumeMessagesTest, AnIntervalThatIsStillOpenIsNotReported) {
  playing(0.5, 10);

  EXPECT_THAT(messages(0), IsEmpty());
}

TEST_F(VolumeMessagesTest, AHistoryWithoutVolumeGivesNothing) {
  EXPECT_THAT(messages(0), IsEmpty());
  add({{"a", 1}, {"RQSessionVolumePlayingState", 1}, {"hvreporting_timestamp", 10}});
  add({{"a", 2}, {"RQSessionVolumePlayingState", 0}, {"hvreporting_timestamp", 20}});

  EXPECT_THAT(messages(0), IsEmpty());
}

TEST_F(VolumeMessagesTest, TheDescriptionsSeenLastCount) {
  add({{"session_selected_format", "old"}, {"active_devices", "Speaker"}});
  playing(0.5, 10);
  add({{"session_selected_format", "lpcm"}, {"RQSessionVolumeOperationProcess", "mixer"}});
  silent(0.5, 20);

  const Dictionary message = messages(1).at(0);

  EXPECT_EQ(*message.find("session_selected_format"), Value("lpcm"));
  EXPECT_EQ(*message.find("active_devices"), Value("Speaker"));
  EXPECT_EQ(*message.find("RQSessionVolumeOperationProcess"), Value("mixer"));
}

TEST_F(VolumeMessagesTest, AChangeOfFormatInMidIntervalDoesNotEndIt) {
  playing(0.5, 10);
  add({{"session_selected_format", "lpcm"}, {"hvreporting_timestamp", 15}});
  playing(0.5, 20);
  silent(0.5, 30);

  EXPECT_THAT(intervals(), ElementsAre("0.5: 20"));
  EXPECT_EQ(*messages(1).at(0).find("session_selected_format"), Value("lpcm"));
}

TEST_F(VolumeMessagesTest, TheMessageThatEndsAnIntervalMayChangeItsDescription) {
  playing(0.5, 10);
  add({{"RQSessionVolume", 0.5}, {"active_devices", "Headset"}, {"hvreporting_timestamp", 20}});

  EXPECT_EQ(*messages(1).at(0).find("active_devices"), Value("Headset"));
}

TEST_F(VolumeMessagesTest, DescriptionsNeedNotBeTexts) {
  add({{"active_devices", platform::Array{"a", "b"}}, {"session_selected_format", 7}});
  playing(0.5, 10);
  silent(0.5, 20);

  const Dictionary message = messages(1).at(0);

  EXPECT_EQ(*message.find("active_devices"), Value(platform::Array{"a", "b"}));
  EXPECT_EQ(*message.find("session_selected_format"), Value(7));
}

TEST_F(VolumeMessagesTest, MutingEndsAnIntervalAndPlaysAtVolumeZero) {
  playing(0.5, 10);
  playing(0, 20);
  playing(0.5, 26);
  silent(0.5, 30);

  EXPECT_THAT(intervals(), ElementsAre("0.5: 10", "0: 6", "0.5: 4"));
}

TEST_F(VolumeMessagesTest, SilenceInBetweenIsNotCounted) {
  playing(0.5, 10);
  silent(0.5, 20);
  silent(0.5, 90);
  playing(0.5, 100);
  silent(0.5, 103);

  EXPECT_THAT(intervals(), ElementsAre("0.5: 10", "0.5: 3"));
}

TEST_F(VolumeMessagesTest, TheVolumeOfTheEndingMessageIsNotTheOneReported) {
  playing(0.5, 10);
  silent(0.9, 20);

  EXPECT_THAT(intervals(), ElementsAre("0.5: 10"));
}

TEST_F(VolumeMessagesTest, AVolumeWithoutAStateMeansNotPlaying) {
  playing(0.5, 10);
  add({{"RQSessionVolume", 0.5}, {"hvreporting_timestamp", 20}});
  add({{"RQSessionVolume", 0.5}, {"hvreporting_timestamp", 30}});

  EXPECT_THAT(intervals(), ElementsAre("0.5: 10"));
}

TEST_F(VolumeMessagesTest, StampsThatGoBackwardsGiveNoInterval) {
  playing(0.5, 100);
  playing(0.75, 40);  // the clock was set back
  silent(0.75, 50);

  EXPECT_THAT(intervals(), ElementsAre("0.75: 10"));
}

TEST_F(VolumeMessagesTest, AVolumeMayBeAnInteger) {
  playing(1, 10);
  playing(1.0, 20);  // the same number
  silent(1, 30);

  EXPECT_THAT(intervals(), ElementsAre("1: 20"));
  EXPECT_EQ(*messages(1).at(0).find("RQSessionVolumeBucketed"), Value("1.0"));
}

TEST_F(VolumeMessagesTest, AVolumeAsTextCountsAsZero) {
  playing(0.5, 10);
  playing("0.5", 20);
  silent("0.5", 24);

  EXPECT_THAT(intervals(), ElementsAre("0.5: 10", "0: 4"));
}

TEST_F(VolumeMessagesTest, AStateAsTextMeansNotPlaying) {
  playing(0.5, 10);
  volumeMessage(0.5, "1", 20);
  silent(0.5, 30);

  EXPECT_THAT(intervals(), ElementsAre("0.5: 10"));
}

TEST_F(VolumeMessagesTest, AStateIsReadAsAnInteger) {
  volumeMessage(0.5, true, 10);
  volumeMessage(0.5, -2, 20);
  volumeMessage(0.5, 0.9, 30);  // less than 1 reads as 0
  volumeMessage(0.5, 0.9, 40);

  EXPECT_THAT(intervals(), ElementsAre("0.5: 20"));
}

TEST_F(VolumeMessagesTest, AVolumeThatIsNotANumberIsHeldLikeOthers) {
  const double nan = std::numeric_limits<double>::quiet_NaN();
  playing(nan, 10);
  playing(nan, 20);
  silent(nan, 30);

  const Dictionary message = messages(1).at(0);

  EXPECT_TRUE(std::isnan(message.find("RQSessionVolume")->toDouble()));
  EXPECT_EQ(*message.find("play_seconds"), Value(20));
  EXPECT_EQ(message.find("RQSessionVolumeBucketed")->kind(), ValueKind::kString);
}

TEST_F(VolumeMessagesTest, AStampThatIsNotANumberGivesNoInterval) {
  const double nan = std::numeric_limits<double>::quiet_NaN();
  playing(0.5, nan);
  playing(0.75, 20);
  silent(0.75, nan);

  EXPECT_THAT(messages(0), IsEmpty());
}

TEST_F(VolumeMessagesTest, WithoutAStampNoIntervalOpens) {
  add({{"RQSessionVolume", 0.5}, {"RQSessionVolumePlayingState", 1}});
  silent(0.5, 20);
  volumeMessage(0.5, 1, "30");  // text is not a stamp
  silent(0.5, 40);

  EXPECT_THAT(messages(0), IsEmpty());
}

TEST_F(VolumeMessagesTest, AnEndWithoutAStampIsTooShort) {
  playing(0.5, 10);
  add({{"RQSessionVolume", 0.5}});
  playing(0.5, 20);
  silent(0.5, 30);

  EXPECT_THAT(intervals(), ElementsAre("0.5: 10"));
}

TEST_F(VolumeMessagesTest, VolumesAndSecondsAreBucketed) {
  playing(0.53, 0);
  playing(7, 59);
  silent(7, 20'000);

  const auto made = messages(1);

  EXPECT_EQ(*made.at(0).find("RQSessionVolumeBucketed"), Value("0.5"));
  EXPECT_EQ(*made.at(0).find("play_secondsBucketed"), Value("60"));
  EXPECT_EQ(*made.at(1).find("RQSessionVolumeBucketed"), Value("1.0"));
  EXPECT_EQ(*made.at(1).find("play_secondsBucketed"), Value("18000"));
}

TEST_F(VolumeMessagesTest, VolumeBucketsAreSixteenthsWithFourDigits) {
  for (int sixteenths = 0; sixteenths <= 16; ++sixteenths) {
    playing(sixteenths / 16.0, 10 * sixteenths);
  }
  silent(1, 170);

  EXPECT_THAT(
      texts("RQSessionVolumeBucketed"),
      ElementsAre("0.0", "0.0625", "0.125", "0.1875", "0.25", "0.3125", "0.375", "0.4375", "0.5",
                  "0.5625", "0.625", "0.6875", "0.75", "0.8125", "0.875", "0.9375", "1.0"));
}

TEST_F(VolumeMessagesTest, SecondsBucketsAreElevenWholeNumbers) {
  for (const double seconds : {0, 1, 5, 10, 30, 60, 300, 1800, 3600, 7200, 18'000}) {
    playing(0.5, 0);
    silent(0.5, seconds);
  }

  EXPECT_THAT(texts("play_secondsBucketed", -1),
              ElementsAre("0", "1", "5", "10", "30", "60", "300", "1800", "3600", "7200", "18000"));
}

TEST_F(VolumeMessagesTest, OtherMessagesInBetweenChangeNothing) {
  playing(0.5, 10);
  add({{"a", 1}, {"hvreporting_timestamp", 15}});
  silent(0.5, 20);

  EXPECT_THAT(intervals(), ElementsAre("0.5: 10"));
}

}  // namespace
}  // namespace halvox
