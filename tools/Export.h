#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/Command.h"
#include "tools/export/RecordKinds.h"

namespace halvox::tools {

enum class ExportFormat : std::uint8_t { kSqlite, kJsonl, kCsv, kOtlpJson, kPerfetto };

struct ExportRecords {
  ExportFormat format = ExportFormat::kSqlite;
  std::string to = "-";                     // the file to write; "-" is the standard output
  bool replace = false;                     // whether an existing file may be replaced
  ExportKinds kinds{};                      // of the records
  std::vector<std::string> applications{};  // glob patterns; empty: all records
  std::optional<double> since{};            // seconds since 1970
  std::optional<double> until{};
  std::string database{};  // empty: as the service's configuration says
};

// Writes the stored records, or with ExportFormat::kPerfetto the streams that they tell of, into a
// file of another form. A service may write to the store meanwhile. A file gets its name when it is
// complete. Memory does not grow with the store. At a terminal, shows on `errors` how far it has
// come.
ExitStatus exportRecords(const ExportRecords& request, const CommonOptions& options,
                         const ToolStreams& streams);

}  // namespace halvox::tools
