#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::pipewire_reporter {

// The longest text that is taken from a client of PipeWire, in bytes.
inline constexpr std::size_t kMaxTextBytes = 512;

// Makes a text from a PipeWire client safe to send: at most kMaxTextBytes of valid UTF-8, cut
// between characters. Control characters, and bytes that are not UTF-8, become U+FFFD.
std::string cleanText(std::string_view text);

// Returns the number if the whole text is one that is not negative; else std::nullopt.
std::optional<std::int64_t> parseNumber(std::string_view text);

// The format that a stream's application and PipeWire agreed on.
struct StreamFormat {
  std::string encoding;        // such as "F32LE" or, for coded audio, "mp3"
  std::uint32_t rate = 0;      // in Hz; 0 if unknown
  std::uint32_t channels = 0;  // 0 if unknown
  friend bool operator==(const StreamFormat&, const StreamFormat&) = default;
};

// Returns a text such as "F32LE 48000 Hz 2 ch". Omits unknown values.
std::string describeFormat(const StreamFormat& format);

// A change of a stream's volume controls. Members that are not set have not changed.
struct VolumeChange {
  std::optional<float> volume;                 // of the whole stream, linear
  std::optional<std::vector<float>> channels;  // of each channel, linear
  std::optional<bool> muted;
};

// The known volume controls of one stream. A plain value that belongs to the loop thread.
class StreamVolume {
 public:
  // Applies a change. Ignores volumes that are NaN, infinite or negative.
  void apply(const VolumeChange& change);

  // Returns the linear volume, where 1 leaves the signal unchanged and more (at most 100) amplifies
  // it: the stream's volume times that of its loudest channel, or 0 while muted. Rounded to 6
  // places, so that noise in the last digits is not a change. std::nullopt until a volume is known.
  [[nodiscard]] std::optional<double> effective() const;

 private:
  std::optional<float> volume_;
  std::optional<float> loudest_;
  bool muted_ = false;
};

}  // namespace halvox::pipewire_reporter
