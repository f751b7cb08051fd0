#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::pipewire_reporter {

// The longest text that is taken from a client of PipeWire, in bytes.
inline constexpr std::size_t kMaxTextBytes = 512;

// A text of a PipeWire client as it may be sent on: at most kMaxTextBytes of valid UTF-8, cut at a
// character; what is not UTF-8 and control characters become U+FFFD.
std::string cleanText(std::string_view text);

// The number that the whole text is; nothing for anything else, negative numbers included.
std::optional<std::int64_t> parseNumber(std::string_view text);

// The format that a stream's application and PipeWire agreed on.
struct StreamFormat {
  std::string encoding;        // such as "F32LE" or, for coded audio, "mp3"
  std::uint32_t rate = 0;      // in Hz; 0 when not known
  std::uint32_t channels = 0;  // 0 when not known
  friend bool operator==(const StreamFormat&, const StreamFormat&) = default;
};

// Such as "F32LE 48000 Hz 2 ch"; leaves out what is not known.
std::string describeFormat(const StreamFormat& format);

// A change of a stream's volume controls; what is not set stays as it was.
struct VolumeChange {
  std::optional<float> volume;                 // of the whole stream, linear
  std::optional<std::vector<float>> channels;  // of each channel, linear
  std::optional<bool> muted;
};

// The volume controls of one stream, as far as they are known.
class StreamVolume {
 public:
  // Takes the change over; numbers that no volume can have (NaN, infinite, negative) are ignored.
  void apply(const VolumeChange& change);

  // Linear, where 1 is the unchanged signal: the stream's volume times that of its loudest channel,
  // rounded to 6 places; 0 while muted. Above 1 (at most 100) the stream is amplified.
  // Nothing until a volume has been told.
  [[nodiscard]] std::optional<double> effective() const;

 private:
  std::optional<float> volume_;
  std::optional<float> loudest_;
  bool muted_ = false;
};

}  // namespace halvox::pipewire_reporter
