#pragma once

#include <memory>

#include "tools/export/RecordWriter.h"

namespace halvox::tools {

// One JSON object on each line, with the columns of the record's table. No value is changed, so
// that reading the lines gives the records of the store: payloads are as they were stored, the
// bytes of metrics are hexadecimal.
[[nodiscard]] std::unique_ptr<RecordWriter> makeJsonlWriter();

}  // namespace halvox::tools
