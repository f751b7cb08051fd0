#include "tools/ReportFiles.h"

#include <cerrno>
#include <system_error>

#include "analysis/ReportBuilder.h"
#include "analysis/StoreRecordSource.h"

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/store/reading/StoreReader.h"
#include "tools/NewFile.h"
#include "tools/StreamFinish.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

using platform::linux_::Failure;
using platform::linux_::Result;

// How streams end that nothing ended, as `halvoxctl streams` has it.
analysis::StreamBuilder::Finish finishOf(const ReportPeriod& period) {
  // What came after the period is not known.
  if (period.until && *period.until < timeNow()) return {.now = period.until};
  return streamFinish(period.directory);
}

}  // namespace

Result<analysis::ReportData> readReportData(const ReportPeriod& period) {
  platform::linux_::StoreReader reader;
  if (const auto opened = reader.open(period.directory); !opened) {
    return Failure<>{opened.error().message};
  }
  analysis::StoreRecordSource source(reader);
  analysis::ReportBuilder builder;
  const auto read = source.forEach({.since = period.since,
                                    .until = period.until,
                                    .messages = true,
                                    .metrics = true,
                                    .power = true,
                                    .snapshots = true,
                                    .losses = true},
                                   [&](const analysis::Record& record) { builder.add(record); });
  if (!read) return read.error();
  return builder.finish(finishOf(period));
}

Result<void> writeReportFile(const std::filesystem::path& file, std::string_view page) {
  std::error_code ignored;
  // A rename would fail as well, but after the whole page was written, and with another reason.
  if (std::filesystem::is_directory(file, ignored)) {
    return Failure<>{file.native() + " is a directory; expected a file to write"};
  }
  NewFile made(file);
  if (!made.write(page, modeOfNewFile()) || !made.keepAs(file)) {
    return Failure<>{file.native() + ": " + platform::linux_::errnoText(errno)};
  }
  return {};
}

}  // namespace halvox::tools
