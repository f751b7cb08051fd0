#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// The states of a PCM substream, in the kernel's words. The state of a closed substream comes
// first.
inline constexpr std::array<std::string_view, 10> kPcmStates{
    "CLOSED", "OPEN",     "SETUP",  "PREPARED",  "RUNNING",
    "XRUN",   "DRAINING", "PAUSED", "SUSPENDED", "DISCONNECTED"};

// The content of /proc/asound/cardN/pcmND/subN/status.
struct PcmStatus {
  std::size_t state = 0;                // position in kPcmStates
  std::int64_t owner = 0;               // process; 0 if unknown
  std::uint64_t hardwareFrames = 0;     // hw_ptr
  std::uint64_t applicationFrames = 0;  // appl_ptr
};

// Returns std::nullopt if the text is not what the kernel writes.
[[nodiscard]] std::optional<PcmStatus> parsePcmStatus(std::string_view text);

// Returns the name of a PCM from its info file, or its ID if it has no name. Returns std::nullopt
// if it has neither.
[[nodiscard]] std::optional<std::string> parsePcmName(std::string_view text);

// The names of the cards in /proc/asound/cards, by card number.
[[nodiscard]] std::map<unsigned, std::string> parseCards(std::string_view text);

// Returns a number that is alone on its line, as in files of sysfs. Returns std::nullopt for any
// other text.
[[nodiscard]] std::optional<std::uint64_t> parseSysfsNumber(std::string_view text);

// The text without white space at its ends; bytes that are not UTF-8 become U+FFFD.
[[nodiscard]] std::string cleanText(std::string_view text);

}  // namespace halvox::platform::linux_
