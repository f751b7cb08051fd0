#pragma once

#include <cstddef>
#include <istream>
#include <string>

namespace halvox::tools {

// Says where a text stops being JSON, and why: `line 1, column 6: expected a value, found "}"`.
// Columns count characters. `text` is read from its beginning. `offset`, in bytes, and `code` are
// those of the parser's result, a rapidjson::ParseErrorCode. A `problem` that is not empty is what
// a handler of the parser objected to, in the place of the reason.
std::string describeJsonError(std::istream& text, std::size_t offset, int code,
                              const std::string& problem = {});

}  // namespace halvox::tools
