#include "platform/linux/link/nats/SubjectToken.h"

#include <algorithm>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_ {
namespace {

constexpr char kReplacement = '_';

bool isAllowed(char character) {
  const auto byte = static_cast<unsigned char>(character);
  return byte > ' ' && byte != 0x7FU && character != '.' && character != '*' && character != '>';
}

}  // namespace

std::string subjectToken(std::string_view text) {
  if (text.empty()) return std::string(1, kReplacement);
  std::string token(utf8Prefix(text, kLongestSubjectToken));
  std::ranges::replace_if(
      token, [](char character) { return !isAllowed(character); }, kReplacement);
  return token.empty() ? std::string(1, kReplacement) : token;
}

}  // namespace halvox::platform::linux_
