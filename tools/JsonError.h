#pragma once

#include <cstddef>
#include <istream>
#include <string>

namespace halvox::tools {

// Describes where a text stops being JSON, and why: `line 1, column 6: expected a value, found
// "}"`. Columns count characters. Reads `text` from its beginning. `offset`, in bytes, and `code`,
// a rapidjson::ParseErrorCode, are the parser's result. If `problem` is not empty, it is used as
// the reason: an objection of the parser's handler.
std::string describeJsonError(std::istream& text, std::size_t offset, int code,
                              const std::string& problem = {});

}  // namespace halvox::tools
