#pragma once

#include <string_view>

#include "tools/export/RecordJson.h"

namespace halvox::tools {

// Writes a JSON text as an AnyValue of OpenTelemetry: {"kvlistValue":{"values":[…]}} for an object.
// Whole numbers of 64 bits become intValue, which is a text as in all 64-bit numbers of the
// encoding; others become doubleValue. A null becomes a value without a type. What is not JSON on
// one line becomes a stringValue.
void writeOtlpValue(JsonWriter& writer, std::string_view json);

}  // namespace halvox::tools
