#pragma once

#include <string>
#include <string_view>

#include "platform/linux/base/Result.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::tools {

// Names one stored row, in a text that a user keeps: "events:4711@1795313222.25". The time detects
// that the number now belongs to another row: numbers start again when a new database replaces the
// old one.
struct RowCursor {
  std::string command;  // the command that shows such rows
  platform::linux_::StoredRecordID id = 0;
  double time = 0;  // seconds since 1970

  friend bool operator==(const RowCursor&, const RowCursor&) = default;
};

// Formats a cursor so that parseCursor() returns an equal one. Has no characters that a shell would
// treat specially.
[[nodiscard]] std::string cursorText(const RowCursor& cursor);

[[nodiscard]] platform::linux_::Result<RowCursor> parseCursor(std::string_view text);

}  // namespace halvox::tools
