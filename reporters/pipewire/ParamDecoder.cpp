#include "reporters/pipewire/ParamDecoder.h"

#include <algorithm>
#include <cstring>

#include <spa/debug/types.h>
#include <spa/param/audio/raw-types.h>
#include <spa/param/format-utils.h>
#include <spa/param/param.h>
#include <spa/param/props.h>
#include <spa/pod/iter.h>
#include <spa/pod/parser.h>

namespace halvox::pipewire_reporter {
namespace {

// Returns the last part of a type's name, such as "S16LE", or "unknown".
std::string typeName(const spa_type_info* types, std::uint32_t type) {
  const char* name = spa_debug_type_find_short_name(types, type);
  return name == nullptr ? "unknown" : name;
}

std::optional<float> readFloat(const spa_pod& value) {
  float number = 0;
  return spa_pod_get_float(&value, &number) == 0 ? std::optional(number) : std::nullopt;
}

std::optional<bool> readBool(const spa_pod& value) {
  bool flag = false;
  return spa_pod_get_bool(&value, &flag) == 0 ? std::optional(flag) : std::nullopt;
}

// Copies the array without the library's function, which trusts the element size that the sender
// of the array claims.
std::optional<std::vector<float>> readFloats(const spa_pod& value) {
  if (spa_pod_is_array(&value) == 0) {
    return std::nullopt;
  }
  std::uint32_t count = 0;
  const void* elements = spa_pod_get_array(&value, &count);
  if (elements == nullptr || count == 0 || SPA_POD_ARRAY_VALUE_TYPE(&value) != SPA_TYPE_Float ||
      SPA_POD_ARRAY_VALUE_SIZE(&value) != sizeof(float)) {
    return std::nullopt;
  }
  // The size of the array is what its sender says. More channels than PipeWire allows are not
  // volumes.
  std::vector<float> numbers(std::min(count, std::uint32_t{SPA_AUDIO_MAX_CHANNELS}));
  std::memcpy(numbers.data(), elements, numbers.size() * sizeof(float));
  return numbers;
}

// Reads encoding, rate and channels of a raw format. Does not use the library's parser for the
// whole format, which would also read the channel positions.
std::optional<StreamFormat> readRawFormat(const spa_pod* param) {
  std::uint32_t encoding = 0;
  std::int32_t rate = 0;
  std::int32_t channels = 0;
  if (spa_pod_parse_object(param, SPA_TYPE_OBJECT_Format, nullptr,              //
                           SPA_FORMAT_AUDIO_format, SPA_POD_OPT_Id(&encoding),  //
                           SPA_FORMAT_AUDIO_rate, SPA_POD_OPT_Int(&rate),       //
                           SPA_FORMAT_AUDIO_channels, SPA_POD_OPT_Int(&channels)) < 0) {
    return std::nullopt;
  }
  // Negative numbers come from a faulty client and count as unknown.
  return StreamFormat{.encoding = typeName(spa_type_audio_format, encoding),
                      .rate = static_cast<std::uint32_t>(std::max(rate, 0)),
                      .channels = static_cast<std::uint32_t>(std::max(channels, 0))};
}

}  // namespace

std::optional<StreamFormat> decodeFormat(const spa_pod* param) {
  std::uint32_t type = 0;
  std::uint32_t subtype = 0;
  if (param == nullptr || spa_format_parse(param, &type, &subtype) < 0 ||
      type != SPA_MEDIA_TYPE_audio) {
    return std::nullopt;
  }
  // Coded audio has a codec in place of a sample format.
  if (subtype != SPA_MEDIA_SUBTYPE_raw) {
    return StreamFormat{.encoding = typeName(spa_type_media_subtype, subtype)};
  }
  return readRawFormat(param);
}

VolumeChange decodeVolume(const spa_pod* param) {
  VolumeChange change;
  if (param == nullptr || !spa_pod_is_object_type(param, SPA_TYPE_OBJECT_Props)) {
    return change;
  }
  // The library's loop over properties takes a pointer that is not const, but changes nothing.
  auto* object = reinterpret_cast<spa_pod_object*>(const_cast<spa_pod*>(param));
  spa_pod_prop* prop = nullptr;
  SPA_POD_OBJECT_FOREACH(object, prop) {
    switch (prop->key) {
      case SPA_PROP_volume:
        change.volume = readFloat(prop->value);
        break;
      case SPA_PROP_channelVolumes:
        change.channels = readFloats(prop->value);
        break;
      case SPA_PROP_mute:
        change.muted = readBool(prop->value);
        break;
      default:
        break;
    }
  }
  return change;
}

}  // namespace halvox::pipewire_reporter
