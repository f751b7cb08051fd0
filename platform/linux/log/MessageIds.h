#pragma once

#include <string_view>

namespace halvox::platform::linux_ {

// Returns the identifier of the journal's catalog for a log line, or an empty text if the catalog
// does not explain that line. `line` begins with the prefix of its unit, as LogCategory::write()
// gets it. The text of a line decides, so that the callers of the log need not know the journal.
[[nodiscard]] std::string_view messageId(std::string_view line);

}  // namespace halvox::platform::linux_
