#include "platform/linux/drivers/alsa/AlsaText.h"

#include <algorithm>
#include <charconv>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kBlanks = " \t\r\n";

std::string_view trimmed(std::string_view text) {
  const std::size_t first = text.find_first_not_of(kBlanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

template <typename Number>
std::optional<Number> numberIn(std::string_view text) {
  Number number{};
  const auto parsed = std::from_chars(text.data(), text.data() + text.size(), number);
  if (parsed.ec != std::errc() || parsed.ptr != text.data() + text.size()) return std::nullopt;
  return number;
}

// Passes each line of the text without its end.
template <typename Take>
void forEachLine(std::string_view text, Take take) {
  while (!text.empty()) {
    const std::size_t end = text.find('\n');
    take(text.substr(0, end));
    text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
  }
}

// The value after "key:" at the start of a line, without surrounding blanks; none if no line has
// it.
std::optional<std::string_view> valueOf(std::string_view text, std::string_view key) {
  std::optional<std::string_view> value;
  forEachLine(text, [&](std::string_view line) {
    const std::size_t colon = line.find(':');
    if (colon == std::string_view::npos || value.has_value()) return;
    if (trimmed(line.substr(0, colon)) == key) value = trimmed(line.substr(colon + 1));
  });
  return value;
}

template <typename Number>
std::optional<Number> numberOf(std::string_view text, std::string_view key) {
  const auto value = valueOf(text, key);
  return value.has_value() ? numberIn<Number>(*value) : std::nullopt;
}

}  // namespace

std::optional<PcmStatus> parsePcmStatus(std::string_view text) {
  // A substream that is not open has this word instead of the fields.
  if (trimmed(text) == "closed") return PcmStatus{};
  const auto word = valueOf(text, "state");
  const auto hardware = numberOf<std::uint64_t>(text, "hw_ptr");
  const auto application = numberOf<std::uint64_t>(text, "appl_ptr");
  if (!word.has_value() || !hardware.has_value() || !application.has_value()) return std::nullopt;
  const auto* const state = std::ranges::find(kPcmStates, *word);
  if (state == kPcmStates.end()) return std::nullopt;
  return PcmStatus{.state = static_cast<std::size_t>(state - kPcmStates.begin()),
                   .owner = numberOf<std::int64_t>(text, "owner_pid").value_or(0),
                   .hardwareFrames = *hardware,
                   .applicationFrames = *application};
}

std::optional<std::string> parsePcmName(std::string_view text) {
  for (const std::string_view key : {"name", "id"}) {
    const auto name = valueOf(text, key);
    if (name.has_value() && !name->empty()) return cleanText(*name);
  }
  return std::nullopt;
}

// A card is two lines: " 0 [PCH            ]: HDA-Intel - HDA Intel PCH" and one with the long
// name.
std::map<unsigned, std::string> parseCards(std::string_view text) {
  constexpr std::string_view kBeforeDriver = "]: ";
  constexpr std::string_view kBeforeName = " - ";
  std::map<unsigned, std::string> cards;
  forEachLine(text, [&](std::string_view line) {
    const std::size_t bracket = line.find(" [");
    const std::size_t driver = line.find(kBeforeDriver);
    if (bracket == std::string_view::npos || driver == std::string_view::npos) return;
    const auto number = numberIn<unsigned>(trimmed(line.substr(0, bracket)));
    const std::size_t name = line.find(kBeforeName, driver);
    if (!number.has_value() || name == std::string_view::npos) return;
    cards.try_emplace(*number, cleanText(line.substr(name + kBeforeName.size())));
  });
  return cards;
}

std::optional<std::uint64_t> parseSysfsNumber(std::string_view text) {
  return numberIn<std::uint64_t>(trimmed(text));
}

std::string cleanText(std::string_view text) { return replaceInvalidUtf8(trimmed(text)); }

}  // namespace halvox::platform::linux_
