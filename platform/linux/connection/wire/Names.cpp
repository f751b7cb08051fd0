#include "platform/linux/connection/wire/Names.h"

#include <array>
#include <cstdint>

namespace halvox::platform::linux_::dbus {
namespace {

// The classes of characters in names. Each class is one bit, and one look-up checks a character.
constexpr std::uint8_t kLetter = 1;  // the underscore counts as one
constexpr std::uint8_t kDigit = 2;
constexpr std::uint8_t kHyphen = 4;

constexpr std::array<std::uint8_t, 256> makeClasses() {
  std::array<std::uint8_t, 256> classes{};
  for (std::size_t c = 'a'; c <= 'z'; ++c) classes[c] = kLetter;
  for (std::size_t c = 'A'; c <= 'Z'; ++c) classes[c] = kLetter;
  for (std::size_t c = '0'; c <= '9'; ++c) classes[c] = kDigit;
  classes['_'] = kLetter;
  classes['-'] = kHyphen;
  return classes;
}
constexpr std::array<std::uint8_t, 256> kClasses = makeClasses();

struct ElementRules {
  char separator;
  std::uint8_t first;  // classes that an element may start with
  std::uint8_t rest;   // classes of its other characters
};

// Returns the number of elements of `text`; 0 if an element breaks the rules.
std::size_t countElements(std::string_view text, const ElementRules& rules) {
  std::size_t elements = 1;
  bool atStart = true;
  for (const char character : text) {
    const std::uint8_t allowed = atStart ? rules.first : rules.rest;
    if ((kClasses[static_cast<unsigned char>(character)] & allowed) != 0) {
      atStart = false;
    } else if (character == rules.separator && !atStart) {
      atStart = true;
      ++elements;
    } else {
      return 0;
    }
  }
  return atStart ? 0 : elements;
}

constexpr std::uint8_t kWord = kLetter | kDigit;
constexpr ElementRules kPathRules{'/', kWord, kWord};
constexpr ElementRules kInterfaceRules{'.', kLetter, kWord};
constexpr ElementRules kWellKnownRules{'.', kLetter | kHyphen, kWord | kHyphen};
// In the unique names that a bus assigns, elements may start with a digit, as in `:1.42`.
constexpr ElementRules kUniqueRules{'.', kWord | kHyphen, kWord | kHyphen};

}  // namespace

bool isObjectPath(std::string_view text) {
  // Do not limit the length, because D-Bus does not limit the length of paths.
  if (text.empty() || text.front() != '/') return false;
  return text.size() == 1 || countElements(text.substr(1), kPathRules) > 0;
}

bool isInterfaceName(std::string_view text) {
  return text.size() <= kMaxNameBytes && countElements(text, kInterfaceRules) >= 2;
}

bool isMemberName(std::string_view text) {
  return text.size() <= kMaxNameBytes && countElements(text, kInterfaceRules) == 1;
}

bool isBusName(std::string_view text) {
  if (text.empty() || text.size() > kMaxNameBytes) return false;
  if (text.front() == ':') return countElements(text.substr(1), kUniqueRules) >= 2;
  return countElements(text, kWellKnownRules) >= 2;
}

}  // namespace halvox::platform::linux_::dbus
