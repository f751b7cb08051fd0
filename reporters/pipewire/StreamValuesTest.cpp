#include "reporters/pipewire/StreamValues.h"

#include <limits>

#include <gtest/gtest.h>

namespace halvox::pipewire_reporter {
namespace {

constexpr const char* kReplacement = "\xEF\xBF\xBD";

TEST(CleanTextTest, KeepsValidText) {
  EXPECT_EQ(cleanText("Café ♫ 𝄞"), "Café ♫ 𝄞");
  EXPECT_EQ(cleanText(""), "");
}

TEST(CleanTextTest, ReplacesEachBadByteAndKeepsWhatFollows) {
  EXPECT_EQ(cleanText("a\xFF"
                      "b"),
            std::string("a") + kReplacement + "b");
  EXPECT_EQ(cleanText("\xC3("), std::string(kReplacement) + "(");
}

TEST(CleanTextTest, ReplacesTruncatedOverlongAndSurrogateSequences) {
  EXPECT_EQ(cleanText("\xE2\x82"), std::string(kReplacement) + kReplacement);
  EXPECT_EQ(cleanText("\xC0\x80"), std::string(kReplacement) + kReplacement);
  EXPECT_EQ(cleanText("\xED\xA0\x80"), std::string(kReplacement) + kReplacement + kReplacement);
}

TEST(CleanTextTest, ReplacesControlCharacters) {
  EXPECT_EQ(cleanText("a\x1B[2J\nb"), std::string("a") + kReplacement + "[2J" + kReplacement + "b");
  EXPECT_EQ(cleanText(std::string_view("\0", 1)), kReplacement);
}

TEST(CleanTextTest, CutsLongTextAtACharacter) {
  std::string text;
  for (int i = 0; i < 1000; ++i) {
    text += "€";
  }

  const std::string cut = cleanText(text);

  EXPECT_LE(cut.size(), kMaxTextBytes);
  EXPECT_GT(cut.size(), kMaxTextBytes - 8);
  EXPECT_EQ(cut.size() % 3, 0U);
}

TEST(ParseNumberTest, TakesWholeNonNegativeNumbersOnly) {
  EXPECT_EQ(parseNumber("4711"), 4711);
  EXPECT_EQ(parseNumber("0"), 0);
  for (const char* text : {"", "-1", "12x", " 12", "1e3", "0x10", "99999999999999999999"}) {
    EXPECT_FALSE(parseNumber(text)) << text;
  }
}

TEST(DescribeFormatTest, NamesEncodingRateAndChannels) {
  EXPECT_EQ(describeFormat({.encoding = "F32LE", .rate = 48000, .channels = 2}),
            "F32LE 48000 Hz 2 ch");
  EXPECT_EQ(describeFormat({.encoding = "mp3"}), "mp3");
}

TEST(StreamVolumeTest, IsUnknownUntilTheFirstChange) {
  StreamVolume volume;
  EXPECT_FALSE(volume.effective());

  volume.apply({.volume = {}, .channels = {}, .muted = true});

  EXPECT_FALSE(volume.effective());
}

TEST(StreamVolumeTest, MultipliesStreamVolumeAndLoudestChannel) {
  StreamVolume volume;

  volume.apply({.volume = 0.5F, .channels = {{0.2F, 0.8F}}, .muted = false});

  EXPECT_DOUBLE_EQ(*volume.effective(), 0.4);
}

TEST(StreamVolumeTest, IsZeroWhileMutedAndReturnsAfterwards) {
  StreamVolume volume;
  volume.apply({.volume = 0.3F, .channels = {}, .muted = {}});

  volume.apply({.volume = {}, .channels = {}, .muted = true});
  EXPECT_EQ(volume.effective(), 0.0);
  volume.apply({.volume = {}, .channels = {}, .muted = false});

  EXPECT_EQ(volume.effective(), 0.3);
}

TEST(StreamVolumeTest, IgnoresNumbersThatAreNotVolumes) {
  StreamVolume volume;
  volume.apply({.volume = 0.5F, .channels = {{1.0F}}, .muted = false});

  volume.apply({.volume = std::numeric_limits<float>::quiet_NaN(), .channels = {}, .muted = {}});
  volume.apply({.volume = -1.0F, .channels = {{-0.5F, 1.0F}}, .muted = {}});
  volume.apply({.volume = std::numeric_limits<float>::infinity(),
                .channels = {std::vector<float>{}},
                .muted = {}});

  EXPECT_EQ(volume.effective(), 0.5);
}

TEST(StreamVolumeTest, AmplifiesUpToAHundred) {
  StreamVolume volume;
  volume.apply({.volume = 1.5F, .channels = {}, .muted = {}});
  EXPECT_EQ(volume.effective(), 1.5);

  volume.apply({.volume = 3e38F, .channels = {{3e38F}}, .muted = {}});

  EXPECT_EQ(volume.effective(), 100.0);
}

}  // namespace
}  // namespace halvox::pipewire_reporter
