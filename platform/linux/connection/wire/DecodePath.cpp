#include "platform/linux/connection/wire/DecodePath.h"

#include <array>
#include <cstdio>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_::dbus {
namespace {

// How much of a key a path shows: enough to recognise the key. A path has up to 64 keys, and the
// whole path is part of one log line.
constexpr std::size_t kMaxQuotedBytes = 64;

void appendEscaped(std::string& out, char byte) {
  std::array<char, 5> escaped{};
  std::snprintf(escaped.data(), escaped.size(), "\\x%02x",
                static_cast<unsigned>(static_cast<unsigned char>(byte)));
  out += escaped.data();
}

}  // namespace

std::string quotable(std::string_view text) {
  // Cut the text first. The check for UTF-8 then reads at most 64 bytes.
  const std::string_view start = utf8Prefix(text, kMaxQuotedBytes);
  const bool isText = isUtf8WithoutNul(start);
  std::string out;
  for (const char byte : start) {
    const auto code = static_cast<unsigned char>(byte);
    // Control characters could start a new line in the log, or control the terminal that shows it.
    if (code < 0x20 || code == 0x7f || (code >= 0x80 && !isText)) {
      appendEscaped(out, byte);
    } else {
      if (byte == '"' || byte == '\\') out += '\\';
      out += byte;
    }
  }
  if (start.size() < text.size()) out += "...";
  return out;
}

void DecodePath::putBefore(std::string_view key) {
  const bool isLast = steps_.empty() || steps_.front() == '[';
  steps_ = '"' + quotable(key) + '"' + (isLast ? "" : ".") + steps_;
}

void DecodePath::putBefore(std::size_t element) {
  const bool isLast = steps_.empty() || steps_.front() == '[';
  steps_ = '[' + std::to_string(element) + ']' + (isLast ? "" : ".") + steps_;
}

std::string DecodePath::text() const {
  if (argument_ == 0) return {};
  std::string text = "argument " + std::to_string(argument_);
  if (!steps_.empty()) text += steps_.front() == '[' ? ", element " : ", key ";
  return text + steps_;
}

}  // namespace halvox::platform::linux_::dbus
