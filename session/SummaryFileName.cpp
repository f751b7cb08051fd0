#include "session/SummaryFileName.h"

#include <array>
#include <cstdio>
#include <cstdlib>

namespace halvox {
namespace {

constexpr std::size_t kMaxNameLength = 255;  // the limit of Linux file systems, in bytes
constexpr char kSubstitute = '_';
// The first byte of the characters from U+0080 to U+00BF in UTF-8.
constexpr unsigned char kLatinLead = 0xC2;

std::string stamp(const platform::LocalTime& time) {
  const auto offset = static_cast<int>(time.offsetFromUTC.count());
  std::array<char, 96> text;
  const int length =
      std::snprintf(text.data(), text.size(), "%04d%02d%02d-%02d%02d%02d%c%02d%02d", time.year,
                    time.month, time.day, time.hour, time.minute, time.second,
                    offset < 0 ? '-' : '+', std::abs(offset) / 60, std::abs(offset) % 60);
  return {text.data(), static_cast<std::size_t>(length)};
}

bool isContinuation(char byte) { return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U; }

// The first `length` bytes of the text, or fewer so that no character is split.
std::string_view cut(std::string_view text, std::size_t length) {
  if (text.size() <= length) return text;
  while (length > 0 && isContinuation(text[length])) --length;
  return text.substr(0, length);
}

std::string usable(std::string_view name) {
  std::string result;
  bool leads = true;
  for (std::size_t index = 0; index < name.size(); ++index) {
    const auto byte = static_cast<unsigned char>(name[index]);
    const bool isLatinControl = byte == kLatinLead && index + 1 < name.size() &&
                                static_cast<unsigned char>(name[index + 1]) < 0xA0;
    const bool isControl = byte < 0x20 || byte == 0x7F || isLatinControl;
    leads = leads && byte == '.';
    result += isControl || byte == '/' || leads ? kSubstitute : name[index];
    if (isLatinControl) ++index;
  }
  return result;
}

}  // namespace

std::string makeSummaryFileName(const SummaryFileNameParts& parts) {
  const std::string beginning = stamp(parts.time) + "-halvox-";
  const std::string end = "-" + std::string(parts.serviceName) + ".json";
  const std::size_t room = kMaxNameLength - beginning.size() - end.size();
  return beginning + std::string(cut(usable(parts.appName), room)) + end;
}

}  // namespace halvox
