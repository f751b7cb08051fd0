#include "tools/Export.h"

#include <cstdint>
#include <filesystem>
#include <system_error>
#include <variant>

#include "platform/linux/store/reading/StoreExport.h"
#include "platform/value.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/StoreRun.h"

namespace halvox::tools {

using platform::Dictionary;
using platform::linux_::StoreExport;
using platform::linux_::StoreReader;

ExitStatus exportRecords(const ExportRecords& request, const CommonOptions& options,
                         const ToolStreams& streams) {
  const Complaint complain("export", options.form(), streams.output, streams.errors);
  const auto directory = storeDirectory(request.database, complain);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  StoreReader reader;
  if (const auto opened = reader.open(std::get<std::filesystem::path>(directory)); !opened) {
    return complain(ExitStatus::kNoService, opened.error().message, "no-store");
  }
  std::error_code ignored;
  if (!request.replace && std::filesystem::exists(request.to, ignored)) {
    return complain(ExitStatus::kBadArguments, request.to + " exists; --force replaces it");
  }
  StoreExport file(request.to);
  auto written = file.create();
  if (written) written = file.copyFrom(reader, {.since = request.since, .until = request.until});
  if (written) written = file.finish();
  if (!written) return complain(ExitStatus::kCannotWrite, written.error().message);
  if (options.form() == OutputForm::kJson) {
    streams.output << toJson(Dictionary{{"file", request.to}, {"records", file.records()}}) << '\n';
  } else {
    streams.output << harmlessText(request.to) << ": " << file.records() << " records\n";
  }
  return ExitStatus::kDone;
}

}  // namespace halvox::tools
