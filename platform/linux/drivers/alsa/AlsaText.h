#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// The states of a PCM substream in the words of the kernel, that of a closed one first.
inline constexpr std::array<std::string_view, 10> kPcmStates{
    "CLOSED", "OPEN",     "SETUP",  "PREPARED",  "RUNNING",
    "XRUN",   "DRAINING", "PAUSED", "SUSPENDED", "DISCONNECTED"};

// What /proc/asound/cardN/pcmND/subN/status tells.
struct PcmStatus {
  std::size_t state = 0;  // position in kPcmStates
  std::int64_t owner = 0;
  std::uint64_t hardwareFrames = 0;     // hw_ptr
  std::uint64_t applicationFrames = 0;  // appl_ptr
};

// None when it is not what the kernel writes.
[[nodiscard]] std::optional<PcmStatus> parsePcmStatus(std::string_view text);

// The name of a PCM in its info file: its name, else its ID. None without either.
[[nodiscard]] std::optional<std::string> parsePcmName(std::string_view text);

// The names of the cards in /proc/asound/cards, by number.
[[nodiscard]] std::map<unsigned, std::string> parseCards(std::string_view text);

// A number alone on its line, as files of sysfs have it.
[[nodiscard]] std::optional<std::uint64_t> parseSysfsNumber(std::string_view text);

// What of `text` is no blank at either end; bytes that are not UTF-8 become U+FFFD.
[[nodiscard]] std::string cleanText(std::string_view text);

}  // namespace halvox::platform::linux_
