#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "analysis/ReportData.h"

#include "platform/linux/base/Result.h"

// What reports read and write.
namespace halvox::tools {

// The records of a store, named by its directory, from `since` up to, but not including, `until`.
struct ReportPeriod {
  std::filesystem::path directory{};
  std::optional<double> since{};
  std::optional<double> until{};
};

// Reads the records of a period. The message of a failure names the store.
platform::linux_::Result<analysis::ReportData> readReportData(const ReportPeriod& period);

// Writes a page in one step: readers see the old file or the whole new one. The message of a
// failure names the file.
platform::linux_::Result<void> writeReportFile(const std::filesystem::path& file,
                                               std::string_view page);

}  // namespace halvox::tools
