#pragma once

#include <memory>

#include "tools/export/RecordWriter.h"

namespace halvox::tools {

// Comma-separated values as RFC 4180 defines them: a header line, lines that end with CRLF, quotes
// around fields that need them. All kinds of records have the same columns; a column that a kind
// does not have is empty.
//
// Spreadsheets run a text that begins like a formula. The names in records come from any program,
// so a quote is put before such a text, which spreadsheets do not show. Numbers and payloads are
// never changed: a payload begins with a brace.
[[nodiscard]] std::unique_ptr<RecordWriter> makeCsvWriter();

}  // namespace halvox::tools
