#include "reporters/pipewire/StreamValues.h"

#include <algorithm>
#include <charconv>
#include <cmath>

#include <rapidjson/encodings.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/stringbuffer.h>

namespace halvox::pipewire_reporter {
namespace {

constexpr unsigned kReplacement = 0xFFFD;
constexpr float kLoudest = 100;
constexpr double kVolumeSteps = 1e6;

bool isControl(unsigned codepoint) {
  return codepoint < 0x20 || (codepoint >= 0x7F && codepoint < 0xA0);
}

bool isVolume(float volume) { return std::isfinite(volume) && volume >= 0; }

}  // namespace

std::string cleanText(std::string_view text) {
  using Utf8 = rapidjson::UTF8<>;
  constexpr std::size_t kLongestCharacter = 4;
  rapidjson::StringBuffer result;
  std::size_t position = 0;
  while (position < text.size() && result.GetSize() + kLongestCharacter <= kMaxTextBytes) {
    rapidjson::MemoryStream rest(text.data() + position, text.size() - position);
    unsigned codepoint = 0;
    if (Utf8::Decode(rest, &codepoint)) {
      position += rest.Tell();
    } else {
      codepoint = kReplacement;
      ++position;
    }
    Utf8::Encode(result, isControl(codepoint) ? kReplacement : codepoint);
  }
  return {result.GetString(), result.GetSize()};
}

std::optional<std::int64_t> parseNumber(std::string_view text) {
  std::int64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size() || number < 0) {
    return std::nullopt;
  }
  return number;
}

std::string describeFormat(const StreamFormat& format) {
  std::string text = cleanText(format.encoding);
  if (format.rate != 0) {
    text += ' ' + std::to_string(format.rate) + " Hz";
  }
  if (format.channels != 0) {
    text += ' ' + std::to_string(format.channels) + " ch";
  }
  return text;
}

void StreamVolume::apply(const VolumeChange& change) {
  if (change.volume && isVolume(*change.volume)) {
    volume_ = change.volume;
  }
  if (change.channels && !change.channels->empty() &&
      std::all_of(change.channels->begin(), change.channels->end(), isVolume)) {
    loudest_ = *std::max_element(change.channels->begin(), change.channels->end());
  }
  muted_ = change.muted.value_or(muted_);
}

std::optional<double> StreamVolume::effective() const {
  if (!volume_ && !loudest_) {
    return std::nullopt;
  }
  if (muted_) {
    return 0.0;
  }
  const float product = std::min(volume_.value_or(1) * loudest_.value_or(1), kLoudest);
  return std::round(static_cast<double>(product) * kVolumeSteps) / kVolumeSteps;
}

}  // namespace halvox::pipewire_reporter
