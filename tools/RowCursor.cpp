#include "tools/RowCursor.h"

#include <charconv>
#include <cmath>
#include <system_error>

#include "tools/JsonText.h"

namespace halvox::tools {
namespace {

template <typename Number>
bool readWhole(std::string_view text, Number& number) {
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  return error == std::errc() && end == text.data() + text.size();
}

}  // namespace

std::string cursorText(const RowCursor& cursor) {
  return cursor.command + ":" + std::to_string(cursor.id) + "@" + shortNumber(cursor.time);
}

platform::linux_::Result<RowCursor> parseCursor(std::string_view text) {
  const std::size_t colon = text.find(':');
  const std::size_t at = text.find('@');
  RowCursor cursor;
  if (colon != std::string_view::npos && at != std::string_view::npos && colon < at) {
    cursor.command = text.substr(0, colon);
    if (readWhole(text.substr(colon + 1, at - colon - 1), cursor.id) &&
        readWhole(text.substr(at + 1), cursor.time) && cursor.id > 0 &&
        std::isfinite(cursor.time)) {
      return cursor;
    }
  }
  return platform::linux_::Failure<>{"\"" + std::string(text) +
                                     "\" is not a cursor; expected one that --show-cursor or "
                                     "--json printed, such as events:4711@1795313222.25"};
}

}  // namespace halvox::tools
