#include "reporters/pipewire/StreamValues.h"

#include <algorithm>
#include <charconv>
#include <cmath>

#include "platform/linux/base/Utf8.h"

namespace halvox::pipewire_reporter {
namespace {

constexpr std::string_view kReplacement = "\uFFFD";
constexpr float kLoudest = 100;
constexpr double kVolumeSteps = 1e6;

bool isControl(char32_t character) {
  return character < 0x20 || (character >= 0x7F && character < 0xA0);
}

bool isVolume(float volume) { return std::isfinite(volume) && volume >= 0; }

}  // namespace

std::string cleanText(std::string_view text) {
  constexpr std::size_t kLongestCharacter = 4;
  std::string result;
  // Leaves room for the longest character, so that the text is never cut within a character.
  while (!text.empty() && result.size() + kLongestCharacter <= kMaxTextBytes) {
    const platform::linux_::Utf8Step step = platform::linux_::nextUtf8(text);
    const bool isKept = step.valid && !isControl(step.character);
    result += isKept ? text.substr(0, step.length) : kReplacement;
    text.remove_prefix(step.length);
  }
  return result;
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
      // One bad channel makes the whole array doubtful; the volumes that were known before stay.
      std::all_of(change.channels->begin(), change.channels->end(), isVolume)) {
    loudest_ = *std::max_element(change.channels->begin(), change.channels->end());
  }
  muted_ = change.muted.value_or(muted_);
}

std::optional<double> StreamVolume::effective() const {
  if (!volume_ && !loudest_) {
    return std::nullopt;
  }
  // Muted is volume 0 and not silence: the stream still plays.
  if (muted_) {
    return 0.0;
  }
  const float product = std::min(volume_.value_or(1) * loudest_.value_or(1), kLoudest);
  // A product of two floats has noise in its last digits, which is not a change of the volume.
  return std::round(static_cast<double>(product) * kVolumeSteps) / kVolumeSteps;
}

}  // namespace halvox::pipewire_reporter
