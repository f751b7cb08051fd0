#include "platform/linux/base/Utf8.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <iterator>

#include <fmt/format.h>

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";

// The forms of UTF-8: what the first byte looks like and the least character of the form.
struct Form {
  unsigned mask;
  unsigned lead;
  char32_t least;
};
constexpr std::array<Form, 4> kForms{{
    {0x80, 0x00, 0x0},
    {0xE0, 0xC0, 0x80},
    {0xF0, 0xE0, 0x800},
    {0xF8, 0xF0, 0x10000},
}};

bool isPlain(char character) { return character >= 0x20 && character < 0x7F; }

bool isUnprintable(char32_t character) {
  return character < 0x20 || (character >= 0x7F && character < 0xA0) || character == 0x2028 ||
         character == 0x2029;
}

std::string escaped(char32_t character) {
  switch (character) {
    case '\n':
      return "\\n";
    case '\r':
      return "\\r";
    case '\t':
      return "\\t";
    default:
      break;
  }
  const auto code = static_cast<std::uint32_t>(character);
  return code < 0x80 ? fmt::format("\\x{:02x}", code) : fmt::format("\\u{:04x}", code);
}

}  // namespace

Utf8Step nextUtf8(std::string_view text) {
  const auto lead = static_cast<unsigned char>(text.front());
  for (std::size_t length = 1; length <= kForms.size(); ++length) {
    const Form& form = kForms[length - 1];
    if ((lead & form.mask) != form.lead) continue;
    if (text.size() < length) return {};
    char32_t character = lead & ~form.mask;
    for (std::size_t index = 1; index < length; ++index) {
      const auto byte = static_cast<unsigned char>(text[index]);
      if ((byte & 0xC0U) != 0x80U) return {};
      character = (character << 6U) | (byte & 0x3FU);
    }
    const bool isSurrogate = character >= 0xD800 && character <= 0xDFFF;
    if (character < form.least || character > 0x10FFFF || isSurrogate) return {};
    return {length, true, character};
  }
  return {};
}

std::string replaceInvalidUtf8(std::string_view text) {
  std::string result;
  while (!text.empty()) {
    const Utf8Step step = nextUtf8(text);
    result += step.valid ? text.substr(0, step.length) : kReplacement;
    text.remove_prefix(step.length);
  }
  return result;
}

std::size_t appendEscaped(std::string& line, std::string_view text, std::size_t room) {
  std::size_t taken = 0;
  while (taken < text.size()) {
    const std::string_view rest = text.substr(taken);
    const auto end = std::ranges::find_if_not(rest, isPlain);
    if (const auto plain = static_cast<std::size_t>(end - rest.begin()); plain > 0) {
      const std::size_t fitting = std::min(plain, room);
      line += rest.substr(0, fitting);
      room -= fitting;
      taken += fitting;
      if (fitting < plain) break;
      continue;
    }
    const Utf8Step step = nextUtf8(rest);
    const std::string part =
        !step.valid ? fmt::format("\\x{:02x}", static_cast<unsigned char>(rest.front()))
        : isUnprintable(step.character) ? escaped(step.character)
                                        : std::string(rest.substr(0, step.length));
    if (part.size() > room) break;
    line += part;
    room -= part.size();
    taken += step.length;
  }
  return taken;
}

}  // namespace halvox::platform::linux_
