#pragma once

#include <memory>
#include <string_view>

#include "tools/export/RecordWriter.h"

namespace halvox::tools {

// Log records of OpenTelemetry in the JSON encoding of its protocol (OTLP). Each line is one
// request, which a collector takes as it is: the object of ExportLogsServiceRequest, which is also
// that of LogsData. `version` is that of this program.
//
// A request has at most kMostOtlpRecords records and, unless one record alone is larger, about
// kMostOtlpBytes: collectors refuse requests of more than 4 MiB unless they are configured
// otherwise.
[[nodiscard]] std::unique_ptr<RecordWriter> makeOtlpWriter(std::string_view version);

constexpr std::size_t kMostOtlpRecords = 512;
constexpr std::size_t kMostOtlpBytes = std::size_t{1} << 20U;

}  // namespace halvox::tools
