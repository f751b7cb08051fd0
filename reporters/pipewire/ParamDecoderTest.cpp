#include "reporters/pipewire/ParamDecoder.h"

#include <array>
#include <cstring>

#include <gtest/gtest.h>
#include <spa/param/audio/format-utils.h>
#include <spa/param/param.h>
#include <spa/param/props.h>
#include <spa/pod/builder.h>

namespace halvox::pipewire_reporter {
namespace {

class ParamDecoderTest : public testing::Test {
 protected:
  ParamDecoderTest() { spa_pod_builder_init(&builder, buffer.data(), sizeof buffer); }

  spa_pod* makeRawFormat(std::uint32_t encoding, int rate, int channels) {
    return static_cast<spa_pod*>(spa_pod_builder_add_object(
        &builder, SPA_TYPE_OBJECT_Format, SPA_PARAM_Format, SPA_FORMAT_mediaType,
        SPA_POD_Id(SPA_MEDIA_TYPE_audio), SPA_FORMAT_mediaSubtype,
        SPA_POD_Id(SPA_MEDIA_SUBTYPE_raw), SPA_FORMAT_AUDIO_format, SPA_POD_Id(encoding),
        SPA_FORMAT_AUDIO_rate, SPA_POD_Int(rate), SPA_FORMAT_AUDIO_channels,
        SPA_POD_Int(channels)));
  }
  // Makes a Props object with an array of floats whose elements claim to have that size.
  spa_pod* makeChannelVolumes(std::uint32_t elementSize, std::uint32_t type, const void* elements,
                              std::uint32_t count) {
    spa_pod_frame frame{};
    spa_pod_builder_push_object(&builder, &frame, SPA_TYPE_OBJECT_Props, SPA_PARAM_Props);
    spa_pod_builder_prop(&builder, SPA_PROP_channelVolumes, 0);
    spa_pod_builder_array(&builder, elementSize, type, count, elements);
    return static_cast<spa_pod*>(spa_pod_builder_pop(&builder, &frame));
  }

  alignas(8) std::array<std::uint8_t, 16384> buffer{};
  spa_pod_builder builder{};
};

TEST_F(ParamDecoderTest, ReadsRawFormats) {
  const auto format = decodeFormat(makeRawFormat(SPA_AUDIO_FORMAT_F32_LE, 48000, 2));

  EXPECT_EQ(format, (StreamFormat{.encoding = "F32LE", .rate = 48000, .channels = 2}));
}

TEST_F(ParamDecoderTest, NamesFormatsThatItDoesNotKnow) {
  const auto format = decodeFormat(makeRawFormat(0x7777, 8000, 1));

  EXPECT_EQ(format, (StreamFormat{.encoding = "unknown", .rate = 8000, .channels = 1}));
}

TEST_F(ParamDecoderTest, NamesTheEncodingOfCodedAudio) {
  auto* pod = static_cast<spa_pod*>(
      spa_pod_builder_add_object(&builder, SPA_TYPE_OBJECT_Format, SPA_PARAM_Format,
                                 SPA_FORMAT_mediaType, SPA_POD_Id(SPA_MEDIA_TYPE_audio),
                                 SPA_FORMAT_mediaSubtype, SPA_POD_Id(SPA_MEDIA_SUBTYPE_mp3)));

  EXPECT_EQ(decodeFormat(pod), StreamFormat{.encoding = "mp3"});
}

TEST_F(ParamDecoderTest, TakesNoOtherParametersForFormats) {
  const float volume = 1;
  EXPECT_FALSE(decodeFormat(nullptr));
  EXPECT_FALSE(decodeFormat(makeChannelVolumes(sizeof volume, SPA_TYPE_Float, &volume, 1)));
}

TEST_F(ParamDecoderTest, TakesNoVideoForAudio) {
  auto* pod = static_cast<spa_pod*>(
      spa_pod_builder_add_object(&builder, SPA_TYPE_OBJECT_Format, SPA_PARAM_Format,
                                 SPA_FORMAT_mediaType, SPA_POD_Id(SPA_MEDIA_TYPE_video),
                                 SPA_FORMAT_mediaSubtype, SPA_POD_Id(SPA_MEDIA_SUBTYPE_raw)));

  EXPECT_FALSE(decodeFormat(pod));
}

TEST_F(ParamDecoderTest, TakesNegativeNumbersForUnknown) {
  const auto format = decodeFormat(makeRawFormat(SPA_AUDIO_FORMAT_F32_LE, -48000, -2));

  EXPECT_EQ(format, StreamFormat{.encoding = "F32LE"});
}

TEST_F(ParamDecoderTest, ReadsVolumeChannelsAndMute) {
  const std::array<float, 2> channels{0.25F, 0.5F};
  auto* pod = static_cast<spa_pod*>(spa_pod_builder_add_object(
      &builder, SPA_TYPE_OBJECT_Props, SPA_PARAM_Props, SPA_PROP_volume, SPA_POD_Float(0.75F),
      SPA_PROP_mute, SPA_POD_Bool(true), SPA_PROP_channelVolumes,
      SPA_POD_Array(sizeof(float), SPA_TYPE_Float, channels.size(), channels.data())));

  const VolumeChange change = decodeVolume(pod);

  EXPECT_EQ(change.volume, 0.75F);
  EXPECT_EQ(change.channels, (std::vector<float>{0.25F, 0.5F}));
  EXPECT_EQ(change.muted, true);
}

TEST_F(ParamDecoderTest, LeavesOutWhatIsMissingOrOfAnotherType) {
  auto* pod = static_cast<spa_pod*>(
      spa_pod_builder_add_object(&builder, SPA_TYPE_OBJECT_Props, SPA_PARAM_Props, SPA_PROP_volume,
                                 SPA_POD_String("loud"), SPA_PROP_channelVolumes, SPA_POD_Int(7)));

  const VolumeChange change = decodeVolume(pod);

  EXPECT_FALSE(change.volume);
  EXPECT_FALSE(change.channels);
  EXPECT_FALSE(change.muted);
  EXPECT_FALSE(decodeVolume(nullptr).volume);
  EXPECT_FALSE(decodeVolume(makeRawFormat(SPA_AUDIO_FORMAT_F32_LE, 48000, 2)).volume);
}

TEST_F(ParamDecoderTest, RefusesAnArrayWhoseElementsClaimAnotherSize) {
  const std::array<std::uint8_t, 2048> elements{};

  EXPECT_FALSE(decodeVolume(makeChannelVolumes(32, SPA_TYPE_Float, elements.data(), 64)).channels);
}

TEST_F(ParamDecoderTest, TakesAnEmptyArrayForNoVolumes) {
  EXPECT_FALSE(
      decodeVolume(makeChannelVolumes(sizeof(float), SPA_TYPE_Float, nullptr, 0)).channels);
}

TEST_F(ParamDecoderTest, ReadsAsManyChannelsAsPipeWireHas) {
  const std::vector<float> elements(1000, 0.5F);

  const auto change =
      decodeVolume(makeChannelVolumes(sizeof(float), SPA_TYPE_Float, elements.data(), 1000));

  ASSERT_TRUE(change.channels);
  EXPECT_EQ(change.channels->size(), std::size_t{SPA_AUDIO_MAX_CHANNELS});
}

}  // namespace
}  // namespace halvox::pipewire_reporter
