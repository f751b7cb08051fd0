#include "platform/linux/link/nats/SubjectToken.h"

#include <algorithm>

namespace halvox::platform::linux_ {
namespace {

constexpr char kReplacement = '_';

bool isAllowed(char character) {
  const auto byte = static_cast<unsigned char>(character);
  return byte > ' ' && byte != 0x7FU && character != '.' && character != '*' && character != '>';
}

bool continuesCharacter(char byte) { return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U; }

}  // namespace

std::string subjectToken(std::string_view text) {
  if (text.empty()) return std::string(1, kReplacement);
  std::size_t length = std::min(text.size(), kLongestSubjectToken);
  if (length < text.size()) {
    while (length > 0 && continuesCharacter(text[length])) --length;
  }
  std::string token(text.substr(0, length));
  std::ranges::replace_if(
      token, [](char character) { return !isAllowed(character); }, kReplacement);
  return token.empty() ? std::string(1, kReplacement) : token;
}

}  // namespace halvox::platform::linux_
